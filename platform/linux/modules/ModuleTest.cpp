#include "platform/linux/modules/Module.h"

#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr Module kPlain{"halvox-test-module.so", "halvox_plain_module_2"};

// Why the module cannot be loaded; empty when it can.
template <typename Entry>
std::string reason(const Result<Entry>& loaded) {
  return loaded ? std::string() : loaded.error().message;
}

TEST(ModuleTest, EntryPointOfAModuleBesideTheProgramIsCalled) {
  const auto loaded = loadEntryPoint<int()>(kPlain);

  ASSERT_EQ(reason(loaded), "");
  EXPECT_EQ((*loaded)(), 42);
}

TEST(ModuleTest, ModuleThatIsNotBesideTheProgramIsLookedForWhereItIsInstalled) {
  const auto path = modulePath({"halvox-not-built.so", "entry"});

  EXPECT_EQ(path.filename(), "halvox-not-built.so");
  EXPECT_EQ(path.parent_path().filename(), "halvox");
  EXPECT_EQ(path, path.lexically_normal());
}

TEST(ModuleTest, MissingModuleIsNamedWithTheSystemsReason) {
  const auto why = reason(loadModule({"halvox-not-built.so", "entry"}));

  EXPECT_THAT(why, AllOf(StartsWith("halvox-not-built.so: "), HasSubstr("No such file")));
}

TEST(ModuleTest, OtherVersionOfTheEntryPointIsNotFound) {
  const auto why = reason(loadModule({kPlain.file, "halvox_plain_module_3"}));

  EXPECT_THAT(why,
              AllOf(StartsWith("halvox-test-module.so: "), HasSubstr("halvox_plain_module_3")));
}

TEST(ModuleTest, ModuleOfAnotherVersionOfTheServiceIsRefused) {
  const auto why = reason(loadModule({"halvox-test-module-of-old.so", kPlain.entryPoint}));

  EXPECT_THAT(why, AllOf(HasSubstr("is of version 0.0.0-test"), HasSubstr("from one build")));
}

TEST(ModuleTest, LibraryThatIsNotAModuleIsRefused) {
  const auto why = reason(loadModule(kPlain, "libm.so.6"));

  EXPECT_THAT(why, HasSubstr("libm.so.6 is not a module of this service"));
}

TEST(ModuleTest, FileThatIsNotALibraryIsRefused) {
  const ScratchDirectory directory;
  const auto path = directory.path() / kPlain.file;
  std::ofstream(path) << "text";

  EXPECT_THAT(reason(loadModule(kPlain, path)), StartsWith("halvox-test-module.so: "));
}

}  // namespace
}  // namespace halvox::platform::linux_
