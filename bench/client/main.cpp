// Compares the client library with two alternatives: a hand-written encoder with batched writes,
// and sd-bus. Each measurement runs in a process of its own, so that getrusage() counts that client
// alone. The kinds take turns in every round. All use one server that does the least for a request.

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <sched.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include "bench/client/RawClient.h"
#include "bench/client/SinkServer.h"
#include "client/HalvoxClient.h"
#include "client/halvox.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace {

using Clock = std::chrono::steady_clock;
using Values = std::vector<double>;
using Work = std::function<Values()>;

constexpr std::int64_t kReporter = 1;
constexpr std::int64_t kWindow = 256;  // as the library has

double microseconds(Clock::duration time) {
  return std::chrono::duration<double, std::micro>(time).count();
}

double cpuMicroseconds() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  const auto toMicroseconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
  };
  return toMicroseconds(usage.ru_utime) + toMicroseconds(usage.ru_stime);
}

double percentile(Values& values, double percent) {
  const auto last = static_cast<double>(values.size() - 1);
  const auto index = static_cast<std::ptrdiff_t>(last * percent / 100);
  std::nth_element(values.begin(), values.begin() + index, values.end());
  return values[static_cast<std::size_t>(index)];
}

// Runs the work in a process of its own and returns its values.
Values inProcess(const Work& work) {
  std::array<int, 2> channel{};
  if (pipe(channel.data()) != 0) throw std::runtime_error("pipe");
  const pid_t child = fork();
  if (child == 0) {
    int status = 1;
    try {
      const Values values = work();
      const std::size_t bytes = values.size() * sizeof(double);
      if (write(channel[1], values.data(), bytes) == static_cast<ssize_t>(bytes)) status = 0;
    } catch (const std::exception& error) {
      std::fprintf(stderr, "halvox_client_bench: %s\n", error.what());
    }
    _exit(status);
  }
  close(channel[1]);
  Values values(64);
  const ssize_t bytes = read(channel[0], values.data(), values.size() * sizeof(double));
  close(channel[0]);
  int status = 0;
  waitpid(child, &status, 0);
  if (status != 0 || bytes <= 0) throw std::runtime_error("a measurement failed");
  values.resize(static_cast<std::size_t>(bytes) / sizeof(double));
  return values;
}

struct DictionaryFree {
  void operator()(halvox_dictionary* dictionary) const { halvox_dictionary_free(dictionary); }
};
using Message = std::unique_ptr<halvox_dictionary, DictionaryFree>;
struct ClientFree {
  void operator()(halvox_client* client) const { halvox_client_free(client); }
};
using Client = std::unique_ptr<halvox_client, ClientFree>;

Message makeMessage(std::int64_t number) {
  Message message(halvox_dictionary_new());
  halvox_dictionary_set_int64(message.get(), "frame_counter", number);
  halvox_dictionary_set_double(message.get(), "sample_rate", 48000.0);
  halvox_dictionary_set_int64(message.get(), "channels", 2);
  halvox_dictionary_set_int64(message.get(), "io_buffer_frames", 512);
  halvox_dictionary_set_bool(message.get(), "is_running", true);
  halvox_dictionary_set_double(message.get(), "volume", 0.75);
  halvox_dictionary_set_string(message.get(), "route", "Speaker");
  halvox_dictionary_set_string(message.get(), "format", "lpcm/float32");
  halvox_dictionary_set_string(message.get(), "device_uid",
                               "alsa_output.pci-0000_00_1f.3.analog-stereo");
  halvox_dictionary_set_double(message.get(), "latency_ms", 10.67);
  return message;
}

Client makeClient(const std::string& socketPath) {
  halvox_options options{};
  options.size = sizeof options;
  options.socket_path = socketPath.c_str();
  options.real_time = 1;  // what is measured is what an audio thread pays
  Client client(halvox_client_new(&options));
  halvox_client_create_session(client.get(), kReporter);
  halvox_client_start(client.get(), kReporter);
  if (halvox_client_flush(client.get(), 5000) != HALVOX_OK) throw std::runtime_error("no server");
  return client;
}

