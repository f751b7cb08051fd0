#pragma once

#include <functional>
#include <set>
#include <string>
#include <string_view>

#include "platform/privacy.h"

namespace halvox::platform {

// Drops the keys that the test names; none at first. Set them before other threads run.
// FakePlatform owns it.
class FakePrivacyService final : public PrivacyService {
 public:
  FakePrivacyService() : PrivacyService(KeyRules::kNone) {}

  void drop(std::string_view key) {
    dropped_.emplace(key);
    setKeyRules(KeyRules::kSome);
  }

  [[nodiscard]] bool dropsKey(std::string_view key) const override {
    return dropped_.contains(key);
  }

 private:
  std::set<std::string, std::less<>> dropped_;
};

}  // namespace halvox::platform
