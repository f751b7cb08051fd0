#include "platform/linux/diagnostics/SnapshotDiagnosticReporterService.h"

#include <string>
#include <thread>
#include <utility>
#include <variant>

#include <sys/resource.h>
#include <unistd.h>

#include "platform/clock.h"
#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/diagnostics/SignatureKeys.h"
#include "platform/linux/diagnostics/SnapshotArchive.h"
#include "platform/linux/diagnostics/SnapshotCollector.h"
#include "platform/linux/diagnostics/SnapshotDirectory.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/object_log.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kNiceness = 10;
constexpr const char* kBusy = "another snapshot is being taken";
constexpr const char* kEnding = "the service is ending";

// A finished snapshot.
struct Snapshot {
  std::filesystem::path path;
  std::uint64_t size;
};

Dictionary errorReply(const std::string& why) { return {{"error", why}}; }

std::string_view textOf(const Dictionary& signature, const char* key) {
  const Value* value = signature.find(key);
  return value == nullptr ? std::string_view{} : value->string();
}

}  // namespace

// The thread that takes snapshots, and its work. Shared by the service and its reporters, which may
// outlive the service.
class SnapshotDiagnosticReporterService::Worker {
 public:
  using Reply = AILDiagnosticReporter::Reply;

  Worker(SnapshotOptions options, SnapshotPartners partners)
      : options_(std::move(options)),
        partners_(std::move(partners)),
        log_(partners_.log.createCategory("com.tarno.halvox", "diagnostics"), "SnapshotReporter"),
        directory_(options_.storageDirectory),
        received_(partners_.statistics.counter("diagnostics", "received")),
        delivered_(partners_.statistics.counter("diagnostics", "delivered")),
        busy_(partners_.statistics.counter("diagnostics", "dropped: another in progress")),
        failed_(partners_.statistics.counter("diagnostics", "dropped: cannot be written")),
        ending_(partners_.statistics.counter("diagnostics", "dropped: service ending")) {}
  ~Worker() { stop(); }
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  void request(SnapshotRequest request, Reply reply);
  void setStateSource(StateSource source);
  void removeLeftovers() const { directory_.removeLeftovers(); }
  void stop();

 private:
  enum class Taken : std::uint8_t { kTaken, kBusy, kEnding };
  struct Work {
    SnapshotRequest request;
    Reply reply;
  };

  Taken tryTake(Work& work);
  void run();
  void carryOut(const Work& work);
  Result<Snapshot> capture(const SnapshotRequest& request);
  [[nodiscard]] Dictionary conclude(const SnapshotRequest& request,
                                    const Result<Snapshot>& snapshot, double seconds);

  const SnapshotOptions options_;
  const SnapshotPartners partners_;
  const ObjectLog log_;
  const SnapshotDirectory directory_;
  Counter& received_;
  Counter& delivered_;
  Counter& busy_;
  Counter& failed_;
  Counter& ending_;
  WaitableFlag stop_;
  OncePerSecond errorLines_;  // used by the thread only
  Mutex mutex_;
  Condition wakeUp_;
  StateSource state_ HALVOX_GUARDED_BY(mutex_);
  std::optional<Work> waiting_ HALVOX_GUARDED_BY(mutex_);
  bool isInWork_ HALVOX_GUARDED_BY(mutex_) = false;
  std::thread thread_ HALVOX_GUARDED_BY(mutex_);
};

void SnapshotDiagnosticReporterService::Worker::request(SnapshotRequest request, Reply reply) {
  received_.add();
  Work work{std::move(request), std::move(reply)};
  const Taken taken = tryTake(work);
  if (taken == Taken::kTaken) return;
  (taken == Taken::kBusy ? busy_ : ending_).add();
  // Reply from another thread, because callers rely on this function returning before the reply.
  dispatch().asyncAfterOnBackgroundQueue(
      std::chrono::nanoseconds(0),
      [reply = std::move(work.reply), why = taken == Taken::kBusy ? kBusy : kEnding] {
        reply(errorReply(why));
      });
}

SnapshotDiagnosticReporterService::Worker::Taken SnapshotDiagnosticReporterService::Worker::tryTake(
    Work& work) {
  const MutexLock lock(mutex_);
  if (stop_.isRaised()) return Taken::kEnding;
  if (isInWork_) return Taken::kBusy;
  isInWork_ = true;
  waiting_.emplace(std::move(work));
  // The first request starts the thread, because most services never take a snapshot.
  if (!thread_.joinable()) thread_ = std::thread(&Worker::run, this);
  wakeUp_.notifyOne();
  return Taken::kTaken;
}

void SnapshotDiagnosticReporterService::Worker::setStateSource(StateSource source) {
  const MutexLock lock(mutex_);
  state_ = std::move(source);
}

void SnapshotDiagnosticReporterService::Worker::stop() {
  std::thread ended;
  {
    const MutexLock lock(mutex_);
    // This ends every wait of a capture, because each of them polls this flag.
    stop_.raise();
    wakeUp_.notifyOne();
    ended = std::move(thread_);
  }
  if (ended.joinable()) ended.join();
}

void SnapshotDiagnosticReporterService::Worker::run() {
  setUpThread("snapshots");
  // A capture must not slow down the audio processes that it examines. The programs that it starts
  // inherit the priority.
  ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), kNiceness);
  for (;;) {
    std::optional<Work> work;
    {
      const MutexLock lock(mutex_);
      while (!waiting_.has_value() && !stop_.isRaised()) wakeUp_.wait(mutex_);
      if (!waiting_.has_value()) return;
      work = std::exchange(waiting_, std::nullopt);
    }
    carryOut(*work);
  }
}

