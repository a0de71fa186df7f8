// A text spoken by the director through espeak-ng in real time, with the simulated behaviour
// manager and audio player: each action comes after the speech has reached its bookmark.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <future>
#include <string>
#include <vector>

#include "director_rig.h"
#include "ko/json.hpp"
#include "robotsim/zutexttospeech.h"

namespace {

using mokutotest::DirectorRig;

// The time of the first entry of that operation whose arguments begin with `prefix` (-1
// when none).
std::int64_t timeOf(const robotsim::Timeline& timeline, const std::string& service,
                    const std::string& operation, const nlohmann::ordered_json& prefix) {
  for (const auto& entry : timeline.entries(service, operation)) {
    const auto args = ko::toJson(entry.arguments);
    if (args.size() >= prefix.size() && std::equal(prefix.begin(), prefix.end(), args.begin()))
      return entry.us;
  }
  return -1;
}

TEST(DirectorOnEspeak, TheActionsComeAfterTheirBookmarksInTheAudio) {
  DirectorRig rig(DirectorRig::Speech::Espeak);
  const std::string shortGesture = mokutotest::kShort;
  const std::string midGesture = mokutotest::kMid;
  auto job =
      rig.job("Hello ^start(" + shortGesture + ") my friend, ^wait(" + shortGesture +
              ") how are you ^run(" + midGesture + ") today? ^startSound(bells/ding) Goodbye.");
  auto done = rig.sayAsync(job);
  ASSERT_EQ(done.wait_for(std::chrono::seconds(60)), std::future_status::ready);

  const robotsim::Timeline& timeline = *rig.timeline;
  const auto says = timeline.entries("ZUTextToSpeech", "say");
  ASSERT_EQ(says.size(), 1u);
  const int sayId = ko::toJson(says[0].arguments).at(0).get<int>();
  const auto marks = rig.espeak()->markRecords(sayId);
  ASSERT_EQ(marks.size(), 4u);
  for (std::size_t k = 1; k < marks.size(); ++k)
    EXPECT_GT(marks[k].audioUs, marks[k - 1].audioUs);
  EXPECT_GE(marks[2].heldUs, 500'000);  // the speech waited for the "^run"

  // A "mrk" is reached when its event is raised, a "mrkpause" when the speech holds there.
  const auto reached = [&](int mark) {
    return marks[static_cast<std::size_t>(mark - 1)].blocking
               ? timeOf(timeline, "ZUTextToSpeech", "hold", {sayId, mark})
               : timeOf(timeline, "ZUMemory", "raiseEvent",
                        {"ZUTextToSpeech/CurrentBookMark", mark});
  };
  const std::int64_t shortStart =
      timeOf(timeline, "ZUBehaviorManager", "startBehavior", {shortGesture});
  const std::int64_t midStart =
      timeOf(timeline, "ZUBehaviorManager", "startBehavior", {midGesture});
  const std::int64_t dingPlay =
      timeOf(timeline, "ZUAudioPlayer", "playSoundSetFile", {"bells", "ding"});
  for (const std::int64_t t : {shortStart, midStart, dingPlay, reached(1), reached(3), reached(4)})
    ASSERT_GE(t, 0);
  EXPECT_GT(shortStart, reached(1));
  EXPECT_GT(midStart, reached(3));
  EXPECT_GT(dingPlay, reached(4));
  // "^wait" held the speech until the gesture of "^start" had ended.
  EXPECT_GT(reached(3), timeOf(timeline, "ZUBehaviorManager", "behaviorStopped", {shortGesture}));
}

}  // namespace
