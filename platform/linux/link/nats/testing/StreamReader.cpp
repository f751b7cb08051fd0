// Prints the messages of a stream, one JSON object a line:
// {"subject":…,"sequence":…,"id":…,"message":…}. An independent subscriber. Except for the handles,
// it shares no code with the back-end that it checks.
//
//   halvox_stream_reader URL STREAM
#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include <nats/nats.h>

#include "platform/linux/link/nats/NatsHandles.h"

namespace {

using namespace halvox::platform::linux_;
using Subscription = UniqueHandle<natsSubscription*, natsSubscription_Destroy>;
using MetaData = UniqueHandle<jsMsgMetaData*, jsMsgMetaData_Destroy>;

constexpr std::int64_t kWaitMilliseconds = 10'000;

int refuse(const char* what, natsStatus status) {
  std::fprintf(stderr, "halvox_stream_reader: %s: %s\n", what, natsStatus_GetText(status));
  return EXIT_FAILURE;
}

void print(natsMsg* message, std::uint64_t sequence) {
  const char* id = "";
  static_cast<void>(natsMsgHeader_Get(message, "Nats-Msg-Id", &id));
  std::printf("{\"subject\":\"%s\",\"sequence\":%llu,\"id\":\"%s\",\"message\":%.*s}\n",
              natsMsg_GetSubject(message), static_cast<unsigned long long>(sequence), id,
              natsMsg_GetDataLength(message), natsMsg_GetData(message));
}

natsStatus printAll(jsCtx* context, const char* stream, std::uint64_t last) {
  jsSubOptions options;
  jsSubOptions_Init(&options);
  options.Stream = stream;
  options.Ordered = true;
  Subscription subscription;
  natsStatus status =
      js_SubscribeSync(subscription.out(), context, ">", nullptr, &options, nullptr);
  for (std::uint64_t sequence = 0; status == NATS_OK && sequence < last;) {
    NatsMessage message;
    status = natsSubscription_NextMsg(message.out(), subscription.get(), kWaitMilliseconds);
    MetaData data;
    if (status == NATS_OK) status = natsMsg_GetMetaData(data.out(), message.get());
    if (status != NATS_OK) break;
    sequence = data.get()->Sequence.Stream;
    print(message.get(), sequence);
  }
  return status;
}

int read(const char* url, const char* stream) {
  NatsConnection connection;
  natsStatus status = natsConnection_ConnectTo(connection.out(), url);
  if (status != NATS_OK) return refuse(url, status);
  JetStreamContext context;
  status = natsConnection_JetStream(context.out(), connection.get(), nullptr);
  if (status != NATS_OK) return refuse(url, status);
  JetStreamInfo info;
  status = js_GetStreamInfo(info.out(), context.get(), stream, nullptr, nullptr);
  if (status != NATS_OK) return refuse(stream, status);
  if (info.get()->State.Msgs == 0) return EXIT_SUCCESS;
  status = printAll(context.get(), stream, info.get()->State.LastSeq);
  return status == NATS_OK ? EXIT_SUCCESS : refuse(stream, status);
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 3) {
    std::fprintf(stderr, "usage: halvox_stream_reader URL STREAM\n");
    return EXIT_FAILURE;
  }
  return read(argv[1], argv[2]);
}
