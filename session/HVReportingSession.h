#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "session/DriverSnapShot.h"
#include "session/ReplyCallbacks.h"
#include "session/SessionCounters.h"
#include "session/SessionHistory.h"
#include "session/SessionLink.h"
#include "session/SessionProfile.h"
#include "session/SessionStop.h"
#include "session/SessionSummary.h"
#include "session/SessionTracing.h"

namespace halvox {

// Message keys offered to clients. The service reads neither, and this is required: no field is
// excluded from comparisons and no message is throttled. The established names begin with "_HV",
// which C++ reserves for itself. These therefore begin with k.
inline constexpr std::string_view kHVReportingSessionBlacklistFieldsKey =
    "_comparison_field_blacklist";
inline constexpr std::string_view kHVReportingSessionThrottleSecondsKey = "_throttle_seconds";

// One reporting session of one client: takes its messages from the start to the stop, records them,
// and passes them on to the real-time link.
//
//   created --start--> started --stop--> stopped --start--> started
//   any state --last reference released--> destroyed, without being stopped
//
// The client's connection object owns it and drives it on the reporting queue. Jobs and analytics
// payloads that need the session share it. Therefore it is always held by a shared pointer. The
// properties may be read and written from any thread; each access is indivisible. No operation
// fails.
//
// Each concern is a member: the profile (what the session is), the history (what it recorded), the
// link (where messages go), the summary (what a stop reports) and the traces of test sessions.
class HVReportingSession : public std::enable_shared_from_this<HVReportingSession> {
 public:
  using ProcessIdentifiers = SessionProfile::ProcessIdentifiers;
  using Account = std::shared_ptr<ResourceAccount>;
  using Counters = std::shared_ptr<const SessionCounters>;
  using HistoryLock = SessionHistory::Lock;

  // `counters` are shared by all sessions.
  HVReportingSession(ReporterID reporterID, ProcessIdentifiers processIdentifiers,
                     Counters counters);
  HVReportingSession(const HVReportingSession&) = delete;
  HVReportingSession& operator=(const HVReportingSession&) = delete;
  ~HVReportingSession();

  // Charges what the session holds to `account` until the session is destroyed. Call at most once,
  // before any other operation.
  void chargeTo(Account account) { held_.chargeTo(std::move(account)); }

  [[nodiscard]] ReporterID reporterID() const { return profile_.reporterID(); }
  // The processes of the owner; the first one is reported as the owner.
  [[nodiscard]] ProcessIdentifiers processIdentifiers() const {
    return profile_.processIdentifiers();
  }
  void setProcessIdentifiers(ProcessIdentifiers identifiers) {
    profile_.setProcessIdentifiers(std::move(identifiers));
  }
  // Setting the type changes the name too.
  [[nodiscard]] AudioServiceType serviceType() const { return profile_.serviceType(); }
  void setServiceType(AudioServiceType serviceType) { profile_.setServiceType(serviceType); }
  [[nodiscard]] std::string_view serviceName() const { return profile_.serviceName(); }
  // The configuration at this moment, empty if none was set. Later changes do not alter the
  // returned dictionary.
  [[nodiscard]] platform::Dictionary configuration() const { return profile_.configuration(); }
  // Both add the entries of a dictionary. A new value replaces the old one, and no key is ever
  // removed. Without a dictionary nothing changes.
  void setConfiguration(const platform::Message& configuration);
  void updateConfigurationWithContentsOfConfiguration(const platform::Dictionary& configuration) {
    profile_.mergeConfiguration(configuration);
  }

  // True from start to stop.
  [[nodiscard]] bool started() const { return started_.load(std::memory_order_acquire); }
  // Whether the session uses its link; false at first.
  [[nodiscard]] bool tlmReportingEnabled() const {
    return tlmReportingEnabled_.load(std::memory_order_relaxed);
  }
  void setTlmReportingEnabled(bool enabled) {
    tlmReportingEnabled_.store(enabled, std::memory_order_relaxed);
  }
  // The state of the link and of the traces, for callers that watch them.
  [[nodiscard]] SessionLink& link() { return link_; }
  [[nodiscard]] SessionTracing& tracing() { return tracing_; }
  // What the drivers had counted when the session started; none if nothing was sampled.
  [[nodiscard]] std::optional<DriverSnapShot> driverSnapShot() const {
    return driverSnapShot_.copy();
  }
  void setDriverSnapShot(std::optional<DriverSnapShot> snapShot) {
    driverSnapShot_.set(std::move(snapShot));
  }
  // The reply that the client connection calls when the session has been stopped. The session only
  // keeps it. A reply that is still here when the session is destroyed is counted as dropped.
  [[nodiscard]] BoolReply transactionCompleteBlock() const {
    return transactionCompleteBlock_.copy();
  }
  void setTransactionCompleteBlock(BoolReply block) {
    transactionCompleteBlock_.set(std::move(block));
  }
  [[nodiscard]] BoolReply takeTransactionCompleteBlock() {
    return transactionCompleteBlock_.take();
  }

