#include "tools/Top.h"

#include <algorithm>
#include <filesystem>
#include <memory>
#include <utility>
#include <variant>

#include <poll.h>

#include "tools/Complaint.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/top/Screen.h"
#include "tools/top/TopSource.h"
#include "tools/top/TopText.h"

namespace halvox::tools {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// Waits. Returns false if the output was closed meanwhile.
bool isReadFor(milliseconds time, int descriptor) {
  pollfd output{descriptor, 0, 0};
  // Requests no events, because errors and hang-ups are always reported.
  const int polled = ::poll(&output, 1, static_cast<int>(time.count()));
  return polled <= 0 || (output.revents & (POLLERR | POLLHUP | POLLNVAL)) == 0;
}

milliseconds until(Clock::time_point time) {
  return std::max(milliseconds(0), std::chrono::ceil<milliseconds>(time - Clock::now()));
}

ExitStatus printBatches(const ShowTop& request, OutputForm form, TopSource& source,
                        const ToolStreams& streams) {
  TopModel model;
  source.readTurn(model);
  Clock::time_point next = Clock::now();
  for (std::uint64_t batch = 0; !request.count || batch < *request.count; ++batch) {
    next += request.interval;
    if (!isReadFor(until(next), streams.outputDescriptor)) return ExitStatus::kDone;
    source.readTurn(model);
    TopSnapshot snapshot = model.snapshot();
    sortSnapshot(snapshot, {.key = request.sort});
    streams.output << (form == OutputForm::kJson ? batchJson(snapshot) + "\n" : batchText(snapshot))
                   << std::flush;
    if (!streams.output) return ExitStatus::kDone;
  }
  return ExitStatus::kDone;
}

// Where the request wants to read, or the exit status of a failure that was reported.
std::variant<TopPlaces, ExitStatus> placesOf(const ShowTop& request, const CommonOptions& options,
                                             const Complaint& complain) {
  TopPlaces places;
  auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  places.store = std::move(std::get<std::filesystem::path>(directory));
  // A store that was named is one of another time or another machine.
  if (!request.database.empty()) return places;
  auto socket = namedSocket(options, complain);
  if (const auto* status = std::get_if<ExitStatus>(&socket)) return *status;
  places.socket = std::move(std::get<std::string>(socket));
  // The screen stands still while a service does not answer.
  places.timeout = std::min(options.timeout, request.interval);
  auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  places.drivers = std::get<platform::linux_::Configuration>(configuration).drivers;
  return places;
}

}  // namespace

void runTopScreen(const ShowTop& request, TopView& view,
                  const std::function<void(TopModel& model)>& readTurn) {
  TopModel model;
  TopChoice choice{.sort = {.key = request.sort}};
  TopSnapshot snapshot;
  Clock::time_point next = Clock::now();
  std::uint64_t turns = 0;
  // A service that has run for weeks may have a million records, which take some seconds.
  view.draw({{"Reading what the service has stored since its start…", TopStyle::kTitle}});
  while (true) {
    if (!choice.isPaused && Clock::now() >= next) {
      if (request.count && turns == *request.count) return;
      ++turns;
      readTurn(model);
      snapshot = model.snapshot();
      next = Clock::now() + request.interval;
    }
    sortSnapshot(snapshot, choice.sort);
    const TopSize size = view.size();
    view.draw(layOut(snapshot, choice, size));
    // A paused screen waits for a key only, and costs nothing.
    constexpr milliseconds kWhilePaused = std::chrono::hours(1);
    const TopKey key = view.wait(choice.isPaused ? kWhilePaused : until(next));
    if (!onKey(key, std::max<std::size_t>(1, size.lines / 2), choice)) return;
  }
}

ExitStatus showTop(const ShowTop& request, const CommonOptions& options,
                   const ToolStreams& streams) {
  const Complaint complain("top", options.form(), streams.output, streams.errors);
  auto places = placesOf(request, options, complain);
  if (const auto* status = std::get_if<ExitStatus>(&places)) return *status;
  TopSource source(std::move(std::get<TopPlaces>(places)));
  if (const auto opened = source.open(); !opened) {
    return complain(ExitStatus::kNoService, opened.error().message, "no-store");
  }
  const bool isScreen = !request.isBatch && !options.json && streams.isInputTerminal &&
                        terminalWidth(streams.outputDescriptor).has_value();
  if (!isScreen) return printBatches(request, options.form(), source, streams);
  streams.output << std::flush;
  const auto view = openScreen();
  if (!view) {
    complain.warn(view.error().message + "; printing batches");
    return printBatches(request, options.form(), source, streams);
  }
  runTopScreen(request, **view, [&](TopModel& model) { source.readTurn(model); });
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
