#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"

namespace halvox::platform::linux_ {

// The place of an event in the order in which events were stored. Numbers only grow, with gaps.
using StoredEventID = std::int64_t;

// Which events to read; what is not set does not restrict.
struct EventFilter {
  std::string name = "*";                 // a glob pattern as fnmatch(3) understands it
  std::optional<double> since{};          // seconds since 1970, included
  std::optional<double> until{};          // seconds since 1970, not included
  StoredEventID after = 0;                // only events stored later than this one
  std::optional<std::uint64_t> newest{};  // only so many, the newest
};

// An event as it is stored. The views are valid during the callback.
struct StoredEvent {
  StoredEventID id;
  double time;  // seconds since 1970
  std::string_view name;
  std::string_view payload;  // JSON text
};

// Reads a store, while a service writes to it or when none runs, and never changes it.
// Belongs to one thread. Holds no lock and no snapshot while a callback runs, so a slow reader does
// not keep the service from tidying up its files.
class StoreReader {
 public:
  using EventCallback = std::function<void(const StoredEvent&)>;

  // Opens the store in that directory: kMissing when there is none, kDamaged, kNewerVersion or
  // kCannotOpen. May be called again, after an error or for another directory.
  [[nodiscard]] std::optional<StoreError> open(const std::filesystem::path& directory);

  // Calls back for each event that passes the filter, in the order of storing, newest last. Waits
  // for the database at most a second, should it be locked.
  [[nodiscard]] std::optional<StoreError> forEachEvent(const EventFilter& filter,
                                                       const EventCallback& callback);

  // True when none is open, or the store's path leads to another database than it did, or to none;
  // then opening again helps, and event numbers may begin anew.
  [[nodiscard]] bool isReplaced() const;

 private:
  [[nodiscard]] StoreError failure(SqliteCode code) const;
  [[nodiscard]] std::optional<StoreError> openDatabase();
  [[nodiscard]] SqliteCode openFile();

  std::optional<StoreFiles> files_;
  Database database_;
  std::optional<FileIdentity> identity_;
};

}  // namespace halvox::platform::linux_
