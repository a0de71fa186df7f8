// The behaviour manager driven through its proxy as the service drives it: names, tags,
// preloads, starts, runs and stops with "behaviorStopped" at every end, the library's
// events, malformed descriptors, and the starter library shipped in share/.

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/behaviorlibrary.h"
#include "robotsim/jointmodel.h"
#include "robotsim/timeline.h"
#include "robotsim/zubehaviormanager.h"
#include "robotsim/zumotion.h"
#include "support/fake_memory.h"
#include "support/scratch_folder.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"

namespace robotsim {
namespace {

namespace fs = std::filesystem;
using simtest::FakeMemory;
using simtest::ScratchFolder;
using simtest::TimelineWaiter;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr auto kBound = std::chrono::seconds(10);
constexpr int kBoundMs = 10000;
constexpr const char* kAdded = "ZUBehaviorManager/BehaviorsAdded";
constexpr const char* kRemoved = "ZUBehaviorManager/BehaviorsRemoved";

constexpr const char* kHeyStand = "animations/Stand/Gestures/Hey_1";
constexpr const char* kHeySit = "animations/Sit/Gestures/Hey_1";
constexpr const char* kSpeaking = "animations/Stand/BodyTalk/Speaking_1";
constexpr const char* kLongHead = "animations/Stand/Long_1";
constexpr const char* kLongArm = "animations/Stand/Long_2";

// A descriptor moving one joint to `angle` in `seconds`.
std::string descriptor(const std::vector<std::string>& tags, double seconds,
                       const std::string& joint = "HeadYaw", double angle = 0.3) {
  std::ostringstream out;
  out << "{\"tags\": [";
  for (std::size_t i = 0; i < tags.size(); ++i)
    out << (i ? ", " : "") << '"' << tags[i] << '"';
  out << "], \"duration\": " << seconds << ", \"joints\": {\"" << joint << "\": {\"times\": ["
      << seconds << "], \"keys\": [[" << angle << ", [3, " << -seconds / 3 << ", 0.0], [3, 0.0, "
      << "0.0]]]}}}";
  return out.str();
}

void writeBehavior(const ScratchFolder& folder, const std::string& path, const std::string& text) {
  folder.write(path + "/behavior.json", text);
}

// Records the "behaviorStopped" signal; waits are bounded.
class StoppedRecorder {
 public:
  void add(const std::string& behavior) {
    {
      std::lock_guard lock(fMutex);
      fStopped.push_back(behavior);
    }
    fCondition.notify_all();
  }
  bool waitFor(const std::string& behavior, std::size_t count = 1) {
    std::unique_lock lock(fMutex);
    return fCondition.wait_for(lock, kBound, [&] {
      return static_cast<std::size_t>(std::count(fStopped.begin(), fStopped.end(), behavior)) >=
             count;
    });
  }
  std::vector<std::string> stopped() {
    std::lock_guard lock(fMutex);
    return fStopped;
  }

 private:
  std::mutex fMutex;
  std::condition_variable fCondition;
  std::vector<std::string> fStopped;
};

class Robot {
 public:
  explicit Robot(const fs::path& root)
      : session(std::make_shared<ko::Session>()),
        broker(ZU::ZUBroker::create(session)),
        timeline(std::make_shared<Timeline>()),
        waiter(*timeline),
        memory(ZU::ZUModule::createModule<FakeMemory>(broker, "ZUMemory")),
        motion(ZU::ZUModule::createModule<ZUMotion>(broker, "ZUMotion", timeline)),
        manager(ZU::ZUModule::createModule<ZUBehaviorManager>(broker, "ZUBehaviorManager", timeline,
                                                              root.string())),
        proxy(broker),
        generic("ZUBehaviorManager", broker),
        motionProxy(broker),
        recorder(std::make_shared<StoppedRecorder>()) {
    proxy.getObject()->connect(
        "behaviorStopped", [rec = recorder](const std::string& behavior) { rec->add(behavior); });
  }

