// How long a request waits while a flood of other jobs runs. There are four kinds of flood: none,
// one with the quality of service of requests (as if there were no qualities), one with utility
// quality and one with background quality. The kinds take turns within one run, so that other work
// on the machine affects all of them alike.
//
//   halvox_quality_bench [ROUNDS]

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace {

using namespace halvox::platform;
using Clock = std::chrono::steady_clock;

constexpr int kDefaultRounds = 10;
constexpr int kRequestsARound = 200;
constexpr std::chrono::microseconds kRequestPause{2000};
constexpr std::chrono::microseconds kRequestWork{50};
constexpr std::chrono::microseconds kFloodWork{500};
constexpr std::size_t kFloodQueues = 4;  // more than the pool has threads

void work(std::chrono::microseconds time) {
  const auto end = Clock::now() + time;
  // Spins instead of sleeping, because the flood must compete for the processors.
  while (Clock::now() < end) {
  }
}

// Gives its queues a next job after each job, until it is destroyed.
class Flood {
 public:
  Flood(DispatchService& service, QualityOfService quality) {
    for (std::size_t number = 0; number < kFloodQueues; ++number) {
      queues_.push_back(
          service.createSerialQueue("com.tarno.halvox.flood", quality, QueueThreading::kShared));
      addNext(queues_.back());
    }
  }
  Flood(const Flood&) = delete;
  Flood& operator=(const Flood&) = delete;
  ~Flood() {
    // Each queue has at most one more job of the flood. The job that is added here runs after it
    // and ends the wait.
    *isOver_ = true;
    for (const auto& queue : queues_) {
      std::promise<void> done;
      queue->async(JobWeight::kBrief, [&done] { done.set_value(); });
      done.get_future().wait();
    }
  }

 private:
  void addNext(const std::shared_ptr<DispatchQueue>& queue) {
    queue->async(JobWeight::kMayBlock, [this, queue, isOver = isOver_] {
      if (*isOver) return;
      work(kFloodWork);
      if (!*isOver) addNext(queue);
    });
  }

  std::shared_ptr<std::atomic<bool>> isOver_ = std::make_shared<std::atomic<bool>>(false);
  std::vector<std::shared_ptr<DispatchQueue>> queues_;
};

struct Kind {
  const char* name;
  std::optional<QualityOfService> flood;
  std::vector<double> latencies{};  // microseconds

  [[nodiscard]] double percentile(int percent) const {
    return latencies[(latencies.size() - 1) * static_cast<std::size_t>(percent) / 100];
  }
  [[nodiscard]] double mean() const {
    double sum = 0;
    for (const double latency : latencies) sum += latency;
    return sum / static_cast<double>(latencies.size());
  }
};

void measureRound(DispatchService& service, DispatchQueue& requests, Kind& kind) {
  std::optional<Flood> flood;
  if (kind.flood.has_value()) flood.emplace(service, *kind.flood);
  auto next = Clock::now();
  for (int request = 0; request < kRequestsARound; ++request) {
    next += kRequestPause;
    // Requests are sent at fixed times, not after a fixed pause: a request that waited long then
    // does not make the following ones rarer.
    std::this_thread::sleep_until(next);
    std::promise<Clock::time_point> ended;
    const auto began = Clock::now();
    requests.async(JobWeight::kMayBlock, [&ended] {
      work(kRequestWork);
      ended.set_value(Clock::now());
    });
    const auto took = ended.get_future().get() - began;
    kind.latencies.push_back(std::chrono::duration<double, std::micro>(took).count());
  }
}

void print(const std::vector<Kind>& kinds) {
  const Kind& same = kinds[1];
  std::printf("%-26s %10s %10s %10s %22s\n", "flood", "median us", "p99 us", "mean us",
              "mean, same flood's = 1");
  for (const Kind& kind : kinds) {
    std::printf("%-26s %10.0f %10.0f %10.0f %22.3f\n", kind.name, kind.percentile(50),
                kind.percentile(99), kind.mean(), kind.mean() / same.mean());
  }
  std::array<double, 1> load{};
  if (::getloadavg(load.data(), 1) == 1) {
    std::printf("load average %.1f, %u processors\n", load[0], std::thread::hardware_concurrency());
  }
}

}  // namespace

int main(int argumentCount, char** arguments) {
  const int rounds = argumentCount > 1 ? std::max(std::atoi(arguments[1]), 1) : kDefaultRounds;
  linux_::CounterStatisticsService statistics;
  linux_::QueuedLogService log{LogLevel::kError, linux_::makeTextLogSink(2), statistics};
  linux_::AsioDispatchService service{log, statistics};
  const auto requests = service.createSerialQueue(
      "com.tarno.halvox.requests", QualityOfService::kUserInteractive, QueueThreading::kOwnThread);
  std::vector<Kind> kinds{{"none", std::nullopt},
                          {"of the requests' quality", QualityOfService::kUserInteractive},
                          {"utility", QualityOfService::kUtility},
                          {"background", QualityOfService::kBackground}};
  for (int round = 0; round < rounds; ++round) {
    for (Kind& kind : kinds) measureRound(service, *requests, kind);
  }
  for (Kind& kind : kinds) std::ranges::sort(kind.latencies);
  print(kinds);
  return EXIT_SUCCESS;
}
