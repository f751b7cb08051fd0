// Measures how many messages a second the link's back-end publishes to a JetStream stream. Compares
// this with the client library's own asynchronous publishing of the same bytes to the same stream
// in the same run. Both wait for all acknowledgements. Needs a server with JetStream:
//
//   halvox_link_bench nats://127.0.0.1:4222 [MESSAGES [ROUNDS]]
#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <string>
#include <vector>

#include <nats/nats.h>

#include "bench/NullPlatform.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/runtime/CounterStatisticsService.h"

namespace {

using namespace halvox::platform;
using namespace halvox::platform::linux_;
using Clock = std::chrono::steady_clock;

constexpr std::int64_t kPending = 8192;  // the back-end's own window

Dictionary payloadOf(std::size_t number) {
  return {{"number", number},
          {"format", "Float32"},
          {"samplerate", 48000.0},
          {"channels", 2},
          {"device", "alsa_output.pci-0000_00_1f.3.analog-stereo"},
          {"hvreporting_timestamp", 1.7e9 + static_cast<double>(number)}};
}

const Dictionary& sessionInfo() {
  static const Dictionary info{{kTLMReportingSessionInfoClientType, 19},
                               {kTLMReportingSessionInfoClientVersion, 2.1},
                               {kTLMReportingSessionInfoSessionID, 1},
                               {kTLMReportingSessionInfoBatchEvent, true}};
  return info;
}

const Dictionary& userInfo() {
  static const Dictionary info{{kTLMReportingUserInfoClientName, "com.tarno.halvox"},
                               {kTLMReportingUserInfoServiceName, "playback_session"}};
  return info;
}

double perSecond(std::size_t messages, Clock::time_point began) {
  return static_cast<double>(messages) /
         std::chrono::duration<double>(Clock::now() - began).count();
}

double measureBackend(TLMReportingService& link, std::size_t messages) {
  const auto session = link.TLMReportingCreateSession(sessionInfo(), userInfo());
  std::promise<bool> found;
  link.TLMReportingStartConfiguration(
      session, [&](const std::optional<Array>& servers) { found.set_value(servers.has_value()); });
  if (!found.get_future().get()) {
    std::fprintf(stderr, "halvox_link_bench: cannot connect to the server\n");
    std::exit(EXIT_FAILURE);
  }
  const auto began = Clock::now();
  for (std::size_t number = 0; number < messages; ++number) {
    if (!link.TLMReportingSendMessage(session, {4, 1, payloadOf(number)}).sent) std::abort();
  }
  std::promise<void> flushed;
  link.TLMReportingFlushMessages(session, [&] { flushed.set_value(); });
  flushed.get_future().wait();
  return perSecond(messages, began);
}

// Publishes the bytes of a stored message under the same subject, with a header of the same length.
double measureLibrary(jsCtx* context, const std::string& body, std::size_t messages) {
  static int round = 0;
  ++round;
  jsPubOptions options;
  jsPubOptions_Init(&options);
  const auto began = Clock::now();
  for (std::size_t number = 0; number < messages; ++number) {
    char id[40];
    // Each message has an identifier of its own, because the server drops messages whose identifier
    // it has seen.
    std::snprintf(id, sizeof id, "plain%011d-%zu", round, number);
    options.MsgId = id;
    if (js_PublishAsync(context, "halvox.playback_session.1", body.data(),
                        static_cast<int>(body.size()), &options) != NATS_OK) {
      std::abort();
    }
  }
  options.MaxWait = 60'000;
  options.MsgId = nullptr;
  if (js_PublishAsyncComplete(context, &options) != NATS_OK) std::abort();
  return perSecond(messages, began);
}

// Returns one of the messages that the back-end published.
std::string storedBody(jsCtx* context) {
  NatsMessage message;
  if (js_GetLastMsg(message.out(), context, "HALVOX", "halvox.playback_session.1", nullptr,
                    nullptr) != NATS_OK) {
    std::abort();
  }
  return {natsMsg_GetData(message.get()),
          static_cast<std::size_t>(natsMsg_GetDataLength(message.get()))};
}

double median(std::vector<double> values) {
  std::ranges::sort(values);
  return values[values.size() / 2];
}

struct Run {
  std::size_t messages;
  int rounds;
};

void compare(TLMReportingService& link, const char* url, Run run) {
  NatsConnection connection;
  JetStreamContext context;
  jsOptions options;
  jsOptions_Init(&options);
  options.PublishAsync.MaxPending = kPending;
  options.PublishAsync.StallWait = 10'000;
  // Warms up, and makes the stream and the message that the library then publishes.
  static_cast<void>(measureBackend(link, run.messages / 10));
  if (natsConnection_ConnectTo(connection.out(), url) != NATS_OK ||
      natsConnection_JetStream(context.out(), connection.get(), &options) != NATS_OK) {
    std::abort();
  }
  const std::string body = storedBody(context.get());
  std::vector<double> backend;
  std::vector<double> library;
  for (int round = 0; round < run.rounds; ++round) {
    // The two take turns, so that other work on the machine affects both alike.
    backend.push_back(measureBackend(link, run.messages));
    library.push_back(measureLibrary(context.get(), body, run.messages));
  }
  std::printf("%zu messages of %zu bytes, median of %d rounds, messages a second:\n", run.messages,
              body.size(), run.rounds);
  std::printf("  back-end of the link  %10.0f\n  plain library         %10.0f\n  ratio %.2f\n",
              median(backend), median(library), median(backend) / median(library));
  natsConnection_Close(connection.get());
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) {
    std::fprintf(stderr, "usage: halvox_link_bench URL [MESSAGES [ROUNDS]]\n");
    return EXIT_FAILURE;
  }
  halvox::bench::NullPlatform installed(LogLevel::kError);
  Configuration::Link options;
  options.backend = LinkBackend::kNats;
  options.servers = {argv[1]};
  CounterStatisticsService statistics;
  AsioDispatchService dispatch(halvox::platform::log(), statistics);
  const auto link = makeNatsTlmReporting(options, {dispatch, statistics});
  if (!link) return EXIT_FAILURE;
  compare(*link, argv[1],
          {.messages = argc > 2 ? std::strtoul(argv[2], nullptr, 10) : 50'000,
           .rounds = argc > 3 ? std::atoi(argv[3]) : 5});
  static_cast<void>(dispatch.stop(std::chrono::seconds(5)));
  // A thread that did not end may still use what would be destroyed.
  if (!link->close()) std::quick_exit(EXIT_FAILURE);
  return EXIT_SUCCESS;
}
