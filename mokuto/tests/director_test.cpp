// The director on the simulated robot with a scripted speech engine: the order of the
// actions and the bookmarks, the stops, and what each kind of action does.
#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "director_rig.h"
#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "mokuto/directortask.h"
#include "mokuto/mkidregister.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace {

using mokutotest::DirectorRig;
using mokutotest::kBound;
using mokutotest::kLongA;
using mokutotest::kLongB;
using mokutotest::kLongC;
using mokutotest::kMid;
using mokutotest::kShort;
using Outcome = ZU::DirectorActionReport::Outcome;
using namespace std::chrono_literals;

constexpr int kBoundMs = 10000;
constexpr const char* kDirector = "mokuto.director";

// Appends an action (and its bookmark, then a word) to a job, as the automatic tagging does.
template <class Action>
std::shared_ptr<Action> append(ZU::MKTaskInstruction& job, ZU::MKTaskActionType type,
                               const std::string& text) {
  auto action = std::make_shared<Action>(type);
  action->text = text;
  job.addAction(action);
  job.text += " " + action->bookmark() + " word";
  return action;
}

void appendAnimation(ZU::MKTaskInstruction& job, ZU::MKTaskActionType type, const std::string& tag,
                     const std::string& animation) {
  auto action = append<ZU::MKAnimationAction>(job, type, tag);
  action->tag = tag;
  action->animation = animation;
}

void appendMarker(ZU::MKTaskInstruction& job, const std::string& name) {
  auto action = append<ZU::MKAffectationAction>(job, ZU::AFFECTATION, "$" + name + "=1");
  action->name = name;
  action->value = "1";
}

class Director : public testing::Test {
 protected:
  struct Run {
    std::shared_ptr<ZU::MKTaskInstruction> job;
    std::future<ZU::MKID> done;
    mokutotest::ScriptedSpeech::Say say;
  };

  Director() { rig_.host->director().setObserver(recorder_); }

  // Says the job and waits until its speech is posted; "started" unless told otherwise.
  Run begin(std::shared_ptr<ZU::MKTaskInstruction> job, bool started = true) {
    Run run{job, rig_.sayAsync(job), {}};
    const auto say = rig_.speech->waitForSay(says_++);
    EXPECT_TRUE(say.has_value());
    if (say)
      run.say = *say;
    if (started)
      rig_.speech->raiseStatus(run.say.id, "started");
    return run;
  }
  void bookmark(int number) { rig_.speech->raiseBookmark(ZU::ZUValue(number)); }
  bool paused(int number) {
    return rig_.speech->mrkpause(number).wait(kBoundMs) == ko::FutureState::FinishedWithValue;
  }
  // Ends the speech and waits for the director stage to return.
  bool end(Run& run) {
    rig_.speech->finish(run.say.id);
    return run.done.wait_for(kBound) == std::future_status::ready;
  }
  std::vector<Outcome> outcomes() const {
    std::vector<Outcome> out;
    for (const auto& report : recorder_->reports())
      out.push_back(report.outcome);
    return out;
  }
  // Whether the entry (service, operation, first) came before (service2, operation2, first2).
  bool before(const std::string& operation, const std::string& first, const std::string& operation2,
              const std::string& first2) const {
    std::ptrdiff_t a = -1, b = -1, index = 0;
    for (const auto& entry : rig_.timeline->entries()) {
      const std::string argument = mokutotest::firstArgument(entry);
      if (a < 0 && entry.operation == operation && argument == first)
        a = index;
      if (b < 0 && entry.operation == operation2 && argument == first2)
        b = index;
      ++index;
    }
    return a >= 0 && b >= 0 && a < b;
  }

  ko::log::ScopedCapture log_{ko::log::Info};
  DirectorRig rig_;
  std::shared_ptr<mokutotest::SyncRecorder> recorder_ =
      std::make_shared<mokutotest::SyncRecorder>();
  std::size_t says_ = 0;
};

// ---- speech and bookmarks ----------------------------------------------------------------

