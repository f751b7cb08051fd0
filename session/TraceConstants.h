#pragma once

#include <string_view>

#include "platform/value.h"

namespace halvox {

// Configuration keys of a session that control its trace.
inline constexpr std::string_view HVReportingTraceType = "HVReportingTraceType";
inline constexpr std::string_view HVReportingMeridelPlistFilePath =
    "HVReportingMeridelPlistFilePath";
// Offered to clients. The service reads none of them, and this is required.
inline constexpr std::string_view HVReportingPerfProcesses = "HVReportingPerfProcesses";
inline constexpr std::string_view HVReportingDelayPerfEndSnapShot = "HVReportingPerfEndDelay";
inline constexpr std::string_view HVReportingTestName = "HVReportingTestName";

// Values of HVReportingTraceType. "ktrace" is recognised by its identity, not by its spelling. A
// client's text works because decoding turns it into this constant.
extern const platform::StringConstant HVReportingTraceTypeKtrace;
inline constexpr std::string_view HVReportingTraceTypeArtrace = "artrace";

}  // namespace halvox
