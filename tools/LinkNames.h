#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "platform/linux/store/reading/StoreReader.h"

// Names of the numbers in stored link messages.
namespace halvox::tools {

// Returns the category of a stored message with its domain, in the form of --category:
// "Session_Playback". A category without a name is its number: "99", "Session_99". The stored
// number has no domain; the domain comes from the tag that the session put into the payload
// ("Session_PlaybackStart"), if the tag agrees with the numbers.
std::string linkCategoryName(const platform::linux_::StoredRecord& message);

// Returns the type of a stored message in the form of --type: "Start", or its number if it has no
// name.
std::string linkTypeName(const platform::linux_::StoredRecord& message);

// Returns true if the message has one of the categories. A category without a domain matches every
// domain; an empty list matches every category.
bool isOfCategory(const platform::linux_::StoredRecord& message,
                  std::span<const std::int64_t> categories);

}  // namespace halvox::tools
