// The speaking body talk on the simulated robot, in real time: each head move ends where the
// joint stood, and the arm animations follow one another.
#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "robotsim/robot.h"
#include "support/fake_robot.h"
#include "support/timeline_waiter.h"
#include "zu/zuserviceproxies.h"

namespace {

// The value inside any dynamic wrappers.
const ko::AnyValue& plain(const ko::AnyValue& v) {
  return v.kind() == ko::Kind::Dynamic ? plain(v.asDynamic()) : v;
}
const ko::AnyValue& at(const ko::AnyValue& list, std::size_t i) {
  return plain(plain(list).asList().at(i));
}

TEST(SimulatedRobot, TheSpeakingBodyTalkMovesTheHeadAndPlaysArmAnimationsInTurn) {
  ko::log::ScopedCapture log;
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  std::optional<robotsim::Robot> robot(std::in_place, options);
  const auto broker = robot->broker();
  bodytalktest::BodyTalkHandle bodyTalk(broker, 1.0);
  const ko::AnyObject manager = broker->service("ZUBehaviorManager");
  ASSERT_TRUE(manager);
  const auto link = manager->connect(
      "behaviorStopped", [&bodyTalk](std::string path) { bodyTalk->onBehaviorStopped(path); });
  bodyTalk->getPosture()->init();
  std::vector<std::string> speaking;
  for (const auto& path : ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors()) {
    if (path.rfind("animations/Stand/BodyTalk/Speaking_", 0) == 0)
      speaking.push_back(path);
  }
  ASSERT_FALSE(speaking.empty());
  bodyTalk->setSpeakingAnimations(ZU::Standing, speaking);

  robotsim::simtest::TimelineWaiter waiter(*robot->timeline());
  bodyTalk->start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
  const std::chrono::milliseconds bound(30000);
  EXPECT_TRUE(waiter.waitFor("ZUMotion", "setAngles", 1, bound));
  EXPECT_TRUE(waiter.waitFor("ZUBehaviorManager", "startBehavior", 3, bound));
  bodyTalk->stop();
  manager->disconnect(link);
  bodyTalk->getPosture()->exit();
  const auto timeline = robot->timeline()->entries();
  robot.reset();

  std::size_t moves = 0;
  std::size_t started = 0;
  std::string playing;
  for (const auto& entry : timeline) {
    if (entry.operation == "angleInterpolationBezier") {
      // [names, duration, times, keys, start angles]: the last key is the start angle.
      const auto& keys = plain(at(entry.arguments, 3).asList().at(0)).asList();
      EXPECT_NEAR(at(keys.back(), 0).to<double>(), at(at(entry.arguments, 4), 0).to<double>(), 1e-6)
          << entry;
      ++moves;
    } else if (entry.operation == "startBehavior") {
      EXPECT_EQ(playing, "") << "started while " << playing << " played: " << entry;
      playing = at(entry.arguments, 0).asString();
      ++started;
    } else if (entry.operation == "behaviorStopped") {
      EXPECT_EQ(at(entry.arguments, 0).asString(), playing) << entry;
      playing.clear();
    }
  }
  EXPECT_GE(moves, 1u);
  EXPECT_GE(started, 3u);
  EXPECT_TRUE(bodytalktest::linesOf(log, "robotbodytalk", ko::log::Error).empty());
  EXPECT_TRUE(bodytalktest::linesOf(log, "robotbodytalk", ko::log::Warning).empty());
}

}  // namespace
