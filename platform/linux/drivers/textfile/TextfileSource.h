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

namespace halvox::platform::linux_ {

// What other daemons count and write as metrics into the files *.prom of one directory. A file that
// is wrong, too large or no file is left out as a whole, with one line in the log for each change
// of it, and so are the files for which no room is left. A file that did not change costs a look at
// its size and times. Files in the order of their names; of a channel that two files tell the first
// file's counts. A file that is deleted takes its channels with it: those of a file of the same
// name that comes later are others.
class TextfileSource final : public DriverSource {
 public:
  static constexpr std::size_t kMostFiles = 1000;
  // Of all files together, as what they tell is kept.
  static constexpr std::size_t kMostBytes = 8U << 20U;

  explicit TextfileSource(std::filesystem::path directory)
      : directory_(std::move(directory)), removedFiles_(directory_) {}

  [[nodiscard]] std::string_view name() const override { return "textfile"; }
  [[nodiscard]] std::shared_ptr<const Reading> read() override;

 private:
  using Channel = ReadingMaker::Channel;

  // By what a change of a file is noticed.
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
    bool isSettled = false;             // the state tells every further change
    std::optional<std::size_t> hash{};  // of the content, if it could be read
    bool isGood = false;
    std::vector<Channel> channels{};  // kept while the file is wrong, for their identity
    std::vector<std::vector<std::uint64_t>> values{};
    std::vector<bool> isShown{};  // false: a file before it tells the channel
    std::string complaint{};      // the last that was logged of this state
    std::uint64_t round = 0;
  };

  void forgetRemoved();
  void readEntry(int directory, const std::string& file, std::size_t& room, Entry& entry);
  void take(std::vector<MetricChannel>&& channels, Entry& entry);
  void complain(const std::string& file, const std::string& what, Entry& entry);
  [[nodiscard]] std::vector<std::string> list(int directory);
  void chooseChannels();

  const std::filesystem::path directory_;
  RemovedFiles removedFiles_;
  std::map<std::string, Entry> entries_;  // by file name
  std::uint64_t round_ = 0;
  bool hasToldOfTooMany_ = false;
  bool isChanged_ = false;  // some file, since the channels were chosen
  ReadingMaker readings_;
};

}  // namespace halvox::platform::linux_
