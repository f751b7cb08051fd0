#include "tools/Vacuum.h"

#include <charconv>
#include <cmath>
#include <limits>
#include <ostream>
#include <string>
#include <system_error>

#include "platform/linux/store/StoreVacuum.h"
#include "tools/JsonText.h"
#include "tools/StorageTask.h"

namespace halvox::tools {
namespace {

using platform::Dictionary;
using platform::linux_::Failure;
using platform::linux_::StoreError;
using platform::linux_::StoreSizes;
using platform::linux_::VacuumState;

constexpr double kMebibyte = 1024.0 * 1024.0;

std::string sizeText(std::uint64_t bytes) {
  return shortNumber(std::round(static_cast<double>(bytes) / kMebibyte * 10) / 10) + " MiB";
}

class VacuumTask final : public StorageTask {
 public:
  VacuumTask(const VacuumStore& request, const CommonOptions& options, const ToolStreams& streams)
      : StorageTask("vacuum", options, streams), request_(request) {}

 private:
  client::Result<bool> begin(client::HalvoxConnection& connection) override {
    Dictionary wanted;
    if (request_.before) wanted.add("before", *request_.before);
    if (request_.toBytes) wanted.add("to", *request_.toBytes);
    return connection.beginVacuum(wanted);
  }
  client::Result<State> ask(client::HalvoxConnection& connection) override {
    return connection.vacuumState();
  }
  platform::linux_::Result<State, StoreError> workAlone(const Place& place) override {
    auto done = platform::linux_::vacuumStore(
        place.directory, StoreSizes::of(place.configuration.storage.maxMegabytes),
        {.before = request_.before, .toBytes = request_.toBytes},
        [&](const VacuumState& state) { place.progress(describe(state)); });
    if (!done) return std::move(done).error();
    return describe(*done);
  }
  std::string progressText(const State& state) override {
    return sizeText(numberIn(state, "bytes")) + " of " + sizeText(numberIn(state, "before"));
  }
  void showResult(const State& state) override {
    const std::uint64_t before = numberIn(state, "before");
    const std::uint64_t bytes = numberIn(state, "bytes");
    const bool isHeld = isSet(state, "log held");
    if (options().json) {
      output() << "{\"command\":\"vacuum\",\"result\":true,\"bytes_before\":" << before
               << ",\"bytes\":" << bytes << ",\"log_held\":" << (isHeld ? "true" : "false")
               << "}\n";
    } else {
      output() << "the database and its log: " << sizeText(before) << " before, " << sizeText(bytes)
               << " now\n";
    }
    if (isHeld) {
      complain().warn(
          "another program reads the database and keeps its log from being emptied; the service "
          "does that later");
    }
  }

  const VacuumStore& request_;
};

}  // namespace

ExitStatus vacuumStore(const VacuumStore& request, const CommonOptions& options,
                       const ToolStreams& streams) {
  return VacuumTask(request, options, streams).run();
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
