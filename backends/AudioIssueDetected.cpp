#include "backends/AudioIssueDetected.h"

#include <utility>

#include "backends/StringHash.h"

namespace halvox::zubmetrics {

using platform::ProtoReader;
using platform::ProtoTextFormatter;
using platform::ProtoWireType;
using platform::ProtoWriter;

namespace {

// Field numbers.
constexpr std::uint32_t kTimestamp = 1;
constexpr std::uint32_t kDuration = 2;
constexpr std::uint32_t kIssueType = 3;
constexpr std::uint32_t kNode = 4;
constexpr std::uint32_t kRtaidClient = 5;

}  // namespace

AudioIssueDetected::AudioIssueDetected(AudioIssueDetected&& other) noexcept
    : issueType_(std::exchange(other.issueType_, {})),
      node_(std::exchange(other.node_, {})),
      rtaidClient_(std::exchange(other.rtaidClient_, {})),
      timestamp_(other.timestamp_),
      duration_(other.duration_),
      // The numbers of `other` stay; without the presence bit its timestamp does not count.
      present_(std::exchange(other.present_, 0)) {}

AudioIssueDetected& AudioIssueDetected::operator=(const AudioIssueDetected& other) {
  if (this == &other) return *this;
  // Copies before it changes anything. If an allocation fails, this message is as it was.
  AudioIssueDetected copy(other);
  swap(*this, copy);
  return *this;
}

AudioIssueDetected& AudioIssueDetected::operator=(AudioIssueDetected&& other) noexcept {
  if (this == &other) return *this;
  AudioIssueDetected taken(std::move(other));
  swap(*this, taken);
  return *this;
}

void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept {
  using std::swap;
  swap(left.issueType_, right.issueType_);
  swap(left.node_, right.node_);
  swap(left.rtaidClient_, right.rtaidClient_);
  swap(left.timestamp_, right.timestamp_);
  swap(left.duration_, right.duration_);
  swap(left.present_, right.present_);
}

std::optional<std::uint64_t> AudioIssueDetected::timestamp() const {
  if ((present_ & kTimestampPresent) == 0) return std::nullopt;
  return timestamp_;
}

void AudioIssueDetected::setTimestamp(std::uint64_t timestamp) {
  timestamp_ = timestamp;
  present_ |= kTimestampPresent;
}

bool AudioIssueDetected::readFrom(ProtoReader& reader) {
  while (reader.hasMore()) {
    const ProtoReader::Tag tag = reader.readTag();
    if (reader.hasError() || tag.wireType == ProtoWireType::kEndGroup) break;
    if (!readField(reader, tag.number, tag.wireType)) return false;
  }
  return !reader.hasError();
}

bool AudioIssueDetected::readField(ProtoReader& reader, std::uint64_t number,
                                   ProtoWireType wireType) {
  switch (number) {
    case kTimestamp:
      setTimestamp(reader.readVarint());
      return true;
    case kDuration:
      duration_ = static_cast<std::int32_t>(reader.readVarint());  // keeps the low 32 bits
      return true;
    case kIssueType:
      reader.readString(issueType_);
      return true;
    case kNode:
      reader.readString(node_);
      return true;
    case kRtaidClient:
      reader.readString(rtaidClient_);
      return true;
    default:
      return reader.skipField(number, wireType);
  }
}

void AudioIssueDetected::writeTo(ProtoWriter& writer) const {
  if (const auto present = timestamp()) writer.writeUInt64(*present, kTimestamp);
  // These fields are written even when they are zero or empty; this is required.
  writer.writeInt32(duration_, kDuration);
  writer.writeString(issueType_, kIssueType);
  writer.writeString(node_, kNode);
  writer.writeString(rtaidClient_, kRtaidClient);
}

void AudioIssueDetected::formatText(ProtoTextFormatter& formatter, const char* name) const {
  formatter.beginObject(name);
  // The fields are in alphabetical order, not in the order of their numbers; this is required.
  formatter.format("duration", duration_);
  formatter.format("issuetype", issueType_);
  formatter.format("node", node_);
  formatter.format("rtaidclient", rtaidClient_);
  if (const auto present = timestamp()) formatter.format("timestamp", *present);
  formatter.endObject();
}

bool AudioIssueDetected::operator==(const AudioIssueDetected& other) const {
  return timestamp() == other.timestamp() && duration_ == other.duration_ &&
         issueType_ == other.issueType_ && node_ == other.node_ &&
         rtaidClient_ == other.rtaidClient_;
}

std::uint64_t AudioIssueDetected::hash_value() const {
  return timestamp().value_or(0) ^ static_cast<std::uint64_t>(std::int64_t{duration_}) ^
         hashString(issueType_) ^ hashString(node_) ^ hashString(rtaidClient_);
}

}  // namespace halvox::zubmetrics