enum class Use { kPrepared, kChanged, kBuilt };

std::int64_t pending(halvox_client* client) {
  halvox_counters counters{};
  counters.size = sizeof counters;
  halvox_client_counters(client, &counters);
  return static_cast<std::int64_t>(counters.pending);
}

// CPU of the library for each message, at full speed but without a loss.
Values pipelineLibrary(const std::string& socketPath, std::int64_t count, Use use) {
  const Client client = makeClient(socketPath);
  Message message = makeMessage(0);
  const double before = cpuMicroseconds();
  const auto begin = Clock::now();
  for (std::int64_t number = 0; number < count; ++number) {
    if (use == Use::kBuilt) message = makeMessage(number);
    if (use == Use::kChanged) {
      halvox_dictionary_set_int64(message.get(), "frame_counter", number);
    }
    if (halvox_client_send(client.get(), kReporter, message.get(), 4, 18) != HALVOX_OK) {
      throw std::runtime_error("a message was dropped");
    }
    // Enough messages wait to keep the library busy, but not so many that their memory leaves the
    // cache.
    while (number % 64 == 0 && pending(client.get()) > 4 * kWindow) {
      std::this_thread::sleep_for(std::chrono::microseconds(100));
    }
  }
  if (halvox_client_flush(client.get(), 60'000) != HALVOX_OK) throw std::runtime_error("no answer");
  const auto messages = static_cast<double>(count);
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  return {(cpuMicroseconds() - before) / messages, messages / seconds};
}

Values pipelineRaw(const std::string& socketPath, std::int64_t count) {
  halvox::bench::RawClient client(socketPath);
  const double before = cpuMicroseconds();
  const auto begin = Clock::now();
  client.pipeline(count, kWindow);
  const auto messages = static_cast<double>(count);
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  return {(cpuMicroseconds() - before) / messages, messages / seconds};
}

// Reduces the interference of the machine with a caller, if this process may raise its priority.
void raisePriority() {
  sched_param parameters{};
  parameters.sched_priority = 10;
  sched_setscheduler(0, SCHED_FIFO, &parameters);
}

enum class Timed { kSend, kNothing, kSpin };

// Waits without leaving the processor.
void spin(Clock::time_point end) {
  while (Clock::now() < end) {
  }
}

// The page faults of this thread so far.
std::int64_t pageFaults() {
  rusage usage{};
  getrusage(RUSAGE_THREAD, &usage);
  return usage.ru_minflt + usage.ru_majflt;
}

// Nanoseconds in halvox_client_send(): bursts of 8 messages every millisecond, like those of the
// threads of a busy audio process. The other kinds show the interference of the machine: kNothing
// times an empty section, and kSpin a loop of 120 ns. An interrupt hits a longer section more
// often.
Values callerLatency(const std::string& socketPath, int count, Timed timed) {
  const Client client = makeClient(socketPath);
  const Message message = makeMessage(0);
  Values times;
  times.reserve(static_cast<std::size_t>(count));
  raisePriority();
  const std::int64_t faultsBefore = pageFaults();
  auto next = Clock::now();
  while (times.size() < static_cast<std::size_t>(count)) {
    for (int burst = 0; burst < 8; ++burst) {
      const auto begin = Clock::now();
      if (timed == Timed::kSend) {
        halvox_client_send(client.get(), kReporter, message.get(), 4, 18);
      } else if (timed == Timed::kSpin) {
        spin(begin + std::chrono::nanoseconds(120));
      }
      times.push_back(microseconds(Clock::now() - begin) * 1000);
    }
    next += std::chrono::milliseconds(1);
    std::this_thread::sleep_until(next);
  }
  const std::int64_t faults = pageFaults() - faultsBefore;
  halvox_client_flush(client.get(), 5000);
  halvox_counters counters{};
  counters.size = sizeof counters;
  halvox_client_counters(client.get(), &counters);
  return {percentile(times, 50),
          percentile(times, 99),
          percentile(times, 99.99),
          percentile(times, 100),
          static_cast<double>(counters.dropped),
          static_cast<double>(faults)};
}

Values distribution(int count, const std::function<void()>& request) {
  Values times;
  times.reserve(static_cast<std::size_t>(count));
  for (int number = 0; number < count; ++number) {
    const auto begin = Clock::now();
    request();
    times.push_back(microseconds(Clock::now() - begin));
  }
  return {percentile(times, 50), percentile(times, 99)};
}

Values synchronousSdBus(const std::string& socketPath, int count) {
  sd_bus* bus = nullptr;
  sd_bus_new(&bus);
  sd_bus_set_address(bus, ("unix:path=" + socketPath).c_str());
  if (sd_bus_start(bus) < 0) throw std::runtime_error("sd-bus cannot connect");
  return distribution(count, [bus] {
    sd_bus_message* reply = nullptr;
    const int result = sd_bus_call_method(
        bus, nullptr, "/com/tarno/halvox/reporting", "com.tarno.halvox.HVReportingServiceProtocol",
        "sendMessage", nullptr, &reply, "a{sv}uqaax", 10, "frame_counter", "x", 0L, "sample_rate",
        "d", 48000.0, "channels", "x", 2L, "io_buffer_frames", "x", 512L, "is_running", "b", 1,
        "volume", "d", 0.75, "route", "s", "Speaker", "format", "s", "lpcm/float32", "device_uid",
        "s", "alsa_output.pci-0000_00_1f.3.analog-stereo", "latency_ms", "d", 10.67, 4U, 18, 1, 1,
        kReporter);
    if (result < 0) throw std::runtime_error("sd-bus call");
    sd_bus_message_unref(reply);
  });
}

Values synchronousFlush(const std::string& socketPath, int count) {
  const Client client = makeClient(socketPath);
  const Message message = makeMessage(0);
  return distribution(count, [&] {
    halvox_client_send(client.get(), kReporter, message.get(), 4, 18);
    if (halvox_client_flush(client.get(), 5000) != HALVOX_OK) throw std::runtime_error("flush");
  });
}

Values synchronousConnection(const std::string& socketPath, int count) {
  using namespace halvox::client;
  auto opened = HalvoxConnection::open(socketPath);
  if (!opened) throw std::runtime_error(opened.failure->message);
  const Dictionary message{{"frame_counter", std::int64_t{0}},
                           {"sample_rate", 48000.0},
                           {"channels", std::int64_t{2}},
                           {"io_buffer_frames", std::int64_t{512}},
                           {"is_running", true},
                           {"volume", 0.75},
                           {"route", "Speaker"},
                           {"format", "lpcm/float32"},
                           {"device_uid", "alsa_output.pci-0000_00_1f.3.analog-stereo"},
                           {"latency_ms", 10.67}};
  return distribution(count, [&] {
    const auto answer = (*opened.value)->sendMessage(message, 4, 18, {{kReporter}});
    if (!answer) throw std::runtime_error(answer.failure->message);
  });
}

struct Kind {
  std::string name;
  Work work;
  std::vector<Values> rounds;

  [[nodiscard]] double median(std::size_t column) const {
    Values values;
    for (const Values& round : rounds) values.push_back(round.at(column));
    return percentile(values, 50);
  }
};

void runRounds(std::vector<Kind>& kinds, int rounds) {
  for (int round = 0; round < rounds; ++round) {
    for (Kind& kind : kinds) kind.rounds.push_back(inProcess(kind.work));
  }
}

void printPipelined(const std::string& socketPath, std::int64_t messages, int rounds) {
  std::vector<Kind> kinds{
      {"hand-written encoder", [&] { return pipelineRaw(socketPath, messages); }, {}},
      {"library, prepared message",
       [&] { return pipelineLibrary(socketPath, messages, Use::kPrepared); },
       {}},
      {"library, one value changed",
       [&] { return pipelineLibrary(socketPath, messages, Use::kChanged); },
       {}},
      {"library, message built anew",
       [&] { return pipelineLibrary(socketPath, messages, Use::kBuilt); },
       {}}};
  runRounds(kinds, rounds);
  std::printf("\n%-30s %14s %8s %14s\n", "pipelined", "CPU us/message", "ratio", "messages/s");
  for (const Kind& kind : kinds) {
    std::printf("%-30s %14.3f %8.2f %14.0f\n", kind.name.c_str(), kind.median(0),
                kind.median(0) / kinds.front().median(0), kind.median(1));
  }
}

void printCaller(const std::string& socketPath, int count, int rounds) {
  std::vector<Kind> kinds{
      {"nothing", [&] { return callerLatency(socketPath, count, Timed::kNothing); }, {}},
      {"a loop of 120 ns", [&] { return callerLatency(socketPath, count, Timed::kSpin); }, {}},
      {"halvox_client_send()", [&] { return callerLatency(socketPath, count, Timed::kSend); }, {}}};
  runRounds(kinds, rounds);
  std::printf("\n%-24s %8s %8s %8s %8s %8s %12s\n", "caller's thread, ns", "p50", "p99", "p99.99",
              "most", "dropped", "page faults");
  for (const Kind& kind : kinds) {
    std::printf("%-24s %8.0f %8.0f %8.0f %8.0f %8.0f %12.0f\n", kind.name.c_str(), kind.median(0),
                kind.median(1), kind.median(2), kind.median(3), kind.median(4), kind.median(5));
  }
}

void printSynchronous(const std::string& socketPath, int count, int rounds) {
  std::vector<Kind> kinds{
      {"sd-bus", [&] { return synchronousSdBus(socketPath, count); }, {}},
      {"HalvoxConnection", [&] { return synchronousConnection(socketPath, count); }, {}},
      {"halvox_client_send(), _flush()", [&] { return synchronousFlush(socketPath, count); }, {}}};
  runRounds(kinds, rounds);
  std::printf("\n%-30s %10s %8s %10s\n", "synchronous, us", "p50", "ratio", "p99");
  for (const Kind& kind : kinds) {
    std::printf("%-30s %10.1f %8.2f %10.1f\n", kind.name.c_str(), kind.median(0),
                kind.median(0) / kinds.front().median(0), kind.median(1));
  }
}

double loadAverage() {
  double load = 0;
  return getloadavg(&load, 1) == 1 ? load : -1;
}

bool isChosen(int argc, char** argv, std::string_view name) {
  return argc == 1 || std::find(argv + 1, argv + argc, name) != argv + argc;
}

}  // namespace

// Usage: halvox_client_bench [pipelined] [caller] [synchronous]
int main(int argc, char** argv) {
  try {
    constexpr int kRounds = 5;
    const halvox::platform::linux_::ScratchDirectory scratch;
    const std::string socketPath = scratch.path("sink");
    const halvox::bench::SinkProcess sink(socketPath);
    std::printf("load average before: %.1f\n", loadAverage());
    if (isChosen(argc, argv, "pipelined")) printPipelined(socketPath, 300'000, kRounds);
    if (isChosen(argc, argv, "caller")) printCaller(socketPath, 40'000, kRounds);
    if (isChosen(argc, argv, "synchronous")) printSynchronous(socketPath, 10'000, kRounds);
    std::printf("\nload average after: %.1f\n", loadAverage());
  } catch (const std::exception& error) {
    std::fprintf(stderr, "halvox_client_bench: %s\n", error.what());
    return 1;
  }
  return 0;
}
