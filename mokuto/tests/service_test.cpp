// The service module ZUMokuto: its library, the say pipeline and its
// stops on the simulated robot with a scripted speech engine, the index callbacks, the
// diagnosis and the tag page.
#include <gtest/gtest.h>

#include <dlfcn.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <future>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "director_rig.h"
#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "mokuto/zumokuto.h"
#include "robotsim/timeline.h"
#include "scripted_speech.h"
#include "service_rig.h"
#include "support/fake_robot.h"
#include "zefoko/host.h"
#include "zu/zumoduleentry.h"
#include "zu/zuproxy.h"

namespace {

using namespace std::chrono_literals;
using mokutotest::kBound;
using mokutotest::ScriptedSpeech;
using Stage = ZU::ZUMokutoStage;

constexpr const char* kMain = "mokuto.main";
constexpr const char* kEnd = "ZUMokuto/EndOfMokuto";

// ---- services of the tests -----------------------------------------------------------------

// The stages entered, in order, as the module reports them.
struct StageLog : ko::test::Recorded<std::pair<Stage, ZU::MKID>> {
  std::atomic<int> failAt{-1};  // a stage that throws

  void enter(Stage stage, ZU::MKID id) {
    add({stage, id});
    if (failAt.load() == static_cast<int>(stage))
      throw std::runtime_error("the stage broke");
  }
  bool waitFor(Stage stage, ZU::MKID id) { return waitForValue({stage, id}); }
};

// ---- the service on the simulated robot, with a scripted speech engine ---------------------

class ServicePipeline : public testing::Test {
 protected:
  ServicePipeline() {
    ZU::ZUMokutoOptions options;
    options.bodyTalk.timeScale = 0.01;
    options.stopAllWait = 100ms;  // the robot waits 3 s
    options.onStage = [stages = stages_](Stage stage, ZU::MKID id) { stages->enter(stage, id); };
    mokuto_ = ZU::ZUModule::createModule<ZU::ZUMokuto>(rig_.broker, "ZUMokuto", options);
    mokuto_->setBodyLanguageModeFromStr("disabled");
    EXPECT_TRUE(mokuto_->waitForIndex(kBound));
    // Whether some text was still registered as running when an end event was raised (with
    // one text at a time: whether the ended one was).
    rig_.timeline->addListener([weak = std::weak_ptr(mokuto_),
                                flag = endedWhileRunning_](const robotsim::TimelineEntry& entry) {
      if (entry.operation != "raiseEvent" ||
          entry.arguments.to<std::vector<ko::AnyValue>>().at(0).to<std::string>() != kEnd)
        return;
      if (const auto module = weak.lock(); module && module->_isRunning())
        flag->store(true);
    });
  }

  ~ServicePipeline() override { mokuto_->exit(); }

  std::future<void> sayAsync(const std::string& text) {
    return std::async(std::launch::async, [module = mokuto_, text] { module->say(text); });
  }
  ScriptedSpeech::Say spoken(std::size_t index) {
    const auto say = speech_->waitForSay(index);
    EXPECT_TRUE(say.has_value()) << "say " << index << " never came";
    return say.value_or(ScriptedSpeech::Say{});
  }
  // The values of the end events raised so far, in order.
  std::vector<int> endEvents() const {
    std::vector<int> values;
    for (const auto& [key, value] : mokutotest::raisedEvents(*timeline_)) {
      if (key == kEnd)
        values.push_back(value.to<int>());
    }
    return values;
  }
  static bool ready(std::future<void>& done) {
    return done.wait_for(kBound) == std::future_status::ready;
  }

