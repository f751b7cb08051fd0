// Reads arbitrary bytes as the results file of a trace.

#include <cstdint>
#include <span>
#include <sstream>

#include "tests/fuzz/InputFile.h"
#include "tools/TraceResults.h"

namespace {

using namespace halvox;
using fuzzing::require;

void read(std::span<const std::uint8_t> bytes) {
  const fuzzing::InputFile file(bytes);
  const auto results = tools::readTraceResults(file.path());
  if (!results) {
    require(!results.error().message.empty());
    return;
  }
  for (const auto& [name, values] : results->values) {
    if (values.empty()) continue;
    const tools::TraceStatistics statistics = tools::statisticsOf(values);
    require(statistics.count == values.size());
    require(statistics.minimum <= statistics.median);
    require(statistics.median <= statistics.percentile95);
    require(statistics.percentile95 <= statistics.percentile99);
    require(statistics.percentile99 <= statistics.maximum);
  }
  std::ostringstream out;
  tools::writeTraceEvents(*results, out);
  require(!out.str().empty());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  read({data, size});
  return 0;
}
