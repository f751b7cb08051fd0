#pragma once

#include <chrono>
#include <cstdint>
#include <span>

#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// Keeps the store within its age and its size, by deleting the oldest records, of whatever kind, in
// small steps.
// Belongs to the writer's thread. Uses no timer: it is asked after commits, and at the start.
class Retention {
 public:
  struct Limits {
    std::chrono::seconds age;
    std::uint64_t databaseBytes;
    std::uint64_t transactionBytes;  // how much one transaction adds, about
  };
  explicit Retention(const Limits& limits) : limits_(limits) {}

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Lets go of all statements, before each closing.
  void release();

  // Deletes what is due in one small transaction of its own. `now` is seconds since 1970. Without
  // an error, `more` tells whether some is left for another call.
  [[nodiscard]] SqliteCode runOnce(double now, std::span<RecordKind* const> kinds, bool& more);

 private:
  using Time = std::chrono::steady_clock::time_point;

  [[nodiscard]] SqliteCode readUse();
  // Whether there is no room for another transaction.
  [[nodiscard]] bool isFull() const;
  [[nodiscard]] std::uint64_t fileBytes() const { return pages_ * pageBytes_; }
  [[nodiscard]] SqliteCode deleteAged(double now, std::span<RecordKind* const> kinds, bool& more);
  [[nodiscard]] SqliteCode deleteForSize(std::span<RecordKind* const> kinds, bool& more);
  [[nodiscard]] SqliteCode shrinkFile(bool& more);

  const Limits limits_;
  struct Statements {
    Statement begin;
    Statement commit;
    Statement rollback;
    Statement pages;
    Statement freePages;
    Statement vacuum;
    Statement checkpoint;
  } statements_;
  std::uint64_t pageBytes_ = 0;
  std::uint64_t pages_ = 0;
  std::uint64_t freePages_ = 0;
  Time nextByAge_{};  // the first call looks at ages
};

}  // namespace halvox::platform::linux_
