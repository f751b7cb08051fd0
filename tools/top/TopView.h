#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace halvox::tools {

// How a line stands out. No meaning hangs on a colour alone: what an alert says is in its text.
enum class TopStyle : std::uint8_t {
  kPlain,
  kTitle,
  kHeading,
  kAlert,  // something was lost
  kFaint,
};

struct TopLine {
  std::string text;  // without characters that could control a terminal; UTF-8
  TopStyle style = TopStyle::kPlain;
};

struct TopSize {
  std::size_t columns = 0;
  std::size_t lines = 0;
  friend bool operator==(const TopSize&, const TopSize&) = default;
};

struct TopKey {
  enum class Kind : std::uint8_t {
    kNone,       // the time passed
    kResized,    // the screen has another size now
    kClosed,     // no key can come any more
    kCharacter,  // `character`
    kUp,
    kDown,
    kPageUp,
    kPageDown,
    kHome,
    kEnd,
  };
  Kind kind = Kind::kNone;
  char character = 0;  // ASCII; other characters are no keys of this program
};

// A terminal that shows lines and takes keys. Belongs to one thread.
class TopView {
 public:
  TopView() = default;
  TopView(const TopView&) = delete;
  TopView& operator=(const TopView&) = delete;
  virtual ~TopView() = default;

  [[nodiscard]] virtual TopSize size() const = 0;
  // Replaces what the screen shows. A line that is too long is cut.
  virtual void draw(const std::vector<TopLine>& lines) = 0;
  // Waits for a key, at most that long.
  [[nodiscard]] virtual TopKey wait(std::chrono::milliseconds time) = 0;
};

}  // namespace halvox::tools
