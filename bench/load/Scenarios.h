#pragma once

#include <cstdint>
#include <vector>

#include "bench/load/LoadClient.h"
#include "bench/load/Report.h"
#include "bench/load/Server.h"

namespace halvox::bench {

struct LoadOptions {
  ServerPrograms programs;
  std::int64_t messages = 200'000;
  std::int64_t window = 64;
  int clients = 4;  // the number of clients for memory and latency under load
  int rounds = 3;   // of throughput; in each round echo and service take turns
  // What grows in the scenario of growth.
  std::int64_t sessions = 10'000;
  int idleConnections = 1000;
  int busyClients = 64;
  std::int64_t history = 1'000'000;  // messages; also of the session that is stopped
  MessageShape shape;
};

// Each scenario starts its own servers, appends its measurements and ends the servers. Throws
// std::runtime_error when a server cannot be started or reached.

// Messages a second, and the CPU time of the service and of its client for each.
void measureThroughput(const LoadOptions& options, std::vector<Measurement>& results);
// The time to an answer, for a client alone and for a client while others are busy.
void measureLatency(const LoadOptions& options, std::vector<Measurement>& results);
// Resident memory of the service, and the growth for each message in a history.
void measureMemory(const LoadOptions& options, std::vector<Measurement>& results);
// Whether a message costs more with many sessions, many clients or a long history.
void measureGrowth(const LoadOptions& options, std::vector<Measurement>& results);
// Wake-ups of a service that has a client but no work.
void measureIdle(const LoadOptions& options, std::vector<Measurement>& results);
// The stop of a session with a long history: its time, its memory and the wait of another client.
void measureStop(const LoadOptions& options, std::vector<Measurement>& results);

}  // namespace halvox::bench
