#include "platform/fake/FakePlatform.h"

#include "platform/services.h"

namespace halvox::platform {

FakePlatform::FakePlatform() {
  installServices({.analytics = analytics,
                   .clock = clock,
                   .connections = connections,
                   .deviceProperties = deviceProperties,
                   .dispatch = dispatch,
                   .featureFlags = featureFlags,
                   .kdebug = kdebug,
                   .log = log,
                   .process = process,
                   .statistics = statistics});
}

FakePlatform::~FakePlatform() {
  connections.clear();
  dispatch.clear();
  analytics.clear();
  dispatch.clear();
}

}  // namespace halvox::platform
