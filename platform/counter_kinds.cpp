#include "platform/counter_kinds.h"

#include <algorithm>
#include <array>

namespace halvox::platform {
namespace {

using enum CounterKind;

// How an entry of the table is compared with a name.
enum class Part : std::uint8_t {
  kWhole,   // the name is the text
  kBefore,  // the name is the text, ": " and a reason
  kAfter,   // the name is a label, ": " and the text
};

struct Entry {
  std::string_view text;
  CounterKind kind;
  Part part = Part::kWhole;
};

// Compare whole names, not words: "connections closed" is a loss only with certain reasons, and
// "let go unfinished" is always one.
constexpr std::array kTable{
    // messages, records and other items that pieces take and pass on
    Entry{"received", kProgress},
    Entry{"delivered", kProgress},
    Entry{"recorded", kProgress},
    Entry{"stored", kProgress},
    Entry{"sent", kProgress},
    Entry{"passed on", kProgress, Part::kBefore},
    Entry{"carried out", kProgress},
    Entry{"held back", kProgress},
    Entry{"failed", kLoss},
    Entry{"failed", kLoss, Part::kBefore},
    Entry{"dropped", kLoss, Part::kBefore},
    Entry{"suppressed", kLoss, Part::kBefore},
    Entry{"refused", kLoss, Part::kBefore},
    Entry{"skipped", kLoss, Part::kBefore},
    Entry{"not recorded", kLoss, Part::kBefore},
    // connections
    Entry{"connections accepted", kProgress},
    Entry{"connections ended", kProgress},
    Entry{"accepting paused", kProgress, Part::kBefore},
    Entry{"requests received", kProgress},
    Entry{"requests delivered", kProgress},
    Entry{"requests answered here", kProgress},
    Entry{"messages ignored", kProgress, Part::kBefore},
    Entry{"replies given", kProgress},
    Entry{"replies sent", kProgress},
    Entry{"bytes received", kProgress},
    Entry{"bytes sent", kProgress},
    Entry{"connections refused", kLoss},
    Entry{"connections closed", kLoss, Part::kBefore},
    Entry{"requests refused", kLoss, Part::kBefore},
    Entry{"replies dropped", kLoss, Part::kBefore},
    // the link to NATS
    Entry{"acknowledged", kProgress},
    Entry{"published again", kProgress},
    Entry{"not acknowledged", kLoss},
    // queues, each under its label
    Entry{"jobs added", kProgress, Part::kAfter},
    Entry{"jobs run", kProgress, Part::kAfter},
    Entry{"jobs that failed", kLoss},
    Entry{"jobs discarded at the stop", kLoss},
    // files
    Entry{"files begun", kProgress},
    Entry{"files written", kProgress},
    Entry{"values taken", kProgress},
    Entry{"bytes written", kProgress},
    Entry{"bytes released", kProgress},
    Entry{"files that failed", kLoss},
    Entry{"files let go unfinished", kLoss},
    // traces
    Entry{"traces started", kProgress},
    Entry{"traces saved", kProgress},
    Entry{"events read back", kProgress},
    Entry{"events delivered", kProgress},
    Entry{"traces that failed", kLoss},
    Entry{"traces given up", kLoss},
    Entry{"events dropped", kLoss, Part::kBefore},
    Entry{"events lost by the tracer", kLoss},
    Entry{"packets lost by the tracer", kLoss},
    // settings and drivers
    Entry{"asked", kProgress},
    Entry{"found", kProgress},
    Entry{"absent", kProgress},
    Entry{"noticed", kProgress},
    Entry{"posted", kProgress},
    Entry{"merged with another", kProgress},
    Entry{"handlers called", kProgress},
    Entry{"readings asked for", kProgress},
    Entry{"readings given", kProgress},
    Entry{"absent: refused or not readable", kLoss},
};

constexpr std::string_view kSeparator = ": ";

bool matches(const Entry& entry, std::string_view name) {
  switch (entry.part) {
    case Part::kWhole:
      return name == entry.text;
    case Part::kBefore:
      return name.starts_with(entry.text) && name.substr(entry.text.size()).starts_with(kSeparator);
    case Part::kAfter:
      return name.ends_with(entry.text) &&
             name.substr(0, name.size() - entry.text.size()).ends_with(kSeparator);
  }
  return false;
}

}  // namespace

std::optional<CounterKind> counterKind(std::string_view name) {
  const auto found =
      std::ranges::find_if(kTable, [name](const Entry& entry) { return matches(entry, name); });
  if (found == kTable.end()) return std::nullopt;
  return found->kind;
}

}  // namespace halvox::platform
