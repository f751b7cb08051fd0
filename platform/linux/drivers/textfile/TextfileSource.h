#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <sys/stat.h>

#include "platform/linux/drivers/DriverSource.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/textfile/MetricChannels.h"
#include "platform/linux/drivers/textfile/RemovedFiles.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// Reads what other daemons count, from files with metrics in one directory (*.prom).
//
// A file that has an error, is too large or is not a regular file is skipped as a whole, and logged
// once for each change of the file. Files beyond the total size are treated in the same way. If two
// files have the same channel, the one that sorts first by name is used. A file that is deleted
// takes its channels with it. A later file of the same name has new channels.
//
// A file that has not changed is not read again; its size and times are compared. Its SourceReader
// owns the source and calls it on one thread.
class TextfileSource final : public DriverSource {
 public:
  static constexpr std::size_t kMostFiles = 1000;
  // The limit for all files together, because the content of all of them is kept in memory. With
  // fifty files of 1 MiB, the service used half a gigabyte.
  static constexpr std::size_t kMostBytes = 8U << 20U;

  // `log` must outlive the source.
  TextfileSource(std::filesystem::path directory, LogCategory& log)
      : directory_(std::move(directory)),
        log_(log, "TextfileSource"),
        removedFiles_(directory_, log) {}

  [[nodiscard]] std::string_view name() const override { return "textfile"; }
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

 private:
  using Channel = ReadingMaker::Channel;

  // A file has changed if one of these has.
  struct State {
    int error = 0;
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    std::int64_t changedAt = 0;  // nanoseconds since 1970
    bool hasRoom = true;
    friend bool operator==(const State&, const State&) = default;
  };
  struct Entry {
    State state{};
    bool isSettled = false;             // any further change will show in the state
    std::optional<std::size_t> hash{};  // of the content, if it could be read
    bool isGood = false;
    std::vector<Channel> channels{};  // kept while the file has an error, for their identity
    std::vector<std::vector<std::uint64_t>> values{};
    std::vector<bool> isShown{};  // false if an earlier file has the same channel
    std::string complaint{};      // the latest log line about this state
    std::uint64_t round = 0;
  };

  void forgetRemoved();
  void readEntry(int directory, const std::string& file, std::size_t& room, Entry& entry);
  void take(std::vector<MetricChannel>&& channels, Entry& entry);
  void complain(const std::string& file, const std::string& what, Entry& entry);
  [[nodiscard]] std::vector<std::string> list(int directory);
  void chooseChannels();

  const std::filesystem::path directory_;
  const ObjectLog log_;
  RemovedFiles removedFiles_;
  std::map<std::string, Entry> entries_;  // by file name
  std::uint64_t round_ = 0;
  bool isExcessLogged_ = false;
  bool isChanged_ = false;  // a file has changed since the channels were chosen
  ReadingMaker readings_;
};

}  // namespace halvox::platform::linux_
