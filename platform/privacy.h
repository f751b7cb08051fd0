#pragma once

#include <atomic>
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
  virtual ~PrivacyService() { setKeyRules(KeyRules::kNone); }

  // Whether a service of this process has rules. If this is false, no key needs to be compared.
  // Static and inline, because it is asked for each message: without rules a message costs this
  // check and no look-up of the service.
  [[nodiscard]] static bool anyKeyRules() {
    // Relaxed: the rules are set before the threads that ask are started.
    return servicesWithRules_.load(std::memory_order_relaxed) != 0;
  }
  // False if this service keeps every key.
  [[nodiscard]] bool hasKeyRules() const { return keyRules_ == KeyRules::kSome; }
  // Whether entries of this key must be dropped.
  [[nodiscard]] virtual bool dropsKey(std::string_view key) const = 0;

 protected:
  explicit PrivacyService(KeyRules keyRules) { setKeyRules(keyRules); }

  // For fakes, whose rules change. Call it before other threads use the service.
  void setKeyRules(KeyRules keyRules) {
    if (keyRules == keyRules_) return;
    keyRules_ = keyRules;
    servicesWithRules_.fetch_add(hasKeyRules() ? 1 : -1, std::memory_order_relaxed);
  }

 private:
  // A number, not a flag, because tests have several services, which end in any order.
  static inline std::atomic<int> servicesWithRules_ = 0;

  KeyRules keyRules_ = KeyRules::kNone;
};

}  // namespace halvox::platform
