#include "tools/top/Screen.h"

#include <string>
#include <utility>

#include "platform/linux/modules/Module.h"
#include "tools/top/CursesEntryPoint.h"

namespace halvox::tools {

platform::linux_::Result<std::unique_ptr<TopView>> openScreen() {
  using platform::linux_::Failure;
  const auto loaded = platform::linux_::loadEntryPoint<decltype(halvoxctl_screen_1)>(kScreenModule);
  if (!loaded) return Failure<>{"the screen needs " + loaded.error().message};
  std::string problem;
  std::unique_ptr<TopView> view((*loaded)(problem));
  if (view == nullptr) return Failure<>{std::move(problem)};
  return view;
}

}  // namespace halvox::tools
