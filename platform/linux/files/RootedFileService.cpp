#include "platform/linux/files/RootedFileService.h"

#include <cerrno>
#include <climits>
#include <utility>

#include "platform/linux/files/FileError.h"
#include "platform/linux/files/RootedDirectory.h"
#include "platform/linux/files/UnfinishedFile.h"
#include "platform/linux/store/IndentedJsonArray.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kBufferBytes = 64 * 1024;

// Returns an errno if a file cannot have this name, and 0 otherwise.
int checkName(std::string_view name) {
  constexpr std::string_view kNotInNames("/\0", 2);
  if (name.empty() || name == "." || name == "..") return EINVAL;
  if (name.find_first_of(kNotInNames) != std::string_view::npos) return EINVAL;
  return name.size() > NAME_MAX ? ENAMETOOLONG : 0;
}

}  // namespace

class RootedJsonArrayFile final : public JsonArrayFile {
 public:
  RootedJsonArrayFile(RootedFileService::Counters counters, const RootedDirectory::Place& place,
                      std::string_view name)
      : counters_(counters), name_(name), path_(place.text() + "/" + name_) {
    counters_.begun.add();
    begin(place);
  }
  RootedJsonArrayFile(const RootedJsonArrayFile&) = delete;
  RootedJsonArrayFile& operator=(const RootedJsonArrayFile&) = delete;
  ~RootedJsonArrayFile() override {
    if (!isCommitted_) counters_.letGo.add();
  }

  void appendObject(std::string_view key, const Dictionary& value) override {
    if (error_.has_value()) return;
    json_.appendObject(key, value);
    takeText();
  }

  std::optional<Error> commit(std::string& path) override {
    if (!isCommitted_ && !error_.has_value()) finish();
    // Count the file only once, even if the caller calls commit() again.
    if (!isCommitted_) (error_.has_value() ? counters_.failed : counters_.written).add();
    isCommitted_ = true;
    if (!error_.has_value()) path = path_;
    return error_;
  }

 private:
  void begin(const RootedDirectory::Place& place) {
    if (const int error = checkName(name_)) return fail("use the name of", error);
    RootedDirectory directory = RootedDirectory::open(place);
    if (directory.error.has_value()) {
      error_ = std::move(directory.error);
    } else if (const int error = file_.begin(std::move(directory.descriptor))) {
      fail("create", error);
    }
  }

  // Collects text and writes it when there are at least kBufferBytes. Writing each object alone
  // would be slow, because an object is much shorter.
  void takeText() {
    buffer_ += json_.takeText();
    if (buffer_.size() >= kBufferBytes) flush();
  }

  void flush() {
    if (const int error = file_.write(buffer_)) fail("write", error);
    buffer_.clear();
  }

  void finish() {
    json_.end();
    takeText();
    if (!buffer_.empty()) flush();
    if (error_.has_value()) return;
    if (const int error = file_.finish(name_)) fail("finish", error);
  }

  // Frees the disk space of the file at once, because the disk may be full and the caller may keep
  // this object for long.
  void fail(std::string_view what, int systemError) {
    error_ = fileError(what, path_, systemError);
    file_.discard();
  }

  const RootedFileService::Counters counters_;
  const std::string name_;
  const std::string path_;
  IndentedJsonArray json_;
  std::string buffer_;
  UnfinishedFile file_;
  std::optional<Error> error_;
  bool isCommitted_ = false;
};

RootedFileService::RootedFileService(std::filesystem::path root, StatisticsService& statistics)
    : root_(std::move(root)),
      counters_{statistics.counter("files", "files begun"),
                statistics.counter("files", "files written"),
                statistics.counter("files", "files that failed"),
                statistics.counter("files", "files let go unfinished")} {}

std::optional<Error> RootedFileService::createDirectory(std::string_view path,
                                                        std::uint32_t permissions) {
  return RootedDirectory::make({root_, path}, permissions).error;
}

std::unique_ptr<JsonArrayFile> RootedFileService::createJsonArrayFile(std::string_view directory,
                                                                      std::string_view name) {
  return std::make_unique<RootedJsonArrayFile>(counters_, RootedDirectory::Place{root_, directory},
                                               name);
}

}  // namespace halvox::platform::linux_
