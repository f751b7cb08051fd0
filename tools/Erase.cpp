#include "tools/Erase.h"

#include <charconv>
#include <ostream>
#include <system_error>
#include <utility>

#include "platform/linux/store/StoreErase.h"
#include "tools/StorageTask.h"

namespace halvox::tools {
namespace {

using platform::Dictionary;
using platform::linux_::EraseState;
using platform::linux_::Failure;
using platform::linux_::StoreError;
using platform::linux_::StoreSizes;

std::string counted(const Dictionary& state, const char* one, const char* many) {
  const std::uint64_t number = numberIn(state, many);
  return std::to_string(number) + ' ' + (number == 1 ? one : many);
}

class EraseTask final : public StorageTask {
 public:
  EraseTask(const EraseStored& request, const CommonOptions& options, const ToolStreams& streams)
      : StorageTask("erase", options, streams), request_(request) {}

 private:
  client::Result<bool> begin(client::HalvoxConnection& connection) override {
    Dictionary wanted;
    if (request_.application) wanted.add("app", *request_.application);
    if (request_.session) wanted.add("session", *request_.session);
    if (request_.before) wanted.add("before", *request_.before);
    return connection.beginErase(wanted);
  }
  client::Result<State> ask(client::HalvoxConnection& connection) override {
    return connection.eraseState();
  }
  platform::linux_::Result<State, StoreError> workAlone(const Place& place) override {
    const auto& storage = place.configuration.storage;
    auto done = platform::linux_::eraseStore({.directory = place.directory, .root = storage.root},
                                             StoreSizes::of(storage.maxMegabytes),
                                             {.application = request_.application,
                                              .session = request_.session,
                                              .before = request_.before},
                                             [&](const EraseState& state) {
                                               place.progress(describe(state));
                                               if (state.isLogHeld) noteHeld();
                                             });
    if (!done) return std::move(done).error();
    if (done->isRunning) {
      done->problem =
          "not complete: another program reads the database and keeps its log from being emptied; "
          "end it, and erase again";
    }
    return describe(*done);
  }
  std::string progressText(const State& state) override {
    return "erased " + counted(state, "record", "records") + " and " +
           counted(state, "file", "files");
  }
  void showResult(const State& state) override {
    if (options().json) {
      output() << "{\"command\":\"erase\",\"result\":true,\"records\":";
      if (request_.before) {
        output() << "null";
      } else {
        output() << numberIn(state, "records");
      }
      output() << ",\"files\":" << numberIn(state, "files") << "}\n";
      return;
    }
    const std::string records =
        request_.before ? "all records before that time" : counted(state, "record", "records");
    output() << "erased " << records << " and " << counted(state, "file", "files") << '\n';
  }
  void noteHeld() override {
    if (std::exchange(isNoted_, true)) return;
    clearProgress();
    complain().warn(
        "waiting for another program that reads the database; until it ends, erased records can be "
        "in the database's log");
  }

  const EraseStored& request_;
  bool isNoted_ = false;
};

}  // namespace

ExitStatus eraseStored(const EraseStored& request, const CommonOptions& options,
                       const ToolStreams& streams) {
  return EraseTask(request, options, streams).run();
}

platform::linux_::Result<std::string> parseErasedApplication(std::string_view text) {
  if (text.empty()) return Failure<>{"the name is empty; expected that of one application"};
  if (text.find_first_of("*?[") != std::string_view::npos) {
    return Failure<>{"\"" + std::string(text) +
                     "\" is a pattern; expected the name of one application"};
  }
  return std::string(text);
}

platform::linux_::Result<std::int64_t> parseErasedSession(std::string_view text) {
  std::int64_t number = 0;
  const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
  if (read.ec != std::errc() || read.ptr != text.data() + text.size() || number == 0) {
    return Failure<>{"\"" + std::string(text) +
                     "\" is not a session; expected a number other than 0"};
  }
  return number;
}

}  // namespace halvox::tools
