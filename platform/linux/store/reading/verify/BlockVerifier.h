#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/blocks/BlockKeys.h"
#include "platform/linux/store/blocks/MessageBlockReader.h"
#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// Verifies the blocks of messages: that each can be unpacked, that no number is used twice, and
// that the times and the keys in the row and in its span are those of its records. Works in the
// open transaction of the connection. Belongs to one thread. Blocks on the disk.
class BlockVerifier {
 public:
  // Does not own its arguments, which must outlive it.
  BlockVerifier(Database& database, Differences& differences)
      : database_(database), differences_(differences) {}

  // Returns SQLITE_OK, also after damage, which becomes a difference; any other error as it is.
  [[nodiscard]] SqliteCode run();

  // After run(): how many numbers the blocks use, including those of deleted records, and how many
  // records they hold.
  [[nodiscard]] std::uint64_t numbers() const { return numbers_; }
  [[nodiscard]] std::uint64_t records() const { return records_; }

 private:
  // What the records of a block say.
  struct Found {
    bool hasTimes = false;
    double firstTime = 0;
    double lastTime = 0;
    BlockKeys keys{};
  };

  [[nodiscard]] SqliteCode begin();
  void verifyRow();
  [[nodiscard]] Found unpack(std::int64_t id, std::int64_t records);
  void note(const BlockRecord& record, Found& found);
  void verifySpan(std::int64_t id, Found& found);
  [[nodiscard]] SqliteCode skipSpansBefore(std::optional<std::int64_t> id);
  [[nodiscard]] SqliteCode stepSpans();
  void addOpen(std::int64_t id, std::int64_t records);

  Database& database_;
  Differences& differences_;
  Statement blocks_;
  Statement spans_;
  bool hasSpan_ = false;
  std::int64_t newestSpan_ = -1;
  std::int64_t next_ = 0;  // the number after those of the blocks so far
  std::int64_t open_ = 0;  // the records in rows after the newest span
  MessageBlockReader reader_;
  std::uint64_t numbers_ = 0;
  std::uint64_t records_ = 0;
};

}  // namespace halvox::platform::linux_
