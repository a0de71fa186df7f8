// The service under load: eight callers say random texts at once while other threads stop
// them (by id, _stopAll with and without waiting), change the configuration and declare
// animation packages, with the speech engine's bookmarks lost, repeated, swapped and late.
// No race (under the thread sanitizer), no deadlock (the watchdog fails the run with every
// thread's stack), every text ended exactly once. MOKUTO_STRESS_SAYS sets the says of each
// caller (10 here; scripts/stress-say runs 1,000).
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <iostream>
#include <map>
#include <random>
#include <thread>
#include <vector>

#include "director_rig.h"
#include "ko/log.hpp"
#include "random_texts.h"
#include "service_rig.h"
#include "watchdog.h"

namespace {

using namespace std::chrono_literals;

int saysPerCaller() {
  const char* value = std::getenv("MOKUTO_STRESS_SAYS");
  const int says = value ? std::atoi(value) : 0;
  return says > 0 ? says : 10;
}

// A thread that runs `step` after random pauses of up to `pauseMs` until `done`, counting
// its steps in `count`.
template <class Step>
std::thread every(std::atomic<bool>& done, std::atomic<int>& count, int pauseMs, unsigned seed,
                  Step step) {
  return std::thread([&done, &count, pauseMs, seed, step]() mutable {
    std::mt19937 random(seed);
    while (!done.load()) {
      std::this_thread::sleep_for(
          std::chrono::milliseconds(std::uniform_int_distribution<int>(0, pauseMs)(random)));
      step(random);
      ++count;
    }
  });
}

TEST(ServiceStress, EightCallersAndTheirStoppersEndEveryTextOnce) {
  constexpr int kCallers = 8;
  const int says = saysPerCaller();
  ko::log::ScopedCapture quiet(ko::log::Fatal);
  mokutotest::ServiceRig rig;
  rig.faults->set(robotsim::parseFaults(
      "ZUTextToSpeech.bookmarks:drop=3; ZUTextToSpeech.bookmarks:duplicate=1;"
      "ZUTextToSpeech.bookmarks:reorder=2; ZUTextToSpeech.bookmarks:delay=600ms@4"));
  rig.mokuto->setBodyLanguageModeFromStr("random");
  const auto mokuto = rig.mokuto;
  mokutotest::Watchdog watchdog(std::chrono::seconds(60 + says * 6), "the stress run");
  const auto began = std::chrono::steady_clock::now();

  std::atomic<int> started{0};
  std::atomic<int> failures{0};
  std::vector<std::thread> callers;
  for (int caller = 0; caller < kCallers; ++caller) {
    callers.emplace_back([&, caller] {
      mokutosoak::RandomTexts texts({mokutotest::kShort, mokutotest::kMid, mokutotest::kEnd},
                                    {"short", "mid", "end"}, {"bells/ding", "bells/dong"},
                                    static_cast<unsigned>(caller));
      for (int n = 0; n < says; ++n) {
        ++started;
        try {
          mokuto->say(texts.next());
        } catch (const std::exception&) {
          ++failures;
        }
      }
    });
  }
  std::atomic<bool> done{false};
  std::atomic<int> stops{0}, stopAlls{0}, waitingStopAlls{0}, settings{0}, packages{0};
  std::vector<std::thread> others;
  others.push_back(every(done, stops, 15, 1, [&](std::mt19937& random) {
    mokuto->stop(std::uniform_int_distribution<int>(1, started.load() + 1)(random));
  }));
  others.push_back(every(done, stopAlls, 200, 2, [&](std::mt19937&) { mokuto->_stopAll(false); }));
  others.push_back(
      every(done, waitingStopAlls, 400, 3, [&](std::mt19937&) { mokuto->_stopAll(true); }));
  others.push_back(every(done, settings, 30, 4, [&](std::mt19937& random) {
    static const char* const modes[] = {"disabled", "random", "contextual"};
    mokuto->setBodyLanguageModeFromStr(modes[random() % 3]);
    mokuto->_setMSPauseBeforeSpeech(static_cast<int>(random() % 200));
    mokuto->addTagsToWords(ZU::ZUValue::makeArray(
        {ZU::ZUValue::makeArray({ZU::ZUValue("short"), ZU::ZUValue::makeArray({"hello"})})}));
    mokuto->declareTagForAnimations(ZU::ZUValue::makeArray({ZU::ZUValue::makeArray(
        {ZU::ZUValue("mid"), ZU::ZUValue::makeArray({mokutotest::kMid})})}));
    mokuto->diagnosisLines();
  }));
  others.push_back(every(done, packages, 300, 5, [&](std::mt19937& random) {
    static const char* const names[] = {"animations", "extra", "more"};
    mokuto->declareAnimationsPackage(names[random() % 3]);
  }));
  for (auto& caller : callers)
    caller.join();
  done = true;
  for (auto& other : others)
    other.join();
  EXPECT_FALSE(mokuto->_isRunning());

  std::map<int, int> ends;
  for (const auto& [key, value] : mokutotest::raisedEvents(*rig.robot->timeline())) {
    if (key == ZU::ZUMokuto::kEndEvent)
      ++ends[value.to<int>()];
  }
  EXPECT_EQ(failures.load(), 0);
  EXPECT_EQ(static_cast<int>(ends.size()), kCallers * says);
  for (int id = 1; id <= kCallers * says; ++id)
    EXPECT_EQ(ends[id], 1) << "text " << id;
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
  std::cout << kCallers << " callers x " << says << " says in " << seconds << " s: " << ends.size()
            << " end events; stops " << stops << ", _stopAll(false) " << stopAlls
            << ", _stopAll(true) " << waitingStopAlls << ", configuration rounds " << settings
            << ", packages declared " << packages << ", bookmark faults struck "
            << rig.faults->strikes("ZUTextToSpeech", "bookmarks") << std::endl;
}

}  // namespace
