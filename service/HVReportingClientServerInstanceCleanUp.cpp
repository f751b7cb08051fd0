#include <algorithm>
#include <exception>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/dispatch.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/ReportingQueue.h"
#include "service/ServiceLog.h"
#include "session/SessionLog.h"

// How sessions enter and leave a client, how a stop waits for its summary file, and how a client
// leaves the service.
namespace halvox {
namespace {

constexpr std::string_view kFileQueueLabel = "com.tarno.halvox.reporting.summaryfile";

// Writes the file part by part, then queues `then` on the reporting queue. Each part is a job, so
// that an orderly end of the service can see the progress.
void writeParts(const std::shared_ptr<platform::DispatchQueue>& queue,
                const std::shared_ptr<SessionStop>& rest, const platform::Job& then) {
  queue->async(platform::JobWeight::kMayBlock, [queue, rest, then] {
    bool isComplete = true;
    std::exception_ptr failure;
    try {
      isComplete = rest->writePart();
    } catch (...) {
      // The queue logs the exception. The client's requests must not wait for ever.
      failure = std::current_exception();
    }
    try {
      if (!isComplete) return writeParts(queue, rest, then);
    } catch (...) {  // no memory for the job
      failure = std::current_exception();
    }
    reportingQueue()->async(platform::JobWeight::kMayBlock, then);
    if (failure) std::rethrow_exception(failure);
  });
}

}  // namespace

// Clients rely on the file after the answer, and the file precedes the summary event. The client
// that stops therefore waits for the file, with everything that it sends meanwhile. Other clients
// do not wait: for them the session is stopped when this returns, as if the whole stop had been
// carried out now. They cannot see how long a stop takes: the file, the event and the replies have
// no order with what other clients do.
bool HVReportingClientServerInstance::stop(const Session& session, platform::Job finished) {
  const std::shared_ptr<SessionStop> rest = session->beginStop();
  if (rest == nullptr) return true;
  try {
    writeFile(rest);
  } catch (const std::exception& error) {  // no memory for the queue or its job
    kServiceLog.error("cannot write the summary file of reporter ", number(session->reporterID()),
                      ": ", error.what());
    rest->finish();
    return true;
  }
  stop_ = OpenStop{.rest = rest, .finished = std::move(finished)};
  return false;
}

// The queue has the quality of requests, because a request waits for it. Each file has a queue of
// its own: the pool has two threads, and the files of several clients take turns.
void HVReportingClientServerInstance::writeFile(const std::shared_ptr<SessionStop>& rest) {
  const auto queue = platform::dispatch().createSerialQueue(
      kFileQueueLabel, platform::QualityOfService::kUserInteractive,
      platform::QueueThreading::kShared);
  writeParts(queue, rest, [client = shared_from_this()] { client->finishStop(); });
}

void HVReportingClientServerInstance::finishStop() {
  std::exception_ptr failure;
  const auto carryOut = [&](const auto& step) {
    try {
      step();
    } catch (...) {
      if (!failure) failure = std::current_exception();
    }
  };
  // Each step is carried out after a failure of the one before, because the client's requests and
  // its clean-up would otherwise wait for ever.
  {
    const OpenStop stop = *std::exchange(stop_, std::nullopt);
    carryOut([&] { stop.rest->finish(); });
    carryOut(stop.finished);
    if (stop.request.has_value()) counters_->requests.carriedOut.add();
  }
  carryOutPostponed();
  if (failure) std::rethrow_exception(failure);
}

void HVReportingClientServerInstance::noteCarriedOut(platform::RequestToken token) {
  // No request is carried out during a stop. If there is one now, this request has begun it.
  if (isStopping()) {
    stop_->request = std::move(token);
  } else {
    counters_->requests.carriedOut.add();
  }
}

void HVReportingClientServerInstance::postpone(platform::Job job) {
  postponed_.push_back(std::move(job));
}

// The connection bounds the number of these jobs, because each holds a request open.
void HVReportingClientServerInstance::carryOutPostponed() {
  std::exception_ptr failure;
  while (!isStopping() && !postponed_.empty()) {
    const platform::Job job = std::move(postponed_.front());
    postponed_.pop_front();
    try {
      job();
    } catch (...) {
      // The queue logs the exception. The other requests are still carried out.
      failure = std::current_exception();
    }
  }
  if (failure) std::rethrow_exception(failure);
}

void HVReportingClientServerInstance::putSession(const Session& session, const Delegate& delegate) {
  session->chargeTo(account_);
  Session& place = sessions_[session->reporterID()];
  // A session that already has this ID is dropped without being stopped, even if it is started.
  // This is required.
  if (place != nullptr) note(place, SessionChange::kRemoved, delegate);
  place = session;
  note(session, SessionChange::kAdded, delegate);
  account_->setSessions(sessions_.size());
}

void HVReportingClientServerInstance::removeSession(SessionMap::iterator place,
                                                    const Delegate& delegate) {
  note(place->second, SessionChange::kRemoved, delegate);
  sessions_.erase(place);
  account_->setSessions(sessions_.size());
}

void HVReportingClientServerInstance::note(const Session& session, SessionChange change,
                                           const Delegate& delegate) const {
  if (delegate != nullptr) delegate->noteSessionChange(*this, session, change);
}

void HVReportingClientServerInstance::handleConnectionError() {
  // The job is not brief, because it stops sessions. It holds the client, because the connection
  // may release the client before the job runs.
  reportingQueue()->async(platform::JobWeight::kMayBlock,
                          [client = shared_from_this()] { client->carryOutConnectionError(); });
}

void HVReportingClientServerInstance::carryOutConnectionError() {
  // What the client asked for before the end of its connection is carried out first.
  if (isStopping()) {
    return postpone([client = shared_from_this()] { client->carryOutConnectionError(); });
  }
  const Delegate delegate = delegate_.lock();
  if (delegate == nullptr) return;
  // An interruption and the end of the connection both lead here. The second call finds the client
  // removed and does nothing.
  const auto& clients = delegate->getAllClients();
  if (std::ranges::none_of(clients, [this](const auto& one) { return one.get() == this; })) return;
  const auto stopped = std::make_shared<std::vector<Session>>();
  for (const auto& [reporterID, session] : sessions_) stopped->push_back(session);
  const bool isComplete = stopSessions(stopped, 0);
  // Sessions are removed after their stop; this order is required. If a file is still being
  // written, they are removed now: other clients must not observe how long it takes.
  while (!sessions_.empty()) removeSession(sessions_.begin(), delegate);
  delegate->removeClient(*this);
  if (isComplete) endCleanUp(*stopped);
}

// As for a destroyed session, the counter of active sessions does not change and held replies are
// dropped. Both are required.
bool HVReportingClientServerInstance::stopSessions(
    const std::shared_ptr<std::vector<Session>>& sessions, std::size_t next) {
  while (next < sessions->size()) {
    const Session& session = (*sessions)[next++];
    if (!session->started()) continue;
    const bool isComplete = stop(session, [this, sessions, next] {
      if (stopSessions(sessions, next)) endCleanUp(*sessions);
    });
    if (!isComplete) return false;
  }
  return true;
}

// Sessions are released, and the line is logged, only after all of them have been stopped. This
// order is required.
void HVReportingClientServerInstance::endCleanUp(std::vector<Session>& sessions) const {
  sessions.clear();
  kServiceLog.notice("removing ", processIdentifier_, " from the server client list");
}

}  // namespace halvox
