// The speaking body talk on the simulated robot, in real time: the head moves are the
// table's, from where the joint stands, and the arm animations follow one another.
#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalk.h"
#include "robotsim/robot.h"
#include "support/fake_robot.h"
#include "support/log_waiter.h"
#include "support/timeline_waiter.h"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkhead.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::LogCapture;

// The value inside any dynamic wrappers.
const ko::AnyValue& plain(const ko::AnyValue& v) {
  return v.kind() == ko::Kind::Dynamic ? plain(v.asDynamic()) : v;
}
const ko::AnyValue::List& listOf(const ko::AnyValue& v) {
  return plain(v).asList();
}
double number(const ko::AnyValue& v) {
  return plain(v).to<double>();
}

// The speaking move whose joint and times these are; nullptr when none.
const ZU::ZURobotBodyTalkHeadMove* tableMove(const std::vector<ZU::ZURobotBodyTalkHeadMove>& table,
                                             const std::string& joint,
                                             const std::vector<double>& times) {
  for (const auto& move : table) {
    const ZU::ZUValue& t = move.times[0];
    if (move.names[0].asString() != joint || t.arraySize() != static_cast<int>(times.size()))
      continue;
    bool same = true;
    for (int i = 0; i < t.arraySize(); ++i)
      same = same && std::abs(t[i].asFloat() - times[static_cast<std::size_t>(i)]) < 1e-6;
    if (same)
      return &move;
  }
  return nullptr;
}

TEST(SimulatedRobot, TheSpeakingBodyTalkMovesTheHeadByTheTableAndPlaysArmAnimationsInTurn) {
  LogCapture log;
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  std::optional<robotsim::Robot> robot(std::in_place, options);
  const auto broker = robot->broker();
  BodyTalkHandle bodyTalk(broker, 1.0);

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

  // Head: [names, duration, times, keys, start angles] of each move.
  const auto table = ZU::ZURobotBodyTalkHeadSpeaking::makeMoves();
  std::size_t moves = 0;
  for (const auto& entry : timeline) {
    if (entry.service != "ZUMotion" || entry.operation != "angleInterpolationBezier")
      continue;
    ++moves;
    const auto& args = listOf(entry.arguments);
    ASSERT_EQ(args.size(), 5u) << entry;
    const std::string joint = plain(listOf(args[0]).at(0)).asString();
    std::vector<double> times;
    for (const auto& t : listOf(listOf(args[2]).at(0)))
      times.push_back(number(t));
    const double start = number(listOf(args[4]).at(0));
    const auto* move = tableMove(table, joint, times);
    ASSERT_NE(move, nullptr) << entry;
    const auto& keys = listOf(listOf(args[3]).at(0));
    ASSERT_EQ(static_cast<int>(keys.size()), move->keys[0].arraySize());
    for (std::size_t k = 0; k < keys.size(); ++k) {
      const double relative = move->keys[0][static_cast<int>(k)][0].asFloat();
      EXPECT_NEAR(number(listOf(keys[k]).at(0)), relative + start, 1e-6) << entry;
    }
  }
  EXPECT_GE(moves, 1u);

  // Arms: each animation starts once the one before has stopped.
  std::string playing;
  std::size_t started = 0;
  for (const auto& entry : timeline) {
    if (entry.service != "ZUBehaviorManager")
      continue;
    const auto& args = listOf(entry.arguments);
    if (entry.operation == "startBehavior") {
      EXPECT_EQ(playing, "") << "started while " << playing << " played: " << entry;
      playing = plain(args.at(0)).asString();
      ++started;
    } else if (entry.operation == "behaviorStopped") {
      EXPECT_EQ(plain(args.at(0)).asString(), playing) << entry;
      playing.clear();
    }
  }
  EXPECT_GE(started, 3u);
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Error, ""), 0u);
  EXPECT_EQ(log->count("robotbodytalk", ko::log::Warning, ""), 0u);
}

}  // namespace
