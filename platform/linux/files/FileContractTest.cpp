// Tests the contract of files on the adapter.

#include "platform/fake/contracts/FileContract.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>

#include "platform/linux/files/RootedFileService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::contract {
namespace {

class RootedFileHarness {
 public:
  FileService& service() { return service_; }
  std::vector<std::string> names(const std::string& directory) const {
    std::vector<std::string> names;
    std::error_code none;  // a missing directory has no names
    for (const auto& entry : std::filesystem::directory_iterator(pathOf(directory), none)) {
      names.push_back(entry.path().filename().string());
    }
    return names;
  }
  std::vector<std::string> keys(const std::string& directory, const std::string& name) const {
    std::ifstream file(pathOf(directory) / name);
    const std::string text((std::istreambuf_iterator<char>(file)), {});
    // Each object of the test has one entry, which is a dictionary of numbers.
    static const std::regex kKey("\"([a-z]+)\": *\\{");
    std::vector<std::string> keys;
    for (std::sregex_iterator match(text.begin(), text.end(), kKey), end; match != end; ++match) {
      keys.push_back((*match)[1]);
    }
    return keys;
  }

 private:
  std::filesystem::path pathOf(const std::string& directory) const {
    return scratch_.path() / "root" / directory.substr(1);
  }

  const linux_::ScratchDirectory scratch_;
  linux_::CounterStatisticsService statistics_;
  linux_::RootedFileService service_{scratch_.path() / "root", statistics_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Rooted, FileContract, RootedFileHarness);

}  // namespace halvox::platform::contract