  ko::log::ScopedCapture log_{ko::log::Info};
  mokutotest::DirectorRig rig_{mokutotest::DirectorRig::Speech::Scripted, false};
  const std::shared_ptr<robotsim::Timeline>& timeline_ = rig_.timeline;
  const std::shared_ptr<ScriptedSpeech>& speech_ = rig_.speech;
  std::shared_ptr<StageLog> stages_ = std::make_shared<StageLog>();
  std::shared_ptr<std::atomic<bool>> endedWhileRunning_ = std::make_shared<std::atomic<bool>>();
  std::shared_ptr<ZU::ZUMokuto> mokuto_;
};

TEST_F(ServicePipeline, TwoTextsOverlapInThePipelineButAreNeverSpokenAtOnce) {
  auto first = sayAsync("Hello there");
  const auto firstSay = spoken(0);
  auto second = sayAsync("And again");
  // The second text is compiled and loaded while the first one is spoken...
  ASSERT_TRUE(stages_->waitFor(Stage::Loader, 2));
  EXPECT_EQ(speech_->sayCount(), 1u);
  EXPECT_EQ(second.wait_for(0ms), std::future_status::timeout);
  // ... and spoken once the first has ended.
  speech_->finish(firstSay.id);
  ASSERT_TRUE(ready(first));
  const auto secondSay = spoken(1);
  EXPECT_TRUE(speech_->hasEnded(firstSay.id));
  speech_->finish(secondSay.id);
  ASSERT_TRUE(ready(second));
  first.get();
  second.get();

  using E = std::pair<Stage, ZU::MKID>;
  EXPECT_EQ(stages_->all(), (std::vector<E>{{Stage::Compiler, 1},
                                            {Stage::Loader, 1},
                                            {Stage::Director, 1},
                                            {Stage::Compiler, 2},
                                            {Stage::Loader, 2},
                                            {Stage::Director, 2}}));
  EXPECT_EQ(endEvents(), (std::vector<int>{1, 2}));
  EXPECT_FALSE(mokuto_->_isRunning());
}

TEST_F(ServicePipeline, APostedSayIsKnownByItsTaskIdAndStoppedByIt) {
  // A first posted call, so that the say's task id differs from the first local id.
  mokuto_->pCall(ko::AnyValue::list({ko::AnyValue(std::string("_isRunning"))}));
  const int task = mokuto_->pCall(
      ko::AnyValue::list({ko::AnyValue(std::string("say")), ko::AnyValue(std::string("Hi"))}));
  EXPECT_NE(task, 1);
  const auto say = spoken(0);
  ASSERT_TRUE(stages_->waitFor(Stage::Director, task));
  mokuto_->stop(task + 100);  // not running: ignored
  mokuto_->stop(task);
  EXPECT_TRUE(speech_->waitForCall("stop(" + std::to_string(say.id) + ")"));
  EXPECT_FALSE(mokuto_->wait(task, 10000));  // the call has ended
  EXPECT_EQ(endEvents(), std::vector<int>{task});
  EXPECT_FALSE(mokuto_->_isRunning());
  EXPECT_FALSE(endedWhileRunning_->load());
}

TEST_F(ServicePipeline, StopAllWithoutWaitingStopsATextWaitingForTheDirector) {
  auto first = sayAsync("Hello there");
  spoken(0);
  auto second = sayAsync("Never spoken");
  ASSERT_TRUE(stages_->waitFor(Stage::Loader, 2));
  mokuto_->_stopAll(false);
  ASSERT_TRUE(ready(first));
  ASSERT_TRUE(ready(second));
  EXPECT_EQ(speech_->sayCount(), 1u);
  const auto entries = stages_->all();
  EXPECT_EQ(std::count(entries.begin(), entries.end(), std::pair{Stage::Director, 2}), 0);
  auto ends = endEvents();
  std::sort(ends.begin(), ends.end());
  EXPECT_EQ(ends, (std::vector<int>{1, 2}));
}

TEST_F(ServicePipeline, StopAllWaitingWithNothingRunningReturnsSilently) {
  log_->clear();
  mokuto_->stop(7);  // no text of that id: nothing is left to stop
  mokuto_->_stopAll(true);
  for (const auto& record : log_->records())
    EXPECT_NE(record.category, kMain) << record.message;
}

TEST_F(ServicePipeline, AStageThatThrowsFailsTheSayWithoutEndEvent) {
  stages_->failAt = static_cast<int>(Stage::Loader);
  EXPECT_THROW(mokuto_->say("Hello"), std::runtime_error);
  EXPECT_TRUE(
      log_->contains(kMain, ko::log::Error, "say() method detects an exception: the stage broke"));
  EXPECT_FALSE(mokuto_->_isRunning());
  EXPECT_TRUE(endEvents().empty());
  EXPECT_EQ(speech_->sayCount(), 0u);
  // The stage locks were released: the next text goes through.
  stages_->failAt = -1;
  auto next = sayAsync("Hello");
  speech_->finish(spoken(0).id);
  ASSERT_TRUE(ready(next));
  EXPECT_EQ(endEvents(), std::vector<int>{2});
}

TEST_F(ServicePipeline, ExitWhileATextIsSpokenEndsTheTextFirst) {
  auto text = sayAsync("Hello there");
  spoken(0);
  const auto lines = mokuto_->diagnosisLines();
  ASSERT_GE(lines.size(), 11u);
  EXPECT_EQ(lines[7], "number of texts in the stack: 1");
  EXPECT_EQ(lines[9], "print the text:");
  EXPECT_EQ(lines[10].rfind("Text number 1: ", 0), 0u);
  mokuto_->exit();
  ASSERT_TRUE(ready(text));
  EXPECT_EQ(endEvents(), std::vector<int>{1});
  EXPECT_FALSE(mokuto_->_isRunning());
  const auto names = rig_.broker->session()->services();
  EXPECT_EQ(std::count(names.begin(), names.end(), "ZUMokuto"), 0);
}

TEST_F(ServicePipeline, DiagnosisWithNoTextRunning) {
  const std::vector<std::string> expected = {
      "Diagnosis of Mokuto:",
      "----------------------------",
      "get body language mode: disabled",
      "get time pause before the sentence: 500ms",
      "is Mokuto running: false",
      "is bodytalk running: false",
      "is TextToSpeech running: false",
      "number of texts in the stack: 0",
      "number of texts asked to stop: 0",
  };
  EXPECT_EQ(mokuto_->diagnosisLines(), expected);
  log_->clear();
  mokuto_->_diagnosis();
  std::vector<std::string> logged;
  for (const auto& record : log_->records()) {
    if (record.category == kMain) {
      EXPECT_EQ(record.function, "ZU::ZUMokuto::diagnosis");
      logged.push_back(record.message);
    }
  }
  EXPECT_EQ(logged, expected);
}

TEST_F(ServicePipeline, PrepareCompilesAndLoadsInTheLastReportedPostureWithoutSpeaking) {
  struct Report {
    ZU::ZUValue value;
    ZU::PostureFamily family;
  };
  const std::vector<Report> reports = {
      {ZU::ZUValue("SittingOnChair"), ZU::SittingOnChair},
      {ZU::ZUValue("Crouching"), ZU::Unknown},
      {ZU::ZUValue(1), ZU::Unknown},  // not a name: ignored
      {ZU::ZUValue("Standing"), ZU::Standing},
  };
  for (const auto& report : reports) {
    SCOPED_TRACE(report.value.toString());
    mokuto_->_postureFamilyChangedCallback("PostureFamilyChanged", report.value, "");
    EXPECT_EQ(mokuto_->prepare("Hi")->postureFamily, report.family);
  }
  const std::string gesture = mokutotest::kShort;
  const auto job = mokuto_->prepare("Hi ^start(" + gesture + ") there",
                                    ZU::ZUValue::makeArray({ZU::ZUValue::makeArray(
                                        {ZU::ZUValue("msPauseBeforeSpeech"), ZU::ZUValue(0)})}));
  ASSERT_EQ(job->actions.size(), 1u);
  EXPECT_EQ(job->actions[0]->text, "^start(" + gesture + ")");
  EXPECT_EQ(job->config.msPauseBeforeSpeech, 0);
  EXPECT_EQ(timeline_->entries("ZUBehaviorManager", "preloadBehavior").size(), 1u);
  EXPECT_EQ(speech_->sayCount(), 0u);
  EXPECT_FALSE(mokuto_->_isRunning());
  EXPECT_TRUE(endEvents().empty());
  for (const auto& entry : stages_->all())
    EXPECT_NE(entry.first, Stage::Director);
}

TEST_F(ServicePipeline, ACallWhoseServiceDoesNotAnswerIsGivenUpAfterTheLookupTimeOrAtAStop) {
  // The lookups of "ZUNowhere" never answer.
  auto pending = std::make_shared<std::vector<ko::Promise<ko::AnyObject>>>();
  auto asked = std::make_shared<ko::test::Counter>();
  const auto session = rig_.broker->session();
  session->setLookupHook(
      [pending, asked](const std::string& name,
                       const std::string&) -> std::optional<ko::Future<ko::AnyObject>> {
        if (name != "ZUNowhere")
          return std::nullopt;
        pending->emplace_back();
        asked->increment();
        return pending->back().future();
      });
  for (const bool stopped : {false, true}) {
    SCOPED_TRACE(stopped ? "stopped" : "timed out");
    ::setenv("KO_DEADLOCK_TIMEOUT", stopped ? "600000" : "100", 1);
    ZU::ZUBroker::resetDeadlockTimeoutForTesting();
    const int before = asked->value();
    auto text = sayAsync("^call(ZUNowhere.anything()) hi");
    ASSERT_TRUE(asked->waitFor(before + 1));
    // The job is not held meanwhile: the diagnosis prints it.
    auto lines = std::async(std::launch::async, [this] { return mokuto_->diagnosisLines(); });
    ASSERT_EQ(lines.wait_for(kBound), std::future_status::ready);
    EXPECT_EQ(lines.get().at(7), "number of texts in the stack: 1");
    if (stopped)
      mokuto_->stop(stages_->all().back().second);
    else
      speech_->finish(spoken(0).id);
    ASSERT_TRUE(ready(text));
    EXPECT_TRUE(log_->containsPart(
        "mokuto.loader", ko::log::Error,
        stopped ? "was given up: the text is stopped" : "Can't find service: ZUNowhere"));
  }
  EXPECT_TRUE(log_->contains("mokuto.loader", ko::log::Error,
                             "session.service(ZUNowhere) timeout after 30sec."));
  EXPECT_EQ(endEvents().size(), 2u);
  session->setLookupHook(nullptr);
  ::unsetenv("KO_DEADLOCK_TIMEOUT");
  ZU::ZUBroker::resetDeadlockTimeoutForTesting();
}

// ---- the method table and the configuration methods ---------------------------------------

TEST_F(ServicePipeline, ConfigurationMethodsRefuseBadValuesAndKeepTheConfiguration) {
  struct Bad {
    const char* name;
    std::function<void()> call;
    const char* text;
  };
  const std::vector<Bad> cases = {
      {"mode 3", [&] { mokuto_->setBodyLanguageMode(3); },
       "\tZUMokuto::setBodyLanguageMode\n\tInvalid body language mode: 3\nThe body language "
       "modes values have to be between 0 and 2.\n0: BODY_LANGUAGE_MODE_DISABLED\n1: "
       "BODY_LANGUAGE_MODE_RANDOM\n2: BODY_LANGUAGE_MODE_CONTEXTUAL"},
      {"mode Random", [&] { mokuto_->setBodyLanguageModeFromStr("Random"); },
       "\tZUMokuto::setBodyLanguageModeFromStr\n\tInvalid body language mode: \"Random\"\nAll "
       "the possible body language modes are: \"disabled\", \"random\" and \"contextual\"."},
      {"negative pause", [&] { mokuto_->_setMSPauseBeforeSpeech(-1); },
       "\tZUMokuto::setMSPauseBeforeSpeech\n\tpause time can't be negative."},
  };
  for (const auto& c : cases)
    EXPECT_EQ(ko::test::errorOf<ZU::ZUError>(c.call), c.text) << c.name;
  EXPECT_EQ(mokuto_->getBodyLanguageModeToStr(), "disabled");
  EXPECT_EQ(mokuto_->_getMSPauseBeforeSpeech(), 500);

  mokuto_->setBodyLanguageModeFromStr("contextual_0");
  EXPECT_EQ(mokuto_->getBodyLanguageMode(), 2u);
  EXPECT_EQ(mokuto_->_getMSPauseBeforeSpeech(), 0);
  EXPECT_TRUE(log_->contains(kMain, ko::log::Error,
                             "contextual_0 is deprecated and will soon be removed, so call: "
                             "\nsetBodyLanguageModeFromStr(\"contextual\") "
                             "and_setMSPauseBeforeSpeech(0) instead."));
  mokuto_->setBodyTalkEnabled(true);
  EXPECT_EQ(mokuto_->getBodyLanguageModeToStr(), "random");
  EXPECT_TRUE(mokuto_->isBodyLanguageEnabled());
  mokuto_->_setCheckExecutionTimes(true);
  EXPECT_TRUE(mokuto_->_isCheckExecutionTimesEnabled());
  mokuto_->_reset();
  EXPECT_EQ(mokuto_->getBodyLanguageModeToStr(), "contextual");
}

// ---- the index callbacks and the tag page, on the stand-in robot --------------------------

class ServiceIndex : public testing::Test {
 protected:
  ServiceIndex() { EXPECT_TRUE(mokuto_->waitForIndex(kBound)); }
  ~ServiceIndex() override {
    mokuto_->exit();
    speech_->exit();
  }
  void changed(const std::vector<std::string>& names) {
    ZU::ZUValue value = ZU::ZUValue::makeArray({});
    for (const auto& name : names)
      value.arrayPush(name);
    mokuto_->_updateRepresentations("ZUBehaviorManager/BehaviorsAdded", value, "");
  }
  std::size_t lists() const { return robot_.behaviors->log.count("getInstalledBehaviors"); }

