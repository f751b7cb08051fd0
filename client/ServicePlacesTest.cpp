#include "client/ServicePlaces.h"

#include <cerrno>
#include <cstdlib>

#include <gtest/gtest.h>

namespace halvox::client {
namespace {

using Places = std::vector<std::string>;

// Unsets the environment variables that the places depend on.
class ServicePlacesTest : public testing::Test {
 protected:
  ServicePlacesTest() { clear(); }
  ~ServicePlacesTest() override { clear(); }

 private:
  static void clear() {
    unsetenv("HALVOX_SOCKET");
    unsetenv("XDG_RUNTIME_DIR");
  }
};

TEST_F(ServicePlacesTest, TheUsersPlaceComesBeforeTheSystems) {
  EXPECT_EQ(socketPlaces(), Places{"/run/halvox/reporting.sock"});
  setenv("XDG_RUNTIME_DIR", "/run/user/1", 1);
  EXPECT_EQ(socketPlaces(),
            (Places{"/run/user/1/halvox/reporting.sock", "/run/halvox/reporting.sock"}));
}

TEST_F(ServicePlacesTest, WhatIsNamedIsTheOnlyPlace) {
  setenv("XDG_RUNTIME_DIR", "/run/user/1", 1);
  setenv("HALVOX_SOCKET", "/from/the/environment", 1);

  EXPECT_EQ(socketPlaces(), Places{"/from/the/environment"});
  EXPECT_EQ(socketPlaces("/named"), Places{"/named"});
}

TEST_F(ServicePlacesTest, ARelativeRuntimeDirectoryIsIgnored) {
  setenv("XDG_RUNTIME_DIR", "run", 1);

  EXPECT_EQ(socketPlaces(), Places{"/run/halvox/reporting.sock"});
}

TEST_F(ServicePlacesTest, OnlyWhatSaysThatNothingIsThereLeadsToTheNextPlace) {
  EXPECT_TRUE(meansAbsence(ENOENT));
  EXPECT_TRUE(meansAbsence(ENOTDIR));
  EXPECT_TRUE(meansAbsence(ECONNREFUSED));
  EXPECT_FALSE(meansAbsence(EACCES));
  EXPECT_FALSE(meansAbsence(EAGAIN));
}

TEST_F(ServicePlacesTest, FailuresNameAllPlacesInTheirOrder) {
  EXPECT_EQ(describeTried("service", {{"/a", ENOENT}}),
            "no service at /a: No such file or directory");
  EXPECT_EQ(describeTried("store", {{"/a", ENOENT}, {"/b", ECONNREFUSED}}),
            "no store found; tried /a (No such file or directory), then /b (Connection refused)");
}

}  // namespace
}  // namespace halvox::client