TEST_F(Director, EarlyBookmarksWaitForTheActionsBeforeThem) {
  Run run = begin(rig_.job("One $a=1 two $b=1"));
  bookmark(2);
  bookmark(1);
  ASSERT_TRUE(recorder_->waitFor(2));
  EXPECT_EQ(outcomes(), (std::vector{Outcome::Executed, Outcome::Executed}));
  EXPECT_TRUE(before("raiseEvent", "a", "raiseEvent", "b"));
  EXPECT_TRUE(end(run));
}

TEST_F(Director, AMrkpauseHoldsTheSpeechUntilItsRunEnds) {
  Run run = begin(rig_.job("^run(" + std::string(kMid) + ") and after"));
  ASSERT_TRUE(paused(1));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "behaviorStopped", kMid), 1u);
  EXPECT_TRUE(end(run));
  EXPECT_EQ(run.job->actions[0]->type, ZU::START);
}

TEST_F(Director, AStopDuringABlockingBookmarkReleasesItAndDropsTheRest) {
  Run run = begin(rig_.job("^run(" + std::string(kLongA) + ") then $x=1 and more"));
  auto blocked = rig_.speech->mrkpause(1);
  ASSERT_TRUE(rig_.waitFor("ZUBehaviorManager", "startBehavior", kLongA));
  rig_.host->stop(run.job->id);
  EXPECT_EQ(blocked.wait(kBoundMs), ko::FutureState::FinishedWithValue);
  EXPECT_TRUE(rig_.speech->waitForCall("stop(" + std::to_string(run.say.id) + ")"));
  ASSERT_EQ(run.done.wait_for(kBound), std::future_status::ready);
  EXPECT_EQ(outcomes(), (std::vector{Outcome::Executed, Outcome::Dropped}));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "behaviorStopped", kLongA), 1u);
  EXPECT_EQ(rig_.count("ZUMemory", "raiseEvent", "x"), 0u);
}

TEST_F(Director, AStopThatCameBeforeTheSpeechStartedTakesEffectAtStarted) {
  auto job = rig_.job("$x=1 Hello");
  ZU::MKIDRegister& texts = rig_.host->textRegister;
  const ZU::MKID id = texts.newMKID(job, std::nullopt);
  {
    // As a stop whose director call found another text current.
    std::lock_guard lock(texts.textsMutex);
    texts.textsToStop.insert(id);
  }
  auto done = std::async(std::launch::async, [&] { rig_.host->director().process(job); });
  const auto say = rig_.speech->waitForSay(0);
  ASSERT_TRUE(say);
  const std::string stop = "stop(" + std::to_string(say->id) + ")";
  bookmark(1);
  EXPECT_FALSE(rig_.speech->waitForCall(stop, 100ms));
  rig_.speech->raiseStatus(say->id, "started");
  EXPECT_TRUE(rig_.speech->waitForCall(stop));
  ASSERT_EQ(done.wait_for(kBound), std::future_status::ready);
  EXPECT_EQ(outcomes(), std::vector{Outcome::Dropped});
  texts.freeMKID(id);
}

TEST_F(Director, AStopOfATextWaitingForTheStageStopsOnlyTheCurrentAnimations) {
  Run first = begin(rig_.job("^start(" + std::string(kLongA) + ") go $x=1"));
  bookmark(1);
  ASSERT_TRUE(rig_.waitFor("ZUBehaviorManager", "startBehavior", kLongA));
  auto second = rig_.job("Waiting");
  auto secondDone = rig_.sayAsync(second);
  ASSERT_TRUE(ko::test::eventually([&] {
    std::lock_guard lock(rig_.host->textRegister.textsMutex);
    return rig_.host->textRegister.runningTexts.size() == 2;
  }));
  rig_.host->stop(second->id);
  EXPECT_TRUE(rig_.waitFor("ZUBehaviorManager", "behaviorStopped", kLongA));
  bookmark(2);
  EXPECT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "x"));
  EXPECT_TRUE(end(first));
  ASSERT_EQ(secondDone.wait_for(kBound), std::future_status::ready);
  for (const auto& call : rig_.speech->calls())
    EXPECT_EQ(call.rfind("stop(", 0), std::string::npos) << call;
  EXPECT_FALSE(rig_.speech->waitForSay(1, 0ms));
}