  std::shared_ptr<ko::Session> session;
  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<Timeline> timeline;
  TimelineWaiter waiter;
  std::shared_ptr<FakeMemory> memory;
  std::shared_ptr<ZUMotion> motion;
  std::shared_ptr<ZUBehaviorManager> manager;
  ZU::ZUBehaviorManagerProxy proxy;
  ZU::ZUProxy generic;  // the methods that the service itself never calls
  ZU::ZUMotionProxy motionProxy;
  std::shared_ptr<StoppedRecorder> recorder;
};

class BehaviorManagerService : public testing::Test {
 protected:
  BehaviorManagerService() {
    writeBehavior(folder_, kHeyStand, descriptor({"hello", "hey"}, 0.2));
    writeBehavior(folder_, kHeySit, descriptor({"hello"}, 0.2));
    writeBehavior(folder_, kSpeaking, descriptor({}, 0.2, "LShoulderPitch", 1.0));
    writeBehavior(folder_, kLongHead, descriptor({"long"}, 60.0, "HeadYaw", 1.0));
    writeBehavior(folder_, kLongArm, descriptor({"long"}, 60.0, "RElbowRoll", 1.0));
    robot_ = std::make_unique<Robot>(folder_.path());
  }

  ScratchFolder folder_;
  std::unique_ptr<Robot> robot_;
};

struct ResolveCase {
  const char* name;
  const char* expected;
};

TEST_F(BehaviorManagerService, ResolvesExactPathsAndUniqueEnds) {
  const ResolveCase cases[] = {
      {kHeyStand, kHeyStand},                    // the installed path itself
      {"Speaking_1", kSpeaking},                 // the only path ending with it
      {"BodyTalk/Speaking_1", kSpeaking},        // several folders
      {"Stand/Gestures/Hey_1", kHeyStand},       //
      {"Hey_1", ""},                             // ends two paths
      {"Gestures/Hey_1", ""},                    //
      {"peaking_1", ""},                         // not after a "/"
      {"Stand/Gestures", ""},                    // a folder, not a behaviour
      {"Wave_1", ""},                            // nothing
      {"", ""},                                  //
      {"/animations/Stand/Gestures/Hey_1", ""},  //
  };
  for (const auto& c : cases)
    EXPECT_EQ(robot_->proxy.resolveBehaviorName(c.name), c.expected) << c.name;
}

TEST_F(BehaviorManagerService, ListsBehavioursAndTheirTags) {
  EXPECT_THAT(robot_->proxy.getInstalledBehaviors(),
              ElementsAre(kHeySit, kSpeaking, kHeyStand, kLongHead, kLongArm));
  EXPECT_THAT(robot_->proxy.getBehaviorTags(kHeyStand), ElementsAre("hello", "hey"));
  EXPECT_THAT(robot_->proxy.getBehaviorTags(kHeySit), ElementsAre("hello"));
  EXPECT_TRUE(robot_->proxy.getBehaviorTags(kSpeaking).empty());
  EXPECT_THROW(robot_->proxy.getBehaviorTags("Hey_1"), ZU::ZUError);
}

TEST_F(BehaviorManagerService, StartedBehaviourHoldsItsChainUntilStopped) {
  robot_->proxy.startBehavior(kLongHead);
  EXPECT_TRUE(robot_->proxy.isBehaviorRunning(kLongHead));
  EXPECT_FALSE(robot_->motionProxy.areResourcesAvailable({"Head"}));
  EXPECT_TRUE(robot_->motionProxy.areResourcesAvailable({"Arms"}));
  EXPECT_THAT(robot_->generic.call<std::vector<std::string>>("getRunningBehaviors"),
              ElementsAre(kLongHead));

  robot_->proxy.stopBehavior(kLongHead);
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kLongHead));
  EXPECT_TRUE(robot_->motionProxy.areResourcesAvailable({"Head"}));
  EXPECT_TRUE(robot_->recorder->waitFor(kLongHead));
  // Stopping what does not run changes nothing.
  robot_->proxy.stopBehavior(kLongHead);
  robot_->proxy.stopBehavior("no/such/behavior");
}

