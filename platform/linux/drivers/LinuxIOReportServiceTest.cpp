#include "platform/linux/drivers/LinuxIOReportService.h"

#include <array>
#include <condition_variable>
#include <limits>
#include <mutex>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testing::MadeSource;
using testing::makeReading;
using testing::simpleChannel;
using ::testing::SizeIs;
using Clock = std::chrono::steady_clock;

// A gate that a test closes to delay the readings of a source.
class Gate {
 public:
  void close() { set(false); }
  void open() { set(true); }
  void pass() {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return isOpen_; });
  }

 private:
  void set(bool isOpen) {
    const std::lock_guard lock(mutex_);
    isOpen_ = isOpen;
    changed_.notify_all();
  }
  std::mutex mutex_;
  std::condition_variable changed_;
  bool isOpen_ = true;
};

class LinuxIOReportServiceTest : public ::testing::Test {
 protected:
  LinuxIOReportService& serve(MadeSource::Make make, MadeSource::Make other = {}) {
    std::vector<std::unique_ptr<DriverSource>> sources;
    sources.push_back(std::make_unique<MadeSource>(std::move(make)));
    if (other) sources.push_back(std::make_unique<MadeSource>(std::move(other)));
    service_ = std::make_unique<LinuxIOReportService>(
        std::move(sources), driversCategory(platform_.log), platform_.statistics, longestWait_);
    service_->open();
    return *service_;
  }

  IOReportService::Samples sample(const IOReportService::Channels& channels) {
    std::optional<IOReportError> error;
    return service_->IOReportCreateSamples(nullptr, channels, *service_->makeMoment(), error);
  }

  IOReportService::Channels find(IOReportService::Name group, IOReportService::Name subGroup) {
    std::optional<IOReportError> error;
    return service_->IOReportCopyChannelsInGroup(group, subGroup, error);
  }

  // Serves one channel and samples it once. Its source is too late for the sample, and the gate
  // stays closed.
  IOReportService::Channels serveLateSource() {
    serve([this] {
      gate_.pass();
      return makeReading({simpleChannel("Tx", "a")}, {1});
    });
    auto found = find("Tx", std::nullopt);
    gate_.close();
    static_cast<void>(sample(found));
    return found;
  }

  std::vector<std::string> show(const IOReportService::Samples& samples) {
    std::vector<std::string> lines;
    service_->IOReportIterate(samples, [&lines](const IOReportChannel& channel) {
      lines.push_back(testing::describe(channel));
      return 0;
    });
    return lines;
  }

  FakePlatform platform_;
  Gate gate_;
  // Call before serve(). The default is long enough that no reading is late on a busy machine.
  std::chrono::milliseconds longestWait_ = 10s;
  // For tests in which one source is late. Each of them takes this time once.
  static constexpr std::chrono::milliseconds kShortWait = 1s;
  std::unique_ptr<LinuxIOReportService> service_;
};

ChannelList::Channel channelIn(std::string group, std::string subGroup) {
  ChannelDescription channel;
  channel.group = std::move(group);
  channel.subGroup = std::move(subGroup);
  return std::make_shared<const ChannelDescription>(std::move(channel));
}

TEST_F(LinuxIOReportServiceTest, AGroupIsChosenByItsNamesAndAnAbsentNameMeansAny) {
  const std::vector channels{channelIn("Speaker", "MCA"), channelIn("Speaker", "Other"),
                             channelIn("Rx", "MCA")};
  auto& service = serve([&] { return makeReading(channels, {1, 2, 3}); });

  EXPECT_EQ(service.IOReportGetChannelCount(find("Speaker", std::nullopt)), 2);
  EXPECT_EQ(service.IOReportGetChannelCount(find(std::nullopt, "MCA")), 2);
  EXPECT_EQ(service.IOReportGetChannelCount(find("Rx", "MCA")), 1);
  EXPECT_EQ(service.IOReportGetChannelCount(find(std::nullopt, std::nullopt)), 3);
  EXPECT_EQ(service.IOReportGetChannelCount(find("Tx", std::nullopt)), 0);
}

TEST_F(LinuxIOReportServiceTest, ASourceLearnsOfSamplesAndNotOfTheSearchForChannels) {
  int samples = 0;
  std::vector<std::unique_ptr<DriverSource>> sources;
  sources.push_back(std::make_unique<MadeSource>(
      [] { return makeReading({simpleChannel("Tx", "a")}, {1}); }, [&samples] { ++samples; }));
  service_ = std::make_unique<LinuxIOReportService>(
      std::move(sources), driversCategory(platform_.log), platform_.statistics, longestWait_);
  service_->open();

  const auto channels = find("Tx", std::nullopt);
  EXPECT_THAT(show(sample(channels)), SizeIs(1));
  service_.reset();  // ends the thread of the source, after its last call

  EXPECT_EQ(samples, 1);
}

