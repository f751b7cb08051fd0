#include "tools/Events.h"

#include <algorithm>
#include <string_view>

#include "analysis/MessageNames.h"
#include "analysis/Payload.h"
#include <fnmatch.h>

#include "client/Vocabulary.h"
#include "tools/JsonText.h"
#include "tools/StoreRun.h"
#include "tools/TimeText.h"

namespace halvox::tools {

using platform::linux_::EventFollower;
using platform::linux_::RecordFilter;
using platform::linux_::StoredEvent;
using platform::linux_::StoreReader;

namespace {

constexpr client::Category kCategoryProper = 0xFFFF;

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
  if (patterns.empty()) return true;
  const std::string application = applicationOf(event);
  return std::ranges::any_of(patterns, [&](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), application.c_str(), 0) == 0;
  });
}

RecordFilter filterOf(const ShowEvents& request) {
  RecordFilter filter = tools::filterOf(request.selection);
  const auto& grep = request.selection.grep;
  if (!grep && request.applications.empty() && request.categories.empty() &&
      request.types.empty()) {
    return filter;
  }
  // The cheap tests come first.
  filter.acceptsEvent = [request](const StoredEvent& event) {
    const analysis::EventNameParts parts = analysis::splitEventName(event.name);
    const auto& pattern = request.selection.grep;
    return isOfType(parts.type, request.types) &&
           isOfCategory(parts.category, request.categories) &&
           isOfApplication(event, request.applications) &&
           (!pattern || pattern->matches(event.name) || pattern->matches(event.payload));
  };
  return filter;
}

}  // namespace

std::string formatEvent(const StoredEvent& event, OutputForm form) {
  if (form == OutputForm::kText) {
    // Names and payloads come from clients, which could otherwise control the terminal.
    return localTime(event.time) + "  " + harmlessText(event.name) + "  " +
           fieldsOfJson(event.payload);
  }
  // The store guarantees that the payload is complete JSON on one line.
  return "{\"time\":" + toJson(event.time) + ",\"name\":" + harmlessJson(quoted(event.name)) +
         ",\"payload\":" + harmlessJson(event.payload) + "}";
}

ExitStatus showEvents(const ShowEvents& request, OutputForm form, std::ostream& out,
                      int outputDescriptor, std::ostream& errors) {
  const auto print = [&](const StoredEvent& event) { out << formatEvent(event, form) << '\n'; };
  return runOverStore({"events", form, request.selection, out, outputDescriptor, errors},
                      filterOf(request),
                      {[&](StoreReader& reader, const RecordFilter& filter) {
                         return reader.forEachEvent(filter, print);
                       },
                       [&](EventFollower& follower) { return follower.deliver(print); }});
}

}  // namespace halvox::tools
