// Unpacks arbitrary bytes as a snapshot. Nothing may appear outside the directory it is unpacked
// to, and nothing but plain files and directories may appear in it.

#include <cstdint>
#include <filesystem>
#include <span>
#include <string>

#include "platform/linux/testing/ScratchDirectory.h"
#include "tests/fuzz/InputFile.h"
#include "tools/SnapshotReader.h"

namespace {

using namespace halvox;
using fuzzing::require;

void read(std::span<const std::uint8_t> bytes) {
  const fuzzing::InputFile file(bytes);
  const platform::linux_::ScratchDirectory scratch;
  const std::filesystem::path parent = scratch.path() / "parent";
  std::filesystem::create_directory(parent);

  static_cast<void>(tools::readSnapshotFiles(file.path(), {"signature.json", "log.txt"}));
  const auto names =
      tools::unpackSnapshot(file.path(), parent / "out", tools::ExistingFiles::kRefuse);
  require(names || !names.error().message.empty());

  for (const auto& entry : std::filesystem::recursive_directory_iterator(scratch.path())) {
    require(!entry.is_symlink() && (entry.is_regular_file() || entry.is_directory()));
    const std::string place = entry.path().lexically_relative(scratch.path());
    require(place == "parent" || place.starts_with("parent/out"));
    require(entry.is_directory() || entry.hard_link_count() == 1);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  read({data, size});
  return 0;
}
