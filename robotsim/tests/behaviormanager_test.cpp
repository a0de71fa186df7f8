// The behaviour manager of the simulated robot driven through its proxy as the service
// drives it: names, tags, preloads, starts, runs and stops with "behaviorStopped" at every
// end, the library's events, malformed descriptors, and the starter library in share/.

#include <atomic>
#include <filesystem>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/behaviorlibrary.h"
#include "robotsim/jointmodel.h"
#include "robotsim/robot.h"
#include "robotsim/zubehaviormanager.h"
#include "support/behavior_files.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

namespace fs = std::filesystem;
using ko::test::errorOf;
using ko::test::ScratchFolder;
using simtest::descriptor;
using testing::ElementsAre;
using testing::HasSubstr;
using Behaviors = std::vector<std::pair<std::string, std::string>>;  // path, descriptor
using Lists = std::vector<std::vector<std::string>>;

constexpr const char* kAdded = "ZUBehaviorManager/BehaviorsAdded";
constexpr const char* kRemoved = "ZUBehaviorManager/BehaviorsRemoved";
constexpr const char* kHeyStand = "animations/Stand/Gestures/Hey_1";
constexpr const char* kHeySit = "animations/Sit/Gestures/Hey_1";
constexpr const char* kSpeaking = "animations/Stand/BodyTalk/Speaking_1";
constexpr const char* kLongHead = "animations/Stand/Long_1";
constexpr const char* kLongArm = "animations/Stand/Long_2";

// The simulated robot on a library of these behaviours, written in `folder`.
RobotOptions robotOn(const ScratchFolder& folder, const Behaviors& behaviors) {
  for (const auto& [path, text] : behaviors)
    folder.write(path + "/" + kBehaviorFileName, text);
  RobotOptions options;
  options.behaviorsRoot = folder.path().string();
  options.speech.backend = ZUTextToSpeechOptions::Backend::Timing;
  return options;
}

// Records the "behaviorStopped" signal; shared with the subscription, which may outlive
// the test's body.
using StoppedRecorder = ko::test::Recorded<std::string>;

std::shared_ptr<StoppedRecorder> listen(ZU::ZUBehaviorManagerProxy& proxy) {
  auto recorder = std::make_shared<StoppedRecorder>();
  proxy.getObject()->connect("behaviorStopped",
                             [recorder](const std::string& behavior) { recorder->add(behavior); });
  return recorder;
}

class BehaviorManagerService : public testing::Test {
 protected:
  // The behaviour lists raised as `key` through the memory service, in order.
  Lists raised(const std::string& key) const {
    Lists out;
    for (const auto& e : robot.timeline()->entries("ZUMemory", "raiseEvent")) {
      const auto arguments = e.arguments.to<std::vector<ko::AnyValue>>();
      if (arguments.at(0).to<std::string>() == key)
        out.push_back(arguments.at(1).to<std::vector<std::string>>());
    }
    return out;
  }
  // How the last run of `behavior` ended, on the timeline: "ended" or "stopped".
  std::string howEnded(const std::string& behavior) const {
    std::string how;
    for (const auto& e : robot.timeline()->entries("ZUBehaviorManager", "behaviorStopped")) {
      if (e.arguments.to<std::vector<std::string>>().at(0) == behavior)
        how = e.result.to<std::string>();
    }
    return how;
  }
  std::vector<std::string> running() {
    return generic.call<std::vector<std::string>>("getRunningBehaviors");
  }

  ScratchFolder folder;
  Robot robot{robotOn(folder, {{kHeyStand, descriptor({"hello", "hey"}, 0.2)},
                               {kHeySit, descriptor({"hello"}, 0.2)},
                               {kSpeaking, descriptor({}, 0.2, "LShoulderPitch", 1.0)},
                               {kLongHead, descriptor({"long"}, 60.0, "HeadYaw", 1.0)},
                               {kLongArm, descriptor({"long"}, 60.0, "RElbowRoll", 1.0)}})};
  simtest::TimelineWaiter waiter{*robot.timeline()};
  ZU::ZUBehaviorManagerProxy proxy{robot.broker()};
  ZU::ZUProxy generic{"ZUBehaviorManager", robot.broker()};  // what the service never calls
  ZU::ZUMotionProxy motion{robot.broker()};
  std::shared_ptr<StoppedRecorder> recorder = listen(proxy);
};

