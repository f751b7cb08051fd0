#include <algorithm>
#include <charconv>
#include <cmath>

#include "analysis/IssueMetric.h"

#include "backends/HVReportingJoulebookUtility.h"
#include "tools/ExplainSinks.h"
#include "tools/Explainer.h"
#include "tools/TimeText.h"

namespace halvox::tools {

using analysis::Message;
using analysis::Payload;
using analysis::Record;
using analysis::RecordKind;

namespace {

constexpr const char* kStampKey = "hvreporting_timestamp";
// A power event and a metric are stored directly after their message.
constexpr double kSoon = 2;

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

// Looks for what other sinks stored of a message.
class RelatedSearch {
 public:
  explicit RelatedSearch(const Explainer::Found::Target& target) : time_(target.time) {
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

}  // namespace

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
                                   .isExempt = one.isExempt,
                                   .equalsPrevious = one.equalsPrevious});
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

}  // namespace halvox::tools
