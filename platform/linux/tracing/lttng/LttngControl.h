#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/tracing/lttng/SessionDaemon.h"

namespace halvox::platform::linux_ {

// What a tracing session records, and where.
struct RecordingPlan {
  std::string event;   // its name, or a pattern with *
  std::string filter;  // an expression over the event's fields; empty: all
  std::vector<std::string> exclusions{};
};

// The tracing sessions of this service in LTTng, and the daemon that it needs for them.
//
// Sessions have names that start with the identity of the storage directory, which one service at a
// time has open: whatever bears such a name when the service starts was left by one before it. Each
// records into a directory of its own below "scratch" in the traces' directory. While it does, an
// empty file of its name is in "recording" beside that: whoever sees it knows that what is emitted
// from now on is recorded.
//
// Any thread may call. Calls wait for the daemon, one at a time, because the control library is not
// for several threads at once: this is the one lock here that is held while something else works.
// Failures are texts.
class LttngControl {
 public:
  using Failure = std::optional<std::string>;
  struct Recording {
    std::string name{};
    std::filesystem::path directory{};
  };

  // Nothing is touched yet.
  explicit LttngControl(std::filesystem::path tracesDirectory);
  LttngControl(const LttngControl&) = delete;
  LttngControl& operator=(const LttngControl&) = delete;

  // Destroys what a service before this one left and knows its daemon again. Cheap when it left
  // nothing.
  void removeLeftovers();
  // Begins to record, starting a session daemon if none answers.
  [[nodiscard]] Failure begin(const RecordingPlan& plan, Recording& recording);
  // Stops and destroys the session; what it recorded is then whole in its directory.
  [[nodiscard]] Failure end(const Recording& recording);
  // Removes what was recorded.
  void discard(const Recording& recording);
  // Destroys all our sessions, and ends the daemon if we started it and nobody else uses it.
  void close();

  [[nodiscard]] const std::filesystem::path& tracesDirectory() const { return tracesDirectory_; }

 private:
  [[nodiscard]] std::string namePrefix() const;
  [[nodiscard]] Failure setUp(const RecordingPlan& plan, const Recording& recording)
      HALVOX_REQUIRES(mutex_);

  const std::filesystem::path tracesDirectory_;
  const std::filesystem::path scratchDirectory_;
  const std::filesystem::path recordingDirectory_;
  Mutex mutex_;
  SessionDaemon daemon_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t begun_ HALVOX_GUARDED_BY(mutex_) = 0;
};

}  // namespace halvox::platform::linux_
