#pragma once

#include <string>
#include <string_view>

#include "platform/connection.h"

namespace halvox::platform::linux_ {

// The introspection document of the exported object or of one of its parents, made from the table
// of the interface.
std::string introspectionOf(const NSXPCInterface& interface, std::string_view path);

}  // namespace halvox::platform::linux_
