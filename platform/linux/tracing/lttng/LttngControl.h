#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/tracing/lttng/SessionDaemon.h"

namespace halvox::platform::linux_ {

// What a recording contains.
struct RecordingPlan {
  std::string event;   // its name, or a pattern with *
  std::string filter;  // an expression over the event's fields; empty: no filter
  std::vector<std::string> exclusions{};
};

// The recordings of this service in LTTng, and the session daemon that they need.
//
//   no daemon --begin()--> daemon runs, recordings begin and end --close()--> no daemon
//
// The first recording starts the daemon, and close() ends it. A daemon that others started is used
// and left running.
//
// Names: a recording has the name of its LTTng session, which begins with the device and inode
// numbers of the traces' directory. One service at a time has that directory open. A session with
// this prefix that exists at the start was therefore left by an earlier service and can be
// destroyed.
//
// Files: each recording writes into a directory of its own below "scratch" in the traces'
// directory. While it records, an empty file with its name is in the directory "recording" next to
// "scratch". As soon as that file exists, every event is recorded.
//
// Threads: any. Each call waits for the daemon. A lock makes calls wait for each other, because the
// control library is not thread-safe. No other lock here is held during input and output.
// Failure: a text for the log. The platform's trace services own this object.
class LttngControl {
 public:
  struct Recording {
    std::string name{};
    std::filesystem::path directory{};
  };

  // Does not contact the tracer.
  explicit LttngControl(std::filesystem::path tracesDirectory);
  LttngControl(const LttngControl&) = delete;
  LttngControl& operator=(const LttngControl&) = delete;

  // Destroys what an earlier service left, and takes over its daemon. Does not call the tracer if
  // nothing was left.
  void removeLeftovers();
  // Begins to record. Starts a session daemon if none answers, which takes up to ten seconds. On
  // failure deletes the recording's files.
  Result<Recording> begin(const RecordingPlan& plan);
  // Stops and destroys the LTTng session. When it returns, the recording is complete on the disk.
  Result<void> end(const Recording& recording);
  // Deletes the files of a recording.
  void discard(const Recording& recording);
  // Destroys all our sessions. Ends the daemon if we started it and no other program uses it.
  void close();

  [[nodiscard]] const std::filesystem::path& tracesDirectory() const { return tracesDirectory_; }

 private:
  [[nodiscard]] std::string namePrefix() const;
  Result<void> setUp(const RecordingPlan& plan, const Recording& recording) HALVOX_REQUIRES(mutex_);

  const std::filesystem::path tracesDirectory_;
  const std::filesystem::path scratchDirectory_;
  const std::filesystem::path recordingDirectory_;
  Mutex mutex_;
  SessionDaemon daemon_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t begun_ HALVOX_GUARDED_BY(mutex_) = 0;
};

}  // namespace halvox::platform::linux_