TEST_F(Director, BookmarksWhileNoTextIsSpokenAndValuesThatAreNoActionsNumberAreIgnored) {
  ZU::DirectorTask& director = rig_.host->director();
  director.xOnBookmark(ZU::ZUValue(1));
  auto held = std::async(std::launch::async, [&director] { director.xBookmarkReached(1, true); });
  ASSERT_EQ(held.wait_for(kBound), std::future_status::ready);  // the speech is not held
  Run run = begin(rig_.job("$a=1 Hello"));
  for (const ZU::ZUValue& value : {ZU::ZUValue(0), ZU::ZUValue("1"), ZU::ZUValue(1.5F),
                                   ZU::ZUValue(), ZU::ZUValue::makeArray({1}), ZU::ZUValue(7)})
    rig_.speech->raiseBookmark(value);
  rig_.speech->finish(run.say.id);
  ASSERT_TRUE(recorder_->waitFor(1));
  EXPECT_EQ(outcomes(), std::vector{Outcome::Skipped});
  EXPECT_TRUE(
      log_->contains(kDirector, ko::log::Error, "The bookmark 1.5 is not a number: ignored."));
  EXPECT_EQ(run.done.wait_for(kBound), std::future_status::ready);
}

TEST_F(Director, InputMode2HoldsTheSpeechEngineInMode2ForTheText) {
  Run run = begin(rig_.job("^inputMode2(on) Hello"));
  ASSERT_TRUE(end(run));
  const auto calls = rig_.speech->calls();
  const std::vector<std::string> expected = {"setParameter(inputMode, 2)",
                                             "say(" + std::to_string(run.say.id) + ")",
                                             "setParameter(inputMode, 3)"};
  EXPECT_EQ(std::vector(calls.end() - 3, calls.end()), expected);
}

TEST_F(Director, TheSpeechStartStartsTheBodyTalkOrPreparesItWithoutArmBreathing) {
  struct Case {
    ZU::BodyLanguageMode mode;
    bool breathingAllowed;
    bool running;
    std::size_t breathChanges;  // off, then on at the end
  };
  for (const Case& c : {Case{ZU::BODY_LANGUAGE_MODE_CONTEXTUAL, false, true, 0},
                        Case{ZU::BODY_LANGUAGE_MODE_DISABLED, true, false, 0},
                        Case{ZU::BODY_LANGUAGE_MODE_DISABLED, false, false, 2}}) {
    SCOPED_TRACE(c.mode * 10 + c.breathingAllowed);
    ZU::MokutoConfig config;
    config.bodyLanguageMode = c.mode;
    config.armsBreathingAllowed = c.breathingAllowed;
    const std::size_t changes = rig_.count("ZUMotion", "setBreathEnabled", "Arms");
    Run run = begin(rig_.job("Hello", config));
    ZU::ZURobotBodyTalk* bodyTalk = rig_.host->bodyTalk();
    EXPECT_TRUE(ko::test::eventually(
        [&] { return c.running ? bodyTalk->isRunning() : bodyTalk->isPaused(); }));
    // Breathing goes off while the speech runs (never once it is over): the speech ends
    // after that.
    if (c.breathChanges > 0) {
      EXPECT_TRUE(ko::test::eventually(
          [&] { return rig_.count("ZUMotion", "setBreathEnabled", "Arms") > changes; }));
    }
    ASSERT_TRUE(end(run));
    EXPECT_FALSE(bodyTalk->isRunning() || bodyTalk->isPaused());
    EXPECT_EQ(rig_.count("ZUMotion", "setBreathEnabled", "Arms") - changes, c.breathChanges);
  }
}

