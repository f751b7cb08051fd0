#include "session/SessionSummary.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/clock.h"
#include "platform/files.h"
#include "platform/services.h"
#include "session/SessionLog.h"
#include "session/SessionProfile.h"
#include "session/SummaryEvent.h"
#include "session/SummaryFileName.h"

namespace halvox {
namespace {

using platform::Message;

// The interface fixes this path. The platform puts its storage root in front of it.
constexpr std::string_view kDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting";
// The readers of these files expect these permissions. Other users are kept out by the permissions
// of the storage root.
constexpr std::uint32_t kDirectoryPermissions = 0777;
// A part should end soon, because the files of several stops take turns, and because an orderly end
// of the service measures its progress in parts.
constexpr int kMessagesInPart = 10'000;

void logIfCutShort(const MessageHistory::Reader& reader, ReporterID reporterID) {
  if (!reader.error().has_value()) return;
  kSessionLog.error("cannot read the rest of the history of reporter ", number(reporterID), ": ",
                    reader.error()->description, "; the summary lacks the remaining messages");
}

platform::Dictionary makeEventOf(const MessageHistory& history, AudioServiceType serviceType,
                                 ReporterID reporterID) {
  SummaryEvent event(serviceType);
  MessageHistory::Reader reader(history);
  while (const MessageHistory::Entry* entry = reader.next()) event.add(*entry);
  logIfCutShort(reader, reporterID);
  return event.take();
}

// The text is written piece by piece, because a long history and its whole text may not fit into
// memory together. The directory must therefore exist before the text is made. Every value has a
// JSON text: only the file can fail.
std::unique_ptr<platform::JsonArrayFile> beginFile(const std::string& name) {
  platform::FileService& files = platform::files();
  // Creating the file is tried even if this fails, and the failure of the file is logged as well.
  // Both lines are required.
  if (const auto error = files.createDirectory(kDirectory, kDirectoryPermissions)) {
    kSessionLog.error("can't create logging directory at ", kDirectory, ": ", error->description);
  }
  return files.createJsonArrayFile(kDirectory, name);
}

// Writes the next messages of a part. Returns true at the end of the history.
bool writeNext(MessageHistory::Reader& reader, platform::JsonArrayFile& file) {
  for (int count = 0; count < kMessagesInPart; ++count) {
    const MessageHistory::Entry* const entry = reader.next();
    if (entry == nullptr) return true;
    file.appendObject(entry->identifier(), entry->message());
  }
  return false;
}

void endFile(const MessageHistory::Reader& reader, platform::JsonArrayFile& file,
             ReporterID reporterID) {
  logIfCutShort(reader, reporterID);
  std::string path;
  if (const auto error = file.commit(path)) {
    kSessionLog.error("jsonOutput writeToURL: ", error->description);
  } else {
    kSessionLog.info("jsonOutput writeToURL: ", path);
  }
}

}  // namespace

platform::Dictionary LateSummary::makeEvent() const {
  return makeEventOf(history_, serviceType_, reporterID_);
}

// The line is logged once, after the first message was read and before it is sent. If the file of
// the histories cannot be read, there may be no message although there were some.
void SessionSummary::sendVolumeMessages(const Send& send) const {
  const auto messages = history_.takeVolumeMessages();
  if (messages == nullptr) return;
  MessageHistory::Reader reader(*messages);
  const MessageHistory::Entry* entry = reader.next();
  if (entry != nullptr) {
    kSessionLog.notice("sending volume event for reporter ", number(profile_.reporterID()));
  }
  for (; entry != nullptr; entry = reader.next()) send(entry->message());
  logIfCutShort(reader, profile_.reporterID());
}

Message SessionSummary::createEvent() const {
  const SessionHistory::Lock history = history_.lock();
  if (!history->has_value() || (*history)->empty()) return std::nullopt;
  return makeEventOf(**history, profile_.serviceType(), profile_.reporterID());
}

std::shared_ptr<const LateSummary> SessionSummary::takeHistory() const {
  std::optional<MessageHistory> history = history_.take();
  if (!history.has_value() || history->empty()) return nullptr;
  return std::make_shared<const LateSummary>(profile_.serviceType(), profile_.reporterID(),
                                             std::move(*history));
}

void SessionSummary::writeFile() const {
  if (!HVReportingUtilityIsInternalBuild() || history_.size() == 0) return;
  const auto file = beginFile(fileName());
  // The lock is held until the whole history has been written, because the file shows one moment of
  // the history.
  const SessionHistory::Lock history = history_.lock();
  if (!history->has_value()) return;
  MessageHistory::Reader reader(**history);
  while (!writeNext(reader, *file)) {
  }
  endFile(reader, *file, profile_.reporterID());
}

std::unique_ptr<SummaryFile> SessionSummary::makeFile(
    const std::shared_ptr<const LateSummary>& run) const {
  if (!HVReportingUtilityIsInternalBuild()) return nullptr;
  return std::make_unique<SummaryFile>(run, fileName());
}

SummaryFile::SummaryFile(std::shared_ptr<const LateSummary> run, std::string name)
    : run_(std::move(run)), name_(std::move(name)), reader_(run_->history()) {}

SummaryFile::~SummaryFile() = default;

bool SummaryFile::writePart() {
  if (file_ == nullptr) file_ = beginFile(name_);
  if (!writeNext(reader_, *file_)) return false;
  endFile(reader_, *file_, run_->reporterID());
  return true;
}

std::string SessionSummary::fileName() const {
  const platform::ClockService& clock = platform::clock();
  return makeSummaryFileName(
      {.time = clock.localTime(clock.currentDate()),
       .appName = platform::describe(HVReportingUtilityRetrieveAppName(profile_.configuration())),
       .serviceName = profile_.serviceName()});
}

}  // namespace halvox
