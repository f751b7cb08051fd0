#include "tools/ExplainSinks.h"

#include "backends/HVReportingJoulebookUtility.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using Sink = Explanation::Sink;
using Took = Explanation::Sink::Took;
using platform::linux_::LinkBackend;

constexpr const char* kCommonEvents = "events, name of all services";
constexpr const char* kServiceEvents = "events, name of the service type";
constexpr const char* kLink = "link, in a session";
constexpr const char* kSingle = "link, single message";
constexpr const char* kSummary = "summary of the session";
constexpr const char* kSummaryFile = "summary file";
constexpr const char* kPowerLog = "power log";
constexpr const char* kMetrics = "issue metrics";
constexpr const char* kCapture = "bug capture";
constexpr const char* kTrace = "trace";

Sink::Took tookOf(std::uint64_t messages, Took otherwise) {
  return messages > 0 ? Took::kYes : otherwise;
}

Sink eventSink(const char* sink, const MessageTally::Count& count, const std::string& name,
               const ExplainSettings& settings) {
  Sink result{.name = sink,
              .took = tookOf(count.messages, Took::kNo),
              .messages = count.messages,
              .record = count.newest};
  const std::string shown = name.empty() ? "the names of their types" : name;
  if (count.messages > 0) {
    result.why = "Stored under " + shown + ".";
  } else if (!name.empty() && !isWanted(settings, name)) {
    result.why =
        "No pattern of analytics.wanted matches " + shown + ". Such events are not recorded.";
  } else {
    result.why = "The store has no event of " + shown +
                 ". If it was recorded, it is older than what the store keeps; otherwise it was "
                 "never sent, was not wanted at that time, or was dropped by the store.";
  }
  return result;
}

std::string linkReasons(const MessageTally& tally) {
  std::string why;
  const auto add = [&](LinkFate fate, const char* reason) {
    const auto& count = tally.link(fate);
    if (count.messages == 0) return;
    why += std::string(why.empty() ? "" : " ") + reason + ": " + std::to_string(count.messages) +
           " (newest record " + std::to_string(count.newest) + ").";
  };
  add(LinkFate::kSession, "Sent through the link of a session");
  add(LinkFate::kRepeats,
      "Dropped by the session, because they repeat the message of the same category and type that "
      "it recorded before");
  add(LinkFate::kMayRepeat,
      "Dropped by a session, because they repeat what it recorded before, or sent by a session "
      "without a link; the store does not show which");
  add(LinkFate::kEqualsEvent,
      "Equal to the event before, which has no link message either (a session that recorded that "
      "one dropped them)");
  add(LinkFate::kTestSession, "Not sent, because sessions of type test do not use the link");
  add(LinkFate::kWithoutStamp,
      "Without a time stamp, because the service made them (their events and link messages cannot "
      "be brought together and are counted apart)");
  add(LinkFate::kNotRecognised,
      "Without a link message for a reason that the store does not show (their session had no "
      "link, "
      "because more than five sessions were active or no back-end was found, or the link's records "
      "are not here)");
  return why;
}

// Where link messages are if they are not stored here; otherwise empty.
std::string backendSentence(const ExplainSettings& settings) {
  if (settings.configuration.link.backend == LinkBackend::kLocal) return {};
  return "link.backend is \"" + backendName(settings) + "\": link messages are not in this store.";
}

Sink linkSink(const MessageTally& tally, const ExplainSettings& settings) {
  const auto& count = tally.link(LinkFate::kSession);
  Sink sink{.name = kLink,
            .took = tookOf(count.messages, Took::kNo),
            .messages = count.messages,
            .record = count.newest,
            .why = linkReasons(tally)};
  const bool isOpen = tally.link(LinkFate::kNotRecognised).messages > 0 ||
                      tally.link(LinkFate::kMayRepeat).messages > 0 ||
                      tally.link(LinkFate::kEqualsEvent).messages > 0 ||
                      tally.link(LinkFate::kWithoutStamp).messages > 0;
  if (count.messages == 0 && isOpen) sink.took = Took::kUnknown;
  const std::string elsewhere = backendSentence(settings);
  if (count.messages == 0 && !elsewhere.empty()) {
    sink.took = Took::kUnknown;
    sink.why += (sink.why.empty() ? "" : " ") + elsewhere;
  }
  return sink;
}

