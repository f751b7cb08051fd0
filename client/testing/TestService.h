#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <list>
#include <map>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <systemd/sd-bus.h>

#include "client/HalvoxClient.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::client {

// A request that the test service got.
struct RecordedCall {
  std::string member;
  std::vector<Value> arguments;
};

// Replaces the reporting service in tests of clients. It answers as the protocol requires, and
// records every request. A test can make it stall, refuse requests, vanish and come back. A thread
// of its own serves all connections. Any thread may call the public functions.
class TestService {
 public:
  // Listens on that socket at once.
  explicit TestService(std::string socketPath);
  ~TestService();
  TestService(const TestService&) = delete;
  TestService& operator=(const TestService&) = delete;

  // A stalled service keeps its connections, but reads nothing from them and accepts no new ones.
  void setStalled(bool stalled);
  // Ends every connection without a word, as a crash does, and removes the socket; come() listens
  // again.
  void vanish();
  // Does the same in an orderly way: tells each client which of its requests was the last one
  // taken.
  void end();
  // Makes the service take requests without answering them.
  void setSilent(bool silent);
  void come();
  // Answers all later requests of that member with an error. An empty error name makes it answer
  // them normally again.
  void refuse(std::string member, std::string errorName = "com.tarno.audio.reporting.Code1");

  [[nodiscard]] std::vector<RecordedCall> calls();
  [[nodiscard]] std::size_t count(std::string_view member);
  // Waits for `count` requests of that member. Returns false if they do not arrive in time.
  [[nodiscard]] bool waitForCalls(std::string_view member, std::size_t count);
  // Returns the members of all requests in their order, separated by blanks.
  [[nodiscard]] std::string members();

 private:
  using Message = platform::linux_::UniqueHandle<sd_bus_message*, sd_bus_message_unref>;
  using BusHandle = platform::linux_::UniqueHandle<sd_bus*, sd_bus_close_unref>;
  using Job = std::function<void()>;

  struct Session {
    ServiceType type = 65535;
    bool running = false;
    Message heldStart;
  };
  struct Connection {
    TestService* service = nullptr;
    BusHandle bus;
    std::map<ReporterID, Session> sessions;
    std::uint32_t lastRequest = 0;
  };

  void run();
  [[nodiscard]] std::size_t countLocked(std::string_view member) const HALVOX_REQUIRES(mutex_);
  void perform(Job job);  // runs it on the service's thread and waits for its end
  void listen();
  void leave();
  void accept();
  void serve(Connection& connection);
  static int onMessage(sd_bus_message* message, void* userData, sd_bus_error* error);
  int answer(Connection& connection, sd_bus_message* message);
  int answerSessionRequest(Connection& connection, sd_bus_message* message,
                           const RecordedCall& call);
  int answerQuery(sd_bus_message* message, const RecordedCall& call);
  Session* find(ReporterID id);

  const std::string socketPath_;
  platform::linux_::UniqueFd wakeUp_;
  platform::linux_::Mutex mutex_;
  platform::linux_::Condition changed_;
  std::vector<RecordedCall> calls_ HALVOX_GUARDED_BY(mutex_);
  std::map<std::string, std::size_t, std::less<>> counts_ HALVOX_GUARDED_BY(mutex_);  // by member
  std::list<Job> jobs_ HALVOX_GUARDED_BY(mutex_);
  std::size_t jobsDone_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::size_t jobsAsked_ HALVOX_GUARDED_BY(mutex_) = 0;
  // Used only by the service's thread.
  bool silent_ = false;
  bool stalled_ = false;
  bool leaving_ = false;
  bool ended_ = false;
  std::string refusedMember_;
  std::string errorName_;
  platform::linux_::UniqueFd listener_;
  std::list<Connection> connections_;
  std::jthread thread_;
};

// The tests of clients use these names without their namespace.
using platform::linux_::eventually;
using platform::linux_::ScratchDirectory;

}  // namespace halvox::client
