// The loader and the director together on the simulated robot with espeak-ng: a job is
// prepared by the loader stage, then spoken by the director, whose behaviour-stopped relay
// feeds the loader's preload counts as the service's module connects them.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <future>
#include <map>
#include <memory>
#include <string>

#include "director_rig.h"
#include "ko_test_helpers.hpp"
#include "loadertask.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace {

using mokutotest::DirectorRig;
using mokutotest::kMid;
using mokutotest::kShort;
using Counts = std::map<std::string, std::int32_t>;

TEST(LoaderAndDirector, ATextIsPreparedAndSpokenAndItsPreloadCountsFallBackAsItsGesturesStop) {
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
                                 ") ^start(" + mid + ") how are you ^startSound(bells/ding) today?",
                             false);
  job->postureFamily = ZU::Standing;
  loader->process(*job);
  for (const auto& action : job->actions)
    EXPECT_NE(action->type, ZU::UNKNOWN) << action->text;
  EXPECT_EQ(loader->getPreloadCounts(), (Counts{{kShort, 0}, {kMid, 1}}));

  auto done = rig.sayAsync(job);
  ASSERT_EQ(done.wait_for(std::chrono::seconds(60)), std::future_status::ready);
  EXPECT_EQ(rig.count("ZUBehaviorManager", "startBehavior", kShort), 1u);
  EXPECT_EQ(rig.count("ZUBehaviorManager", "startBehavior", kMid), 2u);
  EXPECT_EQ(rig.count("ZUAudioPlayer", "playSoundSetFile", "bells"), 1u);

  // One preload at the stage, one more after the first stop of the animation started twice.
  EXPECT_TRUE(rig.waitFor("ZUBehaviorManager", "preloadBehavior", kMid, 2));
  EXPECT_EQ(rig.count("ZUBehaviorManager", "preloadBehavior", kShort), 1u);
  EXPECT_TRUE(ko::test::eventually([&loader] { return loader->getPreloadCounts().empty(); }));
}

}  // namespace
