#include "session/VolumeMessages.h"

#include <utility>

#include "backends/HVReportingUtility.h"
#include "backends/PrivacyFilter.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Key;
using platform::Value;

const Key kFormatKey("session_selected_format");
const Key kDevicesKey("active_devices");
const Key kProcessKey("RQSessionVolumeOperationProcess");
const Key kVolumeKey("RQSessionVolume");
const Key kPlayingKey("RQSessionVolumePlayingState");
const Key kTimestampKey("hvreporting_timestamp");
const Key kVolumeBucketedKey("RQSessionVolumeBucketed");
const Key kPlaySecondsKey("play_seconds");
const Key kPlaySecondsBucketedKey("play_secondsBucketed");

// Four digits show every bucket of volumes, a multiple of one sixteenth, exactly. The buckets of
// seconds are whole numbers.
constexpr int kVolumeFractionDigits = 4;
constexpr int kSecondsFractionDigits = 0;

// Steps of one sixteenth.
const Array& volumeBuckets() {
  static const Array buckets{0,      0.0625, 0.125,  0.1875, 0.25,   0.3125, 0.375,  0.4375, 0.5,
                             0.5625, 0.625,  0.6875, 0.75,   0.8125, 0.875,  0.9375, 1.0};
  return buckets;
}

const Array& secondsBuckets() {
  static const Array buckets{0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18000};
  return buckets;
}

Value bucketed(const Value& number, const Array& buckets, int fractionDigits) {
  const auto text = HVReportingUtilityBucketNumberToString(number, buckets, fractionDigits);
  return text.has_value() ? Value(*text) : Value();
}

void keepIfPresent(const Dictionary& message, const Key& key, Value& kept) {
  if (const Value* value = message.find(key)) kept = *value;
}

std::optional<double> stampOf(const Dictionary& message) {
  const Value* stamp = message.find(kTimestampKey);
  if (stamp == nullptr || !stamp->isNumber()) return std::nullopt;
  return stamp->toDouble();
}

bool saysPlaying(const Dictionary& message) {
  const Value* state = message.find(kPlayingKey);
  return state != nullptr && state->toInt64() != 0;
}

}  // namespace

std::optional<Dictionary> VolumeIntervals::add(const Dictionary& message) {
  // These values are kept from every message, even one without a volume, and before the test below:
  // the message that ends an interval gives the interval its format, devices and process. This is
  // required.
  keepIfPresent(message, kFormatKey, format_);
  keepIfPresent(message, kDevicesKey, devices_);
  keepIfPresent(message, kProcessKey, process_);
  const Value* given = message.find(kVolumeKey);
  if (given == nullptr) return std::nullopt;
  Value volume = given->isNumber() ? *given : Value(0);
  const bool isPlaying = saysPlaying(message);
  if (start_.has_value() && isPlaying && volume == lastVolume_) return std::nullopt;

  const std::optional<double> stamp = stampOf(message);
  std::optional<Dictionary> ended;
  if (start_.has_value()) {
    const double seconds = stamp.value_or(0) - *start_;
    if (seconds > minimumPlaytime_) ended = makeMessage(seconds);
  }
  start_ = isPlaying ? stamp : std::nullopt;
  lastVolume_ = std::move(volume);
  return ended;
}

Dictionary VolumeIntervals::makeMessage(double seconds) const {
  // The message has the volume that was playing, not the one that ended the interval. The length is
  // stored in single precision, but its bucket is chosen in double precision. Both are required.
  Dictionary message{
      {kFormatKey, format_},
      {kDevicesKey, devices_},
      {kProcessKey, process_},
      {kVolumeKey, lastVolume_},
      {kVolumeBucketedKey, bucketed(lastVolume_, volumeBuckets(), kVolumeFractionDigits)},
      {kPlaySecondsKey, static_cast<float>(seconds)},
      {kPlaySecondsBucketedKey, bucketed(seconds, secondsBuckets(), kSecondsFractionDigits)}};
  // The messages that the values come from have passed the rules. These keys have not: most of them
  // are made here.
  applyPrivacy(message);
  return message;
}

bool VolumeIntervals::isConcernedWith(const Dictionary& message) {
  return message.find(kVolumeKey) != nullptr || message.find(kFormatKey) != nullptr ||
         message.find(kDevicesKey) != nullptr || message.find(kProcessKey) != nullptr;
}

std::size_t VolumeIntervals::memorySize() const {
  return format_.memorySize() + devices_.memorySize() + process_.memorySize();
}

std::vector<Dictionary> createVolumeMessages(const MessageHistory& history,
                                             double minimumPlaytime) {
  std::vector<Dictionary> messages;
  VolumeIntervals intervals(minimumPlaytime);
  MessageHistory::Reader reader(history);
  while (const MessageHistory::Entry* entry = reader.next()) {
    auto message = intervals.add(entry->message());
    if (message.has_value()) messages.push_back(std::move(*message));
  }
  return messages;
}

}  // namespace halvox