// As in a report, which releases the samples of each group before it takes the next ones.
TEST_F(LinuxIOReportServiceTest, AllGroupsOfAMomentShareOneReading) {
  std::atomic<int> readings{0};
  const std::vector channels{simpleChannel("Tx", "a"), simpleChannel("Rx", "b")};
  auto& service = serve([&] {
    ++readings;
    return makeReading(channels, {1, 2});
  });
  const std::array groups{find("Tx", std::nullopt), find("Rx", std::nullopt)};
  readings = 0;
  const auto moment = service.makeMoment();
  std::optional<IOReportError> error;

  for (const auto& group : groups) {
    EXPECT_THAT(show(service.IOReportCreateSamples(nullptr, group, *moment, error)), SizeIs(1));
  }

  EXPECT_EQ(readings, 1);
}

// Readings that a test finishes one by one. Each contains its own number.
class SteppedReadings {
 public:
  std::shared_ptr<const Reading> make() {
    std::unique_lock lock(mutex_);
    const std::uint64_t number = ++begun_;
    changed_.notify_all();
    changed_.wait(lock, [&] { return allowed_ >= number; });
    return makeReading({channel_}, {number});
  }
  void allow(std::uint64_t number) {
    const std::lock_guard lock(mutex_);
    allowed_ = number;
    changed_.notify_all();
  }
  void waitUntilBegun(std::uint64_t number) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return begun_ >= number; });
  }
  std::uint64_t begun() {
    const std::lock_guard lock(mutex_);
    return begun_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  const ChannelList::Channel channel_ = simpleChannel("Tx", "number");
  std::uint64_t begun_ = 0;
  std::uint64_t allowed_ = std::numeric_limits<std::uint64_t>::max();
};

TEST_F(LinuxIOReportServiceTest, AReadingThatWasBegunBeforeIsNotUsedAndTheNextOneIsShared) {
  constexpr std::uint64_t kAskers = 8;
  SteppedReadings readings;
  serve([&readings] { return readings.make(); });
  const auto found = find("Tx", std::nullopt);
  const std::uint64_t before = readings.begun();
  readings.allow(before);
  std::vector<std::string> first;
  std::jthread asker([&] { first = show(sample(found)); });
  readings.waitUntilBegun(before + 1);

  // The threads below make their requests during that reading and wait for the next one.
  const auto asked = [this] {
    return platform_.statistics.values("driver source made").at("readings asked for");
  };
  const auto askedBefore = asked();
  std::vector<std::vector<std::string>> others(kAskers);
  std::vector<std::jthread> threads;
  for (auto& lines : others) threads.emplace_back([&] { lines = show(sample(found)); });
  while (asked() < askedBefore + kAskers) std::this_thread::yield();
  readings.allow(before + 1);
  asker.join();
  readings.allow(std::numeric_limits<std::uint64_t>::max());
  threads.clear();

  EXPECT_THAT(first, ElementsAre("-/Tx/-/number  = " + std::to_string(before + 1)));
  for (const auto& lines : others) {
    EXPECT_THAT(lines, ElementsAre("-/Tx/-/number  = " + std::to_string(before + 2)));
  }
  EXPECT_EQ(readings.begun(), before + 2);
}

TEST_F(LinuxIOReportServiceTest, ASlowSourceIsSkippedAndTheOthersAreNot) {
  longestWait_ = kShortWait;
  const auto slow = simpleChannel("Tx", "slow");
  const auto fast = simpleChannel("Tx", "fast");
  serve(
      [this, slow] {
        gate_.pass();
        return makeReading({slow}, {1});
      },
      [fast] { return makeReading({fast}, {2}); });
  const auto found = find("Tx", std::nullopt);

  gate_.close();
  const auto samples = sample(found);
  gate_.open();

  EXPECT_THAT(show(samples), ElementsAre("-/Tx/-/fast  = 2"));
}

TEST_F(LinuxIOReportServiceTest, NobodyWaitsAgainForALateSourceAndItIsLoggedOnce) {
  longestWait_ = SourceReader::kLongestWait;
  const auto found = serveLateSource();

  // If the samples waited again, each of them would be slow. A busy machine delays only some of
  // them.
  constexpr int kRounds = 20;
  int slowRounds = 0;
  for (int round = 0; round < kRounds; ++round) {
    const auto start = Clock::now();
    EXPECT_THAT(show(sample(found)), IsEmpty());
    if (Clock::now() - start >= SourceReader::kLongestWait) ++slowRounds;
  }
  gate_.open();

  EXPECT_LT(slowRounds, kRounds / 2);
  EXPECT_THAT(
      platform_.log.texts(LogLevel::kError),
      ElementsAre("driver source made did not answer within 50 ms; its counters are skipped "
                  "until it answers in time"));
}

