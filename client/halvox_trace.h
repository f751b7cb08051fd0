#ifndef HALVOX_TRACE_H
#define HALVOX_TRACE_H

/* Trace points for C and C++: marks with a code and four numbers, which a trace of the Halvox
 * reporting service records and matches to intervals.
 *
 *   halvox_trace(0x21040010, stream, 0, 0, 0);
 *   start_the_device();
 *   halvox_trace(0x21040014, stream, 0, 0, 0);
 *
 * The service records the codes from 0x21040000 to 0x2104408A. While no trace runs, a trace point
 * looks at one number and goes on. While one does, it writes the time, the thread and the process
 * beside its numbers into a buffer and never waits: an event that finds no room is lost, and
 * counted by the trace. Any thread may call, also a real-time one.
 *
 * Link with -lhalvox-trace. The library loads the LTTng tracer, which has two threads in the
 * process that sleep until a tracer's daemon runs. Built without LTTng it emits nothing. */

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Not 0 while a trace records these events. For halvox_trace() alone. */
extern const int* const halvox_trace_state;
/* Emits in any case. For halvox_trace() alone. */
void halvox_trace_emit(uint32_t code, uint64_t argument1, uint64_t argument2, uint64_t argument3,
                       uint64_t argument4);

/* Emits one trace point if a trace runs. */
static inline void halvox_trace(uint32_t code, uint64_t argument1, uint64_t argument2,
                                uint64_t argument3, uint64_t argument4) {
  /* Another thread writes it at any time; an event more or less then does not matter. */
  if (__builtin_expect(__atomic_load_n(halvox_trace_state, __ATOMIC_RELAXED) != 0, 0)) {
    halvox_trace_emit(code, argument1, argument2, argument3, argument4);
  }
}

#ifdef __cplusplus
}
#endif

#endif
