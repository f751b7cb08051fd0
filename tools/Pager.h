#pragma once

#include <csignal>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::tools {

// Returns the words of the command that shows long output: $HALVOX_PAGER, else $PAGER, else less.
// Words are separated by blanks; no shell is involved. Empty if the variable is empty or "cat", or
// if the terminal cannot move its cursor.
[[nodiscard]] std::vector<std::string> pagerCommand();

// A running pager, such as less, which shows to a person what is written into output(). Belongs to
// one thread. While it exists, this program ignores SIGINT, which is meant for the pager then, and
// SIGPIPE, because the person may quit before the end of the output.
//
//   start() --> running --destructor: closes the output and waits for the person to quit
class Pager {
 public:
  // Starts the pager on the terminal behind `terminal`. Returns null if that is not a terminal, if
  // no pager is wanted, or if it cannot be started: print without it then.
  [[nodiscard]] static std::unique_ptr<Pager> start(int terminal);

  Pager(const Pager&) = delete;
  Pager& operator=(const Pager&) = delete;
  ~Pager();

  // Fails after the person has quit the pager.
  [[nodiscard]] std::ostream& output() { return *output_; }

 private:
  Pager(platform::linux_::ChildProcess process, platform::linux_::UniqueFd input);

  platform::linux_::ChildProcess process_;
  struct sigaction oldInterrupt_ {};
  struct sigaction oldPipe_ {};
  std::unique_ptr<std::streambuf> buffer_;
  std::unique_ptr<std::ostream> output_;
};

}  // namespace halvox::tools
