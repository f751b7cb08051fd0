#include <map>
#include <set>
#include <utility>

#include "tools/ExplainSinks.h"
#include "tools/Explainer.h"

namespace halvox::tools {

using analysis::Message;
using analysis::Record;

namespace {

// The names of applications that are shown of a session.
constexpr std::size_t kMostApplications = 8;

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
    if (message.isSummary) {
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

}  // namespace

Explainer::Outcome Explainer::explainSession(std::int64_t id, const std::string& answerOfService) {
  SessionTally session;
  const auto failure = replay(
      [](const Record&) { return true; },
      [&](const MessageFate& fate) {
        if (fate.session == id) {
          session.add(fate);
        } else if (!fate.session && !fate.message.isLinkMessage &&
                   fate.link != LinkFate::kTestSession && fate.message.service == session.service &&
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
                                  "and none of them repeats what this session alone recorded.");
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

}  // namespace halvox::tools