Sink singleSink(const MessageTally& tally) {
  const auto& count = tally.link(LinkFate::kSingle);
  return {.name = kSingle,
          .took = tookOf(count.messages, Took::kNo),
          .messages = count.messages,
          .record = count.newest,
          .why = count.messages > 0
                     ? "They came while their session was not started, or while no session was "
                       "active, and went out alone, one second later."
                     : "None is stored outside of sessions."};
}

// The sinks of which the store does not say more about many messages than about their type.
void addByType(std::vector<Sink>& sinks, const std::string& type, const ExplainSettings& settings) {
  const bool isEnergy = type == "Joulebook";
  sinks.push_back({.name = kPowerLog,
                   .took = isEnergy ? Took::kUnknown : Took::kNo,
                   .why = isEnergy
                              ? "It takes messages of type Joulebook that have EngineOnTime or "
                                "Haptic_Active_Hardware_Time_Seconds; `halvoxctl power` lists "
                                "its records."
                              : "It takes only messages of type Joulebook."});
  const bool isIssue = type == "IssueDetector";
  sinks.push_back({.name = kMetrics,
                   .took = isIssue ? Took::kUnknown : Took::kNo,
                   .why = isIssue ? "Each message of type IssueDetector makes a metric; `halvoxctl "
                                    "metrics` lists them."
                                  : "Only messages of type IssueDetector make a metric."});
  const bool isCaptured = isEnergy && isInternalBuild(settings.configuration);
  sinks.push_back(
      {.name = kCapture,
       .took = isCaptured ? Took::kUnknown : Took::kNo,
       .why = isCaptured
                  ? "Every second different message with Haptic_Active_Hardware_Time_Seconds "
                    "makes a capture; `halvoxctl snapshots` lists them."
              : isEnergy ? "device.InternalBuild is not true: there are no captures."
                         : "It counts only messages of type Joulebook."});
}

Sink traceSink(const std::string& service, const ExplainSettings& settings) {
  if (service == "test" && isTracingOn(settings.configuration)) {
    return {.name = kTrace,
            .took = Took::kUnknown,
            .why =
                "Sessions of type test are traced. A trace has intervals between trace points, "
                "and no messages; see `halvoxctl trace show`."};
  }
  return {.name = kTrace,
          .took = Took::kNo,
          .why =
              "Only sessions of type test are traced, and only if the feature Tracing of Acoustat "
              "is on."};
}

Sink summaryFileSink(const ExplainSettings& settings) {
  if (!isInternalBuild(settings.configuration)) {
    return {.name = kSummaryFile,
            .took = Took::kNo,
            .why = "device.InternalBuild is not true: no summary files are written."};
  }
  return {.name = kSummaryFile,
          .took = Took::kUnknown,
          .why = "A file has what its session recorded until the stop; see `halvoxctl summary`."};
}

Sink summarySink(const MessageFate& fate, const RelatedRecords& related) {
  Sink sink{.name = kSummary, .record = related.summary.value_or(0)};
  if (related.summary) {
    sink.took = Took::kYes;
    sink.why = "The summary of session " + std::to_string(fate.session.value_or(0)) +
               " has its time stamp.";
  } else if (fate.link == LinkFate::kRepeats) {
    sink.took = Took::kNo;
    sink.why = "A session does not record a message that it drops as a repetition.";
  } else if (fate.link == LinkFate::kSingle) {
    sink.took = Took::kNo;
    sink.why = "It belongs to no run of a session.";
  } else {
    sink.why = "The store has no summary of its session with its time stamp.";
  }
  return sink;
}

Sink relatedSink(const char* name, const std::optional<std::int64_t>& record, const char* what) {
  return {.name = name,
          .took = record ? Took::kYes : Took::kUnknown,
          .record = record.value_or(0),
          .why = record ? std::string("The store has ") + what + " with its values, at its time."
                        : std::string("It makes ") + what +
                              ", but the store has none with its values, at its time."};
}

