// The cost of driver statistics: 500 channels in text files and eight groups, for one session and
// for 64 sessions at once. The groups are sampled one after the other, as the start and the stop of
// a session do. With the argument "memory": the memory that the snapshots of the sessions hold.

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <latch>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <malloc.h>

#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/drivers/textfile/TextfileSource.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace {

using namespace halvox::platform;
using namespace halvox::platform::linux_;
using Clock = std::chrono::steady_clock;

constexpr int kChannels = 500;
constexpr int kChannelsPerFile = 10;
constexpr int kSessions = 64;
// The pause between two measurements, in which the sources' threads fall asleep as they do in a
// service.
constexpr std::chrono::milliseconds kPause{5};
constexpr std::array kGroups{
    "TarnoQ7AMP", "Speaker", "MCA", "Haptics", "StateTransitionTimes_ms", "Rx", "Tx", "IOSndFam2"};

// Shows errors. The service logs one when a reading was too late; the measurement is then invalid.
class ShownLog final : public LogCategory {
 public:
  ShownLog() : LogCategory(LogLevel::kError) {}
  void write(LogLevel /*level*/, std::string_view line) override {
    std::fprintf(stderr, "%.*s\n", static_cast<int>(line.size()), line.data());
  }
};

using SnapShot = std::vector<IOReportService::Samples>;

void writeFiles(const std::filesystem::path& directory, int round) {
  for (int file = 0; file < kChannels / kChannelsPerFile; ++file) {
    std::ofstream out(directory / (std::to_string(file) + ".prom"));
    for (int channel = 0; channel < kChannelsPerFile; ++channel) {
      out << "# TYPE c" << channel << " counter\n"
          << "c" << channel << "_total{driver=\"D" << file << "\",group=\""
          << kGroups.at(static_cast<std::size_t>(channel) % kGroups.size()) << "\"} " << round
          << "\n";
    }
  }
}

// Takes samples as a session does.
class Sampler {
 public:
  explicit Sampler(LinuxIOReportService& service) : service_(service) {
    std::optional<IOReportError> error;
    for (const char* group : kGroups) {
      channels_.push_back(service_.IOReportCopyChannelsInGroup(group, std::nullopt, error));
    }
  }
  SnapShot snapShot() const {
    SnapShot samples;
    const auto moment = service_.makeMoment();
    std::optional<IOReportError> error;
    for (const auto& channels : channels_) {
      samples.push_back(service_.IOReportCreateSamples(nullptr, channels, *moment, error));
    }
    return samples;
  }
  // Takes samples again and visits all differences. Returns their number.
  std::size_t report(const SnapShot& before) const {
    std::size_t count = 0;
    const auto moment = service_.makeMoment();
    std::optional<IOReportError> error;
    for (std::size_t group = 0; group < channels_.size(); ++group) {
      const auto now = service_.IOReportCreateSamples(nullptr, channels_[group], *moment, error);
      service_.IOReportIterate(service_.IOReportCreateSamplesDelta(before[group], now, error),
                               [&count](const IOReportChannel&) {
                                 ++count;
                                 return 0;
                               });
    }
    return count;
  }

 private:
  LinuxIOReportService& service_;
  std::vector<IOReportService::Channels> channels_;
};

double milliseconds(Clock::duration time) {
  return std::chrono::duration<double, std::milli>(time).count();
}

void printTimes(const char* what, std::vector<double>& times) {
  std::ranges::sort(times);
  std::printf("%-42s median %8.3f ms, p95 %8.3f ms, worst %8.3f ms\n", what,
              times[times.size() / 2], times[times.size() * 95 / 100], times.back());
}

