/* The cost of a trace point for the program that emits it, compared with a bare LTTng tracepoint.
 *
 *   halvox_trace_cost BURSTS EVENTS
 *
 * Measures both in two shapes. In a loop, the code loads the address of the trace's state once.
 * Alone in a function, it does so at each call, and the call and the return are in the time too.
 * All four variants take turns in short bursts, so that the tracer's buffers never fill and other
 * work on the machine affects all alike. Prints nanoseconds an event: the median and the minimum of
 * the bursts. The code is position independent, as in the library of an audio framework, and has
 * the same layout in all variants: see CMakeLists.txt. trace_cost.py runs this without a tracer,
 * and with one that records as the service does. */

#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <time.h>

#include "bench/trace/bare_provider.h"
#include "client/halvox_trace.h"

#define ALIKE __attribute__((noinline, aligned(64)))
/* Keeps the compiler from merging two trace points; a real program does other work between them. */
#define OTHER_THINGS __asm__ volatile("" ::: "memory")

enum { kShapes = 4 };
static const uint32_t kCode = 0x21040010;

static double now_nanoseconds(void) {
  struct timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return (double)now.tv_sec * 1e9 + (double)now.tv_nsec;
}

static ALIKE void loop_of_ours(uint64_t events) {
  for (uint64_t event = 0; event < events; ++event) {
    halvox_trace(kCode, event, 2, 3, 4);
    OTHER_THINGS;
  }
}

static ALIKE void loop_of_bare(uint64_t events) {
  for (uint64_t event = 0; event < events; ++event) {
    lttng_ust_tracepoint(halvox_bare, kdebug, kCode, event, 2, 3, 4);
    OTHER_THINGS;
  }
}

static ALIKE void one_of_ours(uint64_t event) { halvox_trace(kCode, event, 2, 3, 4); }

static ALIKE void one_of_bare(uint64_t event) {
  lttng_ust_tracepoint(halvox_bare, kdebug, kCode, event, 2, 3, 4);
}

static ALIKE void calls_of_ours(uint64_t events) {
  for (uint64_t event = 0; event < events; ++event) one_of_ours(event);
}

static ALIKE void calls_of_bare(uint64_t events) {
  for (uint64_t event = 0; event < events; ++event) one_of_bare(event);
}

static double burst(void (*run)(uint64_t), uint64_t events) {
  const double start = now_nanoseconds();
  run(events);
  return (now_nanoseconds() - start) / (double)events;
}

static int compare(const void* left, const void* right) {
  const double difference = *(const double*)left - *(const double*)right;
  return (difference > 0) - (difference < 0);
}

/* Prints the medians and the minima. Sorts both arrays. */
static void tell(const char* shape, double* ours, double* bare, size_t bursts) {
  qsort(ours, bursts, sizeof *ours, compare);
  qsort(bare, bursts, sizeof *bare, compare);
  const size_t middle = bursts / 2;
  printf(
      "  %-13s halvox_trace %.3f ns (least %.3f), bare tracepoint %.3f ns (least %.3f), "
      "ratio %.3f (least %.3f)\n",
      shape, ours[middle], ours[0], bare[middle], bare[0], ours[middle] / bare[middle],
      ours[0] / bare[0]);
}

int main(int count, char** arguments) {
  if (count != 3) return fprintf(stderr, "usage: halvox_trace_cost BURSTS EVENTS\n"), 2;
  const size_t bursts = strtoul(arguments[1], NULL, 10);
  const uint64_t events = strtoul(arguments[2], NULL, 10);
  void (*const runs[kShapes])(uint64_t) = {loop_of_ours, loop_of_bare, calls_of_ours,
                                           calls_of_bare};
  double* const times[kShapes] = {calloc(bursts, sizeof(double)), calloc(bursts, sizeof(double)),
                                  calloc(bursts, sizeof(double)), calloc(bursts, sizeof(double))};
  const struct timespec pause = {0, 5 * 1000 * 1000};
  for (size_t round = 0; round < bursts; ++round) {
    /* The first variant after a pause has cold caches, so each round starts with another one. */
    for (size_t turn = 0; turn < kShapes; ++turn) {
      const size_t shape = (round + turn) % kShapes;
      times[shape][round] = burst(runs[shape], events);
    }
    nanosleep(&pause, NULL);
  }
  tell("in a loop:", times[0], times[1], bursts);
  tell("in functions:", times[2], times[3], bursts);
  for (size_t shape = 0; shape < kShapes; ++shape) free(times[shape]);
  return 0;
}
