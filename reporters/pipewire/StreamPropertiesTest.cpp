#include "reporters/pipewire/StreamProperties.h"

#include <gtest/gtest.h>

#include "reporters/pipewire/ReportingVocabulary.h"
#include "reporters/pipewire/StreamValues.h"

namespace halvox::pipewire_reporter {
namespace {

struct RoleCase {
  const char* role;
  ServiceType type;
};

class ServiceTypeForRoleTest : public testing::TestWithParam<RoleCase> {};

TEST_P(ServiceTypeForRoleTest, MapsRole) {
  EXPECT_EQ(serviceTypeForRole(GetParam().role), GetParam().type) << GetParam().role;
}

INSTANTIATE_TEST_SUITE_P(Roles, ServiceTypeForRoleTest,
                         testing::Values(RoleCase{"Communication", 2}, RoleCase{"phone", 2},
                                         RoleCase{"Music", 7}, RoleCase{"Movie", 7},
                                         RoleCase{"Game", 8}, RoleCase{"Production", 8},
                                         RoleCase{"Notification", 10}, RoleCase{"event", 10},
                                         RoleCase{"alarm", 4}, RoleCase{"", 0},
                                         RoleCase{"Screen", 8}, RoleCase{"mUSIC", 7},
                                         RoleCase{"PHONE", 2}, RoleCase{"Music ", 8}));

TEST(MakeConfigurationTest, NamesApplicationByIdThenNameThenNode) {
  Properties properties{{"node.name", "node"}};
  EXPECT_EQ(*makeConfiguration(properties).find(kApplicationKey), platform::Value("node"));

  properties["application.name"] = "Player";
  EXPECT_EQ(*makeConfiguration(properties).find(kApplicationKey), platform::Value("Player"));

  properties["pipewire.access.portal.app_id"] = "org.example.Sandboxed";
  EXPECT_EQ(*makeConfiguration(properties).find(kApplicationKey),
            platform::Value("org.example.Sandboxed"));

  properties["application.id"] = "org.example.Player";
  EXPECT_EQ(*makeConfiguration(properties).find(kApplicationKey),
            platform::Value("org.example.Player"));
}

TEST(MakeConfigurationTest, LeavesApplicationOutWhenNothingNamesIt) {
  EXPECT_FALSE(makeConfiguration({{"application.id", ""}}).contains(kApplicationKey));
}

TEST(MakeConfigurationTest, TakesStreamPropertiesOver) {
  const auto configuration = makeConfiguration({{"application.process.id", "4711"},
                                                {"application.process.binary", "player"},
                                                {"media.role", "Music"},
                                                {"media.class", "Stream/Output/Audio"},
                                                {"node.latency", "1024/48000"},
                                                {"object.serial", "55"},
                                                {"application.desktop", "player.desktop"},
                                                {"pipewire.access.portal.app_id", "org.player"},
                                                {"some.other", "thing"}});

  const platform::Dictionary expected{{"audio_framework", "PipeWire"},
                                      {"process_binary", "player"},
                                      {"media_class", "Stream/Output/Audio"},
                                      {"media_role", "Music"},
                                      {"desktop_entry", "player.desktop"},
                                      {"portal_app_id", "org.player"},
                                      {kApplicationKey, "org.player"},
                                      {"node_latency", "1024/48000"},
                                      {"process_id", 4711},
                                      {"object_serial", 55}};
  EXPECT_EQ(configuration, expected);
}

TEST(MakeConfigurationTest, EmptyPropertiesHaveNoEntry) {
  const auto configuration = makeConfiguration({{"application.desktop", ""},
                                                {"application.process.id", ""},
                                                {"media.role", ""},
                                                {"pipewire.access.portal.app_id", ""}});

  EXPECT_EQ(configuration, (platform::Dictionary{{"audio_framework", "PipeWire"}}));
}

TEST(MakeConfigurationTest, CleansTextsAndOmitsWrongNumbers) {
  const auto configuration = makeConfiguration({{"media.name", "\xFFsong"},
                                                {"application.process.id", "-3"},
                                                {"object.serial", "1e9"},
                                                {"node.name", std::string(100000, 'x')}});

  EXPECT_EQ(configuration.find("media_name")->string(), "\xEF\xBF\xBDsong");
  EXPECT_LE(configuration.find("node_name")->string().size(), kMaxTextBytes);
  EXPECT_FALSE(configuration.contains("process_id"));
  EXPECT_FALSE(configuration.contains("object_serial"));
}

TEST(NodeNameTest, ANodeWithoutANameIsNamedByItsSerial) {
  EXPECT_EQ(nodeName({{"node.name", "player\n"}}, 55), "player\xEF\xBF\xBD");
  EXPECT_EQ(nodeName({{"node.name", ""}}, 55), "node-55");
  EXPECT_EQ(nodeName({}, 55), "node-55");
}

TEST(ProcessNameTest, PrefersBinaryThenApplicationThenNode) {
  Properties properties;
  EXPECT_EQ(processName(properties), "Unknown");
  properties["node.name"] = "node";
  EXPECT_EQ(processName(properties), "node");
  properties["application.name"] = "Player";
  EXPECT_EQ(processName(properties), "Player");
  properties["application.process.binary"] = "player-bin";
  EXPECT_EQ(processName(properties), "player-bin");
}

}  // namespace
}  // namespace halvox::pipewire_reporter
