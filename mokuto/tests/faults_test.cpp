// The service under the simulated robot's faults: each operation that a stage calls fails,
// hangs or answers late, bookmarks are lost, repeated, swapped or late, a behaviour never
// reports its stop, a sound never ends, and texts are stopped from another thread at each
// stage. Every text ends, with one end event (none when a stage throws), the service
// waiting no longer on its limits than they allow (on the driven clock), with the log
// line of the rule that applied; and the next text is spoken normally.
#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <future>
#include <string>
#include <vector>

#include "director_rig.h"
#include "ko/json.hpp"
#include "ko/log.hpp"
#include "ko_test_helpers.hpp"
#include "service_rig.h"
#include "zu/zuproxy.h"
#include "zu/zuvalueconverter.h"

namespace {

using mokutotest::kBound;
using mokutotest::kEnd;
using mokutotest::kLongA;
using mokutotest::kShort;
using Stage = ZU::ZUMokutoStage;
using ko::log::Error;

const std::string S = kShort;  // 0.3 s
const std::string L = kLongA;  // 30 s

// When the test stops the text, from a thread of its own.
enum class StopAt {
  Never,
  Compiler,  // as the text enters that stage
  Loader,
  Director,
  Strike,  // once the row's last fault has struck
  Hold,    // once the speech holds at a blocking bookmark
  // Once the director waits for a bookmark held back, in a round that only the stop ends
  // (the clock holds the rounds for the row).
  Round,
};

enum Flags : unsigned {
  // The text ends only once the plan is lifted: the service waits for the call without a
  // limit, as the robot's own would. Meanwhile the stop and the diagnosis answer.
  kRelease = 1,
  kRestSkipped = 2,      // the "$a=1" that ends the text is not executed
  kThrows = 4,           // a stage fails: say passes the error on, without end event
  kStopAllBlocking = 8,  // stopped with _stopAll(true) rather than stop(id)
  kAsksTheSpeech = 16,   // the diagnosis asks the speech engine whether it speaks: it waits
  kHeldBookmark = 32,    // the first fault holds back a bookmark the stopped text may never get
};

struct Row {
  const char* name;
  std::string faults;
  std::string text;
  // The service's limits that may run out meanwhile, in the robot's time: 400 per bookmark
  // lost, 200 per animation given up, 5000 per behaviour never heard of, 3000 per
  // blocking _stopAll that gives up.
  int allowedMs = 0;
  // A part of the line that the rule applied logs at error level, after its category
  // ("director: " for "mokuto.director").
  std::string line = {};
  StopAt stopAt = StopAt::Never;
  unsigned flags = 0;
  std::string config = {};  // a configuration value form for the text (JSON)
};

const char* kBlockingEnd =
    R"([["behaviorAtEndOfMokuto", "animations/Stand/Gestures/End_1"],
        ["ifBehaviorAtEndOfMokutoIsBlocking", true]])";
const char* kNoArmsBreathing = R"([["armsBreathingAllowed", false]])";
const char* kRandom = R"([["bodyLanguageMode", "random"]])";

