#pragma once

#include <chrono>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace halvox::tools {

// Encodes the packets of a Perfetto trace, each appended to a text that the caller may empty
// between two calls. perfetto_trace.proto has what it writes. All packets have the clock of real
// time. Packets need not be in the order of their times, but the description of a track must come
// before its events. Names may be any bytes. Belongs to one thread.
//
//   begin() once; then the others
class PerfettoTrace {
 public:
  // Since 1970.
  using Time = std::chrono::nanoseconds;
  // Times outside 1970 to 2262, which clocks that were set wrong give, become the nearest one.
  [[nodiscard]] static Time timeOf(double secondsSince1970);

  // A track belongs to the process or to the track that is its parent.
  enum class TrackID : std::uint64_t {};
  enum class TrackKind : std::uint8_t {
    kProcess = 1,
    kStream = 2,
    kVolume = 3,
    kInterval = 4,
    kLoss = 5
  };
  // Unique in the trace. Only the low 60 bits of the number count.
  [[nodiscard]] static TrackID track(TrackKind kind, std::int64_t number);

  // What a viewer shows about an event.
  struct Annotation {
    std::string_view name;
    std::variant<std::int64_t, double, std::string_view> value;
  };
  using Annotations = std::span<const Annotation>;

  struct Event {
    TrackID track;
    Time time;
    std::string_view name{};
    std::string_view category{};
    Annotations annotations{};
  };

  // `text` must outlive it.
  explicit PerfettoTrace(std::string& text) : text_(text) {}

  // Says that times are real times.
  void begin(Time time);

  void describeProcess(TrackID track, std::int32_t pid, std::string_view name);
  void describeTrack(TrackID track, TrackID parent, std::string_view name);
  void describeCounter(TrackID track, TrackID parent, std::string_view name, std::string_view unit);

  // Slices of a track must nest.
  void beginSlice(const Event& event);
  void endSlice(const Event& event);
  void addInstant(const Event& event);
  void setCounter(TrackID track, Time time, double value);

 private:
  std::string& text_;
};

}  // namespace halvox::tools
