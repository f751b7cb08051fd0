#include <utility>

#include "backends/HVReportingTallyhubBridge.h"
#include "backends/HVReportingUtility.h"
#include "platform/clock.h"
#include "platform/files.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"
#include "session/SessionLog.h"
#include "session/SummaryEvent.h"
#include "session/SummaryFileName.h"
#include "session/VolumeMessages.h"

// What a session tells of itself when it is stopped.
namespace halvox {
namespace {

using platform::Dictionary;
using platform::Message;

constexpr std::string_view kSummaryDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting";
constexpr std::uint32_t kSummaryDirectoryPermissions = 0777;
// The category and type of the summary event: all bits set.
constexpr AudioEventCategory kSummaryCategory{0xFFFFFFFF};
constexpr AudioEventType kSummaryType = AudioEventType::kUnknown;

// Walks the messages that a history has at first, though more may be added on the way.
class VolumeWalk {
 public:
  VolumeWalk(double minimumPlaytime, std::size_t messages)
      : intervals_(minimumPlaytime), end_(messages) {}
  // The next volume message of that history, which is the same each time; none at its end.
  Message next(const MessageHistory& history) {
    while (position_ < end_ && position_ < history.size()) {
      Message message = intervals_.add(history[position_++].message());
      if (message.has_value()) return message;
    }
    return std::nullopt;
  }

 private:
  VolumeIntervals intervals_;
  std::size_t position_ = 0;
  const std::size_t end_;
};

}  // namespace

std::vector<Dictionary> HVReportingSession::createVolumeMessages(const MessageHistory& history,
                                                                 double minimumPlaytime) {
  std::vector<Dictionary> messages;
  VolumeWalk walk(minimumPlaytime, history.size());
  while (Message message = walk.next(history)) messages.push_back(std::move(*message));
  return messages;
}

// Sends what createVolumeMessages() gives, but each as it is found: the messages of a long history
// are many, and sending one adds it to the history, which is locked while it is walked only.
void HVReportingSession::sendVolumeMessages() {
  VolumeWalk walk(HVReportingUtilityVolumeMinimumPlayingTime(serviceType()), historySize());
  const auto next = [&walk, this]() -> Message {
    const HistoryLock history = history_.lock();
    return history->has_value() ? walk.next(**history) : std::nullopt;
  };
  Message message = next();
  if (!message.has_value()) return;
  kSessionLog.notice("sending volume event for reporter ", number(reporterID_));
  for (; message.has_value(); message = next()) {
    sendMessage(message, AudioEventCategory::kVolume, AudioEventType::kSummary, true, nullptr);
    HVReportingTallyhubBridge::handleEvent(message, AudioEventCategory::kVolume,
                                           AudioEventType::kSummary, shared_from_this());
  }
}

void HVReportingSession::sendSummaryEvent() {
  const Message summary = createSummaryEventForSession();
  if (!summary.has_value()) return;
  kSessionLog.notice("sending summary event for reporter ", number(reporterID_));
  sendMessage(summary, kSummaryCategory, kSummaryType, true, nullptr);
}

Message HVReportingSession::createSummaryEventForSession() const {
  const HistoryLock history = history_.lock();
  if (!history->has_value() || (*history)->empty()) return std::nullopt;
  SummaryEvent event(serviceType());
  for (const MessageHistory::Entry& entry : **history) event.add(entry.message());
  return event.take();
}

// The text goes to the file piece by piece, so the directory comes first: a history may be too long
// to be held as text beside itself. Every value that a message can have has a JSON text, so what
// can go wrong is the file alone.
void HVReportingSession::writeSummaryJson() const {
  if (!HVReportingUtilityIsInternalBuild() || historySize() == 0) return;
  platform::FileService& files = platform::files();
  if (const auto error = files.createDirectory(kSummaryDirectory, kSummaryDirectoryPermissions)) {
    kSessionLog.error("can't create logging directory at ", kSummaryDirectory, ": ",
                      error->description);
  }
  const auto file = files.createJsonArrayFile(kSummaryDirectory, summaryFileName());
  {
    const HistoryLock history = history_.lock();
    if (!history->has_value()) return;
    for (const MessageHistory::Entry& entry : **history) {
      file->appendObject(entry.identifier(), entry.message());
    }
  }
  std::string path;
  if (const auto error = file->commit(path)) {
    kSessionLog.error("jsonOutput writeToURL: ", error->description);
  } else {
    kSessionLog.info("jsonOutput writeToURL: ", path);
  }
}

std::string HVReportingSession::summaryFileName() const {
  const platform::ClockService& clock = platform::clock();
  return makeSummaryFileName(
      {.time = clock.localTime(clock.currentDate()),
       .appName = platform::describe(HVReportingUtilityRetrieveAppName(configuration())),
       .serviceName = serviceName()});
}

std::size_t HVReportingSession::historySize() const {
  const HistoryLock history = history_.lock();
  return history->has_value() ? (*history)->size() : 0;
}

}  // namespace halvox