// Replaces what is said about a type by what the store shows about this message.
void refine(std::vector<Sink>& sinks, const MessageFate& fate, const RelatedRecords& related) {
  const platform::Message message = MessageFates::comparable(fate.message.payload);
  const auto event =
      HVReportingJoulebookUtility::eventOf(message, MessageFates::typeOf(fate.message.type));
  for (Sink& sink : sinks) {
    if (sink.name == kPowerLog && event) {
      sink = relatedSink(kPowerLog, related.powerEvent, "a power event");
    } else if (sink.name == kPowerLog && fate.message.type == "Joulebook") {
      sink.took = Took::kNo;
      sink.why = "It has neither EngineOnTime nor Haptic_Active_Hardware_Time_Seconds.";
    } else if (sink.name == kMetrics && fate.message.type == "IssueDetector") {
      sink = relatedSink(kMetrics, related.metric, "a metric");
    }
    sink.messages.reset();
  }
}

std::string linkWhy(const MessageFate& fate) {
  switch (fate.link) {
    case LinkFate::kSession:
      return "Session " + std::to_string(fate.session.value_or(0)) + " sent it through its link.";
    case LinkFate::kRepeats:
      return (fate.session ? "Session " + std::to_string(*fate.session)
                           : std::string("One of several sessions")) +
             " dropped it: it repeats record " + std::to_string(fate.previous) + ".";
    case LinkFate::kMayRepeat:
      return "It equals record " + std::to_string(fate.previous) +
             ", which a session with a link recorded. Either that session dropped it, or a session "
             "without a link sent it: the store does not show which.";
    case LinkFate::kEqualsEvent:
      return "It equals record " + std::to_string(fate.previous) +
             ", which did not go through the link either.";
    case LinkFate::kSingle:
      return "It went out alone.";
    case LinkFate::kTestSession:
      return "Sessions of type test do not use the link.";
    case LinkFate::kWithoutStamp:
      return "It has no time stamp by which its link message can be recognised.";
    case LinkFate::kNotRecognised:
      return "The store has no link message of it and does not show why: its session had no link "
             "(more than five sessions were active, or no back-end was found), or the link's "
             "records "
             "are not in this store.";
  }
  return {};
}

}  // namespace

void MessageTally::add(const MessageFate& fate) {
  const analysis::Message& message = fate.message;
  ++messages;
  if (message.commonID != 0) common.add(message.commonID);
  if (message.serviceID != 0) ofService.add(message.serviceID);
  links[static_cast<std::size_t>(fate.link)].add(message.isLinkMessage ? message.linkID
                                                                       : message.id);
  if (fate.isExempt) ++exempt;
  if (!message.service.empty()) ++services[message.service];
  if (!first) first = message.time;
  last = message.time;
}

std::vector<Sink> sinksOf(const MessageTally& tally, const MessageName& name,
                          const ExplainSettings& settings) {
  const EventNamePair names = eventNamesOf(name);
  std::vector<Sink> sinks{eventSink(kCommonEvents, tally.common, names.ofAll, settings),
                          eventSink(kServiceEvents, tally.ofService, names.ofService, settings),
                          linkSink(tally, settings), singleSink(tally)};
  addByType(sinks, name.type, settings);
  sinks.push_back({.name = kSummary,
                   .took = Took::kUnknown,
                   .why =
                       "Each session has one summary with all messages that it recorded. Explain "
                       "a record to see whether its session's summary has it."});
  sinks.push_back(summaryFileSink(settings));
  sinks.push_back(traceSink(name.service, settings));
  return sinks;
}

std::vector<Sink> sinksOf(const MessageFate& fate, const RelatedRecords& related,
                          const ExplainSettings& settings) {
  MessageTally tally;
  tally.add(fate);
  const MessageName name{fate.message.category, fate.message.type, fate.message.service};
  std::vector<Sink> sinks = sinksOf(tally, name, settings);
  refine(sinks, fate, related);
  for (Sink& sink : sinks) {
    if (sink.name == kLink) {
      sink.why = linkWhy(fate);
      const std::string elsewhere = backendSentence(settings);
      if (!fate.message.isLinkMessage && !elsewhere.empty()) sink.why += " " + elsewhere;
    } else if (sink.name == kSummary) {
      sink = summarySink(fate, related);
    }
  }
  return sinks;
}

}  // namespace halvox::tools
