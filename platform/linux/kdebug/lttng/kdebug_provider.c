// The tracepoint provider as a module of its own, because loading LTTng starts its listener
// threads, and the service decides whether to do so.

#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include "platform/linux/kdebug/lttng/kdebug_provider.h"

__attribute__((visibility("default"))) void halvox_kdebug_lttng_1(uint32_t code, uint64_t arg1,
                                                                  uint64_t arg2, uint64_t arg3,
                                                                  uint64_t arg4);

void halvox_kdebug_lttng_1(uint32_t code, uint64_t arg1, uint64_t arg2, uint64_t arg3,
                           uint64_t arg4) {
  lttng_ust_tracepoint(halvox, kdebug, code, arg1, arg2, arg3, arg4);
}
