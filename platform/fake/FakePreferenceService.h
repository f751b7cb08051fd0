#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <vector>

#include "platform/preferences.h"

namespace halvox::platform {

// Settings that the test sets; none at first. Suites are domains of the user "mobile". Any thread
// may call. FakePlatform owns it.
class FakePreferenceService final : public PreferenceService {
 public:
  static constexpr std::string_view kSuiteUser = "mobile";

  // One look-up.
  struct Read {
    std::string user;
    std::string domain;
    std::string key;
    friend bool operator==(const Read&, const Read&) = default;
  };

  // Sets a value of the user "mobile".
  void set(std::string_view domain, std::string_view key, Value value);
  void remove(std::string_view domain, std::string_view key);
  // All look-ups since the last call, in order.
  std::vector<Read> takeReads();

  [[nodiscard]] std::optional<Value> CFPreferencesCopyValue(
      std::string_view key, std::string_view applicationID,
      std::string_view userName) const override;
  [[nodiscard]] std::optional<Value> suiteValue(std::string_view suiteName,
                                                std::string_view key) const override;

 private:
  mutable std::mutex mutex_;
  std::map<std::pair<std::string, std::string>, Value> values_;  // by domain and key
  mutable std::vector<Read> reads_;
};

}  // namespace halvox::platform
