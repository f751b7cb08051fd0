#include "platform/linux/store/reading/verify/SpoolVerifier.h"

#include <string>

#include "platform/linux/store/spool/SpoolRow.h"

namespace halvox::platform::linux_ {

SqliteCode verifySpool(Database& database, Differences& differences, std::uint64_t& count) {
  Statement rows;
  SqliteCode code =
      database.prepare("SELECT first, messages, sent, block FROM link_spool ORDER BY first", rows);
  std::int64_t next = 0;  // the number after those of the row before
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = rows.step();
    if (code != SQLITE_ROW) continue;
    const std::int64_t first = rows.integer(0);
    const std::int64_t messages = rows.integer(1);
    const std::int64_t sent = rows.integer(2);
    const std::string place = rowPlace(first);
    if (messages < 1 || !readSpoolRow(rows.bytes(3), static_cast<std::size_t>(messages))) {
      differences.add("link_spool", place,
                      "cannot be read as " + std::to_string(messages) + " messages");
      continue;
    }
    if (first < next) differences.add("link_spool", place, "has numbers of the row before");
    if (sent < 0 || sent >= messages) {
      differences.add("link_spool", place,
                      "says that " + std::to_string(sent) + " of its " + std::to_string(messages) +
                          " messages were sent");
    }
    next = first + messages;
    count += static_cast<std::uint64_t>(messages);
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

}  // namespace halvox::platform::linux_
