// The contract of results files, run on JSON files.

#include <filesystem>
#include <fstream>
#include <iterator>

#include <rapidjson/document.h>

#include "platform/fake/FakePlatform.h"
#include "platform/fake/contracts/ResultsFileContract.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/ScratchDirectory.h"
#include "platform/linux/tracing/JsonResultsFileService.h"

namespace halvox::platform::contract {
namespace {

class JsonResultsFileHarness {
 public:
  JsonResultsFileHarness() { std::filesystem::create_directories(root_ / "logs"); }

  ResultsFileService& service() { return service_; }
  std::string usable(const std::string& name) { return "/logs/" + name; }
  std::string unusable() { return "/missing/results.ssj"; }
  std::optional<ResultsFileContent> read(const std::string& path) {
    std::ifstream file(root_.string() + path);
    if (!file) return std::nullopt;
    const std::string text((std::istreambuf_iterator<char>(file)), {});
    rapidjson::Document document;
    document.Parse<rapidjson::kParseFullPrecisionFlag>(text.data(), text.size());
    if (document.HasParseError()) return std::nullopt;
    ResultsFileContent content{document["product"].GetString(), document["version"].GetUint(), {}};
    // A range-based loop does not compile, because clang 14 cannot compare the iterators of this
    // library's objects.
    const rapidjson::Value& all = document["values"];
    for (auto member = all.MemberBegin(); !(member == all.MemberEnd()); ++member) {
      std::vector<double> values;
      for (const auto& value : member->value.GetArray()) values.push_back(value.GetDouble());
      content.values.emplace_back(member->name.GetString(), std::move(values));
    }
    return content;
  }

 private:
  FakePlatform platform_;  // for the log
  linux_::CounterStatisticsService statistics_;
  const linux_::ScratchDirectory directory_;
  const std::filesystem::path root_ = directory_.path() / "root";
  linux_::JsonResultsFileService service_{root_, platform_.log, statistics_};
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Json, ResultsFileContract, JsonResultsFileHarness);

}  // namespace halvox::platform::contract
