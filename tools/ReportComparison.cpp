#include "tools/ReportComparison.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <utility>
#include <variant>
#include <vector>

#include "analysis/Comparison.h"

#include "platform/linux/runtime/Version.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/value.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ReportFiles.h"
#include "tools/ReportJson.h"
#include "tools/ReportPage.h"
#include "tools/StoreRun.h"
#include "tools/TextTable.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::Change;
using analysis::ReportData;
using analysis::Verdict;
using platform::Dictionary;
using platform::linux_::Failure;
using platform::linux_::Result;

constexpr std::string_view kStandardOutput = "-";
constexpr std::string_view kNothing = "-";
// The table of a terminal. The page and JSON have all.
constexpr std::size_t kMostUnclear = 20;

// One side after it was read.
struct Side {
  std::string store{};  // the path of the database
  ReportData data;
};

// Three significant digits, without an exponent for the sizes that occur.
std::string figure(double number) {
  std::array<char, 40> text{};
  const double size = std::abs(number);
  const int digits = size >= 100 || size == 0 ? 0 : size >= 10 ? 1 : size >= 1 ? 2 : 3;
  std::snprintf(text.data(), text.size(), size < 1e15 ? "%.*f" : "%.*g", digits, number);
  return text.data();
}

std::string valueText(std::optional<double> value, const std::string& unit) {
  if (!value) return std::string(kNothing);
  return figure(*value) + (unit.starts_with('/') ? "" : " ") + harmlessText(unit);
}

std::string ratioText(const Change& change) {
  if (!change.ratio) return std::string(kNothing);
  return "x" + figure(*change.ratio);
}

std::string intervalText(const Change& change) {
  if (!change.low || !change.high) return std::string(kNothing);
  return "x" + figure(*change.low) + " to x" + figure(*change.high);
}

// "Before: 2026-11-20 09:00:00.000 to …: 12 streams ran 5.1 h, 4 xruns (/var/lib/halvox/halvox.db)"
void printSide(const char* name, const Side& side, std::ostream& out) {
  out << name;
  if (side.data.from && side.data.to) {
    out << localTime(*side.data.from) << " to " << localTime(*side.data.to) << ": "
        << side.data.totals.streams << " streams ran " << figure(hoursOf(side.data)) << " h, "
        << side.data.totals.xruns << " xruns";
  } else {
    out << "no records";
  }
  out << " (" << harmlessText(side.store) << ")\n";
}

void printTable(const Side& before, const Side& after, const std::vector<Change>& changes,
                const ToolStreams& streams) {
  std::ostream& out = streams.output;
  printSide("Before  ", before, out);
  printSide("After   ", after, out);
  TextTable table({{.heading = "VERDICT"},
                   {.heading = "WHAT", .least = 16},
                   {.heading = "OF", .least = 12, .rank = 1},
                   {.heading = "BEFORE", .align = TextTable::Align::kRight},
                   {.heading = "AFTER", .align = TextTable::Align::kRight},
                   {.heading = "RATIO", .align = TextTable::Align::kRight},
                   {.heading = "95 % INTERVAL", .rank = 2}});
  std::size_t unclear = 0;
  for (const Change& change : changes) {
    if (change.verdict == Verdict::kUnclear && ++unclear > kMostUnclear) continue;
    table.add({std::string(verdictName(change.verdict)), harmlessText(change.what),
               change.of.empty() ? std::string(kNothing) : harmlessText(change.of),
               valueText(change.before, change.unit), valueText(change.after, change.unit),
               ratioText(change), intervalText(change)});
  }
  if (changes.empty()) return;
  out << '\n';
  table.print(out, terminalWidth(streams.outputDescriptor));
  if (unclear > kMostUnclear) {
    out << "\n" << unclear - kMostUnclear << " more unclear ones: --json or -o FILE.html\n";
  }
}

void put(Dictionary& object, const char* key, std::optional<double> value) {
  if (value) object.set(key, *value);
}

Dictionary sideJson(const Side& side) {
  Dictionary object{{"store", side.store},
                    {"streams", side.data.totals.streams},
                    {"xruns", side.data.totals.xruns},
                    {"xrun_milliseconds", side.data.totals.xrunMilliseconds}};
  put(object, "from", side.data.from);
  put(object, "to", side.data.to);
  return object;
}

void printJson(const Side& before, const Side& after, const std::vector<Change>& changes,
               std::ostream& out) {
  out << toJson(Dictionary{{"before", sideJson(before)}, {"after", sideJson(after)}}) << '\n';
  for (const Change& change : changes) {
    Dictionary object{{"verdict", std::string(verdictName(change.verdict))},
                      {"what", change.what},
                      {"of", change.of},
                      {"unit", change.unit}};
    put(object, "before", change.before);
    put(object, "after", change.after);
    put(object, "ratio", change.ratio);
    put(object, "low", change.low);
    put(object, "high", change.high);
    out << harmlessJson(toJson(object)) << '\n';
  }
}

