#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "analysis/BucketCounts.h"
#include "analysis/NameCounts.h"
#include "analysis/StreamRates.h"
#include "analysis/StreamStory.h"

// What a report says about a period. Plain values; texts are as clients wrote them, cut at the
// bounds below. Times are seconds since 1970.
namespace halvox::analysis {

// How much of a report is kept one by one. What is beyond these bounds is in the totals and counted
// in ReportData::losses.
struct ReportBounds {
  std::size_t streams = 2000;  // those that lost most, then those that ran longest
  std::size_t xruns = 2000;    // those that lost most
  std::size_t contexts = 200;  // xruns with the messages around them
  std::size_t around = 10;     // messages before and after an xrun
  // Bytes of content of all messages around xruns. Without a bound they would be most of the page.
  std::size_t aroundBytes = 1'500'000;
  std::size_t marks = 500;    // changed settings and captures
  std::size_t rows = 500;     // of each table of sums
  std::size_t changes = 200;  // of a stream's volume, and of its formats and routes
  // Of all streams together. If they have more, each keeps an equal share, evenly chosen.
  std::size_t allChanges = 20'000;
  std::size_t volumes = 8;     // of the volumes at which a stream ran, with their times
  std::size_t text = 512;      // bytes of a name
  std::size_t payload = 1024;  // bytes of a message's content
};

// From then on the stream had this volume. Without one, the client did not report one.
struct VolumeStep {
  double time = 0;
  std::optional<double> volume{};
  bool isPlaying = false;
};

struct ReportStream {
  StreamStory story{};
  std::vector<VolumeStep> volumeSteps{};
};

// A message near an xrun. Several xruns may share it.
struct ReportMessage {
  std::int64_t id = 0;
  double time = 0;
  std::string name{};  // "Session_Playback.IssueDetector"
  std::string application{};
  std::string payload{};  // JSON, unless it was cut
};

struct ReportXrun {
  std::int64_t messageID = 0;
  double time = 0;
  std::string application{};
  std::optional<std::int64_t> storyID{};  // of the stream; nothing if it belongs to none
  std::string device{};                   // the description of the route, else the node's name
  double milliseconds = 0;
  std::uint64_t missedCycles = 0;  // 0: not reported
  std::int64_t quantum = 0;        // samples; 0: not reported
  std::int64_t rate = 0;           // samples a second; 0: not reported
  std::string role{};              // "culprit", "victim", "device", or empty
  std::string late{};              // the node that was late, with its process; may be empty
  std::vector<std::shared_ptr<const ReportMessage>>
      around{};  // in the order of storing; may be empty
};

struct ReportApplicationDevice {
  std::string application{};
  std::string device{};
  std::uint64_t xruns = 0;
  std::uint64_t missedCycles = 0;
  double milliseconds = 0;
  double longest = 0;  // milliseconds
};

struct ReportDeviceTimes {
  std::string device{};
  std::string channel{};  // "busytime"
  std::string unit{};
  BucketCounts counts{};
  std::uint64_t reports = 0;
};

struct ReportDeviceCounter {
  std::string device{};
  std::string channel{};
  double sum = 0;
  std::uint64_t reports = 0;
};

// How often something of one kind was recorded.
struct ReportIssue {
  std::int64_t metric = 0;
  std::string type{};  // with the next two, of metrics of detected issues only
  std::string node{};
  std::string client{};
  std::uint64_t count = 0;
  double first = 0;
  double last = 0;
};

struct ReportPower {
  std::int64_t category = 0;
  std::string name{};
  std::uint64_t count = 0;
  double first = 0;
  double last = 0;
};

struct ReportMark {
  enum class Kind : std::uint8_t { kSettings, kCapture };
  double time = 0;
  Kind kind = Kind::kSettings;
  std::string text{};  // the settings as JSON, or the path of the capture
};

// What the service counted and did not record or pass on.
struct ReportServiceLoss {
  std::string piece{};   // of the service: "link local"
  std::string reason{};  // "dropped: disk full"
  std::uint64_t count = 0;
  double last = 0;  // when it was last recorded
};

// Something that the report does not show one by one.
struct ReportLoss {
  std::string what{};
  std::string reason{};
  std::uint64_t count = 0;
};

struct ReportTotals {
  std::uint64_t events = 0;
  std::uint64_t messages = 0;  // recorded under the name that all services share
  std::uint64_t linkMessages = 0;
  std::uint64_t metrics = 0;
  std::uint64_t powerEvents = 0;
  std::uint64_t snapshots = 0;
  std::uint64_t streams = 0;
  std::uint64_t xruns = 0;
  std::uint64_t missedCycles = 0;
  double xrunMilliseconds = 0;
};

struct ReportData {
  // The first and the last record.
  std::optional<double> from{};
  std::optional<double> to{};
  ReportTotals totals{};
  std::vector<ReportStream> streams{};  // in the order of their starts
  std::vector<ReportXrun> xruns{};      // in the order of their times
  std::vector<ReportApplicationDevice> byApplication{};
  std::vector<ReportDeviceTimes> deviceTimes{};
  std::vector<ReportDeviceCounter> deviceCounters{};
  NameCounts names;
  NameCounts issueNames;  // of detected issues: "xrun of player"
  std::vector<StreamRate> rates{};
  std::vector<ReportIssue> issues{};
  std::vector<ReportPower> power{};
  std::vector<ReportMark> marks{};
  std::vector<ReportLoss> losses{};
  std::vector<ReportServiceLoss> serviceLosses{};  // in the order of falling counts
};

}  // namespace halvox::analysis
