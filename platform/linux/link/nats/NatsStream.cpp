#include "platform/linux/link/nats/NatsStream.h"

#include "platform/linux/link/nats/NatsLog.h"
#include "platform/linux/link/nats/NatsPublisher.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// The limits of a stream that this service creates. A reader can be absent for a month. 4 GiB
// bounds the disk space that a busy service uses on the server in that time.
constexpr std::int64_t kStreamBytes = std::int64_t{4} << 30;
constexpr std::chrono::nanoseconds kStreamAge = std::chrono::hours(24 * 30);

// For this long the stream recognises a message identifier. A message is published again for at
// most half of this time, because the last copy can arrive late and the stream must still recognise
// its identifier. Two minutes is also the default of the server.
constexpr std::chrono::nanoseconds kDuplicatesTime = std::chrono::minutes(2);
static_assert(kDuplicatesTime >= 2 * NatsPublisher::kAckTime);

}  // namespace

std::string describe(natsStatus status) {
  natsStatus last = NATS_OK;
  const char* const detail = nats_GetLastError(&last);
  std::string text = natsStatus_GetText(status);
  if (last == status && detail != nullptr && *detail != '\0' && text != detail) {
    text += std::string(" (") + detail + ")";
  }
  return text;
}

StreamProvision provideStream(jsCtx* context, const Configuration::Link& options) {
  StreamProvision provision{.failure = {}, .duplicates = kDuplicatesTime};
  JetStreamInfo info;
  jsErrCode code{};
  natsStatus status = js_GetStreamInfo(info.out(), context, options.stream.c_str(), nullptr, &code);
  if (status == NATS_OK) {
    provision.duplicates = std::chrono::nanoseconds(info.get()->Config->Duplicates);
    return provision;
  }
  // Create the stream only if the server says that it does not exist. Other failures do not show
  // whether it exists.
  if (status != NATS_NOT_FOUND && code != JSStreamNotFoundErr) {
    provision.failure = "cannot look up stream " + options.stream + ": " + describe(status);
    return provision;
  }
  const std::string subjects = options.subject + ".>";
  const char* subject = subjects.c_str();
  jsStreamConfig stream;
  jsStreamConfig_Init(&stream);
  stream.Name = options.stream.c_str();
  stream.Subjects = &subject;
  stream.SubjectsLen = 1;
  stream.Storage = js_FileStorage;
  stream.MaxBytes = kStreamBytes;
  stream.MaxAge = kStreamAge.count();
  stream.Replicas = static_cast<std::int64_t>(options.replicas);
  stream.Duplicates = kDuplicatesTime.count();
  status = js_AddStream(info.out(), context, &stream, nullptr, &code);
  if (status == NATS_OK) kLog.notice("created the NATS stream ", options.stream);
  // Another service may have created the stream since the lookup. That is not a failure.
  if (status != NATS_OK && code != JSStreamNameExistErr) {
    provision.failure = "cannot create stream " + options.stream + ": " + describe(status);
  }
  return provision;
}

}  // namespace halvox::platform::linux_
