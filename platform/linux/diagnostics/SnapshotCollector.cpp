#include "platform/linux/diagnostics/SnapshotCollector.h"

#include <array>
#include <cerrno>
#include <memory>

#include <poll.h>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/diagnostics/Child.h"
#include "platform/linux/diagnostics/FileTree.h"
#include "platform/linux/diagnostics/ProcessFacts.h"
#include "platform/linux/diagnostics/SignatureKeys.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kBytesOfDump = 16U << 20U;
// Reserved for the manifest, however large the other parts are.
constexpr std::uint64_t kRoomForManifest = 1U << 20U;

double secondsOf(CaptureDeadline::Clock::duration time) {
  return std::chrono::duration<double>(time).count();
}

// The answer of a state source. Shared with the source, which may answer after the wait has timed
// out.
struct StateAnswer {
  WaitableFlag hasCome;
  Mutex mutex;
  Dictionary state HALVOX_GUARDED_BY(mutex);
};

// Waits for the flag. Returns false if the deadline passed first.
bool awaitFlag(const WaitableFlag& flag, const CaptureDeadline& deadline) {
  while (!flag.isRaised() && !deadline.hasPassed()) {
    std::array<pollfd, 2> polled{
        {{flag.descriptor(), POLLIN, 0}, {deadline.stop().descriptor(), POLLIN, 0}}};
    if (::poll(polled.data(), polled.size(), deadline.millisecondsLeft()) < 0 && errno != EINTR) {
      return false;
    }
  }
  return flag.isRaised();
}

}  // namespace

SnapshotCollector::SnapshotCollector(const SnapshotRequest& request, const SnapshotSources& sources,
                                     SnapshotArchive& archive, const CaptureDeadline& deadline)
    : request_(request), sources_(sources), archive_(archive), deadline_(deadline) {}

// Parts that change quickly come first, because they must show the moment of the request. Parts
// that may take long come last: if they use up the time, no other part is lost.
Result<void> SnapshotCollector::collect() {
  addSignature();
  addRequest();
  addProcess();
  addState();
  addLog();
  addSystem();
  addSound();
  addManifest();
  return result_;
}

void SnapshotCollector::addSignature() {
  addPart("signature.json", [this] { return Finding{.bytes = json(request_.signature)}; });
}

// Omits this part if the request has nothing but its signature. The duration is recorded but not
// waited for, because a snapshot shows one moment.
void SnapshotCollector::addRequest() {
  if (!request_.event && !request_.payload && request_.durationSeconds == 0) return;
  addPart("request.json", [this] {
    Dictionary fields{{"duration_seconds", request_.durationSeconds}};
    if (request_.event) fields.set("event", *request_.event);
    if (request_.payload) fields.set("payload", *request_.payload);
    return Finding{.bytes = json(fields)};
  });
}

void SnapshotCollector::addState() {
  addPart("state.json", [this] { return findState(); });
}

Finding SnapshotCollector::findState() {
  if (!sources_.state) return Finding::failed("no source of the service's state was set");
  const auto answer = std::make_shared<StateAnswer>();
  sources_.state([answer](const Dictionary& state) {
    {
      const MutexLock lock(answer->mutex);
      answer->state = state;
    }
    answer->hasCome.raise();
  });
  if (!awaitFlag(answer->hasCome, deadline_.within(sources_.stateWithin))) {
    return Finding::failed("the service did not answer in time");
  }
  Dictionary state;
  {
    const MutexLock lock(answer->mutex);
    state = answer->state;
  }
  return {.bytes = json(state)};
}

void SnapshotCollector::addLog() {
  addPart("log.txt", [this] {
    if (!sources_.log) return Finding::failed("the service keeps no log lines in memory");
    LogMemory::Contents contents = sources_.log();
    return Finding{.bytes = std::move(contents.text), .isCut = contents.lines < contents.added};
  });
}

void SnapshotCollector::addProcess() {
  addPart("process.json", [this] { return findProcess(); });
}

Finding SnapshotCollector::findProcess() {
  const Value* name = request_.signature.find(signature_key::kDetectedProcess);
  if (name == nullptr || name->string().empty()) {
    return Finding::failed("the signature does not name a process");
  }
  const Dictionary facts = processFacts(sources_.paths.proc, name->string(), deadline_);
  if (facts.find("found")->toUInt64() == 0) {
    return Finding::failed("no process of that name is running");
  }
  return {.bytes = json(facts)};
}

void SnapshotCollector::addSystem() {
  addPart("system.json",
          [this] { return Finding{.bytes = json(systemFacts(sources_.paths, deadline_))}; });
}

void SnapshotCollector::addSound() {
  if (isOver()) return;
  const Clock::time_point begun = Clock::now();
  const Tree tree = readTree(sources_.paths.alsa, TreeBounds{}, deadline_);
  Finding asound;
  asound.isCut = tree.isCut || tree.unreadable > 0;
  asound.failure = tree.failure;
  for (const TreeFile& file : tree.files) {
    if (isOver() || archive_.roomLeft() < file.bytes.size() + kRoomForManifest) break;
    result_ = archive_.add("asound/" + file.path.generic_string(), file.bytes);
    asound.bytes += file.bytes;
  }
  if (asound.failure.empty() && tree.files.empty()) asound.failure = "the directory has no files";
  note("asound/", asound, Clock::now() - begun);
  addPart("pw-dump.json", [this] {
    return runProgram(sources_.paths.pipeWireDump, kBytesOfDump,
                      deadline_.within(sources_.dumpWithin));
  });
}

void SnapshotCollector::addManifest() {
  if (isOver()) return;
  result_ = archive_.add("manifest.json", json({{"version", 1},
                                                {"time", request_.time},
                                                {"seconds", secondsOf(Clock::now() - begun_)},
                                                {"items", Array(items_)}}));
}

void SnapshotCollector::addPart(const char* name, const std::function<Finding()>& find) {
  if (isOver()) return;
  const Clock::time_point begun = Clock::now();
  Finding finding = deadline_.hasPassed() ? Finding::failed("the time limit was reached") : find();
  // Drop the whole capture if the end of the service interrupts it.
  if (deadline_.stop().isRaised()) {
    result_ = Failure<>{"the service is ending"};
    return;
  }
  // Leave room for the manifest, which says what is missing.
  if (finding.isCollected() && archive_.roomLeft() < finding.bytes.size() + kRoomForManifest) {
    finding = Finding::failed("the size limit of the archive was reached");
  }
  if (finding.isCollected()) result_ = archive_.add(name, finding.bytes);
  note(name, finding, Clock::now() - begun);
}

void SnapshotCollector::note(const std::string& name, const Finding& finding,
                             Clock::duration took) {
  Dictionary item{{"name", name},
                  {"collected", finding.isCollected()},
                  {"bytes", static_cast<std::uint64_t>(finding.bytes.size())},
                  {"seconds", secondsOf(took)}};
  if (finding.isCut) item.set("cut", true);
  if (!finding.isCollected()) item.set("reason", finding.failure);
  items_.emplace_back(std::move(item));
}

std::string SnapshotCollector::json(const Dictionary& dictionary) {
  return std::string(encoder_.encode(dictionary)) + "\n";
}

}  // namespace halvox::platform::linux_
