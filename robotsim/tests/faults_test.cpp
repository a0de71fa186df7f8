// The faults of the simulated robot: how a plan is read (and refused), and how each kind
// strikes the services' calls, the speech engine's bookmarks and the behaviour manager's
// stops, on the whole robot with a recording module standing where the service stands.
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <future>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/faults.h"
#include "robotsim/robot.h"
#include "support/recording_module.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

using namespace std::chrono_literals;
using testing::RecordingModule;

constexpr auto kBound = 10s;
constexpr const char* kFaults = "robotsim.faults";

TEST(FaultPlan, ReadsEveryKindAndRefusesWhatItCannotRead) {
  // The kinds are struck by the robot's tests below; seconds and a bookmark's delay here.
  const auto faults =
      parseFaults(" ZUMotion.setAngles:delay=2s ;ZUTextToSpeech.bookmarks:delay=300ms@2;");
  ASSERT_EQ(faults.size(), 2u);
  EXPECT_EQ(faults[0].delay, 2000ms);
  EXPECT_EQ(faults[1].bookmarks, std::vector<std::int32_t>{2});
  EXPECT_TRUE(parseFaults("  ").empty());

  struct Bad {
    const char* spec;
    const char* says;
  };
  const std::vector<Bad> bad = {
      {"ZUBehaviorManager.startBehavior", "write SERVICE.OPERATION:ACTION"},
      {"ZUBehaviourManager.startBehavior:throw", "no service \"ZUBehaviourManager\""},
      {"ZUBehaviorManager.startBehaviour:throw", "has no operation \"startBehaviour\""},
      {"ZUBehaviorManager.startBehavior:explode", "a call may throw, hang or delay=DURATION"},
      {"ZUBehaviorManager.startBehavior:throw=1", "a call may throw"},
      {"ZUMotion.setAngles:delay=300", "a delay is a number followed by ms or s"},
      {"ZUMotion.setAngles:delay=-3ms", "the delay \"-3\" is not a number"},
      {"ZUTextToSpeech.bookmarks:drop=0", "bookmarks are numbered from 1"},
      {"ZUTextToSpeech.bookmarks:drop=2,x", "the bookmark \"x\" is not a number"},
      {"ZUTextToSpeech.bookmarks:throw", "the bookmarks may be drop"},
      {"ZUMemory.bookmarks:drop", "ZUMemory has no operation \"bookmarks\""},
      {"ZUBehaviorManager.behaviorStopped:hang", "behaviorStopped may only be \"never\""},
  };
  for (const auto& b : bad) {
    const std::string message = ko::test::errorOf<FaultSpecError>(
        [&] { parseFaults(std::string("ZUMotion.wait:hang;") + b.spec); });
    EXPECT_EQ(message.rfind(std::string("fault \"") + b.spec + "\": ", 0), 0u) << message;
    EXPECT_NE(message.find(b.says), std::string::npos) << message;
  }
}

// The whole robot (timing speech as fast as possible) behind a plan, with "ZUMokuto"
// recording the speech events and the blocking bookmarks.
class RobotFaults : public ::testing::Test {
 protected:
  RobotFaults() {
    RobotOptions options;
    options.speech.backend = ZUTextToSpeechOptions::Backend::Timing;
    options.speech.playbackRate = kSpeechAsFastAsPossible;
    options.faults = plan_;
    robot_ = std::make_unique<Robot>(options);
    mokuto_ = ZU::ZUModule::createModule<RecordingModule>(robot_->broker(), "ZUMokuto");
    ZU::ZUMemoryProxy memory(robot_->broker());
    memory.subscribeToEvent("ZUTextToSpeech/CurrentBookMark", "ZUMokuto", "onEvent");
    ZU::ZUTextToSpeechProxy(robot_->broker()).enableNotifications();
  }
  ~RobotFaults() override {
    mokuto_->exit();
    robot_.reset();
  }

  // The bookmarks reported while the text was spoken, in order.
  std::vector<int> speak(const std::string& text, std::size_t expected) {
    const std::size_t before = mokuto_->events().size();
    ZU::ZUTextToSpeechProxy(robot_->broker()).say(text);
    mokuto_->waitForEvents([&](const auto& events) { return events.size() >= before + expected; },
                           kBound);
    std::vector<int> numbers;
    const auto events = mokuto_->events();
    for (std::size_t k = before; k < events.size(); ++k)
      numbers.push_back(events[k].value.asInt());
    return numbers;
  }

  ko::log::ScopedCapture log_{ko::log::Warning};
  std::shared_ptr<FaultPlan> plan_ = std::make_shared<FaultPlan>();
  std::unique_ptr<Robot> robot_;
  std::shared_ptr<RecordingModule> mokuto_;
};

TEST_F(RobotFaults, EveryPublishedMethodMayBeNamedAndNothingElse) {
  const auto bare = ZU::ZUModule::createModule<ZU::ZUModule>(robot_->broker(), "Bare");
  const auto builtIns = bare->getMethodList();
  for (const char* service :
       {"ZUMemory", "ZUMotion", "ZUBehaviorManager", "ZUAudioPlayer", "ZURobotPosture",
        "ZURobotModel", "ZUAutonomousMoves", "ZUTextToSpeech"}) {
    SCOPED_TRACE(service);
    std::set<std::string> published;
    for (const auto& name :
         ZU::ZUProxy(service, robot_->broker()).call<std::vector<std::string>>("getMethodList")) {
      if (std::find(builtIns.begin(), builtIns.end(), name) == builtIns.end())
        published.insert(name);
    }
    const auto operations = faultOperations(service);
    EXPECT_EQ(published, std::set<std::string>(operations.begin(), operations.end()));
  }
  bare->exit();
}

