#pragma once

#include <memory>
#include <utility>

#include "session/ResourceAccount.h"
#include "session/SessionSummary.h"

namespace halvox {

class HVReportingSession;

// What remains of a stop when the session has already become a stopped one: the summary file, and
// after it what must follow the file.
//
//   made --writePart() until it returns true--> written --finish()--> finished
//
// Made by HVReportingSession::beginStop(). The parts may be written on any thread, one after the
// other. Holds the session, which its owner must not start or change before finish() has
// returned. If it is destroyed before that, for instance because the service ends, the run is not
// reported. The history is charged to the session's account.
class SessionStop {
 public:
  using Run = std::shared_ptr<const LateSummary>;

  SessionStop(std::shared_ptr<HVReportingSession> session, Run run,
              std::unique_ptr<SummaryFile> file, ResourceCharge charge)
      : session_(std::move(session)),
        run_(std::move(run)),
        file_(std::move(file)),
        charge_(std::move(charge)) {}

  // Writes the next part of the file. Returns true when the file is complete. Waits for the disk.
  bool writePart() { return file_->writePart(); }
  // Sends the summary event and does the rest of the stop, on the thread that began it.
  void finish();

 private:
  std::shared_ptr<HVReportingSession> session_;  // null after finish()
  const Run run_;
  const std::unique_ptr<SummaryFile> file_;
  ResourceCharge charge_;
};

}  // namespace halvox
