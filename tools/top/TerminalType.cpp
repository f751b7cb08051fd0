#include "tools/top/TerminalType.h"

// This header has macros such as "lines" and "columns". Nothing else can therefore be in this
// source.
#include <curses.h>
#include <term.h>
#include <unistd.h>

namespace halvox::tools {

platform::linux_::Result<void> checkTerminalType() {
  using platform::linux_::Failure;
  int outcome = 0;
  if (setupterm(nullptr, STDOUT_FILENO, &outcome) != OK) {
    return Failure<>{outcome == 0
                         ? "the terminal type in TERM is not known, or is not one of a screen"
                         : "this machine has no descriptions of terminals (terminfo)"};
  }
  const char* const moves = tigetstr("cup");
  const bool canMove = moves != nullptr && moves != reinterpret_cast<const char*>(-1);
  static_cast<void>(del_curterm(cur_term));
  if (!canMove) return Failure<>{"a terminal of the type in TERM cannot place the cursor"};
  return {};
}

}  // namespace halvox::tools