  ko::log::ScopedCapture log_{ko::log::Info};
  bodytalktest::FakeRobot robot_;
  bodytalktest::FakeBehaviorManager* behaviors_ = robot_.behaviors.get();
  std::shared_ptr<ScriptedSpeech> speech_ =
      ZU::ZUModule::createModule<ScriptedSpeech>(robot_.broker, "ZUTextToSpeech");
  std::shared_ptr<ZU::ZUMokuto> mokuto_ =
      ZU::ZUModule::createModule<ZU::ZUMokuto>(robot_.broker, "ZUMokuto");
};

TEST_F(ServiceIndex, PackagesAreRefreshedOnceForTheBehavioursThatChanged) {
  EXPECT_EQ(lists(), 1u);                           // the index of "animations/" at start
  mokuto_->declareAnimationsPackage("animations");  // "animations/" is there already
  EXPECT_EQ(lists(), 1u);
  changed({"animations/Stand/A", "", "animations/Sit/B", "elsewhere/Stand/C"});
  EXPECT_EQ(lists(), 2u);
  mokuto_->declareAnimationsPackage("extra");
  EXPECT_EQ(lists(), 3u);
  changed({"extra/Stand/A", "animations/Stand/B", "extra/Stand/C"});
  EXPECT_EQ(lists(), 5u);
}

TEST_F(ServiceIndex, TagPageListsTheVisibleTags) {
  // With no tag: the head, the script (20 lines) and the end of the page, no table.
  const std::string empty = mokuto_->httpGet();
  const std::string tail = "</body></html>";
  const auto scriptEnd = empty.find("</script>") + std::string("</script>").size();
  const std::string head = empty.substr(0, scriptEnd);
  EXPECT_EQ(head.rfind("<html><body><script>function runBehavior (behavior) {\n", 0), 0u);
  EXPECT_EQ(std::count(head.begin(), head.end(), '\n'), 20);
  EXPECT_EQ(empty, head + tail);
  EXPECT_TRUE(mokuto_->_getTagList().empty());

  behaviors_->setLibrary({{"animations/Stand/A", {"hello", ".hidden"}},
                          {"animations/Stand/B", {"hello", "animationMode"}},
                          {"animations/Sit/C", {"sit"}},
                          {"animations/Sit/O'Neil&%27<b>", {"<sit>"}}});
  changed({"animations/Stand/A"});
  EXPECT_EQ(mokuto_->_getTagList(),
            (std::vector<std::string>{".hidden", "<sit>", "animationMode", "hello", "sit"}));
  EXPECT_EQ(mokuto_->_getAnimationsByTag("hello"),
            (std::vector<std::string>{"animations/Stand/A", "animations/Stand/B"}));
  EXPECT_TRUE(mokuto_->_getAnimationsByTag("nothing").empty());
  const std::string link = "<a href=\"javascript:runBehavior('";
  // Names are escaped: the text for HTML, the link's argument for its script.
  const std::string rows =
      "<tr><td>&lt;sit&gt;</td><td>" + link +
      "animations/Sit/O\\x27Neil\\x26\\x2527\\x3cb\\x3e');\">animations/Sit/"
      "O&#39;Neil&amp;%27&lt;b&gt;</a>" +
      "<tr><td>hello</td><td>" + link + "animations/Stand/A');\">animations/Stand/A</a><br/>" +
      link + "animations/Stand/B');\">animations/Stand/B</a>" + "<tr><td>sit</td><td>" + link +
      "animations/Sit/C');\">animations/Sit/C</a>";
  const std::string table =
      "<b><u><i>Available tags</i></u></b><br><table cellspacing=\"5\" cellpadding=\"5\" "
      "border=\"1\"><tr><td><b>Tag name</b></td><td><b>Corresponding behaviors</b><br/><i>(click "
      "to run the behavior)</i></td></tr>";
  EXPECT_EQ(mokuto_->tagPage(), head + table + rows + "</table>" + tail);
}

TEST(ServiceOnTheRobot, TheTimingCheckerFramesTheEndEventAndComesBackWhenSwitchedOnAgain) {
  mokutotest::ServiceRig rig;
  ko::log::ScopedCapture log(ko::log::Info);
  const std::vector<std::string> framed = {"ZUMokuto/StartOfMK", kEnd, "ZUMokuto/StopOfMK"};
  for (const bool on : {true, false, true}) {
    SCOPED_TRACE(on);
    rig.mokuto->_setCheckExecutionTimes(on);
    rig.robot->timeline()->clear();
    log->clear();
    rig.mokuto->say("Hello $a=1");
    std::vector<std::string> events;
    for (const auto& event : mokutotest::raisedEvents(*rig.robot->timeline())) {
      if (event.first.rfind("ZUMokuto/", 0) == 0)
        events.push_back(event.first);
    }
    EXPECT_EQ(events, on ? framed : std::vector<std::string>{kEnd});
    EXPECT_EQ(log->containsPart("mokuto.times", ko::log::Info,
                                "time between 'stop of TTS' and 'stop of MK': "),
              on);
  }
}

TEST(ServiceLibrary, TheHostLoadsItAndItsEntryPointsAnswerZero) {
  // The texts spoken through the library loaded by a host are the remote processes' tests'.
  zefoko::HostOptions options;
  options.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  zefoko::Host host(options);
  ASSERT_EQ(host.loadModuleLibrary(ZUMOKUTO_PLUGIN), std::vector<std::string>{"ZUMokuto"});
  const ZU::ZUProxy mokuto("ZUMokuto", host.broker());
  void* library = ::dlopen(ZUMOKUTO_PLUGIN, RTLD_NOW | RTLD_NOLOAD);
  ASSERT_NE(library, nullptr);
  const auto close =
      reinterpret_cast<ZU::ZUCloseModuleFunction>(::dlsym(library, ZU::kCloseModuleSymbol));
  ASSERT_NE(close, nullptr);
  EXPECT_EQ(close(host.broker()), 0);
  EXPECT_EQ(mokuto.call<bool>("_isRunning"), false);  // still serving
  ::dlclose(library);
  host.shutdown();
  EXPECT_TRUE(host.moduleNames().empty());
}

}  // namespace
