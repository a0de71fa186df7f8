// The host: module libraries loaded from their real shared objects, their errors, and the
// `zefoko serve` process stopped by a signal.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "ko/log.hpp"
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
    try {
      host.loadModuleLibrary(c.path);
      ADD_FAILURE() << "no error";
    } catch (const HostError& e) {
      EXPECT_NE(std::string(e.what()).find(c.expected), std::string::npos) << e.what();
    }
    unsetenv("ZUECHO_FAIL");
    EXPECT_FALSE(hasService(host, "ZUEcho"));
  }
  HostOptions crouching = quietRobot();
  crouching.postureFamily = "Crouching";
  EXPECT_THROW(Host{crouching}, HostError);
}

// `zefoko serve` loads the library, serves until SIGTERM, then ends the modules.
TEST(ZefokoServe, ServesUntilSigtermThenStops) {
  int out[2];
  ASSERT_EQ(pipe(out), 0);
  const pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    dup2(out[1], STDOUT_FILENO);
    close(out[0]);
    execl(ZEFOKO_EXECUTABLE, ZEFOKO_EXECUTABLE, "serve", "--speech", "timing", ZEFOKO_TEST_PLUGIN,
          static_cast<char*>(nullptr));
    _exit(127);
  }
  close(out[1]);
  FILE* lines = fdopen(out[0], "r");
  std::string seen;
  char line[512];
  while (fgets(line, sizeof line, lines)) {
    seen += line;
    if (seen.find("serving") != std::string::npos)
      break;
  }
  EXPECT_NE(seen.find("loaded " ZEFOKO_TEST_PLUGIN " ZUEcho"), std::string::npos) << seen;
  kill(child, SIGTERM);
  while (fgets(line, sizeof line, lines))
    seen += line;
  fclose(lines);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << seen;
  EXPECT_NE(seen.find("SIGTERM, stopping"), std::string::npos) << seen;
  EXPECT_NE(seen.find("stopped"), std::string::npos) << seen;
}

}  // namespace
}  // namespace zefoko
