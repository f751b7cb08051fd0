#include "platform/linux/link/local/NoneTlmReportingService.h"

#include <string>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

class NoneSession final : public TLMReportingSession {
 public:
  [[nodiscard]] std::string description() const override { return "session without back-ends"; }
};

}  // namespace

TLMReportingService::Token NoneTlmReportingService::TLMHierarchyTokenCreate() {
  const std::uint64_t number = lastToken_.fetch_add(1, std::memory_order_relaxed) + 1;
  return std::make_shared<TLMSecureHierarchyToken>("none-" + std::to_string(number));
}

TLMReportingService::Session NoneTlmReportingService::TLMReportingCreateSession(
    const Dictionary& /*sessionInfo*/, const Dictionary& /*userInfo*/) {
  return std::make_shared<NoneSession>();
}

void NoneTlmReportingService::TLMReportingStartConfiguration(const Session& /*session*/,
                                                             BackendsCallback found) {
  // On another thread: the port promises that `found` is not called inside this call.
  callbacks_.call([found = std::move(found)] { found(std::nullopt); });
}

TLMReportingOutcome NoneTlmReportingService::TLMReportingSendMessage(
    const Session& /*session*/, const TLMReportingMessage& /*message*/) {
  return refuse();
}

void NoneTlmReportingService::TLMReportingFlushMessages(const Session& /*session*/,
                                                        std::function<void()> flushed) {
  flushed();
}

TLMReportingOutcome NoneTlmReportingService::TLMReportingSendOneMessage(
    const Dictionary& /*sessionInfo*/, const Dictionary& /*userInfo*/,
    const TLMReportingMessage& /*message*/) {
  return refuse();
}

TLMReportingOutcome NoneTlmReportingService::refuse() {
  received_.add();
  dropped_.add();
  return {
      .sent = false,
      .error = Error{"com.tarno.halvox.link", 2, "the link is disabled: link.backend is \"none\""}};
}

}  // namespace halvox::platform::linux_
