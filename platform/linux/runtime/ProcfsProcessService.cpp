#include "platform/linux/runtime/ProcfsProcessService.h"

#include <array>
#include <cerrno>
#include <string_view>

#include <fcntl.h>
#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kLongestName = 15;

// The name in a `comm` file: everything except the newline that the kernel appends. A name may
// contain any character but NUL, newlines and parentheses included.
std::optional<std::string> readCommandName(const std::string& path) {
  const UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) return std::nullopt;
  std::array<char, 128> buffer;  // names of kernel threads are longer than those of processes
  const ssize_t count = ::read(file.get(), buffer.data(), buffer.size());
  if (count <= 0) return std::nullopt;
  std::string_view name(buffer.data(), static_cast<std::size_t>(count));
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
  ::_exit(exitStatus);
}

}  // namespace halvox::platform::linux_
