#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/property_list.h"

namespace halvox::platform {

// Property-list files that the test makes. The bytes of a file are the index of its content. If the
// file changes, bytes that were read earlier are therefore still parsed as the old content. Any
// thread may call. FakePlatform owns it.
class FakePropertyListService final : public PropertyListService {
 public:
  // Makes the file contain a property list with that root.
  void setFile(std::string path, Value root);
  // Makes the file readable, but not a property list.
  void setBrokenFile(std::string path);
  void setCurrentDirectory(std::string path);

  [[nodiscard]] std::string currentDirectory() const override;
  [[nodiscard]] std::optional<Data> readFile(std::string_view path,
                                             std::optional<Error>& error) const override;
  [[nodiscard]] std::optional<Value> parse(const std::optional<Data>& bytes,
                                           std::optional<Error>& error) const override;

 private:
  void set(std::string path, std::optional<Value> content);

  mutable std::mutex mutex_;
  std::string currentDirectory_ = "/current";
  std::map<std::string, std::size_t, std::less<>> files_;  // by path: the index of its content
  std::vector<std::optional<Value>> contents_;             // all contents so far; none: broken
};

}  // namespace halvox::platform
