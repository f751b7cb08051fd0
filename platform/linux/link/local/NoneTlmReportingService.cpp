#include "platform/linux/link/local/NoneTlmReportingService.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::int64_t kDisabled = 2;

}  // namespace

TLMReportingOutcome NoneTlmReportingService::accept(
    const std::shared_ptr<const LinkParty>& /*sender*/, const TLMReportingMessage& /*message*/) {
  received_.add();
  dropped_.add();
  return {
      .sent = false,
      .error = Error{kErrorDomain, kDisabled, "the link is disabled: link.backend is \"none\""}};
}

}  // namespace halvox::platform::linux_
