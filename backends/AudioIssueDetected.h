#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/protobuf.h"

namespace halvox::zubmetrics {

// One audio issue as the diagnostics metrics know it. A plain value of one thread.
class AudioIssueDetected final : public platform::ProtoBase {
 public:
  AudioIssueDetected() = default;
  ~AudioIssueDetected() override = default;
  AudioIssueDetected(const AudioIssueDetected& other) = default;
  // Leaves its texts empty and its timestamp absent.
  AudioIssueDetected(AudioIssueDetected&& other) noexcept;
  // Leaves this message as it was when copying fails.
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
  // The timestamp is absent from now on, whatever it was.
  void clearTimestamp() { present_ &= ~kTimestampPresent; }
  void setDuration(std::int32_t duration) { duration_ = duration; }

  // Adds what the bytes have to what the message has. Fields are known by their numbers alone, so a
  // value of another wire type is read as the field's own; unknown fields are skipped. The end of a
  // group that was not begun ends the message without an error.
  [[nodiscard]] bool readFrom(platform::ProtoReader& reader) override;
  // All fields but an absent timestamp, in the order of their numbers.
  void writeTo(platform::ProtoWriter& writer) const override;
  // The fields in alphabetical order, without an absent timestamp.
  void formatText(platform::ProtoTextFormatter& formatter, const char* name) const override;

  // Equal fields; an absent timestamp equals only an absent one.
  bool operator==(const AudioIssueDetected& other) const;
  // The same for equal messages, in every run of every program.
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
