// A text prepared by the loader stage and spoken by the director through espeak-ng in real
// time, with the simulated behaviour manager and audio player: each action comes after the
// speech has reached its bookmark, and the director's behaviour-stopped relay feeds the
// loader's preload counts as the service's module connects them.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <future>
#include <map>
#include <memory>
#include <string>

#include "director_rig.h"
#include "ko/json.hpp"
#include "ko_test_helpers.hpp"
#include "loadertask.h"
#include "mokuto/zumokutoparser.h"
#include "robotsim/zutexttospeech.h"

namespace {

using mokutotest::DirectorRig;
using mokutotest::kMid;
using mokutotest::kShort;

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

TEST(DirectorOnEspeak, TheActionsComeAfterTheirBookmarksAndStopsFeedThePreloads) {
  DirectorRig rig(DirectorRig::Speech::Espeak);
  const auto loader = std::make_shared<ZU::LoaderTask>(rig.broker, nullptr);
  loader->updateRepresentations("animations/");
  // The relay may fire after the test's body: the connection holds the loader.
  rig.host->director().behaviorStoppedSignal.connect(
      [loader](const std::string& path) { loader->onBehaviorStopped(path); });

  // The tag "short" has one animation; the named one starts twice, the second time after
  // the first has stopped.
  const std::string mid = kMid;
  auto job = std::make_shared<ZU::MKTaskInstruction>();
  ZU::ZUMokutoParser().parse(job,
                             "^startTag(short) Hello ^start(" + mid + ") my friend, ^wait(" + mid +
                                 ") how are you ^start(" + mid +
                                 ") today? ^startSound(bells/ding) Goodbye.",
                             false);
  job->postureFamily = ZU::Standing;
  loader->process(*job);
  for (const auto& action : job->actions)
    EXPECT_NE(action->type, ZU::UNKNOWN) << action->text;
  EXPECT_EQ(loader->getPreloadCounts(),
            (std::map<std::string, std::int32_t>{{kShort, 0}, {kMid, 1}}));

  auto done = rig.sayAsync(job);
  ASSERT_EQ(done.wait_for(std::chrono::seconds(60)), std::future_status::ready);
  EXPECT_EQ(rig.count("ZUBehaviorManager", "startBehavior", kShort), 1u);
  EXPECT_EQ(rig.count("ZUBehaviorManager", "startBehavior", kMid), 2u);
  EXPECT_EQ(rig.count("ZUAudioPlayer", "playSoundSetFile", "bells"), 1u);
  // One preload at the stage, one more after the first stop of the animation started twice.
  EXPECT_TRUE(rig.waitFor("ZUBehaviorManager", "preloadBehavior", kMid, 2));
  EXPECT_EQ(rig.count("ZUBehaviorManager", "preloadBehavior", kShort), 1u);
  EXPECT_TRUE(ko::test::eventually([&loader] { return loader->getPreloadCounts().empty(); }));

  const robotsim::Timeline& timeline = *rig.timeline;
  const auto says = timeline.entries("ZUTextToSpeech", "say");
  ASSERT_EQ(says.size(), 1u);
  const int sayId = ko::toJson(says[0].arguments).at(0).get<int>();
  const auto marks = rig.espeak()->markRecords(sayId);
  ASSERT_EQ(marks.size(), 5u);
  for (std::size_t k = 1; k < marks.size(); ++k)
    EXPECT_GT(marks[k].audioUs, marks[k - 1].audioUs);

  // A "mrk" is reached when its event is raised, a "mrkpause" when the speech holds there.
  const auto reached = [&](int mark) {
    return marks[static_cast<std::size_t>(mark - 1)].blocking
               ? timeOf(timeline, "ZUTextToSpeech", "hold", {sayId, mark})
               : timeOf(timeline, "ZUMemory", "raiseEvent",
                        {"ZUTextToSpeech/CurrentBookMark", mark});
  };
  const std::int64_t shortStart = timeOf(timeline, "ZUBehaviorManager", "startBehavior", {kShort});
  const std::int64_t midStart = timeOf(timeline, "ZUBehaviorManager", "startBehavior", {kMid});
  const std::int64_t dingPlay =
      timeOf(timeline, "ZUAudioPlayer", "playSoundSetFile", {"bells", "ding"});
  for (const std::int64_t t : {shortStart, midStart, dingPlay, reached(1), reached(2), reached(5)})
    ASSERT_GE(t, 0);
  EXPECT_GT(shortStart, reached(1));
  EXPECT_GT(midStart, reached(2));
  EXPECT_GT(dingPlay, reached(5));
  // "^wait" held the speech until the gesture of the first "^start" had ended.
  EXPECT_GT(reached(4), timeOf(timeline, "ZUBehaviorManager", "behaviorStopped", {kMid}));
}

}  // namespace
