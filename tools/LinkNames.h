#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "platform/linux/store/reading/StoreReader.h"

// The names of what the link stored as numbers.
namespace halvox::tools {

// The category of a stored link message with its domain, as --category takes it:
// "Session_Playback". A category that has no name is its number: "99", "Session_99". The link's own
// number has no domain; it comes from the tag that the session put into the payload
// ("Session_PlaybackStart"), where that agrees with the numbers.
std::string linkCategoryName(const platform::linux_::StoredRecord& message);

// The type of a stored link message, as --type takes it: "Start", or its number when it has no
// name.
std::string linkTypeName(const platform::linux_::StoredRecord& message);

// Whether the message is of one of the categories. A category without a domain stands for all
// domains; an empty list for all categories.
bool isOfCategory(const platform::linux_::StoredRecord& message,
                  std::span<const std::int64_t> categories);

}  // namespace halvox::tools
