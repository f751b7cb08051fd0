#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <sys/types.h>

#include "client/ClientThread.h"
#include "client/FrameRing.h"
#include "client/HalvoxClient.h"
#include "client/RequestEncoder.h"
#include "client/ServiceStream.h"
#include "client/SessionTable.h"
#include "client/SocketWatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::client {

// The thread of a HalvoxClient, and the two ways by which work reaches it: the ring and the lane.
//
//   send() ──encodes──► FrameRing ──┐
//                                   ├─► window of open calls ──► socket
//   session operations ──► lane ────┘
//
// Messages go through the ring, as frames. Session operations and flushes are rare. They go through
// the lane, which has a lock. Each entry of the lane has the number of messages that the ring had
// accepted before it. The worker can therefore carry out everything in the order of the calls.
//
//   absent ──socket connects──► connecting ──handshake──► ready
//     ▲                            │                        │
//     └────────pause, watch────────┴────────────────────────┘
//
// The worker never blocks on the socket. It sends calls while fewer than kMaxOpenCalls are open,
// and always reads answers, so that client and service cannot both wait for the other to read. If
// the service does not answer, the worker takes nothing from the ring and the lane, and they fill
// up to their bounds.
//
// For 50 milliseconds after a message, the worker naps for a few milliseconds at a time, and looks
// into the ring after each nap. Messages gather during a nap and leave in one write, and send()
// makes no system call. After that time the worker sleeps, because an idle program must have no
// wake-ups. The next send() then wakes it with one system call. With Options::isRealTime the worker
// does not sleep while a session runs, but takes naps of at most 10 milliseconds.
//
// If the worker is asleep, the thread that calls flush() does the worker's work, for at most two
// milliseconds. Waking the worker would cost two switches of threads, which is more than the
// request. At any time only the thread that holds `turn_` does the worker's work. Only the worker's
// thread ends the connection and calls the connection handler.
//
// A message keeps its frame in the ring until it is answered. A service that ends in an orderly way
// says which call was the last one that it has taken. The next service then gets the sessions as
// they were after that call, and after that all later operations and messages again. If the service
// ends without that word, nobody knows which of the open calls it has carried out. Their messages
// count as lost, because a message may be missing but must never arrive twice.
//
// If the lane overflows (kMaxWaitingOperations) because there is no service, the worker discards
// the operations in the lane and the waiting messages, which count as lost. After the next
// connection, it makes the sessions in their latest state.
class ClientWorker {
 public:
  explicit ClientWorker(Options options);
  // Delivers pending messages for at most one second, then ends the thread.
  ~ClientWorker();
  ClientWorker(const ClientWorker&) = delete;
  ClientWorker& operator=(const ClientWorker&) = delete;

  // Any thread may call these functions; see HalvoxClient. The functions that send an encoded
  // message are marked as hot, which makes the linker place them in one or two pages of code. An
  // audio thread finds the caches cold at the start of each period. When the functions were in
  // seven pages, its first message took about a tenth longer.
  bool send(const MessageView& message);
  bool send(const EncodedMessageView& message);
  void post(SessionOperation operation);
  bool flush(std::chrono::milliseconds timeout);
  void setConnectionHandler(std::function<void(bool)> handler);
  // Relaxed, because the answer may be outdated in any case when the caller gets it.
  [[nodiscard]] bool isConnected() const { return connected_.load(std::memory_order_relaxed); }
  [[nodiscard]] std::string socketPath() const;
  [[nodiscard]] Counters counters() const;

 private:
  using TimePoint = std::chrono::steady_clock::time_point;
  using FlushTicket = std::uint64_t;
  using ConnectionHandler = std::function<void(bool)>;
  enum class State : std::uint8_t { kAbsent, kConnecting, kReady };
  // A session operation or a flush, and the number of messages that were accepted before it.
  struct LaneEntry {
    std::uint64_t position = 0;
    std::variant<SessionOperation, FlushTicket> step;
  };
  // A call that the service has not answered, or an answered call after such a call. The call of a
  // flush therefore stays here until all calls before it are answered. The calls that make sessions
  // again are of the kind kOther.
  struct OpenCall {
    enum class Kind : std::uint8_t { kOther, kOperation, kMessage, kFlush };
    Kind kind = Kind::kOther;
    bool isAnswered = false;
    std::uint32_t bytes = 0;
    FrameRing::FrameNumber frame = 0;  // of a message that is not answered
    FlushTicket flush = 0;
  };
  // What a service that ended in an orderly way has not taken.
  using Untaken = std::variant<SessionOperation, FrameRing::FrameNumber>;

  template <typename Content>
  bool push(const BasicMessageView<Content>& message);

  // The loop, and its sleep.
  void run();
  [[nodiscard]] bool isEnding();
  void wake() const;
  [[nodiscard]] bool isOwnProcess() const;
  [[nodiscard]] bool mayFallAsleep();
  [[nodiscard]] std::chrono::milliseconds napLength() const;
  void sleepUntilSomethingHappens() HALVOX_REQUIRES(turn_);
  [[nodiscard]] TimePoint nextDeadline() const;
  // Does the worker's work on the thread that calls flush().
  void help(FlushTicket ticket, TimePoint deadline);
  [[nodiscard]] bool isFlushDone(FlushTicket ticket);

