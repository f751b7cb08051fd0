#include "session/LinkDiscovery.h"

#include <string_view>
#include <utility>

#include "platform/dispatch.h"
#include "platform/services.h"

namespace halvox {
namespace {

constexpr std::string_view kQueueLabel = "com.tarno.halvox.session.discovery";

}  // namespace

void LinkDiscovery::awaitAnswer() {
  if (!isSecondCall()) return;
  // The queue is made only here, because an answer seldom comes before the wait. Its job logs and
  // signals, and cannot block.
  platform::dispatch()
      .createSerialQueue(kQueueLabel, platform::QualityOfService::kUtility,
                         platform::QueueThreading::kShared)
      ->async(platform::JobWeight::kBrief,
              [report = report_, backends = std::move(answered_)] { report(backends); });
}

void LinkDiscovery::answer(const Backends& backends) {
  answered_ = backends;
  if (isSecondCall()) report_(backends);
}

}  // namespace halvox
