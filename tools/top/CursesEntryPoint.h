#pragma once

#include <string>

#include "platform/linux/modules/Module.h"
#include "tools/top/TopView.h"

namespace halvox::tools {

// The screen is a module: the terminal library costs the start of every other command 0.3 ms of 4,
// and a machine without it still has the batches.
inline constexpr platform::linux_::Module kScreenModule{"halvoxctl-screen.so",
                                                        "halvoxctl_screen_1"};

// Makes the view as openCursesView() does; the caller owns it. Returns null on failure and sets
// `problem` to the reason.
extern "C" TopView* halvoxctl_screen_1(std::string& problem);

}  // namespace halvox::tools
