// Emits one trace point for each line on standard input, for the tests of the tracepoint provider.
// Prints "ready" when the provider is loaded.

#include <iostream>
#include <memory>
#include <string>
#include <utility>

#include "platform/linux/kdebug/LttngKdebugService.h"

int main() {
  using halvox::platform::linux_::LttngKdebugService;

  auto loaded = LttngKdebugService::load();
  if (!loaded) {
    std::cerr << loaded.error().message << '\n';
    return 1;
  }
  const auto service = *std::move(loaded);
  std::cout << "ready" << std::endl;
  constexpr std::uint32_t kFirstCode = 0x21044814;
  constexpr std::uint32_t kStep = 4;
  std::uint32_t code = kFirstCode;
  for (std::string line; std::getline(std::cin, line); code += kStep) {
    service->kdebug_trace(code, 0, 1, 2, UINT64_MAX);
    std::cout << "emitted" << std::endl;
  }
  return 0;
}
