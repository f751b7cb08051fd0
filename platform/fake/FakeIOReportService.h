#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/ioreport.h"

namespace halvox::platform {

// Driver counters that the test sets. A group has a name such as "Speaker-(null)": group, "-" and
// subgroup. Samples copy the values that the test set last. Differences are computed from samples.
// Each operation is in the journal with its group. Any thread may call. FakePlatform owns it.
class FakeIOReportService final : public IOReportService {
 public:
  // A channel that owns its texts and values.
  struct Channel {
    IOReportFormat format = IOReportFormat::kSimple;
    IOReportKind kind = IOReportKind::kCounter;  // of a simple channel
    std::optional<std::string> driverName{};
    std::optional<std::string> group{};
    std::optional<std::string> subGroup{};
    std::optional<std::string> channelName{};
    std::string unitLabel{};
    std::int64_t integerValue = 0;
    std::vector<IOReportState> states{};
    std::vector<IOReportBucket> buckets{};
    std::int64_t minValue = 0;
    std::int64_t maxValue = 0;

    [[nodiscard]] IOReportChannel view() const;
  };
  using ChannelList = std::vector<Channel>;
  // How an operation fails: without a result, and with that error if there is one.
  struct Failure {
    std::optional<std::int64_t> code{};
  };

  // Does not own the journal, which must outlive it.
  explicit FakeIOReportService(Journal& journal) : journal_(journal) {}

  // Creates the group with these channels and values, or replaces its channels and values.
  void setGroup(std::string_view name, ChannelList channels);
  // Installs a function that runs after each group's samples, to simulate a driver that counts
  // meanwhile; null removes it.
  void afterSamples(std::function<void(const std::string& group)> change);
  // Makes the operation fail for that group.
  void failChannels(std::string_view name, Failure failure);
  void failSubscription(std::string_view name, Failure failure);
  void failSamples(std::string_view name, Failure failure);
  void failDelta(std::string_view name, Failure failure);
  // Makes the search for the group's channels return an error together with the channels.
  void addErrorToChannels(std::string_view name, std::int64_t code);

  Channels IOReportCopyChannelsInGroup(Name group, Name subGroup,
                                       std::optional<IOReportError>& error) override;
  [[nodiscard]] std::int32_t IOReportGetChannelCount(const Channels& channels) const override;
  Subscription IOReportCreateSubscription(const Channels& channels, Channels& subscribedChannels,
                                          std::optional<IOReportError>& error) override;
  [[nodiscard]] Moment makeMoment() override;
  Samples IOReportCreateSamples(const Subscription& subscription, const Channels& channels,
                                IOReportMoment& moment,
                                std::optional<IOReportError>& error) override;
  Samples IOReportCreateSamplesDelta(const Samples& previous, const Samples& current,
                                     std::optional<IOReportError>& error) override;
  void IOReportIterate(const Samples& samples, const Visitor& visitor) const override;

 private:
  using Groups = std::map<std::string, ChannelList, std::less<>>;
  using Failures = std::map<std::string, Failure, std::less<>>;
  class ReadMoment;

  bool fails(const Failures& failures, const std::string& name,
             std::optional<IOReportError>& error) const;

  Journal& journal_;
  mutable std::mutex mutex_;
  Groups groups_;
  std::function<void(const std::string&)> afterSamples_;
  Failures channelFailures_;
  Failures subscriptionFailures_;
  Failures sampleFailures_;
  Failures deltaFailures_;
  std::map<std::string, std::int64_t, std::less<>> addedErrors_;
};

}  // namespace halvox::platform
