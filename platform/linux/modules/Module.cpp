#include "platform/linux/modules/Module.h"

#include <string>
#include <string_view>
#include <system_error>

#include <dlfcn.h>

#include "platform/linux/runtime/Version.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kVersionSymbol = "halvox_module_version";

std::string lastError() {
  const char* const error = ::dlerror();
  return error == nullptr ? "unknown error" : error;
}

}  // namespace

std::filesystem::path modulePath(const Module& module) {
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  const auto directory = program.parent_path();
  auto beside = directory / module.file;
  // A build that is not installed has its modules in the directory of the program. They take
  // precedence over installed ones, which may be of another build.
  if (std::filesystem::exists(beside, error)) return beside;
  // The path is relative to the program, so that an installation that was moved as a whole still
  // finds its modules.
  return (directory / HALVOX_MODULES_FROM_PROGRAM / module.file).lexically_normal();
}

Result<void*> loadModule(const Module& module) { return loadModule(module, modulePath(module)); }

Result<void*> loadModule(const Module& module, const std::filesystem::path& path) {
  const auto failure = [&](const std::string& why) {
    return Failure<>{std::string(module.file) + ": " + why};
  };
  // With RTLD_NOW, a symbol that the program does not have is an error here. It would otherwise end
  // the process at the first call.
  void* const library = ::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
  if (library == nullptr) return failure(lastError());
  // Check the version before the entry point, because a module of another release may have an entry
  // point of the same name.
  const auto* const version = static_cast<const char*>(::dlsym(library, kVersionSymbol));
  if (version == nullptr) return failure(path.native() + " is not a module of this service");
  if (std::string_view(version) != halvoxVersion()) {
    return failure(path.native() + " is of version " + version + ", the service is of version " +
                   halvoxVersion() + "; install both from one build");
  }
  void* const entryPoint = ::dlsym(library, module.entryPoint);
  if (entryPoint == nullptr) return failure(lastError());
  return entryPoint;
}

}  // namespace halvox::platform::linux_
