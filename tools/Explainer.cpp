#include "tools/Explainer.h"

#include <map>

#include "analysis/MessageNames.h"

#include "tools/Arguments.h"
#include "tools/ExplainSinks.h"

namespace halvox::tools {

using analysis::Message;
using analysis::Record;
using analysis::RecordKind;
using analysis::RecordRange;

namespace {

// The parts of "com.tarno.haptics.Session_Playback.Start" or "Session_Playback.Start".
std::optional<MessageName> parseName(const std::string& target) {
  const analysis::EventNameParts parts = analysis::splitEventName(target);
  MessageName name{std::string(parts.category), std::string(parts.type)};
  if (!parts.service.empty() && parts.service != analysis::kCommonService) {
    name.service = parts.service;
  }
  if (parts.category.empty()) {
    const std::size_t dot = target.find('.');
    if (dot == std::string::npos || target.find('.', dot + 1) != std::string::npos) {
      return std::nullopt;
    }
    name = {target.substr(0, dot), target.substr(dot + 1)};
  }
  return name;
}

}  // namespace

Explainer::Outcome Explainer::run(const std::function<std::string(std::int64_t)>& askService) {
  if (const auto number = parseNumber(request_.target)) return explainNumber(*number, askService);
  return explainName();
}

std::optional<ExitStatus> Explainer::read(RecordRange range,
                                          const analysis::RecordSource::Callback& callback) {
  range.since = request_.since;
  range.until = request_.until;
  const auto outcome = source_.forEach(range, callback);
  if (outcome) return std::nullopt;
  return complain_(ExitStatus::kNoService, outcome.error().message, "no-store");
}

std::optional<ExitStatus> Explainer::replay(const std::function<bool(const Record&)>& isOf,
                                            const MessageFates::Callback& onFate,
                                            const std::function<void(const Record&)>& onOther) {
  MessageFates fates(onFate);
  analysis::MessageJoin join([&](const Message& message) { fates.add(message); });
  RecordRange range;
  range.metrics = range.power = onOther != nullptr;
  const auto failure = read(range, [&](const Record& record) {
    const bool isMessage =
        record.kind == RecordKind::kEvent || record.kind == RecordKind::kLinkMessage;
    if (onOther && (!isMessage || isSummary(record))) onOther(record);
    if (isMessage && (isSummary(record) || isOf(record))) join.add(record);
  });
  if (!failure) join.finish();
  return failure;
}

Explanation Explainer::finished(Explanation explanation) const {
  explanation.settings = settingsThatDecide(settings_);
  for (auto& sentence : unknownSentences(settings_)) {
    explanation.unknown.push_back(std::move(sentence));
  }
  return explanation;
}

Explainer::Outcome Explainer::explainName() {
  const auto name = parseName(request_.target);
  if (name && isMessageName(*name)) return explainMessages(*name);
  return explainOther();
}

Explainer::Outcome Explainer::explainMessages(const MessageName& name) {
  MessageTally tally;
  const auto failure = replay(
      [&](const Record& record) {
        return record.category == name.category && record.type == name.type;
      },
      [&](const MessageFate& fate) {
        if (fate.message.category != name.category || fate.message.type != name.type) return;
        if (name.service.empty() || fate.message.service == name.service) tally.add(fate);
      });
  if (failure) return *failure;
  Explanation explanation{.kind = "event",
                          .subject = "Event " + request_.target + ": " +
                                     counted(tally.messages, "message") +
                                     spanText(tally.first, tally.last)};
  explanation.name = nameSentences(name);
  std::string services;
  for (const auto& [service, count] : tally.services) {
    services += (services.empty() ? "" : ", ") + service + " " + std::to_string(count);
  }
  if (!services.empty())
    explanation.sessions.push_back("Messages by service type: " + services + ".");
  if (tally.exempt > 0) {
    explanation.sessions.emplace_back("These are errors: sessions never drop them as repetitions.");
  }
  explanation.sinks = sinksOf(tally, name, settings_);
  return std::vector{finished(std::move(explanation))};
}

// An event that is not a message, or a power event.
Explainer::Outcome Explainer::explainOther() {
  std::map<RecordKind, MessageTally::Count> found;
  std::optional<double> first;
  double last = 0;
  RecordRange withPower;
  withPower.power = true;
  const auto failure = read(withPower, [&](const Record& record) {
    if (record.name != request_.target) return;
    found[record.kind].add(record.id);
    if (!first) first = record.time;
    last = record.time;
  });
  if (failure) return *failure;
  if (found.empty()) {
    return complain_(
        ExitStatus::kRefused,
        "\"" + request_.target +
            "\" is not in the store; expected the name of an event, such as "
            "com.tarno.halvox.Session_Playback.Start or Session_Playback.Start, or the "
            "ID of a session or a record");
  }
  Explanation explanation{.kind = "event", .subject = request_.target + spanText(first, last)};
  explanation.name.emplace_back(
      "It is not named by the category and type of a message: the service makes it itself. "
      "docs/reference/events.md says when.");
  for (const auto& [kind, count] : found) {
    explanation.sinks.push_back({.name = kind == RecordKind::kPowerEvent ? "power log" : "events",
                                 .took = Explanation::Sink::Took::kYes,
                                 .messages = count.messages,
                                 .record = count.newest});
  }
  return std::vector{finished(std::move(explanation))};
}

std::variant<Explainer::Found, ExitStatus> Explainer::find(std::int64_t number) {
  Found found;
  const auto failure = read({}, [&](const Record& record) {
    if (record.id == number) {
      found.record = Found::Target{.name = std::string(record.name),
                                   .category = std::string(record.category),
                                   .type = std::string(record.type),
                                   .payload = std::string(record.payload->json()),
                                   .time = record.time,
                                   .kind = record.kind};
    }
    if (record.sessionID == number) found.isSession = true;
  });
  if (failure) return *failure;
  return found;
}

Explainer::Outcome Explainer::explainNumber(
    std::int64_t number, const std::function<std::string(std::int64_t)>& askService) {
  const auto searched = find(number);
  if (const auto* status = std::get_if<ExitStatus>(&searched)) return *status;
  const auto& found = std::get<Found>(searched);
  // Asking makes a connection, of which the service records an event.
  const std::string answer = found.isSession || !found.record ? askService(number) : std::string();
  std::vector<Explanation> explanations;
  const auto append = [&](Outcome outcome) -> std::optional<ExitStatus> {
    if (const auto* status = std::get_if<ExitStatus>(&outcome)) return *status;
    for (auto& one : std::get<std::vector<Explanation>>(outcome)) {
      explanations.push_back(std::move(one));
    }
    return std::nullopt;
  };
  if (found.isSession) {
    if (const auto status = append(explainSession(number, answer))) return *status;
  }
  if (found.record) {
    if (const auto status = append(explainRecord(number, *found.record))) return *status;
  }
  if (!explanations.empty()) return explanations;
  return complain_(ExitStatus::kRefused, "no stored message is of a session " +
                                             std::to_string(number) +
                                             ", and no stored message has this ID" +
                                             (answer.empty() ? "" : "; the " + answer));
}

}  // namespace halvox::tools
