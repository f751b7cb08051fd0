#include <cstdint>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "service/DelegateFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::PostedRequest;
using platform::RequestMark;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr ReporterID kReporter{7};

// Records what happens to the requests, which it names by their serial numbers.
class NotingSource final : public platform::RequestSource {
 public:
  void answer(const RequestMark& mark, const std::optional<Error>& /*error*/,
              const Value& /*value*/) override {
    if (mark.serial == failing) throw std::runtime_error("cannot answer");
    notes.push_back("answer " + std::to_string(mark.serial));
  }
  void carriedOut(const RequestMark& mark) override {
    notes.push_back("carried out " + std::to_string(mark.serial));
  }

  std::uint32_t failing = 0;
  std::vector<std::string> notes;
};

class HVReportingClientServerInstancePostTest : public DelegateFixture<TestDelegate> {
 protected:
  HVReportingClientServerInstancePostTest() {
    client_->createReportingSession(kReporter, ignore, {});
    client_->startReportingSessionForID(kReporter, ignore, {});
    run();
  }

  static void ignore(const std::optional<Error>& /*error*/, bool /*value*/) {}

  void post(std::uint32_t serial) {
    client_->postMessage(Dictionary{{"serial", serial}}, AudioEventCategory::kPlayback,
                         AudioEventType::kState, Array{7},
                         PostedRequest(source_, {.serial = serial, .wantsAnswer = true}), 100);
  }
  std::size_t historySize() const {
    const auto session = client_->findReportingSessionForID(
        kReporter, HVReportingClientServerInstance::Lookup::kOwnSessions);
    return session == nullptr ? 0 : (*session->nestedAggregatedPayloadData())->size();
  }

  std::shared_ptr<NotingSource> source_ = std::make_shared<NotingSource>();
};

TEST_F(HVReportingClientServerInstancePostTest, ASeriesOfMessagesIsOneJob) {
  for (std::uint32_t serial = 1; serial <= 3; ++serial) post(serial);
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);

  client_->endOfRequests();

  EXPECT_EQ(platform_.dispatch.waitingJobs(), 1U);
  EXPECT_THAT(source_->notes, IsEmpty());
}

TEST_F(HVReportingClientServerInstancePostTest, EachMessageIsCarriedOutBeforeTheNext) {
  post(1);
  post(2);
  client_->endOfRequests();

  run();

  EXPECT_THAT(source_->notes,
              ElementsAre("answer 1", "carried out 1", "answer 2", "carried out 2"));
  EXPECT_EQ(historySize(), 2U);
  EXPECT_EQ(client_->resourceUse().bytes,
            (*client_
                  ->findReportingSessionForID(kReporter,
                                              HVReportingClientServerInstance::Lookup::kOwnSessions)
                  ->nestedAggregatedPayloadData())
                ->memorySize());
}

TEST_F(HVReportingClientServerInstancePostTest, AnotherRequestComesAfterThePostedMessages) {
  post(1);
  client_->destroyReportingSession(
      kReporter,
      [this](const auto& /*error*/, bool /*value*/) { source_->notes.push_back("destroyed"); }, {});
  post(2);
  client_->endOfRequests();

  run();

  EXPECT_THAT(source_->notes,
              ElementsAre("answer 1", "carried out 1", "destroyed", "answer 2", "carried out 2"));
}

TEST_F(HVReportingClientServerInstancePostTest, PostedMessagesAreChargedAtOnce) {
  const std::uint64_t before = client_->resourceUse().bytes;
  post(1);
  EXPECT_GT(client_->resourceUse().bytes, before);
}

TEST_F(HVReportingClientServerInstancePostTest, AFailureDoesNotCostTheOtherMessages) {
  source_->failing = 1;
  post(1);
  post(2);
  client_->endOfRequests();

  EXPECT_THROW(run(), std::runtime_error);

  EXPECT_THAT(source_->notes, ElementsAre("carried out 1", "answer 2", "carried out 2"));
}

TEST_F(HVReportingClientServerInstancePostTest, WithoutMessagesThereIsNoJob) {
  client_->endOfRequests();
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);
}

TEST_F(HVReportingClientServerInstancePostTest, ManySeriesAreAllCarriedOut) {
  std::uint32_t serial = 0;
  for (int series = 0; series < 50; ++series) {
    for (int message = 0; message < series * 4; ++message) post(++serial);
    client_->endOfRequests();
    if (series % 3 == 0) run();
  }
  run();
  EXPECT_EQ(source_->notes.size(), std::size_t{serial} * 2);
  EXPECT_EQ(historySize(), serial);
}

}  // namespace
}  // namespace halvox
