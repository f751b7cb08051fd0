#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <string>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "client/HalvoxClient.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/version/Commit.h"
#include "platform/linux/version/VersionText.h"
#include "reporters/pipewire/HalvoxReportingClient.h"
#include "reporters/pipewire/MainLoop.h"
#include "reporters/pipewire/StreamTracker.h"
#include "reporters/pipewire/StreamWatcher.h"
#include "reporters/pipewire/VerboseReportingClient.h"

namespace {

using namespace halvox::pipewire_reporter;  // the program's own

// The status of wrong arguments is that of halvoxctl; the others are those of sysexits.h.
constexpr int kExitUsage = 2;
constexpr int kExitSoftware = 70;
constexpr int kExitConfiguration = 78;
// How long the end waits at most for the service to answer the last messages.
constexpr std::chrono::seconds kFarewell{1};

struct Arguments {
  std::string socket;
  std::string remote;
  bool verbose = false;
  bool noXruns = false;
};

void logLine(std::string_view line) { fmt::print(stderr, "halvox-pipewire-reporter: {}\n", line); }

void declareOptions(CLI::App& app, Arguments& arguments) {
  app.add_option(
         "--socket", arguments.socket,
         "The reporting service's socket (default: $HALVOX_SOCKET, else what the service's "
         "configuration names, else the user's, $XDG_RUNTIME_DIR/halvox/reporting.sock, if a "
         "service is there, else the system's, /run/halvox/reporting.sock)")
      ->type_name("PATH");
  app.add_option("--remote", arguments.remote, "The PipeWire server to follow")->type_name("NAME");
  app.add_flag("--verbose", arguments.verbose, "Log each operation and message on standard error");
  app.add_flag("--no-xruns", arguments.noXruns,
               "Do not report xruns; saves several wake-ups a second while streams run");
  using namespace halvox::platform;
  app.set_version_flag("--version",
                       linux_::versionText("halvox-pipewire-reporter", linux_::halvoxCommit(), {}));
}

void logLosses(const halvox::client::Counters& counters, const StreamTracker& tracker) {
  if (counters.dropped + counters.lost + counters.refused > 0) {
    logLine(fmt::format("messages dropped {}, lost {}, refused {} of {}", counters.dropped,
                        counters.lost, counters.refused, counters.accepted + counters.dropped));
  }
  if (tracker.refusedStreams() > 0) {
    logLine(fmt::format("{} streams were not followed: more than {} at once, or equal identifiers",
                        tracker.refusedStreams(), StreamTracker::kMaxStreams));
  }
}

// Takes the service's socket from the configuration if neither the arguments nor the environment
// name it. Returns false if the configuration has a mistake.
bool completeFromConfiguration(Arguments& arguments) {
  const char* variable = std::getenv("HALVOX_SOCKET");
  if (!arguments.socket.empty() || (variable != nullptr && *variable != '\0')) return true;
  const auto named = halvox::platform::linux_::configuredSocket();
  if (named) {
    arguments.socket = named->native();
  } else {
    logLine(named.error().message);
  }
  return named.has_value();
}

void run(const Arguments& arguments) {
  // Made before the client, which has a thread: the loop blocks the signals, and only later threads
  // inherit this.
  MainLoop loop;
  halvox::client::HalvoxClient client({.socketPath = arguments.socket});
  HalvoxReportingClient handOver(client);
  VerboseReportingClient verbose(handOver, logLine);
  StreamTracker tracker(arguments.verbose ? static_cast<ReportingClient&>(verbose) : handOver);
  auto serviceRestarted = loop.makeNotifier([&tracker] { tracker.serviceRestarted(); });
  client.setConnectionHandler([&client, serviceRestarted, wasLost = false](bool connected) mutable {
    logLine(connected ? "connected to the reporting service at " + client.socketPath()
                      : "the connection to the reporting service ended; waiting for it");
    // The client library makes the sessions again, but does not repeat earlier messages.
    if (connected && wasLost) {
      serviceRestarted();
    }
    wasLost = wasLost || !connected;
  });
  {
    // Destroyed before the flush: the destructor stops all sessions, and the flush waits for their
    // last messages.
    const StreamWatcher watcher(
        loop.handle(), tracker,
        {.remote = arguments.remote, .log = logLine, .xruns = !arguments.noXruns});
    loop.run();
  }
  client.flush(kFarewell);
  logLosses(client.counters(), tracker);
}

}  // namespace

int main(int count, char** texts) {
  CLI::App app(
      "Reports each audio stream of a running PipeWire server as a session.\n"
      "Runs until SIGTERM or SIGINT, then stops and destroys its sessions.");
  Arguments arguments;
  declareOptions(app, arguments);
  try {
    app.parse(count, texts);
    if (!completeFromConfiguration(arguments)) return kExitConfiguration;
    run(arguments);
    return 0;
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : kExitUsage;
  } catch (const std::exception& error) {
    logLine(error.what());
    return kExitSoftware;
  }
}
