#include "analysis/StreamStory.h"

#include <algorithm>

namespace halvox::analysis {

std::string_view directionName(StreamDirection direction) {
  switch (direction) {
    case StreamDirection::kUnknown:
      return "";
    case StreamDirection::kPlayback:
      return "playback";
    case StreamDirection::kCapture:
      return "capture";
    case StreamDirection::kBoth:
      return "both";
  }
  return "";
}

std::string_view endName(StreamEnd end) {
  switch (end) {
    case StreamEnd::kStillRunning:
      return "still running";
    case StreamEnd::kStopped:
      return "stopped";
    case StreamEnd::kClientGone:
      return "client gone";
    case StreamEnd::kServiceGone:
      return "service gone";
  }
  return "";
}

double unknownVolumeSeconds(const StreamStory& story) {
  // A client reports its volume a moment after its start. A shorter time is not worth a column.
  constexpr double kShortest = 0.05;
  double known = story.otherVolumeSeconds;
  for (const VolumeTime& time : story.volumes) known += time.seconds;
  const double unknown = story.ranSeconds - known;
  return unknown < kShortest ? 0 : unknown;
}

}  // namespace halvox::analysis