TEST_F(BehaviorManagerService, NaturalEndRaisesTheSignal) {
  robot_->proxy.startBehavior(kHeyStand);
  ASSERT_TRUE(robot_->recorder->waitFor(kHeyStand));
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kHeyStand));
  EXPECT_TRUE(robot_->motionProxy.areResourcesAvailable({"Head"}));
  EXPECT_NEAR(robot_->motionProxy.getAngles(ZU::ZUValue("HeadYaw"), false).at(0), 0.3, 1e-5);

  const auto started = robot_->timeline->entries("ZUBehaviorManager", "startBehavior");
  const auto stopped = robot_->timeline->entries("ZUBehaviorManager", "behaviorStopped");
  ASSERT_EQ(started.size(), 1u);
  ASSERT_EQ(stopped.size(), 1u);
  EXPECT_LE(started[0].us, stopped[0].us);
  EXPECT_EQ(stopped[0].result.toString(), ko::AnyValue("ended").toString());
}

TEST_F(BehaviorManagerService, RunReturnsAtTheEnd) {
  robot_->proxy.runBehavior(kSpeaking);
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kSpeaking));
  EXPECT_NEAR(robot_->motionProxy.getAngles(ZU::ZUValue("LShoulderPitch"), false).at(0), 1.0, 1e-5);
  EXPECT_TRUE(robot_->recorder->waitFor(kSpeaking));
  // It can run again once over.
  robot_->proxy.runBehavior(kSpeaking);
  EXPECT_TRUE(robot_->recorder->waitFor(kSpeaking, 2));
}

TEST_F(BehaviorManagerService, PostedRunStopsWithItsTask) {
  const int id = robot_->proxy.post_runBehavior(kLongArm);
  ASSERT_TRUE(robot_->waiter.waitFor("ZUBehaviorManager", "startBehavior"));
  EXPECT_TRUE(robot_->proxy.isBehaviorRunning(kLongArm));
  robot_->proxy.stop(id);
  EXPECT_FALSE(robot_->proxy.wait(id, kBoundMs));
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kLongArm));
  EXPECT_TRUE(robot_->recorder->waitFor(kLongArm));
}

TEST_F(BehaviorManagerService, ABehaviourTakingTheSameJointsEndsTheFirst) {
  robot_->proxy.startBehavior(kLongHead);
  robot_->proxy.startBehavior(kHeyStand);
  EXPECT_TRUE(robot_->recorder->waitFor(kLongHead));
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kLongHead));
  EXPECT_TRUE(robot_->recorder->waitFor(kHeyStand));
}

TEST_F(BehaviorManagerService, StopAllEndsEveryBehaviour) {
  robot_->proxy.startBehavior(kLongHead);
  robot_->proxy.startBehavior(kLongArm);
  robot_->generic.call<void>("stopAllBehaviors");
  EXPECT_TRUE(robot_->generic.call<std::vector<std::string>>("getRunningBehaviors").empty());
  EXPECT_TRUE(robot_->recorder->waitFor(kLongHead));
  EXPECT_TRUE(robot_->recorder->waitFor(kLongArm));
  EXPECT_TRUE(robot_->motionProxy.areResourcesAvailable({"Body"}));
}

