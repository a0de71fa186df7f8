// The head: its move tables, one move from where the joint stands and back, the skips, the
// limit, the stop, and the shuffle after each pass.
#include <gtest/gtest.h>

#include <cmath>
#include <future>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "robotbodytalk/zurobotbodytalkposture.h"
#include "support/fake_robot.h"
#include "support/log_waiter.h"
#include "zurobotbodytalkhead.h"
#include "zurobotbodytalkthread.h"

namespace {

using bodytalktest::f32;
using bodytalktest::FakeRobot;
using bodytalktest::kBound;
using bodytalktest::LogCapture;
using ZU::ZURobotBodyTalkHead;
using ZU::ZURobotBodyTalkHeadMove;
using ZU::ZUValue;

std::shared_ptr<ZU::ZURobotBodyTalkPosture> standing(const FakeRobot& robot) {
  auto posture = std::make_shared<ZU::ZURobotBodyTalkPosture>(robot.broker);
  posture->setPostureFamily(ZU::Standing);
  posture->updateActivePostureFamily();
  return posture;
}

// ---- the tables -------------------------------------------------------------------------------

struct TableMove {
  const char* joint;
  std::vector<double> times;
  std::vector<double> angles;
  bool lastTimeIsInt = false;
};

struct TableCase {
  const char* name;
  std::vector<ZURobotBodyTalkHeadMove> moves;
  std::vector<TableMove> expected;
  // The rounded thirds that the handles use.
  std::vector<double> handles;
  // The listening tables keep their zero angles and offsets as integers.
  bool integerZeros;
};

// The handle value for a third of `interval`: the nearest of the table's rounded values.
double roundedThird(double interval, const std::vector<double>& handles) {
  double best = handles.front();
  for (const double h : handles) {
    if (std::abs(h - interval / 3) < std::abs(best - interval / 3))
      best = h;
  }
  EXPECT_NEAR(best, interval / 3, 1e-4) << "no rounded third for " << interval;
  return best;
}

void expectNumber(const ZUValue& v, double expected, bool isInt, const std::string& where) {
  EXPECT_EQ(v.getType(), isInt ? ZUValue::TypeInt : ZUValue::TypeFloat) << where;
  EXPECT_EQ(v.asFloat(), isInt ? expected : f32(expected)) << where;
}

void expectHandle(const ZUValue& h, double dTime, bool zeroIsInt, const std::string& where) {
  ASSERT_EQ(h.arraySize(), 3) << where;
  expectNumber(h[0], 3, true, where + " type");
  expectNumber(h[1], dTime, zeroIsInt && dTime == 0, where + " dTime");
  expectNumber(h[2], 0, zeroIsInt, where + " dAngle");
}

class HeadTables : public ::testing::TestWithParam<TableCase> {};

TEST_P(HeadTables, EveryMoveIsTheTablesWithHandlesAtThirds) {
  const TableCase& c = GetParam();
  ASSERT_EQ(c.moves.size(), c.expected.size());
  for (std::size_t m = 0; m < c.moves.size(); ++m) {
    const ZURobotBodyTalkHeadMove& move = c.moves[m];
    const TableMove& want = c.expected[m];
    const std::string where = std::string(c.name) + " move " + std::to_string(m + 1);
    ASSERT_EQ(move.names.arraySize(), 1) << where;
    EXPECT_EQ(move.names[0].asString(), want.joint) << where;
    const ZUValue& times = move.times[0];
    const ZUValue& keys = move.keys[0];
    ASSERT_EQ(times.arraySize(), static_cast<int>(want.times.size())) << where;
    ASSERT_EQ(keys.arraySize(), static_cast<int>(want.angles.size())) << where;
    for (std::size_t k = 0; k < want.times.size(); ++k) {
      const int i = static_cast<int>(k);
      const std::string at = where + " key " + std::to_string(k + 1);
      const bool last = k + 1 == want.times.size();
      expectNumber(times[i], want.times[k], last && want.lastTimeIsInt, at + " time");
      expectNumber(keys[i][0], want.angles[k], c.integerZeros && want.angles[k] == 0, at);
      const double previous = k == 0 ? 0.0 : want.times[k - 1];
      expectHandle(keys[i][1], -roundedThird(want.times[k] - previous, c.handles), c.integerZeros,
                   at + " before");
      expectHandle(keys[i][2],
                   last ? 0.0 : roundedThird(want.times[k + 1] - want.times[k], c.handles),
                   c.integerZeros, at + " after");
    }
    EXPECT_EQ(want.angles.back(), 0.0) << where << ": a move ends where it began";
  }
}

const std::vector<double> kSpeakingHandles = {0.15278, 0.18056, 0.13889, 0.16667,
                                              0.125,   0.27778, 0.23611};
const std::vector<double> kListeningHandles = {0.0666667, 0.0933333, 0.173333, 0.0533333, 0.04,
                                               0.08,      0.106667,  0.16,     0.12,      0.146667};

INSTANTIATE_TEST_SUITE_P(
    Tables, HeadTables,
    ::testing::Values(
        TableCase{"Speaking",
                  ZU::ZURobotBodyTalkHeadSpeaking::makeMoves(),
                  {
                      {"HeadPitch", {0.45833, 1.0}, {0.16127, 0.0}},
                      {"HeadYaw", {0.45833, 0.875, 1.29167}, {-0.15708, 0.10472, 0.0}},
                      {"HeadPitch", {0.5, 0.875, 1.41667}, {-0.06736, -0.08133, 0.0}},
                      {"HeadPitch", {0.5, 1.33333, 2.04167}, {0.1316, 0.16651, 0.0}},
                      {"HeadPitch", {0.41667, 1.25}, {0.06877, 0.0}},
                      {"HeadYaw", {0.41667, 0.95833}, {-0.17453, 0.0}},
                      {"HeadYaw", {0.41667, 0.79167, 1.29167}, {-0.15708, 0.05236, 0.0}},
                      {"HeadPitch", {0.54167, 1.25}, {-0.1494, 0.0}},
                  },
                  kSpeakingHandles,
                  false},
        TableCase{
            "ListeningRobotType1",
            ZU::ZURobotBodyTalkHeadListening::makeMoves(1),
            {
                {"HeadPitch", {0.2, 0.48, 1}, {-0.0401426, 0.150098, 0}, true},
                {"HeadPitch", {0.16, 0.28, 0.4, 0.68}, {0.067026847, 0.025830647, 0.083170947, 0}},
                {"HeadPitch", {0.24, 0.56, 1.04}, {-0.0827408, 0.0859654, 0}},
            },
            kListeningHandles,
            true},
        TableCase{"ListeningRobotType0",
                  ZU::ZURobotBodyTalkHeadListening::makeMoves(0),
                  {
                      {"HeadPitch", {0.2, 0.48}, {0.190308, 0}},
                      {"HeadPitch", {0.36, 0.6, 1.04}, {-0.144863, 0.18675, 0}},
                  },
                  kListeningHandles,
                  true}),
    [](const auto& p) { return std::string(p.param.name); });

// ---- one iteration ------------------------------------------------------------------------------

std::vector<std::string> methodsBut(const FakeRobot& robot, const std::string& left) {
  std::vector<std::string> methods;
  for (const auto& call : robot.motion->log.calls()) {
    if (call.method != left)
      methods.push_back(call.method);
  }
  return methods;
}

TEST(HeadIteration, AJointAtPointThreeGoesThroughTheKeysAndIsSetBack) {
  FakeRobot robot;
  robot.motion->angle = 0.3f;
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, standing(robot), ZU::ZURobotBodyTalkTime(1.0));
  head.setRunning(true);
  head.doOneIteration();

