// The robot, the service and its callers in processes of their own, as on a robot: a text
// spoken end to end across three processes (and from a Python script), and the processes
// that die: the robot's mid-text, a caller's mid-say, the listening one restarted.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "ko_test_process.hpp"
#include "zefoko/host.h"

namespace {

using namespace std::chrono_literals;
using ko::test::ChildProcess;

// A start, a wait, a sound, a call of a method that its service lacks, an affectation and a
// tag; in random mode a text keeps its own actions alone.
const std::string kText =
    "Hello ^start(animations/Stand/Gestures/Hey_1) my friend "
    "^wait(animations/Stand/Gestures/Hey_1) bye ^runSound(bells/ding, 50) "
    "^call(ZUMemory.nosuch(1)) "
    "$done=1 ^startTag(hello) see you";

class RemoteProcesses : public ::testing::Test {
 protected:
  std::unique_ptr<ChildProcess> startRobot(bool fast) {
    std::vector<std::string> argv{ZEFOKO_EXECUTABLE, "serve",  "--listen",    endpoint,
                                  "--speech",        "timing", "--heartbeat", "200"};
    if (fast)
      argv.emplace_back("--fast");
    auto robot = std::make_unique<ChildProcess>(argv);
    EXPECT_TRUE(robot->waitForLine("zefoko serve: serving")) << robot->output();
    return robot;
  }
  std::unique_ptr<ChildProcess> startHost() {
    auto host = std::make_unique<ChildProcess>(std::vector<std::string>{
        ZEFOKO_EXECUTABLE, "serve", "--connect", endpoint, "--heartbeat", "200", MOKUTO_MODULE});
    EXPECT_TRUE(host->waitForLine("zefoko serve: serving")) << host->output();
    return host;
  }
  // `mokuto say` with the actions of its timeline file: [type, text, outcome, failure] each.
  std::vector<std::vector<std::string>> say(std::vector<std::string> argv, const char* file) {
    const std::string timeline = (folder / file).string();
    argv.insert(argv.end(), {"--mode", "random", "--quiet", "--timeline", timeline, kText});
    ChildProcess client(argv);
    EXPECT_EQ(client.wait(60s), 0) << client.output();
    std::vector<std::vector<std::string>> actions;
    std::ifstream in(timeline);
    for (std::string line; std::getline(in, line);) {
      const auto entry = nlohmann::json::parse(line);
      if (entry["service"] == "ZUMokuto" && entry["operation"] == "action") {
        const auto& a = entry["arguments"];
        actions.push_back({a["type"], a["text"], a["outcome"], a["failure"].dump()});
      }
      if (entry["service"] == "ZUMemory" && entry["operation"] == "raiseEvent" &&
          entry["arguments"][0] == "ZUMokuto/EndOfMokuto")
        actions.push_back({"end", entry["arguments"][0], "", ""});
    }
    return actions;
  }

