#pragma once

// Shared by the tests of this folder.

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/files/RootedFileService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

// A fixture with a service whose root, in a scratch directory, does not exist yet.
class FilesFixture : public testing::Test {
 protected:
  // Commits the file and returns the code of its error, or 0.
  static std::int64_t codeOf(JsonArrayFile& file) {
    std::string path;
    const auto error = file.commit(path);
    return error.has_value() ? error->code : 0;
  }
  static std::string textOf(const std::filesystem::path& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
  }
  static std::vector<std::string> namesIn(const std::filesystem::path& directory) {
    std::vector<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
      names.push_back(entry.path().filename().string());
    }
    std::ranges::sort(names);
    return names;
  }
  std::uint64_t count(const char* name) { return statistics_.counter("files", name).value(); }

  const ScratchDirectory directory_;
  const std::filesystem::path scratch_ = directory_.path();
  const std::filesystem::path root_ = scratch_ / "root";
  const std::filesystem::path outside_ = scratch_ / "outside";
  CounterStatisticsService statistics_;
  RootedFileService service_{root_, statistics_};
};

}  // namespace halvox::platform::linux_
