#include "platform/fake/FakePropertyListService.h"

#include <span>
#include <utility>

namespace halvox::platform {

void FakePropertyListService::setFile(std::string path, Value root) {
  const std::lock_guard lock(mutex_);
  files_.insert_or_assign(std::move(path), std::move(root));
}

void FakePropertyListService::setBrokenFile(std::string path) {
  const std::lock_guard lock(mutex_);
  files_.insert_or_assign(std::move(path), std::nullopt);
}

void FakePropertyListService::setCurrentDirectory(std::string path) {
  const std::lock_guard lock(mutex_);
  currentDirectory_ = std::move(path);
}

std::string FakePropertyListService::currentDirectory() const {
  const std::lock_guard lock(mutex_);
  return currentDirectory_;
}

// The bytes of a fake file are its path.
std::optional<Data> FakePropertyListService::readFile(std::string_view path,
                                                      std::optional<Error>& error) const {
  const std::lock_guard lock(mutex_);
  if (!files_.contains(path)) {
    error = Error{.description = "no file " + std::string(path)};
    return std::nullopt;
  }
  return Data(std::as_bytes(std::span(path)));
}

std::optional<Value> FakePropertyListService::parse(const std::optional<Data>& bytes,
                                                    std::optional<Error>& error) const {
  if (!bytes.has_value()) {
    error = Error{.description = "no bytes"};
    return std::nullopt;
  }
  const auto path = bytes->bytes();
  const std::lock_guard lock(mutex_);
  const auto file =
      files_.find(std::string_view(reinterpret_cast<const char*>(path.data()), path.size()));
  if (file == files_.end() || !file->second.has_value()) {
    error = Error{.description = "no property list"};
    return std::nullopt;
  }
  return file->second;
}

}  // namespace halvox::platform
