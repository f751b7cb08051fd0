#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/dispatch.h"
#include "platform/performance_trace.h"
#include "platform/process.h"
#include "platform/tlm_reporting.h"
#include "platform/value.h"
#include "session/DriverSnapShot.h"
#include "session/Guarded.h"
#include "session/MessageHistory.h"
#include "session/ReplyCallbacks.h"
#include "session/ResourceAccount.h"

namespace halvox {

class TraceRunner;
struct TraceParams;

// Keys of a message that are offered to clients. Nothing in the service reads them: no field is
// left out of comparisons and nothing is held back for a time on their account. Their established
// names begin with "_HV", which C++ keeps for itself; hence the k.
inline constexpr std::string_view kHVReportingSessionBlacklistFieldsKey =
    "_comparison_field_blacklist";
inline constexpr std::string_view kHVReportingSessionThrottleSecondsKey = "_throttle_seconds";

// One reporting session of one client: what it is for, how it is configured, and the messages that
// it accepted while it was started.
//
//   created --start--> started --stop--> stopped --start--> started ...; gone when released
//
// The client's connection object drives it on the reporting queue and owns it together with jobs
// and analytics payloads that still need it; so it is always held by a shared pointer. Every
// property may be read and written from any thread, one indivisible access at a time. No operation
// fails.
class HVReportingSession : public platform::KQTraceSessionDelegate,
                           public std::enable_shared_from_this<HVReportingSession> {
 public:
  using ProcessIdentifiers = std::vector<platform::ProcessID>;
  using Account = std::shared_ptr<ResourceAccount>;
  // The history, locked: there is one exactly while the session is started.
  using HistoryLock = Guarded<std::optional<MessageHistory>>::Lock;

  HVReportingSession(ReporterID reporterID, ProcessIdentifiers processIdentifiers);
  HVReportingSession(const HVReportingSession&) = delete;
  HVReportingSession& operator=(const HVReportingSession&) = delete;
  ~HVReportingSession() override;

  // From now on what the session holds is charged to that account, until the session is gone. At
  // most once, before anything else is done with the session.
  void chargeTo(Account account);

  [[nodiscard]] ReporterID reporterID() const { return reporterID_; }
  // Processes of the owner; the first is reported as the owner.
  [[nodiscard]] ProcessIdentifiers processIdentifiers() const { return processIdentifiers_.copy(); }
  void setProcessIdentifiers(ProcessIdentifiers identifiers);
  // True from start to stop.
  [[nodiscard]] bool started() const { return started_.load(std::memory_order_acquire); }
  [[nodiscard]] AudioServiceType serviceType() const;
  // Sets the service name too.
  void setServiceType(AudioServiceType serviceType);
  // Always the name that belongs to the service type.
  [[nodiscard]] std::string_view serviceName() const;
  // Whether the session uses the real-time reporting link; false at first.
  [[nodiscard]] bool tlmReportingEnabled() const;
  void setTlmReportingEnabled(bool enabled);
  // The queue of the session's real-time reporting; made at the first call.
  [[nodiscard]] const std::shared_ptr<platform::DispatchQueue>& tlmReportingQueue();
  // The framework's session and its token; none unless the link is being opened or open.
  [[nodiscard]] platform::TLMReportingService::Session tlmReportingSession() const {
    return tlmReportingSession_.copy();
  }
  [[nodiscard]] platform::TLMReportingService::Token tlmReportingAgentToken() const {
    return tlmReportingAgentToken_.copy();
  }
  // Whether the framework found back-ends; may stay true without a session when it was too late.
  [[nodiscard]] bool tlmReportingSessionStarted() const {
    return tlmReportingSessionStarted_.load(std::memory_order_acquire);
  }
  // The flag itself, to be watched; lives as long as the session.
  [[nodiscard]] const std::atomic<bool>* getTLMReportingStartedState() const {
    return &tlmReportingSessionStarted_;
  }
  // Gets one signal for each answer of the framework about back-ends; made at the first call.
  [[nodiscard]] const std::shared_ptr<platform::DispatchSemaphore>& tlmreportingBackendSemaphore();
  // What the drivers had counted when the session started; none while nothing was sampled.
  [[nodiscard]] std::optional<DriverSnapShot> driverSnapShot() const {
    return driverSnapShot_.copy();
  }
  void setDriverSnapShot(std::optional<DriverSnapShot> snapShot) {
    driverSnapShot_.set(std::move(snapShot));
  }
  // What the client connection wants to call when the session was stopped. The session only keeps
  // it; whoever takes it out calls it.
  [[nodiscard]] BoolReply transactionCompleteBlock() const;
  void setTransactionCompleteBlock(BoolReply block);
  [[nodiscard]] BoolReply takeTransactionCompleteBlock();

  // Traces of test sessions. Whether one is being recorded: from a start that began one to the
  // stop.
  [[nodiscard]] bool startedTracing() const {
    return startedTracing_.load(std::memory_order_acquire);
  }
  void setStartedTracing(bool started) {
    startedTracing_.store(started, std::memory_order_release);
  }
  // The trace parameters file that was last set up, what it said, and the runner made from it.
  [[nodiscard]] std::string tracingFileName() const { return tracing_.lock()->fileName; }
  [[nodiscard]] std::shared_ptr<const TraceParams> traceParams() const {
    return tracing_.lock()->params;
  }
  [[nodiscard]] std::shared_ptr<TraceRunner> traceRunner() const { return tracing_.lock()->runner; }
  // The trace of the framework that is being recorded; null when there is none.
  [[nodiscard]] std::shared_ptr<platform::KQTraceConfig> traceConfig() const {
    return tracing_.lock()->config;
  }
  [[nodiscard]] std::shared_ptr<platform::KQTraceSession> traceSession() const {
    return tracing_.lock()->session;
  }
  // Where the last finished trace of the framework is; none before one has finished.
  [[nodiscard]] std::optional<std::string> getKQTraceFileURL() const {
    return tracing_.lock()->finalURL;
  }
  // Reads a trace parameters file and makes a runner of it. What goes wrong is logged; an empty
  // path makes none. Waits for the disk.
  void setupTracing(const std::string& path);
  void kqTraceDidStart(const std::optional<platform::Error>& error) override;
  void kqTraceDidStop(const std::optional<platform::Error>& error) override;
  void kqTraceDidComplete(const std::string& url, std::uint64_t token,
                          const std::optional<platform::Error>& error) override;

  // The configuration as it is now, empty if none was set. Every call sees the newest state, and no
  // later change alters what it returned.
  [[nodiscard]] platform::Dictionary configuration() const { return configuration_.copy(); }
  // Adds the entries of a dictionary, new values in the place of old ones; none changes nothing. No
  // key is ever removed.
  void setConfiguration(const platform::Message& configuration);
  void updateConfigurationWithContentsOfConfiguration(const platform::Dictionary& configuration);

  // "reporterID=7,serviceName=haptics,ownerPid=12,HostApplicationDisplayID=Unknown,started=0"
  [[nodiscard]] std::string description() const;
  void appendDescription(std::string& text) const;
  [[nodiscard]] bool shouldReportOrientation() const { return false; }

  // Begins a run with an empty history and, with the link enabled, begins to open the link; does
  // nothing to a started session. Never blocks.
  void start();
  // Tells what the run was like (volume messages, the summary file, the summary event), closes the
  // link behind them, ends the run and forgets its history; does nothing to a session that is not
  // started. Takes time in proportion to the history, and waits for the disk on internal builds.
  void stop();

  // How long the client played at which volume, as one message an interval that was longer than
  // that many seconds, in the order in which the intervals ended.
  [[nodiscard]] static std::vector<platform::Dictionary> createVolumeMessages(
      const MessageHistory& history, double minimumPlaytime);
  // Every value that every key took in this run, and the service type; none without messages.
  [[nodiscard]] platform::Message createSummaryEventForSession() const;
  // On internal builds, writes the history of this run into a file, unless it is empty. What goes
  // wrong is logged.
  void writeSummaryJson() const;

  // Records a message in the history unless it repeats the one before it of its category and type.
  // `sync` is accepted and has no effect. The reply, when there is one, is called with none before
  // this returns. While the message waits to go out over the link, it is charged to `sender`, the
  // client that sent it, which need not be the session's; without one to the session's account.
  void sendMessage(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, bool sync, const ErrorReply& reply,
                   const Account& sender = nullptr);
  void sendMessage(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, const ErrorReply& reply, const Account& sender = nullptr);
  // Sends one message outside any session, one second later, on a background queue; there the
  // reply, when there is one, is called. `userInfo` is accepted and not used. Until then the
  // message is charged to `sender`, who is not refused here: a message that came this far was
  // answered. Without a sender nobody is charged.
  static void sendSingleMessage(const platform::Message& message, AudioEventCategory category,
                                AudioEventType type, AudioServiceType serviceType,
                                const platform::Dictionary& userInfo, const ErrorReply& reply,
                                const Account& sender = nullptr);

  // The message history of the current run, and the lock of all bookkeeping of identifiers.
  [[nodiscard]] HistoryLock nestedAggregatedPayloadData() const { return history_.lock(); }
  // Gives a message its identifier and records it, or drops it as redundant: then true. The caller
  // holds the history, which may be none: then nothing is recorded and the answer is false.
  bool createMessageIdentifierWithCategory(const HistoryLock& history, AudioEventCategory category,
                                           AudioEventType type,
                                           const platform::Dictionary& message);

 private:
  [[nodiscard]] platform::ProcessID ownerPid() const;  // 0 when there is none
  void charge(std::size_t before, std::size_t after);
  // True when the message was redundant.
  bool record(AudioEventCategory category, AudioEventType type,
              const platform::Dictionary& message);

  // The link; but for the submitting functions, jobs of its queue and callbacks.
  struct LinkStart;
  class LinkDiscovery;
  struct LinkMessage {
    platform::Message original{};  // as the client gave it
    platform::Dictionary tagged{};
    AudioEventCategory category{};
    AudioEventType type{};
    bool wasStarted = false;
    bool isRedundant = false;
    Account sender{};  // who is charged while it waits; null: nobody
  };
  void submitLinkStart();
  void startLink(const LinkStart& start);
  static void onBackendsFound(const std::weak_ptr<HVReportingSession>& weakSession,
                              const std::optional<platform::Array>& backends);
  void endLinkStart(platform::WaitOutcome outcome);
  void submitLinkStop();
  void stopLink();
  void endLinkStop();
  void dropLink();
  void setTlmReportingSessionStarted(bool started) {
    tlmReportingSessionStarted_.store(started, std::memory_order_release);
  }
  void submitToLink(LinkMessage message);
  [[nodiscard]] static std::size_t bytesOf(const LinkMessage& message);
  void sendThroughLink(const LinkMessage& message);
  void sendAsSingleMessage(const LinkMessage& message);

  // Both do nothing unless tracing is switched on and this is a test session. The stop blocks until
  // what was traced is complete.
  void startTracing();
  std::shared_ptr<TraceRunner> runnerForThisRun();
  void startFrameworkTrace();
  void stopTracing();

  void sendVolumeMessages();
  void sendSummaryEvent();
  [[nodiscard]] std::string summaryFileName() const;
  [[nodiscard]] std::size_t historySize() const;

  struct Tracing {
    std::string fileName{};
    std::shared_ptr<const TraceParams> params{};
    std::shared_ptr<TraceRunner> runner{};
    std::shared_ptr<platform::KQTraceConfig> config{};
    std::shared_ptr<platform::KQTraceSession> session{};
    std::optional<std::string> finalURL{};
  };

  const ReporterID reporterID_;
  // Signalled when a trace of the framework has completed.
  const std::shared_ptr<platform::DispatchSemaphore> mTraceDispatchSemaphore_;
  Account account_;                           // null: nobody is charged
  std::atomic<std::size_t> chargedBytes_{0};  // orders with nothing: the sum of what was charged
  Guarded<ProcessIdentifiers> processIdentifiers_;
  Guarded<platform::Dictionary> configuration_;
  Guarded<std::optional<MessageHistory>> history_;
  Guarded<BoolReply> transactionCompleteBlock_;
  Guarded<std::optional<DriverSnapShot>> driverSnapShot_;
  Guarded<Tracing> tracing_;
  std::atomic<bool> startedTracing_{false};  // orders what the start of a trace wrote
  std::once_flag tlmReportingQueueMade_;
  std::shared_ptr<platform::DispatchQueue> tlmReportingQueue_;
  std::once_flag backendSemaphoreMade_;
  std::shared_ptr<platform::DispatchSemaphore> backendSemaphore_;
  Guarded<platform::TLMReportingService::Session> tlmReportingSession_;
  Guarded<platform::TLMReportingService::Token> tlmReportingAgentToken_;
  // Set by the framework's thread before it signals the semaphore; orders with nothing else.
  std::atomic<bool> tlmReportingSessionStarted_{false};
  // Single values; a reader on another thread that sees one a little late is no harm.
  std::atomic<AudioServiceType> serviceType_{AudioServiceType::kUnknown};
  std::atomic<bool> tlmReportingEnabled_{false};
  // Set before the history is made and cleared after it is gone: a reader that sees it set may
  // still find no history, and then records nothing.
  std::atomic<bool> started_{false};
};

}  // namespace halvox
