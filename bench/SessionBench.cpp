#include <memory>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "bench/NullPlatform.h"
#include "bench/TypicalMessage.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegate.h"
#include "session/HVReportingSession.h"

// The cost of one message between the connection and the back-ends. The client object queues it;
// the reporting queue stamps it, offers it to the analytics service (which wants no event),
// compares it and records it. The cost of the connection and of the queue itself is not included.

namespace halvox {
namespace {

using bench::makeMessage;
using bench::nullPlatform;
using platform::Dictionary;

constexpr std::int64_t kBatch = 10'000;

std::vector<Dictionary> makeMessages(std::int64_t first) {
  std::vector<Dictionary> messages;
  messages.reserve(kBatch);
  for (std::int64_t index = 0; index < kBatch; ++index) {
    messages.push_back(makeMessage(first + index));
  }
  return messages;
}

// A service with several clients and sessions. The last client sends to its own session.
class Scene {
 public:
  Scene(std::int64_t clients, std::int64_t sessions)
      : dispatch_(nullPlatform().dispatch),
        delegate_(std::make_shared<HVReportingServiceDelegate>()) {
    for (std::int64_t index = 0; index < clients; ++index) connect();
    for (std::int64_t index = 1; index < sessions; ++index) startSession(ReporterID{index});
    target_ = ReporterID{sessions};
    startSession(target_);
    dispatch_.runAll();
  }

  void restart() {
    sender().stopReportingSessionForID(target_, ignore, context_);
    sender().startReportingSessionForID(target_, ignore, context_);
    dispatch_.runAll();
  }
  void send(Dictionary message) {
    sender().sendMessage(
        std::move(message), AudioEventCategory::kPlayback, AudioEventType::kState,
        std::vector{target_}, [](const auto& /*error*/) {}, context_);
  }
  void runAll() { dispatch_.runAll(); }

 private:
  static void ignore(const std::optional<platform::Error>& /*error*/, bool /*value*/) {}

  HVReportingClientServerInstance& sender() { return *connections_.back()->object; }

  // Holds the same objects as a real connection.
  struct Connection final : platform::NSXPCConnection {
    platform::ProcessID processIdentifier() const override { return 100; }
    std::string description() const override { return "bench"; }
    void setExportedInterface(const platform::NSXPCInterface& /*interface*/) override {}
    void setExportedObject(std::shared_ptr<platform::ExportedObject> exported) override {
      object = std::static_pointer_cast<HVReportingClientServerInstance>(exported);
    }
    void setInterruptionHandler(std::function<void()> /*handler*/) override {}
    void setInvalidationHandler(std::function<void()> /*handler*/) override {}
    void resume() override {}
    std::shared_ptr<HVReportingClientServerInstance> object;
  };

  void connect() {
    connections_.push_back(std::make_shared<Connection>());
    delegate_->listenerShouldAcceptNewConnection(connections_.back());
  }
  void startSession(ReporterID reporterID) {
    sender().createReportingSession(reporterID, ignore, context_);
    sender().startReportingSessionForID(reporterID, ignore, context_);
    dispatch_.runAll();
  }

  // All requests share this token. Its reference count changes as often as that of a request's own
  // token would.
  const platform::RequestContext context_{.sender = 100, .token = std::make_shared<int>()};
  bench::ListDispatch& dispatch_;
  std::shared_ptr<HVReportingServiceDelegate> delegate_;
  std::vector<std::shared_ptr<Connection>> connections_;
  ReporterID target_{0};
};

void BM_SendMessage(benchmark::State& state, std::int64_t clients, std::int64_t sessions,
                    std::int64_t history) {
  Scene scene(clients, sessions);
  std::int64_t number = 0;
  const auto fill = [&] {
    scene.restart();
    for (std::int64_t held = 0; held < history; ++held) {
      scene.send(makeMessage(++number));
      if (held % kBatch == 0) scene.runAll();
    }
    scene.runAll();
  };
  fill();
  std::int64_t sinceFill = 0;
  while (state.KeepRunningBatch(kBatch)) {
    state.PauseTiming();
    // The measured messages lengthen the history. Fill it anew before the additional length affects
    // the result.
    if ((sinceFill += kBatch) > 500'000) {
      fill();
      sinceFill = 0;
    }
    std::vector<Dictionary> messages = makeMessages(number);
    number += kBatch;
    state.ResumeTiming();
    for (std::size_t index = 0; index < messages.size(); ++index) {
      scene.send(std::move(messages[index]));
      if (index % 64 == 63) scene.runAll();  // a window of requests at a time
    }
    scene.runAll();
  }
  state.SetItemsProcessed(state.iterations());
}

void BM_SessionSendMessage(benchmark::State& state, bool redundant) {
  nullPlatform();
  const auto session =
      std::make_shared<HVReportingSession>(ReporterID{1}, HVReportingSession::ProcessIdentifiers{},
                                           SessionCounters::make(nullPlatform().statistics));
  session->start();
  std::int64_t number = 0;
  while (state.KeepRunningBatch(kBatch)) {
    state.PauseTiming();
    session->stop();
    session->start();
    const std::vector<Dictionary> messages = makeMessages(number);
    number += kBatch;
    state.ResumeTiming();
    for (const Dictionary& message : messages) {
      session->sendMessage(redundant ? messages.front() : message, AudioEventCategory::kPlayback,
                           AudioEventType::kState, nullptr);
    }
  }
  state.SetItemsProcessed(state.iterations());
}

// Starts and stops one session among other started ones. Both operations log a line that lists all
// sessions, at a level that is enabled by default.
void BM_RestartAmong(benchmark::State& state) {
  Scene scene(1, state.range(0));
  nullPlatform().log.setLevel(platform::LogLevel::kDefault);
  const std::size_t before = nullPlatform().log.bytes();
  for (auto _ : state) scene.restart();
  state.counters["log_bytes"] = benchmark::Counter(
      static_cast<double>(nullPlatform().log.bytes() - before), benchmark::Counter::kAvgIterations);
  nullPlatform().log.setLevel(platform::LogLevel::kError);
}

BENCHMARK(BM_RestartAmong)->Arg(1)->Arg(100)->Arg(10'000);
BENCHMARK_CAPTURE(BM_SendMessage, one_session, 1, 1, 0);
BENCHMARK_CAPTURE(BM_SendMessage, of_10000_sessions, 1, 10'000, 0);
BENCHMARK_CAPTURE(BM_SendMessage, of_1000_clients, 1'000, 1, 0);
BENCHMARK_CAPTURE(BM_SendMessage, after_1000000_messages, 1, 1, 1'000'000);
BENCHMARK_CAPTURE(BM_SessionSendMessage, recorded, false);
BENCHMARK_CAPTURE(BM_SessionSendMessage, redundant, true);

}  // namespace
}  // namespace halvox
