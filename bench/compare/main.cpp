// Compares the service with rsyslog, which writes the same messages as JSON, in one run: CPU,
// throughput, bytes written and memory. Then compares its answers with those of a server that does
// the least. The kinds take turns in every round; the result is the median of the rounds.

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <CLI/CLI.hpp>

#include "bench/client/RawClient.h"
#include "bench/client/SinkServer.h"
#include "bench/compare/Rsyslog.h"
#include "bench/load/Process.h"
#include "bench/load/Report.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::bench {
namespace {

using Clock = std::chrono::steady_clock;

struct Options {
  std::string service;
  std::int64_t messages = 50'000;  // of each client
  int clients = 4;
  int rounds = 5;
  std::vector<std::string> parts{"cost", "latency"};
};

// What one run of a server measured; for each message unless the name says otherwise.
struct Cost {
  double cpuMicroseconds = 0;
  double messagesPerSecond = 0;
  double writtenBytes = 0;
  double peakMib = 0;   // with all sessions open
  double afterMib = 0;  // resident after all sessions have ended
};

double micros(std::chrono::nanoseconds time) {
  return std::chrono::duration<double, std::micro>(time).count();
}

double loadAverage() {
  double load = 0;
  return getloadavg(&load, 1) == 1 ? load : -1;
}

// Calls the function with 0, 1, … on a thread for each client, and rethrows what one threw.
void onThreads(int count, const std::function<void(int)>& function) {
  std::vector<std::exception_ptr> failures(static_cast<std::size_t>(count));
  std::vector<std::thread> threads;
  for (int number = 0; number < count; ++number) {
    threads.emplace_back([&, number] {
      try {
        function(number);
      } catch (...) {
        failures[static_cast<std::size_t>(number)] = std::current_exception();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (const std::exception_ptr& failure : failures) {
    if (failure) std::rethrow_exception(failure);
  }
}

// The service with its default configuration, a quieter log and `settings`. It has a directory of
// its own.
class Service {
 public:
  Service(const Options& options, const std::string& settings) : socket_(directory_.path("s")) {
    const std::string config = directory_.path("halvox.toml");
    std::ofstream(config) << "[listener]\nsocket = \"" << socket_ << "\"\n[storage]\ndirectory = \""
                          << directory_.path("state") << "\"\n[log]\nlevel = \"error\"\n"
                          << settings;
    process_ = std::make_unique<Process>(std::vector<std::string>{options.service},
                                         std::vector<std::string>{"HALVOX_CONFIG=" + config});
    process_->waitForSocket(socket_);
  }

  [[nodiscard]] const Process& process() const { return *process_; }

  // A client with a started session. The service answers the start only when the session ends.
  [[nodiscard]] std::unique_ptr<RawClient> client(std::int64_t reporter) const {
    auto client = std::make_unique<RawClient>(socket_, reporter);
    client->request("createReportingSession");
    client->waitForAnswer();
    client->request("startReportingSessionForID");
    return client;
  }

 private:
  platform::linux_::ScratchDirectory directory_;
  std::string socket_;
  std::unique_ptr<Process> process_;
};

Cost costOf(const Process& process, const Options& options,
            const std::function<void()>& sendAndWait) {
  const auto cpuBefore = process.settledCpuTime();
  const long writtenBefore = process.writtenBytes();
  const auto begin = Clock::now();
  sendAndWait();
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  const double cpu = micros(process.settledCpuTime() - cpuBefore);
  const auto messages = static_cast<double>(options.messages * options.clients);
  return {.cpuMicroseconds = cpu / messages,
          .messagesPerSecond = messages / seconds,
          .writtenBytes = static_cast<double>(process.writtenBytes() - writtenBefore) / messages,
          .peakMib = static_cast<double>(process.peakKib()) / 1024};
}

Cost runRsyslog(const Options& options, bool variesTexts) {
  Rsyslog rsyslog;
  return costOf(rsyslog.process(), options, [&] {
    onThreads(options.clients, [&](int) { rsyslog.send(options.messages, variesTexts); });
    rsyslog.waitForLines(options.messages * options.clients);
  });
}

// The service's throughput counts until its last answer, not until the last message is stored. A
// message that was answered waits for the store at most half a second, in a bounded queue.
Cost runService(const Options& options, const std::string& settings, bool variesTexts) {
  const Service service(options, settings);
  std::vector<std::unique_ptr<RawClient>> clients;
  for (int number = 0; number < options.clients; ++number) {
    clients.push_back(service.client(number + 1));
    if (variesTexts) clients.back()->varyTexts();
  }
  constexpr std::int64_t kWindow = 256;  // as the client library has
  Cost cost = costOf(service.process(), options, [&] {
    onThreads(options.clients, [&](int number) {
      clients[static_cast<std::size_t>(number)]->pipeline(options.messages, kWindow);
    });
  });
  for (const auto& client : clients) {
    client->request("stopReportingSessionForID");
    client->waitForAnswer();
  }
  clients.clear();
  static_cast<void>(service.process().settledCpuTime());
  cost.afterMib = static_cast<double>(service.process().residentKib()) / 1024;
  return cost;
}

struct Kind {
  std::string name;
  std::function<Cost()> run;
  std::vector<Cost> costs;

  [[nodiscard]] double median(double Cost::*member) const {
    std::vector<double> values;
    for (const Cost& cost : costs) values.push_back(cost.*member);
    return bench::median(values);
  }
};

void compareCosts(const Options& options) {
  const std::string noLink = "[link]\nbackend = \"none\"\n";
  const std::string unwanted = noLink + "[analytics]\nwanted = []\n";
  std::vector<Kind> kinds{
      {"rsyslog, JSON lines", [&] { return runRsyslog(options, false); }, {}},
      {"rsyslog, varied texts", [&] { return runRsyslog(options, true); }, {}},
      {"service, default", [&] { return runService(options, "", false); }, {}},
      {"service, varied texts", [&] { return runService(options, "", true); }, {}},
      {"service, no link", [&] { return runService(options, noLink, false); }, {}},
      {"service, no event wanted", [&] { return runService(options, unwanted, false); }, {}}};
  for (int round = 0; round < options.rounds; ++round) {
    for (Kind& kind : kinds) kind.costs.push_back(kind.run());
  }
  std::printf("%d clients, %lld messages each, medians of %d rounds; ratios to rsyslog\n",
              options.clients, static_cast<long long>(options.messages), options.rounds);
  std::printf("%-26s %10s %6s %12s %6s %9s %9s %10s\n", "", "CPU us/msg", "ratio", "messages/s",
              "ratio", "bytes/msg", "peak MiB", "ended MiB");
  for (const Kind& kind : kinds) {
    const Kind& reference = kinds.front();
    std::printf("%-26s %10.2f %6.2f %12.0f %6.2f %9.0f %9.1f %10.1f\n", kind.name.c_str(),
                kind.median(&Cost::cpuMicroseconds),
                kind.median(&Cost::cpuMicroseconds) / reference.median(&Cost::cpuMicroseconds),
                kind.median(&Cost::messagesPerSecond),
                kind.median(&Cost::messagesPerSecond) / reference.median(&Cost::messagesPerSecond),
                kind.median(&Cost::writtenBytes), kind.median(&Cost::peakMib),
                kind.median(&Cost::afterMib));
  }
}

void compareLatency(const Options& options) {
  constexpr int kPings = 4000;
  const platform::linux_::ScratchDirectory scratch;
  const SinkProcess sink(scratch.path("sink"));
  const Service service(options, "");
  std::vector<double> p50[2];
  std::vector<double> p99[2];
  std::vector<double> switches;
  for (int round = 0; round < options.rounds; ++round) {
    const auto bare = RawClient(scratch.path("sink")).ping(kPings);
    const auto client = service.client(100 + round);
    const long before = service.process().sleeps();
    const auto answered = client->ping(kPings);
    switches.push_back(static_cast<double>(service.process().sleeps() - before) / kPings);
    p50[0].push_back(percentile(bare, 50) * 1e6);
    p99[0].push_back(percentile(bare, 99) * 1e6);
    p50[1].push_back(percentile(answered, 50) * 1e6);
    p99[1].push_back(percentile(answered, 99) * 1e6);
  }
  std::printf("\none call a millisecond, %d calls, medians of %d rounds\n", kPings, options.rounds);
  std::printf("%-26s %10s %10s\n", "", "p50 us", "p99 us");
  std::printf("%-26s %10.1f %10.1f\n", "bare reader", median(p50[0]), median(p99[0]));
  std::printf("%-26s %10.1f %10.1f\n", "service, default", median(p50[1]), median(p99[1]));
  std::printf("%-26s %10.2f %10.2f\n", "ratio", median(p50[1]) / median(p50[0]),
              median(p99[1]) / median(p99[0]));
  std::printf("%-26s %10.2f\n", "context switches a message", median(switches));
}

}  // namespace
}  // namespace halvox::bench

int main(int argc, char** argv) {
  halvox::bench::Options options;
  CLI::App app{
      "Compares the reporting service with rsyslog, and its answers with a bare reader's."};
  options.service = (std::filesystem::path(argv[0]).parent_path() / "halvox-reportingd").string();
  app.add_option("--service", options.service, "The service to measure")->capture_default_str();
  app.add_option("--messages", options.messages, "Messages of each client")
      ->check(CLI::PositiveNumber)
      ->capture_default_str();
  app.add_option("--clients", options.clients, "Clients at a time")
      ->check(CLI::Range(1, 64))
      ->capture_default_str();
  app.add_option("--rounds", options.rounds, "Rounds; the result is their median")
      ->check(CLI::Range(1, 100))
      ->capture_default_str();
  app.add_option("--part", options.parts, "What to compare (default: all)")
      ->check(CLI::IsMember({"cost", "latency"}));
  CLI11_PARSE(app, argc, argv);
  try {
    using namespace halvox::bench;
    std::printf("load average before: %.1f\n", loadAverage());
    for (const std::string& part : options.parts) {
      part == "cost" ? compareCosts(options) : compareLatency(options);
    }
    std::printf("load average after: %.1f\n", loadAverage());
  } catch (const std::exception& error) {
    std::fprintf(stderr, "halvox-compare: %s\n", error.what());
    return 1;
  }
  return 0;
}