std::vector<Row> matrix() {
  const std::string hello = "Hello $a=1";
  const std::string start = "^start(" + S + ") hi $a=1";
  const std::string run = "^run(" + S + ") then $a=1";
  const std::string runLong = "^run(" + L + ") then $a=1";
  const std::string sound = "^runSound(bells/ding) a $a=1";
  const std::string waitSound = "^startSound(bells/ding) a ^waitSound(bells/ding) b $a=1";
  const std::string stopSound = "^startSound(bells/chime) a ^stopSound(bells/chime) b $a=1";
  const std::string mode2 = "^inputMode2(on) Hello $a=1";
  const std::string three = "a $a=1 b $b=1 c $c=1";
  const std::string call = "^call(ZUAutonomousMoves._moveForward()) go $a=1";
  const std::string move = "ZUAutonomousMoves._moveForward";
  const std::string stopLong = "^start(" + L + ") a ^stop(" + L + ") b ^start(" + S + ") c $a=1";
  const std::string gaveUp =
      "director: Behavior " + L + " did not stop before 200ms, timeout expired.";
  const std::string unheard = "director: MK hasn't been notified that the behavior: \"" + S +
                              "\" has stopped.\nMake sure that the animation name follow the "
                              "pattern: \"package/animationPath\"";
  const std::string never = "ZUBehaviorManager.behaviorStopped:never;";
  const std::string lost = "director: The instruction with id ";
  const auto hang = StopAt::Strike;
  const unsigned held = kRelease | kRestSkipped;
  return {
      // ---- the compiler and loader stages ----
      {"getLanguage fails", "ZUTextToSpeech.getLanguage:throw", hello, 0,
       "compiler: TTS.getLanguage() has thrown an error: "},
      {"getLanguage hangs", "ZUTextToSpeech.getLanguage:hang", hello, 0, "", hang, held},
      {"resolveBehaviorName fails", "ZUBehaviorManager.resolveBehaviorName:throw", start, 0,
       "loader: injected fault"},
      {"resolveBehaviorName hangs", "ZUBehaviorManager.resolveBehaviorName:hang", start, 0, "",
       hang, held},
      {"resolveBehaviorName late", "ZUBehaviorManager.resolveBehaviorName:delay=300ms", start, 200},
      {"preloadBehavior fails", "ZUBehaviorManager.preloadBehavior:throw", start, 200,
       "loader: Could not preload behavior " + S + ": "},
      {"preloadBehavior hangs", "ZUBehaviorManager.preloadBehavior:hang", start, 0, "", hang, held},
      {"preloadBehavior late", "ZUBehaviorManager.preloadBehavior:delay=300ms", start, 200},
      {"loadSoundSet fails", "ZUAudioPlayer.loadSoundSet:throw", sound, 0,
       "loader: injected fault"},
      {"loadSoundSet hangs", "ZUAudioPlayer.loadSoundSet:hang", sound, 0, "", hang, held},
      // ---- the director: the speech engine ----
      {"say fails: no speech, no bookmark", "ZUTextToSpeech.say:throw", hello, 400,
       lost + "1 has not been received in time.", StopAt::Never, kRestSkipped},
      {"say hangs: stopped before the speech starts", "ZUTextToSpeech.say:hang", hello, 0, "", hang,
       kRestSkipped},
      // The director asks whether the speech runs only while it waits for a bookmark: a
      // bookmark lost makes it ask, whatever the machine's load (one late would race the
      // director's limit in real time, which a loaded machine may lose).
      {"isRunning fails", "ZUTextToSpeech.bookmarks:drop;ZUTextToSpeech.isRunning:throw", hello,
       400, "director: ZUTextToSpeech.isRunning has thrown an exception: ", StopAt::Never,
       kRestSkipped},
      {"isRunning hangs", "ZUTextToSpeech.bookmarks:delay=2s;ZUTextToSpeech.isRunning:hang", hello,
       400, "", hang, held | kAsksTheSpeech | kHeldBookmark},
      {"isRunning late", "ZUTextToSpeech.bookmarks:drop;ZUTextToSpeech.isRunning:delay=300ms",
       hello, 400, "", StopAt::Never, kRestSkipped},
      {"wait fails", "ZUTextToSpeech.wait:throw", hello, 0,
       "director: ZUTextToSpeech.wait has thrown an exception: "},
      {"wait hangs", "ZUTextToSpeech.wait:hang", hello, 0, "", hang, kRelease},
      {"getLanguage, say and wait late",
       "ZUTextToSpeech.getLanguage:delay=300ms; ZUTextToSpeech.say:delay=300ms;"
       "ZUTextToSpeech.wait:delay=300ms",
       hello},
      {"stop fails: the speech goes on to its end", "ZUTextToSpeech.stop:throw", runLong, 200,
       "director: tts.stop() has thrown an exception: ", StopAt::Hold, kRestSkipped},
      {"stop hangs", "ZUTextToSpeech.stop:hang", runLong, 200, "", StopAt::Hold, held},
      {"stop late", "ZUTextToSpeech.stop:delay=300ms", runLong, 200, "", StopAt::Hold,
       kRestSkipped},
      {"setParameter fails", "ZUTextToSpeech.setParameter:throw", mode2, 0,
       "director: ZUTextToSpeech.setParameter has thrown an exception: "},
      {"setParameter hangs", "ZUTextToSpeech.setParameter:hang", mode2, 0, "", hang, held},
      {"setParameter late", "ZUTextToSpeech.setParameter:delay=300ms", mode2},
      // ---- the director: behaviours ----
      {"startBehavior fails", "ZUBehaviorManager.startBehavior:throw", start, 0,
       "director: Error caught while starting the animation: " + S + ", with this error: "},
      {"startBehavior hangs", "ZUBehaviorManager.startBehavior:hang", start, 200, "", hang, held},
      {"startBehavior late", "ZUBehaviorManager.startBehavior:delay=300ms", start, 200},
      {"stopBehavior fails: given up after 200 ms, the next one starts",
       "ZUBehaviorManager.stopBehavior:throw", stopLong, 600, gaveUp},
      {"stopBehavior hangs: given up after 200 ms", "ZUBehaviorManager.stopBehavior:hang", stopLong,
       600, gaveUp},
      {"stopBehavior late: given up after 200 ms", "ZUBehaviorManager.stopBehavior:delay=2s",
       stopLong, 600, gaveUp},
      {"behaviorStopped never: a stop given up after 200 ms", never, stopLong, 600, gaveUp},
      {"behaviorStopped never: ^run let go by the 5-second check", never, run, 5000, unheard},
      {"behaviorStopped never: ^runTag let go by the 5-second check", never,
       "^runTag(short) then $a=1", 5000, unheard},
      {"isBehaviorRunning fails", never + "ZUBehaviorManager.isBehaviorRunning:throw", run, 5000,
       "director: ZUBehaviorManager.isBehaviorRunning has thrown an exception: "},
      {"isBehaviorRunning hangs", never + "ZUBehaviorManager.isBehaviorRunning:hang", run, 5200, "",
       hang, held},
      {"isBehaviorRunning late", never + "ZUBehaviorManager.isBehaviorRunning:delay=300ms", run,
       5000, unheard},
      {"runBehavior fails (the end behaviour)", "ZUBehaviorManager.runBehavior:throw", hello, 0,
       "director: error while playing the behavior \"" + std::string(kEnd) + "\": ", StopAt::Never,
       0, kBlockingEnd},
      {"runBehavior hangs", "ZUBehaviorManager.runBehavior:hang", hello, 0, "", hang, kRelease,
       kBlockingEnd},
      {"runBehavior late", "ZUBehaviorManager.runBehavior:delay=300ms", hello, 0, "", StopAt::Never,
       0, kBlockingEnd},
      // ---- the director: sounds and arm breathing ----
      {"playSoundSetFile fails", "ZUAudioPlayer.playSoundSetFile:throw", sound, 0,
       "director: the play of a file: \"bells/ding\" throw an error: "},
      {"a sound that never ends, stopped during ^waitSound",
       "ZUAudioPlayer.playSoundSetFile:hang; ZUAudioPlayer.wait:delay=0ms", waitSound, 0, "", hang,
       kRestSkipped},
      {"loadSoundSet, playSoundSetFile and wait for a sound late",
       "ZUAudioPlayer.loadSoundSet:delay=300ms; ZUAudioPlayer.playSoundSetFile:delay=300ms;"
       "ZUAudioPlayer.wait:delay=300ms",
       waitSound},
      {"stop of a sound fails", "ZUAudioPlayer.stop:throw", stopSound, 0,
       "director: ZUAudioPlayer has thrown an exception: "},
      {"stop of a sound hangs", "ZUAudioPlayer.stop:hang", stopSound, 0, "", hang, held},
      {"stop of a sound late", "ZUAudioPlayer.stop:delay=300ms", stopSound},
      {"wait for a sound fails", "ZUAudioPlayer.wait:throw", waitSound, 0,
       "director: ZUAudioPlayer.wait has thrown an error: "},
      {"wait for a sound hangs", "ZUAudioPlayer.wait:hang", waitSound, 0, "", hang, held},
      {"getBreathEnabled fails", "ZUMotion.getBreathEnabled:throw", hello, 0,
       "director: ZUMotion.getBreathEnabled has thrown an exception: ", StopAt::Never, 0,
       kNoArmsBreathing},
      {"getBreathEnabled hangs", "ZUMotion.getBreathEnabled:hang", hello, 0, "", hang, held,
       kNoArmsBreathing},
      {"setBreathEnabled fails", "ZUMotion.setBreathEnabled:throw", hello, 0,
       "director: ZUMotion.setBreathEnabled has thrown an exception: ", StopAt::Never, 0,
       kNoArmsBreathing},
      {"setBreathEnabled late", "ZUMotion.setBreathEnabled:delay=300ms", hello, 0, "",
       StopAt::Never, 0, kNoArmsBreathing},
      // ---- the body talk, which moves while the speech waits for a sound ----
      {"body talk: getAngles fails", "ZUMotion.getAngles:throw", sound, 0, "", StopAt::Never, 0,
       kRandom},
      {"body talk: getAngles late", "ZUMotion.getAngles:delay=300ms", sound, 0, "", StopAt::Never,
       0, kRandom},
      {"body talk: a move that hangs, given up at its limit",
       "ZUMotion.angleInterpolationBezier:hang", sound, 0, "", StopAt::Never, 0, kRandom},
      // ---- the calls of a text: waited for without a limit, as the robot's own ----
      {"a called method fails", move + ":throw", call, 0,
       "director: An exception as been thrown during this call: " + move +
           "([]) with this error: "},
      {"a called method hangs", move + ":hang", call, 0, "", hang, held},
      {"a called method late", move + ":delay=300ms", call},
      {"a posted call hangs: not waited for", move + ":hang", "^pCall(" + move + "()) go $a=1"},
      // ---- the memory ----
      {"raiseEvent fails: the text fails without end event", "ZUMemory.raiseEvent:throw", hello,
       400, "main: say() method detects an exception: ", StopAt::Never, kRestSkipped | kThrows},
      {"raiseEvent hangs", "ZUMemory.raiseEvent:hang", hello, 400, "", StopAt::Never, kRelease},
      {"raiseEvent late", "ZUMemory.raiseEvent:delay=300ms", hello, 400},
      // ---- bookmarks ----
      {"a bookmark lost", "ZUTextToSpeech.bookmarks:drop=2", three, 400,
       lost + "2 has not been received in time."},
      {"every bookmark lost", "ZUTextToSpeech.bookmarks:drop", three, 1200,
       lost + "3 has not been received in time.", StopAt::Never, kRestSkipped},
      {"bookmarks repeated", "ZUTextToSpeech.bookmarks:duplicate", three},
      {"bookmarks swapped", "ZUTextToSpeech.bookmarks:reorder=1", three},
      {"a bookmark late past 400 ms", "ZUTextToSpeech.bookmarks:delay=2s@2", three, 400,
       lost + "2 has not been received in time."},
      {"a blocking bookmark lost", "ZUTextToSpeech.bookmarks:drop=1", run, 400,
       lost + "1 has not been received in time."},
      {"a blocking bookmark late", "ZUTextToSpeech.bookmarks:delay=300ms@1", run, 200},
      {"stopped while the director waits for a bookmark held back",
       "ZUTextToSpeech.bookmarks:delay=2s@1", run, 0, "", StopAt::Round,
       kRestSkipped | kHeldBookmark},
      // ---- stops from another thread at each stage ----
      {"stopped entering the compiler", "", start, 0, "", StopAt::Compiler, kRestSkipped},
      {"stopped entering the loader", "", start, 0, "", StopAt::Loader, kRestSkipped},
      {"stopped entering the director", "", start, 0, "", StopAt::Director, kRestSkipped},
      {"stopped while the speech holds for ^run", "", runLong, 200, "", StopAt::Hold, kRestSkipped},
      {"stopped during ^wait", "", "^start(" + L + ") a ^wait(" + L + ") b $a=1", 200, "",
       StopAt::Hold, kRestSkipped},
      {"_stopAll(true) gives up after 3 s on a text that does not end",
       "ZUBehaviorManager.startBehavior:hang", start, 3200,
       "main: ZUMokuto.stopAll() makes more than 3 seconds, we skip this method", hang,
       held | kStopAllBlocking},
  };
}

