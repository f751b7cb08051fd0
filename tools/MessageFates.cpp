#include "tools/MessageFates.h"

#include <algorithm>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "client/Vocabulary.h"
#include "session/SessionHistory.h"
#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

using analysis::Message;
using platform::Dictionary;

constexpr const char* kStampKey = "hvreporting_timestamp";
constexpr const char* kTestService = "test";
constexpr std::int64_t kNoSession = -1;  // the link's session ID outside sessions

}  // namespace

AudioEventCategory MessageFates::categoryOf(const std::string& name) {
  const auto number = client::findCategory(name);
  return static_cast<AudioEventCategory>(number.value_or(0));
}

AudioEventType MessageFates::typeOf(const std::string& name) {
  // Numbers without a name are "Generic", which is not the name of a number.
  return static_cast<AudioEventType>(client::findEventType(name).value_or(0));
}

std::optional<Dictionary> MessageFates::comparable(const std::string& payload) {
  auto parsed = parseDictionary(payload);
  if (!parsed) return std::nullopt;
  for (const char* added : {"HostApplicationDisplayID", "audiotag"}) {
    parsed->remove(platform::Key(added));
  }
  return HVReportingUtilityRemoveWhiteSpaceFromKeys(*parsed);
}

MessageFates::Base& MessageFates::baseOf(const Message& message) {
  std::string key = message.category;
  for (const std::string* part : {&message.type, &message.service, &message.application}) {
    key.append(1, '\0').append(*part);
  }
  if (bases_.size() == kMostBases && !bases_.contains(key)) bases_.clear();
  return bases_[std::move(key)];
}

void MessageFates::add(const Message& message) {
  MessageFate fate{.message = message};
  if (message.isLinkMessage) {
    fate.session = message.sessionID;
    fate.link = message.sessionID == kNoSession ? LinkFate::kSingle : LinkFate::kSession;
  }
  if (!message.isEvent || message.category.empty()) {
    callback_(fate);
    // The next run of a session begins with an empty history.
    if (message.isSummary && message.sessionID) forgetSession(*message.sessionID);
    return;
  }
  const auto content = comparable(message.payload);
  Base& base = baseOf(message);
  if (content) decide(message, *content, base, fate);
  callback_(fate);
  const bool isRecorded = fate.link == LinkFate::kSession ||
                          fate.link == LinkFate::kNotRecognised ||
                          fate.link == LinkFate::kMayRepeat;
  if (content && isRecorded) {
    keep(base, {.id = message.id, .session = message.sessionID, .message = *content});
  }
}

void MessageFates::decide(const Message& message, const Dictionary& content, const Base& base,
                          MessageFate& fate) const {
  const AudioEventCategory category = categoryOf(message.category);
  const AudioEventType type = typeOf(message.type);
  // A message that equals itself is dropped unless it is exempt.
  fate.isExempt = !SessionHistory::isRedundant(&content, category, type, content);
  if (message.isLinkMessage) {
    const auto previous = std::ranges::find(base, message.sessionID, &Kept::session);
    if (previous == base.end()) return;
    fate.previous = previous->id;
    // The session would have dropped it. Between the two, its history was emptied or had another
    // message, and the store does not show that: the service was killed, for example.
    fate.equalsPrevious = SessionHistory::isRedundant(&previous->message, category, type, content);
    return;
  }
  if (content.find(kStampKey) == nullptr) {
    fate.link = LinkFate::kWithoutStamp;
    return;
  }
  for (auto kept = base.rbegin(); kept != base.rend(); ++kept) {
    if (fate.previous == 0) fate.previous = kept->id;
    if (!SessionHistory::isRedundant(&kept->message, category, type, content)) continue;
    if (fate.link == LinkFate::kRepeats) {
      if (kept->session) fate.session.reset();
      continue;
    }
    fate.previous = kept->id;
    fate.session = kept->session;
    fate.link = kept->session ? LinkFate::kRepeats : LinkFate::kEqualsEvent;
    if (fate.link == LinkFate::kEqualsEvent) break;
  }
  // A session without a link has sent another such message. It would record this one, because it
  // differs from its own, and the two cases look the same.
  const bool hasOther = std::ranges::any_of(base, [](const Kept& one) { return !one.session; });
  if (fate.link == LinkFate::kRepeats && hasOther) {
    fate.link = LinkFate::kMayRepeat;
    fate.session.reset();
  }
  // Whether it was dropped as a repetition does not matter then.
  if (message.service == kTestService) fate.link = LinkFate::kTestSession;
}

void MessageFates::keep(Base& base, Kept kept) {
  std::erase_if(base, [&](const Kept& one) { return one.session == kept.session; });
  if (base.size() == kMostSessions) base.erase(base.begin());
  base.push_back(std::move(kept));
}

void MessageFates::forgetSession(std::int64_t session) {
  for (auto& [key, base] : bases_) {
    std::erase_if(base, [&](const Kept& one) { return one.session == session; });
  }
}

}  // namespace halvox::tools
