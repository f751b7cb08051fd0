#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace halvox::platform::linux_ {

// What to erase. Exactly one member is set.
struct EraseRequest {
  std::optional<std::string> application{};
  std::optional<std::int64_t> session{};
  std::optional<double> before{};  // seconds since 1970
};

// The part of a record that says whose it is. The members that its kind lacks are empty.
struct ErasableRecord {
  enum class Kind : std::uint8_t { kEvent, kLink, kOther };
  Kind kind = Kind::kOther;
  std::string_view application{};  // of an event
  std::int64_t sessionID = 0;      // of a link message
  std::string_view payload{};      // JSON text, or the bytes of an issue metric
  bool isOfAll = false;            // may hold something of every application and session
};

// Decides which records belong to the application or the session of a request. The records of a
// time need no decision; see RecordKind::deleteOlderThan().
//
// Of an application: records that have its name as a text of their own, and link messages that
// have the time stamp of one of its events. A link message without a known stamp, such as the
// summary of a session, belongs to the application to which its session's last message belonged.
// Of a session: its link messages, and events that have the stamp of one of them.
//
// Events and link messages of one client message may be stored in any order. All records are
// therefore looked at first:
//
//   look() for each record, endLook(), then selects() for each record in the order of numbers
//
// Keeps 8 bytes for each message of the selection. Belongs to one thread.
class EraseSelection {
 public:
  // The bounds of what is remembered of others. See ApplicationFilter of halvoxctl.
  static constexpr std::size_t kMostStamps = 65'536;
  static constexpr std::size_t kMostSessions = 65'536;

  explicit EraseSelection(EraseRequest request);

  [[nodiscard]] const EraseRequest& request() const { return request_; }
  void look(const ErasableRecord& record);
  void endLook();
  [[nodiscard]] bool selects(const ErasableRecord& record);
  // Notes a record that selects() is called with soon: a link message may be stored before the
  // event with its stamp.
  void announce(const ErasableRecord& record);
  // Returns true if a message of the selection has this stamp. Call it after endLook().
  [[nodiscard]] bool hasStamp(double stamp) const;

 private:
  [[nodiscard]] bool isNamedIn(const ErasableRecord& record) const;
  [[nodiscard]] bool selectsLink(const ErasableRecord& record);
  void noteOther(std::uint64_t stamp);

  const EraseRequest request_;
  std::string quoted_;                 // the application's name as a JSON text
  std::string prefixed_;               // the same after its length, as in an issue metric
  std::vector<std::uint64_t> stamps_;  // the bits of the times, sorted by endLook()
  std::unordered_set<std::uint64_t> others_;
  std::deque<std::uint64_t> oldest_;  // of others_, in order
  std::unordered_map<std::int64_t, bool> sessions_;
};

// Returns the stamp that the service added to a message.
[[nodiscard]] std::optional<double> stampOf(std::string_view payload);

}  // namespace halvox::platform::linux_
