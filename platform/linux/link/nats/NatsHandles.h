#pragma once

#include <nats/nats.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

using NatsMessage = UniqueHandle<natsMsg*, natsMsg_Destroy>;
using NatsOptionsHandle = UniqueHandle<natsOptions*, natsOptions_Destroy>;
using NatsConnection = UniqueHandle<natsConnection*, natsConnection_Destroy>;
using JetStreamContext = UniqueHandle<jsCtx*, jsCtx_Destroy>;
using JetStreamInfo = UniqueHandle<jsStreamInfo*, jsStreamInfo_Destroy>;

}  // namespace halvox::platform::linux_
