#pragma once

#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/metrics.h"

namespace halvox::platform::contract {

// A metric as it was recorded: its identifier and the bytes of its message.
using RecordedMetric = std::pair<std::uint32_t, std::string>;

// A message with one text in field 3, or with no field if there is no text.
class ContractMessage final : public ProtoBase {
 public:
  explicit ContractMessage(std::optional<std::string> text) : text_(std::move(text)) {}

  void setText(std::string text) { text_ = std::move(text); }
  bool readFrom(ProtoReader& /*reader*/) override { return false; }
  void writeTo(ProtoWriter& writer) const override {
    if (text_.has_value()) writer.writeString(*text_, 3);
  }
  void formatText(ProtoTextFormatter& /*formatter*/, const char* /*name*/) const override {}

 private:
  std::optional<std::string> text_;
};

// What every MetricService promises.
//
// `Harness` is default-constructible and has
//   MetricService& service();
//   std::vector<RecordedMetric> recorded();  all metrics so far; called once, after the last one
template <typename Harness>
class MetricContract : public ::testing::Test {
 protected:
  Harness harness_;
};
TYPED_TEST_SUITE_P(MetricContract);

TYPED_TEST_P(MetricContract, MetricIsItsIdentifierAndItsEncodedMessage) {
  this->harness_.service().postIssueMetric(0x5B0003, ContractMessage("hi"));

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedMetric{0x5B0003, "\x1A\x02hi"}));
}

TYPED_TEST_P(MetricContract, AnyIdentifierAndAnEmptyMessageWillDo) {
  constexpr std::uint32_t kGreatest = std::numeric_limits<std::uint32_t>::max();

  this->harness_.service().postIssueMetric(0, ContractMessage(std::nullopt));
  this->harness_.service().postIssueMetric(kGreatest, ContractMessage(std::nullopt));

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedMetric{0, ""}, RecordedMetric{kGreatest, ""}));
}

TYPED_TEST_P(MetricContract, BytesThatAreNoTextAreKept) {
  const std::string bytes("a\0b\xFF", 4);

  this->harness_.service().postIssueMetric(1, ContractMessage(bytes));

  EXPECT_THAT(this->harness_.recorded(),
              ::testing::ElementsAre(RecordedMetric{1, "\x1A\x04" + bytes}));
}

TYPED_TEST_P(MetricContract, MessageMayChangeOnceItIsPosted) {
  ContractMessage message("one");

  this->harness_.service().postIssueMetric(1, message);
  message.setText("another");

  EXPECT_THAT(this->harness_.recorded(), ::testing::ElementsAre(RecordedMetric{1, "\x1A\x03one"}));
}

TYPED_TEST_P(MetricContract, MetricsKeepTheirOrderEqualOnesToo) {
  for (const std::uint32_t metric : {3U, 1U, 1U, 2U}) {
    this->harness_.service().postIssueMetric(metric, ContractMessage(std::nullopt));
  }

  std::vector<std::uint32_t> identifiers;
  for (const auto& [identifier, bytes] : this->harness_.recorded())
    identifiers.push_back(identifier);
  EXPECT_EQ(identifiers, (std::vector<std::uint32_t>{3, 1, 1, 2}));
}

REGISTER_TYPED_TEST_SUITE_P(MetricContract, MetricIsItsIdentifierAndItsEncodedMessage,
                            AnyIdentifierAndAnEmptyMessageWillDo, BytesThatAreNoTextAreKept,
                            MessageMayChangeOnceItIsPosted, MetricsKeepTheirOrderEqualOnesToo);

}  // namespace halvox::platform::contract
