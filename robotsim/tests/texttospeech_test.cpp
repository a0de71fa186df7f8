// ZUTextToSpeech driven through its proxy as the service drives it: posted says, the
// bookmark and status events through ZUMemory, and the blocking-bookmark calls to the
// module registered as "ZUMokuto".
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/speechscript.h"
#include "robotsim/zumemory.h"
#include "robotsim/zutexttospeech.h"
#include "support/recording_module.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

using testing::ReceivedEvent;
using testing::RecordingModule;
using namespace std::chrono_literals;

constexpr auto kBound = 30s;
constexpr const char* kBookmark = "ZUTextToSpeech/CurrentBookMark";
constexpr const char* kStatus = "ZUTextToSpeech/Status";
// How far a bookmark may be from its audio time, and how far a word from its mark.
constexpr std::int64_t kToleranceUs = 50'000;

// A mark reached on the playback clock neither before its audio time nor a second after
// it: a loaded machine may wake the player late (bench_director measures how late), but
// never that late, whereas a clock that ran on through a hold would be seconds off.
void expectReachedOnTime(const robotsim::SpeechMarkRecord& mark) {
  EXPECT_GE(mark.playbackUs, mark.audioUs - kToleranceUs) << "bookmark " << mark.number;
  EXPECT_LT(mark.playbackUs, mark.audioUs + 1'000'000) << "bookmark " << mark.number;
}

ZUTextToSpeechOptions espeak(double rate = 1.0) {
  ZUTextToSpeechOptions o;
  o.playbackRate = rate;
  return o;
}

ZUTextToSpeechOptions timing(double rate = kSpeechAsFastAsPossible) {
  ZUTextToSpeechOptions o;
  o.backend = ZUTextToSpeechOptions::Backend::Timing;
  o.playbackRate = rate;
  return o;
}

// The simulated robot's memory and speech, with a recording module as "ZUMokuto"
// subscribed to the speech events as the service subscribes.
class Robot {
 public:
  explicit Robot(ZUTextToSpeechOptions options)
      : broker(ZU::ZUBroker::create(std::make_shared<ko::Session>())),
        timeline(std::make_shared<Timeline>()),
        memoryModule(
            ZU::ZUModule::createModule<ZUMemory>(broker, "ZUMemory", ZUMemoryOptions{timeline, 4})),
        ttsModule(ZU::ZUModule::createModule<ZUTextToSpeech>(broker, "ZUTextToSpeech",
                                                             withTimeline(std::move(options)))),
        mokuto(ZU::ZUModule::createModule<RecordingModule>(broker, "ZUMokuto")),
        memory(broker),
        tts(broker) {
    memory.subscribeToEvent(kBookmark, "ZUMokuto", "onEvent");
    memory.subscribeToEvent(kStatus, "ZUMokuto", "onEvent");
    tts.enableNotifications();
  }

  // Waits until the text's status `word` has been delivered.
  bool waitForStatus(int id, const std::string& word) const {
    return mokuto->waitForEvents(
        [&](const std::vector<ReceivedEvent>& events) {
          return testing::hasStatus(events, id, word);
        },
        kBound);
  }
  std::vector<int> bookmarks() const {
    std::vector<int> out;
    for (const auto& e : mokuto->events(kBookmark))
      out.push_back(e.value.asInt());
    return out;
  }
  std::vector<std::string> statuses(int id) const {
    return testing::statusesOf(mokuto->events(), id);
  }
  // Speaks the text as the service does and waits for its last status.
  int speak(const std::string& text) {
    const int id = tts.post_say(text);
    EXPECT_FALSE(tts.wait(id, 0));
    EXPECT_TRUE(waitForStatus(id, "done"));
    return id;
  }

  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<Timeline> timeline;
  std::shared_ptr<ZUMemory> memoryModule;
  std::shared_ptr<ZUTextToSpeech> ttsModule;
  std::shared_ptr<RecordingModule> mokuto;
  ZU::ZUMemoryProxy memory;
  ZU::ZUTextToSpeechProxy tts;

 private:
  ZUTextToSpeechOptions withTimeline(ZUTextToSpeechOptions options) {
    options.timeline = timeline;
    return options;
  }
};

// ---- the reading of a text ------------------------------------------------------

struct SsmlCase {
  std::string text;
  std::string ssml;
};

class SpeechScriptSsml : public ::testing::TestWithParam<SsmlCase> {};

TEST_P(SpeechScriptSsml, TranslatesTagsForEspeak) {
  EXPECT_EQ(toEspeakSsml(parseSpeechText(GetParam().text)),
            "<speak>" + GetParam().ssml + "</speak>");
}

