#include "platform/linux/connection/LinuxConnectionService.h"

#include <utility>

#include "platform/linux/connection/ConnectionHost.h"

namespace halvox::platform::linux_ {

LinuxConnectionService::LinuxConnectionService(ConnectionOptions options,
                                               Backpressure& backpressure)
    : host_(std::make_unique<ConnectionHost>(std::move(options), backpressure)) {}

LinuxConnectionService::~LinuxConnectionService() = default;

Result<void, ConnectionOpenError> LinuxConnectionService::open() { return host_->open(); }

NSXPCListener& LinuxConnectionService::serviceListener() { return *host_; }

void LinuxConnectionService::requestStop() { host_->requestStop(); }

}  // namespace halvox::platform::linux_
