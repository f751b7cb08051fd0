#include "tools/Explain.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <utility>
#include <variant>

#include "analysis/IssueMetric.h"
#include "analysis/MessageNames.h"
#include "analysis/StoreRecordSource.h"

#include "backends/HVReportingJoulebookUtility.h"
#include "client/HalvoxClient.h"
#include "client/Vocabulary.h"
#include "platform/linux/store/reading/StoreReader.h"
#include "tools/Arguments.h"
#include "tools/Complaint.h"
#include "tools/ExplainSinks.h"
#include "tools/ExplainText.h"
#include "tools/Explanation.h"
#include "tools/JsonText.h"
#include "tools/MessageFates.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/TextTable.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::Message;
using analysis::Payload;
using analysis::Record;
using analysis::RecordKind;
using analysis::RecordRange;
namespace store = platform::linux_;

constexpr const char* kStampKey = "hvreporting_timestamp";
// A power event and a metric are stored directly after their message.
constexpr double kSoon = 2;
// The names of applications that are shown of a session.
constexpr std::size_t kMostApplications = 8;

bool isSummary(const Record& record) {
  return record.kind == RecordKind::kLinkMessage && record.category == "Undefined" &&
         record.type == "Unknown";
}

std::string spanText(std::optional<double> first, std::optional<double> last) {
  if (!first || !last) return {};
  return ", from " + localTime(*first) + " to " + localTime(*last);
}

std::string counted(std::uint64_t number, const char* one) {
  return std::to_string(number) + " " + one + (number == 1 ? "" : "s");
}

// Whether one of the numbers in a summary's text, with commas between them, is this one.
bool hasNumber(std::string_view numbers, double wanted) {
  for (std::size_t begin = 0; begin < numbers.size();) {
    const std::size_t end = std::min(numbers.find(',', begin), numbers.size());
    double number = 0;
    std::from_chars(numbers.data() + begin, numbers.data() + end, number);
    if (number == wanted) return true;
    begin = end + 1;
  }
  return false;
}

// What a number may stand for.
struct Found {
  struct Target {
    std::string name;
    std::string category;
    std::string type;
    std::string payload;
    double time = 0;
    RecordKind kind = RecordKind::kEvent;
  };
  std::optional<Target> record;
  bool isSession = false;
};

// Explains over one store.
class Explainer {
 public:
  Explainer(const Explain& request, const Complaint& complain, store::StoreReader& reader,
            ExplainSettings settings)
      : request_(request), complain_(complain), source_(reader), settings_(std::move(settings)) {}

  // Returns the explanations, or the exit status of a failure that was reported.
  std::variant<std::vector<Explanation>, ExitStatus> run(
      const std::function<std::string(std::int64_t)>& askService) {
    if (const auto number = parseNumber(request_.target)) return explainNumber(*number, askService);
    return explainName();
  }

 private:
  using Outcome = std::variant<std::vector<Explanation>, ExitStatus>;

