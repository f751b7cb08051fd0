#pragma once

#include <memory>

#include "platform/linux/base/Result.h"
#include "tools/top/TopView.h"

namespace halvox::tools {

// Takes the terminal of standard input and output over, until the view is destroyed. Standard
// output must have nothing buffered. Colours are used unless NO_COLOR is set or the terminal has
// none; the background stays the user's. Without a UTF-8 locale, other characters than ASCII are
// shown as "?". Fails with the reason if the terminal cannot place the cursor, for example because
// it is "dumb".
//
// SIGINT and SIGTERM end the program and give the terminal back. SIGTSTP and SIGCONT work as in a
// shell. One view at a time.
[[nodiscard]] platform::linux_::Result<std::unique_ptr<TopView>> openCursesView();

}  // namespace halvox::tools
