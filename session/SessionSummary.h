#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <utility>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"
#include "session/MessageHistory.h"
#include "session/SessionHistory.h"

namespace halvox::platform {
class JsonArrayFile;
}

namespace halvox {

class SessionProfile;

// The summary event of a run that has ended, made when it is sent. Immutable; shared by the copies
// of the job that sends it. Gives the memory and the file of the history back when it is destroyed.
class LateSummary {
 public:
  LateSummary(AudioServiceType serviceType, ReporterID reporterID, MessageHistory history)
      : serviceType_(serviceType), reporterID_(reporterID), history_(std::move(history)) {}

  // Takes time, and memory for the texts, in proportion to the history. Logs what it cannot read.
  [[nodiscard]] platform::Dictionary makeEvent() const;
  [[nodiscard]] const MessageHistory& history() const { return history_; }
  [[nodiscard]] ReporterID reporterID() const { return reporterID_; }
  // The number of its messages.
  [[nodiscard]] std::size_t size() const { return history_.size(); }
  // What it keeps in memory.
  [[nodiscard]] std::size_t memorySize() const { return history_.memorySize(); }

 private:
  const AudioServiceType serviceType_;
  const ReporterID reporterID_;
  const MessageHistory history_;
};

// The file of a run that has ended, written part by part. A part takes about 25 ms of processor
// time.
//
//   made --writePart()--> begun --writePart()...--> complete
//
// Belongs to one thread at a time. Waits for the disk. Failures are logged. If it is destroyed
// before it is complete, there is no file.
class SummaryFile {
 public:
  // `name` is the file's name in the directory of summaries.
  SummaryFile(std::shared_ptr<const LateSummary> run, std::string name);
  SummaryFile(const SummaryFile&) = delete;
  SummaryFile& operator=(const SummaryFile&) = delete;
  ~SummaryFile();

  // Writes the next messages. Returns true when the file is complete.
  bool writePart();

 private:
  const std::shared_ptr<const LateSummary> run_;
  const std::string name_;
  MessageHistory::Reader reader_;
  std::unique_ptr<platform::JsonArrayFile> file_;  // null before the first part
};

// What a session reports about its run when it stops: how long was played at which volume, every
// value that every key had, and on internal builds a file with the whole history.
//
// The requests of all clients wait for a stop. What it reports is therefore made elsewhere where
// that makes no difference to a client: volume messages while messages are recorded, and the event
// by the job that sends it. The file must exist before the stop is answered. It is written part by
// part, and the caller decides where.
//
// Owned by the session, on the thread that stops it. Each operation locks the history only while it
// reads it.
class SessionSummary {
 public:
  using Send = std::function<void(const platform::Message&)>;

  // Both must outlive this.
  SessionSummary(const SessionProfile& profile, SessionHistory& history)
      : profile_(profile), history_(history) {}

  // Passes the volume messages to `send`, each as soon as it is read; `send` may add to the
  // history.
  void sendVolumeMessages(const Send& send) const;
  // The summary event; none if the history is empty or the session is not started. Takes time in
  // proportion to the history.
  [[nodiscard]] platform::Message createEvent() const;
  // Takes the history of the run and returns what makes the same event from it later, on any
  // thread; null if there is no event. The service type is that of this moment.
  [[nodiscard]] std::shared_ptr<const LateSummary> takeHistory() const;
  // On internal builds, writes the history into a JSON file, unless it is empty. Logs failures.
  // Waits for the disk.
  void writeFile() const;
  // The file of a run whose history was taken, named by the present time and state; null if this is
  // not an internal build.
  [[nodiscard]] std::unique_ptr<SummaryFile> makeFile(
      const std::shared_ptr<const LateSummary>& run) const;

 private:
  [[nodiscard]] std::string fileName() const;

  const SessionProfile& profile_;  // the session's
  SessionHistory& history_;        // the session's
};

}  // namespace halvox
