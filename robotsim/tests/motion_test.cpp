// The simulated body's motion: Bezier curves as pure functions, the reading of keys, and the
// ZUMotion service driven through its proxy as the body talk and the director drive it.

#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/bezier.h"
#include "robotsim/jointmodel.h"
#include "robotsim/timeline.h"
#include "robotsim/zumotion.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"

namespace robotsim {
namespace {

using ko::AnyValue;
using ZU::ZUValue;

constexpr double kTolerance = 1e-6;
constexpr int kBoundMs = 10000;

// A key with flat handles a third of the way to its neighbours.
BezierKey flatKey(double previousTime, double time, double nextTime, double angle) {
  return {time, angle, {-(time - previousTime) / 3.0, 0.0}, {(nextTime - time) / 3.0, 0.0}};
}

// ---- Bezier curves ------------------------------------------------------------------------

TEST(BezierSegment, HandlesBeyondTheSegmentStayAFunctionOfTime) {
  // Handles reaching past the other key are shortened to it: the value still rises
  // monotonically from one key to the other.
  double previous = 0.0;
  for (int i = 1; i <= 20; ++i) {
    const double t = i / 20.0;
    const double v = bezierSegmentValue(0, 0, 5.0, 0, -4.0, 1, 1, 1, t);
    EXPECT_GE(v, previous - kTolerance) << t;
    EXPECT_LE(v, 1.0 + kTolerance) << t;
    previous = v;
  }
  EXPECT_NEAR(previous, 1.0, kTolerance);
}

TEST(BezierCurve, PassesThroughEveryKeyAndHoldsTheLast) {
  const std::vector<BezierKey> keys = {flatKey(0.0, 0.5, 1.0, 0.4), flatKey(0.5, 1.0, 2.0, -0.2),
                                       flatKey(1.0, 2.0, 2.0, 0.1)};
  const BezierCurve curve(0.3, keys);
  EXPECT_DOUBLE_EQ(curve.duration(), 2.0);
  EXPECT_DOUBLE_EQ(curve.valueAt(0.0), 0.3);
  EXPECT_DOUBLE_EQ(curve.valueAt(-1.0), 0.3);
  for (const auto& key : keys)
    EXPECT_NEAR(curve.valueAt(key.time), key.angle, kTolerance) << key.time;
  EXPECT_DOUBLE_EQ(curve.valueAt(5.0), 0.1);
  // Halfway between two keys with flat third handles: halfway between their angles.
  EXPECT_NEAR(curve.valueAt(0.25), 0.35, kTolerance);
  EXPECT_NEAR(curve.valueAt(0.75), 0.1, kTolerance);
  EXPECT_NEAR(curve.valueAt(1.5), -0.05, kTolerance);
}

// ---- reading keys -------------------------------------------------------------------------

AnyValue key(double angle, double beforeDt, double afterDt) {
  return AnyValue::list(
      {angle, AnyValue::list({3, beforeDt, 0.0}), AnyValue::list({3, afterDt, 0.0})});
}

TEST(BezierTracks, ReadsJointsChainsAndBothLayouts) {
  // One joint with its times and keys given directly.
  auto tracks = parseBezierTracks("HeadYaw", AnyValue::list({0.5, 1.0}),
                                  AnyValue::list({key(0.2, -0.1, 0.1), key(0.0, -0.1, 0.0)}));
  ASSERT_EQ(tracks.size(), 1u);
  EXPECT_EQ(bodyJoints()[tracks[0].joint].name, "HeadYaw");
  ASSERT_EQ(tracks[0].keys.size(), 2u);
  EXPECT_DOUBLE_EQ(tracks[0].keys[0].before.dTime, -0.1);

  // A chain, one list per joint; bare angles get flat third handles; ints are numbers.
  tracks =
      parseBezierTracks("Head", AnyValue::list({AnyValue::list({1}), AnyValue::list({0.3, 0.9})}),
                        AnyValue::list({AnyValue::list({0}), AnyValue::list({0.1, 0.2})}));
  ASSERT_EQ(tracks.size(), 2u);
  EXPECT_EQ(bodyJoints()[tracks[1].joint].name, "HeadPitch");
  EXPECT_NEAR(tracks[1].keys[0].before.dTime, -0.1, kTolerance);
  EXPECT_NEAR(tracks[1].keys[0].after.dTime, 0.2, kTolerance);
  EXPECT_NEAR(tracks[1].keys[1].before.dTime, -0.2, kTolerance);
  EXPECT_DOUBLE_EQ(tracks[1].keys[1].after.dTime, 0.0);
}

struct BadTracksCase {
  const char* name;
  AnyValue names;
  AnyValue times;
  AnyValue keys;
  const char* reason;
};

TEST(BezierTracks, RefusesMalformedMoves) {
  const AnyValue good = AnyValue::list({key(0.1, -0.1, 0.0)});
  const AnyValue once = AnyValue::list({0.5});
  const BadTracksCase cases[] = {
      {"unknown joint", "Tail", once, good, "Unknown joint or chain name 'Tail'"},
      {"name not a string", AnyValue::list({1}), once, good, "must be a string"},
      {"joint twice", AnyValue::list({"HeadYaw", "Head"}), AnyValue::list({once, once}),
       AnyValue::list({good, good}), "named twice"},
      {"fewer time lists", AnyValue::list({"HeadYaw", "HeadPitch"}), AnyValue::list({once}),
       AnyValue::list({good, good}), "2 joints but 1 time lists"},
      {"times and keys differ", "HeadYaw", AnyValue::list({0.5, 1.0}), good, "2 times but 1 keys"},
      {"time zero", "HeadYaw", AnyValue::list({0.0}), good, "positive"},
      {"times go back", "HeadYaw", AnyValue::list({0.5, 0.4}), AnyValue::list({0.1, 0.2}),
       "increase"},
      {"no keys", "HeadYaw", AnyValue::list({AnyValue::list({})}),
       AnyValue::list({AnyValue::list({})}), "no keys"},
      {"handle type", "HeadYaw", once,
       AnyValue::list(
           {AnyValue::list({0.1, AnyValue::list({2, -0.1, 0.0}), AnyValue::list({3, 0.0, 0.0})})}),
       "only 3 (Bezier)"},
      {"short handle", "HeadYaw", once,
       AnyValue::list(
           {AnyValue::list({0.1, AnyValue::list({3, -0.1}), AnyValue::list({3, 0.0, 0.0})})}),
       "[3, dTime, dAngle]"},
      {"angle not a number", "HeadYaw", once, AnyValue::list({"up"}), "must be a number"},
      {"angle not finite", "HeadYaw", once, AnyValue::list({std::nan("")}), "finite"},
      {"times not a list", "HeadYaw", 0.5, good, "times must be a list"},
  };
  for (const auto& c : cases) {
    EXPECT_THAT(
        ko::test::errorOf<KeyframeError>([&] { parseBezierTracks(c.names, c.times, c.keys); }),
        testing::HasSubstr(c.reason))
        << c.name;
  }
}

// ---- the service ------------------------------------------------------------------------

class MotionService : public testing::Test {
 protected:
  float angle(const std::string& joint) { return proxy_.getAngles(ZUValue(joint), false).at(0); }

