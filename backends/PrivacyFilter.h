#pragma once

#include "platform/value.h"

namespace halvox {

// Drops the entries whose keys the privacy rules do not allow, also in dictionaries and arrays
// within the dictionary. Requests of clients pass here once, when they arrive. What the service
// finds out itself passes here when it becomes a message. Keys that the service makes later, out of
// a message, do not pass here. docs/privacy.md lists what is not reached. Without rules this calls
// a few small functions and takes predictable branches; nothing is copied. Any thread may call it.
void applyPrivacy(platform::Dictionary& dictionary);
void applyPrivacy(platform::Message& message);

}  // namespace halvox