std::variant<Side, ExitStatus> readSide(const CompareReports& request, const ComparedPeriod& period,
                                        const Complaint& complain) {
  const auto directory = period.database.empty()
                             ? storeDirectory(request.database, complain)
                             : storeDirectory(period.database, complain, "--compare");
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  const bool hasTimes = period.since || period.until;
  auto data = readReportData({.directory = path,
                              .since = hasTimes ? period.since : request.since,
                              .until = hasTimes ? period.until : request.until});
  if (!data) return complain(ExitStatus::kNoService, data.error().message, "no-store");
  return Side{.store = (path / platform::linux_::kStoreFileName).native(),
              .data = *std::move(data)};
}

std::string pageOf(const Side& before, const Side& after, const std::vector<Change>& changes) {
  std::string page(reportPageBeforeData());
  appendComparisonJson({.program = "halvoxctl " + std::string(platform::linux_::halvoxVersion()),
                        .made = timeNow(),
                        .before = {.store = before.store, .data = before.data},
                        .after = {.store = after.store, .data = after.data}},
                       changes, page);
  page += reportPageAfterData();
  return page;
}

ExitStatus writePage(const std::string& to, const std::string& page, const Complaint& complain,
                     const CommonOptions& options, std::ostream& out) {
  if (to == kStandardOutput) {
    out << page;
    return ExitStatus::kDone;
  }
  if (const auto written = writeReportFile(to, page); !written) {
    return complain(ExitStatus::kCannotWrite, written.error().message);
  }
  if (options.form() == OutputForm::kText) out << "\nThe page is in " << harmlessText(to) << '\n';
  return ExitStatus::kDone;
}

}  // namespace

Result<ComparedPeriod> parseComparedPeriod(std::string_view text, double now) {
  if (text.find('/') != std::string_view::npos || text.ends_with(".db")) {
    return ComparedPeriod{.database = std::string(text)};
  }
  constexpr std::string_view kRange = "..";
  const auto range = text.find(kRange);
  ComparedPeriod period;
  if (range == std::string_view::npos) {
    const auto day = parseDay(text, now);
    if (!day) {
      return Failure<>{"\"" + std::string(text) +
                       "\" is not a period; expected a day (today, yesterday, 2026-11-21), "
                       "SINCE..UNTIL, or the path of a store, such as ./halvox.db"};
    }
    period.since = day->first;
    period.until = day->second;
    return period;
  }
  const auto parse = [&](std::string_view part, std::optional<double>& time) -> Result<void> {
    if (part.empty()) return {};
    auto parsed = parseTime(part, now);
    if (!parsed) return parsed.error();
    time = *parsed;
    return {};
  };
  if (const auto since = parse(text.substr(0, range), period.since); !since) return since.error();
  const auto until = parse(text.substr(range + kRange.size()), period.until);
  if (!until) return until.error();
  if (period.since && period.until && *period.until <= *period.since) {
    return Failure<>{"\"" + std::string(text) +
                     "\" ends before it begins; expected SINCE..UNTIL, the earlier time first"};
  }
  if (!period.since && !period.until) {
    return Failure<>{"\"..\" is every time; give at least one of SINCE and UNTIL"};
  }
  return period;
}

ExitStatus compareReports(const CompareReports& request, const CommonOptions& options,
                          const ToolStreams& streams) {
  const Complaint complain("report", options.form(), streams.output, streams.errors);
  if (!request.to.empty() && reportPageBeforeData().empty()) {
    return complain(ExitStatus::kRefused, kNoReportPage);
  }
  auto before = readSide(request, request.before, complain);
  if (const auto* status = std::get_if<ExitStatus>(&before)) return *status;
  auto after = readSide(request, request.after, complain);
  if (const auto* status = std::get_if<ExitStatus>(&after)) return *status;
  const auto& one = std::get<Side>(before);
  const auto& other = std::get<Side>(after);
  const auto changes = analysis::compare(one.data, other.data);
  const bool isPageOutput = request.to == kStandardOutput;
  if (options.form() == OutputForm::kJson && !isPageOutput) {
    printJson(one, other, changes, streams.output);
  } else if (!isPageOutput) {
    printTable(one, other, changes, streams);
  }
  if (request.to.empty()) return ExitStatus::kDone;
  return writePage(request.to, pageOf(one, other, changes), complain, options, streams.output);
}

}  // namespace halvox::tools
