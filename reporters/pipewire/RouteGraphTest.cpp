#include "reporters/pipewire/RouteGraph.h"

#include <gtest/gtest.h>

namespace halvox::pipewire_reporter {
namespace {

constexpr GlobalID kSpeakers = 10;
constexpr GlobalID kHeadphones = 11;
constexpr GlobalID kStream = 20;

class RouteGraphTest : public testing::Test {
 protected:
  RouteGraphTest() {
    graph.addDevice(kSpeakers, {.name = "speakers", .description = "Speakers"});
    graph.addDevice(kHeadphones, {.name = "headphones", .description = "Headphones"});
  }
  [[nodiscard]] std::vector<std::string> names(Direction direction = Direction::kPlayback) const {
    std::vector<std::string> result;
    for (const auto& device : graph.routeOf(kStream, direction).devices) {
      result.push_back(device.name);
    }
    return result;
  }
  RouteGraph graph;
};

using Names = std::vector<std::string>;

TEST_F(RouteGraphTest, NodesAreLinkedInBothDirectionsUntilTheLastLinkIsRemoved) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});
  graph.addLink(2, {.output = kStream, .input = kSpeakers});

  EXPECT_TRUE(graph.areLinked(kStream, kSpeakers));
  EXPECT_TRUE(graph.areLinked(kSpeakers, kStream));
  EXPECT_FALSE(graph.areLinked(kStream, kHeadphones));

  graph.removeLink(1);
  EXPECT_TRUE(graph.areLinked(kStream, kSpeakers));
  graph.removeLink(2);
  EXPECT_FALSE(graph.areLinked(kStream, kSpeakers));
}

TEST_F(RouteGraphTest, NamesADeviceOnceHoweverManyChannelsAreLinked) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});
  graph.addLink(2, {.output = kStream, .input = kSpeakers});

  EXPECT_EQ(names(), Names({"speakers"}));
}

TEST_F(RouteGraphTest, KeepsADeviceUntilItsLastLinkIsRemoved) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});
  graph.addLink(2, {.output = kStream, .input = kSpeakers});

  graph.removeLink(1);
  EXPECT_EQ(names(), Names({"speakers"}));
  graph.removeLink(2);

  EXPECT_EQ(names(), Names());
}

TEST_F(RouteGraphTest, OrdersDevicesByName) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});
  graph.addLink(2, {.output = kStream, .input = kHeadphones});

  EXPECT_EQ(names(), Names({"headphones", "speakers"}));
}

TEST_F(RouteGraphTest, FollowsTheDirectionOfTheStream) {
  graph.addLink(1, {.output = kSpeakers, .input = kStream});

  EXPECT_EQ(names(Direction::kRecord), Names({"speakers"}));
  EXPECT_EQ(names(Direction::kPlayback), Names());
}

TEST_F(RouteGraphTest, IgnoresPeersThatAreNotDevices) {
  graph.addLink(1, {.output = kStream, .input = 99});

  EXPECT_EQ(names(), Names());
}

TEST_F(RouteGraphTest, RepeatedAndUnknownLinksChangeNothing) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});
  graph.addLink(1, {.output = kStream, .input = kHeadphones});
  graph.removeLink(7);

  EXPECT_EQ(names(), Names({"speakers"}));
  EXPECT_EQ(graph.removeLink(1).input, kSpeakers);
  EXPECT_EQ(graph.removeLink(1).input, 0U);
}

TEST_F(RouteGraphTest, ForgetsEverythingWhenCleared) {
  graph.addLink(1, {.output = kStream, .input = kSpeakers});

  graph.clear();

  EXPECT_EQ(names(), Names());
}

}  // namespace
}  // namespace halvox::pipewire_reporter
