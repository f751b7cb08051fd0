#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>

#include <CLI/CLI.hpp>

#include "bench/load/EchoServer.h"
#include "bench/load/Scenarios.h"

namespace {

using halvox::bench::LoadOptions;
using halvox::bench::Measurement;
using Scenario = void (*)(const LoadOptions&, std::vector<Measurement>&);

const std::vector<std::pair<std::string, Scenario>>& scenarios() {
  static const std::vector<std::pair<std::string, Scenario>> all{
      {"throughput", halvox::bench::measureThroughput},
      {"latency", halvox::bench::measureLatency},
      {"memory", halvox::bench::measureMemory},
      {"growth", halvox::bench::measureGrowth},
      {"idle", halvox::bench::measureIdle},
      {"stop", halvox::bench::measureStop}};
  return all;
}

int run(int argc, char** argv) {
  CLI::App app{
      "Measures the reporting service under load, and a raw sd-bus echo of the same messages in "
      "the "
      "same run. Compare the numbers of one run, not those of different machines."};
  LoadOptions options;
  options.programs.echo = std::filesystem::read_symlink("/proc/self/exe").string();
  options.programs.service =
      (std::filesystem::path(options.programs.echo).parent_path() / "halvox-reportingd").string();
  std::string echoSocket;
  std::string json;
  std::vector<std::string> chosen;
  std::vector<std::string> names;
  for (const auto& [name, scenario] : scenarios()) names.push_back(name);
  app.add_option("--service", options.programs.service, "The service to measure")
      ->capture_default_str();
  app.add_option("--scenario", chosen, "What to measure (default: all)")
      ->check(CLI::IsMember(names));
  app.add_option("--messages", options.messages, "Messages per run")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--window", options.window, "Most unanswered messages at a time")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--clients", options.clients, "Clients for memory and for latency under load")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--rounds", options.rounds, "Rounds of throughput; the result is the median")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--sessions", options.sessions, "Sessions for growth")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--idle-connections", options.idleConnections, "Idle connections for growth")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--busy-clients", options.busyClients, "Clients that send at once, for growth")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--history", options.history, "Messages of history for growth and stop")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--fields", options.shape.fields, "Fields per message")
      ->capture_default_str()
      ->check(CLI::Range(1, 1000));
  app.add_option("--text-bytes", options.shape.textBytes, "Length of each text field")
      ->capture_default_str()
      ->check(CLI::Range(0, 1'000'000));
  app.add_option("--json", json, "Also write the results to this file");
  app.add_option("--echo", echoSocket, "Run as the echo server on this socket")->group("");
  CLI11_PARSE(app, argc, argv);
  if (!echoSocket.empty()) return halvox::bench::serveEcho(echoSocket);

  std::vector<Measurement> results;
  for (const auto& [name, scenario] : scenarios()) {
    if (!chosen.empty() && std::find(chosen.begin(), chosen.end(), name) == chosen.end()) continue;
    std::fprintf(stderr, "measuring %s\n", name.c_str());
    scenario(options, results);
  }
  std::fputs(halvox::bench::formatTable(results).c_str(), stdout);
  if (!json.empty()) std::ofstream(json) << halvox::bench::formatJson(results) << '\n';
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "halvox-load: %s\n", error.what());
    return 1;
  }
}
