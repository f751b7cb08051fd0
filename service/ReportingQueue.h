#pragma once

#include <memory>

#include "platform/dispatch.h"

namespace halvox {

// The label of the reporting queue. Logs and counters show it.
extern const char* const gReportingQueueName;

// The serial queue of the process on which clients are registered and all requests are carried out.
// Null before the first delegate exists. Any thread may call.
[[nodiscard]] std::shared_ptr<platform::DispatchQueue> reportingQueue();

// Creates the queue. A later call replaces it; jobs of the old queue still run there.
void createReportingQueue();

}  // namespace halvox
