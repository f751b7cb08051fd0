#pragma once

#include <chrono>
#include <memory>
#include <vector>

#include "platform/ioreport.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/drivers/SourceReader.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Provides driver channels with what the kernel, the sound server and other daemons count.
//
// A set has the channels that exist when the set is requested, and a subscription to it never gets
// others. A channel that disappears and appears again with the same names and format is sampled
// again. If a source takes longer than `SourceReader::kLongestOpening` to open, sets that are
// requested earlier do not have its channels.
//
// Threads: any thread may use it. A sample blocks for at most the longest wait, for all sources
// together; a source that is late is skipped. Looking for channels, which the service does only
// when it starts, may take as long as the opening. Owner: the platform. It owns the sources and
// their threads, which sleep until a reading is requested.
class LinuxIOReportService final : public IOReportService {
 public:
  // `log` and `statistics` must outlive the service.
  LinuxIOReportService(std::vector<std::unique_ptr<DriverSource>> sources, LogCategory& log,
                       StatisticsService& statistics,
                       std::chrono::milliseconds longestWait = SourceReader::kLongestWait);
  ~LinuxIOReportService() override;

  // Starts the threads, which open all sources at once, and waits until each has opened or has
  // taken too long. Call it once, before everything else.
  void open();

  Channels IOReportCopyChannelsInGroup(Name group, Name subGroup,
                                       std::optional<IOReportError>& error) override;
  [[nodiscard]] std::int32_t IOReportGetChannelCount(const Channels& channels) const override;
  Subscription IOReportCreateSubscription(const Channels& channels, Channels& subscribedChannels,
                                          std::optional<IOReportError>& error) override;
  [[nodiscard]] Moment makeMoment() override;
  // The moment must have been made by this service.
  Samples IOReportCreateSamples(const Subscription& subscription, const Channels& channels,
                                IOReportMoment& moment,
                                std::optional<IOReportError>& error) override;
  Samples IOReportCreateSamplesDelta(const Samples& previous, const Samples& current,
                                     std::optional<IOReportError>& error) override;
  void IOReportIterate(const Samples& samples, const Visitor& visitor) const override;

 private:
  const std::chrono::milliseconds longestWait_;
  std::vector<std::unique_ptr<SourceReader>> readers_;
};

}  // namespace halvox::platform::linux_