  // Reads records of the request's times. Reports a failure.
  std::optional<ExitStatus> read(RecordRange range,
                                 const analysis::RecordSource::Callback& callback) {
    range.since = request_.since;
    range.until = request_.until;
    const auto outcome = source_.forEach(range, callback);
    if (outcome) return std::nullopt;
    return complain_(ExitStatus::kNoService, outcome.error().message, "no-store");
  }
  // Replays the messages that `isOf` accepts, and summaries.
  std::optional<ExitStatus> replay(const std::function<bool(const Record&)>& isOf,
                                   const MessageFates::Callback& onFate,
                                   const std::function<void(const Record&)>& onOther = {}) {
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

  Explanation finished(Explanation explanation) const {
    explanation.settings = settingsThatDecide(settings_);
    for (auto& sentence : unknownSentences(settings_)) {
      explanation.unknown.push_back(std::move(sentence));
    }
    return explanation;
  }

  Outcome explainName();
  Outcome explainMessages(const MessageName& name);
  Outcome explainOther();
  Outcome explainNumber(std::int64_t number,
                        const std::function<std::string(std::int64_t)>& askService);
  std::variant<Found, ExitStatus> find(std::int64_t number);
  Outcome explainRecord(std::int64_t id, const Found::Target& target);
  Outcome explainSession(std::int64_t id, const std::string& answerOfService);

  const Explain& request_;
  const Complaint& complain_;
  analysis::StoreRecordSource source_;
  ExplainSettings settings_;
};

// --- The name of an event -----------------------------------------------------------------------

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

// --- A number -----------------------------------------------------------------------------------

std::variant<Found, ExitStatus> Explainer::find(std::int64_t number) {
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

// Looks for what other sinks stored of a message.
class RelatedSearch {
 public:
  explicit RelatedSearch(const Found::Target& target) : time_(target.time) {
    message_.show(target.payload);
    content_ = MessageFates::comparable(target.payload);
    stamp_ = message_.number(kStampKey);
    const auto event =
        HVReportingJoulebookUtility::eventOf(content_, MessageFates::typeOf(target.type));
    if (event) powerEvent_ = *event;
    isIssue_ = target.type == "IssueDetector";
  }
  RelatedRecords found;

  void see(const Record& record) {
    if (isSummary(record)) seeSummary(record);
    if (std::abs(record.time - time_) > kSoon) return;
    if (record.kind == RecordKind::kPowerEvent && !found.powerEvent && isPowerEvent(record)) {
      found.powerEvent = record.id;
    }
    if (record.kind == RecordKind::kIssueMetric && !found.metric && isMetric(record)) {
      found.metric = record.id;
    }
  }
  // Uses the summary of this session, if one has the message's stamp.
  void settle(std::optional<std::int64_t> session) {
    const auto place = std::ranges::find(summaries_, session, &Summary::session);
    if (session && place != summaries_.end()) found.summary = place->record;
  }

 private:
  struct Summary {
    std::optional<std::int64_t> session;
    std::int64_t record = 0;
  };
  // A message that was sent to several sessions has one stamp in all of their summaries.
  static constexpr std::size_t kMostSummaries = 64;

  void seeSummary(const Record& record) {
    if (!stamp_ || summaries_.size() == kMostSummaries) return;
    const auto stamps = record.payload->text(kStampKey);
    if (stamps && hasNumber(*stamps, *stamp_)) summaries_.push_back({record.sessionID, record.id});
  }
  bool isPowerEvent(const Record& record) {
    if (record.name != powerEvent_) return false;
    if (const auto end = record.payload->number("TimestampEnd")) return end == stamp_;
    constexpr const char* kActive = "Haptic_Active_Hardware_Time_Seconds";
    return record.payload->number(kActive) == message_.number(kActive);
  }
  bool isMetric(const Record& record) {
    if (!isIssue_ || record.number != analysis::kAudioIssueDetected) return false;
    const auto issue = analysis::parseAudioIssue(record.bytes);
    const auto agrees = [&](const char* key, const std::string& text) {
      const auto own = message_.text(key);
      return !own || *own == text;
    };
    return issue && agrees("issue_type", issue->type) && agrees("node", issue->node) &&
           agrees("rtaid_client", issue->client);
  }

  double time_;
  Payload message_;  // of the target, which must outlive this
  platform::Message content_;
  std::optional<double> stamp_;
  std::string_view powerEvent_;
  bool isIssue_ = false;
  std::vector<Summary> summaries_;
};

Explainer::Outcome Explainer::explainRecord(std::int64_t id, const Found::Target& target) {
  Explanation explanation{.kind = "record",
                          .subject = "Record " + std::to_string(id) + ": " +
                                     (target.name.empty() ? "link message" : target.name) + ", " +
                                     localTime(target.time)};
  if (target.category.empty()) {
    explanation.name.emplace_back(
        "It is not a message: the service makes it itself. docs/reference/events.md says when.");
    return std::vector{finished(std::move(explanation))};
  }
  RelatedSearch related(target);
  std::optional<Message> message;
  std::optional<MessageFate> fate;
  const auto failure = replay(
      [&](const Record& record) {
        return record.category == target.category && record.type == target.type;
      },
      [&](const MessageFate& one) {
        const Message& other = one.message;
        if (other.commonID == id || other.serviceID == id || other.linkID == id) {
          message = other;
          fate.emplace(MessageFate{.message = *message,
                                   .link = one.link,
                                   .session = one.session,
                                   .previous = one.previous,
                                   .isExempt = one.isExempt});
        }
      },
      [&](const Record& record) { related.see(record); });
  if (failure) return *failure;
  if (!fate)
    return complain_(ExitStatus::kRefused, "record " + std::to_string(id) + " was deleted");
  related.settle(fate->session);
  explanation.name = nameSentences({target.category, target.type, message->service});
  if (!message->application.empty()) {
    explanation.sessions.push_back("Its application is " + message->application + ".");
  }
  for (auto& sentence : repetitionSentences(*fate)) {
    explanation.sessions.push_back(std::move(sentence));
  }
  explanation.sinks = sinksOf(*fate, related.found, settings_);
  return std::vector{finished(std::move(explanation))};
}

// --- A session ----------------------------------------------------------------------------------

// What the store has of one session.
struct SessionTally {
  MessageTally all;
  std::map<std::pair<std::string, std::string>, MessageTally> byName;  // the vocabulary bounds it
  std::set<std::string> applications;
  std::string service;
  MessageTally::Count summaries;
  std::uint64_t unattributed = 0;  // of its application and service type, without a session

  void add(const MessageFate& fate) {
    const Message& message = fate.message;
    if (!message.service.empty()) service = message.service;
    if (!message.application.empty() && applications.size() < kMostApplications) {
      applications.insert(message.application);
    }
    if (!message.isEvent && message.category == "Undefined" && message.type == "Unknown") {
      summaries.add(message.linkID);
      return;
    }
    all.add(fate);
    byName[{message.category, message.type}].add(fate);
  }
};

std::string baseSentence(const std::string& name, const MessageTally& tally) {
  std::string text = name + ": " + counted(tally.messages, "message");
  const auto add = [&](const MessageTally::Count& count, const char* what) {
    if (count.messages > 0) text += ", " + std::to_string(count.messages) + " " + what;
  };
  add(tally.common, "recorded as events of all services");
  add(tally.ofService, "as events of the service type");
  add(tally.link(LinkFate::kSession), "through the link");
  add(tally.link(LinkFate::kRepeats), "dropped by the session as repetitions");
  return text + ".";
}

Explainer::Outcome Explainer::explainSession(std::int64_t id, const std::string& answerOfService) {
  SessionTally session;
  const auto failure =
      replay([](const Record&) { return true; },
             [&](const MessageFate& fate) {
               if (fate.session == id) {
                 session.add(fate);
               } else if ((fate.link == LinkFate::kNotRecognised ||
                           fate.link == LinkFate::kWithoutStamp) &&
                          fate.message.service == session.service &&
                          session.applications.contains(fate.message.application)) {
                 ++session.unattributed;
               }
             });
  if (failure) return *failure;
  Explanation explanation{.kind = "session",
                          .subject = "Session " + std::to_string(id) + ": " +
                                     counted(session.all.messages, "message") +
                                     spanText(session.all.first, session.all.last)};
  if (id == -1)
    explanation.subject =
        "Messages outside sessions" + spanText(session.all.first, session.all.last);
  explanation.name.push_back("Its service type is " + session.service +
                             ". The second name of each event has it.");
  for (const auto& application : session.applications) {
    explanation.sessions.push_back("Its application is " + application + ".");
  }
  for (const auto& [name, tally] : session.byName) {
    explanation.sessions.push_back(baseSentence(name.first + "." + name.second, tally));
  }
  if (!answerOfService.empty()) {
    explanation.sessions.push_back("The " + answerOfService + ".");
  }
  if (session.unattributed > 0) {
    explanation.unknown.push_back("Of its application and service type, " +
                                  counted(session.unattributed, "further message") +
                                  " cannot be attributed to a session: no link message names it, "
                                  "and none of them repeats what "
                                  "this session recorded.");
  }
  explanation.sinks =
      sinksOf(session.all, {.category = {}, .type = {}, .service = session.service}, settings_);
  std::erase_if(explanation.sinks, [](const auto& sink) {
    return sink.name == "power log" || sink.name == "issue metrics" || sink.name == "bug capture";
  });
  for (auto& sink : explanation.sinks) {
    if (!sink.name.starts_with("summary of")) continue;
    sink.took = session.summaries.messages > 0 ? Explanation::Sink::Took::kYes
                                               : Explanation::Sink::Took::kUnknown;
    sink.messages = session.summaries.messages;
    sink.record = session.summaries.newest;
    sink.why =
        session.summaries.messages > 0
            ? "Each is the end of a run of the session."
            : "The store has no summary of it: it has not been stopped, it recorded nothing, "
              "or its link was closed before.";
  }
  return std::vector{finished(std::move(explanation))};
}

// Asks a running service whether it has the session. Returns a sentence without its article and
// full stop; empty if there is no answer.
std::string askService(std::int64_t id, const CommonOptions& options, const Complaint& complain) {
  const auto socket = namedSocket(options, complain);
  if (!std::holds_alternative<std::string>(socket)) return {};
  const auto opened =
      client::HalvoxConnection::open(std::get<std::string>(socket), options.timeout);
  if (!opened) return {};
  const auto answer = (*opened.value)->reporterIDValid(id);
  if (!answer) return {};
  const platform::Value* found = answer.value->find("reporterID");
  if (found == nullptr || found->toInt64() != id || id == 0) {
    return "running service has no session " + std::to_string(id) + " now";
  }
  return "running service has session " + std::to_string(id) + " now";
}

}  // namespace

ExitStatus explain(const Explain& request, const CommonOptions& options,
                   const ToolStreams& streams) {
  const Complaint complain("explain", options.form(), streams.output, streams.errors);
  auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  store::StoreReader reader;
  const auto opened = reader.open(path);
  if (!opened) return complain(ExitStatus::kNoService, opened.error().message, "no-store");

  ExplainSettings settings{
      .configuration = std::get<store::Configuration>(std::move(configuration)),
      .server = store::storeServer(path)};
  const bool isServed = settings.server.use == store::StoreUse::kServed;
  Explainer explainer(request, complain, reader, std::move(settings));
  auto outcome = explainer.run([&](std::int64_t id) {
    return isServed ? askService(id, options, complain) : std::string();
  });
  if (const auto* status = std::get_if<ExitStatus>(&outcome)) return *status;
  bool isFirst = true;
  for (const Explanation& explanation : std::get<std::vector<Explanation>>(outcome)) {
    if (options.json) {
      streams.output << explanationJson(explanation) << '\n';
    } else {
      if (!std::exchange(isFirst, false)) streams.output << '\n';
      printExplanation(explanation, streams.output, terminalWidth(streams.outputDescriptor));
    }
  }
  streams.output << std::flush;
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