// A run's stop that is not told yet when the behaviour starts again is not heard after
// that start: the subscribers hear one stop, the later run's.
TEST_F(BehaviorManagerService, AnUntoldStopIsNotHeardAfterTheNextStart) {
  // Shared with the subscriber, which outlives the test's body.
  struct Hold {
    ko::test::Gate holding, release;
    std::atomic<bool> first{true};
  };
  const auto hold = std::make_shared<Hold>();
  const std::unique_ptr<Hold, void (*)(Hold*)> letGo(hold.get(),
                                                     [](Hold* h) { h->release.open(); });
  robot_->proxy.getObject()->connect("behaviorStopped", [hold](const std::string&) {
    if (hold->first.exchange(false)) {
      hold->holding.open();
      hold->release.wait();
    }
  });
  auto& holding = hold->holding;
  auto& release = hold->release;
  robot_->proxy.startBehavior(kLongArm);
  robot_->proxy.stopBehavior(kLongArm);  // its news holds the delivery thread
  ASSERT_TRUE(holding.wait());
  robot_->proxy.startBehavior(kLongHead);
  robot_->proxy.stopBehavior(kLongHead);   // a stop not told yet...
  robot_->proxy.startBehavior(kLongHead);  // ...when the behaviour starts again
  release.open();
  robot_->proxy.stopBehavior(kLongHead);
  // Everything told before this second news of kLongArm has been told.
  robot_->proxy.startBehavior(kLongArm);
  robot_->proxy.stopBehavior(kLongArm);
  ASSERT_TRUE(robot_->recorder->waitFor(kLongArm, 2));
  EXPECT_THAT(robot_->recorder->stopped(), ElementsAre(kLongArm, kLongHead, kLongArm));
  // The timeline keeps both ends.
  EXPECT_EQ(robot_->timeline->entries("ZUBehaviorManager", "behaviorStopped").size(), 4u);
}

// A listener of the timeline that throws ends neither the delivery thread nor the news.
TEST_F(BehaviorManagerService, AThrowingTimelineListenerIsLoggedAndTheNewsGoOn) {
  ko::log::ScopedCapture cap;
  robot_->timeline->addListener([](const TimelineEntry& entry) {
    if (entry.operation == "behaviorStopped")
      throw std::runtime_error("viewer gone");
  });
  robot_->proxy.startBehavior(kLongHead);
  robot_->proxy.stopBehavior(kLongHead);
  robot_->proxy.startBehavior(kLongArm);
  robot_->proxy.stopBehavior(kLongArm);
  ASSERT_TRUE(robot_->recorder->waitFor(kLongHead));
  ASSERT_TRUE(robot_->recorder->waitFor(kLongArm));
  EXPECT_TRUE(cap->containsPart("robotsim.timeline", ko::log::Error, "viewer gone"));
}

TEST_F(BehaviorManagerService, StartErrors) {
  robot_->proxy.startBehavior(kLongHead);
  try {
    robot_->proxy.startBehavior(kLongHead);
    ADD_FAILURE() << "started twice";
  } catch (const ZU::ZUError& e) {
    EXPECT_THAT(e.description(), HasSubstr("is already running"));
  }
  EXPECT_THROW(robot_->proxy.startBehavior("Hey_1"), ZU::ZUError);
  EXPECT_THROW(robot_->proxy.runBehavior("animations/Stand/Nothing"), ZU::ZUError);
  robot_->proxy.stopBehavior(kLongHead);
  EXPECT_TRUE(robot_->recorder->waitFor(kLongHead));
  // Only the running behaviour ever stopped.
  EXPECT_THAT(robot_->recorder->stopped(), ElementsAre(kLongHead));
}

TEST_F(BehaviorManagerService, StartWithoutTheMotionServiceIsAnError) {
  robot_->broker->unregisterModule("ZUMotion");
  robot_->motion.reset();
  try {
    robot_->proxy.startBehavior(kHeyStand);
    ADD_FAILURE() << "started without a body";
  } catch (const ZU::ZUError& e) {
    EXPECT_THAT(e.description(), HasSubstr("ZUMotion is not available"));
  }
  EXPECT_FALSE(robot_->proxy.isBehaviorRunning(kHeyStand));
}