TEST_F(Director, ModeDisabledMidTextStopsGesturesAndHoldsArmBreathingOffToTheEnd) {
  ZU::MokutoConfig config;
  config.armsBreathingAllowed = false;
  auto job = rig_.job("Hello", config);
  appendAnimation(*job, ZU::AUTO_START_TAG, "gesture", kLongC);
  auto mode = append<ZU::MKModeAction>(*job, ZU::MODE, "^mode(disabled)");
  mode->mode = ZU::BODY_LANGUAGE_MODE_DISABLED;
  Run run = begin(job);
  bookmark(1);
  ASSERT_TRUE(rig_.waitFor("ZUBehaviorManager", "startBehavior", kLongC));
  bookmark(2);
  ASSERT_TRUE(recorder_->waitFor(2));
  EXPECT_TRUE(rig_.host->bodyTalk()->isPaused());
  EXPECT_TRUE(rig_.waitFor("ZUBehaviorManager", "behaviorStopped", kLongC));
  EXPECT_EQ(rig_.count("ZUMotion", "setBreathEnabled", "Arms"), 1u);
  ASSERT_TRUE(end(run));
  const auto breath = rig_.timeline->entries("ZUMotion", "setBreathEnabled");
  ASSERT_EQ(breath.size(), 2u);
  EXPECT_FALSE(breath[0].arguments.to<std::vector<ko::AnyValue>>().at(1).to<bool>());
  EXPECT_TRUE(breath[1].arguments.to<std::vector<ko::AnyValue>>().at(1).to<bool>());
}

// ---- animations -------------------------------------------------------------------------

TEST_F(Director, AnimationsOfLowerPriorityGiveWayAndNeverTakeOver) {
  auto job = rig_.job("Hello");
  appendAnimation(*job, ZU::AUTO_START_TAG, "gesture", kLongC);
  appendAnimation(*job, ZU::START_TAG, "hello", kLongA);  // the automatic one goes
  appendAnimation(*job, ZU::START, "", kLongB);           // the tagged one goes
  appendAnimation(*job, ZU::START, "", kLongB);           // already runs: nothing
  appendAnimation(*job, ZU::START_TAG, "hello", kLongB);  // lower priority: nothing
  appendMarker(*job, "done");
  Run run = begin(job);
  for (int n = 1; n <= 6; ++n)
    bookmark(n);
  ASSERT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "done"));
  for (const char* path : {kLongA, kLongB, kLongC})
    EXPECT_EQ(rig_.count("ZUBehaviorManager", "startBehavior", path), 1u) << path;
  // Each gives way once the next one has started.
  EXPECT_TRUE(before("startBehavior", kLongA, "behaviorStopped", kLongC));
  EXPECT_TRUE(before("startBehavior", kLongB, "behaviorStopped", kLongA));
  EXPECT_TRUE(rig_.waitFor("ZUBehaviorManager", "behaviorStopped", kLongA));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "behaviorStopped", kLongB), 0u);
  EXPECT_TRUE(end(run));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "behaviorStopped", kLongB), 1u);
}

TEST_F(Director, WaitingForAnAnimationNeverStartedReturnsAtOnce) {
  Run run = begin(rig_.job("^wait(" + std::string(kLongA) + ") Hello"));
  ASSERT_TRUE(paused(1));
  EXPECT_FALSE(log_->containsPart(kDirector, ko::log::Error, "hasn't been notified"));
  EXPECT_TRUE(end(run));
}

TEST_F(Director, StopTagStopsOnlyTheFirstAnimationOfTheTag) {
  auto job = rig_.job("Hello");
  appendAnimation(*job, ZU::START_TAG, "hello", kLongA);
  appendAnimation(*job, ZU::START_TAG, "hello", kLongB);
  appendAnimation(*job, ZU::STOP_TAG, "hello", "");
  appendMarker(*job, "done");
  Run run = begin(job);
  for (int n = 1; n <= 4; ++n)
    bookmark(n);
  ASSERT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "done"));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "stopBehavior", kLongB), 0u);
  EXPECT_TRUE(rig_.waitFor("ZUBehaviorManager", "behaviorStopped", kLongA));
  EXPECT_TRUE(end(run));
}

