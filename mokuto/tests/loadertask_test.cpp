// The loader stage and the animation index: on the simulated robot with a library of its
// own and the process's body talk, and against a stand-in behaviour manager for the
// failures and the abort of an update.

#include "loadertask.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <future>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "robotsim/robot.h"
#include "support/behavior_files.h"
#include "support/fake_robot.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuproxy.h"
#include "zu/zuvalue.h"

namespace {

using robotsim::simtest::descriptor;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using ZU::LoaderTask;
using TagMap = LoaderTask::TagMap;
using Paths = std::set<std::string>;
using Counts = std::map<std::string, std::int32_t>;

constexpr const char* kCategory = "mokuto.loader";

constexpr const char* kHeyStand = "animations/Stand/Gestures/Hey_1";
constexpr const char* kHey2Stand = "animations/Stand/Gestures/Hey_2";
constexpr const char* kWave = "animations/Stand/Gestures/Wave_1";
constexpr const char* kHeySit = "animations/Sit/Gestures/Hey_1";
constexpr const char* kYesChair = "animations/SitOnPod/Gestures/Yes_1";
constexpr const char* kListening = "animations/Stand/BodyTalk/Listening_2";
constexpr const char* kSpeaking = "animations/Stand/BodyTalk/Speaking_3";
constexpr const char* kThinking = "animations/Stand/BodyTalk/Thinking_1";
constexpr const char* kSpeakingSit = "animations/Sit/BodyTalk/Speaking_1";
constexpr const char* kExtraSpeaking = "extra/Stand/BodyTalk/Speaking_9";

struct Behavior {
  const char* path;
  std::vector<std::string> tags;
};
const std::vector<Behavior> kLibrary = {
    {kHeyStand, {"hello", "hey"}},
    {kHey2Stand, {"hello"}},
    {kWave, {"wave"}},
    {kHeySit, {"hello"}},
    {kYesChair, {"yes"}},
    {"animations/Crouch/Foo", {"crouch"}},
    {kListening, {}},
    {kSpeaking, {}},
    {kThinking, {"thinking"}},
    {kSpeakingSit, {}},
    {kExtraSpeaking, {"extra"}},
};

// The job of an annotated text as the compiler leaves it; "auto:<tag>" stands for one
// automatic tag.
std::shared_ptr<ZU::MKTaskInstruction> job(const std::string& text, ZU::PostureFamily family,
                                           ZU::MokutoConfig config = {}) {
  auto made = std::make_shared<ZU::MKTaskInstruction>(1, text, std::move(config), family);
  if (text.rfind("auto:", 0) == 0) {
    auto action = std::make_shared<ZU::MKAnimationAction>(ZU::AUTO_START_TAG);
    action->tag = text.substr(5);
    action->text = "AUTO_START_TAG(" + action->tag + ")";
    made->addAction(action);
  } else {
    ZU::ZUMokutoParser().parse(made, text, false);
  }
  return made;
}

std::string animationOf(const ZU::MKTaskInstruction& job, std::size_t k) {
  const auto* action = dynamic_cast<const ZU::MKAnimationAction*>(job.actions.at(k).get());
  return action ? action->animation : "";
}

std::size_t loaderLines(ko::log::ScopedCapture& log) {
  std::size_t count = 0;
  for (const auto& record : log->records())
    count += record.category == kCategory;
  return count;
}

// The value inside any dynamic wrappers.
const ko::AnyValue& plain(const ko::AnyValue& v) {
  return v.kind() == ko::Kind::Dynamic ? plain(v.asDynamic()) : v;
}

// Stands where the service's module stands: the behaviour manager's events refresh the
// package "animations/". Holds the loader weakly: a delivery may outlive the test.
class ModuleStandIn : public ZU::ZUModule {
 public:
  ModuleStandIn(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                std::weak_ptr<LoaderTask> loader)
      : ZU::ZUModule(broker, name), fLoader(std::move(loader)) {
    bindMethods("ModuleStandIn", {{"_updateRepresentations", &ModuleStandIn::_updateRepresentations,
                                   "Refreshes the animations."}});
  }
  void _updateRepresentations(const std::string&, const ZU::ZUValue&, const std::string&) {
    if (const auto loader = fLoader.lock())
      loader->updateRepresentations("animations/");
  }