INSTANTIATE_TEST_SUITE_P(
    Texts, SpeechScriptSsml,
    ::testing::Values(
        SsmlCase{"Hello \\mrk=3\\ world", "Hello <mark name=\"0\"/> world"},
        SsmlCase{"a \\mrkpause=4\\ b \\mrk=5\\", "a <mark name=\"0\"/> b <mark name=\"1\"/>"},
        // A mark after a full stop goes before the stop, in order.
        SsmlCase{"One. \\mrk=1\\ \\mrk=2\\ Two", "One<mark name=\"0\"/><mark name=\"1\"/>.   Two"},
        SsmlCase{"Wait... \\mrk=1\\", "Wait<mark name=\"0\"/>... "},
        SsmlCase{"Really? \\mrk=1\\", "Really? <mark name=\"0\"/>"},
        SsmlCase{"はい。\\mrk=1\\ええ？\\mrk=2\\そう！！\\mrk=3\\3．\\mrk=4\\",
                 "はい<mark name=\"0\"/>。ええ<mark name=\"1\"/>？そう<mark name=\"2\"/>！！3<mark "
                 "name=\"3\"/>．"},
        SsmlCase{"\\pau=500\\Hi", "<break strength=\"x-weak\" time=\"500ms\"/>Hi"},
        SsmlCase{"\\pau=99999999\\", "<break strength=\"x-weak\" time=\"60000ms\"/>"},
        SsmlCase{"a & b < c > d", "a &amp; b &lt; c &gt; d"},
        // Other tags, malformed ones and a lone backslash are not spoken.
        SsmlCase{"\\rspd=80\\Hi \\vct=120\\there", "Hi there"},
        SsmlCase{"\\mrk=x\\a\\mrk=\\b\\mrk=-1\\c", "abc"}, SsmlCase{"\\mrk=99999999999\\a", "a"},
        SsmlCase{"end \\mrk=1", "end "},
        SsmlCase{"ctl\x01"
                 "char",
                 "ctl char"}));

TEST(SpeechScript, NumbersMarksInTextOrderWithTheirKinds) {
  const auto script = parseSpeechText("\\MRK=7\\ a \\mrkpause=2\\ b \\mrk=7\\ \\Pau=20\\");
  ASSERT_EQ(script.marks.size(), 3U);
  EXPECT_EQ(script.marks[0].number, 7);
  EXPECT_FALSE(script.marks[0].blocking);
  EXPECT_EQ(script.marks[1].number, 2);
  EXPECT_TRUE(script.marks[1].blocking);
  EXPECT_EQ(script.marks[2].number, 7);
  EXPECT_EQ(script.parts.back().breakMs, 20);
}

// ---- espeak-ng in real time -------------------------------------------------------

