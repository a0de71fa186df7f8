// Texts stopped at random moments while bookmarks, "mrkpause" calls and the behaviour
// manager's stops arrive: nothing deadlocks, every director stage and every blocked call
// returns, and no action begins after its text's stop has returned.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <future>
#include <limits>
#include <memory>
#include <random>
#include <set>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "director_rig.h"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/speechscript.h"
#include "zu/zuproxy.h"

namespace {

using mokutotest::DirectorRig;
using mokutotest::kBound;

constexpr int kRounds = 500;
constexpr int kBoundMs = 10000;

// A text of 3 to 6 actions drawn from every kind the director waits on or is told about.
std::string composeText(std::mt19937& random) {
  const std::string shortGesture = mokutotest::kShort;
  const std::string midGesture = mokutotest::kMid;
  const std::vector<std::string> menu = {
      "$k=1",
      "^start(" + shortGesture + ")",
      "^start(" + midGesture + ")",
      "^stop(" + midGesture + ")",
      "^wait(" + shortGesture + ")",
      "^startSound(bells/ding, 40)",
      "^waitSound(bells/ding)",
      R"(^call(ZUMemory.raiseEvent("called", 1)))",
      "^run(" + shortGesture + ")",
  };
  std::string text = "Hello";
  const int actions = 3 + static_cast<int>(random() % 4);
  for (int n = 0; n < actions; ++n) {
    // The slow "^run" only now and then.
    std::size_t pick = random() % menu.size();
    if (pick == menu.size() - 1 && random() % 4 != 0)
      pick = 0;
    text += " word " + menu[pick];
  }
  return text;
}

// The speech engine's part: "started" (mostly), the bookmarks in order with a few lost or
// swapped, each "mrkpause" call waited for, then the end. False when a call never returned.
bool drive(mokutotest::ScriptedSpeech& speech, const mokutotest::ScriptedSpeech::Say& say,
           unsigned seed) {
  std::mt19937 random(seed);
  if (random() % 8 != 0)
    speech.raiseStatus(say.id, "started");
  auto marks = robotsim::parseSpeechText(say.text).marks;
  for (std::size_t k = 0; k + 1 < marks.size(); ++k) {
    if (random() % 10 == 0)
      std::swap(marks[k], marks[k + 1]);
  }
  bool returned = true;
  for (const auto& mark : marks) {
    if (random() % 20 == 0)
      continue;
    if (mark.blocking) {
      returned =
          speech.mrkpause(mark.number).wait(kBoundMs) != ko::FutureState::Timeout && returned;
    } else {
      speech.raiseBookmark(ZU::ZUValue(mark.number));
    }
    std::this_thread::sleep_for(std::chrono::microseconds(random() % 2000));
  }
  speech.finish(say.id);
  return returned;
}

TEST(DirectorStress, RandomStopsNeverDeadlockNorLetAnActionBeginAfterTheStop) {
  // The rounds' expected errors (late bookmarks, stops) would fill the output.
  ko::log::ScopedCapture quiet(ko::log::Silent);
  DirectorRig rig;
  auto recorder = std::make_shared<mokutotest::SyncRecorder>();
  rig.host->director().setObserver(recorder);
  ZU::MKIDRegister& texts = rig.host->textRegister;
  std::mt19937 random(20240611);

  for (int round = 0; round < kRounds; ++round) {
    SCOPED_TRACE("round " + std::to_string(round));
    auto job = rig.job(composeText(random));
    const unsigned seed = static_cast<unsigned>(random());
    const int stopKind = static_cast<int>(random() % 4);  // 0: none, 1: the text's, 2: all
    const auto stopAfter = std::chrono::microseconds(random() % 25000);

    const std::size_t sayIndex = rig.speech->sayCount();
    auto finished = std::make_shared<std::atomic<bool>>(false);
    auto done = std::async(std::launch::async, [&rig, job, finished] {
      const ZU::MKID id = rig.host->say(job);
      finished->store(true);
      return id;
    });
    // A text stopped before the director stage is never spoken.
    auto driver = std::async(std::launch::async, [&, finished] {
      const auto deadline = std::chrono::steady_clock::now() + kBound;
      while (std::chrono::steady_clock::now() < deadline) {
        if (const auto say = rig.speech->waitForSay(sayIndex, std::chrono::milliseconds(2)))
          return drive(*rig.speech, *say, seed);
        if (finished->load())
          return true;
      }
      return false;
    });
    std::int64_t stoppedUs = std::numeric_limits<std::int64_t>::max();
    if (stopKind != 0) {
      ASSERT_TRUE(ko::test::eventually([&] {
        std::lock_guard lock(texts.textsMutex);
        return job->id != 0;
      }));
      std::this_thread::sleep_for(stopAfter);
      if (stopKind == 2)
        rig.host->director().stop(-1);
      else
        rig.host->stop(job->id);
      stoppedUs = ko::os::ustime();
    }
    ASSERT_EQ(done.wait_for(kBound), std::future_status::ready) << job->text;
    ASSERT_EQ(driver.wait_for(kBound), std::future_status::ready) << job->text;
    EXPECT_TRUE(driver.get()) << "a blocked mrkpause call never returned: " << job->text;
    const ZU::MKID id = done.get();
    for (const auto& report : recorder->reports()) {
      if (report.textId == id && report.outcome == ZU::DirectorActionReport::Outcome::Executed) {
        EXPECT_LT(report.beginUs, stoppedUs) << "action " << report.bookmark << " of " << job->text;
      }
    }
  }
  // The rounds went through every way an action can end.
  std::set<ZU::DirectorActionReport::Outcome> outcomes;
  for (const auto& report : recorder->reports())
    outcomes.insert(report.outcome);
  EXPECT_EQ(outcomes.size(), 3u);
  // Every gesture of a text is stopped with it.
  const ZU::ZUProxy manager("ZUBehaviorManager", rig.broker);
  EXPECT_TRUE(ko::test::eventually(
      [&] { return manager.call<std::vector<std::string>>("getRunningBehaviors").empty(); }));
}

}  // namespace
