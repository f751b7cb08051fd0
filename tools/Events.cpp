#include "tools/Events.h"

#include <algorithm>
#include <limits>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>

#include "analysis/MessageNames.h"
#include "analysis/Payload.h"

#include "client/Vocabulary.h"
#include "tools/EventRows.h"
#include "tools/Globs.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"

namespace halvox::tools {

using platform::linux_::EventFollower;
using platform::linux_::RecordFilter;
using platform::linux_::RecordOrder;
using platform::linux_::StoredEvent;
using platform::linux_::StoredRecordID;
using platform::linux_::StoreReader;

namespace {

constexpr client::Category kCategoryProper = 0xFFFF;
// The event that the service records when a client disconnects.
constexpr std::string_view kUptimeEvent = "com.tarno.halvox.hvreportingclientuptime";
constexpr std::string_view kOwnProcess = "halvoxctl";

// The application of an event. Of an event of an earlier version, only the payload has it.
std::string applicationOf(const StoredEvent& event) {
  if (!event.application.empty()) return std::string(event.application);
  analysis::Payload payload;
  payload.show(event.payload);
  return std::string(payload.text("HostApplicationDisplayID").value_or(std::string_view()));
}

bool isOfCategory(std::string_view name, const std::vector<std::uint32_t>& categories) {
  return categories.empty() || std::ranges::any_of(categories, [&](std::uint32_t wanted) {
           const std::string text = client::categoryName(wanted);
           if ((wanted & ~kCategoryProper) != 0) return name == text;
           // The part after the domain.
           return name == text || name.ends_with("_" + text);
         });
}

bool isOfType(std::string_view name, const std::vector<std::uint16_t>& types) {
  return types.empty() || std::ranges::any_of(types, [&](std::uint16_t wanted) {
           return name == client::eventTypeName(wanted);
         });
}

bool isOfApplication(const StoredEvent& event, const std::vector<std::string>& patterns) {
  return patterns.empty() || matchesAnyGlob(patterns, applicationOf(event));
}

// Whether the service recorded the event when a command of this program disconnected.
bool isOwn(const StoredEvent& event) {
  if (event.name != kUptimeEvent) return false;
  analysis::Payload payload;
  payload.show(event.payload);
  return payload.text("processName") == kOwnProcess;
}

RecordFilter filterOf(const ShowEvents& request, OutputForm form) {
  RecordFilter filter = tools::filterOf(request.selection);
  const bool hidesOwn = form == OutputForm::kText && !request.hasOwnEvents;
  const auto& grep = request.selection.grep;
  if (!hidesOwn && !grep && request.applications.empty() && request.categories.empty() &&
      request.types.empty()) {
    return filter;
  }
  // The cheap tests come first.
  filter.acceptsEvent = [request, hidesOwn](const StoredEvent& event) {
    const analysis::EventNameParts parts = analysis::splitEventName(event.name);
    const auto& pattern = request.selection.grep;
    return isOfType(parts.type, request.types) &&
           isOfCategory(parts.category, request.categories) &&
           isOfApplication(event, request.applications) && !(hidesOwn && isOwn(event)) &&
           (!pattern || pattern->matches(event.name) || pattern->matches(event.payload));
  };
  return filter;
}

std::optional<double> stampOf(std::string_view json) {
  analysis::Payload payload;
  payload.show(json);
  return payload.number("hvreporting_timestamp");
}

class EventReading final : public StoreReading {
 public:
  EventReading(RecordOrder order, bool showsMessagesOnce, std::vector<std::int64_t> sessions)
      : order_(order), showsMessagesOnce_(showsMessagesOnce), sessions_(std::move(sessions)) {}

  Outcome find(StoreReader& reader, const RecordFilter& filter,
               const RowCallback& callback) override {
    return reader.forEachEvent(filter,
                               [&](const StoredEvent& event) { callback(event.id, event.time); });
  }

  Outcome prepare(StoreReader& reader, std::optional<StoredRecordID> shownBefore,
                  RecordFilter& filter) override {
    if (!sessions_.empty()) {
      if (auto selected = selectSessions(reader, filter); !selected) return selected;
    }
    if (!showsMessagesOnce_) return StoreReading::prepare(reader, shownBefore, filter);
    // The event that was shown before is read again, to recognise its partner.
    shownBefore_ = shownBefore;
    if (!filter.newest || *filter.newest == 0) return {};
    most_ = std::exchange(filter.newest, std::nullopt);
    return order_ == RecordOrder::kOldestFirst ? skipToNewest(reader, filter) : Outcome();
  }

