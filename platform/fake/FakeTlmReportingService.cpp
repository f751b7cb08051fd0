#include "platform/fake/FakeTlmReportingService.h"

#include <algorithm>
#include <memory>
#include <thread>
#include <utility>

namespace halvox::platform {
namespace {

class FakeTlmReportingSession final : public TLMReportingSession {
 public:
  explicit FakeTlmReportingSession(std::size_t number) : number_(number) {}
  [[nodiscard]] std::size_t number() const { return number_; }
  [[nodiscard]] std::string description() const override {
    return "session " + std::to_string(number_);
  }

 private:
  const std::size_t number_;
};

std::size_t numberOf(const TLMReportingService::Session& session) {
  return dynamic_cast<const FakeTlmReportingSession&>(*session).number();
}

// The session, category and type of a message, such as "session 1 4/1".
std::string label(const FakeTlmReportingService::SentMessage& message) {
  const std::string owner =
      message.session == 0 ? "single" : "session " + std::to_string(message.session);
  return owner + " " + std::to_string(message.category) + "/" + std::to_string(message.type);
}

}  // namespace

void FakeTlmReportingService::answerDiscoveries(Answering answering,
                                                std::optional<Array> backends) {
  const std::lock_guard lock(mutex_);
  discoveries_ = answering;
  backends_ = std::move(backends);
}

bool FakeTlmReportingService::answerDiscovery(const std::optional<Array>& backends) {
  BackendsCallback found;
  {
    const std::lock_guard lock(mutex_);
    if (waitingDiscoveries_.empty()) return false;
    found = std::move(waitingDiscoveries_.front());
    waitingDiscoveries_.pop_front();
  }
  found(backends);
  return true;
}

void FakeTlmReportingService::answerFlushes(Answering answering) {
  const std::lock_guard lock(mutex_);
  flushes_ = answering;
}

bool FakeTlmReportingService::completeFlush() {
  std::function<void()> flushed;
  {
    const std::lock_guard lock(mutex_);
    if (waitingFlushes_.empty()) return false;
    flushed = std::move(waitingFlushes_.front());
    waitingFlushes_.pop_front();
  }
  flushed();
  return true;
}

void FakeTlmReportingService::setOutcome(TLMReportingOutcome outcome) {
  const std::lock_guard lock(mutex_);
  outcome_ = std::move(outcome);
}

void FakeTlmReportingService::clear() {
  std::deque<BackendsCallback> discoveries;  // destroyed without the lock: callbacks own objects
  std::deque<std::function<void()>> flushes;
  const std::lock_guard lock(mutex_);
  discoveries.swap(waitingDiscoveries_);
  flushes.swap(waitingFlushes_);
}

std::vector<std::string> FakeTlmReportingService::tokens() const {
  const std::lock_guard lock(mutex_);
  return tokens_;
}

std::vector<FakeTlmReportingService::Info> FakeTlmReportingService::sessions() const {
  const std::lock_guard lock(mutex_);
  return infos_;
}

std::size_t FakeTlmReportingService::liveSessions() const {
  const std::lock_guard lock(mutex_);
  return static_cast<std::size_t>(
      std::ranges::count_if(sessions_, [](const auto& session) { return !session.expired(); }));
}

std::size_t FakeTlmReportingService::waitingDiscoveries() const {
  const std::lock_guard lock(mutex_);
  return waitingDiscoveries_.size();
}

std::size_t FakeTlmReportingService::waitingFlushes() const {
  const std::lock_guard lock(mutex_);
  return waitingFlushes_.size();
}

std::vector<FakeTlmReportingService::SentMessage> FakeTlmReportingService::messages() const {
  const std::lock_guard lock(mutex_);
  return messages_;
}

std::vector<FakeTlmReportingService::SentMessage> FakeTlmReportingService::singleMessages() const {
  const std::lock_guard lock(mutex_);
  return singleMessages_;
}

std::vector<FakeTlmReportingService::Info> FakeTlmReportingService::singleMessageInfos() const {
  const std::lock_guard lock(mutex_);
  return singleMessageInfos_;
}

TLMReportingService::Token FakeTlmReportingService::TLMHierarchyTokenCreate() {
  const std::lock_guard lock(mutex_);
  tokens_.push_back("token " + std::to_string(tokens_.size() + 1));
  journal_.record(JournalKind::kLink, "create " + tokens_.back());
  return std::make_shared<TLMSecureHierarchyToken>(tokens_.back());
}

TLMReportingService::Session FakeTlmReportingService::TLMReportingCreateSession(
    const Dictionary& sessionInfo, const Dictionary& userInfo) {
  const std::lock_guard lock(mutex_);
  infos_.push_back({sessionInfo, userInfo});
  auto session = std::make_shared<FakeTlmReportingSession>(infos_.size());
  sessions_.emplace_back(session);
  journal_.record(JournalKind::kLink, "create " + session->description());
  return session;
}

void FakeTlmReportingService::TLMReportingStartConfiguration(const Session& session,
                                                             BackendsCallback found) {
  journal_.record(JournalKind::kLink, "configure " + session->description());
  Answering answering{};
  std::optional<Array> backends;
  {
    const std::lock_guard lock(mutex_);
    answering = discoveries_;
    backends = backends_;
    if (answering == Answering::kWhenTold) {
      waitingDiscoveries_.push_back(std::move(found));
      return;
    }
  }
  answer(answering, std::move(found), backends);
}

void FakeTlmReportingService::answer(Answering answering, BackendsCallback found,
                                     const std::optional<Array>& backends) {
  if (answering == Answering::kBeforeReturning) {
    std::thread([&] { found(backends); }).join();
    return;
  }
  // Only the framework knows this queue; it stands for the framework's thread.
  const auto thread = std::make_shared<FakeDispatchQueue>(
      dispatch_, FakeDispatchQueue::Traits{.label = "real-time framework",
                                           .quality = QualityOfService::kUtility,
                                           .threading = QueueThreading::kShared});
  thread->async(JobWeight::kBrief, [found = std::move(found), backends] { found(backends); });
}

TLMReportingOutcome FakeTlmReportingService::TLMReportingSendMessage(
    const Session& session, const TLMReportingMessage& message) {
  const std::lock_guard lock(mutex_);
  messages_.push_back({numberOf(session), message.category, message.type, message.payload});
  journal_.record(JournalKind::kLink, "send " + label(messages_.back()));
  return outcome_;
}

void FakeTlmReportingService::TLMReportingFlushMessages(const Session& session,
                                                        std::function<void()> flushed) {
  journal_.record(JournalKind::kLink, "flush " + session->description());
  {
    const std::lock_guard lock(mutex_);
    if (flushes_ == Answering::kWhenTold) {
      waitingFlushes_.push_back(std::move(flushed));
      return;
    }
  }
  flushed();
}

TLMReportingOutcome FakeTlmReportingService::TLMReportingSendOneMessage(
    const Dictionary& sessionInfo, const Dictionary& userInfo, const TLMReportingMessage& message) {
  const std::lock_guard lock(mutex_);
  singleMessages_.push_back({0, message.category, message.type, message.payload});
  singleMessageInfos_.push_back({sessionInfo, userInfo});
  journal_.record(JournalKind::kLink, "send " + label(singleMessages_.back()));
  return outcome_;
}

}  // namespace halvox::platform
