#pragma once

#include <string_view>

#include "platform/value.h"

namespace halvox {

// Keys of a session's configuration that concern traces.
inline constexpr std::string_view HVReportingTraceType = "HVReportingTraceType";
inline constexpr std::string_view HVReportingMeridelPlistFilePath =
    "HVReportingMeridelPlistFilePath";
// Offered to clients; nothing in the service reads them.
inline constexpr std::string_view HVReportingPerfProcesses = "HVReportingPerfProcesses";
inline constexpr std::string_view HVReportingDelayPerfEndSnapShot = "HVReportingPerfEndDelay";
inline constexpr std::string_view HVReportingTestName = "HVReportingTestName";

// Values of HVReportingTraceType. "ktrace" counts only as this very object; a text that comes from
// a client and spells it is decoded to it.
extern const platform::StringConstant HVReportingTraceTypeKtrace;
inline constexpr std::string_view HVReportingTraceTypeArtrace = "artrace";

}  // namespace halvox
