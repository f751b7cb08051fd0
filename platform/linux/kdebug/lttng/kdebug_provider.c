// The module that holds the tracepoint provider, apart from the service: loading LTTng starts its
// listener threads, and that is for the service to decide.

#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include "platform/linux/kdebug/lttng/kdebug_provider.h"

__attribute__((visibility("default"))) void halvox_kdebug_emit(uint32_t code, uint64_t arg1,
                                                               uint64_t arg2, uint64_t arg3,
                                                               uint64_t arg4);

void halvox_kdebug_emit(uint32_t code, uint64_t arg1, uint64_t arg2, uint64_t arg3, uint64_t arg4) {
  lttng_ust_tracepoint(halvox, kdebug, code, arg1, arg2, arg3, arg4);
}