  EXPECT_EQ(methodsBut(robot, "angleInterpolationBezier"),
            (std::vector<std::string>{"areResourcesAvailable", "getAngles", "wait", "setAngles"}));
  const auto resources = robot.motion->log.calls("areResourcesAvailable").at(0).args.at(0);
  EXPECT_EQ(resources.toString(), R"(["Head"])");
  const auto angles = robot.motion->log.calls("getAngles").at(0);
  EXPECT_EQ(angles.args.at(0).asString(), "HeadPitch");
  EXPECT_FALSE(angles.args.at(1).asBool());
  EXPECT_EQ(robot.motion->log.calls("wait").at(0).args.at(1).asInt(), 10000);

  ASSERT_TRUE(robot.motion->log.waitFor("angleInterpolationBezier", 1));
  const auto move = robot.motion->log.calls("angleInterpolationBezier").at(0).args;
  EXPECT_EQ(move.at(0)[0].asString(), "HeadPitch");
  EXPECT_EQ(move.at(1)[0][0].asFloat(), f32(0.45833));
  EXPECT_EQ(move.at(1)[0][1].asFloat(), f32(1.0));
  const ZUValue& keys = move.at(2)[0];
  EXPECT_EQ(keys[0][0].asFloat(), static_cast<double>(0.3f + 0.16127f));
  EXPECT_NEAR(keys[0][0].asFloat(), 0.46127, 1e-6);
  EXPECT_EQ(keys[1][0].asFloat(), static_cast<double>(0.3f));
  EXPECT_EQ(keys[0][1][1].asFloat(), f32(-0.15278));
  EXPECT_EQ(keys[0][2][1].asFloat(), f32(0.18056));