TEST(TextToSpeechEspeak, BookmarksArriveInOrderAtTheirAudioTimes) {
  Robot robot(espeak());
  const int id = robot.speak(
      "Hello \\mrk=1\\ there. \\mrk=2\\ How are \\mrk=3\\ you \\pau=300\\ \\mrk=4\\ today? "
      "\\mrk=5\\ Fine.");
  EXPECT_EQ(robot.bookmarks(), (std::vector<int>{1, 2, 3, 4, 5}));
  EXPECT_EQ(robot.statuses(id), (std::vector<std::string>{"started", "done"}));

  const auto marks = robot.ttsModule->markRecords(id);
  ASSERT_EQ(marks.size(), 5U);
  for (std::size_t i = 0; i < marks.size(); ++i) {
    EXPECT_EQ(marks[i].number, static_cast<int>(i) + 1);
    expectReachedOnTime(marks[i]);
    if (i > 0) {
      EXPECT_GT(marks[i].audioUs, marks[i - 1].audioUs) << "bookmark " << marks[i].number;
    }
  }
  // The pause is in the audio between bookmarks 3 and 4.
  EXPECT_GE(marks[3].audioUs - marks[2].audioUs, 300'000);
  // The words are the caller's; the first bookmark comes with "there".
  const auto records = robot.ttsModule->wordRecords(id);
  std::vector<std::string> words;
  for (const auto& word : records)
    words.push_back(word.text);
  ASSERT_EQ(words,
            (std::vector<std::string>{"Hello", "there", "How", "are", "you", "today", "Fine"}));
  EXPECT_NEAR(static_cast<double>(marks[0].audioUs), static_cast<double>(records[1].audioUs),
              kToleranceUs);
  // The timeline shows each bookmark with its audio time and lateness.
  const auto entries = robot.timeline->entries("ZUTextToSpeech", "bookmark");
  ASSERT_EQ(entries.size(), 5U);
  EXPECT_EQ(entries[1].arguments.asList().at(1).to<int>(), 2);
}

TEST(TextToSpeechEspeak, BlockingBookmarkHoldsTheSpeechUntilItsCallbackReturns) {
  Robot robot(espeak());
  robot.mokuto->holdBlockingBookmarks();
  const int id = robot.tts.post_say("One \\mrk=1\\ two \\mrkpause=2\\ three \\mrk=3\\ four.");
  ASSERT_TRUE(robot.mokuto->waitForBlockingBookmarks(1, kBound));
  EXPECT_EQ(robot.mokuto->blockingBookmarks(), std::vector<int>{2});
  EXPECT_TRUE(robot.tts.isRunning(id));
  // While the callback is held, the next bookmark does not come.
  EXPECT_FALSE(robot.mokuto->waitForEvents(kBookmark, 2, 1500ms));
  const auto released = std::chrono::steady_clock::now();
  robot.mokuto->releaseBlockingBookmarks();
  EXPECT_FALSE(robot.tts.wait(id, 0));
  ASSERT_TRUE(robot.waitForStatus(id, "done"));

  EXPECT_EQ(robot.bookmarks(), (std::vector<int>{1, 3}));
  EXPECT_GT(robot.mokuto->events(kBookmark).at(1).time, released);
  const auto marks = robot.ttsModule->markRecords(id);
  ASSERT_EQ(marks.size(), 3U);
  EXPECT_TRUE(marks[1].blocking);
  EXPECT_GE(marks[1].heldUs, 1'500'000);
  // The playback clock stood still during the hold: bookmark 3 is still on time.
  expectReachedOnTime(marks[2]);
}

// ---- both backends -------------------------------------------------------------------

struct BackendCase {
  std::string name;
  ZUTextToSpeechOptions options;
};

class TextToSpeechBackends : public ::testing::TestWithParam<BackendCase> {};

TEST_P(TextToSpeechBackends, NoneOf200BookmarksIsLost) {
  ko::log::ScopedCapture cap(ko::log::Warning);
  Robot robot(GetParam().options);
  std::string text;
  std::vector<int> expected;
  std::vector<int> blocking;
  for (int n = 1; n <= 200; ++n) {
    text += "word " + std::to_string(n);
    text += n % 7 == 0 ? ". " : n % 5 == 0 ? ", " : " ";
    if (n % 11 == 0)
      text += "\\pau=10\\ ";
    if (n % 13 == 0) {
      text += "\\mrkpause=" + std::to_string(n) + "\\ ";
      blocking.push_back(n);
    } else {
      text += "\\mrk=" + std::to_string(n) + "\\ ";
      expected.push_back(n);
    }
  }
  const int id = robot.speak(text);
  EXPECT_EQ(robot.bookmarks(), expected);
  EXPECT_EQ(robot.mokuto->blockingBookmarks(), blocking);
  const auto marks = robot.ttsModule->markRecords(id);
  ASSERT_EQ(marks.size(), 200U);
  for (std::size_t i = 1; i < marks.size(); ++i)
    EXPECT_GE(marks[i].audioUs, marks[i - 1].audioUs);
  EXPECT_FALSE(cap->containsPart("robotsim.texttospeech", ko::log::Warning, "not reported"));
  // Raised in the order the player met them, whichever thread told each: the start, the
  // bookmarks, the end.
  std::vector<std::string> raised;
  for (const auto& entry : robot.timeline->entries("ZUMemory", "raiseEvent")) {
    const auto arguments = entry.arguments.asList();
    raised.push_back(arguments.at(0).to<std::string>() == kStatus
                         ? arguments.at(1).asList().at(1).to<std::string>()
                         : "mark");
  }
  std::vector<std::string> order{"started"};
  order.insert(order.end(), expected.size(), "mark");
  order.emplace_back("done");
  EXPECT_EQ(raised, order);
}

TEST_P(TextToSpeechBackends, TextsPlayOneAfterTheOther) {
  Robot robot(GetParam().options);
  const int first = robot.tts.post_say("first \\mrk=1\\ text");
  const int second = robot.tts.post_say("second \\mrk=2\\ text");
  ASSERT_TRUE(robot.waitForStatus(second, "done"));
  std::vector<std::string> order;
  for (const auto& e : robot.mokuto->events(kStatus))
    order.push_back(std::to_string(e.value[0].asInt() == first ? 1 : 2) + e.value[1].asString());
  EXPECT_EQ(order, (std::vector<std::string>{"1started", "1done", "2started", "2done"}));
  EXPECT_EQ(robot.bookmarks(), (std::vector<int>{1, 2}));
}

TEST_P(TextToSpeechBackends, WithoutNotificationsNoEventIsRaisedButBlockingCallsAreMade) {
  Robot robot(GetParam().options);
  robot.tts.call<void>("disableNotifications");
  robot.tts.say("quiet \\mrk=1\\ text \\mrkpause=2\\ here");
  EXPECT_EQ(robot.mokuto->blockingBookmarks(), std::vector<int>{2});
  EXPECT_THROW(robot.memoryModule->getData(kStatus), ZU::ZUError);
  EXPECT_THROW(robot.memoryModule->getData(kBookmark), ZU::ZUError);
}

INSTANTIATE_TEST_SUITE_P(Backends, TextToSpeechBackends,
                         ::testing::Values(BackendCase{"Timing", timing()},
                                           BackendCase{"Espeak", espeak(kSpeechAsFastAsPossible)}),
                         [](const auto& param) { return param.param.name; });

// ---- stops racing the speech ----------------------------------------------------------

// A log sink that holds the thread that writes "Task <id> asked to stop" until the say of
// that task has begun to play: the stop then lands while the say registers its text.
class StopLineHolder : public ko::log::Sink {
 public:
  StopLineHolder(int id, simtest::TimelineWaiter& waiter)
      : fLine(":Task " + std::to_string(id) + " asked to stop"), fWaiter(waiter) {}
  void consume(const ko::log::Record& record) override {
    if (record.message.find(fLine) != std::string::npos)
      fWaiter.waitFor("ZUTextToSpeech", "started");
  }

 private:
  const std::string fLine;
  simtest::TimelineWaiter& fWaiter;
};

TEST(TextToSpeechStops, AStopLandingWhileItsSayBeginsIsNeverLost) {
  Robot robot(timing(1.0));
  simtest::TimelineWaiter started(*robot.timeline);
  const int id = robot.tts.post_say(std::string(400, 'a') + " \\mrk=1\\ end");
  auto holder = std::make_shared<StopLineHolder>(id, started);
  ko::log::addSink(holder);
  robot.tts.stop(id);
  ko::log::removeSink(holder);
  EXPECT_FALSE(robot.ttsModule->wait(id, 10'000));
  ASSERT_TRUE(robot.waitForStatus(id, "stopped"));
  EXPECT_EQ(robot.statuses(id), (std::vector<std::string>{"started", "stopped"}));
}

// A log sink that holds the say's thread where it reads its Japanese text into kana, its
// text registered but not queued yet, until the test has stopped it.
class ReadingHolder : public ko::log::Sink {
 public:
  void consume(const ko::log::Record& record) override {
    if (record.message.find("No reading for the kanji") == std::string::npos)
      return;
    reading.open();
    stopped.wait();
  }
  ko::test::Gate reading, stopped;
};

TEST(TextToSpeechStops, AStopLandingBeforeItsTextIsQueuedIsNeverLost) {
  ZUTextToSpeechOptions options = espeak();
  options.language = "Japanese";
  Robot robot(options);
  auto holder = std::make_shared<ReadingHolder>();
  ko::log::addSink(holder);
  const int id = robot.tts.post_say("𠮷 \\mrk=1\\ はい");
  const bool held = holder->reading.wait();
  robot.tts.stop(id);
  holder->stopped.open();
  ko::log::removeSink(holder);
  ASSERT_TRUE(held);
  EXPECT_FALSE(robot.ttsModule->wait(id, 10'000));
  ASSERT_TRUE(robot.waitForStatus(id, "stopped"));
  EXPECT_EQ(robot.statuses(id), std::vector<std::string>{"stopped"});
  EXPECT_EQ(robot.bookmarks(), std::vector<int>{});
}

// A stop of each text, stopAll() and exit() end the says still queued behind the text
// being spoken: they never start.
TEST(TextToSpeechStops, StopsEndTheSaysStillQueued) {
  for (const std::string how : {"stop", "stopAll", "exit"}) {
    SCOPED_TRACE(how);
    Robot robot(timing(1.0));
    const int running = robot.tts.post_say(std::string(200, 'a') + " \\mrk=1\\ end");
    const int queued = robot.tts.post_say("never \\mrk=2\\ heard");
    ASSERT_TRUE(robot.waitForStatus(running, "started"));
    if (how == "exit") {
      robot.ttsModule->exit();
    } else if (how == "stopAll") {
      robot.ttsModule->stopAll();
    } else {
      robot.tts.stop(queued);
      robot.tts.stop(running);
      ASSERT_TRUE(robot.waitForStatus(queued, "stopped"));
      EXPECT_EQ(robot.statuses(running), (std::vector<std::string>{"started", "stopped"}));
      EXPECT_EQ(robot.statuses(queued), std::vector<std::string>{"stopped"});
    }
    EXPECT_FALSE(robot.ttsModule->wait(running, 10'000));
    EXPECT_FALSE(robot.ttsModule->wait(queued, 10'000));
    const auto started = robot.timeline->entries("ZUTextToSpeech", "started");
    ASSERT_EQ(started.size(), 1U);
    EXPECT_EQ(started[0].arguments.asList().at(0).to<int>(), running);
    EXPECT_TRUE(robot.timeline->entries("ZUTextToSpeech", "done").empty());
    EXPECT_EQ(robot.bookmarks(), std::vector<int>{});
  }
}

TEST(TextToSpeechStops, AStoppedTextsQueuedBlockingCallIsWithdrawn) {
  Robot robot(timing(1.0));
  simtest::TimelineWaiter holds(*robot.timeline);
  robot.mokuto->holdBlockingBookmarks();
  // Two texts stopped while their handlers hold both threads of the blocking calls...
  for (int n = 1; n <= 2; ++n) {
    const int id = robot.tts.post_say("\\mrkpause=" + std::to_string(n) + "\\ text");
    ASSERT_TRUE(robot.mokuto->waitForBlockingBookmarks(static_cast<std::size_t>(n), kBound));
    robot.tts.stop(id);
    ASSERT_FALSE(robot.ttsModule->wait(id, 10'000));
  }
  // ...so that the call of the third waits in the queue when its text is stopped.
  const int third = robot.tts.post_say("\\mrkpause=3\\ text");
  ASSERT_TRUE(holds.waitFor("ZUTextToSpeech", "hold", 3));
  robot.tts.stop(third);
  ASSERT_FALSE(robot.ttsModule->wait(third, 10'000));
  robot.mokuto->releaseBlockingBookmarks();
  const int fourth = robot.tts.post_say("\\mrkpause=4\\ text");
  ASSERT_FALSE(robot.ttsModule->wait(fourth, 10'000));
  EXPECT_EQ(robot.mokuto->blockingBookmarks(), (std::vector<int>{1, 2, 4}));
}

TEST(TextToSpeechTiming, ParametersAreKeptWithinTheirRanges) {
  Robot robot(timing());
  struct Case {
    const char* name;
    float set;
    float read;
  };
  for (const Case c :
       {Case{"speed", 150.0F, 150.0F}, Case{"speed", 1000.0F, 400.0F}, Case{"speed", 10.0F, 50.0F},
        Case{"pitchShift", 1.5F, 1.5F}, Case{"pitchShift", 0.0F, 0.0F},
        Case{"pitchShift", 9.0F, 4.0F}, Case{"volume", 0.5F, 0.5F}, Case{"volume", 3.0F, 1.0F},
        Case{"inputMode", 2.0F, 2.0F}, Case{"inputMode", 3.0F, 3.0F}}) {
    robot.tts.setParameter(c.name, c.set);
    EXPECT_EQ(robot.tts.call<float>("getParameter", std::string(c.name)), c.read) << c.name;
  }
  ko::log::ScopedCapture cap;
  robot.tts.setParameter("doubleVoice", 1.0F);
  EXPECT_TRUE(
      cap->contains("robotsim.texttospeech", ko::log::Warning, "Unknown parameter: doubleVoice"));
  EXPECT_THROW(robot.tts.call<float>("getParameter", std::string("doubleVoice")), ZU::ZUError);
}

TEST(TextToSpeechLanguages, EspeakSpeaksTheServicesLanguages) {
  Robot robot(espeak(kSpeechAsFastAsPossible));
  const auto languages = robot.tts.call<std::vector<std::string>>("getAvailableLanguages");
  for (const char* language : {"English", "French", "Japanese"})
    EXPECT_NE(std::find(languages.begin(), languages.end(), language), languages.end());
  EXPECT_EQ(robot.tts.getLanguage(), "English");
  robot.tts.call<void>("setLanguage", std::string("French"));
  EXPECT_EQ(robot.tts.getLanguage(), "French");
  robot.speak("Bonjour \\mrk=1\\ tout le monde.");
  EXPECT_EQ(robot.bookmarks(), std::vector<int>{1});
  EXPECT_THROW(robot.tts.call<void>("setLanguage", std::string("Klingon")), ZU::ZUError);
  EXPECT_EQ(robot.tts.getLanguage(), "French");
}

}  // namespace
}  // namespace robotsim
