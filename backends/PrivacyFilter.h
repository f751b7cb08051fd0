#pragma once

#include <string_view>

#include "platform/privacy.h"
#include "platform/value.h"

namespace halvox {

// The part of the functions below that works only if there are rules.
void dropKeys(platform::Dictionary& dictionary);
bool isKeyDropped(std::string_view key);

// Drops the entries whose keys the privacy rules do not allow, also in dictionaries and arrays
// within the dictionary. Requests of clients pass here once, when they arrive. What the service
// finds out itself passes here when it becomes a message, also the keys of volume messages, which
// the service makes from a client's messages. docs/privacy.md lists what is not reached.
//
// Without rules this is one check of a flag, which the compiler puts where it is called; nothing is
// copied. Any thread may call it.
inline void applyPrivacy(platform::Dictionary& dictionary) {
  if (platform::PrivacyService::anyKeyRules()) dropKeys(dictionary);
}

inline void applyPrivacy(platform::Message& message) {
  if (platform::PrivacyService::anyKeyRules() && message.has_value()) dropKeys(*message);
}

// Whether the rules drop entries of this key. For code that uses a value before the value becomes a
// message, for example in a line of the log. Any thread may call it.
inline bool isDropped(std::string_view key) {
  return platform::PrivacyService::anyKeyRules() && isKeyDropped(key);
}

}  // namespace halvox
