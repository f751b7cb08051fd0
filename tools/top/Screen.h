#pragma once

#include <memory>

#include "platform/linux/base/Result.h"
#include "tools/top/TopView.h"

namespace halvox::tools {

// Takes the terminal of standard input and output over, as openCursesView() says. Loads the module
// that can do it. Fails with the reason if the module is missing or the terminal cannot show a
// screen.
[[nodiscard]] platform::linux_::Result<std::unique_ptr<TopView>> openScreen();

}  // namespace halvox::tools