TEST_F(BehaviorManagerService, PreloadReadsChangedDescriptors) {
  EXPECT_TRUE(robot_->proxy.preloadBehavior(kHeyStand));
  EXPECT_THROW(robot_->proxy.preloadBehavior("Hey_1"), ZU::ZUError);

  const fs::path file = folder_.path() / kHeyStand / "behavior.json";
  const auto written = fs::last_write_time(file);
  writeBehavior(folder_, kHeyStand, descriptor({"wave"}, 0.2));
  fs::last_write_time(file, written + std::chrono::seconds(1));
  EXPECT_TRUE(robot_->proxy.preloadBehavior(kHeyStand));
  EXPECT_THAT(robot_->proxy.getBehaviorTags(kHeyStand), ElementsAre("wave"));

  writeBehavior(folder_, kHeyStand, "{\"tags\": [], \"duration\": 1}");
  fs::last_write_time(file, written + std::chrono::seconds(2));
  try {
    robot_->proxy.preloadBehavior(kHeyStand);
    ADD_FAILURE() << "preloaded a malformed descriptor";
  } catch (const ZU::ZUError& e) {
    EXPECT_THAT(e.description(), HasSubstr("\"joints\" must be an object"));
  }
}

TEST_F(BehaviorManagerService, InstallAndRemoveRaiseTheirEvents) {
  const std::string wave = "animations/Stand/Gestures/Wave_9";
  robot_->generic.call<void>("installBehavior", wave, descriptor({"hello"}, 0.2));
  ASSERT_TRUE(robot_->memory->waitForEvents(kAdded, 1));
  EXPECT_THAT(robot_->memory->events(kAdded)[0].names, ElementsAre(wave));
  EXPECT_TRUE(fs::exists(folder_.path() / wave / "behavior.json"));
  EXPECT_EQ(robot_->proxy.resolveBehaviorName("Wave_9"), wave);
  robot_->proxy.runBehavior(wave);

  EXPECT_TRUE(robot_->generic.call<bool>("removeBehavior", wave));
  ASSERT_TRUE(robot_->memory->waitForEvents(kRemoved, 1));
  EXPECT_THAT(robot_->memory->events(kRemoved)[0].names, ElementsAre(wave));
  EXPECT_FALSE(fs::exists(folder_.path() / wave));
  EXPECT_TRUE(fs::exists(folder_.path() / "animations/Stand/Gestures"));  // Hey_1 is there
  EXPECT_FALSE(robot_->generic.call<bool>("removeBehavior", wave));

  // Removing a running behaviour stops it first.
  robot_->proxy.startBehavior(kLongHead);
  EXPECT_TRUE(robot_->generic.call<bool>("removeBehavior", kLongHead));
  EXPECT_TRUE(robot_->recorder->waitFor(kLongHead));
  EXPECT_FALSE(fs::exists(folder_.path() / kLongHead));
  EXPECT_EQ(robot_->memory->events(kRemoved).size(), 2u);
}

TEST_F(BehaviorManagerService, InstallRefusesBadPathsAndDescriptors) {
  const std::string good = descriptor({"x"}, 0.2);
  for (const std::string path : {"", "/abs/olute", "a//b", "../outside", "a/../../b", "a/", "."}) {
    EXPECT_THROW(robot_->generic.call<void>("installBehavior", path, good), ZU::ZUError) << path;
  }
  try {
    robot_->generic.call<void>("installBehavior", "animations/Stand/Bad",
                               descriptor({"x"}, 0.2, "Tail"));
    ADD_FAILURE() << "installed a malformed descriptor";
  } catch (const ZU::ZUError& e) {
    EXPECT_THAT(e.description(), HasSubstr("Unknown joint or chain name 'Tail'"));
  }
  EXPECT_TRUE(robot_->memory->events(kAdded).empty());
  EXPECT_FALSE(fs::exists(folder_.path() / "animations/Stand/Bad"));
  EXPECT_FALSE(fs::exists(folder_.path().parent_path() / "outside"));
}

