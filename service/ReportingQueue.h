#pragma once

#include <memory>

#include "platform/dispatch.h"

namespace halvox {

// The label of the reporting queue.
extern const char* const gReportingQueueName;

// The one queue of the process on which clients are registered and all their requests are carried
// out, one at a time. Null before the first delegate was made. Any thread may ask.
[[nodiscard]] std::shared_ptr<platform::DispatchQueue> reportingQueue();

// Makes the queue; a later call puts a new one in the place of the old.
void createReportingQueue();

}  // namespace halvox
