// The host: module libraries loaded from their real shared objects, their errors, and the
// `zefoko serve` process stopped by a signal.
#include <gtest/gtest.h>
#include <signal.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <vector>

#include "ko_test_helpers.hpp"
#include "ko_test_process.hpp"
#include "zefoko/host.h"
#include "zu/zuproxy.h"

namespace zefoko {
namespace {

HostOptions quietRobot() {
  HostOptions options;
  options.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  return options;
}

bool hasService(Host& host, const std::string& name) {
  const auto names = host.broker()->session()->services();
  return std::find(names.begin(), names.end(), name) != names.end();
}

TEST(Host, LoadsAModuleLibraryAndEndsItsModuleAtShutdown) {
  Host host(quietRobot());
  EXPECT_EQ(host.loadModuleLibrary(ZEFOKO_TEST_PLUGIN), std::vector<std::string>{"ZUEcho"});
  EXPECT_EQ(ZU::ZUProxy("ZUEcho", host.broker()).call<std::string>("echo", "hello"), "hello");
  EXPECT_EQ(host.moduleNames(), std::vector<std::string>{"ZUEcho"});
  host.shutdown();
  EXPECT_TRUE(host.moduleNames().empty());
  host.shutdown();  // twice is harmless
}

struct BadLibrary {
  const char* name;
  std::string path;
  const char* expected;
  bool failingCreate;
};

TEST(Host, ALibraryThatCannotServeIsAClearError) {
  const BadLibrary cases[] = {
      {"missing file", "/nonexistent/libnothing.so", "Cannot load the module library", false},
      {"not a module library", ZEFOKO_TEST_PLAIN_LIBRARY, "is not a module library", false},
      {"failing _createModule", ZEFOKO_TEST_PLUGIN, "cannot be created: \tZUEcho::_createModule",
       true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    if (c.failingCreate)
      setenv("ZUECHO_FAIL", "1", 1);
    Host host(quietRobot());
    const std::string error = ko::test::errorOf<HostError>([&] { host.loadModuleLibrary(c.path); });
    EXPECT_NE(error.find(c.expected), std::string::npos) << error;
    unsetenv("ZUECHO_FAIL");
    EXPECT_FALSE(hasService(host, "ZUEcho"));
  }
  HostOptions crouching = quietRobot();
  crouching.postureFamily = "Crouching";
  EXPECT_THROW(Host{crouching}, HostError);
}

// `zefoko serve` loads the library, serves until SIGTERM, then ends the modules.
TEST(ZefokoServe, ServesUntilSigtermThenStops) {
  ko::test::ChildProcess serve(
      {ZEFOKO_EXECUTABLE, "serve", "--speech", "timing", ZEFOKO_TEST_PLUGIN});
  EXPECT_TRUE(serve.waitForLine("loaded " ZEFOKO_TEST_PLUGIN " ZUEcho")) << serve.output();
  ASSERT_TRUE(serve.waitForLine("serving")) << serve.output();
  serve.kill(SIGTERM);
  EXPECT_EQ(serve.wait(std::chrono::seconds(30)), 0) << serve.output();
  EXPECT_NE(serve.output().find("SIGTERM, stopping"), std::string::npos) << serve.output();
  EXPECT_NE(serve.output().find("stopped"), std::string::npos) << serve.output();
}

}  // namespace
}  // namespace zefoko
