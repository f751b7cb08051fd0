#include "platform/linux/base/ProcessStat.h"

#include <charconv>
#include <string>
#include <system_error>

#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kStateField = 3;
constexpr int kStartField = 22;
// 52 fields of at most 20 digits and a name of at most 64 bytes need less.
constexpr std::size_t kMostBytes = 4096;

std::optional<ProcessStat> readStat(const char* path) {
  const FileContent content = readWholeFile({.path = path, .most = kMostBytes});
  return content.isRead() ? parseProcessStat(content.bytes) : std::nullopt;
}

}  // namespace

std::optional<ProcessStat> parseProcessStat(std::string_view text) {
  // The name may contain parentheses. It ends at the last one, because no later field contains any.
  const std::size_t nameEnd = text.rfind(") ");
  if (nameEnd == std::string_view::npos) return std::nullopt;
  std::string_view rest = text.substr(nameEnd + 2);
  if (rest.size() < 2 || rest[1] != ' ') return std::nullopt;
  ProcessStat stat{.state = rest[0]};
  for (int field = kStateField; field < kStartField; ++field) {
    const std::size_t blank = rest.find(' ');
    if (blank == std::string_view::npos) return std::nullopt;
    rest.remove_prefix(blank + 1);
  }
  // Require the blank after the number. Otherwise the number could be the beginning of a longer
  // one.
  const char* const end = rest.data() + rest.size();
  const auto [next, error] = std::from_chars(rest.data(), end, stat.startTicks);
  if (error != std::errc{} || next == end || *next != ' ') return std::nullopt;
  return stat;
}

std::optional<ProcessStat> readProcessStat(pid_t pid) {
  return readStat(("/proc/" + std::to_string(pid) + "/stat").c_str());
}

std::optional<ProcessStat> readOwnProcessStat() { return readStat("/proc/self/stat"); }

}  // namespace halvox::platform::linux_
