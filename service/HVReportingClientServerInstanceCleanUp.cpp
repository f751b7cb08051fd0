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
    if (!isComplete) return writeParts(queue, rest, then);
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
//
// The files of one client are written one after the other, each with the rest of its stop, although
// a client that disconnects stops all its sessions at once. A client with many sessions then delays
// the files of others by one part of a file at most.
bool HVReportingClientServerInstance::stop(const Session& session, platform::Job finished) {
  const std::shared_ptr<SessionStop> rest = session->beginStop();
  if (rest == nullptr) return true;
  stops_.push_back({.rest = rest, .finished = std::move(finished)});
  if (stops_.size() == 1) writeNextFile();
  return false;
}

// The queue has the quality of requests, because a request waits for it. Each file has a queue of
// its own: the pool has two threads, and the files of several clients take turns.
void HVReportingClientServerInstance::writeNextFile() {
  const auto queue = platform::dispatch().createSerialQueue(
      kFileQueueLabel, platform::QualityOfService::kUserInteractive,
      platform::QueueThreading::kShared);
  writeParts(queue, stops_.front().rest,
             [client = shared_from_this()] { client->finishFirstStop(); });
}

void HVReportingClientServerInstance::finishFirstStop() {
  std::exception_ptr failure;
  const auto carryOut = [&](const auto& step) {
    try {
      step();
    } catch (...) {
      if (!failure) failure = std::current_exception();
    }
  };
  // Each step is carried out after a failure of the one before, because a client would be kept for
  // ever whose stops and clean-up do not go on.
  {
    const OpenStop stop = std::move(stops_.front());
    stops_.pop_front();
    carryOut([&] { stop.rest->finish(); });
    if (stop.finished) carryOut(stop.finished);
    if (stop.request.has_value()) counters_->requests.carriedOut.add();
  }
  if (isStopping()) {
    writeNextFile();
  } else {
    carryOutPostponed();
  }
  if (failure) std::rethrow_exception(failure);
}

void HVReportingClientServerInstance::noteCarriedOut(platform::RequestToken token) {
  // No request is carried out during a stop. If there is one now, this request has begun it.
  if (isStopping()) {
    stops_.back().request = std::move(token);
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
  // Requests that wait for a stop arrived before the end of the connection.
  if (isStopping() && !postponed_.empty()) {
    return postpone([client = shared_from_this()] { client->carryOutConnectionError(); });
  }
  const Delegate delegate = delegate_.lock();
  if (delegate == nullptr) return;
  // An interruption and the end of the connection both lead here. The second call finds the client
  // removed and does nothing.
  const auto& clients = delegate->getAllClients();
  if (std::ranges::none_of(clients, [this](const auto& one) { return one.get() == this; })) return;
  // As for a destroyed session, the counter of active sessions does not change and held replies are
  // dropped. Both are required.
  std::vector<Session> dropped;
  for (const auto& [reporterID, session] : sessions_) {
    dropped.push_back(session);
    if (session->started()) static_cast<void>(stop(session, {}));
  }
  // Other clients must not observe how long the files take: from here on they find neither the
  // sessions nor the client.
  while (!sessions_.empty()) removeSession(sessions_.begin(), delegate);
  delegate->removeClient(*this);
  // Sessions are released, and the line is logged, only after all sessions have been stopped. This
  // order is required.
  auto end = [this, dropped = std::move(dropped)]() mutable {
    dropped.clear();
    kServiceLog.notice("removing ", processIdentifier_, " from the server client list");
  };
  isStopping() ? postpone(std::move(end)) : end();
}

}  // namespace halvox
