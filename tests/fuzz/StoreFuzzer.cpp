// Reads arbitrary bytes as the database of a store that an unknown program wrote. Reading must end,
// and what is delivered must be within the bytes.

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <span>

#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "platform/linux/testing/ScratchDirectory.h"
#include "tests/fuzz/InputFile.h"

namespace {

using namespace halvox::platform::linux_;
using halvox::fuzzing::require;

// A block of a few bytes may stand for many small records.
constexpr std::uint64_t kMostRecords = 20'000;

void readAll(const std::filesystem::path& directory) {
  StoreReader reader;
  if (!reader.open(directory)) return;
  for (const RecordOrder order : {RecordOrder::kOldestFirst, RecordOrder::kNewestFirst}) {
    std::uint64_t count = 0;
    RecordFilter filter;
    filter.order = order;
    filter.isEnough = [&count] { return count >= kMostRecords; };
    static_cast<void>(reader.forEachEvent(filter, [&count](const StoredEvent& event) {
      require(event.id > 0);
      ++count;
    }));
    static_cast<void>(
        reader.forEachRecord(kLinkMessages, filter, [&count](const StoredRecord& record) {
          require(record.fields.size() == kLinkMessages.columns.size());
          ++count;
        }));
  }
  std::uint64_t items = 0;
  static_cast<void>(reader.forEachItem(
      {.messages = true, .metrics = true, .power = true, .snapshots = true, .losses = true}, {},
      [&](const StoredItem&) {
        if (++items >= kMostRecords) reader.stopReading();
      }));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  // On a file system: the database's own files are made beside it.
  const ScratchDirectory directory;
  std::ofstream(directory.path() / "halvox.db", std::ios::binary)
      .write(reinterpret_cast<const char*>(data), static_cast<std::streamsize>(size));
  readAll(directory.path());
  return 0;
}
