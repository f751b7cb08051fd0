#pragma once

#include <string_view>

namespace halvox::tools {

// The page that `halvoxctl report` writes, without its data: HTML up to where the JSON of the
// report stands, and from there on. Both are empty in a build without HALVOX_REPORT. Made at build
// time from tools/report.
constexpr std::string_view kNoReportPage =
    "this halvoxctl was built without the page of reports; configure its build with "
    "-DHALVOX_REPORT=ON";
std::string_view reportPageBeforeData();
std::string_view reportPageAfterData();

}  // namespace halvox::tools
