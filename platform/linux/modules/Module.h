#pragma once

#include <filesystem>
#include <utility>

#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

// An optional part of the service, in a library of its own. A part with heavy libraries is a
// module, so that a service that does not use it neither maps nor initialises them.
struct Module {
  const char* file;  // such as "halvox-link-nats.so"
  // The function that makes the part. Its name ends with the version of its signature and of the
  // classes that it shares with the program. Raise the version whenever one of these changes.
  const char* entryPoint;
};

// The path of the module: in the program's directory if the module is there, as in a build tree,
// otherwise where it is installed.
[[nodiscard]] std::filesystem::path modulePath(const Module& module);

// Loads the module and returns the address of its entry point, or why it cannot be loaded. The
// error names the module, the path and the system's reason. A module of another version of the
// service is refused, because the classes that both share may differ. The module stays loaded until
// the process ends, because its libraries have threads, and objects of the service refer to its
// code. Blocks on the disk. Any thread may call.
[[nodiscard]] Result<void*> loadModule(const Module& module);
// Loads the module from that path, in the same way.
[[nodiscard]] Result<void*> loadModule(const Module& module, const std::filesystem::path& path);

// Loads the module and returns its entry point as a function of that type.
template <typename Function>
[[nodiscard]] Result<Function*> loadEntryPoint(const Module& module) {
  Result<void*> loaded = loadModule(module);
  if (!loaded) return std::move(loaded).error();
  return reinterpret_cast<Function*>(*loaded);
}

}  // namespace halvox::platform::linux_
