#include "service/HVReportingClientServerInstance.h"

#include <utility>

#include "backends/HVReportingUtility.h"
#include "backends/HVReportingUtilityVEKStateManager.h"
#include "platform/services.h"
#include "service/ReportingQueue.h"
#include "service/ServiceLog.h"

namespace halvox {
namespace {

constexpr int kKilledExitStatus = 2;

// The name of the process that sent a message; none if the process has ended. The name is looked up
// for each message, because a process may rename itself at any time. A look-up reads a file, which
// costs about as much as the rest of a message. It is made only for messages whose sender is used.
std::optional<std::string> senderProcessName(AudioEventType type, platform::ProcessID sender) {
  if (!HVReportingUtilityVEKStateManager::concerns(type)) return std::nullopt;
  if (!HVReportingUtilityIsInternalBuild()) return std::nullopt;
  return HVReportingUtilityProcessNameForPID(sender);
}

}  // namespace

HVReportingClientServerInstance::HVReportingClientServerInstance(
    platform::ProcessID pid, std::weak_ptr<HVReportingServiceDelegateProtocol> delegate,
    Counters counters)
    : processIdentifier_(pid), delegate_(std::move(delegate)), counters_(std::move(counters)) {
  kServiceLog.notice("new client with pid ", pid);
}

HVReportingClientServerInstance::~HVReportingClientServerInstance() {
  kServiceLog.notice("dealloc ", processIdentifier_, " from the server client list");
}

std::optional<platform::Date> HVReportingClientServerInstance::clientStartDate() const {
  return clientStartDate_.copy();
}

void HVReportingClientServerInstance::setClientStartDate(platform::Date date) {
  clientStartDate_.set(date);
}

std::optional<std::string> HVReportingClientServerInstance::clientProcessName() const {
  return clientProcessName_.copy();
}

void HVReportingClientServerInstance::setClientProcessName(std::optional<std::string> name) {
  clientProcessName_.set(std::move(name));
}

HVReportingClientServerInstance::Session HVReportingClientServerInstance::findReportingSessionForID(
    ReporterID reporterID, Lookup lookup) const {
  // ID 0 is not excluded: a client may have created a session under it. Requests that exclude it do
  // so themselves.
  if (const auto own = sessions_.find(reporterID); own != sessions_.end()) return own->second;
  if (lookup == Lookup::kOwnSessions) return nullptr;
  const Delegate delegate = delegate_.lock();
  return delegate == nullptr ? nullptr : delegate->findReportingSessionForID(reporterID);
}

// The job holds the client, so that the requests of a connection that has ended are still carried
// out. It also holds the request's token, by which the connection knows how many of its requests
// are open. A request with a dictionary charges it before it is queued: the client's next request
// is then checked against what this one will make the service hold.
template <typename Work>
void HVReportingClientServerInstance::queueRequest(platform::JobWeight weight,
                                                   RequestContext&& context, Work work) {
  counters_->requests.received.add();
  reportingQueue()->async(weight, [client = shared_from_this(), token = std::move(context.token),
                                   work = std::move(work)]() mutable {
    work(*client);
    client->counters_->requests.carriedOut.add();
  });
}

// The I/O thread may run the brief requests itself. Starts, stops and destroys are not brief: they
// can wait for the drivers, a trace or a file, and would hold up every connection meanwhile.
template <typename Member, typename Reply>
void HVReportingClientServerInstance::queueRequest(platform::JobWeight weight,
                                                   RequestContext&& context, Member carryOut,
                                                   ReporterID reporterID, Reply&& reply) {
  queueRequest(weight, std::move(context),
               [carryOut, reporterID, reply = std::forward<Reply>(reply)](auto& client) {
                 (client.*carryOut)(reporterID, reply);
               });
}

void HVReportingClientServerInstance::createReportingSession(ReporterID reporterID, BoolReply reply,
                                                             RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutCreate, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::setServiceType(AudioServiceType serviceType,
                                                     ReporterID reportingSession, BoolReply reply,
                                                     RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [serviceType, reportingSession, reply = std::move(reply)](auto& client) {
                 client.carryOutSetServiceType(serviceType, reportingSession, reply);
               });
}

void HVReportingClientServerInstance::getServiceNameForReporterID(ReporterID reporterID,
                                                                  ServiceTypeReply reply,
                                                                  RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutGetServiceName, reporterID,
               std::move(reply));
}

void HVReportingClientServerInstance::setConfiguration(platform::Dictionary configuration,
                                                       ReporterID reporterID, BoolReply reply,
                                                       RequestContext context) {
  ResourceCharge charge(account_, configuration.memorySize());
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [configuration = std::move(configuration), reporterID, reply = std::move(reply),
                charge = std::move(charge)](auto& client) {
                 client.carryOutSetConfiguration(configuration, reporterID, reply);
               });
}

void HVReportingClientServerInstance::startReportingSessionForID(ReporterID reporterID,
                                                                 BoolReply reply,
                                                                 RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutStart, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::sendMessage(platform::Message message,
                                                  AudioEventCategory category, AudioEventType type,
                                                  ReporterIDs reporterIDs, ErrorReply reply,
                                                  RequestContext context) {
  ResourceCharge charge(account_, message ? message->memorySize() : 0);
  // Looked up here, on the connection's thread: when the job runs, the sender may have ended.
  auto senderName = senderProcessName(type, context.sender);
  queueRequest(
      platform::JobWeight::kBrief, std::move(context),
      [request = MessageRequest{std::move(message), category, type, std::move(reporterIDs),
                                std::move(senderName), std::move(reply), std::move(charge)}](
          auto& client) mutable { client.carryOutSend(request); });
}

void HVReportingClientServerInstance::stopReportingSessionForID(ReporterID reporterID,
                                                                BoolReply reply,
                                                                RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutStop, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::destroyReportingSession(ReporterID reporterID,
                                                              BoolReply reply,
                                                              RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutDestroy, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::reporterIDValid(ReporterID reporterID, DictionaryReply reply,
                                                      RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutReporterIDValid, reporterID,
               std::move(reply));
}

void HVReportingClientServerInstance::getAllReporters(ReportersReply reply,
                                                      RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [reply = std::move(reply)](auto& client) { client.carryOutGetAllReporters(reply); });
}

// Runs on the connection's thread, before everything that is queued. No session is stopped and
// nothing is flushed; this is required.
void HVReportingClientServerInstance::killService(BoolReply /*reply*/) {
  kServiceLog.notice("DESTROYING SERVICE");
  platform::process().terminate(kKilledExitStatus);
}

}  // namespace halvox
