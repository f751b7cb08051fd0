#include "tools/Streams.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <utility>
#include <variant>

#include "analysis/StoreRecordSource.h"
#include "analysis/StreamBuilder.h"

#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Complaint.h"
#include "tools/Globs.h"
#include "tools/StoreRun.h"
#include "tools/StreamFinish.h"
#include "tools/StreamText.h"
#include "tools/TextTable.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::StreamBuilder;
using analysis::StreamEnd;
using analysis::StreamMoment;
using analysis::StreamStory;
using platform::linux_::StoreReader;

// Whether one of the comma-separated devices of a route, or all of them together, has that name.
bool matchesOne(const std::vector<std::string>& patterns, const std::string& devices) {
  constexpr std::string_view kSeparator = ", ";
  if (matchesAnyGlob(patterns, devices)) return true;
  for (std::size_t begin = 0; begin < devices.size();) {
    const std::size_t end = std::min(devices.find(kSeparator, begin), devices.size());
    if (matchesAnyGlob(patterns, devices.substr(begin, end - begin))) return true;
    begin = end + kSeparator.size();
  }
  return false;
}

bool isSelected(const ShowStreams& request, const StreamStory& story) {
  if (request.glitched && story.xruns.reports == 0) return false;
  const bool isRunning = story.end == StreamEnd::kStillRunning;
  if (request.since && !isRunning && story.ended < *request.since) return false;
  if (request.until && story.started >= *request.until) return false;
  if (!request.applications.empty() && !matchesAnyGlob(request.applications, story.application)) {
    return false;
  }
  return request.devices.empty() ||
         std::ranges::any_of(story.routes, [&](const analysis::StreamChange& route) {
           return matchesOne(request.devices, route.text) ||
                  matchesOne(request.devices, route.names);
         });
}

// Reads all messages of a store, and gives the stories. All of them: a stream that ran at some time
// may have begun long before it.
ExitStatus readStories(const std::string& database, const Complaint& complain,
                       const StreamBuilder::StoryCallback& onStory,
                       const StreamBuilder::MomentCallback& onMoment) {
  const auto directory = storeDirectory(database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  StoreReader reader;
  const auto opened = reader.open(path);
  if (!opened) return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  analysis::StoreRecordSource source(reader);
  StreamBuilder builder(onStory, onMoment);
  const auto read =
      source.forEach({}, [&](const analysis::Record& record) { builder.add(record); });
  if (!read) return complain(ExitStatus::kNoService, read.error().message, "no-store");
  builder.finish(streamFinish(path));
  return ExitStatus::kDone;
}

void printMoments(const StreamStory& story, const std::vector<StreamMoment>& moments,
                  std::size_t notKept, std::ostream& out) {
  TextTable table({{.heading = "TIME"},
                   {.heading = "AFTER", .align = TextTable::Align::kRight},
                   {.heading = "WHAT HAPPENED"}});
  for (const StreamMoment& moment : moments) {
    table.add({localTime(moment.time), durationText(moment.time - story.started),
               describeMoment(story, moment)});
  }
  out << describeStream(story) << '\n';
  table.print(out, std::nullopt);
  if (notKept > 0) out << notKept << " further moments are not shown.\n";
}

}  // namespace

ExitStatus showStreams(const ShowStreams& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors) {
  const Complaint complain("streams", form, out, errors);
  // By start: stories come in the order of their ends.
  std::multimap<double, StreamStory> stories;
  const ExitStatus status = readStories(
      request.database, complain,
      [&](const StreamStory& story) {
        if (!isSelected(request, story)) return;
        stories.emplace(story.started, story);
        if (request.last && stories.size() > *request.last) stories.erase(stories.begin());
      },
      nullptr);
  if (status != ExitStatus::kDone) return status;
  if (form == OutputForm::kJson) {
    for (const auto& [started, story] : stories) out << streamJson(story) << '\n';
  } else {
    TextTable table(streamColumns());
    // Drop each story when its row is made: holding both took half as much memory again.
    for (auto next = stories.begin(); next != stories.end(); next = stories.erase(next)) {
      table.add(streamRow(next->second));
    }
    table.print(out, terminalWidth(outputDescriptor));
  }
  out << std::flush;
  return ExitStatus::kDone;
}

ExitStatus showStream(const ShowStream& request, OutputForm form, std::ostream& out,
                      std::ostream& errors) {
  const Complaint complain("streams show", form, out, errors);
  std::map<std::int64_t, std::pair<std::vector<StreamMoment>, std::size_t>> open;  // by story
  bool isFound = false;
  const auto isWanted = [&](const StreamStory& story) {
    return story.id == request.id || story.sessionID == request.id;
  };
  const auto onMoment = [&](const StreamStory& story, const StreamMoment& moment) {
    if (!isWanted(story)) return;
    auto& [moments, notKept] = open[story.id];
    // The end always fits.
    if (moments.size() < request.mostMoments || moment.kind == StreamMoment::Kind::kEnded) {
      moments.push_back(moment);
    } else {
      ++notKept;
    }
  };
  const auto onStory = [&](const StreamStory& story) {
    if (!isWanted(story)) return;
    const auto moments = open.extract(story.id);
    if (form == OutputForm::kText) {
      if (std::exchange(isFound, true)) out << '\n';
      if (!moments.empty()) {
        printMoments(story, moments.mapped().first, moments.mapped().second, out);
      }
      return;
    }
    isFound = true;
    out << streamJson(story, moments.empty() ? 0 : moments.mapped().second) << '\n';
    if (moments.empty()) return;
    for (const StreamMoment& moment : moments.mapped().first) out << momentJson(moment) << '\n';
  };
  const ExitStatus status = readStories(request.database, complain, onStory, onMoment);
  if (status != ExitStatus::kDone) return status;
  out << std::flush;
  if (isFound) return ExitStatus::kDone;
  return complain(ExitStatus::kRefused, "no stream or session has the ID " +
                                            std::to_string(request.id) +
                                            "; `halvoxctl streams` lists them");
}

}  // namespace halvox::tools
