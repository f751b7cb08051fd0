// The contract of files, run on the fake.

#include "platform/fake/contracts/FileContract.h"

#include "platform/fake/FakeFileService.h"
#include "platform/fake/Journal.h"

namespace halvox::platform::contract {
namespace {

class FakeFileHarness {
 public:
  FileService& service() { return service_; }
  std::vector<std::string> names(const std::string& directory) const {
    std::vector<std::string> names;
    for (const auto& file : service_.files()) {
      if (file.directory == directory) names.push_back(file.name);
    }
    return names;
  }
  std::vector<std::string> keys(const std::string& directory, const std::string& name) const {
    std::vector<std::string> keys;
    for (const auto& file : service_.files()) {
      if (file.directory != directory || file.name != name) continue;
      for (const auto& object : file.objects) keys.push_back(object.first);
    }
    return keys;
  }

 private:
  Journal journal_;
  FakeFileService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, FileContract, FakeFileHarness);

}  // namespace halvox::platform::contract
