#include "client/SessionTable.h"

#include <string>

#include <gtest/gtest.h>

namespace halvox::client {
namespace {

// Returns the operations as text, which makes a failed comparison easy to read.
std::string words(const std::vector<SessionOperation>& operations) {
  static constexpr const char* kVerbs[] = {"create", "type", "configure",
                                           "start",  "stop", "destroy"};
  std::string text;
  for (const auto& operation : operations) {
    text += kVerbs[operation.step.index()] + (" " + std::to_string(operation.id)) + ";";
  }
  return text;
}

SessionTable tableAfter(const std::vector<SessionOperation>& operations) {
  SessionTable table;
  for (const auto& operation : operations) table.apply(operation);
  return table;
}

TEST(SessionTableTest, RemakesARunningSessionWithAllThatItWas) {
  const auto table = tableAfter(
      {{7, CreateSession{}}, {7, ServiceType{2}}, {7, Dictionary{{"a", 1}}}, {7, StartSession{}}});

  EXPECT_EQ(words(table.remake()), "create 7;type 7;configure 7;start 7;");
}

TEST(SessionTableTest, DoesNotStartWhatWasStopped) {
  const auto table = tableAfter({{7, CreateSession{}}, {7, StartSession{}}, {7, StopSession{}}});

  EXPECT_EQ(words(table.remake()), "create 7;");
}

TEST(SessionTableTest, ForgetsWhatWasDestroyed) {
  const auto table =
      tableAfter({{7, CreateSession{}}, {8, CreateSession{}}, {7, DestroySession{}}});

  EXPECT_EQ(words(table.remake()), "create 8;");
}

TEST(SessionTableTest, MergesConfigurations) {
  const auto table = tableAfter({{7, CreateSession{}},
                                 {7, Dictionary{{"a", 1}, {"b", 1}}},
                                 {7, Dictionary{{"b", 2}, {"c", 2}}}});

  EXPECT_EQ(std::get<Dictionary>(table.remake().at(1).step),
            (Dictionary{{"a", 1}, {"b", 2}, {"c", 2}}));
}

TEST(SessionTableTest, CreatingAgainBeginsAnew) {
  const auto table = tableAfter(
      {{7, CreateSession{}}, {7, ServiceType{2}}, {7, StartSession{}}, {7, CreateSession{}}});

  EXPECT_EQ(words(table.remake()), "create 7;");
}

TEST(SessionTableTest, KeepsTheOrderOfCreation) {
  const auto table = tableAfter({{9, CreateSession{}}, {3, CreateSession{}}, {5, CreateSession{}}});

  EXPECT_EQ(words(table.remake()), "create 9;create 3;create 5;");
}

TEST(SessionTableTest, IgnoresOperationsOnSessionsThatAreNotThere) {
  const auto table = tableAfter({{7, ServiceType{2}}, {7, StartSession{}}, {7, DestroySession{}}});

  EXPECT_EQ(table.size(), 0U);
}

TEST(SessionTableTest, CountsRunningSessionsWhateverEndsThem) {
  SessionTable table = tableAfter({{7, CreateSession{}},
                                   {7, StartSession{}},
                                   {7, StartSession{}},
                                   {8, CreateSession{}},
                                   {8, StartSession{}},
                                   {9, CreateSession{}},
                                   {9, StartSession{}}});
  EXPECT_EQ(table.running(), 3U);

  table.apply({7, StopSession{}});
  table.apply({8, DestroySession{}});
  table.apply({9, CreateSession{}});

  EXPECT_EQ(table.running(), 0U);
}

}  // namespace
}  // namespace halvox::client
