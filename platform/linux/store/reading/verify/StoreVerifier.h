#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// What a verification has read, and what the store says of files beside it.
struct VerifiedStore {
  std::uint64_t records = 0;
  std::int64_t version = 0;             // of the schema
  std::vector<std::string> captures{};  // the paths of the recorded captures, in that order
};

// Verifies a store: the write-ahead log, the pages, the schema, and the records with what the
// database says about them elsewhere. Changes nothing. Reads a snapshot of the database, also while
// a service writes to it; until the end of verify(), the service cannot reuse its write-ahead log,
// which therefore grows.
//
// Belongs to one thread. Blocks on the disk, for minutes if the store is large.
class StoreVerifier {
 public:
  // Does not own `differences`, which must outlive it.
  explicit StoreVerifier(Differences& differences) : differences_(differences) {}

  // Verifies the store in `directory`. Returns what it has read, or why it could not read. Damage
  // that prevents reading is a difference.
  [[nodiscard]] Result<VerifiedStore, StoreError> verify(const std::filesystem::path& directory);

 private:
  [[nodiscard]] SqliteCode verifySnapshot(VerifiedStore& store);
  [[nodiscard]] SqliteCode verifyPages();
  [[nodiscard]] SqliteCode verifyRecords(VerifiedStore& store);
  [[nodiscard]] SqliteCode verifyRuns();
  [[nodiscard]] SqliteCode readCaptures(VerifiedStore& store);

  Differences& differences_;
  std::string file_;
  StoreReader reader_;
};

}  // namespace halvox::platform::linux_
