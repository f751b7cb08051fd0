#include "tools/Events.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <deque>
#include <filesystem>
#include <utility>
#include <variant>

#include <fnmatch.h>
#include <poll.h>

#include "platform/linux/runtime/Configuration.h"
#include "platform/linux/store/EventFollower.h"
#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

using platform::linux_::EventFilter;
using platform::linux_::EventFollower;
using platform::linux_::StoredEvent;
using platform::linux_::StoreError;
using platform::linux_::StoreReader;

constexpr const char* kDatabaseName = "halvox.db";
constexpr std::uint64_t kShownWhenFollowing = 10;

std::string localTime(double seconds) {
  const double whole = std::floor(seconds);
  const auto milliseconds = static_cast<int>((seconds - whole) * 1000);
  const auto time = static_cast<std::time_t>(whole);
  std::tm fields{};
  std::array<char, 64> date{};
  if (localtime_r(&time, &fields) == nullptr ||
      std::strftime(date.data(), date.size(), "%Y-%m-%d %H:%M:%S", &fields) == 0) {
    return std::to_string(seconds);  // so far off that it has no date
  }
  std::array<char, 8> fraction{};
  std::snprintf(fraction.data(), fraction.size(), ".%03d", milliseconds);
  return std::string(date.data()) + fraction.data();
}

// The directory of the store, or how the run ends without one.
std::variant<std::filesystem::path, ExitStatus> storeDirectory(const std::string& database,
                                                               std::ostream& errors) {
  if (database.empty()) {
    auto loaded = platform::linux_::loadConfiguration();
    if (const auto* error = std::get_if<platform::linux_::ConfigurationError>(&loaded)) {
      errors << "halvoxctl events: " << harmlessText(error->description) << '\n';
      return ExitStatus::kBadConfiguration;
    }
    return std::get<platform::linux_::Configuration>(loaded).storage.directory;
  }
  const std::filesystem::path path(database);
  std::error_code ignored;
  if (std::filesystem::is_directory(path, ignored)) return path;
  if (path.filename() == kDatabaseName) {
    return path.has_parent_path() ? path.parent_path() : std::filesystem::path(".");
  }
  errors << "halvoxctl events: --database: " << harmlessText(database)
         << " is no store; expected a " << kDatabaseName << " or the directory that has one\n";
  return ExitStatus::kBadArguments;
}

// Prints what passes the patterns. The store itself takes one pattern; with several of them it
// gives everything, and the choice, and with it the count of the newest, is made here.
class EventPrinter {
 public:
  EventPrinter(const ShowEvents& request, EventForm form, std::ostream& out)
      : names_(request.names), form_(form), out_(out) {
    const bool choosesHere = names_.size() > 1;
    if (names_.size() == 1) filter_.name = names_.front();
    filter_.since = request.since;
    filter_.until = request.until;
    std::optional<std::uint64_t> last = request.last;
    if (request.follow && !request.since && !last) last = kShownWhenFollowing;
    (choosesHere ? newest_ : filter_.newest) = last;
  }

  [[nodiscard]] const EventFilter& filter() const { return filter_; }

  void take(const StoredEvent& event) {
    if (!passes(event.name)) return;
    if (!newest_) {
      out_ << formatEvent(event, form_) << '\n';
      return;
    }
    held_.push_back(formatEvent(event, form_));
    if (held_.size() > *newest_) held_.pop_front();
  }

  // What was stored before is complete: from here on every event counts.
  void finish() {
    for (const auto& line : held_) out_ << line << '\n';
    held_.clear();
    newest_.reset();
    out_ << std::flush;
  }

 private:
  [[nodiscard]] bool passes(std::string_view name) const {
    if (names_.size() < 2) return true;
    const std::string text(name);
    return std::ranges::any_of(names_, [&](const std::string& pattern) {
      return fnmatch(pattern.c_str(), text.c_str(), 0) == 0;
    });
  }

  std::vector<std::string> names_;
  EventForm form_;
  std::ostream& out_;
  EventFilter filter_;
  std::optional<std::uint64_t> newest_;
  std::deque<std::string> held_;
};

ExitStatus complain(const StoreError& error, std::ostream& errors) {
  errors << "halvoxctl events: " << harmlessText(error.description) << '\n';
  return ExitStatus::kNoService;
}

// Waits for the next events. False when nobody reads the output any more.
bool waitForEvents(int storeDescriptor, int outputDescriptor) {
  std::array<pollfd, 2> polled{{{storeDescriptor, POLLIN, 0}, {outputDescriptor, 0, 0}}};
  while (poll(polled.data(), polled.size(), -1) < 0) {
  }
  return (polled[1].revents & (POLLERR | POLLHUP | POLLNVAL)) == 0;
}

ExitStatus followEvents(const std::filesystem::path& directory, EventPrinter& printer,
                        std::ostream& out, int outputDescriptor, std::ostream& errors) {
  EventFollower follower;
  if (const auto error = follower.open(directory, printer.filter()))
    return complain(*error, errors);
  do {
    const auto error = follower.deliver([&](const StoredEvent& event) { printer.take(event); });
    printer.finish();
    if (error) return complain(*error, errors);
  } while (out && waitForEvents(follower.descriptor(), outputDescriptor));
  return ExitStatus::kDone;
}

}  // namespace

std::string formatEvent(const StoredEvent& event, EventForm form) {
  if (form == EventForm::kText) {
    return localTime(event.time) + "  " + harmlessText(event.name) + "  " +
           fieldsOfJson(event.payload);
  }
  // The payload is JSON already, on one line and complete: that is the store's promise.
  return "{\"time\":" + toJson(event.time) + ",\"name\":" + harmlessJson(quoted(event.name)) +
         ",\"payload\":" + harmlessJson(event.payload) + "}";
}

ExitStatus showEvents(const ShowEvents& request, EventForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors) {
  const auto directory = storeDirectory(request.database, errors);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  EventPrinter printer(request, form, out);
  if (request.follow) return followEvents(path, printer, out, outputDescriptor, errors);

  StoreReader reader;
  if (const auto error = reader.open(path)) return complain(*error, errors);
  const auto error =
      reader.forEachEvent(printer.filter(), [&](const StoredEvent& event) { printer.take(event); });
  printer.finish();
  return error ? complain(*error, errors) : ExitStatus::kDone;
}

}  // namespace halvox::tools
