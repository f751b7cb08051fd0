#pragma once

#include <chrono>
#include <memory>
#include <vector>

#include "platform/ioreport.h"
#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/drivers/SourceReader.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What the kernel, the sound server and other daemons count, as driver channels. A set of channels
// is of those that there are when it is asked for; a subscription never gets more. A channel that
// goes and comes again is sampled again, known by its names and its format. A source that takes
// longer than `SourceReader::kLongestOpening` to open is in no set that is asked for before it is
// open.
//
// No moment holds the caller longer than the longest wait, all sources together; what is late is
// left out of its samples. Looking for channels, which is done at the start only, may take as long
// as the opening. Any thread may call. Owns the sources and their threads, which sleep while nobody
// asks.
class LinuxIOReportService final : public IOReportService {
 public:
  LinuxIOReportService(std::vector<std::unique_ptr<DriverSource>> sources,
                       StatisticsService& statistics,
                       std::chrono::milliseconds longestWait = SourceReader::kLongestWait);
  ~LinuxIOReportService() override;

  // Starts the threads, which open all sources at once, and waits until each has, or has taken too
  // long. Once, before all else, when the services are installed.
  void open();

  Channels IOReportCopyChannelsInGroup(Name group, Name subGroup,
                                       std::optional<IOReportError>& error) override;
  [[nodiscard]] std::int32_t IOReportGetChannelCount(const Channels& channels) const override;
  Subscription IOReportCreateSubscription(const Channels& channels, Channels& subscribedChannels,
                                          std::optional<IOReportError>& error) override;
  [[nodiscard]] Moment makeMoment() override;
  // The moment must be one of this service.
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
