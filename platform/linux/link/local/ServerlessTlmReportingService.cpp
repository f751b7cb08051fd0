#include "platform/linux/link/local/ServerlessTlmReportingService.h"

#include <utility>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLongestName = 255;

// Returns the name under `key`, cut between characters if it is long. A client's configuration can
// have any value of any length as a name, and the name is stored with every message. With a name of
// 8 MiB, a few small messages would fill the store.
std::string nameOf(const Dictionary& info, std::string_view key) {
  const Value* const value = info.find(key);
  if (value == nullptr) return {};
  // Convert a value that is not a string to text. The record then still shows what the client sent.
  const std::string name = value->isString() ? std::string(value->string()) : describe(*value);
  return std::string(utf8Prefix(name, kLongestName));
}

std::shared_ptr<const LinkParty> partyOf(const Dictionary& sessionInfo,
                                         const Dictionary& userInfo) {
  const Value* const id = sessionInfo.find(kTLMReportingSessionInfoSessionID);
  return std::make_shared<const LinkParty>(
      LinkParty{.sessionID = id == nullptr ? 0 : id->toInt64(),
                .clientName = nameOf(userInfo, kTLMReportingUserInfoClientName),
                .serviceName = nameOf(userInfo, kTLMReportingUserInfoServiceName)});
}

}  // namespace

// The data that all messages of one session have in common. Immutable.
class ServerlessTlmReportingService::PartySession final : public TLMReportingSession {
 public:
  PartySession(std::string framework, std::shared_ptr<const LinkParty> party)
      : framework_(std::move(framework)), party_(std::move(party)) {}

  [[nodiscard]] std::string description() const override {
    return framework_ + " session " + std::to_string(party_->sessionID);
  }
  [[nodiscard]] const std::shared_ptr<const LinkParty>& party() const { return party_; }

 private:
  const std::string framework_;
  const std::shared_ptr<const LinkParty> party_;
};

TLMReportingService::Token ServerlessTlmReportingService::TLMHierarchyTokenCreate() {
  const std::uint64_t number = lastToken_.fetch_add(1, std::memory_order_relaxed) + 1;
  return std::make_shared<TLMSecureHierarchyToken>(name_ + "-" + std::to_string(number));
}

TLMReportingService::Session ServerlessTlmReportingService::TLMReportingCreateSession(
    const Dictionary& sessionInfo, const Dictionary& userInfo) {
  return std::make_shared<PartySession>(name_, partyOf(sessionInfo, userInfo));
}

void ServerlessTlmReportingService::TLMReportingStartConfiguration(const Session& /*session*/,
                                                                   BackendsCallback found) {
  // Answer on another thread, because the port promises that `found` is not called inside this
  // call.
  callbacks_.call([found = std::move(found), backends = backends_] { found(backends); });
}

TLMReportingOutcome ServerlessTlmReportingService::TLMReportingSendMessage(
    const Session& session, const TLMReportingMessage& message) {
  return accept(static_cast<const PartySession&>(*session).party(), message);
}

void ServerlessTlmReportingService::TLMReportingFlushMessages(const Session& /*session*/,
                                                              std::function<void()> flushed) {
  flushed();
}

TLMReportingOutcome ServerlessTlmReportingService::TLMReportingSendOneMessage(
    const Dictionary& sessionInfo, const Dictionary& userInfo, const TLMReportingMessage& message) {
  return accept(partyOf(sessionInfo, userInfo), message);
}

}  // namespace halvox::platform::linux_