void measureOne(const Sampler& sampler) {
  std::vector<double> snapShots;
  std::vector<double> reports;
  for (int round = 0; round < 200; ++round) {
    std::this_thread::sleep_for(kPause);
    const auto start = Clock::now();
    const SnapShot before = sampler.snapShot();
    snapShots.push_back(milliseconds(Clock::now() - start));
    std::this_thread::sleep_for(kPause);
    const auto stop = Clock::now();
    // A report that misses channels would be faster, and the measurement wrong.
    if (sampler.report(before) != kChannels) std::abort();
    reports.push_back(milliseconds(Clock::now() - stop));
  }
  printTimes("snapshot, one session", snapShots);
  printTimes("report, one session", reports);
}

// Starts and stops all sessions on one queue, as the service does.
void measureQueue(const Sampler& sampler, const std::filesystem::path& directory) {
  std::vector<double> snapShots;
  std::vector<double> reports;
  for (int round = 0; round < 20; ++round) {
    std::vector<SnapShot> sessions;
    for (int session = 0; session < kSessions; ++session) {
      const auto start = Clock::now();
      sessions.push_back(sampler.snapShot());
      snapShots.push_back(milliseconds(Clock::now() - start));
    }
    // All files change, so that the first report has to read them again.
    writeFiles(directory, round + 2);
    for (const SnapShot& session : sessions) {
      const auto start = Clock::now();
      if (sampler.report(session) != kChannels) std::abort();
      reports.push_back(milliseconds(Clock::now() - start));
    }
  }
  printTimes("snapshot, 64 sessions on one queue", snapShots);
  printTimes("report, 64 sessions, files rewritten", reports);
}

void measureThreads(const Sampler& sampler) {
  std::mutex mutex;
  std::vector<double> snapShots;
  std::vector<double> reports;
  for (int round = 0; round < 10; ++round) {
    std::latch start(kSessions);
    std::vector<std::jthread> threads;
    for (int session = 0; session < kSessions; ++session) {
      threads.emplace_back([&] {
        start.arrive_and_wait();
        const auto first = Clock::now();
        const SnapShot before = sampler.snapShot();
        const auto second = Clock::now();
        static_cast<void>(sampler.report(before));
        const auto third = Clock::now();
        const std::lock_guard lock(mutex);
        snapShots.push_back(milliseconds(second - first));
        reports.push_back(milliseconds(third - second));
      });
    }
  }
  printTimes("snapshot, 64 threads at once", snapShots);
  printTimes("report, 64 threads at once", reports);
}

void measureMemory(const Sampler& sampler) {
  std::vector<SnapShot> sessions;
  sessions.reserve(kSessions);
  // What only the first snapshot allocates is not counted.
  static_cast<void>(sampler.snapShot());
  const std::size_t before = mallinfo2().uordblks;
  for (int session = 0; session < kSessions; ++session) {
    sessions.push_back(sampler.snapShot());
  }
  const std::size_t held = mallinfo2().uordblks - before;
  std::printf("a session's snapshot holds %.1f bytes a channel\n",
              static_cast<double>(held) / (kSessions * kChannels));
}

void measureTimes(const Sampler& sampler, const std::filesystem::path& directory) {
  measureOne(sampler);
  measureQueue(sampler, directory);
  measureThreads(sampler);
}

}  // namespace

int main(int argc, char** argv) {
  const bool isOfMemory = argc > 1 && std::string_view(argv[1]) == "memory";
  // All threads share one arena, because mallinfo2() must count the memory of all of them.
  if (isOfMemory) mallopt(M_ARENA_MAX, 1);
  std::string name = (std::filesystem::temp_directory_path() / "halvox-bench-XXXXXX").string();
  if (mkdtemp(name.data()) == nullptr) return 1;
  const std::filesystem::path directory(name);
  writeFiles(directory, 1);
  {
    ShownLog log;
    CounterStatisticsService statistics;
    std::vector<std::unique_ptr<DriverSource>> sources;
    sources.push_back(std::make_unique<TextfileSource>(directory, log));
    LinuxIOReportService service(std::move(sources), log, statistics);
    service.open();
    const Sampler sampler(service);
    if (isOfMemory) {
      measureMemory(sampler);
    } else {
      measureTimes(sampler, directory);
    }
  }
  std::filesystem::remove_all(directory);
  return 0;
}
