#include "platform/linux/tracing/lttng/LttngControl.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <fstream>
#include <span>
#include <system_error>
#include <utility>

#include <lttng/lttng.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/tracing/TraceServices.h"
#include "platform/linux/tracing/lttng/TracerSessions.h"

namespace halvox::platform::linux_ {
namespace {

using Handle = UniqueHandle<lttng_handle*, lttng_destroy_handle>;
using Channel = UniqueHandle<lttng_channel*, lttng_channel_destroy>;
using Event = UniqueHandle<lttng_event*, lttng_event_destroy>;

constexpr const char* kChannel = "halvox";
// The buffers of one processor. 16 MiB hold the events of one second at a rate of 200,000 a second.
// The consumer may therefore be a second late.
constexpr std::uint64_t kSubBufferBytes = 1U << 20U;
constexpr std::uint64_t kMostSubBuffers = 16;
constexpr std::uint64_t kFewestSubBuffers = 4;
constexpr std::uint64_t kMostBytesOfAll = 256U << 20U;

// The tracer allocates buffers for every processor that the machine may ever have. On large
// machines each processor gets fewer buffers, so that all buffers together stay within 256 MiB.
std::uint64_t subBuffers() {
  const auto processors = static_cast<std::uint64_t>(std::max(1L, ::sysconf(_SC_NPROCESSORS_CONF)));
  const std::uint64_t share = kMostBytesOfAll / kSubBufferBytes / processors;
  return std::bit_floor(std::clamp(share, kFewestSubBuffers, kMostSubBuffers));
}

lttng_domain domain() {
  lttng_domain result{};
  result.type = LTTNG_DOMAIN_UST;
  // One set of buffers for each user, not for each process, because processes come and go.
  result.buf_type = LTTNG_BUFFER_PER_UID;
  return result;
}

// `result` is a code of the library; negative ones are errors.
Result<void> check(int result, std::string_view what) {
  if (result >= 0) return {};
  return Failure<>{"cannot " + std::string(what) + ": " + ::lttng_strerror(result)};
}

void copyName(std::span<char> to, std::string_view from) {
  const std::size_t length = std::min(from.size(), to.size() - 1);
  std::ranges::copy(from.substr(0, length), to.begin());
  to[length] = '\0';
}

Result<void> addChannel(lttng_handle* handle) {
  lttng_domain ust = domain();
  const Channel channel(::lttng_channel_create(&ust));
  if (!channel) return Failure<>{"cannot create a channel"};
  copyName(channel.get()->name, kChannel);
  // When the buffers are full, new events are lost and counted. Overwriting old ones would lose the
  // beginnings of intervals, and nothing would count them.
  channel.get()->attr.overwrite = 0;
  channel.get()->attr.subbuf_size = kSubBufferBytes;
  channel.get()->attr.num_subbuf = subBuffers();
  return check(::lttng_enable_channel(handle, channel.get()), "enable the channel");
}

Result<void> addContexts(lttng_handle* handle) {
  for (const auto context :
       {LTTNG_EVENT_CONTEXT_VPID, LTTNG_EVENT_CONTEXT_VTID, LTTNG_EVENT_CONTEXT_PROCNAME}) {
    lttng_event_context wanted{};
    wanted.ctx = context;
    const int result = ::lttng_add_context(handle, &wanted, nullptr, kChannel);
    if (auto added = check(result, "add a context"); !added) return added;
  }
  return {};
}

Result<void> addEvent(lttng_handle* handle, RecordingPlan plan) {
  const Event event(::lttng_event_create());
  if (!event) return Failure<>{"cannot create an event"};
  event.get()->type = LTTNG_EVENT_TRACEPOINT;
  event.get()->loglevel_type = LTTNG_EVENT_LOGLEVEL_ALL;
  copyName(event.get()->name, plan.event);
  std::vector<char*> exclusions;
  for (std::string& exclusion : plan.exclusions) exclusions.push_back(exclusion.data());
  const int result = ::lttng_enable_event_with_exclusions(
      handle, event.get(), kChannel, plan.filter.empty() ? nullptr : plan.filter.c_str(),
      static_cast<int>(exclusions.size()), exclusions.empty() ? nullptr : exclusions.data());
  return check(result, "enable the event");
}

}  // namespace

LttngControl::LttngControl(std::filesystem::path tracesDirectory)
    : tracesDirectory_(std::move(tracesDirectory)),
      scratchDirectory_(tracesDirectory_ / kTraceScratch),
      recordingDirectory_(tracesDirectory_ / "recording"),
      daemon_(tracesDirectory_ / kTraceDaemonNote) {}

std::string LttngControl::namePrefix() const {
  // Device and inode identify the directory itself; one directory can have several paths.
  struct stat status {};
  ::stat(tracesDirectory_.c_str(), &status);
  return "halvox-" + std::to_string(status.st_dev) + "-" + std::to_string(status.st_ino) + "-";
}

void LttngControl::removeLeftovers() {
  const MutexLock lock(mutex_);
  std::error_code ignored;
  const bool isRecorded = std::filesystem::exists(scratchDirectory_, ignored);
  // Usually nothing was left. Do not call the tracer's library then, because a call connects to a
  // daemon, which may hang.
  if (!isRecorded && !daemon_.isNoted()) return;
  // Adopt the daemon before destroying the sessions. If an earlier run of this service started it,
  // it needs a keeper again.
  daemon_.adopt(namePrefix());
  if (::lttng_session_daemon_alive() == 1) destroyTracerSessions(namePrefix());
  std::filesystem::remove_all(recordingDirectory_, ignored);
  std::filesystem::remove_all(scratchDirectory_, ignored);
}

Result<LttngControl::Recording> LttngControl::begin(const RecordingPlan& plan) {
  const MutexLock lock(mutex_);
  std::error_code ignored;
  std::filesystem::create_directories(tracesDirectory_, ignored);
  Recording recording;
  // The process ID distinguishes these recordings from those that an earlier service left.
  recording.name = namePrefix() + std::to_string(::getpid()) + "-" + std::to_string(++begun_);
  recording.directory = scratchDirectory_ / recording.name;
  if (auto isSetUp = setUp(plan, recording); !isSetUp) {
    discard(recording);
    return std::move(isSetUp).error();
  }
  // Tests and tools wait for this file. Errors are ignored, because the recording works without it.
  std::filesystem::create_directories(recordingDirectory_, ignored);
  std::ofstream(recordingDirectory_ / recording.name).close();
  return recording;
}

Result<void> LttngControl::setUp(const RecordingPlan& plan, const Recording& recording) {
  std::error_code error;
  std::filesystem::create_directories(recording.directory, error);
  if (error) {
    return Failure<>{"cannot create " + recording.directory.string() + ": " + error.message()};
  }
  // Check at each recording, because the daemon may be one that others started, and may have ended
  // since the last trace.
  if (::lttng_session_daemon_alive() != 1) {
    if (auto started = daemon_.start(namePrefix()); !started) return started;
  }
  const std::string url = "file://" + recording.directory.string();
  const char* const name = recording.name.c_str();
  auto done = check(::lttng_create_session(name, url.c_str()), "create a session");
  if (!done) return done;
  lttng_domain ust = domain();
  const Handle handle(::lttng_create_handle(name, &ust));
  done = handle ? addChannel(handle.get()) : Failure<>{"cannot create a handle"};
  if (done) done = addContexts(handle.get());
  if (done) done = addEvent(handle.get(), plan);
  if (done) done = check(::lttng_start_tracing(name), "start the session");
  // Nothing was recorded, and there is no data to wait for.
  if (!done) static_cast<void>(::lttng_destroy_session_no_wait(name));
  return done;
}

Result<void> LttngControl::end(const Recording& recording) {
  const MutexLock lock(mutex_);
  std::error_code ignored;
  // Remove the file first, because its presence promises that events are recorded.
  std::filesystem::remove(recordingDirectory_ / recording.name, ignored);
  const char* const name = recording.name.c_str();
  // Both calls wait until the recording is on the disk. Make both, even if the first one fails.
  auto stopped = check(::lttng_stop_tracing(name), "stop the session");
  auto destroyed = check(::lttng_destroy_session(name), "destroy the session");
  return stopped ? destroyed : stopped;
}

void LttngControl::discard(const Recording& recording) {
  std::error_code ignored;
  if (!recording.directory.empty()) std::filesystem::remove_all(recording.directory, ignored);
}

void LttngControl::close() {
  const MutexLock lock(mutex_);
  // If nothing was recorded and the daemon is not ours, there is nothing to destroy.
  if (begun_ == 0 && !daemon_.isOurs()) return;
  if (daemon_.isOurs()) {
    daemon_.leave();
  } else if (::lttng_session_daemon_alive() == 1) {
    destroyTracerSessions(namePrefix());
  }
  std::error_code ignored;
  std::filesystem::remove_all(recordingDirectory_, ignored);
  std::filesystem::remove_all(scratchDirectory_, ignored);
}

}  // namespace halvox::platform::linux_
