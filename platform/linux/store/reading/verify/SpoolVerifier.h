#pragma once

#include <cstdint>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// Verifies the messages that the link could not send yet: that each row can be unpacked, that no
// number is used twice, and that no more messages were sent than a row has. Adds the number of
// messages to `count`. Works in the open transaction of the connection. Returns SQLITE_OK, also
// after damage, which becomes a difference; any other error as it is. Blocks on the disk.
[[nodiscard]] SqliteCode verifySpool(Database& database, Differences& differences,
                                     std::uint64_t& count);

}  // namespace halvox::platform::linux_
