// The cost of one message in the store: two events with equal payloads of 14 fields.

#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include <benchmark/benchmark.h>
#include <sys/resource.h>

#include "platform/linux/store/PayloadEncoder.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kMessagesPerPause = 64;

class SystemClock final : public ClockService {
 public:
  [[nodiscard]] Date currentDate() const override {
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return {std::chrono::duration<double>(now).count()};
  }
  [[nodiscard]] LocalTime localTime(Date /*date*/) const override { return {}; }
  [[nodiscard]] std::chrono::duration<double> systemUptime() const override { return {}; }
  [[nodiscard]] std::chrono::milliseconds processUptime() const override { return {}; }
};

class PlainStatistics final : public StatisticsService {
 public:
  Counter& counter(std::string_view /*piece*/, std::string_view /*name*/) override {
    return counter_;
  }

 private:
  Counter counter_;
};

Dictionary makeMessage() {
  Dictionary message{{"session_selected_format", "LPCM 48000 Hz, 2 channels, float"},
                     {"active_devices", "BuiltInSpeaker"},
                     {"hvreporting_timestamp", 1'700'000'000.123456},
                     {"systemuptime_sec", 86'400},
                     {"processuptime_ms", std::int64_t{123'456'789}}};
  for (int field = 0; field < 9; ++field) {
    const std::string key = "reported_field_" + std::to_string(field);
    message.set(key, field % 3 == 0   ? Value(field * 1000)
                     : field % 3 == 1 ? Value(0.125 * field)
                                      : Value("value " + key));
  }
  return message;
}

// Builds the payload as the analytics bridge does.
AnalyticsPayloadBuilder makeBuilder(const Dictionary& message) {
  return [message] {
    Dictionary payload = message;
    payload.set("HostApplicationDisplayID", "com.example.player");
    return payload;
  };
}

struct Bench {
  explicit Bench(std::uint32_t maxMegabytes = 512) {
    char name[] = "/tmp/halvox-store-bench-XXXXXX";
    directory = ::mkdtemp(name);
    store = std::make_unique<SqliteStore>(
        StoreOptions{.directory = directory, .maxMegabytes = maxMegabytes},
        SqliteStore::Environment{clock, statistics, backpressure});
    if (const auto opened = store->open(); !opened) {
      throw std::runtime_error(opened.error().message);
    }
    service = std::make_unique<SqliteAnalyticsService>(*store, clock);
  }
  ~Bench() {
    store.reset();
    std::filesystem::remove_all(directory);
  }

  void send(const Dictionary& message) {
    const std::string first = "com.tarno.halvox.Session_Playback.Start";
    const std::string second = "com.tarno.longformaudio.Session_Playback.Start";
    for (const std::string& name : {first, second}) {
      if (service->isAnalyticsEventUsed(name)) {
        service->sendAnalyticsEventLazy(name, makeBuilder(message));
      }
    }
  }

  std::filesystem::path directory;
  SystemClock clock;
  PlainStatistics statistics;
  Backpressure backpressure;
  std::unique_ptr<SqliteStore> store;
  std::unique_ptr<SqliteAnalyticsService> service;
};

double cpuSeconds(int who) {
  struct rusage use {};
  ::getrusage(who, &use);
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + 1e-6 * static_cast<double>(time.tv_usec);
  };
  return seconds(use.ru_utime) + seconds(use.ru_stime);
}

// The whole path on all threads: two stored events for each message. Pauses while backpressure is
// high, as the service does, so that the caller never waits in the queue.
void storeMessage(benchmark::State& state) {
  Bench bench(static_cast<std::uint32_t>(state.range(0)));
  const Dictionary message = makeMessage();
  const double before = cpuSeconds(RUSAGE_SELF);
  double caller = 0;
  std::int64_t messages = 0;
  for (auto iteration : state) {
    const double start = cpuSeconds(RUSAGE_THREAD);
    for (int index = 0; index < kMessagesPerPause; ++index) bench.send(message);
    messages += kMessagesPerPause;
    if (bench.backpressure.isHigh()) {
      caller += cpuSeconds(RUSAGE_THREAD) - start;
      while (bench.backpressure.isHigh()) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    } else {
      caller += cpuSeconds(RUSAGE_THREAD) - start;
    }
  }
  // Included: what the writer still has to do belongs to the messages.
  bench.store->close();
  const double all = cpuSeconds(RUSAGE_SELF) - before;
  struct rusage use {};
  ::getrusage(RUSAGE_SELF, &use);
  state.SetItemsProcessed(messages);
  state.counters["cpu_us_per_message"] = all / static_cast<double>(messages) * 1e6;
  state.counters["caller_us_per_message"] = caller / static_cast<double>(messages) * 1e6;
  state.counters["resident_mib"] = static_cast<double>(use.ru_maxrss) / 1024;
}
// 512 MB have room for all events; with 32 MB old events are deleted all the time.
BENCHMARK(storeMessage)
    ->ArgName("megabytes")
    ->Arg(512)
    ->Arg(32)
    ->Iterations(8000)
    ->Unit(benchmark::kMicrosecond)
    ->UseRealTime();

// The caller's side alone: two names tested and two events queued. Timing pauses while the writer
// catches up.
void handOver(benchmark::State& state) {
  Bench bench;
  const Dictionary message = makeMessage();
  for (auto iteration : state) {
    bench.send(message);
    if (bench.backpressure.isHigh()) {
      state.PauseTiming();
      while (bench.store->waiting() > 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));
      state.ResumeTiming();
    }
  }
}
BENCHMARK(handOver)->Iterations(300'000);

void askWhetherUsed(benchmark::State& state) {
  Bench bench;
  const std::string name = "com.tarno.halvox.Session_Playback.Start";
  for (auto iteration : state) benchmark::DoNotOptimize(bench.service->isAnalyticsEventUsed(name));
}
BENCHMARK(askWhetherUsed);

void buildPayload(benchmark::State& state) {
  const AnalyticsPayloadBuilder builder = makeBuilder(makeMessage());
  for (auto iteration : state) benchmark::DoNotOptimize(builder());
}
BENCHMARK(buildPayload);

void encodePayload(benchmark::State& state) {
  PayloadEncoder encoder;
  const Dictionary payload = makeBuilder(makeMessage())();
  for (auto iteration : state) benchmark::DoNotOptimize(encoder.encode(payload));
  state.counters["bytes"] = static_cast<double>(encoder.encode(payload).size());
}
BENCHMARK(encodePayload);

void comparePayloads(benchmark::State& state) {
  const AnalyticsPayloadBuilder builder = makeBuilder(makeMessage());
  const Dictionary left = builder();
  const Dictionary right = builder();
  for (auto iteration : state) benchmark::DoNotOptimize(encodeAlike(left, right));
}
BENCHMARK(comparePayloads);

}  // namespace
}  // namespace halvox::platform::linux_
