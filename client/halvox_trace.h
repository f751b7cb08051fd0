#ifndef HALVOX_TRACE_H
#define HALVOX_TRACE_H

/** @file
 * Trace points for C and C++: marks with a code and four numbers. A trace of the Halvox reporting
 * service records them and matches them to intervals.
 *
 * @code{.c}
 *   halvox_trace(0x21040010, stream, 0, 0, 0);
 *   start_the_device();
 *   halvox_trace(0x21040014, stream, 0, 0, 0);
 * @endcode
 *
 * The service records the codes from 0x21040000 to 0x2104408A. While no trace runs, a trace point
 * only tests one number. While one runs, a trace point writes its numbers, the time, the thread and
 * the process into a buffer. It never blocks: an event that finds no room is lost, and the trace
 * counts it. Any thread may call halvox_trace(), including real-time threads.
 *
 * Link with -lhalvox-trace. The library loads the LTTng tracer, which has two threads in the
 * process; they sleep until a tracer's daemon runs. Built without LTTng, the library emits nothing.
 */

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Points to a number that is not 0 while a trace records these events. Only for halvox_trace(). */
extern const int* const halvox_trace_state;
/** Emits a trace point without testing whether a trace runs. Only for halvox_trace(). */
void halvox_trace_emit(uint32_t code, uint64_t argument1, uint64_t argument2, uint64_t argument3,
                       uint64_t argument4);

/** Emits one trace point if a trace runs. The program chooses the meaning of the arguments. */
static inline void halvox_trace(uint32_t code, uint64_t argument1, uint64_t argument2,
                                uint64_t argument3, uint64_t argument4) {
  /* Another thread may write the number at any time. One event more or less does not matter at that
   * moment. */
  if (__builtin_expect(__atomic_load_n(halvox_trace_state, __ATOMIC_RELAXED) != 0, 0)) {
    halvox_trace_emit(code, argument1, argument2, argument3, argument4);
  }
}

#ifdef __cplusplus
}
#endif

#endif
