#include <fstream>
#include <memory>
#include <string>

#include <benchmark/benchmark.h>
#include <malloc.h>

#include "bench/NullPlatform.h"
#include "bench/TypicalMessage.h"
#include "session/HVReportingSession.h"

// The cost of stopping a session with a long history, without its summary event, which is made when
// it is sent; and the cost of making that event. `peak_ratio` is the peak memory of the process
// above what it used before the session, divided by the memory of the history at the start of the
// stop.

namespace halvox {
namespace {

using bench::nullPlatform;
using platform::Dictionary;

constexpr std::int64_t kMessages = 1'000'000;

void stamp(Dictionary& message, std::int64_t number) {
  message.set("hvreporting_timestamp", 1.7e9 + 0.25 * static_cast<double>(number));
  message.set("systemuptime_sec", number / 4);
  message.set("processuptime_ms", number * 250);
}

Dictionary makeStampedMessage(std::int64_t number) {
  Dictionary message = bench::makeMessage(number);
  stamp(message, number);
  return message;
}

// Makes messages with changing volumes, each held longer than the minimum time, so that every
// message ends an interval.
Dictionary makeVolumeMessage(std::int64_t number) {
  Dictionary message;
  message.set("RQSessionVolume", static_cast<double>(number % 16) / 16);
  message.set("RQSessionVolumePlayingState", 1);
  stamp(message, 4 * number);
  return message;
}

double statusKilobytes(const std::string& name) {
  std::ifstream status("/proc/self/status");
  std::string word;
  while (status >> word) {
    if (word != name) continue;
    double value = 0;
    status >> value;
    return value;
  }
  return 0;
}

// Writing 5 resets the peak resident memory of a process; see proc(5).
void forgetPeak() { std::ofstream("/proc/self/clear_refs") << "5"; }

template <typename Make>
std::shared_ptr<HVReportingSession> startedSession(Make make) {
  const auto session =
      std::make_shared<HVReportingSession>(ReporterID{1}, HVReportingSession::ProcessIdentifiers{},
                                           SessionCounters::make(nullPlatform().statistics));
  session->start();
  for (std::int64_t number = 0; number < kMessages; ++number) {
    session->sendMessage(make(number), AudioEventCategory::kPlayback, AudioEventType::kState,
                         nullptr);
  }
  return session;
}

template <typename Make>
void BM_Stop(benchmark::State& state, Make make) {
  nullPlatform();
  double ratio = 0;
  double history = 0;
  for (auto _ : state) {
    state.PauseTiming();
    // Returns to the system what the last iteration freed, so that the base does not contain it.
    ::malloc_trim(0);
    const double base = statusKilobytes("VmRSS:");
    const auto session = startedSession(make);
    history = statusKilobytes("VmRSS:") - base;
    forgetPeak();
    state.ResumeTiming();
    session->stop();
    state.PauseTiming();
    ratio = (statusKilobytes("VmHWM:") - base) / history;
    state.ResumeTiming();
  }
  state.counters["history_mb"] = history / 1024;
  state.counters["peak_ratio"] = ratio;
}

void BM_SummaryEvent(benchmark::State& state) {
  nullPlatform();
  const auto session = startedSession(makeStampedMessage);
  for (auto _ : state) benchmark::DoNotOptimize(session->createSummaryEventForSession());
}

BENCHMARK(BM_SummaryEvent)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK_CAPTURE(BM_Stop, ten_fields, makeStampedMessage)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3);
BENCHMARK_CAPTURE(BM_Stop, a_volume_each, makeVolumeMessage)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3);

}  // namespace
}  // namespace halvox
