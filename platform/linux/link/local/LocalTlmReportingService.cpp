#include "platform/linux/link/local/LocalTlmReportingService.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kBackendName = "local";
constexpr std::int64_t kStoreClosed = 1;

}  // namespace

LocalTlmReportingService::LocalTlmReportingService(SqliteStore& store, const ClockService& clock,
                                                   CallbackThread& callbacks)
    : ServerlessTlmReportingService(kBackendName, Array{kBackendName}, callbacks),
      store_(store),
      records_(store.linkMessages()),
      clock_(clock) {}

TLMReportingOutcome LocalTlmReportingService::accept(const std::shared_ptr<const LinkParty>& sender,
                                                     const TLMReportingMessage& message) {
  const bool taken = records_.add({.time = clock_.currentDate().secondsSince1970,
                                   .party = sender,
                                   .category = message.category,
                                   .type = message.type,
                                   .payload = message.payload});
  if (taken) return {.sent = true};
  return {.sent = false, .error = Error{kErrorDomain, kStoreClosed, "the store is closed"}};
}

}  // namespace halvox::platform::linux_
