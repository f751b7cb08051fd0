#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "analysis/StreamStory.h"

#include "tools/export/PerfettoTrace.h"

namespace halvox::tools {

// Which streams a trace shows. A member that is not set selects everything.
struct PerfettoSelection {
  std::vector<std::string> applications{};  // glob patterns
  std::optional<double> since{};            // seconds since 1970
};

// Makes the tracks of a trace from the stories of streams, while a StreamBuilder makes them:
//
//   a process for each application, and in it for each stream
//     a track: a slice from its first message to its end; in this, a slice while it runs, and
//       instants for xruns, devices, formats and other messages
//     a counter: its volume
//
// A stream that began before `since` is shown from then on, in the state that it had. Holds only
// the streams that are open, of which the builder bounds the number, and at most kMostApplications
// names. Belongs to one thread.
//
//   onMoment() and onStory() as the builder calls them
class PerfettoStreams {
 public:
  // The names of applications come from clients. The streams of any further ones share a process.
  static constexpr std::size_t kMostApplications = 4096;

  // `trace` must outlive it.
  PerfettoStreams(PerfettoTrace& trace, PerfettoSelection selection)
      : trace_(trace), selection_(std::move(selection)) {}

  void onMoment(const analysis::StreamStory& story, const analysis::StreamMoment& moment);
  void onStory(const analysis::StreamStory& story);

  // What was written.
  [[nodiscard]] std::uint64_t streams() const { return streams_; }
  [[nodiscard]] std::uint64_t xruns() const { return xruns_; }

 private:
  // A stream that has not ended.
  struct Open {
    bool isShown = false;
    bool hasCounter = false;
    double time = 0;  // of its last event; the clock of a service may be set back
    bool isInRun = false;
    bool isPlaying = false;
    double runsSince = 0;
    std::optional<double> volume{};
    std::string format{};
    std::string route{};
    std::string routeNames{};

    [[nodiscard]] bool runs() const { return isInRun || isPlaying; }
  };

  [[nodiscard]] bool isShownNow(const analysis::StreamStory& story,
                                const analysis::StreamMoment& moment, const Open& stream) const;
  void show(const analysis::StreamStory& story, Open& stream);
  void follow(const analysis::StreamStory& story, const analysis::StreamMoment& moment,
              Open& stream);
  void setRuns(const analysis::StreamStory& story, Open& stream, bool isInRun, bool isPlaying);
  void writeVolume(const analysis::StreamStory& story, Open& stream, double time, double volume);
  void writeXrun(const analysis::StreamStory& story, const analysis::StreamMoment& moment,
                 double time);
  void writeRoute(const analysis::StreamStory& story, const Open& stream, double time);
  void writeFormat(const analysis::StreamStory& story, const Open& stream, double time);
  void writeEnd(const analysis::StreamStory& story, Open& stream);
  [[nodiscard]] PerfettoTrace::TrackID processOf(const std::string& application);

  PerfettoTrace& trace_;
  const PerfettoSelection selection_;
  std::unordered_map<std::int64_t, Open> open_;  // by the story's ID
  std::map<std::string, std::int32_t, std::less<>> processes_;
  std::uint64_t streams_ = 0;
  std::uint64_t xruns_ = 0;
};

}  // namespace halvox::tools