  Outcome printAll(StoreReader& reader, const RecordFilter& filter, RowPrinter& printer) override {
    RecordFilter limited = filter;
    if (most_ && order_ == RecordOrder::kNewestFirst) {
      limited.isEnough = [&] { return printer.rows() >= *most_ || filter.isEnough(); };
    }
    return print(printer, [&](const StoreReader::EventCallback& callback) {
      return reader.forEachEvent(limited, callback);
    });
  }

  Outcome printAdded(EventFollower& follower, RowPrinter& printer) override {
    return print(printer, [&](const StoreReader::EventCallback& callback) {
      return follower.deliver(callback);
    });
  }

 private:
  // Makes the filter accept events of the sessions only. An event does not name its session: its
  // link message, which does, has the same stamp. Takes 8 bytes a message.
  Outcome selectSessions(StoreReader& reader, RecordFilter& filter) const {
    constexpr double kLongestDelay = 10;  // of the record of a link message, in seconds
    namespace store = platform::linux_;
    RecordFilter ofSessions;
    ofSessions.since = filter.since;
    if (filter.until) ofSessions.until = *filter.until + kLongestDelay;
    ofSessions.numbers.push_back({store::kLinkSessionID, sessions_});
    const auto stamps = std::make_shared<std::vector<double>>();
    auto read = reader.forEachRecord(
        store::kLinkMessages, ofSessions, [&](const store::StoredRecord& record) {
          if (const auto stamp = stampOf(record.text(store::kLinkPayload))) {
            stamps->push_back(*stamp);
          }
        });
    std::ranges::sort(*stamps);
    filter.acceptsEvent = [stamps, others = filter.acceptsEvent](const StoredEvent& event) {
      if (others && !others(event)) return false;
      const auto stamp = stampOf(event.payload);
      return stamp && std::ranges::binary_search(*stamps, *stamp);
    };
    return read;
  }

  // Makes the filter begin with the oldest of the rows that are wanted. How many events they are is
  // known only after they were read.
  Outcome skipToNewest(StoreReader& reader, RecordFilter& filter) {
    RecordFilter backwards = filter;
    backwards.order = RecordOrder::kNewestFirst;
    std::uint64_t found = 0;
    StoredRecordID first = std::numeric_limits<StoredRecordID>::max();
    EventRows rows(backwards.order, [&](const StoredEvent& event) {
      first = event.id;
      ++found;
    });
    backwards.isEnough = [&] { return found >= *most_; };
    auto read = reader.forEachEvent(backwards, [&](const StoredEvent& event) { rows.add(event); });
    // Fewer than wanted: from the beginning.
    if (read && found >= *most_) filter.after = std::max(filter.after, first - 1);
    return read;
  }

  template <typename Read>
  Outcome print(RowPrinter& printer, Read read) {
    const auto show = [&printer](const StoredEvent& event) {
      printer.print(
          event.id, event.time, [&] { return eventCells(event); },
          [&] { return eventJson(event); });
    };
    if (!showsMessagesOnce_) return read(show);
    if (!rows_) {
      rows_.emplace(order_, show);
      if (shownBefore_) rows_->treatAsShown(*shownBefore_);
    }
    auto done = read([&](const StoredEvent& event) { rows_->add(event); });
    rows_->flush();
    return done;
  }

  RecordOrder order_;
  bool showsMessagesOnce_;
  std::vector<std::int64_t> sessions_;  // empty: all
  std::optional<StoredRecordID> shownBefore_;
  std::optional<std::uint64_t> most_;  // rows; nothing: all
  std::optional<EventRows> rows_;
};

RowCell::Look lookOf(std::string_view name) {
  const std::string_view type = analysis::splitEventName(name).type;
  return type == "Error" || type == "IssueDetector" ? RowCell::Look::kProblem
                                                    : RowCell::Look::kName;
}

}  // namespace

std::vector<RowCell> eventCells(const StoredEvent& event) {
  // Names and payloads come from clients, which could otherwise control the terminal.
  return {{.text = harmlessText(event.name), .look = lookOf(event.name), .keepsEnd = true},
          {.text = fieldsOfJson(event.payload)}};
}

std::string eventJson(const StoredEvent& event) {
  // The store guarantees that the payload is complete JSON on one line.
  return "{\"time\":" + toJson(event.time) + ",\"name\":" + harmlessJson(quoted(event.name)) +
         ",\"payload\":" + harmlessJson(event.payload) + "}";
}

ExitStatus showEvents(const ShowEvents& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors) {
  RecordFilter filter = filterOf(request, form);
  EventReading reading(filter.order, form == OutputForm::kText && !request.hasAllNames,
                       request.sessions);
  return runOverStore({"events", form, request.selection, out, outputDescriptor, errors},
                      std::move(filter), reading);
}

}  // namespace halvox::tools