 private:
  std::weak_ptr<LoaderTask> fLoader;
};

class LoaderOnRobot : public testing::Test {
 protected:
  LoaderOnRobot() {
    for (const auto& behavior : kLibrary)
      library.write(std::string(behavior.path) + "/behavior.json",
                    descriptor(behavior.tags, 0.3, "HeadYaw", 0.1));
    robotsim::RobotOptions options;
    options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
    options.behaviorsRoot = library.path().string();
    robot.emplace(options);
    bodyTalk = std::make_shared<ZU::ZURobotBodyTalkInstance>(robot->broker());
    loader = std::make_shared<LoaderTask>(robot->broker(), bodyTalk);
  }

  ko::AnyObject service(const std::string& name) const { return robot->broker()->service(name); }
  // How many times the behaviour manager preloaded that behaviour.
  std::size_t preloadsOf(const std::string& behavior) const {
    std::size_t count = 0;
    for (const auto& entry : robot->timeline()->entries("ZUBehaviorManager", "preloadBehavior"))
      count += plain(plain(entry.arguments).asList().at(0)).asString() == behavior;
    return count;
  }

  ko::test::ScratchFolder library;
  std::optional<robotsim::Robot> robot;
  std::shared_ptr<ZU::ZURobotBodyTalkInstance> bodyTalk;
  std::shared_ptr<LoaderTask> loader;
};

// Each package's posture folders under their tags; the body talk folder of "animations/"
// alone handed to the body talk; a rebuild forgets what was uninstalled.
TEST_F(LoaderOnRobot, IndexesThePackagesPostureFoldersUnderTheirTags) {
  ZU::ZURobotBodyTalk& talk = *bodyTalk->bodyTalk;
  loader->updateRepresentations("animations/");
  EXPECT_EQ(loader->getInstalledTags(ZU::Standing), (TagMap{{"hello", {kHeyStand, kHey2Stand}},
                                                            {"hey", {kHeyStand}},
                                                            {"thinking", {kThinking}},
                                                            {"wave", {kWave}}}));
  EXPECT_EQ(loader->getInstalledTags(ZU::Sitting), (TagMap{{"hello", {kHeySit}}}));
  EXPECT_EQ(loader->getInstalledTags(ZU::SittingOnChair), (TagMap{{"yes", {kYesChair}}}));
  EXPECT_THAT(loader->getInstalledTags(ZU::Unknown), IsEmpty());
  TagMap merged{{"stale", {"x"}}};
  loader->getMergedTags(merged);
  EXPECT_EQ(merged, (TagMap{{"hello", {kHeyStand, kHey2Stand, kHeySit}},
                            {"hey", {kHeyStand}},
                            {"thinking", {kThinking}},
                            {"wave", {kWave}},
                            {"yes", {kYesChair}}}));
  EXPECT_THAT(talk.getSpeakingAnimations(ZU::Standing), ElementsAre(kSpeaking));
  EXPECT_THAT(talk.getListeningAnimations(ZU::Standing), ElementsAre(kListening));
  EXPECT_THAT(talk.getSpeakingAnimations(ZU::Sitting), ElementsAre(kSpeakingSit));
  EXPECT_THAT(talk.getListeningAnimations(ZU::Sitting), IsEmpty());
  EXPECT_THAT(talk.getSpeakingAnimations(ZU::SittingOnChair), IsEmpty());

  loader->updateRepresentations("extra/");
  EXPECT_EQ(loader->getInstalledTags(ZU::Standing).at("extra"), Paths{kExtraSpeaking});
  EXPECT_THAT(talk.getSpeakingAnimations(ZU::Standing), ElementsAre(kSpeaking));

  ASSERT_TRUE(service("ZUBehaviorManager")->call<bool>("removeBehavior", std::string(kHeyStand)));
  loader->updateRepresentations("animations/");
  const TagMap standing = loader->getInstalledTags(ZU::Standing);
  EXPECT_EQ(standing.count("hey"), 0u);
  EXPECT_EQ(standing.at("hello"), Paths{kHey2Stand});
  EXPECT_EQ(standing.at("extra"), Paths{kExtraSpeaking});
}

TEST_F(LoaderOnRobot, FollowsTheBehaviourManagersEventsWhileSubscribed) {
  const auto standIn =
      ZU::ZUModule::createModule<ModuleStandIn>(robot->broker(), LoaderTask::kModuleName, loader);
  loader->subscribeToEvents();
  const auto manager = service("ZUBehaviorManager");
  const std::string added = "animations/Sit/Gestures/New_1";
  manager->call<void>("installBehavior", added, descriptor({"new"}, 0.3, "HeadYaw", 0.1));
  EXPECT_TRUE(ko::test::eventually(
      [this] { return loader->getInstalledTags(ZU::Sitting).count("new") == 1; }));
  manager->call<bool>("removeBehavior", added);
  EXPECT_TRUE(ko::test::eventually(
      [this] { return loader->getInstalledTags(ZU::Sitting).count("new") == 0; }));

  loader->unsubscribeToEvents();
  for (const char* event : {LoaderTask::kBehaviorsAddedEvent, LoaderTask::kBehaviorsRemovedEvent}) {
    EXPECT_THAT(
        service("ZUMemory")->call<std::vector<std::string>>("getSubscribers", std::string(event)),
        Not(Contains(LoaderTask::kModuleName)));
  }
  standIn->exit();
}

// One action through the stage: the error code put in front of its text (which makes it
// UNKNOWN), its animation, the preloads, the one line logged.
struct StageCase {
  std::string text;  // "auto:<tag>" for an automatic tag
  ZU::PostureFamily family;
  TagMap configured;  // the job's table for its posture family
  std::string code;   // the error code put in front of the written text
  std::string animation;
  Counts preloads = {};
  ko::log::Level level = ko::log::Silent;  // Silent: the stage logs nothing
  std::string line{};                      // the whole line, or a part of another service's error
};

TEST_F(LoaderOnRobot, PreparesEachKindOfAction) {
  using namespace ZU;
  using ko::log::Error;
  using ko::log::Warning;
  const std::string notFound = "NO_ANIMATION_FOR_CURRENT_POSTURE";
  const std::string unknownPosture =
      " action can't be done because the robot is in an unknown posture.";
  const TagMap none;
  const Counts noPreloads;
  const TagMap heyWithout{{"hey", {}}};  // configured without animations
  const std::vector<StageCase> cases = {
      {"^start(animations/Stand/Gestures/Hey_1)", Standing, none, "", kHeyStand, {{kHeyStand, 0}}},
      {"^start(Wave_1)", Standing, none, "", kWave, noPreloads, Warning,
       "Animation name badly formatted given \"Wave_1\" instead of "
       "\"animations/Stand/Gestures/Wave_1\"."},
      {"^run(animations/Stand/Gestures/Wave_1)", Standing, none, "", kWave},
      {"^stop(Nowhere_1)", Standing, none, "ANIMATION_NOT_FOUND", "Nowhere_1", noPreloads, Error,
       "Animation \"Nowhere_1\" not found. Instruction skipped."},
      {"^startTag(hey)", Standing, none, "", kHeyStand, {{kHeyStand, 0}}},
      {"^stopTag(yes)", SittingOnChair, none, "", kYesChair, {{kYesChair, 0}}},
      {"^waitTag(hey)", Sitting, none, notFound, "", noPreloads, Warning,
       "Tag \"hey\" not found for the Sitting posture. Instruction skipped."},
      {"^runTag(hello)", Unknown, none, notFound, "", noPreloads, Warning,
       "^runTag(hello)" + unknownPosture},
      {"auto:hello", Unknown, none, notFound, "", noPreloads, Warning,
       "AUTO_START_TAG(hello)" + unknownPosture},
      {"auto:nothing", Standing, none, "", ""},
      {"^startTag(hello)", Standing, {{"hello", {kWave}}}, "", kWave, {{kWave, 0}}},
      {"^startTag(hey)", Standing, heyWithout, notFound, "", noPreloads, Warning,
       "Tag \"hey\" not found for the Standing posture. Instruction skipped."},
      {"^startSound(bells/ding)", Standing, none, "", ""},
      {"^runSound(nosuch/ding)", Standing, none, "SOUND_SET_NOT_FOUND", "", noPreloads, Error,
       "nosuch"},
      {"^stopSound(nosuch/ding)", Standing, none, "", ""},
      {"^call(NoSuchService.f())", Standing, none, "MODULE_NOT_FOUND", "", noPreloads, Error,
       "NoSuchService"},
      {"^pCall(ZUMemory.getData(\"k\"))", Standing, none, "", ""},
      {"^mode(random)", Standing, none, "", ""},
  };
  loader->updateRepresentations("animations/");
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text + " while " + postureFamilyToStr(c.family));
    MokutoConfig config;
    config.tagsToAnimations[static_cast<std::size_t>(c.family)] = c.configured;
    const auto made = job(c.text, c.family, config);
    ASSERT_EQ(made->actions.size(), 1u);
    const std::string written = made->actions[0]->text;
    const MKTaskActionType parsed = made->actions[0]->type;
    ko::log::ScopedCapture log;
    loader->process(*made);

