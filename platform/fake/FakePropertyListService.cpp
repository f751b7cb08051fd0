#include "platform/fake/FakePropertyListService.h"

#include <cstring>
#include <span>
#include <utility>

namespace halvox::platform {

void FakePropertyListService::set(std::string path, std::optional<Value> content) {
  const std::lock_guard lock(mutex_);
  files_.insert_or_assign(std::move(path), contents_.size());
  contents_.push_back(std::move(content));
}

void FakePropertyListService::setFile(std::string path, Value root) {
  set(std::move(path), std::move(root));
}

void FakePropertyListService::setBrokenFile(std::string path) {
  set(std::move(path), std::nullopt);
}

void FakePropertyListService::setCurrentDirectory(std::string path) {
  const std::lock_guard lock(mutex_);
  currentDirectory_ = std::move(path);
}

std::string FakePropertyListService::currentDirectory() const {
  const std::lock_guard lock(mutex_);
  return currentDirectory_;
}

std::optional<Data> FakePropertyListService::readFile(std::string_view path,
                                                      std::optional<Error>& error) const {
  const std::lock_guard lock(mutex_);
  const auto file = files_.find(path);
  if (file == files_.end()) {
    error = Error{.description = "no file " + std::string(path)};
    return std::nullopt;
  }
  return Data(std::as_bytes(std::span(&file->second, 1)));
}

std::optional<Value> FakePropertyListService::parse(const std::optional<Data>& bytes,
                                                    std::optional<Error>& error) const {
  if (!bytes.has_value()) {
    error = Error{.description = "no bytes"};
    return std::nullopt;
  }
  const std::lock_guard lock(mutex_);
  std::size_t number = contents_.size();
  const auto read = bytes->bytes();
  if (read.size() == sizeof number) std::memcpy(&number, read.data(), sizeof number);
  if (number >= contents_.size() || !contents_[number].has_value()) {
    error = Error{.description = "not a property list"};
    return std::nullopt;
  }
  return contents_[number];
}

}  // namespace halvox::platform
