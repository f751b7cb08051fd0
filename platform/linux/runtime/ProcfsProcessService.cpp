#include "platform/linux/runtime/ProcfsProcessService.h"

#include <cerrno>
#include <string_view>

#include <unistd.h>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLongestName = 15;

// The name in a `comm` file: everything except the newline that the kernel appends. A name may
// contain any character but NUL, including newlines and parentheses.
std::optional<std::string> readCommandName(const std::string& path) {
  // Read more than kLongestName bytes, because names of kernel threads can be longer than those of
  // processes.
  const FileContent file =
      readWholeFile({.path = path.c_str(), .most = 128, .excess = FileToRead::Excess::kCut});
  if (file.bytes.empty()) return std::nullopt;
  std::string_view name = file.bytes;
  if (name.ends_with('\n')) name.remove_suffix(1);
  return replaceInvalidUtf8(name.substr(0, kLongestName));
}

}  // namespace

std::optional<ProcessRecord> ProcfsProcessService::processRecord(ProcessID pid) const {
  if (pid <= 0) return std::nullopt;
  std::optional<std::string> name = readCommandName("/proc/" + std::to_string(pid) + "/comm");
  if (!name.has_value()) return std::nullopt;
  return ProcessRecord{.pid = pid, .commandName = *std::move(name)};
}

ProcessID ProcfsProcessService::ownProcessIdentifier() const { return ::getpid(); }

std::string ProcfsProcessService::ownProcessName() const {
  const char* name = program_invocation_short_name;
  if (name != nullptr && *name != '\0') return replaceInvalidUtf8(name);
  return readCommandName("/proc/self/comm").value_or("");
}

void ProcfsProcessService::terminate(int exitStatus) {
  if (beforeEnd_) beforeEnd_();
  // exit() would be wrong, because other threads still run, and the destructors of what they use
  // would race with them.
  ::_exit(exitStatus);
}

}  // namespace halvox::platform::linux_
