#include "tools/export/ExportOutput.h"

#include <cerrno>
#include <cstddef>
#include <optional>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;
using platform::linux_::errnoText;
using platform::linux_::Failure;
using platform::linux_::Result;
using platform::linux_::UniqueFd;

class StreamOutput final : public ExportOutput {
 public:
  explicit StreamOutput(std::ostream& stream) : stream_(stream) {}

  Result<void> write(std::string_view bytes) override {
    stream_.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    return outcome();
  }
  Result<void> finish() override {
    stream_.flush();
    return outcome();
  }

 private:
  [[nodiscard]] Result<void> outcome() const {
    if (!stream_) return Failure<>{"the standard output cannot be written"};
    return {};
  }

  std::ostream& stream_;
};

class FileOutput final : public ExportOutput {
 public:
  FileOutput(fs::path file, NewFile::Existing existing)
      : path_(std::move(file)), existing_(existing) {}

  Result<void> write(std::string_view bytes) override {
    if (!file_) file_.emplace(path_);
    if (!file_->append(bytes)) return failure();
    return {};
  }
  Result<void> finish() override {
    // An export without records may have no bytes.
    if (!file_) file_.emplace(path_);
    if (!file_->complete(modeOfNewFile()) || !file_->keepAs(path_, existing_)) return failure();
    return {};
  }

 private:
  [[nodiscard]] Failure<> failure() const { return {path_.native() + ": " + errnoText(errno)}; }

  const fs::path path_;
  const NewFile::Existing existing_;
  std::optional<NewFile> file_;
};

// A pipe or a device. Replacing it by a file would take it away from the programs that use it.
class DirectOutput final : public ExportOutput {
 public:
  explicit DirectOutput(fs::path file) : path_(std::move(file)) {}

  Result<void> write(std::string_view bytes) override {
    // Opening a pipe waits until a program reads it.
    if (!descriptor_) descriptor_.reset(::open(path_.c_str(), O_WRONLY | O_CLOEXEC));
    if (!descriptor_) return failure();
    while (!bytes.empty()) {
      const ssize_t count = ::write(descriptor_.get(), bytes.data(), bytes.size());
      if (count < 0 && errno == EINTR) continue;
      if (count < 0) return failure();
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return {};
  }
  Result<void> finish() override { return write({}); }

 private:
  [[nodiscard]] Failure<> failure() const { return {path_.native() + ": " + errnoText(errno)}; }

  const fs::path path_;
  UniqueFd descriptor_;
};

}  // namespace

std::unique_ptr<ExportOutput> makeStreamOutput(std::ostream& stream) {
  return std::make_unique<StreamOutput>(stream);
}

std::unique_ptr<ExportOutput> makeFileOutput(const fs::path& file, NewFile::Existing existing) {
  std::error_code ignored;
  const fs::file_status status = fs::status(file, ignored);
  if (fs::exists(status) && !fs::is_regular_file(status) && !fs::is_directory(status)) {
    return std::make_unique<DirectOutput>(file);
  }
  return std::make_unique<FileOutput>(file, existing);
}

}  // namespace halvox::tools
