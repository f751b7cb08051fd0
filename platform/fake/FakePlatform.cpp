#include "platform/fake/FakePlatform.h"

#include "platform/fake/ServicesOf.h"

namespace halvox::platform {

FakePlatform::FakePlatform() { installServices(servicesWith(analytics)); }

Services FakePlatform::servicesWith(AnalyticsService& otherAnalytics) {
  return servicesOf(*this, otherAnalytics);
}

FakePlatform::~FakePlatform() {
  connections.clear();
  tlmReporting.clear();
  notify.clear();
  dispatch.clear();
  analytics.clear();
  dispatch.clear();
}

}  // namespace halvox::platform