    const MKTaskAction& action = *made->actions[0];
    // An automatic tag without animation is dropped silently, its text unchanged.
    const bool dropped = !c.code.empty() || (parsed == AUTO_START_TAG && c.animation.empty());
    EXPECT_EQ(action.type, dropped ? UNKNOWN : parsed);
    EXPECT_EQ(action.text, c.code.empty() ? written : c.code + " " + written);
    EXPECT_EQ(animationOf(*made, 0), c.animation);
    EXPECT_EQ(loader->getPreloadCounts(), c.preloads);
    if (const auto* call = dynamic_cast<const MKCallAction*>(&action); call && c.code.empty()) {
      EXPECT_TRUE(call->proxy && call->proxy->isValid());
    }
    EXPECT_EQ(loaderLines(log), c.level == ko::log::Silent ? 0u : 1u);
    if (c.level != ko::log::Silent) {
      // The lines of another service's error are checked by a part.
      EXPECT_TRUE(c.level == Error && c.code != "ANIMATION_NOT_FOUND"
                      ? log->containsPart(kCategory, c.level, c.line)
                      : log->contains(kCategory, c.level, c.line));
    }
  }
}

TEST_F(LoaderOnRobot, ATagDrawsAmongAllItsAnimations) {
  loader->updateRepresentations("animations/");
  std::set<std::string> drawn;
  for (int i = 0; i < 64; ++i) {
    const auto made = job("^startTag(hello)", ZU::Standing);
    loader->process(*made);
    drawn.insert(animationOf(*made, 0));
  }
  EXPECT_EQ(drawn, (Paths{kHeyStand, kHey2Stand}));
}