TEST_F(BehaviorManagerService, RescanAnnouncesWhatChanged) {
  writeBehavior(folder_, "animations/Stand/Gestures/Yes_1", descriptor({"yes"}, 0.2));
  fs::remove_all(folder_.path() / kHeySit);
  robot_->generic.call<void>("rescan");
  ASSERT_EQ(robot_->memory->events(kAdded).size(), 1u);
  EXPECT_THAT(robot_->memory->events(kAdded)[0].names,
              ElementsAre("animations/Stand/Gestures/Yes_1"));
  ASSERT_EQ(robot_->memory->events(kRemoved).size(), 1u);
  EXPECT_THAT(robot_->memory->events(kRemoved)[0].names, ElementsAre(kHeySit));
  EXPECT_EQ(robot_->proxy.resolveBehaviorName("Hey_1"), kHeyStand);

  // Nothing changed: nothing announced.
  robot_->generic.call<void>("rescan");
  EXPECT_EQ(robot_->memory->events(kAdded).size(), 1u);
  EXPECT_EQ(robot_->memory->events(kRemoved).size(), 1u);
}

struct MalformedCase {
  const char* folder;
  std::string text;
  const char* reason;
};

TEST(BehaviorLibraryScan, MalformedDescriptorsAreSkipped) {
  const std::string joints =
      "\"joints\": {\"HeadYaw\": {\"times\": [0.5], \"keys\": [[0.1, [3, -0.1, 0], [3, 0, 0]]]}}";
  const MalformedCase cases[] = {
      {"bad/NotJson", "{\"tags\": [", "not JSON"},
      {"bad/NotObject", "[1, 2]", "must be a JSON object"},
      {"bad/NoDuration", "{\"tags\": [], " + joints + "}", "\"duration\" is missing"},
      {"bad/NegativeDuration", "{\"duration\": -1, " + joints + "}", "must be positive"},
      {"bad/TagNumber", "{\"tags\": [3], \"duration\": 1, " + joints + "}", "list of non-empty"},
      {"bad/NoJoints", "{\"duration\": 1, \"joints\": {}}", "at least one joint"},
      {"bad/UnknownJoint", descriptor({}, 0.5, "Tail"), "Unknown joint or chain name 'Tail'"},
      {"bad/KeyAfterEnd", "{\"duration\": 0.2, " + joints + "}", "after the end"},
      {"bad/NoKeys", "{\"duration\": 1, \"joints\": {\"HeadYaw\": {\"times\": [0.5]}}}",
       "needs \"times\" and \"keys\""},
      {"bad/HandleType",
       "{\"duration\": 1, \"joints\": {\"HeadYaw\": {\"times\": [0.5], \"keys\": [[0.1, [2, -0.1, "
       "0], [3, 0, 0]]]}}}",
       "only 3 (Bezier)"},
      {"bad/Deep", std::string(300, '[') + std::string(300, ']'), "not JSON"},
  };
  ScratchFolder folder;
  for (const auto& c : cases)
    writeBehavior(folder, c.folder, c.text);
  writeBehavior(folder, "good/Fine", descriptor({"fine"}, 0.5));
  folder.write("behavior.json", descriptor({}, 0.5));  // at the root: no behaviour path

  ko::log::ScopedCapture capture(ko::log::Warning);
  Robot robot(folder.path());
  EXPECT_THAT(robot.proxy.getInstalledBehaviors(), ElementsAre("good/Fine"));
  for (const auto& c : cases) {
    const std::string prefix = std::string("Behavior \"") + c.folder + "\" skipped: ";
    bool found = false;
    for (const auto& r : capture->records()) {
      if (r.category == "robotsim.behaviormanager" && r.message.rfind(prefix, 0) == 0) {
        found = true;
        EXPECT_THAT(r.message, HasSubstr(c.reason)) << c.folder;
      }
    }
    EXPECT_TRUE(found) << c.folder;
  }
  robot.proxy.runBehavior("good/Fine");
}

// ---- the starter library --------------------------------------------------------------------

std::size_t descriptorFiles(const fs::path& root) {
  std::size_t n = 0;
  for (const auto& entry : fs::recursive_directory_iterator(root))
    n += entry.path().filename() == "behavior.json" ? 1u : 0u;
  return n;
}

