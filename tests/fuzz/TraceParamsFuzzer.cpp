// Feeds hostile bytes as a trace parameters file to everything from the bytes to the record.
// Reading must end and give a record in which every trace point obeys the rules of its kind.

#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/tracing/PlistPropertyListService.h"
#include "platform/services.h"
#include "tracing/TraceParamsParser.h"

namespace halvox {
namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

// Every file contains the bytes of this run.
class BytesPropertyListService final : public platform::PropertyListService {
 public:
  void setBytes(std::span<const std::uint8_t> bytes) {
    bytes_ = platform::Data(std::as_bytes(bytes));
  }

  std::string currentDirectory() const override { return lists_.currentDirectory(); }
  std::optional<platform::Data> readFile(std::string_view /*path*/,
                                         std::optional<platform::Error>& /*error*/) const override {
    return bytes_;
  }
  std::optional<platform::Value> parse(const std::optional<platform::Data>& bytes,
                                       std::optional<platform::Error>& error) const override {
    auto root = lists_.parse(bytes, error);
    require(root.has_value() != error.has_value());
    // Bytes that pass the check of the shape must not turn out deeper than its bound.
    require(!error.has_value() || error->description.find("turned out") == std::string::npos);
    return root;
  }

 private:
  platform::linux_::PlistPropertyListService lists_;
  std::optional<platform::Data> bytes_;
};

platform::Services servicesWith(platform::FakePlatform& fakes,
                                platform::PropertyListService& lists) {
  return {.analytics = fakes.analytics,
          .clock = fakes.clock,
          .connections = fakes.connections,
          .deviceProperties = fakes.deviceProperties,
          .diagnosticReporters = fakes.diagnosticReporters,
          .dispatch = fakes.dispatch,
          .featureFlags = fakes.featureFlags,
          .files = fakes.files,
          .ioReport = fakes.ioReport,
          .kdebug = fakes.kdebug,
          .ktrace = fakes.ktrace,
          .log = fakes.log,
          .metrics = fakes.metrics,
          .notify = fakes.notify,
          .overflow = fakes.overflow,
          .performanceTraces = fakes.performanceTraces,
          .powerLog = fakes.powerLog,
          .preferences = fakes.preferences,
          .privacy = fakes.privacy,
          .process = fakes.process,
          .propertyLists = lists,
          .resultsFiles = fakes.resultsFiles,
          .statistics = fakes.statistics,
          .tlmReporting = fakes.tlmReporting};
}

void check(const TraceParams& params) {
  for (const TraceDataParams& point : params.tracePoints) {
    switch (point.kind) {
      case TracePointKind::kImpulse:
        require(point.endCode == point.beginCode);
        break;
      case TracePointKind::kInterval:
        break;
      case TracePointKind::kLevel:
        require(point.endCode == 0);
        break;
    }
  }
}

// The services are kept, because the parser makes its log category only once.
void read(std::span<const std::uint8_t> bytes) {
  static platform::FakePlatform& fakes = *new platform::FakePlatform;
  static BytesPropertyListService& lists = *new BytesPropertyListService;
  platform::installServices(servicesWith(fakes, lists));
  fakes.log.clear();
  lists.setBytes(bytes);
  check(TraceParamsParser("/bytes.plist").loadTraceParams());
}

}  // namespace
}  // namespace halvox

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  halvox::read({data, size});
  return 0;
}
