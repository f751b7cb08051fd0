#include "platform/fake/FakeFileService.h"

#include <algorithm>
#include <stdexcept>

namespace halvox::platform {
namespace {

bool isFileName(const std::string& name) {
  constexpr std::size_t kLongest = 255;
  const bool hasOther = name.find('/') != std::string::npos || name.find('\0') != std::string::npos;
  return !name.empty() && name != "." && name != ".." && !hasOther && name.size() <= kLongest;
}

}  // namespace

class FakeJsonArrayFile final : public JsonArrayFile {
 public:
  FakeJsonArrayFile(FakeFileService& service, FakeFileService::File file)
      : service_(service), file_(std::move(file)) {}

  void appendObject(std::string_view key, const Dictionary& value) override {
    if (isCommitted_) throw std::logic_error("an object was added to a committed file");
    service_.step("object " + std::string(key) + " = " + describe(value));
    file_.objects.emplace_back(key, value);
  }
  std::optional<Error> commit(std::string& path) override {
    if (isCommitted_) throw std::logic_error("a file was committed twice");
    isCommitted_ = true;
    service_.step("commit");
    std::string name = "/root" + file_.directory + "/" + file_.name;
    auto error = service_.add(std::move(file_));
    if (!error.has_value()) path = std::move(name);
    return error;
  }

 private:
  FakeFileService& service_;
  FakeFileService::File file_;
  bool isCommitted_ = false;
};

void FakeFileService::setDirectoryError(std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  directoryError_ = std::move(error);
}

void FakeFileService::setFileError(std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  fileError_ = std::move(error);
}

std::map<std::string, std::uint32_t> FakeFileService::directories() const {
  const std::lock_guard lock(mutex_);
  return directories_;
}

std::vector<FakeFileService::File> FakeFileService::files() const {
  const std::lock_guard lock(mutex_);
  return files_;
}

std::vector<std::string> FakeFileService::steps() const {
  const std::lock_guard lock(mutex_);
  return steps_;
}

std::optional<Error> FakeFileService::createDirectory(std::string_view path,
                                                      std::uint32_t permissions) {
  step("directory " + std::string(path) + " " + std::to_string(permissions));
  const std::lock_guard lock(mutex_);
  known_.emplace(path);
  if (directoryError_.has_value()) return directoryError_;
  directories_.emplace(path, permissions);  // an existing directory keeps its permissions
  return std::nullopt;
}

std::unique_ptr<JsonArrayFile> FakeFileService::createJsonArrayFile(std::string_view directory,
                                                                    std::string_view name) {
  step("file " + std::string(directory) + "/" + std::string(name));
  return std::make_unique<FakeJsonArrayFile>(
      *this, FakeFileService::File{std::string(directory), std::string(name)});
}

void FakeFileService::step(std::string text) {
  journal_.record(JournalKind::kFile, text);
  const std::lock_guard lock(mutex_);
  steps_.push_back(std::move(text));
}

std::optional<Error> FakeFileService::add(File file) {
  const std::lock_guard lock(mutex_);
  if (fileError_.has_value()) return fileError_;
  if (!isFileName(file.name)) return Error{.description = "not a file name: " + file.name};
  const auto isInside = [&](const std::string& known) {
    return (known + "/").starts_with(file.directory + "/");
  };
  if (std::ranges::none_of(known_, isInside)) {
    return Error{.description = "no such directory: " + file.directory};
  }
  std::erase_if(files_, [&](const File& other) {
    return other.directory == file.directory && other.name == file.name;
  });
  files_.push_back(std::move(file));
  return std::nullopt;
}

}  // namespace halvox::platform
