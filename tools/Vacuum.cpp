#include "tools/Vacuum.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <limits>
#include <string>
#include <system_error>
#include <variant>

#include <poll.h>

#include "client/HalvoxClient.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/StoreVacuum.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::Dictionary;
using platform::Value;
using platform::linux_::Configuration;
using platform::linux_::Failure;
using platform::linux_::StoreError;
using platform::linux_::StoreSizes;
using platform::linux_::VacuumState;

// How often the service is asked how far it is.
constexpr std::chrono::milliseconds kTurn{100};
constexpr double kMebibyte = 1024.0 * 1024.0;

std::string sizeText(std::uint64_t bytes) {
  return shortNumber(std::round(static_cast<double>(bytes) / kMebibyte * 10) / 10) + " MiB";
}

std::uint64_t numberIn(const Dictionary& answer, std::string_view name) {
  const Value* value = answer.find(name);
  return value != nullptr ? value->toUInt64() : 0;
}

bool isSet(const Dictionary& answer, std::string_view name) {
  const Value* value = answer.find(name);
  return value != nullptr && value->toBool();
}

VacuumState stateOf(const Dictionary& answer) {
  const Value* problem = answer.find("problem");
  return {.isRunning = isSet(answer, "running"),
          .bytesBefore = numberIn(answer, "before"),
          .bytes = numberIn(answer, "bytes"),
          .isLogHeld = isSet(answer, "log held"),
          .problem = problem != nullptr ? std::string(problem->string()) : std::string()};
}

ExitStatus statusOf(const client::Failure& failure) {
  return failure.kind == client::Failure::Kind::kRefused ? ExitStatus::kRefused
                                                         : ExitStatus::kNoService;
}

class Run {
 public:
  Run(const VacuumStore& request, const CommonOptions& options, const ToolStreams& streams)
      : request_(request),
        options_(options),
        streams_(streams),
        complain_("vacuum", options.form(), streams.output, streams.errors) {}

  ExitStatus run() {
    const auto socket = namedSocket(options_, complain_);
    if (const auto* status = std::get_if<ExitStatus>(&socket)) return *status;
    auto opened = client::HalvoxConnection::open(std::get<std::string>(socket), options_.timeout);
    if (opened) return askService(**opened.value);
    // The named socket is of one service. Without it, no other store may be meant.
    const bool isElsewhere = !options_.socket.empty();
    if (isElsewhere || opened.failure->kind != client::Failure::Kind::kNoService) {
      return complain_(statusOf(*opened.failure), opened.failure->message);
    }
    return workAlone();
  }

 private:
  ExitStatus askService(client::HalvoxConnection& connection) {
    Dictionary wanted;
    if (request_.before) wanted.add("before", *request_.before);
    if (request_.toBytes) wanted.add("to", *request_.toBytes);
    if (const auto begun = connection.beginVacuum(wanted); !begun) {
      return complain_(statusOf(*begun.failure), begun.failure->message);
    }
    for (;;) {
      const auto answer = connection.vacuumState();
      if (!answer) {
        clearProgress();
        return complain_(statusOf(*answer.failure), answer.failure->message);
      }
      const VacuumState state = stateOf(*answer.value);
      if (!state.isRunning) return finish(state);
      showProgress(state);
      ::poll(nullptr, 0, static_cast<int>(kTurn.count()));
    }
  }

  // Does in place of the service what it would do.
  ExitStatus workAlone() {
    const auto directory = findStore(complain_);
    if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
    const auto configuration = serviceConfiguration(complain_);
    if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
    const auto& path = std::get<std::filesystem::path>(directory);
    const auto file = path / platform::linux_::kStoreFileName;
    std::error_code error;
    if (!std::filesystem::exists(file, error)) {
      return complain_(ExitStatus::kNoService, file.native() + ": there is no store", "no-store");
    }
    const auto sizes = StoreSizes::of(std::get<Configuration>(configuration).storage.maxMegabytes);
    const auto done = platform::linux_::vacuumStore(
        path, sizes, {.before = request_.before, .toBytes = request_.toBytes},
        [this](const VacuumState& state) { showProgress(state); });
    if (done) return finish(*done);
    clearProgress();
    const bool isWriting = done.error().code == StoreError::kDirectory;
    return complain_(isWriting ? ExitStatus::kCannotWrite : ExitStatus::kNoService,
                     done.error().message);
  }

  ExitStatus finish(const VacuumState& state) {
    clearProgress();
    if (!state.problem.empty()) return complain_(ExitStatus::kRefused, state.problem);
    if (options_.json) {
      streams_.output << "{\"command\":\"vacuum\",\"result\":true,\"bytes_before\":"
                      << state.bytesBefore << ",\"bytes\":" << state.bytes
                      << ",\"log_held\":" << (state.isLogHeld ? "true" : "false") << "}\n";
    } else {
      streams_.output << "the database and its log: " << sizeText(state.bytesBefore) << " before, "
                      << sizeText(state.bytes) << " now\n";
    }
    if (state.isLogHeld) {
      complain_.warn(
          "another program reads the database and keeps its log from being emptied; the service "
          "does that later");
    }
    return ExitStatus::kDone;
  }

  void showProgress(const VacuumState& state) {
    if (!streams_.isErrorTerminal || options_.json) return;
    streams_.errors << "\r\033[K" << sizeText(state.bytes) << " of " << sizeText(state.bytesBefore)
                    << std::flush;
    isShown_ = true;
  }
  void clearProgress() {
    if (isShown_) streams_.errors << "\r\033[K" << std::flush;
    isShown_ = false;
  }

  const VacuumStore& request_;
  const CommonOptions& options_;
  const ToolStreams& streams_;
  const Complaint complain_;
  bool isShown_ = false;
};

}  // namespace

ExitStatus vacuumStore(const VacuumStore& request, const CommonOptions& options,
                       const ToolStreams& streams) {
  return Run(request, options, streams).run();
}

platform::linux_::Result<std::uint64_t> parseBytes(std::string_view text) {
  constexpr std::string_view kUnits = "KMG";
  constexpr unsigned kBitsPerUnit = 10;
  std::uint64_t number = 0;
  const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
  const std::string_view unit(read.ptr,
                              static_cast<std::size_t>(text.data() + text.size() - read.ptr));
  const std::size_t power = unit.empty() ? 0 : kUnits.find(unit) + 1;
  const unsigned bits = static_cast<unsigned>(power) * kBitsPerUnit;
  const bool isUnit = unit.empty() || (unit.size() == 1 && power > 0);
  if (read.ec != std::errc() || !isUnit ||
      number > std::numeric_limits<std::uint64_t>::max() >> bits) {
    return Failure<>{"\"" + std::string(text) +
                     "\" is not a size; expected a number of bytes, such as 100M"};
  }
  // Somebody who leaves out the unit does not mean to delete nearly everything.
  if (number << bits < platform::linux_::kLeastVacuumBytes) {
    return Failure<>{"\"" + std::string(text) + "\" is too small; expected at least 1M"};
  }
  return number << bits;
}

}  // namespace halvox::tools
