#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "analysis/Payload.h"

// The names under which the service records messages. Pure functions: any thread may call.
namespace halvox::analysis {

// The service of the event names that all services share.
inline constexpr std::string_view kCommonService = "halvox";

// The parts of "com.tarno.<service>.<category>.<type>". All empty for a name of another form.
struct EventNameParts {
  std::string_view service;
  std::string_view category;
  std::string_view type;
};
[[nodiscard]] EventNameParts splitEventName(std::string_view name);

// The service type in a link message's service name: "longformaudio" for "longformaudio_session".
[[nodiscard]] std::string_view linkServiceType(std::string_view serviceName);

// The names of a link message's category, with its domain, and type. The record has the category
// without its domain; the session's tag in the payload has both.
struct LinkMessageNames {
  std::string category;
  std::string_view type;  // a constant
};
[[nodiscard]] LinkMessageNames linkMessageNames(std::int64_t category, std::int64_t type,
                                                const Payload& payload);

}  // namespace halvox::analysis
