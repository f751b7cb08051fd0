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

// Measures what the audio drivers counted while a session ran: a snapshot of a fixed list of
// channel groups at its start, and the difference to it, as up to three messages, at its stop.
//
// Subscribes once, when it is made, to the channels that there are then: a driver, and a channel of
// a driver, that shows up later is not reported until the service starts again. One a process,
// owned by the service's delegate; made before any client can connect, and only read afterwards, so
// any thread may use it. Reports no failure: a group without channels is left out for good, a
// sample that fails is left out that one time, and both are logged.
class HVReportingDriverUtility {
 public:
  using DriverStats = platform::Dictionary;

  HVReportingDriverUtility();

  // In the order of the fixed list; only groups that had channels and could be subscribed.
  [[nodiscard]] const std::vector<HVReportingIOChannelSubscription>& ioChannelSubscriptions()
      const {
    return ioChannelSubscriptions_;
  }

  // Samples every subscription, all at one moment. Waits for the sources of the counters.
  [[nodiscard]] DriverSnapShot getSnapShot() const;
  // Samples again and sends what changed since the session's snapshot, of the channels that are in
  // it, through the session and to the analytics service: one message for each format that has
  // something to report. Does not change the snapshot; without one nothing is sent.
  void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& session) const;

  // Add one channel's entry, if it has something to tell.
  static void processSimpleData(const platform::IOReportChannel& channel, DriverStats& driverStats);
  static void processHistogramData(const platform::IOReportChannel& channel,
                                   DriverStats& driverStats);
  static void processStateData(const platform::IOReportChannel& channel, DriverStats& driverStats);
  // The key of a channel: "AmpDriver_Haptics_Stats_Simple_PeakLevel".
  static std::string getDriverStatsKey(const platform::IOReportChannel& channel,
                                       std::string_view type);

 private:
  struct Stats {
    DriverStats simple;
    DriverStats histogram;
    DriverStats state;
  };

  void subscribe(const HVReportingDriver& driver);
  static void addChannel(const platform::IOReportChannel& channel, Stats& stats);

  std::vector<HVReportingIOChannelSubscription> ioChannelSubscriptions_;
};

}  // namespace halvox
