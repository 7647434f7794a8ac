#include "daemon/PluginHost.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <stdexcept>

#include "platform/foundation/Exceptions.h"
#include "testing/TestPlatform.h"
#include "tests/daemon/Support.h"

namespace kx::test {
namespace {

using testing::HasSubstr;

std::string loadFailure(const std::string& path) {
  ErrorPtr error;
  EXPECT_FALSE(PluginModule::load(path, &error));
  EXPECT_TRUE(error);
  EXPECT_THAT(error->message(), testing::Not(HasSubstr("\n")));
  return error->message();
}

TEST(PluginModuleTest, SaysWhatIsWrongWithAFile) {
  TempDirectory work;
  EXPECT_THAT(loadFailure(work.at("none.so")), HasSubstr("cannot find the plug-in: looked at"));
  work.write("text.so", "this is no module");
  EXPECT_THAT(loadFailure(work.at("text.so")), HasSubstr("cannot load the plug-in: "));
  EXPECT_THAT(loadFailure("/proc/self/exe"), HasSubstr("cannot load the plug-in: "));
}

TEST(PluginModuleTest, SaysThatAModuleHasNoEntryPoint) {
  EXPECT_THAT(loadFailure("/lib/x86_64-linux-gnu/libm.so.6"),
              HasSubstr("has no entry point \"kxsync_plugin_create_client\""));
}

TEST(PluginModuleTest, TheEnvironmentNamesAModuleUnlessThePathDoes) {
  ::setenv("KXSYNC_PLUGIN", "/nowhere/of-the-environment.so", 1);
  EXPECT_THAT(loadFailure(""), HasSubstr("looked at /nowhere/of-the-environment.so"));
  EXPECT_THAT(loadFailure("/nowhere/given.so"), HasSubstr("looked at /nowhere/given.so"));
  ::unsetenv("KXSYNC_PLUGIN");
}

// The real module, found beside this program.
class RealPluginTest : public testing::Test {
 protected:
  void SetUp() override {
    ErrorPtr error;
    module = PluginModule::load("", &error);
    ASSERT_TRUE(module) << error->description();
  }
  TestPlatform platform;
  std::shared_ptr<PluginModule> module;
};

TEST_F(RealPluginTest, IsFoundBesideTheProgramAndMadeOnTheQueue) {
  EXPECT_EQ(module->path(), KX_TEST_PLUGIN_PATH);
  PluginHost host(module, platform);
  ASSERT_FALSE(host.createClient());
  StringList dataclasses;
  std::string anchor;
  EXPECT_FALSE(host.call([&](FRClient& client) {
    EXPECT_TRUE(host.queue().isCurrent());
    dataclasses = client.supportedDataclasses();
    anchor = client.currentSyncAnchor();
  }));
  EXPECT_THAT(dataclasses, testing::ElementsAre("Photo"));
  EXPECT_EQ(anchor, "1");
}

TEST_F(RealPluginTest, ItsExceptionsCrossTheModulesBorder) {
  PluginHost host(module, platform);
  ASSERT_FALSE(host.createClient());
  platform.onMainThread = true;
  const auto raised =
      host.call([](FRClient& client) { client.prepareForSyncWithHostAnchor("1", {}, nullptr); });
  ASSERT_TRUE(raised);
  EXPECT_EQ(raised->name, "InternalInconsistency");
  EXPECT_THAT(raised->reason,
              HasSubstr("Ferrule plugins should only be run on a non-main-thread queue!"));
  const auto absent = host.call([](FRClient& client) { client.prioritizeAsset(nullptr); });
  ASSERT_TRUE(absent);
  EXPECT_EQ(absent->name, "InternalInconsistency");
}

TEST_F(RealPluginTest, RefusesAnotherInterfaceVersion) {
  EXPECT_EQ(module->entry()(&platform, kFRInterfaceVersion + 1), nullptr);
}

TEST_F(RealPluginTest, AClientCanBeMadeAnewManyTimes) {
  PluginHost host(module, platform);
  for (int i = 0; i < 20; ++i) {
    ASSERT_FALSE(host.createClient());
    EXPECT_FALSE(host.call([](FRClient& client) { client.syncEndedWithSuccess(false); }));
  }
  EXPECT_FALSE(host.destroyClient());
  const auto raised = host.call([](FRClient&) {});
  ASSERT_TRUE(raised);
  EXPECT_EQ(raised->reason, "the plug-in has no client");
}

TEST(CatchRaisedTest, NamesEachKindOfException) {
  EXPECT_FALSE(catchRaised([] {}));
  EXPECT_EQ(catchRaised([] { throw InternalInconsistency("a"); })->name, "InternalInconsistency");
  EXPECT_EQ(catchRaised([] { throw TypeError("k", "string", "number"); })->name, "TypeError");
  EXPECT_EQ(catchRaised([] { throw std::runtime_error("b"); })->reason, "b");
  EXPECT_EQ(catchRaised([] { throw 7; })->reason, "an exception of unknown type");
}

}  // namespace
}  // namespace kx::test
