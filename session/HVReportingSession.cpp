#include "session/HVReportingSession.h"

#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/services.h"
#include "platform/statistics.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

namespace halvox {
namespace {

// Answers to starts that nobody will get: their session went without having been stopped.
platform::Counter& startRepliesDropped() {
  static platform::Counter& counter =
      platform::statistics().counter("start replies", "dropped: session released");
  return counter;
}

}  // namespace

HVReportingSession::HVReportingSession(ReporterID reporterID, ProcessIdentifiers processIdentifiers)
    : reporterID_(reporterID),
      mTraceDispatchSemaphore_(platform::dispatch().createSemaphore(0)),
      processIdentifiers_(std::move(processIdentifiers)) {
  kSessionLog.info("created reporting session for ID: ", number(reporterID_));
  emitTracePoint(ReportingTracePoint::kSessionCreated);
}

HVReportingSession::~HVReportingSession() {
  emitTracePoint(ReportingTracePoint::kSessionDestroyed);
  kSessionLog.info("deallocing this session ", number(reporterID_));
  if (account_ != nullptr) account_->removeBytes(chargedBytes_.load(std::memory_order_relaxed));
  if (transactionCompleteBlock_.take()) startRepliesDropped().add();
}

void HVReportingSession::chargeTo(Account account) { account_ = std::move(account); }

void HVReportingSession::charge(std::size_t before, std::size_t after) {
  if (account_ == nullptr) return;
  account_->addBytes(after - before);  // wraps, and so takes away, when less is held than before
  chargedBytes_.fetch_add(after - before, std::memory_order_relaxed);
}

void HVReportingSession::setProcessIdentifiers(ProcessIdentifiers identifiers) {
  processIdentifiers_.set(std::move(identifiers));
}

AudioServiceType HVReportingSession::serviceType() const {
  return serviceType_.load(std::memory_order_relaxed);
}

void HVReportingSession::setServiceType(AudioServiceType serviceType) {
  serviceType_.store(serviceType, std::memory_order_relaxed);
  kSessionLog.info("setting service type ", serviceName());
}

// Made from the type each time, so that nobody can see a type with the name of another. The type
// that a new session has is called "unknown", which is also what its name begins as.
std::string_view HVReportingSession::serviceName() const {
  return HVReportingUtilityGenerateServiceNameFromServiceType(serviceType());
}

bool HVReportingSession::tlmReportingEnabled() const {
  return tlmReportingEnabled_.load(std::memory_order_relaxed);
}

void HVReportingSession::setTlmReportingEnabled(bool enabled) {
  tlmReportingEnabled_.store(enabled, std::memory_order_relaxed);
}

BoolReply HVReportingSession::transactionCompleteBlock() const {
  return transactionCompleteBlock_.copy();
}

void HVReportingSession::setTransactionCompleteBlock(BoolReply block) {
  transactionCompleteBlock_.set(std::move(block));
}

BoolReply HVReportingSession::takeTransactionCompleteBlock() {
  return transactionCompleteBlock_.take();
}

void HVReportingSession::setConfiguration(const platform::Message& configuration) {
  if (configuration.has_value()) updateConfigurationWithContentsOfConfiguration(*configuration);
}

void HVReportingSession::updateConfigurationWithContentsOfConfiguration(
    const platform::Dictionary& configuration) {
  const auto current = configuration_.lock();
  const std::size_t before = current->memorySize();
  current->merge(configuration);
  charge(before, current->memorySize());
}

platform::ProcessID HVReportingSession::ownerPid() const {
  const auto owners = processIdentifiers_.lock();
  return owners->empty() ? 0 : owners->front();
}

std::string HVReportingSession::description() const {
  std::string text;
  appendDescription(text);
  return text;
}

void HVReportingSession::appendDescription(std::string& text) const {
  text += "reporterID=";
  text += std::to_string(number(reporterID_));
  text += ",serviceName=";
  text += serviceName();
  text += ",ownerPid=";
  text += std::to_string(ownerPid());
  text += ",HostApplicationDisplayID=";
  text += platform::describe(HVReportingUtilityRetrieveAppName(configuration()));
  text += started() ? ",started=1" : ",started=0";
}

void HVReportingSession::start() {
  kSessionLog.debug("starting session owned by ", number(reporterID_));
  if (started()) {
    kSessionLog.info("", number(reporterID_), " is already started");
    return;
  }
  started_.store(true, std::memory_order_release);
  history_.set(MessageHistory());
  emitTracePoint(ReportingTracePoint::kSessionStarted);
  if (tlmReportingEnabled()) submitLinkStart();
  startTracing();
}

void HVReportingSession::stop() {
  kSessionLog.debug("ending session ", number(reporterID_));
  if (!started()) return;
  kSessionLog.debug("ending session ", number(reporterID_));
  emitTracePoint(ReportingTracePoint::kSessionStopped);
  sendVolumeMessages();
  writeSummaryJson();
  sendSummaryEvent();
  if (tlmReportingEnabled()) submitLinkStop();
  stopTracing();
  // Taken out under the lock but destroyed without it: a long history takes its time.
  const std::optional<MessageHistory> history = history_.take();
  charge(history.has_value() ? history->memorySize() : 0, 0);
  started_.store(false, std::memory_order_release);
}

}  // namespace halvox
