#pragma once

#include <string>
#include <string_view>

#include "platform/connection.h"

namespace halvox::platform::linux_ {

// Returns the introspection document (XML) of `path`, generated from the interface's table. `path`
// must be that of the exported object or of one of its parents.
std::string introspectionOf(const NSXPCInterface& interface, std::string_view path);

}  // namespace halvox::platform::linux_
