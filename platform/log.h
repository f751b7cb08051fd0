#pragma once

#include <array>
#include <atomic>
#include <charconv>
#include <concepts>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// The levels of the unified log, least important first.
enum class LogLevel : std::uint8_t { kDebug, kInfo, kDefault, kError };

// One category of the log, made once and kept for the life of the process.
// Any thread may use it. A disabled level costs a load and a branch.
class LogCategory {
 public:
  virtual ~LogCategory() = default;
  LogCategory(const LogCategory&) = delete;
  LogCategory& operator=(const LogCategory&) = delete;

  // True when lines of that level are wanted by anybody.
  [[nodiscard]] bool isEnabled(LogLevel level) const {
    // Orders with nothing: a level changed while running may be seen a little later.
    return level >= threshold_.load(std::memory_order_relaxed);
  }

  // Takes one line, its "%25s:%-5d " prefix included. Does not block on a slow reader of the log.
  virtual void write(LogLevel level, std::string_view line) = 0;

 protected:
  explicit LogCategory(LogLevel threshold) : threshold_(threshold) {}
  std::atomic<LogLevel> threshold_;
};

// The unified log of the platform.
class LogService {
 public:
  virtual ~LogService() = default;

  // The category of that name in that subsystem. Calling again with the same names gives the same
  // category. The service owns it; it lives as long as the process.
  virtual LogCategory& createCategory(std::string_view subsystem, std::string_view category) = 0;
};

namespace detail {

inline void appendLogPart(std::string& line, std::string_view part) { line += part; }
inline void appendLogPart(std::string& line, const char* part) { line += part; }
inline void appendLogPart(std::string& line, const std::string& part) { line += part; }
template <std::integral Number>
void appendLogPart(std::string& line, Number number) {
  std::array<char, 24> buffer;
  line.append(buffer.data(), std::to_chars(buffer.begin(), buffer.end(), number).ptr);
}
inline void appendLogPart(std::string& line, bool flag) { line += flag ? '1' : '0'; }
inline void appendLogPart(std::string& line, const Dictionary& value) { line += describe(value); }
inline void appendLogPart(std::string& line, const Message& value) { line += describe(value); }
// Anything that can say what it is; asked only when the line is written.
template <typename Described>
requires requires(const Described& part) {
  { part.description() } -> std::convertible_to<std::string>;
}
void appendLogPart(std::string& line, const Described& part) { line += part.description(); }

// The name right-aligned in 25 characters, a colon, the line left-aligned in 5, a blank.
std::string logPrefix(std::string_view unit, std::uint32_t line);

}  // namespace detail

// What one source unit logs with: its category and the name that its lines begin with.
// A text and its parts are joined as they stand: kLog.info("found reporting session ", id).
// Parts are texts, integers, values and objects with a description(); none is formatted unless the
// line is wanted.
class UnitLog {
 public:
  using CategoryAccessor = LogCategory& (*)();
  constexpr UnitLog(CategoryAccessor category, std::string_view unit)
      : category_(category), unit_(unit) {}

  // The first part of a line, which also remembers where the line is logged.
  struct Text {
    // The builtin is what std::source_location is made of, which clang 14 lacks.
    // NOLINTNEXTLINE(google-explicit-constructor): so that call sites read as plain text
    Text(const char* first, std::uint32_t where = __builtin_LINE()) : text(first), line(where) {}
    const char* text;
    std::uint32_t line;
  };

  template <typename... Parts>
  void debug(const Text& text, const Parts&... parts) const {
    log(LogLevel::kDebug, text, parts...);
  }
  template <typename... Parts>
  void info(const Text& text, const Parts&... parts) const {
    log(LogLevel::kInfo, text, parts...);
  }
  template <typename... Parts>
  void notice(const Text& text, const Parts&... parts) const {  // the level called "default"
    log(LogLevel::kDefault, text, parts...);
  }
  template <typename... Parts>
  void error(const Text& text, const Parts&... parts) const {
    log(LogLevel::kError, text, parts...);
  }
  [[nodiscard]] bool isDebugEnabled() const { return category_().isEnabled(LogLevel::kDebug); }

  // The same for a unit whose caller chooses the category.
  template <typename... Parts>
  static void logTo(LogCategory& category, std::string_view unit, LogLevel level, const Text& text,
                    const Parts&... parts) {
    if (!category.isEnabled(level)) return;
    std::string line = detail::logPrefix(unit, text.line);
    line += text.text;
    (detail::appendLogPart(line, parts), ...);
    category.write(level, line);
  }

 private:
  template <typename... Parts>
  void log(LogLevel level, const Text& text, const Parts&... parts) const {
    logTo(category_(), unit_, level, text, parts...);
  }

  CategoryAccessor category_;
  std::string_view unit_;
};

}  // namespace halvox::platform
