// The head: one move from where the joint stands and back, the skips, the limit, the stop,
// and the shuffle after each pass.
#include <gtest/gtest.h>

#include <future>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"
#include "zurobotbodytalkhead.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::FakeRobot;
using bodytalktest::kBound;
using bodytalktest::linesOf;
using ZU::ZUValue;

constexpr const char* kTooLong = "Aborting head move in body language which did not stop after 10s";

// The speaking head on the fake robot, standing (unless told), its `running` flag set.
struct Head {
  explicit Head(double scale, ZU::PostureFamily family = ZU::Standing)
      : posture(std::make_shared<ZU::ZURobotBodyTalkPosture>(robot.broker)),
        head(robot.broker, posture, ZU::ZURobotBodyTalkTime(scale)) {
    posture->setPostureFamily(family);
    posture->updateActivePostureFamily();
    head.setRunning(true);
  }
  std::vector<std::string> methods() const {
    std::vector<std::string> out;
    for (const auto& call : robot.motion->log.calls())
      out.push_back(call.method);
    return out;
  }
  FakeRobot robot;
  ko::log::ScopedCapture log;
  std::shared_ptr<ZU::ZURobotBodyTalkPosture> posture;
  ZU::ZURobotBodyTalkHeadSpeaking head;
};

// The rules every move of the three tables keeps: one joint, rising key times, handles of
// type 3 at a third of the time to the key before and after (rounded; the last after-handle
// 0), no change of angle in a handle, and a last key at the start angle.
TEST(HeadTables, EveryMoveEndsWhereItBeganWithHandlesAtThirds) {
  for (auto table : {ZU::ZURobotBodyTalkHeadSpeaking::makeMoves(),
                     ZU::ZURobotBodyTalkHeadListening::makeMoves(1),
                     ZU::ZURobotBodyTalkHeadListening::makeMoves(0)}) {
    for (const auto& move : table) {
      SCOPED_TRACE(move.times.toString());
      ASSERT_EQ(move.names.arraySize(), 1);
      const ZUValue& times = move.times[0];
      const ZUValue& keys = move.keys[0];
      ASSERT_EQ(keys.arraySize(), times.arraySize());
      for (int k = 0; k < keys.arraySize(); ++k) {
        const bool last = k + 1 == keys.arraySize();
        const double before = times[k].asFloat() - (k == 0 ? 0.0 : times[k - 1].asFloat());
        const double after = last ? 0.0 : times[k + 1].asFloat() - times[k].asFloat();
        EXPECT_GT(before, 0.0);
        EXPECT_NEAR(keys[k][1][1].asFloat(), -before / 3, 1e-4);
        EXPECT_NEAR(keys[k][2][1].asFloat(), after / 3, 1e-4);
        for (const int h : {1, 2}) {
          EXPECT_EQ(keys[k][h][0].toString(), "3");
          EXPECT_EQ(keys[k][h][2].asFloat(), 0.0);
        }
      }
      EXPECT_EQ(keys[keys.arraySize() - 1][0].asFloat(), 0.0);
    }
  }
}

TEST(HeadIteration, AJointAtPointThreeGoesThroughTheKeysAndIsSetBack) {
  Head h(1.0);
  h.robot.motion->angle = 0.3f;
  h.head.doOneIteration();
  ASSERT_TRUE(h.robot.motion->log.waitFor("angleInterpolationBezier", 1));
  auto methods = h.methods();
  std::erase(methods, "angleInterpolationBezier");  // posted: it may come at any time
  EXPECT_EQ(methods,
            (std::vector<std::string>{"areResourcesAvailable", "getAngles", "wait", "setAngles"}));
  const auto& log = h.robot.motion->log;
  EXPECT_EQ(log.calls("areResourcesAvailable").at(0).args.at(0).toString(), R"(["Head"])");
  EXPECT_EQ(log.calls("getAngles").at(0).args.at(0).asString(), "HeadPitch");
  EXPECT_FALSE(log.calls("getAngles").at(0).args.at(1).asBool());
  EXPECT_EQ(log.calls("wait").at(0).args.at(1).asInt(), 10000);

  // Move 1 from 0.3 rad: through 0.46127 at 0.45833 s and back to 0.3 at 1.0 s.
  const auto move = log.calls("angleInterpolationBezier").at(0).args;
  EXPECT_EQ(move.at(0)[0].asString(), "HeadPitch");
  EXPECT_EQ(move.at(1)[0].toString(), ZUValue::makeArray({0.45833f, 1.0f}).toString());
  const ZUValue& keys = move.at(2)[0];
  EXPECT_NEAR(keys[0][0].asFloat(), 0.46127, 1e-6);
  EXPECT_EQ(keys[1][0].asFloat(), static_cast<double>(0.3f));
  EXPECT_EQ(keys[0][1].toString(), ZUValue::makeArray({3, -0.15278f, 0.0f}).toString());
  EXPECT_EQ(keys[0][2].toString(), ZUValue::makeArray({3, 0.18056f, 0.0f}).toString());
  EXPECT_EQ(keys[1][2].toString(), ZUValue::makeArray({3, 0.0f, 0.0f}).toString());

  const auto set = log.calls("setAngles").at(0).args;
  EXPECT_EQ(set.at(0).asString(), "HeadPitch");
  EXPECT_EQ(set.at(1).asFloat(), static_cast<double>(0.3f));
  EXPECT_EQ(set.at(2).asFloat(), 1.0);
  EXPECT_EQ(h.head.getCurrentMove(), 1u);
}

