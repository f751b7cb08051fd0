#include "tools/ReportPage.h"

namespace halvox::tools {

// A build without HALVOX_REPORT.
std::string_view reportPageBeforeData() { return {}; }
std::string_view reportPageAfterData() { return {}; }

}  // namespace halvox::tools
