#include "backends/HVReportingZUBBridge.h"

#include <algorithm>
#include <charconv>
#include <limits>
#include <string>
#include <string_view>
#include <system_error>

#include "backends/AudioIssueDetected.h"
#include "backends/BackEndCounters.h"
#include "platform/log.h"
#include "platform/metrics.h"
#include "platform/services.h"

namespace halvox {

using platform::Dictionary;
using platform::Key;
using platform::Value;

namespace {

constexpr platform::UnitLog kLog(&HVReportingZUBLogCategory, "HVReportingZUBBridge");

const Value* findOrLog(const Dictionary& message, const Key& key) {
  const Value* value = message.find(key);
  if (value == nullptr) kLog.error("Failed to get ", key.text(), " for AudioIssueDetected");
  return value;
}

std::string textUnder(const Dictionary& message, const Key& key) {
  const Value* value = findOrLog(message, key);
  return value == nullptr ? std::string() : describe(*value);
}

// Returns the integer at the beginning of a text, after blanks; 0 without one. An integer out of
// range becomes the smallest or the largest.
std::int64_t leadingInteger(std::string_view text) {
  using Limits = std::numeric_limits<std::int64_t>;
  text.remove_prefix(std::min(text.find_first_not_of(" \t"), text.size()));
  const bool negative = text.starts_with('-');
  // from_chars() does not accept a plus sign.
  if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
  std::int64_t integer = 0;
  const auto [end, failure] = std::from_chars(text.begin(), text.end(), integer);
  if (failure == std::errc::result_out_of_range) return negative ? Limits::min() : Limits::max();
  return integer;
}

std::int32_t secondsUnder(const Dictionary& message, const Key& key) {
  const Value* value = findOrLog(message, key);
  if (value == nullptr) return 0;
  const std::int64_t seconds =
      value->isString() ? leadingInteger(value->string()) : value->toInt64();
  // Keeps the low 32 bits; this is required.
  return static_cast<std::int32_t>(seconds);
}

// Reads the keys in this order because missing keys must be logged in this order.
zubmetrics::AudioIssueDetected makeMetric(const Dictionary& message) {
  static const Key issueType("issue_type");
  static const Key rtaidClient("rtaid_client");
  static const Key node("node");
  static const Key silence("any_channel_silence_seconds");
  zubmetrics::AudioIssueDetected metric;
  metric.setIssueType(textUnder(message, issueType));
  metric.setRtaidClient(textUnder(message, rtaidClient));
  metric.setNode(textUnder(message, node));
  metric.setDuration(secondsUnder(message, silence));
  return metric;
}

}  // namespace

void HVReportingZUBBridge::handleEvent(const platform::Message& message,
                                       AudioEventCategory /*category*/, AudioEventType type,
                                       const std::shared_ptr<HVReportingSession>& /*session*/,
                                       const IssueMetricCounters& counters) {
  if (type != AudioEventType::kIssueDetector || !message.has_value()) return;
  counters.received.add();
  // The metric is posted even if all keys are missing, because it still says that a client saw an
  // issue.
  platform::metrics().postIssueMetric(kAudioIssueDetectedMetricID, makeMetric(*message));
  counters.delivered.add();
}

}  // namespace halvox
