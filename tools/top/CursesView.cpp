#include "tools/top/CursesView.h"

#include <algorithm>
#include <clocale>
#include <cstdio>
#include <cwchar>
#include <string>
#include <string_view>
#include <utility>

// The macros of this header have names such as "timeout" and "move".
#define NCURSES_NOMACROS 1
#define NCURSES_WIDECHAR 1
#include <curses.h>
#include <langinfo.h>
#include <poll.h>
#include <unistd.h>

#include "platform/linux/base/Utf8.h"
#include "tools/TerminalColour.h"
#include "tools/top/TerminalType.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;

constexpr short kAlertPair = 1;

// How long a terminal may take between the bytes of one key, in milliseconds. The library's default
// of a second would delay a bare Escape by that long.
constexpr int kEscapeDelay = 50;

class CursesView final : public TopView {
 public:
  explicit CursesView(SCREEN* screen) : screen_(screen) {
    isUtf8_ = std::string_view(nl_langinfo(CODESET)) == "UTF-8";
    cbreak();
    noecho();
    nonl();
    curs_set(0);
    keypad(stdscr, TRUE);
    set_escdelay(kEscapeDelay);
    if (!isColourWanted() || !has_colors() || start_color() == ERR) return;
    // -1 is the terminal's own colour: readable on dark and on light backgrounds.
    hasColour_ = use_default_colors() != ERR && init_pair(kAlertPair, COLOR_RED, -1) != ERR;
  }
  ~CursesView() override {
    endwin();
    delscreen(screen_);
  }

  [[nodiscard]] TopSize size() const override {
    return {.columns = static_cast<std::size_t>(std::max(0, getmaxx(stdscr))),
            .lines = static_cast<std::size_t>(std::max(0, getmaxy(stdscr)))};
  }

  void draw(const std::vector<TopLine>& lines) override {
    erase();
    const int rows = getmaxy(stdscr);
    for (int row = 0; row < rows && static_cast<std::size_t>(row) < lines.size(); ++row) {
      drawLine(row, lines[static_cast<std::size_t>(row)]);
    }
    refresh();
  }

  [[nodiscard]] TopKey wait(std::chrono::milliseconds time) override {
    timeout(static_cast<int>(time.count()));
    return keyOf(getch());
  }

 private:
  // Writes a line, cut at the right edge. The widths of this library decide and not ours: a line
  // that it took for longer would go on in the next one.
  void drawLine(int row, const TopLine& line) {
    const attr_t attributes = attributesOf(line.style);
    attr_set(attributes, pairOf(line.style), nullptr);
    if (wmove(stdscr, row, 0) == ERR) return;
    const int columns = getmaxx(stdscr);
    int used = 0;
    std::wstring text;
    for (std::string_view rest = line.text; !rest.empty();) {
      const auto step = platform::linux_::nextUtf8(rest);
      rest.remove_prefix(step.length);
      const wchar_t shown = shownFor(step.valid ? step.character : U'?');
      const int width = std::max(0, wcwidth(shown));
      if (used + width > columns) break;
      used += width;
      text += shown;
    }
    // A heading is a bar over the whole width.
    if (line.style == TopStyle::kHeading)
      text.append(static_cast<std::size_t>(columns - used), L' ');
    addnwstr(text.c_str(), static_cast<int>(text.size()));
    attr_set(A_NORMAL, 0, nullptr);
  }

  [[nodiscard]] wchar_t shownFor(char32_t character) const {
    constexpr char32_t kAscii = 0x80;
    const auto wide = static_cast<wchar_t>(character);
    if (character < kAscii) return wide;
    return isUtf8_ && wcwidth(wide) >= 0 ? wide : L'?';
  }

  [[nodiscard]] attr_t attributesOf(TopStyle style) const {
    switch (style) {
      case TopStyle::kPlain:
        return A_NORMAL;
      case TopStyle::kTitle:
        return A_BOLD;
      case TopStyle::kHeading:
        return A_REVERSE;
      case TopStyle::kAlert:
        return hasColour_ ? A_NORMAL : A_BOLD;
      case TopStyle::kFaint:
        return A_DIM;
    }
    return A_NORMAL;
  }
  [[nodiscard]] short pairOf(TopStyle style) const {
    return style == TopStyle::kAlert && hasColour_ ? kAlertPair : short{0};
  }

  [[nodiscard]] static TopKey keyOf(int key) {
    using Kind = TopKey::Kind;
    switch (key) {
      case ERR:
        return {.kind = isInputClosed() ? Kind::kClosed : Kind::kNone};
      case KEY_RESIZE:
        return {.kind = Kind::kResized};
      case KEY_UP:
        return {.kind = Kind::kUp};
      case KEY_DOWN:
        return {.kind = Kind::kDown};
      case KEY_PPAGE:
        return {.kind = Kind::kPageUp};
      case KEY_NPAGE:
        return {.kind = Kind::kPageDown};
      case KEY_HOME:
        return {.kind = Kind::kHome};
      case KEY_END:
        return {.kind = Kind::kEnd};
      default:
        break;
    }
    constexpr int kFirstPrintable = ' ';
    constexpr int kLastPrintable = '~';
    if (key < kFirstPrintable || key > kLastPrintable) {
      return {.kind = Kind::kCharacter};
    }
    return {.kind = Kind::kCharacter, .character = static_cast<char>(key)};
  }

  // The terminal has gone, and waiting for a key would return at once for ever.
  [[nodiscard]] static bool isInputClosed() {
    pollfd input{STDIN_FILENO, POLLIN, 0};
    return ::poll(&input, 1, 0) > 0 && (input.revents & (POLLHUP | POLLERR | POLLNVAL)) != 0;
  }

  SCREEN* screen_;
  bool isUtf8_ = false;
  bool hasColour_ = false;
};

}  // namespace

Result<std::unique_ptr<TopView>> openCursesView() {
  // The library takes the encoding of the terminal from the locale. Nothing else of the locale is
  // wanted: numbers are written with a point everywhere.
  std::setlocale(LC_CTYPE, "");
  // The library itself ends the program if it does not know the terminal.
  if (const auto checked = checkTerminalType(); !checked) return Failure<>{checked.error().message};
  // The size of the terminal counts, and not LINES and COLUMNS, which do not follow a resize.
  use_tioctl(TRUE);
  SCREEN* const screen = newterm(nullptr, stdout, stdin);
  if (screen == nullptr) return Failure<>{"the terminal cannot be set up"};
  return std::unique_ptr<TopView>(std::make_unique<CursesView>(screen));
}

}  // namespace halvox::tools
