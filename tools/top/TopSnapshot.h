#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "analysis/StreamStory.h"

// What `halvoxctl top` shows at one moment, as plain values. Texts are as clients wrote them: a
// view must escape them. A number that is not known is empty.
namespace halvox::tools {

struct TopService {
  bool isConnected = false;
  std::string problem;  // for a person; empty if there is none
  std::optional<double> uptimeSeconds;
  std::optional<std::uint64_t> clients;  // without this one
  std::optional<std::uint64_t> sessions;
  std::optional<double> messagesPerSecond;  // that the service received
  std::optional<double> storedPerSecond;    // records of all kinds
  std::optional<std::uint64_t> waitingJobs;
  std::optional<std::uint64_t> waitingRecords;
  std::optional<std::uint64_t> storeBytes;
};

// One reason for which the service lost, refused or suppressed something.
struct TopLoss {
  std::string piece;   // "link local"
  std::string reason;  // "dropped: disk full"
  std::uint64_t total = 0;
  std::optional<double> perSecond{};
};

struct TopDevice {
  std::string name;                       // the node's name
  std::string description;                // empty if unknown
  std::optional<std::int64_t> quantum{};  // frames
  std::optional<std::int64_t> rate{};     // Hz
  std::optional<double> busy{};           // the share of the time that it worked, 0 to 1
  std::uint64_t xruns = 0;                // in the last minute
  std::uint64_t streams = 0;              // that run on it
};

enum class TopStreamState : std::uint8_t {
  kOpen,     // nothing says that it has run
  kRunning,  // it plays or records
  kPaused,   // it has run and may run again
};

struct TopStream {
  std::int64_t id = 0;  // as `halvoxctl streams` shows it
  std::optional<std::int64_t> sessionID;
  std::string application;  // empty if unknown
  std::string service;      // empty if unknown
  analysis::StreamDirection direction = analysis::StreamDirection::kUnknown;
  std::string device;       // descriptions; empty if unknown
  std::string deviceNames;  // node names, joined by ", "
  std::optional<double> volume;
  TopStreamState state = TopStreamState::kOpen;
  double started = 0;            // seconds since 1970
  std::uint64_t xruns = 0;       // reports in the last minute
  double lostMilliseconds = 0;   // in the last minute
  std::uint64_t xrunsInAll = 0;  // reports since it began
};

struct TopSnapshot {
  double time = 0;     // seconds since 1970
  double seconds = 0;  // of the rates; 0 if there are none yet
  TopService service;
  std::vector<TopLoss> losses;
  std::vector<TopDevice> devices;
  std::vector<TopStream> streams;
};

// "open", "running", "paused".
[[nodiscard]] const char* stateName(TopStreamState state);

}  // namespace halvox::tools