  ko::test::ScratchFolder scratch;
  const std::filesystem::path& folder = scratch.path();
  const std::string endpoint = "ipc://" + (folder / "robot").string();
};

TEST_F(RemoteProcesses, ATextGivesTheSameActionsAndEndAcrossThreeProcessesAsInOne) {
  const auto robot = startRobot(true);
  const auto host = startHost();
  const auto apart = say({MOKUTO_EXECUTABLE, "--connect", endpoint, "say"}, "apart.jsonl");
  const auto together =
      say({MOKUTO_EXECUTABLE, "say", "--speech", "timing", "--fast"}, "together.jsonl");
  ASSERT_EQ(apart.size(), 7U);  // six actions and the end event
  EXPECT_EQ(apart, together);
  for (std::size_t k = 0; k + 1 < apart.size(); ++k)
    EXPECT_EQ(apart[k][2], k == 3 ? "failed" : "executed") << apart[k][1];
  EXPECT_EQ(apart[3][3], "\"Cannot find method 'nosuch' on ZUMemory\"");

  // A robot programmer's script.
  ChildProcess script({PYTHON_EXECUTABLE, SAY_EXAMPLE, endpoint,
                       "Hi ^start(animations/Stand/Gestures/Hey_1) there"});
  EXPECT_TRUE(script.waitForLine("ZUMokuto/EndOfMokuto")) << script.output();
  EXPECT_EQ(script.wait(30s), 0) << script.output();
}

// The host in this process: its module's state can be read after the robot's process died.
TEST_F(RemoteProcesses, ARobotKilledMidTextEndsTheTextAndTheNextIsSpokenOnceItIsBack) {
  ko::log::ScopedCapture capture(ko::log::Warning);
  auto robot = startRobot(false);
  zefoko::HostOptions options;
  options.connect = endpoint;
  options.remote.heartbeatInterval = 200ms;
  options.remote.heartbeatTimeout = 1000ms;
  zefoko::Host host(options);
  ASSERT_TRUE(host.session()->waitForLink(10s));
  host.loadModuleLibrary(MOKUTO_MODULE);
  const auto mokuto = [&] { return host.session()->service("ZUMokuto", "local").value(); };

  ko::test::Gate started;
  const auto timeline = host.session()->service("ZUTimeline").value(10000);
  timeline->connect("entryRecorded", [&](std::int64_t, std::string service, std::string operation,
                                         ko::AnyValue, ko::AnyValue) {
    if (service == "ZUTextToSpeech" && operation == "started")
      started.open();
  });
  const ko::Future<void> said = mokuto()->async<void>("say", kText);
  ASSERT_TRUE(started.wait());
  robot->kill(SIGKILL);
  ASSERT_TRUE(robot->wait(10s));

  // The text ends by the director's own limits, and the log says why.
  EXPECT_NE(said.wait(30000), ko::FutureState::Timeout);
  EXPECT_TRUE(
      capture->containsPart("ko.remote", ko::log::Warning, "Lost the link with " + endpoint));
  EXPECT_TRUE(
      capture->containsPart("mokuto.director", ko::log::Error, "has not been received in time"));
  EXPECT_FALSE(mokuto()->call<bool>("_isRunning"));

  // A new robot process: the module is made again for it, and speaks.
  robot = startRobot(true);
  ASSERT_TRUE(ko::test::eventually([&] { return host.session()->isLinked(); }));
  ASSERT_TRUE(host.reloadModules());
  EXPECT_NO_THROW(mokuto()->call<void>(
      "say", std::string("Again ^start(animations/Stand/Gestures/Hey_1) here")));
  host.shutdown();
}

TEST_F(RemoteProcesses, AClientStopsItsOwnTextOnSigintAndOneKilledMidSayLetsTheTextEnd) {
  const auto robot = startRobot(false);
  const auto host = startHost();
  {
    ChildProcess client({MOKUTO_EXECUTABLE, "--connect", endpoint, "say", "--mode", "random",
                         "One two ^start(animations/Stand/Gestures/Hey_1) three four five."});
    ASSERT_TRUE(client.waitForLine("speech started")) << client.output();
    client.kill(SIGINT);
    EXPECT_EQ(client.wait(30s), 130) << client.output();
    EXPECT_NE(client.output().find("speech stopped"), std::string::npos) << client.output();
    EXPECT_NE(client.output().find("stopped after"), std::string::npos) << client.output();
  }
  auto session = std::make_shared<ko::Session>();
  session->connect(endpoint);
  ASSERT_TRUE(session->waitForLink(10s));
  ko::test::Gate ended;
  session->service("ZUTimeline")
      .value(10000)
      ->connect("entryRecorded", [&](std::int64_t, std::string service, std::string operation,
                                     ko::AnyValue arguments, ko::AnyValue) {
        if (service == "ZUMemory" && operation == "raiseEvent" &&
            arguments.asList().at(0).asString() == "ZUMokuto/EndOfMokuto")
          ended.open();
      });
  ChildProcess client({MOKUTO_EXECUTABLE, "--connect", endpoint, "say", "--mode", "random",
                       "One two ^start(animations/Stand/Gestures/Hey_1) three four five."});
  ASSERT_TRUE(client.waitForLine("speech started")) << client.output();
  client.kill(SIGKILL);
  EXPECT_TRUE(ended.wait());
  EXPECT_TRUE(robot->waitForLine("is gone: no sign of life")) << robot->output();
  session->closeLink();
}

TEST_F(RemoteProcesses, ConnectedProcessesServeAgainWhenTheListeningOneIsRestarted) {
  auto robot = startRobot(true);
  const auto host = startHost();
  robot->kill(SIGKILL);
  ASSERT_TRUE(robot->wait(10s));
  robot = startRobot(true);
  ASSERT_TRUE(host->waitForLine("zefoko serve: serving again")) << host->output();
  const auto apart = say({MOKUTO_EXECUTABLE, "--connect", endpoint, "say"}, "after.jsonl");
  ASSERT_FALSE(apart.empty());
  EXPECT_EQ(apart.back()[0], "end");
}

}  // namespace
