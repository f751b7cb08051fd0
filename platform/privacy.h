#pragma once

#include <string_view>

namespace halvox::platform {

// What the owner of this machine does not want to be stored or sent. The configuration says it.
//
// Any thread may call; nothing blocks, and nothing fails. The composition root owns the service.
class PrivacyService {
 public:
  enum class KeyRules : bool { kNone, kSome };

  PrivacyService(const PrivacyService&) = delete;
  PrivacyService& operator=(const PrivacyService&) = delete;
  virtual ~PrivacyService() = default;

  // False if every key is kept. Not virtual, because it is asked for every message.
  [[nodiscard]] bool hasKeyRules() const { return keyRules_ == KeyRules::kSome; }
  // Whether entries of this key must be dropped.
  [[nodiscard]] virtual bool dropsKey(std::string_view key) const = 0;

 protected:
  explicit PrivacyService(KeyRules keyRules) : keyRules_(keyRules) {}
  void setKeyRules(KeyRules keyRules) { keyRules_ = keyRules; }

 private:
  KeyRules keyRules_;
};

}  // namespace halvox::platform
