#include "service/HVReportingServiceProtocol.h"

#include "service/ServiceFixture.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::MethodEffect;
using platform::Value;
using testing::ElementsAre;
using testing::IsEmpty;

struct Row {
  std::string_view name;
  std::string_view in;
  std::string_view out;
  MethodEffect effect;
};

constexpr auto kMore = MethodEffect::kMayHoldMore;
constexpr auto kNoMore = MethodEffect::kHoldsNoMore;

TEST(HVReportingServiceInterfaceTest, HasTheNamesThatClientsUse) {
  EXPECT_EQ(HVReportingServiceInterface().name, "com.tarno.halvox.HVReportingServiceProtocol");
  EXPECT_EQ(HVReportingServiceInterface().objectPath, "/com/tarno/halvox/reporting");
}

TEST(HVReportingServiceInterfaceTest, ListsTheMethodsWithTheirSignatures) {
  const std::vector<Row> expected{{"createReportingSession", "x", "b", MethodEffect::kMakesSession},
                                  {"setServiceType", "qx", "b", kNoMore},
                                  {"getServiceNameForReporterID", "x", "q", kNoMore},
                                  {"setConfiguration", "a{sv}x", "b", kMore},
                                  {"startReportingSessionForID", "x", "b", kMore},
                                  {"sendMessage", "a{sv}uqaax", "", kMore},
                                  {"stopReportingSessionForID", "x", "b", kNoMore},
                                  {"destroyReportingSession", "x", "b", kNoMore},
                                  {"reporterIDValid", "x", "a{sv}", kNoMore},
                                  {"getAllReporters", "", "ax", kNoMore},
                                  {"killService", "", "b", kNoMore}};

  const auto methods = HVReportingServiceInterface().methods;

  ASSERT_EQ(methods.size(), expected.size());
  for (std::size_t index = 0; index < expected.size(); ++index) {
    EXPECT_EQ(methods[index].name, expected[index].name);
    EXPECT_EQ(methods[index].in, expected[index].in) << methods[index].name;
    EXPECT_EQ(methods[index].out, expected[index].out) << methods[index].name;
    EXPECT_EQ(methods[index].effect, expected[index].effect) << methods[index].name;
    EXPECT_NE(methods[index].invoke, nullptr) << methods[index].name;
  }
}

class HVReportingServiceProtocolTest : public ServiceFixture {
 protected:
  Connection client_ = connect(100);
};

TEST_F(HVReportingServiceProtocolTest, IDsTakeAllSixtyFourBits) {
  constexpr std::int64_t kSmallest = std::numeric_limits<std::int64_t>::min();
  create(client_, kSmallest);

  EXPECT_EQ(call(client_, "getAllReporters", {})->value(), Value(Array{kSmallest}));
}

TEST_F(HVReportingServiceProtocolTest, AnswersHaveTheTypesOfTheSignatures) {
  using platform::NumberKind;
  EXPECT_EQ(create(client_, 7)->value().numberKind(), NumberKind::kBool);
  EXPECT_EQ(call(client_, "getServiceNameForReporterID", {7})->value().numberKind(),
            NumberKind::kUInt16);
  EXPECT_EQ(call(client_, "getAllReporters", {})->value().array()[0].numberKind(),
            NumberKind::kInt64);
  const Dictionary valid = call(client_, "reporterIDValid", {7})->value().dictionary();
  EXPECT_EQ(valid.find("reporterID")->numberKind(), NumberKind::kInt64);
  EXPECT_EQ(valid.find("serviceType")->numberKind(), NumberKind::kUInt16);
}

TEST_F(HVReportingServiceProtocolTest, AMessageIsAnsweredWithNothing) {
  EXPECT_THAT(send(client_, {})->replies(), ElementsAre(ok(Value())));
}

TEST_F(HVReportingServiceProtocolTest, AnEndlessListOfReporterIDsIsRefused) {
  createAndStart(client_, 7);
  const std::vector<Value> ids(10'001, Value(std::int64_t{7}));

  const Call call = post(client_, "sendMessage",
                         {Dictionary{{"a", 1}}, kCategory, kType, Array{Value(Array(ids))}});

  ASSERT_EQ(call->replies().size(), 1U);
  ASSERT_TRUE(call->replies()[0].error.has_value());
  EXPECT_EQ(call->replies()[0].error->name, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_NE(call->replies()[0].error->description.find("message_reporter_ids = 10000"),
            std::string::npos);
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);
}

TEST_F(HVReportingServiceProtocolTest, MoreThanOneListOfReporterIDsIsRefused) {
  createAndStart(client_, 7);

  const Call call = post(client_, "sendMessage",
                         {Dictionary{{"a", 1}}, kCategory, kType, Array{Array{7}, Array{7}}});

  ASSERT_EQ(call->replies().size(), 1U);
  ASSERT_TRUE(call->replies()[0].error.has_value());
  EXPECT_EQ(call->replies()[0].error->name, "org.freedesktop.DBus.Error.InvalidArgs");
  EXPECT_EQ(call->replies()[0].error->description,
            "sendMessage: argument 4: expected at most one list of reporter IDs, found 2");
  EXPECT_EQ(platform_.dispatch.waitingJobs(), 0U);
}

TEST_F(HVReportingServiceProtocolTest, AnEmptyListOfIDsIsNotTheAbsenceOfAList) {
  createAndStart(client_, 7);

  send(client_, Array{});
  EXPECT_EQ(historySize(client_, 7), 0U);

  sendToAll(client_);
  EXPECT_EQ(historySize(client_, 7), 1U);
}

}  // namespace
}  // namespace halvox