TEST_F(RobotFaults, CallsFailHangUntilLiftedOrStoppedAndAnswerLate) {
  plan_->set(parseFaults(
      "ZUBehaviorManager.getInstalledBehaviors:throw; ZURobotModel._getRobotType:hang;"
      "ZUAudioPlayer.playSoundSetFile:hang; ZURobotPosture.getPostureFamily:delay=20ms"));
  const auto broker = robot_->broker();
  EXPECT_EQ(ko::test::errorOf([&] { ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors(); }),
            "\tZUBehaviorManager::getInstalledBehaviors\n\tinjected fault");
  EXPECT_TRUE(log_->contains(kFaults, ko::log::Warning,
                             "ZUBehaviorManager.getInstalledBehaviors: fails (injected fault)"));

  // A posted call that hangs ends when its task is asked to stop.
  const ZU::ZUAudioPlayerProxy audio(broker);
  audio.loadSoundSet("bells");
  const int play = audio.post_playSoundSetFile("bells", "ding", 0, 1.0, 0, 0);
  ASSERT_TRUE(plan_->waitForStrikes("ZUAudioPlayer", "playSoundSetFile", 1, kBound));
  EXPECT_TRUE(audio.isRunning(play));
  audio.stop(play);
  EXPECT_FALSE(audio.wait(play, 10000));

  // A direct call that hangs ends when the plan is lifted.
  auto model = std::async(std::launch::async,
                          [broker] { return ZU::ZURobotModelProxy(broker)._getRobotType(); });
  ASSERT_TRUE(plan_->waitForStrikes("ZURobotModel", "_getRobotType", 1, kBound));
  EXPECT_EQ(plan_->hanging(), 1u);
  EXPECT_EQ(model.wait_for(10ms), std::future_status::timeout);
  EXPECT_EQ(ZU::ZURobotPostureProxy(broker).getPostureFamily(), "Standing");  // late
  EXPECT_TRUE(
      log_->contains(kFaults, ko::log::Warning,
                     "ZURobotPosture.getPostureFamily: answers 20 ms late (injected fault)"));
  plan_->lift();
  ASSERT_EQ(model.wait_for(kBound), std::future_status::ready);
  EXPECT_EQ(model.get(), 1);
  EXPECT_EQ(plan_->hanging(), 0u);
  ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors();  // no fault any more
}

TEST_F(RobotFaults, BookmarksAreDroppedRepeatedSwappedAndLate) {
  plan_->set(
      parseFaults("ZUTextToSpeech.bookmarks:drop=2; ZUTextToSpeech.bookmarks:duplicate=3;"
                  "ZUTextToSpeech.bookmarks:reorder=4"));
  EXPECT_EQ(speak("a \\mrk=1\\ b \\mrk=2\\ c \\mrk=3\\ d \\mrk=4\\ e \\mrk=5\\ f", 5),
            (std::vector<int>{1, 3, 3, 5, 4}));
  // Held back at the end of the text, a bookmark comes before its end.
  plan_->set(parseFaults("ZUTextToSpeech.bookmarks:reorder=2"));
  EXPECT_EQ(speak("a \\mrk=1\\ b \\mrk=2\\ c", 2), (std::vector<int>{1, 2}));
  plan_->set(parseFaults("ZUTextToSpeech.bookmarks:delay=50ms@1"));
  EXPECT_EQ(speak("a \\mrk=1\\ b \\mrk=2\\ c", 2), (std::vector<int>{2, 1}));
  EXPECT_EQ(plan_->strikes("ZUTextToSpeech", "bookmarks"), 5u);
  EXPECT_TRUE(log_->contains(kFaults, ko::log::Warning,
                             "ZUTextToSpeech.bookmarks: bookmark 2 dropped (injected fault)"));

  // A blocking bookmark dropped is never handed to the module: the speech does not wait.
  plan_->set(parseFaults("ZUTextToSpeech.bookmarks:drop=1"));
  mokuto_->holdBlockingBookmarks();
  speak("a \\mrkpause=1\\ b \\mrk=2\\ c", 1);
  EXPECT_TRUE(mokuto_->blockingBookmarks().empty());
  mokuto_->releaseBlockingBookmarks();
}

TEST_F(RobotFaults, AHiddenStopIsRecordedButNeverSignalled) {
  plan_->set(parseFaults("ZUBehaviorManager.behaviorStopped:never"));
  const auto service = robot_->broker()->service("ZUBehaviorManager");
  const auto heard = std::make_shared<std::atomic<bool>>(false);
  const auto link = service->connect("behaviorStopped", [heard](std::string) { *heard = true; });
  const ZU::ZUBehaviorManagerProxy behaviors(robot_->broker());
  const auto all = behaviors.getInstalledBehaviors();
  ASSERT_FALSE(all.empty());
  behaviors.startBehavior(all.front());
  behaviors.stopBehavior(all.front());
  // The stop is struck where the signal would be triggered.
  ASSERT_TRUE(plan_->waitForStrikes("ZUBehaviorManager", "behaviorStopped", 1, kBound));
  EXPECT_FALSE(heard->load());
  service->disconnect(link);
}

}  // namespace
}  // namespace robotsim
