#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "bench/load/Scenarios.h"

// The cost of stopping a session with a long history: for the service, its client and others.
namespace halvox::bench {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kAskEvery{10};

double secondsSince(Clock::time_point begin) {
  return std::chrono::duration<double>(Clock::now() - begin).count();
}

// A client that sends a request every 10 ms, or after each answer if that takes longer, from its
// construction to end().
class OtherClient {
 public:
  explicit OtherClient(const Server& server)
      : client_(server.idleClient()), thread_([this] { run(); }) {}
  ~OtherClient() { end(); }
  OtherClient(const OtherClient&) = delete;
  OtherClient& operator=(const OtherClient&) = delete;

  // Stops sending. Returns the time to each answer in seconds.
  std::vector<double> end() {
    ending_ = true;
    if (thread_.joinable()) thread_.join();
    return waits_;
  }

 private:
  void run() {
    auto next = Clock::now();
    while (!ending_) {
      waits_.push_back(client_->ask());
      // A long wait is not made up for by a burst of requests.
      next = std::max(next + kAskEvery, Clock::now());
      std::this_thread::sleep_until(next);
    }
  }

  std::unique_ptr<LoadClient> client_;
  std::vector<double> waits_;        // written by the thread; read after it was joined
  std::atomic<bool> ending_{false};  // orders with nothing: join() does
  std::thread thread_;
};

struct Build {
  std::string name;
  std::string settings;
};

void measure(const LoadOptions& options, const Build& build, std::vector<Measurement>& results) {
  const Server server(options.programs, ServerKind::kStored, build.settings);
  const auto client = server.client(1);
  client->pipeline(options.history, options.window, options.shape);
  // The service still stores what it has answered; that work does not belong to the stop.
  server.process().waitForRest();
  const long before = server.process().residentKib();
  server.process().forgetPeak();

  OtherClient other(server);
  const auto cpuBefore = server.process().cpuTime();
  const auto begin = Clock::now();
  client->stop();
  const double seconds = secondsSince(begin);
  const std::chrono::duration<double> cpu = server.process().cpuTime() - cpuBefore;
  server.process().waitForRest();
  const double atRest = secondsSince(begin);
  const std::chrono::duration<double> cpuAtRest = server.process().cpuTime() - cpuBefore;
  const std::vector<double> waits = other.end();

  const auto add = [&](const char* what, const char* unit, double value,
                       std::optional<double> atMost) {
    results.push_back({build.name + ": " + what, unit, value, {}, atMost, {}});
  };
  add("answer to the stop", "s", seconds, 5.0);
  add("CPU time of the service until then", "s", cpu.count(), {});
  add("until the service is idle again", "s", atRest, {});
  add("CPU time of the service until it is", "s", cpuAtRest.count(), {});
  add("longest wait of another client", "s", *std::ranges::max_element(waits), 0.05);
  add("median wait of another client", "us", median(waits) * 1e6, {});
  add("resident memory before", "MiB", static_cast<double>(before) / 1024, {});
  add("resident memory after it", "MiB", static_cast<double>(server.process().residentKib()) / 1024,
      {});
  // The texts of the summary event contain each value of the history.
  add("peak resident memory", "MiB", static_cast<double>(server.process().peakKib()) / 1024, 512.0);
}

}  // namespace

void measureStop(const LoadOptions& options, std::vector<Measurement>& results) {
  const std::string what = "stop of " + std::to_string(options.history) + " messages";
  measure(options, {what + ", no link", kNoLink}, results);
  measure(options, {what, kLocalLink}, results);
  measure(options,
          {"the same on an internal build",
           std::string(kLocalLink) + "[device]\nInternalBuild = true\n"},
          results);
}

}  // namespace halvox::bench
