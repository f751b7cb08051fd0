#include "tools/top/TopLayout.h"

#include <algorithm>
#include <array>
#include <sstream>
#include <string>
#include <string_view>

#include "tools/TextTable.h"
#include "tools/top/TopText.h"

namespace halvox::tools {
namespace {

constexpr std::size_t kGap = 2;  // columns between two texts
// From this height on, empty lines separate the parts.
constexpr std::size_t kRoomyLines = 18;

struct HelpEntry {
  const char* what;
  const char* text;
};
constexpr std::array kHelp{
    HelpEntry{"q", "quit"},
    HelpEntry{"p, Space", "pause, and go on"},
    HelpEntry{"s", "sort the streams by the next key"},
    HelpEntry{"x a d v t", "sort by xruns, application, device, volume, time of the start"},
    HelpEntry{"r", "reverse the order"},
    HelpEntry{"arrows", "move through the streams; also PgUp, PgDn, Home, End"},
    HelpEntry{"?, h", "this help; any key leaves it"},
    HelpEntry{"XRUNS", "reports of missed cycles in the last minute, and how much they lost"},
    HelpEntry{"BUSY", "the share of the time that the device's node worked"},
    HelpEntry{"QUANTUM", "frames of a cycle, as the driver counts or as the last xrun reported"},
    HelpEntry{"RATE", "frames a second, from the same source"},
    HelpEntry{"VOLUME", "linear; muted is 0"},
    HelpEntry{"STATE", "running: plays or records; paused; open: has not run yet"},
    HelpEntry{"waiting", "what the service's queues and its store have still to do"},
    HelpEntry{"lines below",
              "what the service lost, refused or suppressed since its start, and why"},
};
constexpr std::size_t kHelpIndent = 13;

// Places texts next to each other, as many on a line as fit. Stops after `most` lines; the last one
// then ends with the number of the texts that did not fit.
std::vector<std::string> flow(const std::vector<std::string>& texts, std::size_t columns,
                              std::size_t most) {
  std::vector<std::string> lines;
  std::size_t used = 0;
  for (std::size_t index = 0; index < texts.size(); ++index) {
    const std::size_t width = displayWidth(texts[index]);
    if (!lines.empty() && used + kGap + width <= columns) {
      lines.back() += std::string(kGap, ' ') + texts[index];
      used += kGap + width;
      continue;
    }
    if (lines.size() == most) {
      if (most == 0) break;
      const std::string more = "+" + std::to_string(texts.size() - index);
      const std::size_t room = columns - std::min(columns, more.size() + kGap);
      lines.back() = cutTo(lines.back(), room) + std::string(kGap, ' ') + more;
      break;
    }
    lines.push_back(texts[index]);
    used = width;
  }
  return lines;
}

std::vector<std::string> linesOf(const TextTable& table, std::size_t columns) {
  std::ostringstream out;
  table.print(out, columns);
  std::istringstream text(out.str());
  std::vector<std::string> lines;
  for (std::string line; std::getline(text, line);) lines.push_back(line);
  return lines;
}

// Adds a part if there is room for its heading and a row. Alerts are the rows with xruns.
template <typename Row>
void addRows(std::vector<TopLine>& lines, const std::vector<std::string>& table,
             const std::vector<Row>& rows, std::size_t first, std::size_t room) {
  if (room < 2) return;
  lines.push_back({table.front(), TopStyle::kHeading});
  const std::size_t end = std::min(rows.size(), first + room - 1);
  for (std::size_t row = first; row < end; ++row) {
    lines.push_back({table[row + 1], rows[row].xruns > 0 ? TopStyle::kAlert : TopStyle::kPlain});
  }
}

// Adds what is being lost now, then everything else that did not reach its aim. To suppress a
// message that repeats another is the service's ordinary work and never stands out.
void addLosses(std::vector<TopLine>& lines, const std::vector<TopLoss>& losses, TopSize size) {
  constexpr std::size_t kShare = 8;  // of the lines of the screen
  std::size_t room = std::max<std::size_t>(1, size.lines / kShare);
  std::vector<TopLoss> urgent;
  std::vector<TopLoss> others;
  for (const TopLoss& loss : losses) {
    const bool isUrgent =
        loss.perSecond.value_or(0) > 0 && loss.reason.find("suppressed") == std::string::npos;
    (isUrgent ? urgent : others).push_back(loss);
  }
  const auto add = [&](const std::vector<TopLoss>& some, TopStyle style) {
    const auto texts = flow(lossTexts(some), size.columns, room);
    room -= texts.size();
    for (const auto& text : texts) lines.push_back({text, style});
  };
  add(urgent, TopStyle::kAlert);
  add(others, TopStyle::kPlain);
}

std::string keysLine(const TopChoice& choice, std::size_t columns) {
  std::vector<std::string> texts;
  if (choice.isPaused) texts.emplace_back("PAUSED");
  texts.insert(texts.end(), {"q quit", choice.isPaused ? "p go on" : "p pause", "? help"});
  texts.push_back("s sort: " + std::string(sortName(choice.sort.key)) +
                  (choice.sort.isReversed ? ", reversed" : ""));
  const auto lines = flow(texts, columns, 1);
  return lines.empty() ? std::string() : lines.front();
}

// Breaks a text at blanks. A word that is longer than a line stays whole and is cut by the view.
std::vector<std::string> wrap(std::string_view text, std::size_t columns) {
  std::vector<std::string> lines;
  while (text.size() > columns) {
    const std::size_t end = text.substr(0, columns + 1).rfind(' ');
    if (end == std::string_view::npos || end == 0) break;
    lines.emplace_back(text.substr(0, end));
    text.remove_prefix(end + 1);
  }
  lines.emplace_back(text);
  return lines;
}

std::vector<TopLine> helpLines(TopSize size) {
  std::vector<TopLine> lines{{"halvoxctl top: keys and columns", TopStyle::kTitle}};
  for (const HelpEntry& entry : kHelp) {
    std::string what = entry.what;
    const std::size_t room = size.columns - std::min(size.columns, kHelpIndent);
    for (const std::string& text : wrap(entry.text, std::max<std::size_t>(room, 1))) {
      what.resize(kHelpIndent, ' ');
      lines.push_back({what + text});
      what.clear();
    }
  }
  if (lines.size() > size.lines) lines.resize(size.lines);
  return lines;
}

// How the lines between the service and the keys are shared.
struct Shares {
  std::size_t devices = 0;
  std::size_t streams = 0;
};

Shares share(const TopSnapshot& snapshot, std::size_t room) {
  const std::size_t devices = snapshot.devices.empty() ? 0 : snapshot.devices.size() + 1;
  const std::size_t streams = snapshot.streams.size() + 1;
  Shares shares;
  // Streams get what devices do not need, and at least half.
  shares.devices = std::min(devices, std::max(room / 3, room - std::min(room, streams)));
  shares.streams = room - std::min(room, shares.devices);
  return shares;
}

}  // namespace

std::vector<TopLine> layOut(const TopSnapshot& snapshot, TopChoice& choice, TopSize size) {
  if (size.lines == 0 || size.columns == 0) return {};
  if (choice.showsHelp) return helpLines(size);
  const bool isRoomy = size.lines >= kRoomyLines;
  std::vector<TopLine> lines;
  for (const auto& text :
       flow(serviceTexts(snapshot), size.columns, std::max<std::size_t>(1, size.lines / 4))) {
    lines.push_back({text, TopStyle::kTitle});
  }
  addLosses(lines, snapshot.losses, size);
  const std::size_t separators = isRoomy ? 2 : 0;
  const std::size_t taken = lines.size() + separators + 1;  // and the keys
  const Shares shares = share(snapshot, size.lines - std::min(size.lines, taken));
  if (shares.devices >= 2) {
    if (isRoomy) lines.push_back({""});
    addRows(lines, linesOf(deviceTable(snapshot.devices), size.columns), snapshot.devices, 0,
            shares.devices);
  }
  if (isRoomy) lines.push_back({""});
  const std::size_t page = shares.streams - std::min<std::size_t>(1, shares.streams);
  choice.firstStream = std::min(choice.firstStream,
                                snapshot.streams.size() - std::min(snapshot.streams.size(), page));
  addRows(lines, linesOf(streamTable(snapshot.streams), size.columns), snapshot.streams,
          choice.firstStream, shares.streams);
  lines.resize(size.lines - 1);
  lines.push_back({keysLine(choice, size.columns), TopStyle::kFaint});
  return lines;
}

bool onKey(const TopKey& key, std::size_t pageLines, TopChoice& choice) {
  const auto back = [&](std::size_t lines) {
    choice.firstStream -= std::min(choice.firstStream, lines);
  };
  const auto sortBy = [&](TopSortKey by) { choice.sort = {.key = by}; };
  constexpr std::size_t kLast = 1U << 20U;  // limited by layOut()
  if (key.kind == TopKey::Kind::kClosed) return false;
  if (choice.showsHelp && key.kind != TopKey::Kind::kNone && key.kind != TopKey::Kind::kResized) {
    choice.showsHelp = false;
    return key.kind != TopKey::Kind::kCharacter || key.character != 'q';
  }
  switch (key.kind) {
    case TopKey::Kind::kNone:
    case TopKey::Kind::kResized:
    case TopKey::Kind::kClosed:
      return true;
    case TopKey::Kind::kUp:
      back(1);
      return true;
    case TopKey::Kind::kDown:
      ++choice.firstStream;
      return true;
    case TopKey::Kind::kPageUp:
      back(pageLines);
      return true;
    case TopKey::Kind::kPageDown:
      choice.firstStream += pageLines;
      return true;
    case TopKey::Kind::kHome:
      choice.firstStream = 0;
      return true;
    case TopKey::Kind::kEnd:
      choice.firstStream = kLast;
      return true;
    case TopKey::Kind::kCharacter:
      break;
  }
  switch (key.character) {
    case 'q':
      return false;
    case 'p':
    case ' ':
      choice.isPaused = !choice.isPaused;
      break;
    case '?':
    case 'h':
      choice.showsHelp = true;
      break;
    case 's':
      sortBy(nextSortKey(choice.sort.key));
      break;
    case 'r':
      choice.sort.isReversed = !choice.sort.isReversed;
      break;
    case 'x':
      sortBy(TopSortKey::kXruns);
      break;
    case 'a':
      sortBy(TopSortKey::kApplication);
      break;
    case 'd':
      sortBy(TopSortKey::kDevice);
      break;
    case 'v':
      sortBy(TopSortKey::kVolume);
      break;
    case 't':
      sortBy(TopSortKey::kStarted);
      break;
    default:
      break;
  }
  return true;
}

}  // namespace halvox::tools
