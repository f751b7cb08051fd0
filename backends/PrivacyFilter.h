#pragma once

#include "platform/value.h"

namespace halvox {

// Drops the entries whose keys the privacy rules do not allow, also in dictionaries and arrays
// within the dictionary. Everything that can be stored, sent or logged passes here once, as early
// as possible: requests of clients when they arrive, and what the service finds out itself when it
// makes a message of it. Later code therefore never sees the entries and needs no rule of its own.
// Without rules it costs one branch. Any thread may call it.
void applyPrivacy(platform::Dictionary& dictionary);
void applyPrivacy(platform::Message& message);

}  // namespace halvox
