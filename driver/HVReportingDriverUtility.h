#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "driver/HVReportingIOChannelSubscription.h"
#include "platform/ioreport.h"
#include "platform/value.h"
#include "session/DriverSnapShot.h"

namespace halvox {

class HVReportingSession;

// Measures what the audio drivers counted while a session ran. It takes a snapshot of a fixed list
// of channel groups when the session starts, and sends the difference as up to three messages when
// the session stops.
//
// Lifecycle: it subscribes once, in its constructor, to the channels that exist then. A channel
// that appears later is not reported until the service starts again.
// Owner: the service's delegate, which makes one before any client can connect.
// Thread: any, because nothing changes after the constructor. Snapshots and reports wait for the
// sources of the counters.
// Failure: only logged. A group without channels is skipped for the life of the process; a sample
// that fails is skipped this one time.
class HVReportingDriverUtility {
 public:
  using DriverStats = platform::Dictionary;

  HVReportingDriverUtility();

  // The subscriptions in the order of the fixed list. Groups that had no channels or could not be
  // subscribed to are missing.
  [[nodiscard]] const std::vector<HVReportingIOChannelSubscription>& ioChannelSubscriptions()
      const {
    return ioChannelSubscriptions_;
  }

  // Samples every subscription at one moment. Blocks until the sources have answered or are late.
  [[nodiscard]] DriverSnapShot getSnapShot() const;
  // Samples again and sends what changed since the session's snapshot, of the channels that are in
  // the snapshot. Each format with something to report becomes one message, which goes through the
  // session and to the analytics service. The snapshot stays as it is; without one nothing is sent.
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& session) const;

  // Each adds one channel's entry to the dictionary, unless there is nothing to report.
  static void processSimpleData(const platform::IOReportChannel& channel, DriverStats& driverStats);
  static void processHistogramData(const platform::IOReportChannel& channel,
                                   DriverStats& driverStats);
  static void processStateData(const platform::IOReportChannel& channel, DriverStats& driverStats);
  // The key of a channel, such as "AmpDriver_Haptics_Stats_Simple_PeakLevel".
  static std::string getDriverStatsKey(const platform::IOReportChannel& channel,
                                       std::string_view type);

 private:
  // The messages of one report, by format.
  struct Stats {
    DriverStats simple;
    DriverStats histogram;
    DriverStats state;
  };

  // Adds a subscription to the group, unless it has no channels or refuses.
  void subscribe(const HVReportingDriver& driver);
  // Adds the channel to the message of its format; logs formats that are not reported.
  static void addChannel(const platform::IOReportChannel& channel, Stats& stats);

  std::vector<HVReportingIOChannelSubscription> ioChannelSubscriptions_;
};

}  // namespace halvox
