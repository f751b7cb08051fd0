#include "analysis/FieldCollector.h"

#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

class FieldCollectorTest : public testing::Test {
 protected:
  // A record of that kind, of the category and type Volume.State unless it has another name.
  Record record(RecordKind kind, std::string_view json, double time = 1) {
    payload_.show(json);
    Record record;
    record.kind = kind;
    record.time = time;
    record.category = "Volume";
    record.type = "State";
    record.payload = &payload_;
    return record;
  }
  void addEvent(std::string_view service, std::string_view json, double time = 1) {
    Record event = record(RecordKind::kEvent, json, time);
    event.service = service;
    collector_.add(event);
  }
  void addOther(RecordKind kind, std::string_view name, std::string_view json) {
    Record other = record(kind, json);
    other.name = name;
    other.category = other.type = {};
    collector_.add(other);
  }
  // The field of that key; an empty one if there is none.
  Field field(std::string_view key) {
    if (fields_.empty()) fields_ = collector_.take();
    for (const Field& one : fields_) {
      if (one.key == key) return one;
    }
    return {};
  }

  Payload payload_;
  FieldCollector collector_;
  std::vector<Field> fields_;
};

std::uint64_t countOf(const Field& field, FieldType type) {
  return field.types[static_cast<std::size_t>(type)];
}

TEST_F(FieldCollectorTest, KeysComeInOrderWithTheTypesOfTheirValues) {
  addEvent("halvox", R"({"i":7,"n":1.0,"e":1e300,"b":true,"t":"x","a":[1,{"in":2}],"d":{"k":{}}})");

  EXPECT_EQ(countOf(field("i"), FieldType::kInteger), 1U);
  EXPECT_EQ(countOf(field("n"), FieldType::kNumber), 1U);
  EXPECT_EQ(countOf(field("e"), FieldType::kNumber), 1U);
  EXPECT_EQ(countOf(field("b"), FieldType::kBoolean), 1U);
  EXPECT_EQ(countOf(field("t"), FieldType::kText), 1U);
  EXPECT_EQ(countOf(field("a"), FieldType::kArray), 1U);
  EXPECT_EQ(countOf(field("d"), FieldType::kDictionary), 1U);
  std::string keys;
  for (const Field& one : fields_) keys += one.key;
  EXPECT_EQ(keys, "abdeint");
}

TEST_F(FieldCollectorTest, TheExampleIsTheNewestValue) {
  addEvent("halvox", R"({"a":[1, {"b":"]"}],"d":{},"t":"old"})");
  addEvent("halvox", R"({"t":"n\"ew","f":-1.50})");

  EXPECT_EQ(field("a").example, R"([1, {"b":"]"}])");
  EXPECT_EQ(field("d").example, "{}");
  EXPECT_EQ(field("t").example, "n\"ew");
  EXPECT_EQ(field("f").example, "-1.50");
  EXPECT_FALSE(field("t").isExampleCut);
}

TEST_F(FieldCollectorTest, ALongExampleIsCutBetweenCharacters) {
  std::string text(FieldCollector::kMostExampleBytes - 1, 'x');
  addEvent("halvox", "{\"t\":\"" + text + "\u00e9\"}");

  EXPECT_EQ(field("t").example, text);
  EXPECT_TRUE(field("t").isExampleCut);
}

TEST_F(FieldCollectorTest, TheTwoEventsOfAMessageCountOnce) {
  addEvent("halvox", R"({"n":1})");
  addEvent("haptics", R"({"n":1})");
  addEvent("haptics", R"({"n":1})");  // of a message whose other event is not recorded
  addEvent("halvox", R"({"n":2})");
  addEvent("haptics", R"({"n":3})");

  EXPECT_EQ(field("n").events, 4U);
}

TEST_F(FieldCollectorTest, RecordsAreCountedByKindAndPlace) {
  addEvent("halvox", R"({"n":1})", 5);
  addEvent("halvox", R"({"n":2})", 3);
  collector_.add(record(RecordKind::kLinkMessage, R"({"n":1,"audiotag":"VolumeState"})", 4));
  addOther(RecordKind::kEvent, "com.tarno.halvox.hvreportingclientuptime", R"({"n":1})");
  addOther(RecordKind::kPowerEvent, "Oxbow_Haptics", R"({"n":1})");
  addOther(RecordKind::kSnapshot, "", R"({"n":1})");
  addOther(RecordKind::kIssueMetric, "", "");

  const Field n = field("n");
  EXPECT_EQ(n.events, 3U);
  EXPECT_EQ(n.linkMessages, 1U);
  EXPECT_EQ(n.powerEvents, 1U);
  EXPECT_EQ(n.snapshots, 1U);
  EXPECT_EQ(n.records(), 6U);
  EXPECT_EQ(n.first, 1);
  EXPECT_EQ(n.last, 5);
  ASSERT_EQ(n.places.size(), 4U);
  EXPECT_EQ(n.places[0].name, "Volume.State");
  EXPECT_EQ(n.places[0].count, 3U);
  EXPECT_EQ(n.places[1].name, "com.tarno.halvox.hvreportingclientuptime");
  EXPECT_EQ(n.places[2].name, "Oxbow_Haptics");
  EXPECT_EQ(n.places[3].name, "snapshot");
  EXPECT_EQ(field("audiotag").linkMessages, 1U);
}

TEST_F(FieldCollectorTest, KeysThatAreTooManyOrTooLongAreCounted) {
  for (std::size_t key = 0; key < FieldCollector::kMostKeys; ++key) {
    addEvent("halvox", "{\"k" + std::to_string(key) + "\":1}");
  }
  addEvent("halvox", R"({"k0":2,"one more":1,"another":1})");
  addEvent("halvox", "{\"" + std::string(FieldCollector::kMostKeyBytes + 1, 'k') + "\":1}");

  EXPECT_EQ(collector_.valuesOfOtherKeys(), 2U);
  EXPECT_EQ(collector_.valuesOfLongKeys(), 1U);
  EXPECT_EQ(collector_.take().size(), FieldCollector::kMostKeys);
}

TEST_F(FieldCollectorTest, PlacesThatAreTooManyAreCounted) {
  for (std::size_t place = 0; place < FieldCollector::kMostPlaces + 3; ++place) {
    addOther(RecordKind::kPowerEvent, "event" + std::to_string(place), R"({"n":1})");
  }

  EXPECT_EQ(field("n").places.size(), FieldCollector::kMostPlaces);
  EXPECT_EQ(field("n").otherPlaces, 3U);
}

TEST_F(FieldCollectorTest, ASummaryCountsWithItsOwnKeyOnly) {
  Record summary = record(RecordKind::kLinkMessage,
                          R"({"HV_Session_Summary_Event":"7","n":"1,2","audiotag":"x"})");
  summary.category = "Undefined";
  summary.type = "Unknown";
  collector_.add(summary);
  collector_.add(record(RecordKind::kLinkMessage, R"({"n":1})"));

  EXPECT_EQ(field("HV_Session_Summary_Event").linkMessages, 1U);
  EXPECT_EQ(countOf(field("n"), FieldType::kInteger), 1U);
  EXPECT_EQ(countOf(field("n"), FieldType::kText), 0U);
  EXPECT_EQ(fields_.size(), 2U);
}

TEST_F(FieldCollectorTest, WhatIsNotAnObjectHasNoKeys) {
  for (const char* json : {"", "7", "\"t\"", "[1]", "{", "null"}) {
    addOther(RecordKind::kPowerEvent, "event", json);
  }

  EXPECT_TRUE(collector_.take().empty());
}

}  // namespace
}  // namespace halvox::analysis
