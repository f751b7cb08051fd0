#include "tools/StoreRun.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <filesystem>
#include <limits>
#include <memory>
#include <system_error>
#include <utility>
#include <variant>

#include <poll.h>

#include "platform/linux/store/StoreSchema.h"
#include "tools/Pager.h"
#include "tools/ServiceConfiguration.h"
#include "tools/TerminalColour.h"
#include "tools/TextTable.h"

namespace halvox::tools {
namespace {

using platform::linux_::EventFollower;
using platform::linux_::Failure;
using platform::linux_::kStoreFileName;
using platform::linux_::RecordFilter;
using platform::linux_::RecordOrder;
using platform::linux_::Result;
using platform::linux_::StoreError;
using platform::linux_::StoreReader;

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

RowStyle styleOf(const StoreRun& run) {
  const auto width = terminalWidth(run.outputDescriptor);
  return {.form = run.form,
          .command = run.command,
          .width = width,
          .isUtc = run.selection.isUtc,
          .isFull = run.selection.isFull,
          .hasColour = width.has_value() && isColourWanted()};
}

void warnOfGap(const StoreRun& run) {
  Complaint(run.command, run.form, run.out, run.errors)
      .warn("rows are missing: the store removed them before they were read");
}

// Where a cursor's row is in the store.
enum class CursorPlace : std::uint8_t {
  kStored,
  kRemoved,        // the rows after it may be stored
  kOtherDatabase,  // the store was replaced, and its numbers began again
};

Result<CursorPlace, StoreError> findCursor(const RowCursor& cursor, StoreReader& reader,
                                           StoreReading& reading) {
  RecordFilter filter;
  filter.after = cursor.id - 1;
  std::optional<RowCursor> found;
  filter.isEnough = [&found] { return found.has_value(); };
  const auto read =
      reading.find(reader, filter, [&](platform::linux_::StoredRecordID id, double time) {
        found = RowCursor{cursor.command, id, time};
      });
  if (!read) return read.error();
  if (found) {
    if (found->id != cursor.id) return CursorPlace::kRemoved;
    return *found == cursor ? CursorPlace::kStored : CursorPlace::kOtherDatabase;
  }
  // Numbers only grow while a database exists, even if its rows are removed.
  return reader.lastRead() >= cursor.id ? CursorPlace::kRemoved : CursorPlace::kOtherDatabase;
}

// Makes the filter begin at the selection's cursor.
StoreReading::Outcome beginAtCursor(const StoreRun& run, StoreReader& reader, StoreReading& reading,
                                    RecordFilter& filter) {
  const RecordSelection& selection = run.selection;
  const bool isAfter = selection.afterCursor.has_value();
  const auto& cursor = isAfter ? selection.afterCursor : selection.cursor;
  if (!cursor) return reading.prepare(reader, std::nullopt, filter);
  const auto place = findCursor(*cursor, reader, reading);
  if (!place) return place.error();
  const Complaint complain(run.command, run.form, run.out, run.errors);
  if (*place == CursorPlace::kOtherDatabase) {
    complain.warn("another database has replaced the one of the cursor " + cursorText(*cursor) +
                  "; showing the rows by their times");
    const double next = std::nextafter(cursor->time, std::numeric_limits<double>::infinity());
    if (selection.isReversed) {
      const double end = isAfter ? cursor->time : next;
      filter.until = std::min(filter.until.value_or(end), end);
    } else {
      const double begin = isAfter ? next : cursor->time;
      filter.since = std::max(filter.since.value_or(begin), begin);
    }
    return reading.prepare(reader, std::nullopt, filter);
  }
  if (*place == CursorPlace::kRemoved) {
    complain.warn("the row of the cursor " + cursorText(*cursor) +
                  " was removed from the store; showing the rows after it");
  }
  if (selection.isReversed) {
    filter.before = cursor->id + 1;
  } else {
    filter.after = cursor->id - 1;
  }
  return reading.prepare(reader, isAfter ? std::optional(cursor->id) : std::nullopt, filter);
}

// Prints the cursor from which the next run continues: that of the last row, or the one with which
// this run began if there was no row.
void printCursor(const StoreRun& run, RowPrinter& printer) {
  if (!run.selection.showCursor || run.form == OutputForm::kJson) return;
  const auto last = printer.last();
  const auto& cursor = last ? last : run.selection.afterCursor;
  if (cursor) printer.out() << "-- cursor: " << cursorText(*cursor) << '\n';
}

ExitStatus follow(const StoreRun& run, const std::filesystem::path& directory, RecordFilter filter,
                  StoreReading& reading) {
  EventFollower follower;
  if (const auto opened = follower.open(directory, filter); !opened) {
    return cannotRead(run, opened.error());
  }
  filter.isEnough = [&run] { return !run.out; };
  if (const auto begun = beginAtCursor(run, follower.reader(), reading, filter); !begun) {
    return cannotRead(run, begun.error());
  }
  follower.beginWith(filter);
  RowPrinter printer(run.out, styleOf(run));
  do {
    const auto delivered = reading.printAdded(follower, printer);
    // Flushed after each batch, so that a reader of the pipe sees records at once.
    run.out << std::flush;
    if (!delivered) return cannotRead(run, delivered.error());
    if (follower.hasGap()) warnOfGap(run);
  } while (run.out && waitForRecords(follower.descriptor(), run.outputDescriptor));
  return ExitStatus::kDone;
}

ExitStatus printOnce(const StoreRun& run, const std::filesystem::path& directory,
                     RecordFilter filter, StoreReading& reading) {
  StoreReader reader;
  if (const auto opened = reader.open(directory); !opened) return cannotRead(run, opened.error());
  if (const auto begun = beginAtCursor(run, reader, reading, filter); !begun) {
    return cannotRead(run, begun.error());
  }
  // Measured before the pager starts: its pipe has no width.
  const RowStyle style = styleOf(run);
  std::unique_ptr<Pager> pager =
      run.selection.usePager ? Pager::start(run.outputDescriptor) : nullptr;
  std::ostream& out = pager ? pager->output() : run.out;
  filter.isEnough = [&out] { return !out; };
  RowPrinter printer(out, style);
  const auto read = reading.printAll(reader, filter, printer);
  printCursor(run, printer);
  out << std::flush;
  // Waits until the person quits. An error line would disturb the pager's screen before that.
  pager.reset();
  if (reader.hasGap()) warnOfGap(run);
  return read ? ExitStatus::kDone : cannotRead(run, read.error());
}

}  // namespace

std::variant<std::filesystem::path, ExitStatus> storeDirectory(const std::string& database,
                                                               const Complaint& complain,
                                                               std::string_view option) {
  if (database.empty()) return findStore(complain);
  const std::filesystem::path path(database);
  std::error_code ignored;
  if (std::filesystem::is_directory(path, ignored)) return path;
  // The file may be missing. The reader of the store reports that with its own reason.
  if (path.filename() == kStoreFileName) {
    return path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
  }
  return complain(ExitStatus::kBadArguments,
                  std::string(option) + ": " + database + " is not a store; expected a " +
                      std::string(kStoreFileName) + " or the directory that has one");
}

RecordFilter filterOf(const RecordSelection& selection) {
  RecordFilter filter;
  filter.names = selection.names;
  filter.since = selection.since;
  filter.until = selection.until;
  filter.newest = selection.last;
  const bool hasBegin =
      selection.since || selection.last || selection.cursor || selection.afterCursor;
  if (selection.follow && !hasBegin) filter.newest = kShownWhenFollowing;
  if (selection.isReversed) filter.order = RecordOrder::kNewestFirst;
  return filter;
}

StoreReading::Outcome StoreReading::prepare(
    StoreReader& /*reader*/, std::optional<platform::linux_::StoredRecordID> shownBefore,
    RecordFilter& filter) {
  if (!shownBefore) return {};
  if (filter.order == RecordOrder::kNewestFirst) {
    filter.before = *shownBefore;
  } else {
    filter.after = *shownBefore;
  }
  return {};
}

ExitStatus runOverStore(const StoreRun& run, RecordFilter filter, StoreReading& reading) {
  const Complaint complain(run.command, run.form, run.out, run.errors);
  for (const auto& cursor : {run.selection.cursor, run.selection.afterCursor}) {
    if (cursor && cursor->command != run.command) {
      return complain(ExitStatus::kBadArguments, "the cursor " + cursorText(*cursor) +
                                                     " names a row of another command; expected "
                                                     "one that begins with \"" +
                                                     run.command + ":\"");
    }
  }
  const auto directory = storeDirectory(run.selection.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  return run.selection.follow ? follow(run, path, std::move(filter), reading)
                              : printOnce(run, path, std::move(filter), reading);
}

}  // namespace halvox::tools
