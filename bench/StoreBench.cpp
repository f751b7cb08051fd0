// The cost of one message in the store: two events with equal payloads of 14 fields.

#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <unistd.h>

#include "bench/TypicalMessage.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
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
auto makeBuilder(const Dictionary& message) {
  return [message] {
    static const Key key("HostApplicationDisplayID");
    return AnalyticsPayload(message, {key, "com.example.player"});
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

  // The message as the local link sends it.
  void sendLink(const Dictionary& message) {
    Dictionary payload = message;
    payload.set("audiotag", "Session_PlaybackStart");
    store->linkMessages().add({.time = clock.currentDate().secondsSince1970,
                               .party = party,
                               .category = 4,
                               .type = 1,
                               .payload = payload});
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
  CounterStatisticsService statistics;
  Backpressure backpressure;
  std::unique_ptr<SqliteStore> store;
  std::unique_ptr<SqliteAnalyticsService> service;
  std::shared_ptr<const LinkParty> party =
      std::make_shared<LinkParty>(LinkParty{7, "com.tarno.halvox", "longformaudio_session"});
};

// The bytes that this process has had written to disk.
double writtenBytes() {
  std::ifstream file("/proc/self/io");
  std::string name;
  double bytes = 0;
  while (file >> name >> bytes) {
    if (name == "write_bytes:") return bytes;
  }
  return 0;
}

// Some words, different ones for each number.
std::string words(std::uint64_t number, int count) {
  constexpr std::array kWords{"open",  "device",  "stream", "failed", "route",  "speaker",
                              "mixer", "headset", "buffer", "late",   "glitch", "render"};
  std::minstd_rand random(static_cast<std::uint32_t>(number + 1));
  std::string text;
  for (int word = 0; word < count; ++word) {
    if (word > 0) text += ' ';
    text += kWords[random() % kWords.size()];
    if (random() % 3 == 0) text += '-' + std::to_string(random() % 100'000);
  }
  return text;
}

// A message of a running client. Each differs from the one before in a counter and the stamps, and
// in its texts if `isVaried`.
Dictionary messageOf(std::int64_t number, bool isVaried) {
  Dictionary message = bench::makeMessage(512 * number);
  if (isVaried) {
    const auto seed = static_cast<std::uint64_t>(4 * number);
    message.set("route", words(seed, 5));
    message.set("device_uid", words(seed + 1, 5));
    message.set("format", words(seed + 2, 12));
    message.set("latency_ms", 0.001 * static_cast<double>(number * 7919 % 1'000'000));
  }
  message.set("hvreporting_timestamp", 1'700'000'000.123 + 13e-6 * static_cast<double>(number));
  message.set("systemuptime_sec", 86'400 + number / 70'000);
  message.set("processuptime_ms", 123'456 + number / 70);
  return message;
}

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
  // The close is measured too, because it waits for the work that these messages have left to the
  // writer.
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

// The cost of a store that takes both events and the link message of each message. Reports the CPU
// time of the whole process without that of making the messages, the bytes written to disk, and the
// size of the closed file.
void storeAll(benchmark::State& state) {
  const bool isVaried = state.range(0) == 1;
  constexpr std::int64_t kMessages = 300'000;
  constexpr std::size_t kPrepared = 20'000;
  std::vector<Dictionary> messages;
  for (std::size_t number = 0; number < kPrepared; ++number) {
    messages.push_back(messageOf(static_cast<std::int64_t>(number), isVaried));
  }
  for (auto iteration : state) {
    Bench bench(static_cast<std::uint32_t>(state.range(1)));
    const double cpu = cpuSeconds(RUSAGE_SELF);
    const double bytes = writtenBytes();
    for (std::int64_t number = 0; number < kMessages; ++number) {
      const Dictionary& message = messages[static_cast<std::size_t>(number) % kPrepared];
      bench.send(message);
      bench.sendLink(message);
      while (bench.backpressure.isHigh()) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
      }
    }
    bench.store->close();
    ::sync();
    const double each = 1.0 / kMessages;
    state.counters["cpu_us_per_message"] = (cpuSeconds(RUSAGE_SELF) - cpu) * 1e6 * each;
    state.counters["written_per_message"] = (writtenBytes() - bytes) * each;
    state.counters["stored_per_message"] =
        static_cast<double>(std::filesystem::file_size(bench.directory / "halvox.db")) * each;
  }
}
BENCHMARK(storeAll)
    ->ArgNames({"varied", "megabytes"})
    ->Args({0, 512})
    ->Args({1, 512})
    ->Args({0, 16})
    ->Args({1, 16})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

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
  const auto builder = makeBuilder(makeMessage());
  for (auto iteration : state) benchmark::DoNotOptimize(builder());
}
BENCHMARK(buildPayload);

void encodePayload(benchmark::State& state) {
  PayloadEncoder encoder;
  const Dictionary payload = makeBuilder(makeMessage())().dictionary();
  for (auto iteration : state) benchmark::DoNotOptimize(encoder.encode(payload));
  state.counters["bytes"] = static_cast<double>(encoder.encode(payload).size());
}
BENCHMARK(encodePayload);

void comparePayloads(benchmark::State& state) {
  const auto builder = makeBuilder(makeMessage());
  const Dictionary left = builder().dictionary();
  const Dictionary right = builder().dictionary();
  for (auto iteration : state) benchmark::DoNotOptimize(encodeAlike(left, right));
}
BENCHMARK(comparePayloads);

}  // namespace
}  // namespace halvox::platform::linux_