  // A Bezier move of one joint to `target` at `seconds`, in the layout the head part uses.
  static ZUValue names(const std::string& joint) { return ZUValue::makeArray({joint}); }
  static ZUValue times(double seconds) {
    return ZUValue::makeArray({ZUValue::makeArray({seconds})});
  }
  static ZUValue keys(double target, double seconds) {
    const ZUValue before = ZUValue::makeArray({3, -seconds / 3.0, 0.0});
    const ZUValue after = ZUValue::makeArray({3, 0.0, 0.0});
    return ZUValue::makeArray({ZUValue::makeArray({ZUValue::makeArray({target, before, after})})});
  }

  std::shared_ptr<ZU::ZUBroker> broker_ = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  std::shared_ptr<Timeline> timeline_ = std::make_shared<Timeline>();
  simtest::TimelineWaiter waiter_{*timeline_};
  std::shared_ptr<ZUMotion> motion_ =
      ZU::ZUModule::createModule<ZUMotion>(broker_, "ZUMotion", timeline_);
  ZU::ZUMotionProxy proxy_{broker_};
};

TEST_F(MotionService, GetAnglesOfJointsChainsAndLists) {
  EXPECT_EQ(proxy_.getAngles(ZUValue("Head"), false).size(), 2u);
  EXPECT_EQ(proxy_.getAngles(ZUValue("LArm"), true).size(), 6u);
  EXPECT_EQ(proxy_.getAngles(ZUValue("Arms"), false).size(), 12u);
  EXPECT_EQ(proxy_.getAngles(ZUValue("Body"), false).size(), bodyJoints().size());
  const auto pair = proxy_.getAngles(ZUValue::makeArray({"RElbowRoll", "LElbowRoll"}), false);
  ASSERT_EQ(pair.size(), 2u);
  EXPECT_FLOAT_EQ(pair[0], -pair[1]);  // the rest pose is symmetric
  EXPECT_THROW(proxy_.getAngles(ZUValue("Tail"), false), ZU::ZUError);
}

TEST_F(MotionService, AnglesAreSampledWhileJointsMoveAndOnlyThoseThatMove) {
  const auto sampled = [this] { return timeline_->entries("ZUMotion", "angles"); };
  motion_->recordPose();
  ASSERT_EQ(sampled().size(), 1u);
  EXPECT_EQ(sampled()[0].arguments.asMap().size(), bodyJoints().size());

  // A blocking move returns on its last key, its chain free.
  motion_->sampleAngles(50);
  proxy_.angleInterpolationBezier(names("HeadYaw"), times(0.2), keys(0.5, 0.2));
  EXPECT_NEAR(angle("HeadYaw"), 0.5, 1e-5);
  EXPECT_TRUE(proxy_.areResourcesAvailable({"Head"}));
  ASSERT_TRUE(waiter_.waitFor("ZUMotion", "moveEnded"));
  // The motion thread tells where the move left the joint before it sleeps.
  ASSERT_TRUE(waiter_.waitUntil([&] {
    const auto all = sampled();
    return all.back().arguments.asMap().at(0).second.to<double>() == 0.5;
  }));
  const auto samples = sampled();
  ASSERT_GE(samples.size(), 2u);
  double previous = 0;
  for (std::size_t k = 1; k < samples.size(); ++k) {
    const auto& angles = samples[k].arguments.asMap();
    ASSERT_EQ(angles.size(), 1u) << samples[k];
    EXPECT_EQ(angles[0].first.to<std::string>(), "HeadYaw");
    const double angle = angles[0].second.to<double>();
    EXPECT_GE(angle, previous) << samples[k];
    previous = angle;
    // A period apart, half a tick early at most; the last tells where the move ended, at its
    // own time.
    if (k > 1 && k + 1 < samples.size()) {
      EXPECT_GE(samples[k].us - samples[k - 1].us, 15'000) << samples[k];
    }
  }

  motion_->sampleAngles(0);
  const std::size_t before = sampled().size();
  proxy_.angleInterpolationBezier(names("HeadYaw"), times(0.1), keys(0.0, 0.1));
  EXPECT_EQ(sampled().size(), before);
}

TEST_F(MotionService, AnglesClampToTheLimitsWithOneWarningPerJoint) {
  ko::log::ScopedCapture capture(ko::log::Warning);
  proxy_.angleInterpolationBezier(ZUValue::makeArray({"HeadPitch"}),
                                  ZUValue::makeArray({ZUValue::makeArray({0.05, 0.1})}),
                                  ZUValue::makeArray({ZUValue::makeArray({2.0f, 3.0f})}));
  EXPECT_FLOAT_EQ(angle("HeadPitch"), 0.5f);
  std::size_t warnings = 0;
  for (const auto& r : capture->records())
    warnings += r.category == "robotsim.motion" && r.message.find("HeadPitch") != std::string::npos;
  EXPECT_EQ(warnings, 1u);

  proxy_.setAngles(ZUValue("LHand"), ZUValue(-1.0f), 1.0f);
  ASSERT_TRUE(waiter_.waitFor("ZUMotion", "moveEnded", 2));
  EXPECT_FLOAT_EQ(angle("LHand"), 0.0f);
  EXPECT_TRUE(capture->containsPart("robotsim.motion", ko::log::Warning, "LHand asked for -1"));
}

TEST_F(MotionService, PostedMoveHoldsItsChainUntilStopped) {
  const float start = angle("HeadYaw");
  const int id =
      proxy_.post_angleInterpolationBezier(names("HeadYaw"), times(30.0), keys(1.5, 30.0));
  ASSERT_TRUE(waiter_.waitFor("ZUMotion", "angleInterpolationBezier"));
  EXPECT_FALSE(proxy_.areResourcesAvailable({"Head"}));
  EXPECT_FALSE(proxy_.areResourcesAvailable({"HeadYaw"}));
  EXPECT_TRUE(proxy_.areResourcesAvailable({"LArm", "RArm"}));
  EXPECT_TRUE(proxy_.wait(id, 1));  // still running: the time ran out

  proxy_.stop(id);
  EXPECT_FALSE(proxy_.wait(id, kBoundMs));
  EXPECT_TRUE(proxy_.areResourcesAvailable({"Head"}));
  const float stoppedAt = angle("HeadYaw");
  EXPECT_GE(stoppedAt, start);
  EXPECT_LT(stoppedAt, 1.5f);

  // A stop that may come before the task has started its move ends it all the same.
  const int early =
      proxy_.post_angleInterpolationBezier(names("HeadPitch"), times(30.0), keys(0.3, 30.0));
  proxy_.stop(early);
  EXPECT_FALSE(proxy_.wait(early, kBoundMs));
  EXPECT_TRUE(proxy_.areResourcesAvailable({"Head"}));
}

TEST_F(MotionService, ALaterMoveTakesTheJointOver) {
  const int id =
      proxy_.post_angleInterpolationBezier(names("HeadYaw"), times(30.0), keys(1.5, 30.0));
  ASSERT_TRUE(waiter_.waitFor("ZUMotion", "angleInterpolationBezier"));
  proxy_.setAngles(ZUValue::makeArray({"HeadYaw", "HeadPitch"}), ZUValue::makeArray({-0.3, 0.2}),
                   1.0f);
  // Left without joints, the posted move ends.
  EXPECT_FALSE(proxy_.wait(id, kBoundMs));
  ASSERT_TRUE(waiter_.waitFor("ZUMotion", "moveEnded", 2));
  EXPECT_FLOAT_EQ(angle("HeadYaw"), -0.3f);
  EXPECT_FLOAT_EQ(angle("HeadPitch"), 0.2f);
}

TEST_F(MotionService, BreathingPerChain) {
  EXPECT_TRUE(proxy_.getBreathEnabled("Body"));
  proxy_.setBreathEnabled("Arms", false);
  EXPECT_FALSE(proxy_.getBreathEnabled("Arms"));
  EXPECT_FALSE(proxy_.getBreathEnabled("LArm"));
  EXPECT_FALSE(proxy_.getBreathEnabled("Body"));
  EXPECT_TRUE(proxy_.getBreathEnabled("Head"));
  proxy_.setBreathEnabled("RArm", true);
  EXPECT_TRUE(proxy_.getBreathEnabled("RArm"));
  EXPECT_FALSE(proxy_.getBreathEnabled("Arms"));
  EXPECT_THROW(proxy_.getBreathEnabled("Legs"), ZU::ZUError);
  EXPECT_THROW(proxy_.setBreathEnabled("", true), ZU::ZUError);
  EXPECT_EQ(timeline_->entries("ZUMotion", "setBreathEnabled").size(), 2u);
}

TEST_F(MotionService, BadArgumentsAreErrorsThatNameTheProblem) {
  EXPECT_THAT(
      ko::test::errorOf([&] {
        proxy_.angleInterpolationBezier(names("HeadYaw"), times(0.5), ZUValue::makeArray({}));
      }),
      testing::HasSubstr("::angleInterpolationBezier\n\t1 joints but 1 time lists and 0 key "
                         "lists"));
  EXPECT_THROW(proxy_.setAngles(ZUValue("HeadYaw"), ZUValue(0.1f), 0.0f), ZU::ZUError);
  EXPECT_THROW(proxy_.setAngles(ZUValue("Head"), ZUValue::makeArray({0.1, 0.2, 0.3}), 0.5f),
               ZU::ZUError);
  EXPECT_THROW(proxy_.areResourcesAvailable({"Head", "Wings"}), ZU::ZUError);
  // The body is untouched by refused calls.
  EXPECT_TRUE(proxy_.areResourcesAvailable({"Body"}));
}

}  // namespace
}  // namespace robotsim
