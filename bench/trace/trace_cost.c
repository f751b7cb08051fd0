/* What a trace point costs whoever emits it, beside a tracepoint of LTTng with nothing around it.
 *
 *   halvox_trace_cost BURSTS EVENTS
 *
 * Two shapes of both: in a loop, where the compiler looks the trace's state up once, and alone in a
 * function, where it must do so at each call, which is then in the time too. All take turns in
 * short bursts, so that the tracer's buffers never fill and whatever else the machine does meets
 * all of them. Told are nanoseconds an event: the median of the bursts, and the least. The code is
 * position independent, as in the library of an audio framework, and laid out alike: see
 * CMakeLists.txt. trace_cost.py runs it without a tracer and with one that records as the service
 * does. */

#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <time.h>

#include "bench/trace/bare_provider.h"
#include "client/halvox_trace.h"

#define ALIKE __attribute__((noinline, aligned(64)))
/* An emitter does other things between two of them. */
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

/* Sorts both. */
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
    /* The first one after a pause meets cold caches, so each goes first in its turn. */
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
