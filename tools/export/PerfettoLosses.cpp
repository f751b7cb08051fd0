#include "tools/export/PerfettoLosses.h"

#include <array>
#include <string>
#include <utility>

namespace halvox::tools {
namespace {

using TrackKind = PerfettoTrace::TrackKind;

// Above those of the applications and that of the trace results.
constexpr std::int32_t kPid = 1'000'001;

}  // namespace

void PerfettoLosses::add(const analysis::Record& record) {
  if (record.kind != analysis::RecordKind::kLoss) return;
  const auto track = PerfettoTrace::track(TrackKind::kLoss, 1);
  if (!std::exchange(isDescribed_, true)) {
    const auto process = PerfettoTrace::track(TrackKind::kProcess, kPid);
    trace_.describeProcess(process, kPid, "halvox-reportingd");
    trace_.describeTrack(track, process, "losses (at the time of recording)");
  }
  const std::string name = std::string(record.name) + ": " + std::string(record.reason);
  const std::array annotations{PerfettoTrace::Annotation{.name = "count", .value = record.number}};
  trace_.addInstant({.track = track,
                     .time = PerfettoTrace::timeOf(record.time),
                     .name = name,
                     .category = "loss",
                     .annotations = annotations});
}

}  // namespace halvox::tools
