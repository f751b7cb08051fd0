#include "tools/top/CursesEntryPoint.h"

#include <utility>

#include "tools/top/CursesView.h"

namespace halvox::tools {

TopView* halvoxctl_screen_1(std::string& problem) {
  auto view = openCursesView();
  if (view) return std::move(*view).release();
  problem = view.error().message;
  return nullptr;
}

}  // namespace halvox::tools
