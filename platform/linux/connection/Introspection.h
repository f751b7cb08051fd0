#pragma once

#include <string>
#include <string_view>

#include "platform/connection.h"

namespace halvox::platform::linux_ {

// The introspection document (XML) of the exported object or of one of its parents, generated from
// the interface's table. `path` must be one of these.
std::string introspectionOf(const NSXPCInterface& interface, std::string_view path);

}  // namespace halvox::platform::linux_
