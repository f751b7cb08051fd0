// Runs the service with the test's object in a process of its own, for tests that need one. Usage:
// TestServer <socket> [limit of descriptors]

#include <cstdio>
#include <cstdlib>

#include <sys/resource.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/connection/testing/TestInterface.h"

int main(int argc, char** argv) {
  using namespace halvox::platform;
  using namespace halvox::platform::linux_;
  if (argc < 2) return EXIT_FAILURE;
  if (argc > 2) {
    const rlim_t limit = std::strtoul(argv[2], nullptr, 10);
    const rlimit descriptors{.rlim_cur = limit, .rlim_max = limit};
    if (setrlimit(RLIMIT_NOFILE, &descriptors) != 0) return EXIT_FAILURE;
  }
  FakePlatform platform;
  Backpressure backpressure;
  TestDelegate delegate;
  ConnectionOptions options;
  options.socket = argv[1];
  LinuxConnectionService service(options, backpressure);
  if (const auto opened = service.open(); !opened) {
    std::fprintf(stderr, "%s\n", opened.error().message.c_str());
    constexpr int kFirstStatus = 10;
    return kFirstStatus + static_cast<int>(opened.error().code);
  }
  service.serviceListener().setDelegate(delegate);
  service.serviceListener().resume();
  return EXIT_SUCCESS;
}