  // "reporterID=7,serviceName=haptics,ownerPid=12,HostApplicationDisplayID=Unknown,started=0"
  [[nodiscard]] std::string description() const;
  void appendDescription(std::string& text) const;
  // Nothing calls this; it is part of the session's interface.
  [[nodiscard]] bool shouldReportOrientation() const { return false; }

  // Begins a run with an empty history, begins to open the link if it is enabled, and traces the
  // run of a test session. Does nothing to a started session. Does not wait for the link, but reads
  // the trace parameters file if there is one.
  void start();
  // Reports the run (volume messages, the summary file, the summary event), closes the link after
  // those messages, ends the trace, and forgets the history. Does nothing unless the session is
  // started. Takes time in proportion to the history. Waits for the disk on internal builds, and
  // for the trace of a test session without a time-out.
  void stop();
  // Does the same, but leaves a summary file and what must follow it to the caller. The session is
  // stopped when this returns. Returns null if nothing remains.
  [[nodiscard]] std::unique_ptr<SessionStop> beginStop();

  // How long the client played at which volume: one message for each interval longer than
  // `minimumPlaytime` seconds, in the order in which the intervals ended.
  [[nodiscard]] static std::vector<platform::Dictionary> createVolumeMessages(
      const MessageHistory& history, double minimumPlaytime);
  // The service type and every value that every key had in this run; none without messages.
  [[nodiscard]] platform::Message createSummaryEventForSession() const {
    return summary_.createEvent();
  }
  // On internal builds, writes the history of this run into a file, unless it is empty. Logs
  // failures. Waits for the disk.
  void writeSummaryJson() const { summary_.writeFile(); }

  // Records a message, unless it repeats the previous one of its category and type, and passes it
  // to the link. `sync` has no effect; this is required. Calls the reply, if there is one, without
  // an error before it returns. While the message waits for the link it is charged to `sender`, the
  // client that sent it, which need not own the session; null charges the session's account.
  void sendMessage(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, bool sync, const ErrorReply& reply,
                   const Account& sender = nullptr);
  void sendMessage(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, const ErrorReply& reply, const Account& sender = nullptr);
  // Sends one message outside any session, one second from now, on the background queue, and then
  // calls the reply, if there is one, on that queue. `userInfo` has no effect; this is required.
  // Until it is sent, the message is charged to `sender`; null charges nobody.
  static void sendSingleMessage(const platform::Message& message, AudioEventCategory category,
                                AudioEventType type, AudioServiceType serviceType,
                                const platform::Dictionary& userInfo, const ErrorReply& reply,
                                const Account& sender, const SessionCounters& counters);

  // The message history of the current run, locked. The lock also guards the counts of identifiers.
  [[nodiscard]] HistoryLock nestedAggregatedPayloadData() const { return history_.lock(); }
  // Records a message under its next identifier and returns false, or drops it as redundant and
  // returns true. The caller holds the history's lock. Without a history nothing is recorded and
  // the result is false.
  bool createMessageIdentifierWithCategory(const HistoryLock& history, AudioEventCategory category,
                                           AudioEventType type,
                                           const platform::Dictionary& message) {
    return history_.recordLocked(history, category, type, message) ==
           SessionHistory::Outcome::kRedundant;
  }

 private:
  friend class SessionStop;

  void sendVolumeMessages();
  void sendSummaryEvent(const std::shared_ptr<const LateSummary>& run);
  // The end of a stop, after the file. `run` is null if the history was empty.
  void endStop(const std::shared_ptr<const LateSummary>& run);
  void count(SessionHistory::Outcome outcome) const;

  // Members that others refer to come first, because destruction runs backwards.
  const Counters counters_;
  ResourceTally held_;
  SessionProfile profile_;
  SessionHistory history_;
  SessionLink link_;
  SessionTracing tracing_;
  const SessionSummary summary_;
  Guarded<BoolReply> transactionCompleteBlock_;
  Guarded<std::optional<DriverSnapShot>> driverSnapShot_;
  std::atomic<bool> tlmReportingEnabled_{false};  // orders nothing else
  // Set before the history is created and cleared after it has been taken. A thread that reads true
  // may therefore find no history, and then records nothing.
  std::atomic<bool> started_{false};
};

}  // namespace halvox
