// The contract of results files, run on the fake.

#include "platform/fake/contracts/ResultsFileContract.h"

#include <algorithm>

#include "platform/fake/FakeResultsFileService.h"
#include "platform/fake/Journal.h"

namespace halvox::platform::contract {
namespace {

class FakeResultsFileHarness {
 public:
  ResultsFileService& service() { return service_; }
  std::string usable(const std::string& name) { return "/logs/" + name; }
  std::string unusable() {
    service_.failToOpen("/missing/results.ssj");
    return "/missing/results.ssj";
  }
  std::optional<ResultsFileContent> read(const std::string& path) {
    const auto file = service_.finished(path);
    if (!file.has_value()) return std::nullopt;
    ResultsFileContent content{file->productName, file->version, {}};
    for (const auto& measurement : file->measurements) {
      auto place = std::ranges::find_if(
          content.values, [&](const auto& entry) { return entry.first == measurement.name; });
      if (place == content.values.end()) {
        place = content.values.insert(place, {measurement.name, std::vector<double>()});
      }
      place->second.push_back(measurement.value);
    }
    return content;
  }

 private:
  Journal journal_;
  FakeResultsFileService service_{journal_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ResultsFileContract, FakeResultsFileHarness);

}  // namespace halvox::platform::contract
