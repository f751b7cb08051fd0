#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/protobuf.h"

namespace halvox::zubmetrics {

// The protocol-buffers message of one audio issue, as the diagnostics metrics receive it. A plain
// value: one thread at a time may use it.
class AudioIssueDetected final : public platform::ProtoBase {
 public:
  AudioIssueDetected() = default;
  ~AudioIssueDetected() override = default;
  AudioIssueDetected(const AudioIssueDetected& other) = default;
  // Leaves `other` with empty texts and without a timestamp.
  AudioIssueDetected(AudioIssueDetected&& other) noexcept;
  // Leaves this message unchanged if copying throws.
  AudioIssueDetected& operator=(const AudioIssueDetected& other);
  AudioIssueDetected& operator=(AudioIssueDetected&& other) noexcept;
  friend void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept;

  [[nodiscard]] const std::string& issueType() const { return issueType_; }
  [[nodiscard]] const std::string& node() const { return node_; }
  [[nodiscard]] const std::string& rtaidClient() const { return rtaidClient_; }
  [[nodiscard]] std::optional<std::uint64_t> timestamp() const;
  [[nodiscard]] std::int32_t duration() const { return duration_; }
  void setIssueType(std::string_view issueType) { issueType_ = issueType; }
  void setNode(std::string_view node) { node_ = node; }
  void setRtaidClient(std::string_view rtaidClient) { rtaidClient_ = rtaidClient; }
  void setTimestamp(std::uint64_t timestamp);
  // Makes the timestamp absent. The stored value stays but no longer counts.
  void clearTimestamp() { present_ &= ~kTimestampPresent; }
  void setDuration(std::int32_t duration) { duration_ = duration; }

  // Merges the encoded fields into this message. Skips unknown fields. Returns false when the bytes
  // end within a field or a field cannot be skipped; fields before the error keep their new values.
  //
  // Two rules look like mistakes and are required: the wire type of a known field is not checked,
  // and a stray end-of-group tag ends the message without an error.
  [[nodiscard]] bool readFrom(platform::ProtoReader& reader) override;
  // Writes the fields in the order of their numbers, empty ones included; only an absent timestamp
  // is omitted.
  void writeTo(platform::ProtoWriter& writer) const override;
  // Formats the fields in alphabetical order and omits an absent timestamp.
  void formatText(platform::ProtoTextFormatter& formatter, const char* name) const override;

  // Compares all fields. Absent timestamps are equal, whatever value is stored.
  bool operator==(const AudioIssueDetected& other) const;
  // Returns a hash that is the same for equal messages in every program and every run.
  [[nodiscard]] std::uint64_t hash_value() const;

 private:
  static constexpr std::uint32_t kTimestampPresent = 1;

  [[nodiscard]] bool readField(platform::ProtoReader& reader, std::uint64_t number,
                               platform::ProtoWireType wireType);

  std::string issueType_;
  std::string node_;
  std::string rtaidClient_;
  std::uint64_t timestamp_ = 0;
  std::int32_t duration_ = 0;
  std::uint32_t present_ = 0;
};

}  // namespace halvox::zubmetrics
