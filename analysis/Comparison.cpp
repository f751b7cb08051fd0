#include "analysis/Comparison.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <map>
#include <tuple>
#include <utility>

#include "analysis/NameCounts.h"
#include "analysis/RateSums.h"

namespace halvox::analysis {
namespace {

constexpr double kSecondsPerHour = 3600;

using Key = std::tuple<Change::Kind, std::string, std::string>;  // kind, what, of

// What is known of one figure in one period.
struct Side {
  std::optional<double> value{};
  // Of rates.
  const RateSums* sums = nullptr;
  double events = 0;  // how many events the rate counts or sums up
  // Of percentiles: the interval in which the true one is.
  std::optional<std::pair<double, double>> interval{};
};

struct Figure {
  std::string unit{};
  bool isProblem = true;  // more of it is worse
  Side before{};
  Side after{};
};

using Figures = std::map<Key, Figure>;

// The value that Student's t with so many degrees of freedom, at least 4, exceeds in 2.5 of 100
// cases: the expansion of Cornish and Fisher around the normal distribution, good to 1 %.
double studentQuantile(double freedom) {
  constexpr double z = 1.959964;
  constexpr double z3 = z * z * z;
  constexpr double z5 = z3 * z * z;
  constexpr double z7 = z5 * z * z;
  return z + (z3 + z) / (4 * freedom) + (5 * z5 + 16 * z3 + 3 * z) / (96 * freedom * freedom) +
         (3 * z7 + 19 * z5 + 17 * z3 - 15 * z) / (384 * freedom * freedom * freedom);
}

// Events that happen one by one vary at least like this, however equal the groups are.
double poissonLogVariance(double count) { return 1 / count; }

// What the figure of a period contributes to the variance of the ratio's logarithm. Nothing if
// there are too few groups. `events` is positive.
std::optional<double> logVariance(const RateSums& sums, double events) {
  if (sums.groups() < RateSums::kFewestGroups) return std::nullopt;
  const double least = poissonLogVariance(events);
  return std::max(least, sums.logVariance().value_or(least));
}

void compareRates(const Figure& figure, Change& change) {
  const RateSums& before = *figure.before.sums;
  const RateSums& after = *figure.after.sums;
  if (before.hours() <= 0 || after.hours() <= 0) return;
  const bool isCount = change.kind != Change::Kind::kMilliseconds;
  double countBefore = before.count();
  double countAfter = after.count();
  if (countBefore <= 0 && countAfter <= 0) return;
  if (countBefore <= 0 || countAfter <= 0) {
    // Half an event more on both sides gives a ratio where one of them had none. There is no half
    // of a time.
    if (!isCount) return;
    constexpr double kHalf = 0.5;
    countBefore += kHalf;
    countAfter += kHalf;
  }
  change.ratio = (countAfter / after.hours()) / (countBefore / before.hours());
  const auto varianceBefore = logVariance(before, isCount ? countBefore : figure.before.events);
  const auto varianceAfter = logVariance(after, isCount ? countAfter : figure.after.events);
  if (!varianceBefore || !varianceAfter) return;
  const auto freedom = static_cast<double>(before.groups() + after.groups() - 2);
  const double width = studentQuantile(freedom) * std::sqrt(*varianceBefore + *varianceAfter);
  change.low = *change.ratio * std::exp(-width);
  change.high = *change.ratio * std::exp(width);
}

void comparePercentiles(const Figure& figure, Change& change) {
  if (!change.before || !change.after || *change.before <= 0) return;
  change.ratio = *change.after / *change.before;
  const auto& before = figure.before.interval;
  const auto& after = figure.after.interval;
  if (!before || !after || before->first <= 0) return;
  change.low = after->first / before->second;
  change.high = after->second / before->first;
}

Verdict verdictOf(const Change& change, bool isProblem) {
  if (!change.low || !change.high) return Verdict::kUnclear;
  if (*change.low > 1) return isProblem ? Verdict::kWorse : Verdict::kHigher;
  if (*change.high < 1) return isProblem ? Verdict::kBetter : Verdict::kLower;
  return Verdict::kUnclear;
}

Change changeOf(const Key& key, const Figure& figure) {
  Change change;
  std::tie(change.kind, change.what, change.of) = key;
  change.unit = figure.unit;
  change.before = figure.before.value;
  change.after = figure.after.value;
  if (change.kind == Change::Kind::kDeviceTime) {
    comparePercentiles(figure, change);
  } else if (figure.before.sums != nullptr && figure.after.sums != nullptr) {
    compareRates(figure, change);
  }
  change.verdict = verdictOf(change, figure.isProblem);
  return change;
}

std::string nameOf(const StreamRate& rate) {
  const std::string name = rate.name.empty() ? "(unknown)" : rate.name;
  switch (rate.of) {
    case StreamRate::Of::kAll:
      return "all streams";
    case StreamRate::Of::kApplication:
      return "application " + name;
    case StreamRate::Of::kDevice:
      return "device " + name;
  }
  return {};
}

// The figures of one period go into one side of each figure.
using SideOf = Side Figure::*;

void addRates(const ReportData& data, SideOf side, Figures& figures) {
  for (const StreamRate& rate : data.rates) {
    const auto add = [&](Change::Kind kind, const char* what, const char* unit,
                         const RateSums& sums) {
      Figure& figure = figures[{kind, what, nameOf(rate)}];
      figure.unit = unit;
      figure.*side = {.value = sums.perHour(), .sums = &sums, .events = rate.xruns.count()};
    };
    add(Change::Kind::kXruns, "xruns", "/h", rate.xruns);
    add(Change::Kind::kMilliseconds, "time lost", "ms/h", rate.milliseconds);
  }
}

// The interval of a percentile, from those of its neighbours which the share of so many independent
// values may be. A report's cycles follow each other and are alike: only the reports count as
// independent.
std::optional<std::pair<double, double>> intervalOf(const ReportDeviceTimes& times, double share) {
  if (times.reports < RateSums::kFewestGroups) return std::nullopt;
  const auto reports = static_cast<double>(times.reports);
  const double width =
      studentQuantile(std::max(4.0, reports - 1)) * std::sqrt(share * (1 - share) / reports);
  return std::pair(times.counts.percentile(std::max(0.0, share - width)),
                   times.counts.percentile(std::min(1.0, share + width)));
}

void addDeviceTimes(const ReportData& data, SideOf side, Figures& figures) {
  constexpr std::array<std::pair<const char*, double>, 2> kShares{{{" p50", 0.5}, {" p95", 0.95}}};
  for (const ReportDeviceTimes& times : data.deviceTimes) {
    for (const auto& [name, share] : kShares) {
      Figure& figure =
          figures[{Change::Kind::kDeviceTime, times.channel + name, "device " + times.device}];
      figure.unit = times.unit;
      figure.isProblem = times.channel == "busytime" || times.channel == "waittime";
      figure.*
          side = {.value = times.counts.percentile(share), .interval = intervalOf(times, share)};
    }
  }
}

constexpr std::size_t kParts = 32;  // of a period

// How often names were recorded in the parts of a period, each a group: what is frequent at one
// moment is so at the next one, but less so in the next part.
struct NameSums {
  std::map<std::string, RateSums> names{};
  RateSums none{};  // of a name that was not recorded
};

double secondsOf(const ReportData& data) { return data.to.value_or(0) - data.from.value_or(0); }

RateSums sumsOf(const NameCounts::Series& series, const NameCounts& counts,
                const ReportData& data) {
  constexpr std::size_t kStepsOfAPart = NameCounts::kSteps / kParts;
  RateSums sums;
  for (std::size_t part = 0; part < kParts; ++part) {
    const std::size_t first = part * kStepsOfAPart;
    const double from = counts.from() + static_cast<double>(first) * counts.step();
    const double to = from + static_cast<double>(kStepsOfAPart) * counts.step();
    const double seconds =
        std::min(to, data.to.value_or(to)) - std::max(from, data.from.value_or(from));
    double count = 0;
    for (std::size_t step = first; step < first + kStepsOfAPart; ++step) {
      count += series.steps.at(step);
    }
    sums.add(std::max(0.0, seconds) / kSecondsPerHour, count);
  }
  return sums;
}

// The sums of the names that begin with `prefix`, without it.
NameSums sumsOfNames(const NameCounts& counts, const ReportData& data, std::string_view prefix) {
  NameSums sums;
  for (const NameCounts::Series* series : counts.series()) {
    if (!series->name.starts_with(prefix)) continue;
    sums.names.emplace(series->name.substr(prefix.size()), sumsOf(*series, counts, data));
  }
  for (std::size_t part = 0; part < kParts; ++part) {
    sums.none.add(secondsOf(data) / kParts / kSecondsPerHour, 0);
  }
  return sums;
}

void addNames(Change::Kind kind, const NameSums& before, const NameSums& after, Figures& figures) {
  const auto sideOf = [](const NameSums& side, const std::string& name) {
    const auto found = side.names.find(name);
    const RateSums& sums = found == side.names.end() ? side.none : found->second;
    return Side{.value = sums.perHour(), .sums = &sums};
  };
  for (const NameSums* names : {&before, &after}) {
    for (const auto& [name, sums] : names->names) {
      figures[{kind, name, ""}] = {.unit = "/h",
                                   .isProblem = kind == Change::Kind::kIssues,
                                   .before = sideOf(before, name),
                                   .after = sideOf(after, name)};
    }
  }
}

// The distance from an equal figure, for the order within a verdict.
double effectOf(const Change& change) {
  return change.ratio && *change.ratio > 0 ? std::log(*change.ratio) : 0;
}

}  // namespace

std::string_view verdictName(Verdict verdict) {
  switch (verdict) {
    case Verdict::kWorse:
      return "worse";
    case Verdict::kHigher:
      return "higher";
    case Verdict::kUnclear:
      return "unclear";
    case Verdict::kLower:
      return "lower";
    case Verdict::kBetter:
      return "better";
  }
  return {};
}

double hoursOf(const ReportData& data) {
  const auto all = std::ranges::find(data.rates, StreamRate::Of::kAll, &StreamRate::of);
  return all == data.rates.end() ? 0 : all->xruns.hours();
}

std::vector<Change> compare(const ReportData& before, const ReportData& after) {
  constexpr std::string_view kCommonNames = "com.tarno.halvox.";
  const NameSums namesBefore = sumsOfNames(before.names, before, kCommonNames);
  const NameSums namesAfter = sumsOfNames(after.names, after, kCommonNames);
  const NameSums issuesBefore = sumsOfNames(before.issueNames, before, "");
  const NameSums issuesAfter = sumsOfNames(after.issueNames, after, "");
  Figures figures;
  addRates(before, &Figure::before, figures);
  addRates(after, &Figure::after, figures);
  addDeviceTimes(before, &Figure::before, figures);
  addDeviceTimes(after, &Figure::after, figures);
  addNames(Change::Kind::kEvents, namesBefore, namesAfter, figures);
  addNames(Change::Kind::kIssues, issuesBefore, issuesAfter, figures);
  std::vector<Change> changes;
  changes.reserve(figures.size());
  for (const auto& [key, figure] : figures) changes.push_back(changeOf(key, figure));
  std::ranges::stable_sort(changes, [](const Change& one, const Change& other) {
    if (one.verdict != other.verdict) return one.verdict < other.verdict;
    return effectOf(one) > effectOf(other);
  });
  return changes;
}

}  // namespace halvox::analysis
