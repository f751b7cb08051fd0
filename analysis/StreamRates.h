#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "analysis/RateSums.h"
#include "analysis/StreamStory.h"

namespace halvox::analysis {

// How often the streams of one application, on one device, or all streams, lost sound. Each stream
// is a group of the sums; its hours are those during which it ran.
struct StreamRate {
  enum class Of : std::uint8_t { kAll, kApplication, kDevice };
  Of of = Of::kAll;
  std::string name{};  // of the application or device; empty if it is unknown
  RateSums xruns{};
  RateSums milliseconds{};  // lost to xruns
};

// Sums up what streams lost, for rates an hour of playing. Memory: a row for each application and
// device up to a bound, and the devices of open streams. Belongs to one thread.
//
//   onMoment() and onStory() as StreamBuilder calls them; take()
class StreamRates {
 public:
  // `rows` bounds the applications and the devices, `text` the bytes of their names.
  StreamRates(std::size_t rows, std::size_t text) : rows_(rows), text_(text) {}

  void onMoment(const StreamStory& story, const StreamMoment& moment);
  void onStory(const StreamStory& story);

  // Streams and parts of streams for which there was no row.
  [[nodiscard]] std::uint64_t notKept() const { return notKept_; }
  // Returns all streams together first, then applications and devices in the order of their names.
  [[nodiscard]] std::vector<StreamRate> take();

 private:
  // What a stream did on one device.
  struct Part {
    double seconds = 0;
    double xruns = 0;
    double milliseconds = 0;
  };
  struct Open {
    std::map<std::string, Part, std::less<>> parts{};
    std::string device{};       // in force now
    double secondsCounted = 0;  // of the story's ranSeconds, in `parts`
  };
  Part& countTime(Open& open, const StreamStory& story);
  void add(StreamRate::Of of, std::string_view name, const Part& part);

  std::size_t rows_;
  std::size_t text_;
  std::unordered_map<std::int64_t, Open> open_;  // by the story's ID
  std::map<std::pair<StreamRate::Of, std::string>, StreamRate> rates_;
  std::uint64_t notKept_ = 0;
};

}  // namespace halvox::analysis
