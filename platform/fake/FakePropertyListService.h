#pragma once

#include <map>
#include <mutex>
#include <string>

#include "platform/property_list.h"

namespace halvox::platform {

// Property-list files that a test makes up. Any thread may call.
class FakePropertyListService final : public PropertyListService {
 public:
  // From now on the file of that path holds a property list with that root.
  void setFile(std::string path, Value root);
  // From now on the file of that path can be read but is no property list.
  void setBrokenFile(std::string path);
  void setCurrentDirectory(std::string path);

  [[nodiscard]] std::string currentDirectory() const override;
  [[nodiscard]] std::optional<Data> readFile(std::string_view path,
                                             std::optional<Error>& error) const override;
  [[nodiscard]] std::optional<Value> parse(const std::optional<Data>& bytes,
                                           std::optional<Error>& error) const override;

 private:
  mutable std::mutex mutex_;
  std::string currentDirectory_ = "/current";
  std::map<std::string, std::optional<Value>, std::less<>> files_;  // none: broken
};

}  // namespace halvox::platform
