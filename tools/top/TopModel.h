#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "analysis/RecordSource.h"
#include "analysis/StreamBuilder.h"

#include "tools/top/MinuteCount.h"
#include "tools/top/TopReadings.h"
#include "tools/top/TopSnapshot.h"

namespace halvox::tools {

// Makes what `halvoxctl top` shows of the records and counters that it is given. Reads nothing
// itself, and knows no clock: tests give it any records and any time.
//
//   each turn: addRecord() the new records, onTurn(), snapshot()
//
// Memory: the bounds of StreamBuilder, and kMostDevices devices, whose names come from clients.
// Belongs to one thread.
class TopModel {
 public:
  static constexpr std::size_t kMostDevices = 256;
  // A record of a message waits this long for the other record of the same message, in seconds. The
  // service writes both within half a second. A stream is therefore at most this late on the
  // screen; StreamBuilder would otherwise wait for ten seconds of further records.
  static constexpr double kLongestWait = 1;

  TopModel();

  // Takes the next record of the store.
  void addRecord(const analysis::Record& record) { builder_->add(record); }
  // Takes the readings of a turn, after its records.
  void onTurn(TopReadings readings);
  // Forgets all streams and counters: the service that wrote them has ended, or another database
  // has taken the place of the store.
  void forget();

  [[nodiscard]] TopSnapshot snapshot() const;

 private:
  struct Stream {
    TopStream shown;
    bool isInRun = false;
    bool isPlaying = false;
    bool hasRun = false;
    MinuteCount xruns;
  };
  struct Device {
    DeviceReading reading;
    std::string description;
    std::optional<std::int64_t> quantum;  // as the last xrun said
    std::optional<std::int64_t> rate;
    MinuteCount xruns;  // as the driver counted
    bool isCounted = false;
    bool isPresent = false;  // in the last reading
  };

  void makeBuilder();
  void onMoment(const analysis::StreamStory& story, const analysis::StreamMoment& moment);
  void onXrun(Stream& stream, const analysis::StreamMoment& moment);
  void onRoute(Stream& stream, const analysis::StreamMoment& moment);
  [[nodiscard]] Device* device(std::string_view name);
  void takeDevices(double now, double seconds);
  [[nodiscard]] TopService service() const;
  [[nodiscard]] std::vector<TopLoss> losses() const;
  [[nodiscard]] std::vector<TopDevice> devices(const std::vector<TopStream>& streams) const;
  [[nodiscard]] std::vector<TopStream> streams() const;
  [[nodiscard]] std::optional<double> rate(std::uint64_t grown) const;
  // How much a counter has grown since the turn before; nothing if that is not known.
  [[nodiscard]] std::optional<double> ratePerSecond(const std::string& counter) const;

  std::unique_ptr<analysis::StreamBuilder> builder_;
  std::unordered_map<std::int64_t, Stream> streams_;  // by the story's ID
  std::map<std::string, Device, std::less<>> devices_;
  TopReadings readings_;
  std::optional<CounterValues> before_;  // the counters of the turn before
  double seconds_ = 0;                   // since the turn before
  bool hasTurned_ = false;
};

}  // namespace halvox::tools
