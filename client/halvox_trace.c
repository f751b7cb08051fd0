#include "client/halvox_trace.h"

#ifdef HALVOX_TRACE_BY_LTTNG

/* Uses the definition of the service's own provider: both must emit the same event. */
#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include "platform/linux/kdebug/lttng/kdebug_provider.h"

const int* const halvox_trace_state = &lttng_ust_tracepoint_halvox___kdebug.state;

void halvox_trace_emit(uint32_t code, uint64_t argument1, uint64_t argument2, uint64_t argument3,
                       uint64_t argument4) {
  lttng_ust_do_tracepoint(halvox, kdebug, code, argument1, argument2, argument3, argument4);
}

#else

static const int nobody_traces = 0;
const int* const halvox_trace_state = &nobody_traces;

void halvox_trace_emit(uint32_t code, uint64_t argument1, uint64_t argument2, uint64_t argument3,
                       uint64_t argument4) {
  (void)code;
  (void)argument1;
  (void)argument2;
  (void)argument3;
  (void)argument4;
}

#endif
