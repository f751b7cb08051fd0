#pragma once

#include <chrono>
#include <cstdint>
#include <span>

#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// Keeps the store within its limits of age and size. Deletes the oldest records of all kinds, in
// small transactions between the transactions that store records.
// Owned by the store and used by the writer's thread only. Has no timer, because an idle service
// must cause no wake-ups. Instead, the writer calls it at the start and after commits. Expired
// records of a service that receives nothing therefore stay until the next record is written.
class Retention {
 public:
  struct Limits {
    std::chrono::seconds age;
    std::uint64_t databaseBytes;
    std::uint64_t transactionBytes;  // how much payload one transaction may add
  };
  explicit Retention(const Limits& limits) : limits_(limits) {}

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Finalizes all statements, before each closing of the database.
  void release();

  // Runs one step in a transaction of its own. `now` is seconds since 1970. Sets `more` to whether
  // another call would find work. After an error the transaction may still be open: the caller
  // reads the text of the error and then rolls back, because a rollback replaces the text.
  [[nodiscard]] SqliteCode runOnce(double now, std::span<RecordKind* const> kinds, bool& more);

 private:
  using Time = std::chrono::steady_clock::time_point;

  [[nodiscard]] SqliteCode readUse();
  // Returns true if one more transaction and `more` bytes could make the file outgrow its limit.
  [[nodiscard]] bool isFull(std::uint64_t more = 0) const;
  [[nodiscard]] std::uint64_t fileBytes() const { return pages_ * pageBytes_; }
  [[nodiscard]] SqliteCode deleteAged(double now, std::span<RecordKind* const> kinds, bool& more);
  [[nodiscard]] SqliteCode deleteForSize(std::span<RecordKind* const> kinds, bool& more);
  [[nodiscard]] SqliteCode shrinkFile(bool& more);

  const Limits limits_;
  struct Statements {
    Statement begin;
    Statement commit;
    Statement pages;
    Statement freePages;
    Statement vacuum;
    Statement checkpoint;
  } statements_;
  std::uint64_t pageBytes_ = 0;
  std::uint64_t pages_ = 0;
  std::uint64_t freePages_ = 0;
  Time nextByAge_{};  // in the past, so that the first call looks for expired records
};

}  // namespace halvox::platform::linux_