TEST_F(Director, TagsAndNamesAreRunWaitedForAndStoppedByTheirActions) {
  struct Case {
    std::string text;
    std::vector<int> marks;  // raised in turn; a negative one as a held "mrkpause"
    const char* stopped;     // stops, and is heard to stop, before "x" is raised
  };
  const std::string longGesture = kLongA;
  const std::vector<Case> cases = {
      {"^runTag(short) then $x=1", {-1, 2}, kShort},
      {"^startTag(mid) a ^waitTag(mid) b $x=1", {1, -2, 3}, kMid},
      {"^start(" + longGesture + ") a ^stop(" + longGesture + ") b $x=1", {1, 2, 3}, kLongA},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    rig_.timeline->clear();
    Run run = begin(rig_.job(c.text, {}, {{"short", kShort}, {"mid", kMid}}));
    for (const int mark : c.marks) {
      if (mark < 0)
        ASSERT_TRUE(paused(-mark));
      else
        bookmark(mark);
    }
    ASSERT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "x"));
    EXPECT_TRUE(before("behaviorStopped", c.stopped, "raiseEvent", "x"));
    EXPECT_TRUE(end(run));
  }
  EXPECT_FALSE(log_->containsPart(kDirector, ko::log::Error, "did not stop before"));
}

TEST_F(Director, ATagIsNotLaunchedOnceThePostureChanged) {
  const auto& posture = rig_.host->bodyTalk()->getPosture();
  posture->setPostureFamily(ZU::Standing);
  Run run = begin(rig_.job("^startTag(hello) Hello $x=1", {}, {{"hello", kLongA}}));
  posture->setPostureFamily(ZU::Sitting);
  bookmark(1);
  bookmark(2);
  ASSERT_TRUE(recorder_->waitFor(2));
  EXPECT_TRUE(log_->contains(kDirector, ko::log::Warning,
                             "Tag \"hello\" not launched because the robot posture has changed "
                             "from the begin of the text"));
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "startBehavior", kLongA), 0u);
  EXPECT_TRUE(end(run));
}

TEST_F(Director, TheBehaviourAtTheEndHoldsTheTextOnlyWhenBlocking) {
  // A blocking one has ended when the text ends; a 30 s one not blocking lets it end at once.
  for (const auto& [behaviour, blocking] : {std::pair{kMid, true}, std::pair{kLongA, false}}) {
    SCOPED_TRACE(behaviour);
    ZU::MokutoConfig config;
    config.behaviorAtEndOfMokuto = behaviour;
    config.ifBehaviorAtEndOfMokutoIsBlocking = blocking;
    Run run = begin(rig_.job("Bye", config));
    ASSERT_TRUE(end(run));
    if (blocking) {
      EXPECT_FALSE(ZU::ZUBehaviorManagerProxy(rig_.broker).isBehaviorRunning(behaviour));
    }
    EXPECT_TRUE(rig_.waitFor("ZUBehaviorManager", "startBehavior", behaviour));
  }
}

TEST_F(Director, AnAutomaticYeahAsksForAStepForwardAboutHalfOfTheTime) {
  ZU::MokutoConfig config;
  config.bodyLanguageMode = ZU::BODY_LANGUAGE_MODE_RANDOM;
  auto job = rig_.job("Yeah", config);
  constexpr int kTags = 40;
  for (int n = 0; n < kTags; ++n)
    appendAnimation(*job, ZU::AUTO_START_TAG, "yeah", kLongC);
  Run run = begin(job);
  for (int n = 1; n <= kTags; ++n)
    bookmark(n);
  ASSERT_TRUE(recorder_->waitFor(kTags));
  EXPECT_TRUE(end(run));
  const std::size_t steps = rig_.count("ZUAutonomousMoves", "_moveForward");
  EXPECT_GE(steps, 8u);  // binomial(40, 1/2): outside [8, 32] once in 10^5 runs
  EXPECT_LE(steps, 32u);
  EXPECT_EQ(rig_.count("ZUBehaviorManager", "startBehavior", kLongC), 0u);
}

// ---- sounds, calls, memory --------------------------------------------------------------

