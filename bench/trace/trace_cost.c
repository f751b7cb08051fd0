/* What a trace point costs whoever emits it, beside a tracepoint of LTTng with nothing around it.
 * Both take turns in short bursts, so that the tracer's buffers never fill and whatever else the
 * machine does meets both; the medians of the bursts are told, in nanoseconds. trace_cost.py runs
 * it without a tracer and with one that records as the service does. */

#define LTTNG_UST_TRACEPOINT_CREATE_PROBES
#define LTTNG_UST_TRACEPOINT_DEFINE
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <time.h>

#include "bench/trace/bare_provider.h"
#include "client/halvox_trace.h"

enum { kBursts = 400, kEvents = 5000 };
static const uint32_t kCode = 0x21040010;

static double now_nanoseconds(void) {
  struct timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return (double)now.tv_sec * 1e9 + (double)now.tv_nsec;
}

static double burst_of_ours(void) {
  const double start = now_nanoseconds();
  for (uint64_t event = 0; event < kEvents; ++event) {
    halvox_trace(kCode, event, 2, 3, 4);
    __asm__ volatile("" ::: "memory"); /* an emitter does other things between two of them */
  }
  return (now_nanoseconds() - start) / kEvents;
}

static double burst_of_bare(void) {
  const double start = now_nanoseconds();
  for (uint64_t event = 0; event < kEvents; ++event) {
    lttng_ust_tracepoint(halvox_bare, kdebug, kCode, event, 2, 3, 4);
    __asm__ volatile("" ::: "memory");
  }
  return (now_nanoseconds() - start) / kEvents;
}

static int compare(const void* left, const void* right) {
  const double difference = *(const double*)left - *(const double*)right;
  return (difference > 0) - (difference < 0);
}

static double median(double* values) {
  qsort(values, kBursts, sizeof *values, compare);
  return values[kBursts / 2];
}

int main(void) {
  static double ours[kBursts];
  static double bare[kBursts];
  const struct timespec pause = {0, 5 * 1000 * 1000};
  for (int burst = 0; burst < kBursts; ++burst) {
    /* The first one after a pause meets cold caches, so each goes first in half of the bursts. */
    if (burst % 2 == 0) ours[burst] = burst_of_ours();
    bare[burst] = burst_of_bare();
    if (burst % 2 != 0) ours[burst] = burst_of_ours();
    nanosleep(&pause, NULL);
  }
  const double of_ours = median(ours);
  const double of_bare = median(bare);
  printf("halvox_trace %.2f ns, bare tracepoint %.2f ns, ratio %.3f\n", of_ours, of_bare,
         of_ours / of_bare);
  return 0;
}