  const auto set = robot.motion->log.calls("setAngles").at(0).args;
  EXPECT_EQ(set.at(0).asString(), "HeadPitch");
  EXPECT_EQ(set.at(1).asFloat(), static_cast<double>(0.3f));
  EXPECT_EQ(set.at(2).asFloat(), 1.0);
  EXPECT_EQ(head.getCurrentMove(), 1u);
}

struct SkipCase {
  const char* name;
  bool resourcesAvailable;
  ZU::PostureFamily posture;
  bool failGetAngles;
  std::vector<std::string> calls;
  const char* warning;  // a part of the warning logged, or nullptr
};

class HeadSkips : public ::testing::TestWithParam<SkipCase> {};

TEST_P(HeadSkips, TheIterationEndsWithoutMovingNorAdvancing) {
  const SkipCase& c = GetParam();
  FakeRobot robot;
  LogCapture log;
  robot.motion->available = c.resourcesAvailable;
  robot.motion->failGetAngles = c.failGetAngles;
  auto posture = standing(robot);
  posture->setPostureFamily(c.posture);
  posture->updateActivePostureFamily();
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, posture, ZU::ZURobotBodyTalkTime(1.0));
  head.setRunning(true);
  head.doOneIteration();

  std::vector<std::string> methods;
  for (const auto& call : robot.motion->log.calls())
    methods.push_back(call.method);
  EXPECT_EQ(methods, c.calls);
  EXPECT_EQ(head.getCurrentMove(), 0u);
  const auto warnings = log->lines("robotbodytalk", ko::log::Warning, "");
  if (c.warning) {
    ASSERT_EQ(warnings.size(), 1u);
    EXPECT_NE(warnings[0].record.message.find(c.warning), std::string::npos)
        << warnings[0].record.message;
  } else {
    EXPECT_TRUE(warnings.empty());
  }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, HeadSkips,
    ::testing::Values(
        SkipCase{
            "HeadResourcesTaken", false, ZU::Standing, false, {"areResourcesAvailable"}, nullptr},
        SkipCase{"UnknownPosture",
                 true,
                 ZU::Unknown,
                 false,
                 {"areResourcesAvailable"},
                 "Cannot move the head in that posture"},
        SkipCase{"MotionException",
                 true,
                 ZU::Sitting,
                 true,
                 {"areResourcesAvailable", "getAngles"},
                 "ZUMotion exception: \tZUMotion::getAngles\n\tjoints unplugged"}),
    [](const auto& p) { return std::string(p.param.name); });