TEST(StarterLibrary, EveryBehaviourIsValid) {
  ko::log::ScopedCapture capture(ko::log::Warning);
  auto session = std::make_shared<ko::Session>();
  auto broker = ZU::ZUBroker::create(session);
  auto manager = ZU::ZUModule::createModule<ZUBehaviorManager>(broker, "ZUBehaviorManager");
  ZU::ZUBehaviorManagerProxy proxy(broker);

  const fs::path root = manager->libraryRoot();
  ASSERT_FALSE(root.empty());
  const auto installed = proxy.getInstalledBehaviors();
  EXPECT_EQ(installed.size(), descriptorFiles(root));
  EXPECT_FALSE(capture->containsPart("robotsim.behaviormanager", ko::log::Warning, "skipped"));

  const std::set<std::string> requiredTags = {"hello", "hey",    "yes",   "no",      "me",
                                              "you",   "two",    "three", "four",    "five",
                                              "pick",  "oppose", "yeah",  "medidate"};
  for (const std::string family : {"Stand", "Sit", "SitOnPod"}) {
    const std::string package = "animations/" + family + "/";
    std::map<std::string, int> tagCounts;
    for (const auto& behavior : installed) {
      if (behavior.rfind(package + "Gestures/", 0) == 0) {
        const auto tags = proxy.getBehaviorTags(behavior);
        EXPECT_FALSE(tags.empty()) << behavior;
        for (const auto& tag : tags)
          ++tagCounts[tag];
      }
    }
    for (const auto& tag : requiredTags)
      EXPECT_GT(tagCounts[tag], 0) << family << ": " << tag;
    EXPECT_GE(tagCounts["hello"], 2) << family;
    EXPECT_THAT(
        proxy.getBehaviorTags(package + "Gestures/Hey_1"),
        ElementsAre("hello", "hey", "hi", "bonjour", "salut", "coucou", "こんにちは", "やあ"));

    for (const auto& [kind, count] : std::vector<std::pair<std::string, int>>{
             {"Speaking", 10}, {"Listening", 5}, {"Thinking", 3}}) {
      for (int i = 1; i <= count; ++i) {
        const std::string path = package + "BodyTalk/" + kind + "_" + std::to_string(i);
        EXPECT_EQ(proxy.resolveBehaviorName(path), path);
      }
    }
    EXPECT_THAT(proxy.getBehaviorTags(package + "BodyTalk/Thinking_1"),
                testing::Contains("thinking"));
  }

  for (const auto& behavior : installed) {
    EXPECT_TRUE(proxy.preloadBehavior(behavior)) << behavior;
    const auto d = readBehaviorDescriptor(root / behavior / kBehaviorFileName);
    EXPECT_GE(d.duration, 1.0) << behavior;
    EXPECT_LE(d.duration, 4.0) << behavior;
    const bool armsOnly = behavior.find("/BodyTalk/Speaking_") != std::string::npos ||
                          behavior.find("/BodyTalk/Listening_") != std::string::npos;
    for (const auto& track : d.tracks) {
      const auto& joint = bodyJoints()[track.joint];
      // The body talk's arm animations leave the head to the head moves.
      if (armsOnly) {
        EXPECT_EQ(joint.name.rfind("Head", 0), std::string::npos) << behavior;
      }
      double previous = 0;
      for (std::size_t i = 0; i < track.keys.size(); ++i) {
        const auto& k = track.keys[i];
        EXPECT_GE(k.angle, joint.minAngle) << behavior << " " << joint.name;
        EXPECT_LE(k.angle, joint.maxAngle) << behavior << " " << joint.name;
        // Handles a third of the way to the neighbouring keys.
        EXPECT_NEAR(k.before.dTime, -(k.time - previous) / 3, 2e-4) << behavior;
        const double next = i + 1 < track.keys.size() ? track.keys[i + 1].time : k.time;
        EXPECT_NEAR(k.after.dTime, (next - k.time) / 3, 2e-4) << behavior;
        previous = k.time;
      }
    }
  }
}

}  // namespace
}  // namespace robotsim
