#include "platform/linux/link/local/LocalTlmReportingService.h"

#include <string>
#include <utility>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kBackendName = "local";
constexpr const char* kErrorDomain = "com.tarno.halvox.link";
constexpr std::int64_t kStoreClosed = 1;
constexpr std::size_t kLongestName = 255;

// A client's configuration can give any value as a name, of any length, and names are stored with
// every message. A name of 8 MiB would fill the store with a few small messages; names are
// therefore cut, between characters.
std::string nameOf(const Dictionary& info, std::string_view key) {
  const Value* const value = info.find(key);
  if (value == nullptr) return {};
  // A value that is not a string is kept as text, so that the record still says what the client
  // sent.
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

// A session: what all its messages have in common. Immutable.
class LocalTlmReportingService::LocalSession final : public TLMReportingSession {
 public:
  explicit LocalSession(std::shared_ptr<const LinkParty> party) : party_(std::move(party)) {}

  [[nodiscard]] std::string description() const override {
    return std::string(kBackendName) + " session " + std::to_string(party_->sessionID);
  }
  [[nodiscard]] const std::shared_ptr<const LinkParty>& party() const { return party_; }

 private:
  const std::shared_ptr<const LinkParty> party_;
};

TLMReportingService::Token LocalTlmReportingService::TLMHierarchyTokenCreate() {
  const std::uint64_t number = lastToken_.fetch_add(1, std::memory_order_relaxed) + 1;
  return std::make_shared<TLMSecureHierarchyToken>(std::string(kBackendName) + "-" +
                                                   std::to_string(number));
}

TLMReportingService::Session LocalTlmReportingService::TLMReportingCreateSession(
    const Dictionary& sessionInfo, const Dictionary& userInfo) {
  return std::make_shared<LocalSession>(partyOf(sessionInfo, userInfo));
}

void LocalTlmReportingService::TLMReportingStartConfiguration(const Session& /*session*/,
                                                              BackendsCallback found) {
  // On another thread: the port promises that `found` is not called inside this call.
  callbacks_.call([found = std::move(found)] { found(Array{kBackendName}); });
}

TLMReportingOutcome LocalTlmReportingService::TLMReportingSendMessage(
    const Session& session, const TLMReportingMessage& message) {
  return record(static_cast<const LocalSession&>(*session).party(), message);
}

void LocalTlmReportingService::TLMReportingFlushMessages(const Session& /*session*/,
                                                         std::function<void()> flushed) {
  // Nothing to wait for: the store's writer has the messages and commits them within half a second.
  flushed();
}

TLMReportingOutcome LocalTlmReportingService::TLMReportingSendOneMessage(
    const Dictionary& sessionInfo, const Dictionary& userInfo, const TLMReportingMessage& message) {
  return record(partyOf(sessionInfo, userInfo), message);
}

TLMReportingOutcome LocalTlmReportingService::record(std::shared_ptr<const LinkParty> party,
                                                     const TLMReportingMessage& message) {
  const bool taken = records_.add({.time = clock_.currentDate().secondsSince1970,
                                   .party = std::move(party),
                                   .category = message.category,
                                   .type = message.type,
                                   .payload = message.payload});
  if (taken) return {.sent = true};
  return {.sent = false, .error = Error{kErrorDomain, kStoreClosed, "the store is closed"}};
}

}  // namespace halvox::platform::linux_