TEST(HeadIteration, WithoutResourcesPostureOrMotionTheIterationEndsWithoutMovingNorAdvancing) {
  struct Case {
    bool resourcesAvailable;
    ZU::PostureFamily posture;
    bool failGetAngles;
    std::vector<std::string> calls;
    const char* warning;  // a part of the one warning logged, or nullptr
  };
  const Case cases[] = {
      {false, ZU::Standing, false, {"areResourcesAvailable"}, nullptr},
      {true, ZU::Unknown, false, {"areResourcesAvailable"}, "Cannot move the head in that posture"},
      {true,
       ZU::Sitting,
       true,
       {"areResourcesAvailable", "getAngles"},
       "ZUMotion exception: \tZUMotion::getAngles\n\tjoints unplugged"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.warning ? c.warning : "resources taken");
    Head h(1.0, c.posture);
    h.robot.motion->available = c.resourcesAvailable;
    h.robot.motion->failGetAngles = c.failGetAngles;
    h.head.doOneIteration();
    EXPECT_EQ(h.methods(), c.calls);
    EXPECT_EQ(h.head.getCurrentMove(), 0u);
    const auto warnings = linesOf(h.log, "robotbodytalk", ko::log::Warning);
    ASSERT_EQ(warnings.size(), c.warning ? 1u : 0u);
    if (c.warning) {
      EXPECT_NE(warnings[0].message.find(c.warning), std::string::npos) << warnings[0].message;
    }
  }
}

TEST(HeadIteration, AMoveStillRunningAtTheLimitIsStoppedAndTheJointSetBack) {
  Head h(0.01);
  h.robot.motion->moveMs = 60000;
  h.head.doOneIteration();
  EXPECT_EQ(h.robot.motion->log.calls("wait").at(0).args.at(1).asInt(), 100);
  EXPECT_TRUE(h.log->contains("robotbodytalk", ko::log::Warning, kTooLong));
  EXPECT_EQ(h.robot.motion->log.count("stop"), 1u);
  EXPECT_EQ(h.robot.motion->log.count("setAngles"), 1u);
  EXPECT_EQ(h.head.getCurrentMove(), 1u);
}

TEST(HeadIteration, AStopEndsTheMoveInProgressAndSkipsTheRestore) {
  Head h(1.0);
  h.robot.motion->moveMs = 60000;
  auto iteration = std::async(std::launch::async, [&] { h.head.doOneIteration(); });
  ASSERT_TRUE(h.robot.motion->log.waitFor("wait", 1));
  h.head.setRunning(false);
  h.head.stop();
  ASSERT_EQ(iteration.wait_for(kBound), std::future_status::ready);
  EXPECT_EQ(h.robot.motion->log.count("stop"), 1u);
  EXPECT_EQ(h.robot.motion->log.count("setAngles"), 0u);
  EXPECT_FALSE(h.log->contains("robotbodytalk", ko::log::Warning, kTooLong));
  h.head.stop();  // nothing left to stop
  EXPECT_EQ(h.robot.motion->log.count("stop"), 1u);
}

TEST(HeadPasses, EightIterationsOfTheWorkerShuffleTheSpeakingListTwice) {
  Head h(0.001);
  h.head.setRunning(false);
  const auto table = ZU::ZURobotBodyTalkHeadSpeaking::makeMoves();
  ZU::ZURobotBodyTalkThread worker(std::make_shared<ko::EventLoop>("HeadTest", 2),
                                   ZU::ZURobotBodyTalkTime(0.001));
  worker.setBodyPart(&h.head);
  worker.start();
  ASSERT_TRUE(h.robot.motion->log.waitFor("setAngles", 8));
  worker.requestStop();
  worker.stop();

  const auto moves = h.robot.motion->log.calls("angleInterpolationBezier");
  ASSERT_GE(moves.size(), 4u);
  // The first pass plays every other move of the table, in order.
  for (std::size_t i = 0; i < 4; ++i)
    EXPECT_EQ(moves[i].args.at(1).toString(), table[2 * i].times.toString()) << i;
  EXPECT_EQ(h.head.getShuffleCount(), h.robot.motion->log.count("setAngles") * 2 / table.size());
  EXPECT_GE(h.head.getShuffleCount(), 2u);
}

// A pass is the whole list: shuffled after its eighth move, not before.
TEST(HeadPasses, TheListIsShuffledOnceEveryMoveWasPlayed) {
  Head h(1.0);
  for (int move = 1; move < 8; ++move)
    h.head.afterIteration();
  EXPECT_EQ(h.head.getShuffleCount(), 0u);
  h.head.afterIteration();
  EXPECT_EQ(h.head.getShuffleCount(), 1u);
}

// The head rests 1 to 5 s after each move, and the listening head as long before its
// first; each rest is drawn anew.
TEST(HeadRests, AreOneToFiveSecondsDrawnAnew) {
  Head h(1.0);
  ZU::ZURobotBodyTalkHeadListening listening(h.robot.broker, h.posture,
                                             ZU::ZURobotBodyTalkTime(1.0), 1);
  ZU::ZURobotBodyTalkHeadSpeaking& speaking = h.head;
  std::set<int> rests, delays;
  for (int draw = 0; draw < 500; ++draw) {
    rests.insert(speaking.getPause());
    delays.insert(listening.getStartDelay());
  }
  const std::set<int> oneToFive = {1, 2, 3, 4, 5};
  EXPECT_EQ(rests, oneToFive);
  EXPECT_EQ(delays, oneToFive);
}

}  // namespace
