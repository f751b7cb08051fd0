// The cost of a job on a queue with its own thread, compared with a bare call of the same job. The
// job runs either on the thread that adds it ("helped") or on the queue's thread ("handed over").

#include <cstdint>
#include <future>
#include <memory>

#include <benchmark/benchmark.h>

#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace {

using namespace halvox::platform;

struct Fixture {
  linux_::CounterStatisticsService statistics;
  linux_::QueuedLogService log{LogLevel::kError, linux_::makeTextLogSink(2), statistics};
  linux_::AsioDispatchService service{log, statistics};
  std::shared_ptr<DispatchQueue> queue = service.createSerialQueue(
      "com.tarno.halvox.bench", QualityOfService::kUserInteractive, QueueThreading::kOwnThread);
};

// Makes a job as large as that of a request: it holds a reference and three numbers.
Job makeJob(const std::shared_ptr<std::uint64_t>& total) {
  return [total, a = std::uint64_t{1}, b = std::uint64_t{2}, c = std::uint64_t{3}] {
    *total += a + b + c;
  };
}

void bareCall(benchmark::State& state) {
  const auto total = std::make_shared<std::uint64_t>(0);
  for (auto _ : state) {
    const Job job = makeJob(total);
    job();
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(bareCall);

void helped(benchmark::State& state) {
  Fixture fixture;
  const auto total = std::make_shared<std::uint64_t>(0);
  for (auto _ : state) {
    fixture.service.beginHelping();
    for (std::int64_t job = 0; job < state.range(0); ++job) {
      fixture.queue->async(JobWeight::kBrief, makeJob(total));
    }
    fixture.service.endHelping();
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(helped)->Arg(1)->Arg(8)->Arg(64);

void handedOver(benchmark::State& state) {
  Fixture fixture;
  const auto total = std::make_shared<std::uint64_t>(0);
  for (auto _ : state) {
    // Counts from 1, because the last job is the one below, which ends the wait.
    for (std::int64_t job = 1; job < state.range(0); ++job) {
      fixture.queue->async(JobWeight::kBrief, makeJob(total));
    }
    std::promise<void> done;
    fixture.queue->async(JobWeight::kBrief, [&done] { done.set_value(); });
    done.get_future().wait();
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
// The work is done on another thread, whose CPU time counts too.
BENCHMARK(handedOver)->Arg(1)->Arg(8)->Arg(64)->UseRealTime()->MeasureProcessCPUTime();

}  // namespace