  // The connection.
  void tryConnect();
  [[nodiscard]] std::vector<std::string> placesToTry() const;
  void processStream();
  bool receive();
  void onReady();
  void loseConnection();
  void settleOpenCalls();
  void pauseBeforeRetry();
  void retryNow();
  void notifyConnection(bool connected);
  void notifyNewHandler();

  // Sending.
  [[nodiscard]] bool isWindowOpen() const { return state_ == State::kReady && windowIsOpen_; }
  void updateWindow();
  void sendAll();
  bool sendNext();
  void sendFromLane();
  void sendUntaken();
  void sendOperation(SessionOperation operation);
  bool sendStep(const SessionOperation& operation, OpenCall::Kind kind);
  void sendFlush(FlushTicket ticket);
  void sendMessage(FrameRing::FrameNumber frame);
  void numberCall(char* frame, const OpenCall& call);
  void numberWithoutAnswer(char* frame, const OpenCall& call);
  void giveUpWaitingIfOverflowed();
  void giveUpMessage(FrameRing::FrameNumber frame);

  // Receiving.
  bool takeAnswers();
  void takeLastAnswers();
  void onAnswer(const Answer& answer);
  void finishFlushes();

  const Options options_;
  const std::vector<std::string> places_;  // where the service may be, in the order of the attempts
  FrameRing ring_;
  const pid_t process_;
  platform::linux_::UniqueFd wakeUp_;
  std::atomic<bool> asleep_{false};  // sequentially consistent with the ring's newest_
  std::atomic<bool> closing_{false};
  std::atomic<bool> connected_{false};
  std::atomic<std::uint64_t> dropped_{0};
  std::atomic<std::uint64_t> withoutForm_{0};  // accepted and refused without entering the ring
  // Written only by the thread that holds `turn_`. counters() reads them before the ring's tail().
  // Their sum is therefore never larger than the number of accepted messages.
  std::atomic<std::uint64_t> acknowledged_{0};
  std::atomic<std::uint64_t> refused_{0};
  std::atomic<std::uint64_t> lost_{0};
  std::atomic<std::uint64_t> reconnects_{0};
  // The position of the first entry of the lane; UINT64_MAX if the lane is empty. Written under the
  // lock. A thread publishes a message after its earlier operations, and a worker that sees the
  // message therefore sees these operations, too.
  std::atomic<std::uint64_t> lanePosition_{UINT64_MAX};

  mutable platform::linux_::Mutex mutex_;
  platform::linux_::Condition flushed_;
  std::deque<LaneEntry> lane_ HALVOX_GUARDED_BY(mutex_);
  SessionTable wanted_ HALVOX_GUARDED_BY(mutex_);  // after all operations that were posted
  bool overflowed_ HALVOX_GUARDED_BY(mutex_) = false;
  std::shared_ptr<ConnectionHandler> handler_ HALVOX_GUARDED_BY(mutex_);
  bool handlerIsNew_ HALVOX_GUARDED_BY(mutex_) = false;
  FlushTicket flushAsked_ HALVOX_GUARDED_BY(mutex_) = 0;
  FlushTicket flushDone_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool endNow_ HALVOX_GUARDED_BY(mutex_) = false;
  std::string shownPlace_ HALVOX_GUARDED_BY(mutex_);  // of the current or last connection

  // Held by the thread that does the worker's work. The worker's own thread holds it except while
  // it sleeps or naps. Lock it before `mutex_`.
  platform::linux_::Mutex turn_;
  // The following members belong to the thread that holds `turn_`.
  SocketWatch watch_;
  State state_ = State::kAbsent;
  TimePoint retryAt_{};
  TimePoint handshakeEnds_{};
  std::string place_;           // of the current or last connection
  TimePoint samePlaceUntil_{};  // until then no other place is tried
  std::chrono::milliseconds pause_;
  bool everConnected_ = false;
  // The sessions after all operations that are no longer in `openOperations_`.
  SessionTable made_;
  std::deque<SessionOperation> openOperations_;  // of the calls of the kind kOperation in `open_`
  // These three are sent before anything from the ring and the lane, in this order.
  std::deque<SessionOperation> remaking_;
  std::deque<Untaken> untaken_;
  std::deque<FlushTicket> interruptedFlushes_;
  // The last call that the service has taken, if it has said that it ends; 0: it has taken none.
  std::optional<std::uint32_t> lastTaken_;
  TimePoint lastMessage_{};           // when a message was last taken out of the ring
  std::chrono::milliseconds nap_{0};  // the next nap; 0: sleep until woken
  bool readable_ = false;             // the socket may have bytes to read, or have been closed
  bool windowIsOpen_ = true;
  std::uint32_t lastSerial_ = 0;
  // The sent calls, with consecutive serials up to `lastSerial_`. The oldest ones are removed when
  // they are answered.
  std::deque<OpenCall> open_;
  std::size_t unanswered_ = 0;
  std::size_t openBytes_ = 0;
  ServiceStream stream_;
  ClientThread thread_;
};

}  // namespace halvox::client
