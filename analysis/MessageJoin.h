#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "analysis/RecordSource.h"

namespace halvox::analysis {

// The key of the summary of a session's run.
inline constexpr std::string_view kSummaryKey = "HV_Session_Summary_Event";

// True for the record of the summary of a session's run. A client can send a message with the same
// names and key, but the service gives it a stamp of its own.
[[nodiscard]] bool isSummary(const Record& record);

// One message of a client, or of the service itself, with all that its records say.
struct Message {
  std::int64_t id = 0;      // of its first event, or of its link message if it has no event
  double time = 0;          // when it was recorded, in seconds since 1970
  std::string name;         // of an event that is not a message, such as the end of a client
  std::string service;      // empty if unknown
  std::string category;     // with its domain: "Session_Playback"
  std::string type;         // "Start"
  std::string application;  // empty if unknown
  std::optional<std::int64_t> sessionID;  // -1 outside a session
  std::string payload;                    // JSON
  bool isEvent = false;                   // it was recorded as an event
  bool isLinkMessage = false;             // it went through the link
  bool isSummary = false;                 // it is the summary of a session's run
  // The IDs of its records; 0 if it has no such record.
  std::int64_t commonID = 0;   // the event under the name that all services share
  std::int64_t serviceID = 0;  // the event under the name of its service type
  std::int64_t linkID = 0;
};

// Makes one message of its records: up to two events, whose names differ and whose payloads are
// equal, and one link message for each session, which has another key in its payload. The stamp
// that the service puts into each message brings event and link message together.
//
// The link records a message later than the events do. It never records a message that repeats the
// one before, or any message of a service without a link in the store. A message therefore waits
// for its other record until kLongestWait seconds of records, kMostWaiting messages, or
// kMostWaitingBytes of payloads have passed. A payload that is larger waits alone. Messages come
// out in the order of their first records, with one exception: the summary that ends a run of a
// session may be recorded after events of the session's next run, but not after their link
// messages. It comes out before the first message whose link message is recorded after it. Of a
// summary, which can have many megabytes, only the entry that names it is kept.
//
// Belongs to one thread.
class MessageJoin {
 public:
  static constexpr double kLongestWait = 10;
  static constexpr std::size_t kMostWaiting = 4096;
  static constexpr std::size_t kMostWaitingBytes = std::size_t{16} << 20U;  // of payloads

  using Callback = std::function<void(const Message&)>;
  // Calls `callback` from add() and finish().
  explicit MessageJoin(Callback callback) : callback_(std::move(callback)) {}

  // Takes the next event or link message; ignores other kinds.
  void add(const Record& record);
  // Delivers the messages that were recorded before that time, in seconds since 1970, and have not
  // found their other record. A record that comes later becomes a message of its own.
  void deliverBefore(double time);
  // Delivers the messages that still wait. Call once, after the last record.
  void finish();

 private:
  struct Waiting {
    Message message;
    std::uint64_t key = 0;             // of stamp, category and type; 0 without a stamp
    bool hasCommon = false;            // its event under the name that all services share
    bool isComplete = false;           // nothing more can come
    std::vector<Message> summaries{};  // of earlier runs; delivered before this message
    bool isDelivered = false;          // a summary that was delivered before another message
  };

  void addEvent(const Record& record);
  void addLinkMessage(const Record& record);
  void addSummary(const Record& record);
  // Moves the summaries of the session that wait behind that message to it.
  void moveSummariesTo(Waiting& message, std::int64_t sessionID);
  void forgetSummary(std::int64_t sessionID, std::uint64_t number);
  [[nodiscard]] bool completesTwin(const Record& record);
  // Finds a message that waits for a record of the other kind.
  [[nodiscard]] Waiting* find(std::uint64_t key, const Record& record);
  Waiting& push(const Record& record, std::uint64_t key);
  void setPayload(Message& message, const Record& record);
  void deliverReady(double now);
  void deliverFirst();
  [[nodiscard]] Waiting* waiting(std::uint64_t number);

  Callback callback_;
  std::deque<Waiting> waiting_;
  std::size_t waitingBytes_ = 0;                                 // of the payloads
  std::uint64_t firstNumber_ = 0;                                // of waiting_.front()
  std::unordered_multimap<std::uint64_t, std::uint64_t> byKey_;  // key to number
  std::optional<std::uint64_t> lastEvent_;  // the number of the last event's message
  std::unordered_multimap<std::int64_t, std::uint64_t>
      summaries_;  // session to number, if it waits
};

}  // namespace halvox::analysis
