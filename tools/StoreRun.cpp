#include "tools/StoreRun.h"

#include <array>
#include <filesystem>
#include <system_error>
#include <variant>

#include <poll.h>

#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::linux_::EventFollower;
using platform::linux_::Failure;
using platform::linux_::RecordFilter;
using platform::linux_::StoreError;
using platform::linux_::StoreReader;

constexpr const char* kDatabaseName = "halvox.db";
constexpr std::uint64_t kShownWhenFollowing = 10;

ExitStatus cannotRead(const StoreRun& run, const Failure<StoreError>& failure) {
  return Complaint(run.command, run.form, run.out, run.errors)(ExitStatus::kNoService,
                                                               failure.message, "no-store");
}

// Waits for the next records. Returns false when the output is closed.
bool waitForRecords(int storeDescriptor, int outputDescriptor) {
  // The output is polled for errors only. While no records come, nothing else shows that a pipe has
  // lost its reader.
  std::array<pollfd, 2> polled{{{storeDescriptor, POLLIN, 0}, {outputDescriptor, 0, 0}}};
  // Only a signal can make poll() fail here.
  while (poll(polled.data(), polled.size(), -1) < 0) {
  }
  return (polled[1].revents & (POLLERR | POLLHUP | POLLNVAL)) == 0;
}

ExitStatus follow(const StoreRun& run, const std::filesystem::path& directory,
                  const RecordFilter& filter, const StoreReading& reading) {
  EventFollower follower;
  if (const auto opened = follower.open(directory, filter); !opened) {
    return cannotRead(run, opened.error());
  }
  do {
    const auto delivered = reading.added(follower);
    // Flushed after each batch, so that a reader of the pipe sees records at once.
    run.out << std::flush;
    if (!delivered) return cannotRead(run, delivered.error());
  } while (run.out && waitForRecords(follower.descriptor(), run.outputDescriptor));
  return ExitStatus::kDone;
}

}  // namespace

std::variant<std::filesystem::path, ExitStatus> storeDirectory(const std::string& database,
                                                               const Complaint& complain) {
  if (database.empty()) return findStore(complain);
  const std::filesystem::path path(database);
  std::error_code ignored;
  if (std::filesystem::is_directory(path, ignored)) return path;
  // The file may be missing. The reader of the store reports that with its own reason.
  if (path.filename() == kDatabaseName) {
    return path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
  }
  return complain(ExitStatus::kBadArguments, "--database: " + database +
                                                 " is not a store; expected a " + kDatabaseName +
                                                 " or the directory that has one");
}

RecordFilter filterOf(const RecordSelection& selection) {
  RecordFilter filter;
  filter.names = selection.names;
  filter.since = selection.since;
  filter.until = selection.until;
  filter.newest = selection.last;
  if (selection.follow && !selection.since && !selection.last) filter.newest = kShownWhenFollowing;
  return filter;
}

ExitStatus runOverStore(const StoreRun& run, const RecordFilter& filter,
                        const StoreReading& reading) {
  const auto directory =
      storeDirectory(run.selection.database, {run.command, run.form, run.out, run.errors});
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  if (run.selection.follow) return follow(run, path, filter, reading);

  StoreReader reader;
  if (const auto opened = reader.open(path); !opened) return cannotRead(run, opened.error());
  const auto read = reading.all(reader, filter);
  run.out << std::flush;
  return read ? ExitStatus::kDone : cannotRead(run, read.error());
}

}  // namespace halvox::tools
