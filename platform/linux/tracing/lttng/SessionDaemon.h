#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include <sys/types.h>

namespace halvox::platform::linux_ {

// The session daemon of LTTng, when it was started by us. Belongs to one thread at a time.
//
// A file tells which process it is, so that a service that starts again after it was killed knows
// its daemon too. A process is signalled only while its start time is the one that was noted.
class SessionDaemon {
 public:
  struct Limits {
    std::chrono::milliseconds answersWithin{10'000};
    std::chrono::milliseconds endsWithin{5'000};  // of a signal; then it is killed
  };

  // The file is in a directory that exists before the daemon is started.
  explicit SessionDaemon(std::filesystem::path noteFile) : SessionDaemon(std::move(noteFile), {}) {}
  SessionDaemon(std::filesystem::path noteFile, Limits limits)
      : noteFile_(std::move(noteFile)), limits_(limits) {}

  // Takes over the daemon that the file names, if it still runs; otherwise the file goes.
  void adopt();
  [[nodiscard]] bool isNoted() const;
  // Ends the daemon that was ours and does not answer any more, starts another and waits until it
  // answers; or ends it and tells why not.
  [[nodiscard]] std::optional<std::string> start();
  [[nodiscard]] bool isOurs() const { return process_.has_value(); }
  // Ends the daemon, if it is ours, and waits until it is gone.
  void end();

 private:
  struct Process {
    pid_t pid = 0;
    std::string startTime;  // as the kernel tells it
    bool isChild = false;
  };

  [[nodiscard]] static std::string startTimeOf(pid_t pid);
  [[nodiscard]] bool isAlive() const;
  [[nodiscard]] bool isGoneSoon() const;
  void note() const;

  const std::filesystem::path noteFile_;
  const Limits limits_;
  std::optional<Process> process_;
};

}  // namespace halvox::platform::linux_