// The preload again after the first of two stops: the director's test on espeak-ng.
TEST_F(LoaderOnRobot, TwoStartsOfOneAnimationPreloadItOnceAndOtherStopsAreIgnored) {
  const std::string twice = std::string("^start(") + kHeyStand + ") a ^start(" + kHeyStand + ") b";
  loader->process(*job(twice, ZU::Standing));
  EXPECT_EQ(preloadsOf(kHeyStand), 1u);
  loader->onBehaviorStopped(kWave);  // not started by the text
  for (int stop = 0; stop < 3; ++stop)
    loader->onBehaviorStopped(kHeyStand);
  EXPECT_THAT(loader->getPreloadCounts(), IsEmpty());
}

TEST_F(LoaderOnRobot, TheBehaviourAtTheEndIsPreloadedWhenThereIsOneAndNotCounted) {
  ZU::MokutoConfig config;
  loader->process(*job("Hello.", ZU::Standing, config));
  EXPECT_THAT(robot->timeline()->entries("ZUBehaviorManager", "preloadBehavior"), IsEmpty());
  config.behaviorAtEndOfMokuto = kWave;
  loader->process(*job("Hello.", ZU::Standing, config));
  EXPECT_EQ(preloadsOf(kWave), 1u);
  EXPECT_THAT(loader->getPreloadCounts(), IsEmpty());
}

class LoaderOnStandIns : public testing::Test {
 protected:
  LoaderOnStandIns() : loader(std::make_shared<LoaderTask>(robot.broker, nullptr)) {}

  bodytalktest::FakeRobot robot;
  bodytalktest::FakeBehaviorManager& manager = *robot.behaviors;
  std::shared_ptr<LoaderTask> loader;
};

TEST_F(LoaderOnStandIns, IndexesOnlyPathsBelowAPostureFolderOfThePackage) {
  manager.setLibrary({{"animations/", {"root"}},
                      {"animations", {"bare"}},
                      {"animationsX/Stand/A", {"lookalike"}},
                      {"animations/Standing/B", {"standing"}},
                      {"animations/Stand/Bad", {"bad"}},
                      {"animations/Stand/Good", {"good"}}});
  manager.failOn("getBehaviorTags", "animations/Stand/Bad");
  ko::log::ScopedCapture log;
  loader->updateRepresentations("animations/");
  EXPECT_THAT(manager.behaviorsOf("getBehaviorTags"),
              ElementsAre("animations/Stand/Bad", "animations/Stand/Good"));
  EXPECT_EQ(loader->getInstalledTags(ZU::Standing), (TagMap{{"good", {"animations/Stand/Good"}}}));
  TagMap merged;
  loader->getMergedTags(merged);
  EXPECT_EQ(merged.size(), 1u);
  EXPECT_TRUE(log->containsPart(kCategory, ko::log::Error,
                                "Error caught when calling behaviorManager.getBehaviorTags(): "));
}