TEST_F(LinuxIOReportServiceTest, ALateSourceThatComesRoundIsSampledAgain) {
  longestWait_ = kShortWait;
  const auto found = serveLateSource();
  gate_.open();

  EXPECT_TRUE(eventually([&] { return show(sample(found)).size() == 1; }));
}

// The counts of a channel start when its driver is loaded, not when the session starts.
TEST_F(LinuxIOReportServiceTest, WhatASourceThatWasLateAtTheSnapshotCountedIsNotReported) {
  longestWait_ = kShortWait;
  const auto channel = simpleChannel("Tx", "a");
  auto& service = serve([&] {
    gate_.pass();
    return makeReading({channel}, {1000});
  });
  const auto found = find("Tx", std::nullopt);
  gate_.close();
  const auto snapshot = sample(found);
  gate_.open();

  IOReportService::Samples now;
  ASSERT_TRUE(eventually([&] {
    now = sample(found);
    return show(now).size() == 1;
  }));

  std::optional<IOReportError> error;
  EXPECT_THAT(show(service.IOReportCreateSamplesDelta(snapshot, now, error)), IsEmpty());
}

TEST_F(LinuxIOReportServiceTest, SourcesAreReadAtOnce) {
  std::atomic<bool> isOver{true};
  std::atomic<int> entered{0};
  const auto meet = [&](const ChannelList::Channel& channel) {
    ++entered;
    while (entered < 2 && !isOver) std::this_thread::yield();
    return makeReading({channel}, {1});
  };
  const auto a = simpleChannel("Tx", "a");
  const auto b = simpleChannel("Tx", "b");
  serve([&] { return meet(a); }, [&] { return meet(b); });
  const auto found = find("Tx", std::nullopt);
  entered = 0;
  isOver = false;

  const auto samples = sample(found);
  isOver = true;

  EXPECT_THAT(show(samples), SizeIs(2));
  service_.reset();
}

TEST_F(LinuxIOReportServiceTest, TheLeaseIsReleasedWhenNobodyHoldsSamples) {
  const auto channel = simpleChannel("Tx", "a");
  std::mutex mutex;
  std::weak_ptr<void> lease;
  serve([&] {
    auto reading = std::make_shared<Reading>(*makeReading({channel}, {1}));
    reading->lease = std::make_shared<int>();
    const std::lock_guard lock(mutex);
    lease = reading->lease;
    return reading;
  });
  const auto isHeld = [&] {
    const std::lock_guard lock(mutex);
    return !lease.expired();
  };

  auto samples = sample(find("Tx", std::nullopt));
  EXPECT_TRUE(isHeld());
  samples.reset();
  // The thread that made the reading may hold it for a moment after handing it over.
  EXPECT_TRUE(eventually([&] { return !isHeld(); }));
}

TEST_F(LinuxIOReportServiceTest, ReadingsAskedForAreGivenOrLate) {
  longestWait_ = kShortWait;
  serve([&] {
    gate_.pass();
    return makeReading({}, {});
  });
  const auto found = find("Tx", std::nullopt);
  gate_.close();
  static_cast<void>(sample(found));
  gate_.open();

  const auto counted = platform_.statistics.values("driver source made");
  EXPECT_EQ(counted.at("readings asked for"),
            counted.at("readings given") + counted.at("skipped: late"));
}

TEST_F(LinuxIOReportServiceTest, ManyThreadsMaySampleAtOnce) {
  constexpr int kThreads = 64;
  const std::vector channels{simpleChannel("Tx", "a"), simpleChannel("Tx", "b")};
  std::atomic<std::uint64_t> count{0};
  auto& service = serve([&] {
    const std::uint64_t now = ++count;
    return makeReading(channels, {now, now});
  });
  const auto found = find("Tx", std::nullopt);
  std::atomic<int> wrong{0};
  std::vector<std::jthread> threads;

  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&] {
      std::optional<IOReportError> error;
      const auto before = sample(found);
      const auto after = sample(found);
      const auto delta = service.IOReportCreateSamplesDelta(before, after, error);
      std::vector<std::int64_t> values;
      service.IOReportIterate(delta, [&values](const IOReportChannel& channel) {
        values.push_back(channel.integerValue);
        return 0;
      });
      // Both channels of a reading have values of the same moment.
      if (values.size() == 2 && values[0] != values[1]) ++wrong;
    });
  }
  threads.clear();

  EXPECT_EQ(wrong, 0);
}

}  // namespace
}  // namespace halvox::platform::linux_
