#include "analysis/ReportBuilder.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "analysis/DriverReport.h"
#include "analysis/IssueMetric.h"
#include "analysis/MessageNames.h"
#include "analysis/XrunFigures.h"

#include "platform/linux/base/Utf8.h"

namespace halvox::analysis {
namespace {

constexpr std::string_view kDriverReports = "IOReporting";

// What every message has besides its content.
bool isStamp(std::string_view key) {
  return key == "hvreporting_timestamp" || key == "systemuptime_sec" || key == "processuptime_ms" ||
         key == "HostApplicationDisplayID";
}

double positive(std::optional<double> number) { return std::max(number.value_or(0), 0.0); }

std::int64_t positive(std::optional<std::int64_t> number) {
  return std::max<std::int64_t>(number.value_or(0), 0);
}

// Moves the rows of a table in the order of `isBefore`.
template <typename Rows, typename Map, typename IsBefore>
void moveRows(Map& map, Rows& rows, IsBefore isBefore) {
  for (auto& [key, row] : map) rows.push_back(std::move(row));
  map.clear();
  std::ranges::stable_sort(rows, isBefore);
}

// Returns the row of that key, or null if the table is full.
template <typename Map, typename Key>
auto* rowOf(Map& map, const Key& key, std::size_t most) {
  auto found = map.find(key);
  if (found == map.end() && map.size() < most) found = map.try_emplace(key).first;
  return found == map.end() ? nullptr : &found->second;
}

template <typename Row>
void countIn(Row& row, double time) {
  row.first = row.count == 0 ? time : std::min(row.first, time);
  row.last = row.count == 0 ? time : std::max(row.last, time);
  ++row.count;
}

}  // namespace

ReportBuilder::ReportBuilder(const ReportBounds& bounds)
    : bounds_(bounds),
      xruns_(bounds_),
      streams_(bounds_),
      rates_(bounds_.rows, bounds_.text),
      builder_(
          [this](const StreamStory& story) {
            ++data_.totals.streams;
            streams_.onStory(story);
            rates_.onStory(story);
          },
          [this](const StreamStory& story, const StreamMoment& moment) {
            onMoment(story, moment);
          }) {}

void ReportBuilder::add(const Record& record) {
  data_.from = std::min(data_.from.value_or(record.time), record.time);
  data_.to = std::max(data_.to.value_or(record.time), record.time);
  switch (record.kind) {
    case RecordKind::kEvent:
      addEvent(record);
      break;
    case RecordKind::kLinkMessage:
      ++data_.totals.linkMessages;
      break;
    case RecordKind::kIssueMetric:
      addMetric(record);
      break;
    case RecordKind::kPowerEvent:
      addPower(record);
      break;
    case RecordKind::kSnapshot:
      ++data_.totals.snapshots;
      addMark({record.time, ReportMark::Kind::kCapture, name(record.path)});
      break;
    case RecordKind::kLoss:
      addLoss(record);
      break;
  }
  builder_.add(record);
}

void ReportBuilder::addEvent(const Record& record) {
  ++data_.totals.events;
  data_.names.add(record.name.substr(0, bounds_.text), record.time);
  // The same message under its service's own name follows.
  if (record.service == kCommonService && !record.type.empty()) addMessage(record);
}

void ReportBuilder::addMessage(const Record& record) {
  ++data_.totals.messages;
  auto message = std::make_shared<ReportMessage>();
  message->id = record.id;
  message->time = record.time;
  message->name = name(std::string(record.category) + "." + std::string(record.type));
  message->application = name(record.application);
  message->payload = platform::linux_::utf8Prefix(record.payload->json(), bounds_.payload);
  xruns_.addMessage(std::move(message));
  if (isXrun(record.type, *record.payload)) addXrun(record);
  if (record.category == kDriverReports) addDriverReport(record);
  if (record.category == "Setup" && record.type == "Setup") addSettings(record);
}

void ReportBuilder::addXrun(const Record& record) {
  const Payload& payload = *record.payload;
  const auto text = [&](std::string_view key) { return payload.text(key).value_or(""); };
  ReportXrun xrun;
  xrun.messageID = record.id;
  xrun.time = record.time;
  xrun.application = name(record.application.empty() ? text("rtaid_client") : record.application);
  xrun.device = name(text("device_node_name"));
  const XrunFigures figures = xrunFigures(payload);
  xrun.milliseconds = figures.milliseconds;
  xrun.missedCycles = figures.missedCycles;
  xrun.quantum = positive(payload.integer("quantum"));
  xrun.rate = positive(payload.integer("rate"));
  xrun.role = name(text("xrun_role"));
  xrun.late = name(text("late_node"));
  if (!text("late_process").empty()) xrun.late += " (" + name(text("late_process")) + ")";
  ++data_.totals.xruns;
  data_.totals.missedCycles += xrun.missedCycles;
  data_.totals.xrunMilliseconds += xrun.milliseconds;
  xruns_.addXrun(std::move(xrun));
}

void ReportBuilder::addDriverReport(const Record& record) {
  const auto add = [&](std::string_view key, const DriverReportKey& parts) {
    const auto row = std::pair(name(parts.device), name(parts.channel));
    if (record.type == "Simple") {
      auto* const counter = rowOf(deviceCounters_, row, bounds_.rows);
      if (counter == nullptr) return void(++rowsNotKept_);
      counter->device = row.first;
      counter->channel = row.second;
      counter->sum += positive(record.payload->number(key));
      ++counter->reports;
    } else {
      auto* const times = rowOf(deviceTimes_, row, bounds_.rows);
      if (times == nullptr) return void(++rowsNotKept_);
      times->device = row.first;
      times->channel = row.second;
      const auto unit = parseDriverHistogram(record.payload->text(key).value_or(""),
                                             [&](double lower, double upper, std::uint64_t hits) {
                                               times->counts.add(lower, upper, hits);
                                             });
      ++times->reports;
      if (unit) times->unit = name(*unit);
      if (!unit) ++damagedReports_;
    }
  };
  if (record.type != "Simple" && record.type != "Histogram") return;
  record.payload->forEachMember([&](std::string_view key, std::string_view) {
    if (const auto parts = parseDriverReportKey(key, record.type)) add(key, *parts);
  });
}

// Each session is told the settings when it starts and when they change. Only a change is a mark.
void ReportBuilder::addSettings(const Record& record) {
  std::string settings;
  record.payload->forEachMember([&](std::string_view key, std::string_view json) {
    if (isStamp(key) || key == "object_serial") return;
    settings.append(settings.empty() ? "" : ", ").append(key).append(": ").append(json);
  });
  if (settings == lastSettings_) return;
  lastSettings_ = settings;
  addMark({record.time, ReportMark::Kind::kSettings, name(settings)});
}

void ReportBuilder::addMetric(const Record& record) {
  ++data_.totals.metrics;
  AudioIssue issue;
  if (record.number == kAudioIssueDetected) {
    issue = parseAudioIssue(record.bytes).value_or(issue);
    data_.issueNames.add(name(issue.type + " of " + issue.client), record.time);
  }
  const auto key =
      std::tuple(record.number, name(issue.type), name(issue.node), name(issue.client));
  ReportIssue* const row = rowOf(issues_, key, bounds_.rows);
  if (row == nullptr) return void(++rowsNotKept_);
  std::tie(row->metric, row->type, row->node, row->client) = key;
  countIn(*row, record.time);
}

void ReportBuilder::addPower(const Record& record) {
  ++data_.totals.powerEvents;
  const auto key = std::pair(record.number, name(record.name));
  ReportPower* const row = rowOf(power_, key, bounds_.rows);
  if (row == nullptr) return void(++rowsNotKept_);
  std::tie(row->category, row->name) = key;
  countIn(*row, record.time);
}

void ReportBuilder::addLoss(const Record& record) {
  const auto key = std::pair(name(record.name), name(record.reason));
  ReportServiceLoss* const row = rowOf(serviceLosses_, key, bounds_.rows);
  if (row == nullptr) return void(++rowsNotKept_);
  std::tie(row->piece, row->reason) = key;
  row->count += static_cast<std::uint64_t>(std::max<std::int64_t>(record.number, 0));
  row->last = std::max(row->last, record.time);
}

void ReportBuilder::addMark(ReportMark mark) {
  if (data_.marks.size() >= bounds_.marks) return void(++marksNotKept_);
  data_.marks.push_back(std::move(mark));
}

void ReportBuilder::onMoment(const StreamStory& story, const StreamMoment& moment) {
  if (moment.kind == StreamMoment::Kind::kXrun) onXrunOfStream(story, moment);
  streams_.onMoment(story, moment);
  rates_.onMoment(story, moment);
}

void ReportBuilder::onXrunOfStream(const StreamStory& story, const StreamMoment& moment) {
  ReportXrun xrun;
  xrun.milliseconds = moment.xrun.milliseconds;
  xrun.missedCycles = moment.xrun.missedCycles;
  // What people call the device.
  const std::string device =
      name(!story.routes.empty() && !story.routes.back().text.empty() ? story.routes.back().text
                                                                      : moment.xrun.device);
  ++ofStreams_.xruns;
  ofStreams_.missedCycles += xrun.missedCycles;
  ofStreams_.xrunMilliseconds += xrun.milliseconds;
  addToApplication(name(story.application), device, xrun);
  if (ReportXrun* const kept = xruns_.find(moment.messageID)) {
    kept->storyID = story.id;
    if (!device.empty()) kept->device = device;
  }
}

void ReportBuilder::addToApplication(const std::string& application, const std::string& device,
                                     const ReportXrun& xrun) {
  auto* const row = rowOf(byApplication_, std::pair(application, device), bounds_.rows);
  if (row == nullptr) return void(++rowsNotKept_);
  row->application = application;
  row->device = device;
  ++row->xruns;
  row->missedCycles += xrun.missedCycles;
  row->milliseconds += xrun.milliseconds;
  row->longest = std::max(row->longest, xrun.milliseconds);
}

// The sums of the table are then those of the whole report.
void ReportBuilder::addXrunsOutsideStreams() {
  const ReportTotals& all = data_.totals;
  if (all.xruns <= ofStreams_.xruns) return;
  ReportApplicationDevice row{.application = "(outside sessions)"};
  row.xruns = all.xruns - ofStreams_.xruns;
  row.missedCycles = all.missedCycles - std::min(all.missedCycles, ofStreams_.missedCycles);
  row.milliseconds = std::max(0.0, all.xrunMilliseconds - ofStreams_.xrunMilliseconds);
  data_.byApplication.push_back(std::move(row));
}

ReportData ReportBuilder::finish(const StreamBuilder::Finish& finish) {
  builder_.finish(finish);
  data_.streams = streams_.take();
  data_.xruns = xruns_.take();
  data_.rates = rates_.take();
  addXrunsOutsideStreams();
  moveRows(byApplication_, data_.byApplication, [](const auto& one, const auto& other) {
    return one.milliseconds > other.milliseconds;
  });
  const auto isMoreFrequent = [](const auto& one, const auto& other) {
    return one.count > other.count;
  };
  moveRows(issues_, data_.issues, isMoreFrequent);
  moveRows(power_, data_.power, isMoreFrequent);
  moveRows(serviceLosses_, data_.serviceLosses, isMoreFrequent);
  for (auto& [key, row] : deviceTimes_) data_.deviceTimes.push_back(std::move(row));
  for (auto& [key, row] : deviceCounters_) data_.deviceCounters.push_back(std::move(row));
  noteLosses();
  return std::move(data_);
}

void ReportBuilder::noteLosses() {
  noteLoss("streams", "not drawn and not in the table: others lost more or ran longer",
           streams_.notKept());
  noteLoss("xruns", "without a mark: others lost more", xruns_.notKept());
  noteLoss("xruns", "without the messages around them: others lost more", xruns_.withoutContext());
  noteLoss("changes of volume, format or device", "not drawn: there are too many",
           streams_.changesNotKept());
  noteLoss("settings and captures", "not drawn: there are too many", marksNotKept_);
  noteLoss("events", "without a name in the table: there are too many names",
           data_.names.otherNames());
  noteLoss("records", "not in a table of sums: it has too many rows", rowsNotKept_);
  noteLoss("streams", "not in a comparison's rates: there are too many applications and devices",
           rates_.notKept());
  noteLoss("driver histograms", "cannot be read", damagedReports_);
  noteLoss("texts", "shortened", textsCut_);
}

void ReportBuilder::noteLoss(std::string_view what, std::string_view reason, std::uint64_t count) {
  if (count > 0) data_.losses.push_back({std::string(what), std::string(reason), count});
}

std::string ReportBuilder::shortened(std::string_view text, std::size_t most) {
  if (text.size() <= most) return std::string(text);
  ++textsCut_;
  return std::string(platform::linux_::utf8Prefix(text, most)) + "…";
}

}  // namespace halvox::analysis
