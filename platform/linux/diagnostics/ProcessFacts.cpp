#include "platform/linux/diagnostics/ProcessFacts.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/diagnostics/BoundedFile.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kMostProcesses = 8;
constexpr std::size_t kMostThreads = 256;
constexpr std::size_t kMostMappedFiles = 200;
constexpr std::size_t kMostOpenFiles = 1U << 20U;
constexpr std::size_t kBytesOfFile = 64U << 10U;
constexpr std::size_t kBytesOfMaps = 4U << 20U;

std::optional<std::int32_t> parseNumber(const std::string& text) {
  std::int32_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

// Returns the names in a directory that are numbers, sorted; at most `most`.
std::vector<std::int32_t> numberedEntries(const fs::path& directory, std::size_t most,
                                          std::error_code& error) {
  std::vector<std::int32_t> numbers;
  fs::directory_iterator at(directory, error);
  for (; !error && at != fs::directory_iterator(); at.increment(error)) {
    if (const auto number = parseNumber(at->path().filename().string())) {
      numbers.push_back(*number);
      if (numbers.size() == most) break;
    }
  }
  std::ranges::sort(numbers);
  return numbers;
}

std::string commandName(const fs::path& process) {
  std::string name = readBounded(process / "comm", 64).bytes;
  if (name.ends_with('\n')) name.pop_back();
  return replaceInvalidUtf8(name);
}

// Collects the facts about one process, and the reasons for those that could not be read.
class Facts {
 public:
  void add(const char* key, Value value) { facts_.set(key, std::move(value)); }
  void addFailure(const char* key, const std::string& why) { failures_.set(key, why); }
  void addFile(const char* key, const fs::path& file) {
    const Finding finding = readBounded(file, kBytesOfFile);
    if (!finding.isCollected()) return addFailure(key, finding.failure);
    add(key, replaceInvalidUtf8(finding.bytes));
  }
  [[nodiscard]] Dictionary take() {
    // A capture says what could not be read, and why. Otherwise a reader could conclude that there
    // was nothing to read.
    if (!failures_.empty()) facts_.set("not_readable", failures_);
    return std::move(facts_);
  }

 private:
  Dictionary facts_;
  Dictionary failures_;
};

void addCommandLine(Facts& facts, const fs::path& process) {
  Finding finding = readBounded(process / "cmdline", kBytesOfFile);
  if (!finding.isCollected()) return facts.addFailure("cmdline", finding.failure);
  std::vector<Value> words;
  for (std::size_t begin = 0; begin < finding.bytes.size();) {
    // The kernel ends each word with a NUL. If a process has overwritten its words, the last NUL
    // may be missing.
    const std::size_t end = std::min(finding.bytes.find('\0', begin), finding.bytes.size());
    words.emplace_back(replaceInvalidUtf8(finding.bytes.substr(begin, end - begin)));
    begin = end + 1;
  }
  facts.add("cmdline", Array(words));
}

void addOpenFiles(Facts& facts, const fs::path& process) {
  std::error_code error;
  const auto numbers = numberedEntries(process / "fd", kMostOpenFiles, error);
  if (error) return facts.addFailure("open_files", error.message());
  facts.add("open_files", static_cast<std::uint64_t>(numbers.size()));
}

void addThreads(Facts& facts, const fs::path& process) {
  std::error_code error;
  const auto threads = numberedEntries(process / "task", kMostOpenFiles, error);
  if (error) return facts.addFailure("threads", error.message());
  std::vector<Value> described;
  for (const std::int32_t thread : threads) {
    if (described.size() == kMostThreads) break;
    const fs::path task = process / "task" / std::to_string(thread);
    described.emplace_back(Dictionary{{"tid", thread}, {"name", commandName(task)}});
  }
  facts.add("thread_count", static_cast<std::uint64_t>(threads.size()));
  facts.add("threads", Array(described));
}

struct Mapped {
  std::uint64_t bytes = 0;
  std::uint64_t mappings = 0;
};

// Adds one line of /proc/<pid>/maps, such as
// "55d0-55d1 r-xp 00000000 08:01 1234   /usr/bin/thing".
void addMapping(std::string_view line, std::map<std::string, Mapped>& all) {
  const std::size_t dash = line.find('-');
  const std::size_t blank = line.find(' ');
  if (dash == std::string_view::npos || blank == std::string_view::npos || dash > blank) return;
  std::uint64_t begin = 0;
  std::uint64_t end = 0;
  std::from_chars(line.data(), line.data() + dash, begin, 16);
  std::from_chars(line.data() + dash + 1, line.data() + blank, end, 16);
  std::size_t at = blank;
  for (int field = 0; field < 4 && at != std::string_view::npos; ++field) {
    at = line.find(' ', line.find_first_not_of(' ', at));
  }
  at = at == std::string_view::npos ? at : line.find_first_not_of(' ', at);
  const std::string name =
      at == std::string_view::npos ? "anonymous" : replaceInvalidUtf8(line.substr(at));
  Mapped& mapped = all[name];
  mapped.bytes += end > begin ? end - begin : 0;
  ++mapped.mappings;
}

void addMaps(Facts& facts, const fs::path& process) {
  const Finding finding = readBounded(process / "maps", kBytesOfMaps);
  if (!finding.isCollected()) return facts.addFailure("maps", finding.failure);
  std::map<std::string, Mapped> all;
  const std::string_view text = finding.bytes;
  for (std::size_t begin = 0; begin < text.size();) {
    const std::size_t end = std::min(text.find('\n', begin), text.size());
    addMapping(text.substr(begin, end - begin), all);
    begin = end + 1;
  }
  std::vector<std::pair<std::string, Mapped>> bySize(all.begin(), all.end());
  // Sort the largest first, because only kMostMappedFiles are kept.
  std::ranges::stable_sort(bySize, std::ranges::greater{},
                           [](const auto& entry) { return entry.second.bytes; });
  Mapped sum;
  std::vector<Value> largest;
  for (const auto& [name, mapped] : bySize) {
    sum.bytes += mapped.bytes;
    sum.mappings += mapped.mappings;
    if (largest.size() == kMostMappedFiles) continue;
    largest.emplace_back(
        Dictionary{{"name", name}, {"bytes", mapped.bytes}, {"mappings", mapped.mappings}});
  }
  facts.add("maps", Dictionary{{"bytes", sum.bytes},
                               {"mappings", sum.mappings},
                               {"names", static_cast<std::uint64_t>(all.size())},
                               {"cut", finding.isCut},
                               {"largest", Array(largest)}});
}

Dictionary factsOf(const fs::path& procRoot, std::int32_t pid) {
  const fs::path process = procRoot / std::to_string(pid);
  Facts facts;
  facts.add("pid", pid);
  addCommandLine(facts, process);
  facts.addFile("status", process / "status");
  facts.addFile("limits", process / "limits");
  facts.addFile("cgroup", process / "cgroup");
  addMaps(facts, process);
  addOpenFiles(facts, process);
  addThreads(facts, process);
  return facts.take();
}

}  // namespace

Dictionary processFacts(const fs::path& procRoot, std::string_view name,
                        const CaptureDeadline& deadline) {
  std::error_code error;
  std::uint64_t found = 0;
  std::vector<Value> processes;
  for (const std::int32_t pid : numberedEntries(procRoot, kMostOpenFiles, error)) {
    if (deadline.hasPassed()) break;
    // Search by name, because a signature identifies a process only by its name. Several processes
    // may have the same name.
    if (commandName(procRoot / std::to_string(pid)) != name) continue;
    ++found;
    if (processes.size() < kMostProcesses) processes.emplace_back(factsOf(procRoot, pid));
  }
  return {{"name", name}, {"found", found}, {"processes", Array(processes)}};
}

}  // namespace halvox::platform::linux_
