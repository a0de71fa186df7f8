// Several threads drive the body talk at random moments (start, prepare, pause, resume,
// stop, notifications, posture changes, new animation lists) while its workers run: it
// must never deadlock, race, or leave a worker running after the last stop. Meant for the
// tsan build as well.
#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "robotbodytalk/zurobotbodytalk.h"
#include "support/fake_robot.h"

namespace {

using bodytalktest::BodyTalkHandle;
using bodytalktest::FakeRobot;
using ZU::ZURobotBodyTalk;

constexpr int kRounds = 300;
constexpr int kThreads = 3;
constexpr int kOperationsPerThread = 6;
// Generous: a round takes milliseconds; only a deadlock comes near it.
constexpr auto kRoundBound = std::chrono::seconds(60);

const std::vector<std::string> kAnimations = {"a", "b", "c", "d"};

void randomOperation(ZURobotBodyTalk& bodyTalk, const FakeRobot& robot, std::mt19937& random) {
  const auto pick = [&random](int n) {
    return std::uniform_int_distribution<int>(0, n - 1)(random);
  };
  const auto animation = [&] { return kAnimations[static_cast<std::size_t>(pick(4))]; };
  const ZURobotBodyTalk::Mode mode =
      pick(4) == 0 ? ZURobotBodyTalk::kListening : ZURobotBodyTalk::kSpeaking;
  const ZU::ZURobotBodyTalkParts parts{pick(5) != 0, pick(5) != 0};
  switch (pick(9)) {
    case 0:
      bodyTalk.start(mode, parts, pick(2) == 0);
      break;
    case 1:
      bodyTalk.prepare(mode, parts, pick(2) == 0);
      break;
    case 2:
      bodyTalk.pause();
      break;
    case 3:
      bodyTalk.resume();
      break;
    case 4:
      bodyTalk.stop();
      break;
    case 5:
    case 6: {
      // The animation that plays now, if any, or another one.
      const auto started = robot.behaviors->started();
      bodyTalk.onBehaviorStopped(started.empty() || pick(3) == 0 ? animation() : started.back());
      break;
    }
    case 7:
      bodyTalk.getPosture()->setPostureFamily(pick(4));
      break;
    default: {
      std::vector<std::string> names(kAnimations.begin(), kAnimations.begin() + pick(5));
      bodyTalk.setSpeakingAnimations(pick(3), names);
      break;
    }
  }
  if (pick(3) == 0)
    std::this_thread::sleep_for(std::chrono::microseconds(pick(400)));
}

TEST(BodyTalkStress, ThreadsDrivingTheBodyTalkAtRandomNeverDeadlockNorLeaveAWorkerRunning) {
  std::srand(7);
  FakeRobot robot;
  ko::log::ScopedCapture log;
  robot.motion->moveMs = 2;
  BodyTalkHandle bodyTalk(robot.broker, 0.001);
  bodyTalk->getPosture()->init();
  for (ZU::PostureFamily family = ZU::Standing; family <= ZU::Unknown; ++family) {
    bodyTalk->setSpeakingAnimations(family, kAnimations);
    bodyTalk->setListeningAnimations(family, {"e", "f"});
  }

  for (int round = 0; round < kRounds; ++round) {
    std::vector<std::future<void>> threads;
    for (int t = 0; t < kThreads; ++t) {
      threads.push_back(std::async(std::launch::async, [&, seed = round * kThreads + t] {
        std::mt19937 random(static_cast<std::mt19937::result_type>(seed));
        for (int i = 0; i < kOperationsPerThread; ++i)
          randomOperation(*bodyTalk, robot, random);
      }));
    }
    for (auto& thread : threads) {
      if (thread.wait_for(kRoundBound) != std::future_status::ready) {
        ADD_FAILURE() << "round " << round << " did not end: a deadlock";
        std::abort();
      }
    }
    bodyTalk->stop();
    ASSERT_TRUE(bodyTalk->areWorkersStopped()) << "round " << round;
    ASSERT_FALSE(bodyTalk->isRunning());
  }
  // After the storm, whatever it left, the body talk still moves the head and plays its
  // animations (under load the storm itself may stop every worker before its first move).
  bodyTalk->getPosture()->setPostureFamily(ZU::Standing);
  bodyTalk->setSpeakingAnimations(ZU::Standing, kAnimations);
  bodyTalk->start(ZURobotBodyTalk::kSpeaking, {true, true}, true);
  EXPECT_TRUE(robot.motion->log.waitFor("setAngles", 1));
  EXPECT_TRUE(robot.behaviors->log.waitFor("startBehavior", 1));
  bodyTalk->stop();
  EXPECT_TRUE(bodyTalk->areWorkersStopped());
}

}  // namespace
