#include "platform/linux/link/local/NoneTlmReportingService.h"

namespace halvox::platform::linux_ {
namespace {

class NoneSession final : public TLMReportingSession {
 public:
  [[nodiscard]] std::string description() const override { return "session without back-ends"; }
};

}  // namespace

TLMReportingService::Token NoneTlmReportingService::TLMHierarchyTokenCreate() {
  return std::make_shared<TLMSecureHierarchyToken>("none");
}

TLMReportingService::Session NoneTlmReportingService::TLMReportingCreateSession(
    const Dictionary& /*sessionInfo*/, const Dictionary& /*userInfo*/) {
  return std::make_shared<NoneSession>();
}

void NoneTlmReportingService::TLMReportingStartConfiguration(const Session& /*session*/,
                                                             BackendsCallback found) {
  found(std::nullopt);
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
  return {.sent = false, .error = Error{"com.tarno.halvox.link", 2, "there is no back-end"}};
}

}  // namespace halvox::platform::linux_
