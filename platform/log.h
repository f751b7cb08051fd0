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

// The levels of the unified log, least important first; isEnabled() compares them in this order.
enum class LogLevel : std::uint8_t { kDebug, kInfo, kDefault, kError };

// Returns "debug", "info", "default" or "error", as log lines and the configuration spell it.
std::string_view levelName(LogLevel level);

// One category of the log.
//
// The log service makes it once and keeps it for the life of the process. Callers keep a reference.
// Any thread may use it. A disabled level costs a load and a branch; debug lines can therefore stay
// on the hot path.
class LogCategory {
 public:
  virtual ~LogCategory() = default;
  LogCategory(const LogCategory&) = delete;
  LogCategory& operator=(const LogCategory&) = delete;

  // True if lines of that level are wanted.
  [[nodiscard]] bool isEnabled(LogLevel level) const {
    // Relaxed, because it is harmless if a thread sees a change of the level a little later.
    return level >= threshold_.load(std::memory_order_relaxed);
  }

  // Writes one line, which already has its "%25s:%-5d " prefix. Does not block on a slow reader of
  // the log.
  virtual void write(LogLevel level, std::string_view line) = 0;

 protected:
  explicit LogCategory(LogLevel threshold) : threshold_(threshold) {}
  std::atomic<LogLevel> threshold_;
};

// The unified log of the platform. Any thread may call. The composition root owns the service.
class LogService {
 public:
  virtual ~LogService() = default;

  // The category of that name in that subsystem. The same names always give the same category.
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
// Appends any object that has a description(). That function runs only if the line is written.
template <typename Described>
requires requires(const Described& part) {
  { part.description() } -> std::convertible_to<std::string>;
}
void appendLogPart(std::string& line, const Described& part) { line += part.description(); }

// The unit's name right-aligned in 25 characters, a colon, the line number left-aligned in 5, and a
// space. Every log line of the system begins with it.
std::string logPrefix(std::string_view unit, std::uint32_t line);

}  // namespace detail

// Writes the log lines of one source unit. It has the unit's category, and the name with which its
// lines begin.
//
//   kLog.info("found reporting session ", id);
//
// The text and its parts are joined as they are. Parts are texts, integers, values, and objects
// with a description(); none is formatted unless the line is wanted. Each unit has one UnitLog as a
// constant and uses it from any thread.
class UnitLog {
 public:
  using CategoryAccessor = LogCategory& (*)();
  constexpr UnitLog(CategoryAccessor category, std::string_view unit)
      : category_(category), unit_(unit) {}

  // The first part of a line. It also carries the number of the source line that logs.
  struct Text {
    // std::source_location does the same, but the standard library of clang 14 does not have it.
    // The constructor is implicit, so that call sites read as plain text.
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

  // Logs a line for a unit whose caller chooses the category and the level.
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