void SnapshotDiagnosticReporterService::Worker::carryOut(const Work& work) {
  const auto begun = std::chrono::steady_clock::now();
  const Result<Snapshot> snapshot = capture(work.request);
  const std::chrono::duration<double> took = std::chrono::steady_clock::now() - begun;
  const Dictionary response = conclude(work.request, snapshot, took.count());
  {
    // Reset this before the reply, because its receiver may request the next snapshot at once.
    const MutexLock lock(mutex_);
    isInWork_ = false;
  }
  work.reply(response);
}

Result<Snapshot> SnapshotDiagnosticReporterService::Worker::capture(
    const SnapshotRequest& request) {
  if (auto made = directory_.prepare(); !made) return std::move(made).error();
  SnapshotSources sources{.paths = options_.paths,
                          .log = partners_.keptLines,
                          .state = {},
                          .stateWithin = options_.stateWithin,
                          .dumpWithin = options_.dumpWithin};
  {
    const MutexLock lock(mutex_);
    // Copy the source and call it without the lock, because the call may wait.
    sources.state = state_;
  }
  const CaptureDeadline deadline(stop_, std::chrono::steady_clock::now() + options_.collectWithin);
  SnapshotArchive archive(directory_.temporaryPath(), options_.mostBytes);
  if (auto opened = archive.open(); !opened) return std::move(opened).error();
  SnapshotCollector collector(request, sources, archive, deadline);
  if (auto collected = collector.collect(); !collected) return std::move(collected).error();
  if (auto finished = archive.finish(); !finished) return std::move(finished).error();
  auto published = directory_.publish(request.time, textOf(request.signature, signature_key::kType),
                                      textOf(request.signature, signature_key::kSubType));
  if (!published) return std::move(published).error();
  archive.keep();
  return Snapshot{.path = *std::move(published), .size = archive.size()};
}

Dictionary SnapshotDiagnosticReporterService::Worker::conclude(const SnapshotRequest& request,
                                                               const Result<Snapshot>& snapshot,
                                                               double seconds) {
  if (!snapshot) {
    (stop_.isRaised() ? ending_ : failed_).add();
    if (errorLines_.tryPass()) log_.error("cannot take a snapshot: ", snapshot.error().message);
    return errorReply(snapshot.error().message);
  }
  // Delete old snapshots only after the new one has its name, because a failed capture must not
  // cost an old snapshot.
  directory_.keepNewest(options_.keep, snapshot->path);
  // Record the snapshot only after the file has its name, because a record must not name a file
  // that does not exist.
  if (partners_.recorder != nullptr) {
    partners_.recorder->recordSnapshot(request.time, request.signature, snapshot->path);
  }
  delivered_.add();
  log_.notice("snapshot taken: ", snapshot->path.native(), ", ", snapshot->size, " bytes");
  return {{"path", snapshot->path.native()}, {"size_bytes", snapshot->size}, {"seconds", seconds}};
}

// Makes signatures, and passes requests to the worker, which it keeps alive.
class SnapshotDiagnosticReporterService::Reporter final : public AILDiagnosticReporter {
 public:
  explicit Reporter(std::shared_ptr<Worker> worker) : worker_(std::move(worker)) {}

  Dictionary makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                           std::string_view subtypeContext,
                           std::optional<std::string_view> detectedProcess,
                           const std::optional<Dictionary>& triggerThresholdValues) const override {
    Dictionary signature{{signature_key::kDomain, domain},
                         {signature_key::kType, type},
                         {signature_key::kSubType, subType},
                         {signature_key::kSubtypeContext, subtypeContext}};
    if (detectedProcess.has_value()) {
      signature.set(signature_key::kDetectedProcess, *detectedProcess);
    }
    if (triggerThresholdValues.has_value()) {
      signature.set(signature_key::kTriggerThresholdValues, *triggerThresholdValues);
    }
    return signature;
  }

  void requestSnapshot(const Dictionary& signature, double durationSeconds,
                       const std::optional<Dictionary>& event,
                       const std::optional<Dictionary>& payload, Reply reply) override {
    worker_->request({.time = clock().currentDate(),
                      .signature = signature,
                      .durationSeconds = durationSeconds,
                      .event = event,
                      .payload = payload},
                     std::move(reply));
  }

 private:
  const std::shared_ptr<Worker> worker_;
};

SnapshotDiagnosticReporterService::SnapshotDiagnosticReporterService(SnapshotOptions options,
                                                                     SnapshotPartners partners)
    : worker_(std::make_shared<Worker>(std::move(options), std::move(partners))) {}

SnapshotDiagnosticReporterService::~SnapshotDiagnosticReporterService() { stop(); }

std::shared_ptr<AILDiagnosticReporter> SnapshotDiagnosticReporterService::createReporter() {
  return std::make_shared<Reporter>(worker_);
}

void SnapshotDiagnosticReporterService::setStateSource(StateSource source) {
  worker_->setStateSource(std::move(source));
}

void SnapshotDiagnosticReporterService::removeLeftovers() const { worker_->removeLeftovers(); }

void SnapshotDiagnosticReporterService::stop() { worker_->stop(); }

}  // namespace halvox::platform::linux_
