#include "bench/load/Scenarios.h"

#include <atomic>
#include <chrono>
#include <ctime>
#include <functional>
#include <memory>
#include <thread>

#include <sys/resource.h>

#include "bench/load/Server.h"

namespace halvox::bench {
namespace {

using Clock = std::chrono::steady_clock;

double micros(std::chrono::nanoseconds time) {
  return std::chrono::duration<double, std::micro>(time).count();
}

std::chrono::nanoseconds ownThreadCpu() {
  timespec time{};
  ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

struct Cost {
  double messagesPerSecond;
  double serverMicros;
  double clientMicros;
};

// Measures `count` messages of one pipelining client, including the server's work after the last
// answer.
Cost pipelineCost(const Server& server, LoadClient& client, const LoadOptions& options,
                  std::int64_t count) {
  const auto serverBefore = server.process().settledCpuTime();
  const auto clientBefore = ownThreadCpu();
  const auto begin = Clock::now();
  client.pipeline(count, options.window, options.shape);
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  const auto clientCpu = ownThreadCpu() - clientBefore;
  const auto serverCpu = server.process().settledCpuTime() - serverBefore;
  const auto messages = static_cast<double>(count);
  return {messages / seconds, micros(serverCpu) / messages, micros(clientCpu) / messages};
}

Cost oneRun(const LoadOptions& options, ServerKind kind, const char* link = kNoLink) {
  const Server server(options.programs, kind, link);
  const auto client = server.client(1);
  client->pipeline(5000, options.window, options.shape);  // warms caches and pools up
  return pipelineCost(server, *client, options, options.messages);
}

double medianOf(const std::vector<Cost>& costs, double Cost::*member) {
  std::vector<double> values;
  for (const Cost& cost : costs) values.push_back(cost.*member);
  return median(values);
}

// Measures the latency of one client while others keep the server busy.
std::vector<double> pingUnderLoad(const Server& server, const LoadOptions& options, int count) {
  std::atomic<bool> stopping{false};
  std::vector<std::thread> busy;
  for (int number = 0; number < options.clients; ++number) {
    busy.emplace_back([&server, &options, &stopping, number] {
      MessageShape repeated = options.shape;
      // The messages are repeated, so that no history grows while the other client is measured.
      repeated.content = Content::kRepeated;
      const auto client = server.client(100 + number);
      while (!stopping) client->pipeline(1000, options.window, repeated);
    });
  }
  const auto client = server.client(1);
  std::vector<double> latencies = client->ping(count, options.shape);
  stopping = true;
  for (std::thread& thread : busy) thread.join();
  return latencies;
}

double serverMicrosAfter(const LoadOptions& options,
                         const std::function<void(const Server&, LoadClient&)>& prepare) {
  const Server server(options.programs, ServerKind::kUnwanted);
  const auto client = server.client(1);
  client->pipeline(5000, options.window, options.shape);
  prepare(server, *client);
  return pipelineCost(server, *client, options, options.messages / 2).serverMicros;
}

// The cost of a message when all of the clients send at once.
double serverMicrosOfMany(const LoadOptions& options, int count) {
  const Server server(options.programs, ServerKind::kUnwanted);
  std::vector<std::unique_ptr<LoadClient>> clients;
  for (int number = 0; number < count; ++number) {
    clients.push_back(server.client(1 + number));
    clients.back()->pipeline(5000 / count + 1, options.window, options.shape);
  }
  const std::int64_t each = options.messages / 2 / count;
  const auto before = server.process().settledCpuTime();
  std::vector<std::thread> busy;
  for (const auto& client : clients) {
    busy.emplace_back([&options, each, sender = client.get()] {
      sender->pipeline(each, options.window, options.shape);
    });
  }
  for (std::thread& thread : busy) thread.join();
  const auto cpu = server.process().settledCpuTime() - before;
  return micros(cpu) / static_cast<double>(each * count);
}

// Each connection takes a descriptor here and one in the service, which inherits the limit.
void allowManyDescriptors() {
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);
}

}  // namespace

void measureThroughput(const LoadOptions& options, std::vector<Measurement>& results) {
  std::vector<Cost> echo;
  std::vector<Cost> linked;
  std::vector<Cost> stored;
  std::vector<Cost> unwanted;
  for (int round = 0; round < options.rounds; ++round) {
    // Each round has one run of each kind. Other work on the machine then affects all kinds alike,
    // and hardly changes their ratios.
    echo.push_back(oneRun(options, ServerKind::kEcho));
    linked.push_back(oneRun(options, ServerKind::kStored, kLocalLink));
    stored.push_back(oneRun(options, ServerKind::kStored));
    unwanted.push_back(oneRun(options, ServerKind::kUnwanted));
  }
  const auto add = [&](const char* name, const char* unit, const std::vector<Cost>& costs,
                       double Cost::*member, std::optional<double> atMost,
                       std::optional<double> atLeast) {
    results.push_back(
        {name, unit, medianOf(costs, member), medianOf(echo, member), atMost, atLeast});
  };
  add("throughput, events and link stored", "messages/s", linked, &Cost::messagesPerSecond, {}, {});
  add("service CPU, events and link stored", "us/message", linked, &Cost::serverMicros, {}, {});
  add("throughput, both events stored", "messages/s", stored, &Cost::messagesPerSecond, {}, 0.55);
  add("service CPU, both events stored", "us/message", stored, &Cost::serverMicros, 1.9, {});
  add("client CPU, both events stored", "us/message", stored, &Cost::clientMicros, {}, {});
  add("throughput, no event wanted", "messages/s", unwanted, &Cost::messagesPerSecond, {}, 0.75);
  add("service CPU, no event wanted", "us/message", unwanted, &Cost::serverMicros, 1.3, {});
  add("client CPU, no event wanted", "us/message", unwanted, &Cost::clientMicros, {}, {});
}

void measureLatency(const LoadOptions& options, std::vector<Measurement>& results) {
  constexpr int kPings = 4000;
  const auto add = [&](const char* name, const std::vector<double>& service,
                       const std::vector<double>& echo, double percent,
                       std::optional<double> atMost) {
    results.push_back({name,
                       "us",
                       percentile(service, percent) * 1e6,
                       percentile(echo, percent) * 1e6,
                       atMost,
                       {}});
  };
  const Server echo(options.programs, ServerKind::kEcho);
  const Server service(options.programs, ServerKind::kStored);
  const auto idle = [&](const Server& server) {
    return server.client(1)->ping(kPings, options.shape);
  };
  const auto echoIdle = idle(echo);
  const auto serviceIdle = idle(service);
  add("reply latency p50, one call a millisecond", serviceIdle, echoIdle, 50, 1.5);
  add("reply latency p99, one call a millisecond", serviceIdle, echoIdle, 99, 2.0);
  const auto echoLoaded = pingUnderLoad(echo, options, kPings / 4);
  const auto serviceLoaded = pingUnderLoad(service, options, kPings / 4);
  add("reply latency p50 under load", serviceLoaded, echoLoaded, 50, {});
  add("reply latency p99 under load", serviceLoaded, echoLoaded, 99, {});
}

void measureMemory(const LoadOptions& options, std::vector<Measurement>& results) {
  const auto mebibytes = [](long kibibytes) { return static_cast<double>(kibibytes) / 1024; };
  {
    const Server server(options.programs, ServerKind::kStored);
    std::vector<std::unique_ptr<LoadClient>> clients;
    clients.reserve(static_cast<std::size_t>(options.clients));
    for (int number = 0; number < options.clients; ++number) {
      clients.push_back(server.client(1 + number));
    }
    std::vector<std::thread> busy;
    busy.reserve(clients.size());
    for (const auto& client : clients) {
      busy.emplace_back([&options, sender = client.get()] {
        sender->pipeline(options.messages / 2, options.window, options.shape);
      });
    }
    for (std::thread& thread : busy) thread.join();
    const std::string who = std::to_string(options.clients) + " clients at full speed";
    const double peak = mebibytes(server.process().peakKib());
    results.push_back({"peak resident memory, " + who, "MiB", peak, {}, 24.0, {}});
    for (const auto& client : clients) client->stop();
    server.process().waitForRest();
    const double rest = mebibytes(server.process().residentKib());
    results.push_back({"resident memory after their sessions", "MiB", rest, {}, 16.0, {}});
  }
  const Server server(options.programs, ServerKind::kUnwanted);
  const auto client = server.client(1);
  client->pipeline(5000, options.window, options.shape);
  // Measured after a warm-up, because the first messages make the pools and tables that later ones
  // use.
  const long before = server.process().residentKib();
  client->pipeline(options.messages, options.window, options.shape);
  const auto grown = static_cast<double>(server.process().residentKib() - before) * 1024;
  results.push_back({"history, per message of " + std::to_string(options.shape.fields) + " fields",
                     "bytes",
                     grown / static_cast<double>(options.messages),
                     {},
                     80.0,
                     {}});
}

void measureGrowth(const LoadOptions& options, std::vector<Measurement>& results) {
  allowManyDescriptors();
  // First and last, because the speed of a shared machine changes meanwhile.
  const auto alone = [&] { return serverMicrosAfter(options, [](const Server&, LoadClient&) {}); };
  const double first = alone();
  const double sessions = serverMicrosAfter(options, [&options](const Server&, LoadClient& client) {
    client.createSessions(1000, options.sessions);
  });
  std::vector<std::unique_ptr<LoadClient>> idle;
  const double connections = serverMicrosAfter(options, [&](const Server& server, LoadClient&) {
    for (int number = 0; number < options.idleConnections; ++number) {
      idle.push_back(server.idleClient());
    }
  });
  // Their connections would count in the next measurement.
  idle.clear();
  const double history = serverMicrosAfter(options, [&options](const Server&, LoadClient& client) {
    client.pipeline(options.history, options.window, options.shape);
  });
  const double busy = serverMicrosOfMany(options, options.busyClients);
  const double one = (first + alone()) / 2;
  const auto add = [&](std::int64_t count, const char* what, double value) {
    results.push_back({"service CPU with " + std::to_string(count) + what + ", times that with one",
                       "x",
                       value / one,
                       {},
                       1.1,
                       {}});
  };
  results.push_back({"service CPU with one client", "us/message", one, {}, {}, {}});
  add(options.sessions, " sessions", sessions);
  add(options.idleConnections, " idle connections", connections);
  add(options.history, " messages of history", history);
  add(options.busyClients, " busy clients", busy);
}

void measureIdle(const LoadOptions& options, std::vector<Measurement>& results) {
  const Server server(options.programs, ServerKind::kStored);
  const auto client = server.client(1);
  client->pipeline(1000, options.window, options.shape);
  // Work that is still queued would count as wake-ups.
  static_cast<void>(server.process().settledCpuTime());
  const long before = server.process().sleeps();
  std::this_thread::sleep_for(std::chrono::seconds(10));
  results.push_back({"wake-ups in 10 idle seconds",
                     "",
                     static_cast<double>(server.process().sleeps() - before),
                     {},
                     0.0,
                     {}});
}

}  // namespace halvox::bench