TEST_F(LoaderOnStandIns, FailedCallsAreLoggedAndAFailedListLeavesThePackageEmpty) {
  manager.setLibrary({{"animations/Stand/A", {"a"}}, {"other/Sit/B", {"b"}}});
  loader->updateRepresentations("animations/");
  loader->updateRepresentations("other/");
  manager.failOn("getInstalledBehaviors", "");
  ko::log::ScopedCapture log;
  loader->updateRepresentations("animations/");
  EXPECT_THAT(loader->getInstalledTags(ZU::Standing), IsEmpty());
  EXPECT_EQ(loader->getInstalledTags(ZU::Sitting), (TagMap{{"b", {"other/Sit/B"}}}));

  // One line for both subscriptions, one per unsubscription.
  robot.memory->fail = true;
  loader->subscribeToEvents();
  loader->unsubscribeToEvents();
  std::vector<std::pair<ko::log::Level, std::string>> lines;
  for (const auto& record : log->records()) {
    if (record.category == kCategory)
      lines.emplace_back(record.level, record.message.substr(0, record.message.find(": ") + 2));
  }
  using ko::log::Error;
  EXPECT_THAT(
      lines,
      ElementsAre(std::pair(ko::log::Warning,
                            "Error caught when calling "
                            "behaviorManager.getInstalledBehaviors(): "),
                  std::pair(Error, "ZUMemory.subscribeToEvent has thrown an exception: "),
                  std::pair(Error, "ZUMemory.unsubscribeToEvent has thrown an exception: "),
                  std::pair(Error, "ZUMemory.unsubscribeToEvent has thrown an exception: ")));
}

TEST_F(LoaderOnStandIns, AbortUpdateEndsTheUpdateInProgressAndWaitsForIt) {
  manager.setLibrary({{"animations/Stand/A", {"a"}},
                      {"animations/Stand/B", {"b"}},
                      {"animations/Stand/C", {"c"}}});
  loader->updateRepresentations("animations/");
  ASSERT_EQ(loader->getInstalledTags(ZU::Standing).size(), 3u);

  // The update's first tag query holds it until the abort has been asked for.
  const auto entered = std::make_shared<ko::test::Gate>();
  const std::weak_ptr<LoaderTask> weak = loader;
  manager.setTagQueryHook([entered, weak](const std::string&) {
    entered->open();
    ko::test::eventually([weak] {
      const auto held = weak.lock();
      return !held || held->isUpdateAborted();
    });
  });
  const std::size_t queries = manager.log.count("getBehaviorTags");
  auto update = std::async(std::launch::async,
                           [held = loader] { held->updateRepresentations("animations/"); });
  ASSERT_TRUE(entered->wait());
  auto abort = std::async(std::launch::async, [held = loader] { held->abortUpdate(); });
  ASSERT_EQ(abort.wait_for(ko::test::kBound), std::future_status::ready);
  ASSERT_EQ(update.wait_for(ko::test::kBound), std::future_status::ready);

  EXPECT_EQ(manager.log.count("getBehaviorTags"), queries + 1);
  EXPECT_EQ(manager.behaviorsOf("getBehaviorTags").back(), "animations/Stand/A");
  EXPECT_EQ(loader->getInstalledTags(ZU::Standing), (TagMap{{"a", {"animations/Stand/A"}}}));
}

TEST(LoaderWithoutServices, EachFailingCallMarksOnlyItsActionAndTheStageGoesOn) {
  const auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  LoaderTask loader(broker, nullptr);
  ZU::MokutoConfig config;
  config.behaviorAtEndOfMokuto = "animations/Stand/End";
  const auto made =
      job("^start(a) ^startSound(bells/ding) ^startTag(hey) ^mode(random)", ZU::Standing, config);
  ko::log::ScopedCapture log;
  loader.process(*made);

  std::vector<std::string> texts;
  for (const auto& action : made->actions)
    texts.push_back(action->text);
  EXPECT_THAT(
      texts,
      ElementsAre("ANIMATION_NOT_FOUND ^start(a)", "SOUND_SET_NOT_FOUND ^startSound(bells/ding)",
                  "NO_ANIMATION_FOR_CURRENT_POSTURE ^startTag(hey)", "^mode(random)"));
  EXPECT_TRUE(log->containsPart(kCategory, ko::log::Error,
                                "Could not preload behavior animations/Stand/End: "));
}

}  // namespace
