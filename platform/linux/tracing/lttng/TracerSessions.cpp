#include "platform/linux/tracing/lttng/TracerSessions.h"

#include <cstdlib>
#include <memory>

#include <lttng/lttng.h>

namespace halvox::platform::linux_ {

std::vector<std::string> tracerSessionNames() {
  lttng_session* sessions = nullptr;
  const int count = ::lttng_list_sessions(&sessions);
  const std::unique_ptr<lttng_session, decltype(&std::free)> owner(sessions, &std::free);
  std::vector<std::string> names;
  if (count > 0) names.reserve(static_cast<std::size_t>(count));
  for (int index = 0; index < count; ++index) names.emplace_back(sessions[index].name);
  return names;
}

void destroyTracerSessions(std::string_view prefix) {
  if (prefix.empty()) return;
  for (const std::string& name : tracerSessionNames()) {
    if (name.starts_with(prefix)) static_cast<void>(::lttng_destroy_session_no_wait(name.c_str()));
  }
}

}  // namespace halvox::platform::linux_
