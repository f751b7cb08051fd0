#include "reporters/pipewire/NodeDirectory.h"

#include <gtest/gtest.h>

namespace halvox::pipewire_reporter {
namespace {

constexpr GlobalID kNode = 40;

Properties named(const char* name, const char* process = "") {
  return {{"node.name", name}, {"application.process.binary", process}};
}

TEST(NodeDirectoryTest, ANodeHasItsNameSerialAndProcess) {
  NodeDirectory nodes;
  nodes.set(kNode, 77, named("player", "player-bin"));

  const LateNode node = nodes.describe(kNode, "player");

  EXPECT_EQ(node.id, kNode);
  EXPECT_EQ(node.name, "player");
  EXPECT_EQ(node.serial, 77U);
  EXPECT_EQ(node.process, "player-bin");
}

TEST(NodeDirectoryTest, OfAnUnknownNodeOnlyTheNameOfTheProfilerIsKnown) {
  const LateNode node = NodeDirectory().describe(kNode,
                                                 "play\x01"
                                                 "er");

  EXPECT_EQ(node.name,
            "play\xEF\xBF\xBD"
            "er");
  EXPECT_FALSE(node.serial.has_value());
  EXPECT_EQ(node.process, "");
}

TEST(NodeDirectoryTest, ANodeThatHasDisappearedIsStillKnown) {
  NodeDirectory nodes;
  nodes.set(kNode, 77, named("player", "player-bin"));

  nodes.remove(kNode);
  nodes.remove(kNode);

  EXPECT_EQ(nodes.describe(kNode, "player").serial, 77U);
  EXPECT_EQ(nodes.describe(kNode, "player").process, "player-bin");
}

TEST(NodeDirectoryTest, ANodeThatHasTheIdOfOneThatDisappearedIsNotTakenForIt) {
  NodeDirectory nodes;
  nodes.set(kNode, 77, named("player", "player-bin"));
  nodes.remove(kNode);
  nodes.set(kNode, 78, named("browser", "browser-bin"));

  EXPECT_EQ(nodes.describe(kNode, "player").serial, 77U);
  EXPECT_EQ(nodes.describe(kNode, "browser").serial, 78U);
  EXPECT_EQ(nodes.describe(kNode, "").serial, 78U);
  EXPECT_FALSE(nodes.describe(kNode, "another").serial.has_value());
}

TEST(NodeDirectoryTest, OfSeveralThatDisappearedTheLatestIsMeant) {
  NodeDirectory nodes;
  for (const std::uint64_t serial : {77U, 78U}) {
    nodes.set(kNode, serial, named("player"));
    nodes.remove(kNode);
  }

  EXPECT_EQ(nodes.describe(kNode, "player").serial, 78U);
}

TEST(NodeDirectoryTest, NewPropertiesReplaceTheOld) {
  NodeDirectory nodes;
  nodes.set(kNode, 77, named("player"));
  nodes.set(kNode, 77, named("player", "player-bin"));

  EXPECT_EQ(nodes.describe(kNode, "player").process, "player-bin");
}

TEST(NodeDirectoryTest, NodesOfAnotherServerAreForgotten) {
  NodeDirectory nodes;
  nodes.set(kNode, 77, named("player"));
  nodes.set(kNode + 1, 78, named("browser"));
  nodes.remove(kNode + 1);

  nodes.clear();

  EXPECT_FALSE(nodes.describe(kNode, "player").serial.has_value());
  EXPECT_FALSE(nodes.describe(kNode + 1, "browser").serial.has_value());
}

TEST(NodeDirectoryTest, ABoundedNumberIsKept) {
  NodeDirectory nodes;
  for (GlobalID id = 0; id <= NodeDirectory::kMaxNodes; ++id) nodes.set(id, id, named("n"));
  EXPECT_FALSE(nodes.describe(NodeDirectory::kMaxNodes, "n").serial.has_value());
  nodes.set(0, 5, named("n"));
  EXPECT_EQ(nodes.describe(0, "n").serial, 5U);

  for (GlobalID id = 0; id <= NodeDirectory::kMaxGone; ++id) nodes.remove(id);
  EXPECT_FALSE(nodes.describe(0, "n").serial.has_value());
  EXPECT_EQ(nodes.describe(1, "n").serial, 1U);
}

}  // namespace
}  // namespace halvox::pipewire_reporter
