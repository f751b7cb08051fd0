// Measures how many messages a second one client gets through the service and its link, to the
// local store and to a JetStream stream. Compares this with the client library's own asynchronous
// publishing of the same bytes to the same server in the same run. A message counts when it is
// stored. Runs its own server:
//
//   halvox_link_load [MESSAGES [ROUNDS]]
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <exception>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <arpa/inet.h>
#include <nats/nats.h>
#include <netinet/in.h>
#include <sqlite3.h>
#include <sys/socket.h>
#include <unistd.h>

#include "bench/load/Report.h"
#include "bench/load/Server.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::bench {
namespace {

using namespace platform::linux_;
using Clock = std::chrono::steady_clock;
using Database = UniqueHandle<sqlite3*, sqlite3_close>;
using Statement = UniqueHandle<sqlite3_stmt*, sqlite3_finalize>;
using StreamInfo = UniqueHandle<jsStreamInfo*, jsStreamInfo_Destroy>;

constexpr const char* kStream = "HALVOX";
constexpr std::int64_t kWindow = 256;    // unanswered requests, as in our client library
constexpr std::int64_t kPending = 8192;  // unacknowledged messages of the plain library
constexpr std::int64_t kWarmUp = 2000;
constexpr std::chrono::milliseconds kPoll{2};
constexpr std::chrono::minutes kPatience{2};

struct Result {
  double perSecond;
  double cpuMicros;  // CPU time per message of the process that publishes
};

std::chrono::nanoseconds ownCpu() {
  timespec time{};
  ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

// Measures wall-clock time, and the CPU time that `cpu` returns, from construction to result().
class Stopwatch {
 public:
  using Cpu = std::function<std::chrono::nanoseconds()>;
  explicit Stopwatch(Cpu cpu) : cpu_(std::move(cpu)), cpuBefore_(cpu_()), began_(Clock::now()) {}

  [[nodiscard]] Result result(std::int64_t messages) const {
    const std::chrono::duration<double> seconds = Clock::now() - began_;
    const std::chrono::duration<double, std::micro> cpu = cpu_() - cpuBefore_;
    const auto count = static_cast<double>(messages);
    return {count / seconds.count(), cpu.count() / count};
  }

 private:
  Cpu cpu_;
  std::chrono::nanoseconds cpuBefore_;
  Clock::time_point began_;
};

void waitUntil(const char* what, const std::function<bool()>& isTrue) {
  for (const auto end = Clock::now() + kPatience; !isTrue(); std::this_thread::sleep_for(kPoll)) {
    if (Clock::now() > end) throw std::runtime_error(std::string("timed out waiting for ") + what);
  }
}

int freePort() {
  const UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  auto* const any = reinterpret_cast<sockaddr*>(&address);
  if (::bind(socket.get(), any, length) != 0 || ::getsockname(socket.get(), any, &length) != 0) {
    throw std::runtime_error("cannot find a free port");
  }
  return ntohs(address.sin_port);
}

// Runs a server with JetStream and connects the plain library to it.
class JetStream {
 public:
  JetStream()
      : port_(std::to_string(freePort())),
        process_({"nats-server", "-js", "-sd", directory_.path().string(), "-a", "127.0.0.1", "-p",
                  port_, "-l", directory_.path("log")},
                 {}) {
    waitUntil("nats-server", [this] {
      return natsConnection_ConnectTo(connection_.out(), url().c_str()) == NATS_OK;
    });
    jsOptions options;
    jsOptions_Init(&options);
    options.PublishAsync.MaxPending = kPending;
    options.PublishAsync.StallWait = 10'000;
    if (natsConnection_JetStream(context_.out(), connection_.get(), &options) != NATS_OK) {
      throw std::runtime_error("the server does not offer JetStream");
    }
  }

  [[nodiscard]] std::string url() const { return "nats://127.0.0.1:" + port_; }

  [[nodiscard]] std::int64_t messages() const {
    StreamInfo info;
    const bool isThere =
        js_GetStreamInfo(info.out(), context_.get(), kStream, nullptr, nullptr) == NATS_OK;
    return isThere ? static_cast<std::int64_t>(info.get()->State.Msgs) : 0;
  }

  // Returns one of the messages on the stream.
  [[nodiscard]] NatsMessage message() const {
    NatsMessage message;
    if (js_GetMsg(message.out(), context_.get(), kStream, kWarmUp / 2, nullptr, nullptr) !=
        NATS_OK) {
      throw std::runtime_error("cannot read a message from the stream");
    }
    return message;
  }

  // Publishes copies of `like`, each with an identifier of the same length.
  Result publish(const NatsMessage& like, std::int64_t messages) {
    const char* id = nullptr;
    if (natsMsgHeader_Get(like.get(), "Nats-Msg-Id", &id) != NATS_OK) {
      throw std::runtime_error("a message on the stream has no identifier");
    }
    const auto width = static_cast<int>(std::string(id).size());
    jsPubOptions options;
    jsPubOptions_Init(&options);
    // The plain library publishes in this process, the service in its own. For each, the CPU time
    // of the process that does the work is measured.
    const Stopwatch watch(ownCpu);
    for (std::int64_t number = 0; number < messages; ++number) {
      char text[64];
      std::snprintf(text, sizeof text, "%0*lld", width, static_cast<long long>(++published_));
      options.MsgId = text;
      if (js_PublishAsync(context_.get(), natsMsg_GetSubject(like.get()),
                          natsMsg_GetData(like.get()), natsMsg_GetDataLength(like.get()),
                          &options) != NATS_OK) {
        throw std::runtime_error("the plain library cannot publish");
      }
    }
    options.MaxWait = 60'000;
    options.MsgId = nullptr;
    if (js_PublishAsyncComplete(context_.get(), &options) != NATS_OK) {
      throw std::runtime_error("the plain library received no acknowledgements in time");
    }
    return watch.result(messages);
  }

 private:
  ScratchDirectory directory_;
  std::string port_;
  Process process_;
  NatsConnection connection_;
  JetStreamContext context_;
  std::int64_t published_ = 0;
};

// Returns how many records the store has, events and link messages.
std::int64_t storedRecords(const std::string& path) {
  Database database;
  Statement statement;
  // Fails while the service is still creating the file. The caller tries again. The number of the
  // last record needs no block to be unpacked, which would take time from what is measured.
  if (sqlite3_open_v2(path.c_str(), database.out(), SQLITE_OPEN_READONLY, nullptr) != SQLITE_OK ||
      sqlite3_prepare_v2(database.get(),
                         "SELECT id + records - 1 FROM message_blocks ORDER BY id DESC LIMIT 1", -1,
                         statement.out(), nullptr) != SQLITE_OK ||
      sqlite3_step(statement.get()) != SQLITE_ROW) {
    return 0;
  }
  return sqlite3_column_int64(statement.get(), 0);
}

// Sends messages from one client through the service until `stored` has counted all of them.
Result through(const Server& server, std::int64_t messages,
               const std::function<std::int64_t()>& stored) {
  const MessageShape shape;
  // The runs to JetStream share one stream, which still holds the messages of the runs before.
  const std::int64_t before = stored();
  const auto client = server.client(1);
  client->pipeline(kWarmUp, kWindow, shape);
  // Waits until these messages are stored, because their work must not be measured with that of the
  // next ones.
  waitUntil("the first messages", [&] { return stored() >= before + kWarmUp; });
  const Stopwatch watch([&server] { return server.process().cpuTime(); });
  client->pipeline(messages, kWindow, shape);
  waitUntil("the messages", [&] { return stored() >= before + kWarmUp + messages; });
  return watch.result(messages);
}

struct Run {
  ServerPrograms programs;
  std::int64_t messages;
  int rounds;
};

Result toLocal(const Run& run, ServerKind kind) {
  const Server server(run.programs, kind, kLocalLink);
  // With events, each message makes two of them and a link message.
  const std::int64_t recordsOfMessage = kind == ServerKind::kStored ? 3 : 1;
  return through(server, run.messages,
                 [&] { return storedRecords(server.database()) / recordsOfMessage; });
}

Result toJetStream(const Run& run, ServerKind kind, const JetStream& stream) {
  const Server server(run.programs, kind,
                      "[link]\nbackend = \"nats\"\nservers = [\"" + stream.url() + "\"]\n");
  return through(server, run.messages, [&] { return stream.messages(); });
}

void compare(const Run& run) {
  constexpr std::size_t kRows = 5;
  const char* const names[kRows] = {"local, no event wanted", "local, both events stored",
                                    "JetStream, no event wanted", "JetStream, both events stored",
                                    "plain library to JetStream"};
  JetStream stream;
  std::vector<double> rates[kRows];
  std::vector<double> costs[kRows];
  const auto add = [&](std::size_t row, const Result& result) {
    rates[row].push_back(result.perSecond);
    costs[row].push_back(result.cpuMicros);
  };
  for (int round = 0; round < run.rounds; ++round) {
    add(0, toLocal(run, ServerKind::kUnwanted));
    add(1, toLocal(run, ServerKind::kStored));
    add(2, toJetStream(run, ServerKind::kUnwanted, stream));
    add(3, toJetStream(run, ServerKind::kStored, stream));
    add(4, stream.publish(stream.message(), run.messages));
  }
  std::printf(
      "%lld messages of %d bytes of JSON, median of %d rounds, messages a second,\n"
      "times those of the plain library, CPU time of the publishing process a message:\n",
      static_cast<long long>(run.messages), natsMsg_GetDataLength(stream.message().get()),
      run.rounds);
  for (std::size_t row = 0; row < kRows; ++row) {
    std::printf("  %-30s %10.0f  %.2f %8.2f us\n", names[row], median(rates[row]),
                median(rates[row]) / median(rates[kRows - 1]), median(costs[row]));
  }
}

}  // namespace
}  // namespace halvox::bench

int main(int argc, char** argv) {
  try {
    const auto here = std::filesystem::read_symlink("/proc/self/exe").parent_path();
    halvox::bench::compare(
        {.programs = {.service = (here / "halvox-reportingd").string(), .echo = {}},
         .messages = argc > 1 ? std::atoll(argv[1]) : 100'000,
         .rounds = argc > 2 ? std::atoi(argv[2]) : 3});
  } catch (const std::exception& error) {
    std::fprintf(stderr, "halvox_link_load: %s\n", error.what());
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}
