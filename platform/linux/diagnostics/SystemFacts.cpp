#include "platform/linux/diagnostics/SystemFacts.h"

#include <algorithm>
#include <string_view>

#include <sys/utsname.h>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/Child.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kBytesOfFile = 16U << 10U;
constexpr std::chrono::seconds kVersionWithin{1};

Dictionary kernel() {
  utsname names{};
  ::uname(&names);
  // Omits the host name, because it can identify a person and does not explain a fault.
  return {{"name", names.sysname},
          {"release", names.release},
          {"version", names.version},
          {"machine", names.machine}};
}

std::string trimmed(std::string_view text) {
  const std::size_t begin = text.find_first_not_of(" \t\r\n");
  if (begin == std::string_view::npos) return {};
  return replaceInvalidUtf8(text.substr(begin, text.find_last_not_of(" \t\r\n") - begin + 1));
}

// Parses lines of the form KEY="value". Leaves escapes within quotes as they are, because they
// hardly occur in os-release.
Dictionary assignments(std::string_view text) {
  Dictionary entries;
  for (std::size_t begin = 0; begin < text.size();) {
    const std::size_t end = std::min(text.find('\n', begin), text.size());
    const std::string line = trimmed(text.substr(begin, end - begin));
    begin = end + 1;
    const std::size_t sign = line.find('=');
    if (line.starts_with('#') || sign == std::string::npos || sign == 0) continue;
    std::string value = line.substr(sign + 1);
    if (value.size() >= 2 && value.front() == value.back() &&
        (value.front() == '"' || value.front() == '\'')) {
      value = value.substr(1, value.size() - 2);
    }
    entries.set(line.substr(0, sign), value);
  }
  return entries;
}

}  // namespace

Dictionary systemFacts(const SystemPaths& paths, const CaptureDeadline& deadline) {
  Dictionary facts{{"kernel", kernel()}};
  Dictionary failures;
  // /etc/os-release is a symbolic link on most systems, and readBounded() does not follow links.
  std::error_code ignored;
  const auto osRelease = std::filesystem::canonical(paths.osRelease, ignored);
  if (const Finding found = readBounded(osRelease, kBytesOfFile); found.isCollected()) {
    facts.set("distribution", assignments(found.bytes));
  } else {
    failures.set("distribution", found.failure);
  }
  if (const Finding found = readBounded(paths.alsa / "version", kBytesOfFile);
      found.isCollected()) {
    facts.set("alsa", trimmed(found.bytes));
  } else {
    failures.set("alsa", found.failure);
  }
  const Finding pipeWire =
      runProgram(paths.pipeWireVersion, kBytesOfFile, deadline.within(kVersionWithin));
  if (pipeWire.isCollected()) {
    facts.set("pipewire", trimmed(pipeWire.bytes));
  } else {
    failures.set("pipewire", pipeWire.failure);
  }
  if (!failures.empty()) facts.set("not_readable", failures);
  return facts;
}

}  // namespace halvox::platform::linux_
