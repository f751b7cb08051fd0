#include "analysis/MessageJoin.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <utility>

#include "analysis/MessageNames.h"
#include "analysis/TwinEvents.h"

namespace halvox::analysis {
namespace {

constexpr std::string_view kStampKey = "hvreporting_timestamp";

// The stamp has fractions of a microsecond. Two messages of one category and type therefore have
// the same stamp only if a client sent one message to several sessions.
std::uint64_t keyOf(const Record& record) {
  const auto stamp = record.payload->number(kStampKey);
  if (!stamp || record.category.empty()) return 0;
  const std::hash<std::string_view> hash;
  std::uint64_t key = std::bit_cast<std::uint64_t>(*stamp);
  for (const std::string_view text : {record.category, record.type}) {
    key = (key ^ hash(text)) * 0x9E3779B97F4A7C15U;
  }
  return key | 1U;
}

std::string_view payloadToKeep(const Record& record) {
  return isSummary(record) ? R"({"HV_Session_Summary_Event":""})" : record.payload->json();
}

bool isSame(std::string_view text, std::string_view other) {
  return text.empty() || other.empty() || text == other;
}

}  // namespace

bool isSummary(const Record& record) {
  // The stamp of a message is a number. The stamps of a summary are a text.
  return record.kind == RecordKind::kLinkMessage && record.type == "Unknown" &&
         record.payload->text(kSummaryKey).has_value() && keyOf(record) == 0;
}

void MessageJoin::add(const Record& record) {
  if (record.kind == RecordKind::kEvent) {
    addEvent(record);
  } else if (record.kind == RecordKind::kLinkMessage) {
    addLinkMessage(record);
  } else {
    return;
  }
  deliverReady(record.time);
}

void MessageJoin::addEvent(const Record& record) {
  if (record.category.empty()) {
    // This event is not a message, but keeps its place among the messages.
    Waiting& event = push(record, 0);
    event.message.name = record.name;
    event.message.commonID = record.id;
    event.isComplete = true;
    return;
  }
  if (completesTwin(record)) return;
  const bool isCommon = record.service == kCommonService;
  const std::uint64_t key = keyOf(record);
  Waiting* message = find(key, record);
  if (message == nullptr) message = &push(record, key);
  message->message.isEvent = true;
  // The link's payload has another key. The event's payload replaces it, because the second event
  // of a message is recognised by its equal payload. The event's ID is the one by which others know
  // the message.
  if (message->message.isLinkMessage) {
    setPayload(message->message, record);
    message->message.id = record.id;
  }
  message->message.application = record.application;
  message->hasCommon = isCommon;
  (isCommon ? message->message.commonID : message->message.serviceID) = record.id;
  if (!isCommon) message->message.service = record.service;
}

// True if the record is the second event of a message.
bool MessageJoin::completesTwin(const Record& record) {
  if (record.service == kCommonService || !lastEvent_) return false;
  Waiting* const last = waiting(*std::exchange(lastEvent_, std::nullopt));
  if (last == nullptr || !last->hasCommon) return false;
  const TwinContent first{.category = last->message.category,
                          .type = last->message.type,
                          .payload = last->message.payload};
  if (!isTwin(first, record)) return false;
  last->message.service = record.service;
  last->message.serviceID = record.id;
  last->isComplete = last->message.isLinkMessage || last->key == 0;
  return true;
}

void MessageJoin::addLinkMessage(const Record& record) {
  if (isSummary(record)) return addSummary(record);
  const std::uint64_t key = keyOf(record);
  Waiting* message = find(key, record);
  if (message != nullptr && record.sessionID) moveSummariesTo(*message, *record.sessionID);
  if (message == nullptr) {
    message = &push(record, key);
    // Without a stamp no later record can find this message.
    message->isComplete = key == 0;
  } else {
    message->isComplete = !message->message.service.empty();
  }
  message->message.isLinkMessage = true;
  message->message.linkID = record.id;
  message->message.sessionID = record.sessionID;
  if (message->message.service.empty()) message->message.service = record.service;
}

void MessageJoin::addSummary(const Record& record) {
  Waiting& summary = push(record, 0);
  summary.isComplete = true;
  summary.message.isLinkMessage = true;
  summary.message.isSummary = true;
  summary.message.linkID = record.id;
  summary.message.sessionID = record.sessionID;
  summary.message.service = record.service;
  if (record.sessionID) {
    summaries_.emplace(*record.sessionID, firstNumber_ + waiting_.size() - 1);
  }
}

// All of these summaries are behind the message, because it waited when they were added.
void MessageJoin::moveSummariesTo(Waiting& message, std::int64_t sessionID) {
  const auto [begin, end] = summaries_.equal_range(sessionID);
  std::vector<std::uint64_t> numbers;
  for (auto place = begin; place != end; ++place) numbers.push_back(place->second);
  summaries_.erase(begin, end);
  std::ranges::sort(numbers);
  for (const std::uint64_t number : numbers) {
    Waiting* const summary = waiting(number);
    if (summary == nullptr) continue;
    waitingBytes_ -= summary->message.payload.size();
    summary->message.time = std::min(summary->message.time, message.message.time);
    message.summaries.push_back(std::move(summary->message));
    summary->message = {};
    summary->isDelivered = true;
  }
}

MessageJoin::Waiting* MessageJoin::find(std::uint64_t key, const Record& record) {
  if (key == 0) return nullptr;
  const bool isEvent = record.kind == RecordKind::kEvent;
  Waiting* found = nullptr;
  std::uint64_t foundNumber = 0;
  const auto [begin, end] = byKey_.equal_range(key);
  for (auto place = begin; place != end; ++place) {
    Waiting* const candidate = waiting(place->second);
    if (candidate == nullptr) continue;
    const Message& message = candidate->message;
    if (isEvent ? message.isEvent : message.isLinkMessage) continue;
    if (message.category != record.category || message.type != record.type) continue;
    const std::string_view service =
        record.service == kCommonService ? std::string_view() : record.service;
    if (!isSame(message.service, service)) continue;
    // Takes the oldest one, because a message to several sessions reaches them in the same order
    // each time.
    if (found != nullptr && place->second > foundNumber) continue;
    found = candidate;
    foundNumber = place->second;
  }
  if (found != nullptr && isEvent) lastEvent_ = foundNumber;
  return found;
}

MessageJoin::Waiting& MessageJoin::push(const Record& record, std::uint64_t key) {
  const std::size_t bytes = payloadToKeep(record).size();
  while (!waiting_.empty() &&
         (waiting_.size() == kMostWaiting || waitingBytes_ + bytes > kMostWaitingBytes)) {
    deliverFirst();
  }
  const std::uint64_t number = firstNumber_ + waiting_.size();
  Waiting& added = waiting_.emplace_back();
  added.key = key;
  added.message.id = record.id;
  added.message.time = record.time;
  added.message.category = record.category;
  added.message.type = record.type;
  setPayload(added.message, record);
  if (key != 0) byKey_.emplace(key, number);
  if (record.kind == RecordKind::kEvent && !record.category.empty()) lastEvent_ = number;
  return added;
}

void MessageJoin::setPayload(Message& message, const Record& record) {
  waitingBytes_ -= message.payload.size();
  message.payload = payloadToKeep(record);
  waitingBytes_ += message.payload.size();
}

MessageJoin::Waiting* MessageJoin::waiting(std::uint64_t number) {
  if (number < firstNumber_ || number - firstNumber_ >= waiting_.size()) return nullptr;
  return &waiting_[number - firstNumber_];
}

void MessageJoin::deliverReady(double now) {
  while (!waiting_.empty()) {
    const Waiting& first = waiting_.front();
    // The absolute difference also ends the wait after the clock was set back.
    if (!first.isComplete && std::abs(now - first.message.time) <= kLongestWait) return;
    deliverFirst();
  }
}

void MessageJoin::deliverFirst() {
  // Taken out of the queue before the callback, which must not see a half-delivered queue.
  Waiting first = std::move(waiting_.front());
  waiting_.pop_front();
  waitingBytes_ -= first.message.payload.size();
  const std::uint64_t number = firstNumber_++;
  const auto [begin, end] = byKey_.equal_range(first.key);
  for (auto place = begin; place != end; ++place) {
    if (place->second != number) continue;
    byKey_.erase(place);
    break;
  }
  if (first.key == 0 && first.message.sessionID) forgetSummary(*first.message.sessionID, number);
  for (const Message& summary : first.summaries) callback_(summary);
  if (!first.isDelivered) callback_(first.message);
}

void MessageJoin::forgetSummary(std::int64_t sessionID, std::uint64_t number) {
  const auto [begin, end] = summaries_.equal_range(sessionID);
  const auto place =
      std::find_if(begin, end, [=](const auto& one) { return one.second == number; });
  if (place != end) summaries_.erase(place);
}

void MessageJoin::deliverBefore(double time) {
  while (!waiting_.empty() && waiting_.front().message.time < time) deliverFirst();
  deliverReady(time);
}

void MessageJoin::finish() {
  while (!waiting_.empty()) deliverFirst();
}

}  // namespace halvox::analysis