TEST(HeadIteration, AMoveStillRunningAtTheLimitIsStoppedAndTheJointSetBack) {
  FakeRobot robot;
  LogCapture log;
  robot.motion->moveMs = 60000;
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, standing(robot),
                                       ZU::ZURobotBodyTalkTime(0.01));
  head.setRunning(true);
  head.doOneIteration();
  EXPECT_EQ(robot.motion->log.calls("wait").at(0).args.at(1).asInt(), 100);
  EXPECT_TRUE(log->has("robotbodytalk", ko::log::Warning,
                       "Aborting head move in body language which did not stop after 10s"));
  EXPECT_EQ(robot.motion->log.count("stop"), 1u);
  EXPECT_EQ(robot.motion->log.count("setAngles"), 1u);
  EXPECT_EQ(head.getCurrentMove(), 1u);
}

TEST(HeadIteration, AStopEndsTheMoveInProgressAndSkipsTheRestore) {
  FakeRobot robot;
  LogCapture log;
  robot.motion->moveMs = 60000;
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, standing(robot), ZU::ZURobotBodyTalkTime(1.0));
  head.setRunning(true);
  auto iteration = std::async(std::launch::async, [&] { head.doOneIteration(); });
  ASSERT_TRUE(robot.motion->log.waitFor("wait", 1));
  head.setRunning(false);
  head.stop();
  ASSERT_EQ(iteration.wait_for(kBound), std::future_status::ready);
  EXPECT_EQ(robot.motion->log.count("stop"), 1u);
  EXPECT_EQ(robot.motion->log.count("setAngles"), 0u);
  EXPECT_FALSE(log->has("robotbodytalk", ko::log::Warning,
                        "Aborting head move in body language which did not stop after 10s"));
  // Nothing left to stop.
  head.stop();
  EXPECT_EQ(robot.motion->log.count("stop"), 1u);
}

// ---- passes and shuffles ----------------------------------------------------------------------

TEST(HeadPasses, EightIterationsOfTheWorkerShuffleTheSpeakingListTwice) {
  FakeRobot robot;
  const auto table = ZU::ZURobotBodyTalkHeadSpeaking::makeMoves();
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, standing(robot),
                                       ZU::ZURobotBodyTalkTime(0.001));
  ZU::ZURobotBodyTalkThread worker(std::make_shared<ko::EventLoop>("HeadTest", 2),
                                   ZU::ZURobotBodyTalkTime(0.001));
  worker.setBodyPart(&head);
  worker.start();
  ASSERT_TRUE(robot.motion->log.waitFor("setAngles", 8));
  worker.requestStop();
  worker.stop();

  const auto moves = robot.motion->log.calls("angleInterpolationBezier");
  const std::size_t iterations = robot.motion->log.count("setAngles");
  ASSERT_GE(moves.size(), 4u);
  // The first pass plays every other move of the table, in order.
  for (std::size_t i = 0; i < 4; ++i) {
    EXPECT_EQ(moves[i].args.at(1).toString(), table[2 * i].times.toString()) << "iteration " << i;
  }
  EXPECT_EQ(head.getShuffleCount(), iterations * 2 / table.size());
  EXPECT_GE(head.getShuffleCount(), 2u);
}

// A pass is the whole list: shuffled after its eighth move, not before.
TEST(HeadPasses, TheListIsShuffledOnceEveryMoveWasPlayed) {
  FakeRobot robot;
  ZU::ZURobotBodyTalkHeadSpeaking head(robot.broker, standing(robot), ZU::ZURobotBodyTalkTime(1.0));
  for (int move = 1; move < 8; ++move)
    head.afterIteration();
  EXPECT_EQ(head.getShuffleCount(), 0u);
  head.afterIteration();
  EXPECT_EQ(head.getShuffleCount(), 1u);
}

// The head rests 1 to 5 s after each move, and the listening head as long before its
// first; each rest is drawn anew.
TEST(HeadRests, AreOneToFiveSecondsDrawnAnew) {
  FakeRobot robot;
  ZU::ZURobotBodyTalkHeadSpeaking speaking(robot.broker, standing(robot),
                                           ZU::ZURobotBodyTalkTime(1.0));
  ZU::ZURobotBodyTalkHeadListening listening(robot.broker, standing(robot),
                                             ZU::ZURobotBodyTalkTime(1.0), 1);
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
