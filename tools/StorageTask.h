#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>

#include "client/HalvoxClient.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/store/StoreError.h"
#include "tools/Command.h"
#include "tools/Complaint.h"

namespace halvox::tools {

// Work on the store that takes some time: the running service does it, or if none runs, this
// program. Shows the progress if the errors go to a terminal. Belongs to one thread.
//
// States are those of the interface com.tarno.halvox.Storage, with "running", "log held" and
// "problem", whoever does the work.
class StorageTask {
 public:
  StorageTask(const StorageTask&) = delete;
  StorageTask& operator=(const StorageTask&) = delete;
  virtual ~StorageTask() = default;

  // Does the work. Blocks until its end.
  ExitStatus run();

 protected:
  using State = platform::Dictionary;
  struct Place {
    std::filesystem::path directory;
    platform::linux_::Configuration configuration;
    std::function<void(const State&)> progress;
  };

  // Does not own its arguments, which must outlive it.
  StorageTask(std::string_view command, const CommonOptions& options, const ToolStreams& streams)
      : options_(options),
        streams_(streams),
        complain_(std::string(command), options.form(), streams.output, streams.errors) {}

  virtual client::Result<bool> begin(client::HalvoxConnection& connection) = 0;
  virtual client::Result<State> ask(client::HalvoxConnection& connection) = 0;
  // Does in place of the service what it would do. Returns the last state.
  virtual platform::linux_::Result<State, platform::linux_::StoreError> workAlone(
      const Place& place) = 0;
  // Describes a state of the running work.
  virtual std::string progressText(const State& state) = 0;
  // Shows the result of work that did not fail.
  virtual void showResult(const State& state) = 0;
  // Called while the work runs and a reader holds the log.
  virtual void noteHeld() {}

  [[nodiscard]] const CommonOptions& options() const { return options_; }
  [[nodiscard]] std::ostream& output() const { return streams_.output; }
  [[nodiscard]] const Complaint& complain() const { return complain_; }
  void clearProgress();

 private:
  ExitStatus askService(client::HalvoxConnection& connection);
  ExitStatus workInPlace();
  ExitStatus finish(const State& state);
  void showProgress(const State& state);

  const CommonOptions& options_;
  const ToolStreams& streams_;
  const Complaint complain_;
  bool isShown_ = false;
};

// Members of a state; 0, false and an empty text if it lacks them.
[[nodiscard]] std::uint64_t numberIn(const platform::Dictionary& state, std::string_view name);
[[nodiscard]] bool isSet(const platform::Dictionary& state, std::string_view name);
[[nodiscard]] std::string textIn(const platform::Dictionary& state, std::string_view name);

}  // namespace halvox::tools
