#include "service/ReportingQueue.h"

#include "platform/services.h"
#include "session/Guarded.h"

namespace halvox {
namespace {

using SharedQueue = Guarded<std::shared_ptr<platform::DispatchQueue>>;

SharedQueue& slot() {
  // Never destroyed, because connections may still queue work while the process exits.
  static auto* queue = new SharedQueue;
  return *queue;
}

}  // namespace

const char* const gReportingQueueName = "com.tarno.halvox.reporting.server";

std::shared_ptr<platform::DispatchQueue> reportingQueue() { return slot().copy(); }

void createReportingQueue() {
  // The queue has a thread of its own, because some requests wait: a stop can wait for a trace or a
  // file.
  slot().set(platform::dispatch().createSerialQueue(gReportingQueueName,
                                                    platform::QualityOfService::kUserInteractive,
                                                    platform::QueueThreading::kOwnThread));
}

}  // namespace halvox