TEST_F(BehaviorManagerService, ResolvesNamesAndListsTags) {
  const std::pair<const char*, const char*> cases[] = {
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
  for (const auto& [name, expected] : cases)
    EXPECT_EQ(proxy.resolveBehaviorName(name), expected) << name;
  EXPECT_THAT(proxy.getInstalledBehaviors(),
              ElementsAre(kHeySit, kSpeaking, kHeyStand, kLongHead, kLongArm));
  EXPECT_THAT(proxy.getBehaviorTags(kHeyStand), ElementsAre("hello", "hey"));
  EXPECT_TRUE(proxy.getBehaviorTags(kSpeaking).empty());
  EXPECT_THROW(proxy.getBehaviorTags("Hey_1"), ZU::ZUError);
}

// Every way a behaviour ends frees its joints and is told: to the subscribers of
// "behaviorStopped" once, and on the timeline with how it ended.
TEST_F(BehaviorManagerService, EveryEndFreesTheJointsAndIsTold) {
  std::map<std::string, std::size_t> stops;  // told so far, by behaviour
  const auto told = [&](std::initializer_list<std::pair<const char*, const char*>> behaviors) {
    for (const auto& [behavior, how] : behaviors) {
      EXPECT_TRUE(recorder->waitForValue(behavior, ++stops[behavior])) << behavior;
      EXPECT_EQ(howEnded(behavior), how) << behavior;
    }
    EXPECT_TRUE(running().empty());
    EXPECT_TRUE(motion.areResourcesAvailable({"Body"}));
  };
  const int id = proxy.post_runBehavior(kLongArm);  // a posted run, stopped with its task
  ASSERT_TRUE(waiter.waitFor("ZUBehaviorManager", "startBehavior"));
  EXPECT_TRUE(proxy.isBehaviorRunning(kLongArm));
  proxy.stop(id);
  EXPECT_FALSE(proxy.wait(id, 10000));
  told({{kLongArm, "stopped"}});

  proxy.startBehavior(kLongHead);
  EXPECT_FALSE(motion.areResourcesAvailable({"Head"}));
  EXPECT_TRUE(motion.areResourcesAvailable({"Arms"}));
  EXPECT_THAT(running(), ElementsAre(kLongHead));
  proxy.stopBehavior(kLongHead);
  proxy.stopBehavior(kLongHead);  // what does not run: nothing to do
  proxy.stopBehavior("no/such/behavior");
  told({{kLongHead, "stopped"}});

  proxy.startBehavior(kHeyStand);  // to its end
  told({{kHeyStand, "ended"}});
  EXPECT_NEAR(motion.getAngles(ZU::ZUValue("HeadYaw"), false).at(0), 0.3, 1e-5);

  proxy.runBehavior(kSpeaking);  // returns at its end
  EXPECT_FALSE(proxy.isBehaviorRunning(kSpeaking));
  EXPECT_NEAR(motion.getAngles(ZU::ZUValue("LShoulderPitch"), false).at(0), 1.0, 1e-5);
  told({{kSpeaking, "ended"}});

  proxy.startBehavior(kLongHead);  // taken over by one on the same joints
  proxy.startBehavior(kHeyStand);
  told({{kLongHead, "stopped"}, {kHeyStand, "ended"}});

  proxy.startBehavior(kLongHead);
  proxy.startBehavior(kLongArm);
  generic.call<void>("stopAllBehaviors");
  EXPECT_TRUE(running().empty());
  told({{kLongHead, "stopped"}, {kLongArm, "stopped"}});
  EXPECT_EQ(recorder->all().size(), 8u);  // once each
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
  proxy.getObject()->connect("behaviorStopped", [hold](const std::string&) {
    if (hold->first.exchange(false)) {
      hold->holding.open();
      hold->release.wait();
    }
  });
  proxy.startBehavior(kLongArm);
  proxy.stopBehavior(kLongArm);  // its news holds the delivery thread
  ASSERT_TRUE(hold->holding.wait());
  proxy.startBehavior(kLongHead);
  proxy.stopBehavior(kLongHead);   // a stop not told yet...
  proxy.startBehavior(kLongHead);  // ...when the behaviour starts again
  hold->release.open();
  proxy.stopBehavior(kLongHead);
  // Everything told before this second news of kLongArm has been told.
  proxy.startBehavior(kLongArm);
  proxy.stopBehavior(kLongArm);
  ASSERT_TRUE(recorder->waitForValue(kLongArm, 2));
  EXPECT_THAT(recorder->all(), ElementsAre(kLongArm, kLongHead, kLongArm));
  // The timeline keeps both ends.
  EXPECT_EQ(robot.timeline()->entries("ZUBehaviorManager", "behaviorStopped").size(), 4u);
}

// A listener of the timeline that throws ends neither the delivery thread nor the news.
TEST_F(BehaviorManagerService, AThrowingTimelineListenerIsLoggedAndTheNewsGoOn) {
  ko::log::ScopedCapture cap;
  robot.timeline()->addListener([](const TimelineEntry& entry) {
    if (entry.operation == "behaviorStopped")
      throw std::runtime_error("viewer gone");
  });
  for (const char* behavior : {kLongHead, kLongArm}) {
    proxy.startBehavior(behavior);
    proxy.stopBehavior(behavior);
  }
  ASSERT_TRUE(recorder->waitForValue(kLongHead));
  ASSERT_TRUE(recorder->waitForValue(kLongArm));
  EXPECT_TRUE(cap->containsPart("robotsim.timeline", ko::log::Error, "viewer gone"));
}

// A refused start leaves the running behaviour alone: only it ever stops.
TEST_F(BehaviorManagerService, RefusedStartsAreErrors) {
  proxy.startBehavior(kLongHead);
  EXPECT_THAT(errorOf([&] { proxy.startBehavior(kLongHead); }), HasSubstr("is already running"));
  EXPECT_THAT(errorOf([&] { proxy.startBehavior("Hey_1"); }), HasSubstr("is not installed"));
  EXPECT_THAT(errorOf([&] { proxy.runBehavior("animations/Stand/No"); }),
              HasSubstr("not installed"));
  proxy.stopBehavior(kLongHead);
  EXPECT_TRUE(recorder->waitForValue(kLongHead));
  EXPECT_THAT(recorder->all(), ElementsAre(kLongHead));
}

// Installs, removals and rescans change the library on disk and raise their events.
TEST_F(BehaviorManagerService, LibraryChangesAreAnnounced) {
  const std::string wave = "animations/Stand/Gestures/Wave_9";
  generic.call<void>("installBehavior", wave, descriptor({"hello"}, 0.2));
  EXPECT_TRUE(fs::exists(folder.path() / wave / kBehaviorFileName));
  EXPECT_EQ(proxy.resolveBehaviorName("Wave_9"), wave);
  proxy.runBehavior(wave);
  EXPECT_TRUE(generic.call<bool>("removeBehavior", wave));
  EXPECT_FALSE(fs::exists(folder.path() / wave));
  EXPECT_TRUE(fs::exists(folder.path() / "animations/Stand/Gestures"));  // Hey_1 is there
  EXPECT_FALSE(generic.call<bool>("removeBehavior", wave));
  // Removing a running behaviour stops it first.
  proxy.startBehavior(kLongHead);
  EXPECT_TRUE(generic.call<bool>("removeBehavior", kLongHead));
  EXPECT_TRUE(recorder->waitForValue(kLongHead));
  EXPECT_FALSE(fs::exists(folder.path() / kLongHead));
  // A rescan announces what changed on disk; a second one, nothing.
  const std::string yes = "animations/Stand/Gestures/Yes_1";
  folder.write(yes + "/" + kBehaviorFileName, descriptor({"yes"}, 0.2));
  fs::remove_all(folder.path() / kHeySit);
  generic.call<void>("rescan");
  generic.call<void>("rescan");
  EXPECT_EQ(raised(kAdded), (Lists{{wave}, {yes}}));
  EXPECT_EQ(raised(kRemoved), (Lists{{wave}, {kLongHead}, {kHeySit}}));
  EXPECT_EQ(proxy.resolveBehaviorName("Hey_1"), kHeyStand);

  // Bad paths and descriptors install nothing.
  for (const std::string path : {"", "/abs/olute", "a//b", "../outside", "a/../../b", "a/", "."}) {
    EXPECT_THROW(generic.call<void>("installBehavior", path, descriptor({"x"}, 0.2)), ZU::ZUError)
        << path;
  }
  EXPECT_THAT(errorOf([&] {
                generic.call<void>("installBehavior", "animations/Stand/Bad",
                                   descriptor({"x"}, 0.2, "Tail"));
              }),
              HasSubstr("Unknown joint or chain name 'Tail'"));
  EXPECT_EQ(raised(kAdded).size(), 2u);
  EXPECT_FALSE(fs::exists(folder.path() / "animations/Stand/Bad"));
  EXPECT_FALSE(fs::exists(folder.path().parent_path() / "outside"));
}

TEST(BehaviorLibraryScan, MalformedDescriptorsAreSkipped) {
  const std::string joints =
      "\"joints\": {\"HeadYaw\": {\"times\": [0.5], \"keys\": [[0.1, [3, -0.1, 0], [3, 0, 0]]]}}";
  const std::map<std::string, std::pair<std::string, const char*>> cases = {
      {"bad/NotJson", {"{\"tags\": [", "not JSON"}},
      {"bad/NotObject", {"[1, 2]", "must be a JSON object"}},
      {"bad/NoDuration", {"{\"tags\": [], " + joints + "}", "\"duration\" is missing"}},
      {"bad/NegativeDuration", {"{\"duration\": -1, " + joints + "}", "must be positive"}},
      {"bad/TagNumber", {"{\"tags\": [3], \"duration\": 1, " + joints + "}", "list of non-empty"}},
      {"bad/NoJoints", {"{\"duration\": 1, \"joints\": {}}", "at least one joint"}},
      {"bad/KeyAfterEnd", {"{\"duration\": 0.2, " + joints + "}", "after the end"}},
      {"bad/NoKeys",
       {"{\"duration\": 1, \"joints\": {\"HeadYaw\": {\"times\": [0.5]}}}",
        "needs \"times\" and \"keys\""}},
      {"bad/Deep", {std::string(300, '[') + std::string(300, ']'), "not JSON"}},
      {".", {descriptor({}, 0.5), "must lie in a behaviour folder"}},  // at the root
  };
  ScratchFolder folder;
  Behaviors behaviors = {{"good/Fine", descriptor({"fine"}, 0.5)}};
  for (const auto& [path, c] : cases)
    behaviors.emplace_back(path, c.first);

  ko::log::ScopedCapture capture(ko::log::Warning);
  Robot robot(robotOn(folder, behaviors));
  ZU::ZUBehaviorManagerProxy proxy(robot.broker());
  EXPECT_THAT(proxy.getInstalledBehaviors(), ElementsAre("good/Fine"));
  std::map<std::string, std::string> skipped;
  for (const auto& r : capture->records()) {
    const auto end = r.message.find("\" skipped: ");
    if (r.category == "robotsim.behaviormanager" && r.message.rfind("Behavior \"", 0) == 0 &&
        end != std::string::npos)
      skipped[r.message.substr(10, end - 10)] = r.message;
  }
  ASSERT_EQ(skipped.size(), cases.size());
  for (const auto& [path, c] : cases)
    EXPECT_THAT(skipped[path], HasSubstr(c.second)) << path;
  proxy.runBehavior("good/Fine");
}

// ---- the starter library --------------------------------------------------------------------

// Gestures for the words in every posture family, the body talk's animations, keys within
// the joints' limits with handles a third of the way to their neighbours. (The robot's
// test sees that every descriptor is read without a warning.)
TEST(StarterLibrary, EveryBehaviourIsValid) {
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  auto manager = ZU::ZUModule::createModule<ZUBehaviorManager>(broker, "ZUBehaviorManager");
  ZU::ZUBehaviorManagerProxy proxy(broker);
  const fs::path root = manager->libraryRoot();
  const auto installed = proxy.getInstalledBehaviors();
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
    for (const char* tag : {"hello", "hey", "bonjour", "こんにちは", "yes", "no", "me", "you",
                            "two", "three", "four", "five", "pick", "oppose", "yeah", "medidate"})
      EXPECT_GT(tagCounts[tag], 0) << family << ": " << tag;
    EXPECT_GE(tagCounts["hello"], 2) << family;
    for (const auto& [kind, count] : std::initializer_list<std::pair<const char*, int>>{
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
    // The body talk's arm animations leave the head to the head moves.
    const bool armsOnly = behavior.find("/BodyTalk/Speaking_") != std::string::npos ||
                          behavior.find("/BodyTalk/Listening_") != std::string::npos;
    for (const auto& track : d.tracks) {
      const auto& joint = bodyJoints()[track.joint];
      EXPECT_FALSE(armsOnly && joint.name.rfind("Head", 0) == 0) << behavior;
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
