#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

#include "analysis/Payload.h"

#include "platform/linux/base/Result.h"

namespace halvox::analysis {

enum class RecordKind : std::uint8_t {
  kEvent,        // a named event; each message of a client makes up to two, with equal payloads
  kLinkMessage,  // a message of a session that went through the real-time link
  kIssueMetric,
  kPowerEvent,
  kSnapshot,
  kLoss,  // what the service counted as dropped, suppressed or refused
};

// One stored record. Its views and its payload are valid during the callback only. A member that
// the kind does not have, or that the record does not say, is empty.
//
// An event is not marked with its session, and a link message is not marked with its application.
// MessageJoin brings them together.
struct Record {
  RecordKind kind = RecordKind::kEvent;
  std::int64_t id = 0;    // grows in the order of storing; unique among messages
  double time = 0;        // seconds since 1970
  std::string_view name;  // the whole name of an event or a power event; a loss's piece
  // The service type's name, such as "longformaudio". An event under the name that all services
  // share has the service "halvox".
  std::string_view service;
  // Of messages: the names of their category, such as "Session_Playback", and of their type.
  // Numbers without a name are shown as the service names them.
  std::string_view category;
  std::string_view type;
  std::string_view application;           // of an event
  std::optional<std::int64_t> sessionID;  // of a link message; -1 outside a session
  std::int64_t number = 0;                // a metric's ID, a power event's category, a loss's count
  std::string_view path;                  // of a snapshot
  std::string_view reason;                // of a loss: "dropped: disk full"
  // The JSON object of the record. A metric has none (its bytes are `bytes`), nor has a loss.
  const Payload* payload = nullptr;  // owned by the source, never null in a callback
  std::string_view bytes;
};

// Which records to read: those from `since` up to, but not including, `until`, in seconds since
// 1970. Events and link messages are read together.
struct RecordRange {
  std::optional<double> since;
  std::optional<double> until;
  std::int64_t after = 0;  // only messages that were stored after this record
  bool messages = true;
  bool metrics = false;
  bool power = false;
  bool snapshots = false;
  bool losses = false;
};

// Where records come from: a database of the service, a server, exported files. Reads forward, in
// one pass and constant memory. Belongs to one thread.
class RecordSource {
 public:
  using Callback = std::function<void(const Record&)>;

  RecordSource() = default;
  RecordSource(const RecordSource&) = delete;
  RecordSource& operator=(const RecordSource&) = delete;
  virtual ~RecordSource() = default;

  // Calls `callback` on this thread for each record of the range, before it returns. Messages come
  // in the order of storing, which is the order of time unless the clock was set back; other kinds
  // are merged with them by time. A source can be read several times. After a failure, the records
  // before it have been delivered. The message of a failure names the source.
  [[nodiscard]] virtual platform::linux_::Result<void> forEach(const RecordRange& range,
                                                               const Callback& callback) = 0;
};

}  // namespace halvox::analysis
