#include "tools/Pager.h"

#include <cstdlib>
#include <sstream>
#include <string_view>
#include <utility>

#include <ext/stdio_filebuf.h>
#include <unistd.h>

namespace halvox::tools {
namespace {

using platform::linux_::ChildProcess;
using platform::linux_::ChildProgram;
using platform::linux_::UniqueFd;

// F: end if everything fits on one screen. R: show colours. S: cut long lines. X: leave the text on
// the screen. M: show the place in the prompt. K: end on Ctrl-C.
constexpr const char* kLessOptions = "LESS=FRSXMK";

std::string_view valueOf(const char* variable) {
  const char* const value = std::getenv(variable);
  return value == nullptr ? std::string_view() : std::string_view(value);
}

// The environment of the pager: ours, and less's settings if the user has none. The output is
// UTF-8, whatever the locale.
std::vector<std::string> pagerEnvironment() {
  std::vector<std::string> changes;
  if (std::getenv("LESS") == nullptr) changes.emplace_back(kLessOptions);
  if (std::getenv("LESSCHARSET") == nullptr) changes.emplace_back("LESSCHARSET=utf-8");
  return platform::linux_::environmentWith(changes);
}

struct sigaction ignore(int signal) {
  struct sigaction ignored {};
  ignored.sa_handler = SIG_IGN;
  struct sigaction old {};
  ::sigaction(signal, &ignored, &old);
  return old;
}

}  // namespace

std::vector<std::string> pagerCommand() {
  const std::string_view terminal = valueOf("TERM");
  if (terminal.empty() || terminal == "dumb") return {};
  std::string_view command = "less";
  for (const char* variable : {"HALVOX_PAGER", "PAGER"}) {
    if (std::getenv(variable) == nullptr) continue;
    command = valueOf(variable);
    break;
  }
  std::istringstream text{std::string(command)};
  std::vector<std::string> words;
  for (std::string word; text >> word;) words.push_back(word);
  if (words.size() == 1 && words.front() == "cat") words.clear();
  return words;
}

std::unique_ptr<Pager> Pager::start(int terminal) {
  if (terminal < 0 || ::isatty(terminal) == 0) return nullptr;
  ChildProgram program{.command = pagerCommand()};
  if (program.command.empty()) return nullptr;
  auto pipe = platform::linux_::makePipe();
  if (!pipe) return nullptr;
  program.environment = pagerEnvironment();
  program.descriptors = {{STDIN_FILENO, pipe->reader.get()}, {STDOUT_FILENO, terminal}};
  auto process = ChildProcess::start(program);
  if (!process) return nullptr;
  return std::unique_ptr<Pager>(new Pager(std::move(*process), std::move(pipe->writer)));
}

Pager::Pager(ChildProcess process, UniqueFd input)
    : process_(std::move(process)),
      oldInterrupt_(ignore(SIGINT)),
      oldPipe_(ignore(SIGPIPE)),
      buffer_(
          std::make_unique<__gnu_cxx::stdio_filebuf<char>>(input.release(), std::ios_base::out)),
      output_(std::make_unique<std::ostream>(buffer_.get())) {}

Pager::~Pager() {
  output_->flush();
  // The pager sees the end of its input.
  buffer_.reset();
  process_.wait();
  ::sigaction(SIGPIPE, &oldPipe_, nullptr);
  ::sigaction(SIGINT, &oldInterrupt_, nullptr);
}

}  // namespace halvox::tools