TEST_F(Director, SoundsStartWaitAndStopWithTheirVolumeOver100) {
  Run run = begin(
      rig_.job("^startSound(bells/chime, 50) a ^waitSound(bells/chime) b ^startSound(bells/dong) c "
               "^stopSound(bells/dong) d"));
  bookmark(1);
  ASSERT_TRUE(paused(2));
  EXPECT_EQ(rig_.count("ZUAudioPlayer", "soundEnded", "bells"), 1u);
  bookmark(3);
  bookmark(4);
  ASSERT_TRUE(recorder_->waitFor(4));
  EXPECT_TRUE(rig_.waitFor("ZUAudioPlayer", "soundStopped", "bells"));
  EXPECT_TRUE(end(run));
  const auto plays = rig_.timeline->entries("ZUAudioPlayer", "playSoundSetFile");
  ASSERT_EQ(plays.size(), 2u);
  const auto volumeOf = [](const robotsim::TimelineEntry& e) {
    return e.arguments.to<std::vector<ko::AnyValue>>().at(2).to<double>();
  };
  EXPECT_DOUBLE_EQ(volumeOf(plays[0]), 0.5);
  EXPECT_DOUBLE_EQ(volumeOf(plays[1]), 1.0);
}

TEST_F(Director, CallsPassTheirJsonArgumentsAndAffectationsRaiseStrings) {
  Run run = begin(rig_.job(
      R"(^call(ZUMemory.raiseEvent("called", 7)) ^pCall(ZUMemory.raiseEvent("posted", [1, "two"])))"
      R"( ^call(ZUMemory.noSuchMethod()) $x=1)"));
  ASSERT_TRUE(paused(1));
  bookmark(2);
  ASSERT_TRUE(paused(3));
  bookmark(4);
  ASSERT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "posted"));
  ASSERT_TRUE(rig_.waitFor("ZUMemory", "raiseEvent", "x"));
  EXPECT_TRUE(end(run));
  const auto valueOf = [this](const std::string& key) {
    for (const auto& [raised, value] : mokutotest::raisedEvents(*rig_.timeline)) {
      if (raised == key)
        return value;
    }
    return ko::AnyValue();
  };
  EXPECT_EQ(valueOf("called").to<int>(), 7);
  const auto posted = valueOf("posted").to<std::vector<ko::AnyValue>>();
  ASSERT_EQ(posted.size(), 2u);
  EXPECT_EQ(posted[1].to<std::string>(), "two");
  EXPECT_EQ(valueOf("x").to<std::string>(), "1");
  EXPECT_TRUE(log_->containsPart(kDirector, ko::log::Error,
                                 "An exception as been thrown during this call: "
                                 "ZUMemory.noSuchMethod([]) with this error: "));
}

TEST(DirectorSetup, WithoutASpeechEngineTheDirectorCannotBeBuilt) {
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  ZU::MKIDRegister texts;
  EXPECT_EQ(ko::test::errorOf<ZU::ZUError>([&] { ZU::DirectorTask(broker, nullptr, texts); }),
            "\tZUMokuto::Constructor\n\tModule ZUTextToSpeech not found");
}

TEST(DirectorSetup, SubscriptionFailuresAreLoggedOneByOne) {
  ko::log::ScopedCapture log(ko::log::Info);
  auto broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
  auto speech = ZU::ZUModule::createModule<mokutotest::ScriptedSpeech>(broker, "ZUTextToSpeech");
  {
    ZU::MKIDRegister texts;
    ZU::DirectorTask director(broker, nullptr, texts);
    EXPECT_TRUE(speech->waitForCall("enableNotifications()"));
    director.subscribeToEvents();
    director.unsubscribeToEvents();
  }
  for (const std::string verb : {"subscribing to", "unsubscribing to"}) {
    for (const char* event : {"ZUTextToSpeech/CurrentBookMark", "ZUTextToSpeech/Status"}) {
      EXPECT_TRUE(log->containsPart(
          kDirector, ko::log::Error,
          "Exception caught when " + verb + " the event: \"" + event + "\" with this error: "))
          << verb << event;
    }
  }
  for (const std::string verb : {"connecting", "disconnecting"}) {
    EXPECT_TRUE(log->containsPart(
        kDirector, ko::log::Error,
        "Exception caught when " + verb + " to the signal: \"behaviorStopped\" with this error: "))
        << verb;
  }
  speech->exit();
}

}  // namespace