bool ready(std::future<void>& f) {
  return f.wait_for(kBound) == std::future_status::ready;
}

ZU::ZUValue configuration(const std::string& json) {
  return json.empty() ? ZU::ZUValue() : ZU::fromAnyReference(ko::fromJson(json));
}

TEST(FaultMatrix, EveryTextEndsOnceWithinItsLimitsAndTheNextIsSpokenNormally) {
  mokutotest::ServiceRig rig;
  ko::log::ScopedCapture log(ko::log::Warning);
  const ZU::ZUProxy behaviors("ZUBehaviorManager", rig.robot->broker());
  const ZU::ZUProxy audio("ZUAudioPlayer", rig.robot->broker());

  // The text that entered the compiler last, and the stage at which the row stops its text.
  std::atomic<ZU::MKID> current{0};
  std::atomic<int> stopStage{-1};
  std::atomic<bool> stageStopReturned{false};
  rig.setStageHook([&](Stage stage, ZU::MKID id) {
    if (stage == Stage::Compiler)
      current = id;
    if (static_cast<int>(stage) != stopStage.load())
      return;
    auto stopping = std::async(std::launch::async, [&rig, id] { rig.mokuto->stop(id); });
    stageStopReturned = ready(stopping);
  });

  // MOKUTO_FAULT_ROWS=text runs only the rows whose name holds the text.
  const char* only = std::getenv("MOKUTO_FAULT_ROWS");
  for (const Row& row : matrix()) {
    if (only && std::string(row.name).find(only) == std::string::npos)
      continue;
    SCOPED_TRACE(row.name);
    const auto faults = robotsim::parseFaults(row.faults);
    std::vector<std::size_t> strikesBefore;
    for (const auto& fault : faults)
      strikesBefore.push_back(rig.faults->strikes(fault.service, fault.operation));
    const std::size_t holds = rig.robot->timeline()->entries("ZUTextToSpeech", "hold").size();
    const std::size_t executed = rig.events("a");
    log->clear();
    stopStage = row.stopAt == StopAt::Compiler   ? static_cast<int>(Stage::Compiler)
                : row.stopAt == StopAt::Loader   ? static_cast<int>(Stage::Loader)
                : row.stopAt == StopAt::Director ? static_cast<int>(Stage::Director)
                                                 : -1;
    stageStopReturned = false;
    rig.faults->set(faults);
    const auto clockBefore = rig.clock->now();

    rig.clock->holdRounds(row.stopAt == StopAt::Round);
    auto said = rig.sayAsync(row.text, configuration(row.config));
    if (row.stopAt == StopAt::Strike || row.stopAt == StopAt::Hold || row.stopAt == StopAt::Round) {
      const bool reached =
          row.stopAt == StopAt::Hold ? rig.waitForTimeline("ZUTextToSpeech", "hold", holds + 1)
          : row.stopAt == StopAt::Round
              ? ko::test::eventually([&] { return rig.clock->heldRounds() > 0; })
              : rig.faults->waitForStrikes(faults.back().service, faults.back().operation,
                                           strikesBefore.back() + 1, kBound);
      EXPECT_TRUE(reached) << "the moment to stop never came";
      auto stopping = std::async(std::launch::async, [&rig, &row, &current] {
        if (row.flags & kStopAllBlocking)
          rig.mokuto->_stopAll(true);
        else
          rig.mokuto->stop(current.load());
      });
      EXPECT_TRUE(ready(stopping)) << "the stop did not return";
    } else if (stopStage.load() >= 0) {
      EXPECT_TRUE(ready(said));
      EXPECT_TRUE(stageStopReturned.load()) << "the stop did not return";
    }
    if (row.flags & kRelease) {
      // The service answers while one of its calls hangs.
      std::size_t k = 0;
      while (k + 1 < faults.size() && faults[k].action != robotsim::Fault::Action::Hang)
        ++k;
      EXPECT_TRUE(rig.faults->waitForStrikes(faults[k].service, faults[k].operation,
                                             strikesBefore[k] + 1, kBound));
      auto probe = std::async(std::launch::async, [&rig, &row] {
        rig.mokuto->_isRunning();
        rig.mokuto->getBodyLanguageModeToStr();
        if (!(row.flags & kAsksTheSpeech))
          rig.mokuto->diagnosisLines();
      });
      EXPECT_TRUE(ready(probe)) << "the diagnosis froze while a call hangs";
      rig.faults->lift();
    }
    const bool ended = ready(said);
    rig.clock->holdRounds(false);
    EXPECT_TRUE(ended || row.stopAt != StopAt::Round) << "the stop did not wake the director";
    EXPECT_TRUE(ended || (row.flags & kRelease)) << "the text ended only once the plan was lifted";
    // Every fault struck (a stop asks the speech engine from the event loop: that call may
    // come after the end of the text).
    const std::size_t firstStruck = (row.flags & kHeldBookmark) ? 1 : 0;
    for (std::size_t k = firstStruck; k < faults.size(); ++k) {
      EXPECT_TRUE(rig.faults->waitForStrikes(faults[k].service, faults[k].operation,
                                             strikesBefore[k] + 1, kBound))
          << faults[k].service << "." << faults[k].operation << " never struck";
    }
    rig.faults->lift();
    ASSERT_TRUE(ended || ready(said)) << "the text never ended";
    bool threw = false;
    try {
      said.get();
    } catch (const std::exception&) {
      threw = true;
    }
    const ZU::MKID id = current.load();
    const bool throws = (row.flags & kThrows) != 0;
    EXPECT_EQ(threw, throws);
    EXPECT_EQ(rig.endEvents(id), throws ? 0u : 1u);
    EXPECT_LE((rig.clock->now() - clockBefore).count(), row.allowedMs);
    EXPECT_EQ(rig.events("a"), executed + ((row.flags & kRestSkipped) ? 0 : 1));
    for (std::size_t k = firstStruck; k < faults.size(); ++k) {
      EXPECT_TRUE(log->containsPart("robotsim.faults", ko::log::Warning,
                                    faults[k].service + "." + faults[k].operation + ": "));
    }
    if (const auto colon = row.line.find(": "); colon != std::string::npos) {
      EXPECT_TRUE(ko::test::eventually([&] {
        return log->containsPart("mokuto." + row.line.substr(0, colon), Error,
                                 row.line.substr(colon + 2));
      })) << row.line;
    }

    // The next text, without faults, on a robot at rest.
    stopStage = -1;
    behaviors.call<void>("stopAllBehaviors");
    audio.call<void>("stopAll");
    const std::size_t nexts = rig.events("next");
    const auto nextBefore = rig.clock->now();
    auto next = rig.sayAsync("And the next one. $next=1");
    ASSERT_TRUE(ready(next)) << "the next text never ended";
    next.get();
    EXPECT_EQ(rig.events("next"), nexts + 1);
    EXPECT_EQ(rig.endEvents(current.load()), 1u);
    EXPECT_EQ(rig.clock->now(), nextBefore);
  }
  rig.setStageHook(nullptr);
}

}  // namespace
