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
  MessageShape shape;
};

// Each scenario starts its own servers, appends its measurements and ends the servers. Throws
// std::runtime_error when a server cannot be started or reached.
void measureThroughput(const LoadOptions& options, std::vector<Measurement>& results);
void measureLatency(const LoadOptions& options, std::vector<Measurement>& results);
void measureMemory(const LoadOptions& options, std::vector<Measurement>& results);
void measureGrowth(const LoadOptions& options, std::vector<Measurement>& results);
void measureIdle(const LoadOptions& options, std::vector<Measurement>& results);
void measureStop(const LoadOptions& options, std::vector<Measurement>& results);

}  // namespace halvox::bench
