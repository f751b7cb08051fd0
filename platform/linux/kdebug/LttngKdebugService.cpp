#include "platform/linux/kdebug/LttngKdebugService.h"

#include <cstdlib>
#include <string_view>
#include <system_error>

#include <dlfcn.h>

namespace halvox::platform::linux_ {

std::variant<std::unique_ptr<KdebugService>, std::string> LttngKdebugService::load(
    const std::filesystem::path& module) {
  if (module.empty()) return "this build has no LTTng provider";
  // LTTng would otherwise wait three seconds at the start for a session daemon that does not
  // answer.
  ::setenv("LTTNG_UST_REGISTER_TIMEOUT", "0", /*replace=*/0);
  void* const library = ::dlopen(module.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
  if (library == nullptr) return ::dlerror();
  void* const symbol = ::dlsym(library, "halvox_kdebug_emit");
  if (symbol == nullptr) return module.native() + " is not the provider";
  return std::unique_ptr<KdebugService>(new LttngKdebugService(reinterpret_cast<Emit>(symbol)));
}

std::filesystem::path LttngKdebugService::modulePath() {
  constexpr std::string_view kInstalled = HALVOX_KDEBUG_MODULE;
  if (kInstalled.empty()) return {};
  const std::filesystem::path installed(kInstalled);
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  auto beside = program.parent_path() / installed.filename();
  return !error && std::filesystem::exists(beside, error) ? beside : installed;
}

void LttngKdebugService::kdebug_trace(std::uint32_t code, std::uint64_t argument1,
                                      std::uint64_t argument2, std::uint64_t argument3,
                                      std::uint64_t argument4) {
  emit_(code, argument1, argument2, argument3, argument4);
}

}  // namespace halvox::platform::linux_
