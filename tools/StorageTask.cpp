#include "tools/StorageTask.h"

#include <chrono>
#include <ostream>
#include <system_error>
#include <utility>
#include <variant>

#include <poll.h>

#include "platform/linux/store/StoreSchema.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::Value;
using platform::linux_::Configuration;
using platform::linux_::StoreError;

// How often the service is asked how far it is.
constexpr std::chrono::milliseconds kTurn{100};

ExitStatus statusOf(const client::Failure& failure) {
  return failure.kind == client::Failure::Kind::kRefused ? ExitStatus::kRefused
                                                         : ExitStatus::kNoService;
}

}  // namespace

std::uint64_t numberIn(const platform::Dictionary& state, std::string_view name) {
  const Value* value = state.find(name);
  return value != nullptr ? value->toUInt64() : 0;
}

bool isSet(const platform::Dictionary& state, std::string_view name) {
  const Value* value = state.find(name);
  return value != nullptr && value->toBool();
}

std::string textIn(const platform::Dictionary& state, std::string_view name) {
  const Value* value = state.find(name);
  return value != nullptr ? std::string(value->string()) : std::string();
}

ExitStatus StorageTask::run() {
  const auto socket = namedSocket(options_, complain_);
  if (const auto* status = std::get_if<ExitStatus>(&socket)) return *status;
  auto opened = client::HalvoxConnection::open(std::get<std::string>(socket), options_.timeout);
  if (opened) return askService(**opened.value);
  // The named socket is of one service. Without it, no other store may be meant.
  const bool isElsewhere = !options_.socket.empty();
  if (isElsewhere || opened.failure->kind != client::Failure::Kind::kNoService) {
    return complain_(statusOf(*opened.failure), opened.failure->message);
  }
  return workInPlace();
}

ExitStatus StorageTask::askService(client::HalvoxConnection& connection) {
  if (const auto begun = begin(connection); !begun) {
    return complain_(statusOf(*begun.failure), begun.failure->message);
  }
  for (;;) {
    const auto state = ask(connection);
    if (!state) {
      clearProgress();
      return complain_(statusOf(*state.failure), state.failure->message);
    }
    if (!isSet(*state.value, "running")) return finish(*state.value);
    showProgress(*state.value);
    if (isSet(*state.value, "log held")) noteHeld();
    ::poll(nullptr, 0, static_cast<int>(kTurn.count()));
  }
}

ExitStatus StorageTask::workInPlace() {
  const auto directory = findStore(complain_);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  auto configuration = serviceConfiguration(complain_);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  const auto file = path / platform::linux_::kStoreFileName;
  std::error_code error;
  if (!std::filesystem::exists(file, error)) {
    return complain_(ExitStatus::kNoService, file.native() + ": there is no store", "no-store");
  }
  const auto done = workAlone({.directory = path,
                               .configuration = std::get<Configuration>(std::move(configuration)),
                               .progress = [this](const State& state) { showProgress(state); }});
  if (done) return finish(*done);
  clearProgress();
  const bool isWriting = done.error().code == StoreError::kDirectory;
  return complain_(isWriting ? ExitStatus::kCannotWrite : ExitStatus::kNoService,
                   done.error().message);
}

ExitStatus StorageTask::finish(const State& state) {
  clearProgress();
  const std::string problem = textIn(state, "problem");
  if (!problem.empty()) return complain_(ExitStatus::kRefused, problem);
  showResult(state);
  return ExitStatus::kDone;
}

void StorageTask::showProgress(const State& state) {
  if (!streams_.isErrorTerminal || options_.json) return;
  streams_.errors << "\r\033[K" << progressText(state) << std::flush;
  isShown_ = true;
}

void StorageTask::clearProgress() {
  if (isShown_) streams_.errors << "\r\033[K" << std::flush;
  isShown_ = false;
}

}  // namespace halvox::tools
