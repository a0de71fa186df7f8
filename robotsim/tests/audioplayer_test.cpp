// The audio player of the simulated robot driven through its proxy as the director drives
// it: sound sets, plays that last the real duration of their WAV files, posted plays
// stopped and waited for.

#include <chrono>
#include <future>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "ko/path.hpp"
#include "ko_test_helpers.hpp"
#include "robotsim/robot.h"
#include "robotsim/soundlibrary.h"
#include "support/sound_files.h"
#include "support/timeline_waiter.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

namespace fs = std::filesystem;
using ko::test::ScratchFolder;
using simtest::writeTone;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr int kBoundMs = 10000;

TEST(SoundFiles, DurationsComeFromTheFiles) {
  const struct {
    const char* name;
    int rate;
    int channels;
    double seconds;
  } cases[] = {
      {"short.wav", 8000, 1, 0.25},
      {"stereo.wav", 16000, 2, 0.25},
      {"odd.wav", 44100, 1, 0.5},
      {"empty.wav", 8000, 1, 0.0},
  };
  ScratchFolder folder;
  for (const auto& c : cases) {
    writeTone(folder.path() / "set" / c.name, c.seconds, c.rate, c.channels);
    EXPECT_DOUBLE_EQ(soundFileDuration(folder.path() / "set" / c.name), c.seconds) << c.name;
  }
  folder.write("set/broken.wav", "not a sound");
  folder.write("set/readme.txt", "not a sound either");
  EXPECT_THROW(soundFileDuration(folder.path() / "set" / "broken.wav"), SoundFileError);
  EXPECT_THROW(soundFileDuration(folder.path() / "set" / "missing.wav"), SoundFileError);

  const SoundSet set = readSoundSet(folder.path() / "set");
  EXPECT_EQ(set.files.size(), 4u);
  EXPECT_EQ(set.files.count("short"), 1u);
  EXPECT_EQ(set.rejected.count("broken.wav"), 1u);
  EXPECT_EQ(set.rejected.count("readme.txt"), 0u);
  EXPECT_THROW(readSoundSet(folder.path() / "nothing"), SoundFileError);
  // The starter sounds are short bells.
  const fs::path bells = fs::path(ko::path::findData("zefoko", "sounds")) / "bells";
  for (const std::string bell : {"ding", "dong", "chime"}) {
    EXPECT_GE(soundFileDuration(bells / (bell + ".wav")), 0.1) << bell;
    EXPECT_LE(soundFileDuration(bells / (bell + ".wav")), 1.0) << bell;
  }
}

// The simulated robot with the sound sets written in `folder`: "tones" with a 0.2 s "beep"
// and a 10 s "Long".
RobotOptions robotWithTones(const ScratchFolder& folder) {
  writeTone(folder.path() / "tones" / "beep.wav", 0.2, 8000);
  writeTone(folder.path() / "tones" / "Long.WAV", 10, 8000);
  RobotOptions options;
  options.soundsRoot = options.behaviorsRoot = folder.path().string();
  options.speech.backend = ZUTextToSpeechOptions::Backend::Timing;
  return options;
}

class AudioPlayerService : public testing::Test {
 protected:
  AudioPlayerService() { proxy.loadSoundSet("tones"); }
  std::size_t count(const char* operation) const {
    return robot.timeline()->entries("ZUAudioPlayer", operation).size();
  }

  ScratchFolder folder;
  Robot robot{robotWithTones(folder)};
  simtest::TimelineWaiter waiter{*robot.timeline()};
  ZU::ZUAudioPlayerProxy proxy{robot.broker()};
  ZU::ZUProxy generic{"ZUAudioPlayer", robot.broker()};  // what the service never calls
};

TEST_F(AudioPlayerService, LoadsAndUnloadsSoundSets) {
  proxy.loadSoundSet("tones");  // again: read anew
  EXPECT_THAT(generic.call<std::vector<std::string>>("getLoadedSoundSetsList"),
              ElementsAre("tones"));
  for (const std::string bad : {"bells", "", "../tones", "tones/beep.wav"}) {
    EXPECT_THAT(ko::test::errorOf([&] { proxy.loadSoundSet(bad); }),
                testing::EndsWith("\n\tUnknown sound set \"" + bad + "\""));
  }
  generic.call<void>("unloadSoundSet", "tones");
  EXPECT_TRUE(generic.call<std::vector<std::string>>("getLoadedSoundSetsList").empty());
  EXPECT_THROW(generic.call<void>("unloadSoundSet", "tones"), ZU::ZUError);
}

TEST_F(AudioPlayerService, ARunSoundPlaysTheWholeFile) {
  // As "^runSound(tones/beep, 50)" plays it: synchronous, returning at the end.
  proxy.playSoundSetFile("tones", "beep", 0, 0.5, 0, 0);
  const auto plays = robot.timeline()->entries("ZUAudioPlayer", "playSoundSetFile");
  ASSERT_EQ(plays.size(), 1u);
  EXPECT_DOUBLE_EQ(plays[0].result.to<double>(), 0.2);
  ASSERT_EQ(count("soundEnded"), 1u);
  // The name may carry its extension, in any case; the short form plays the whole file too.
  generic.call<void>("playSoundSetFile", "tones", "beep.wav");
  // A volume above 1 plays at 1.
  proxy.playSoundSetFile("tones", "beep.WAV", 0, 1.5, 0, 0);
  EXPECT_EQ(count("soundEnded"), 3u);
  const auto loud = robot.timeline()->entries("ZUAudioPlayer", "playSoundSetFile").back();
  EXPECT_EQ(loud.arguments.asList().at(2).to<double>(), 1.0);
}

// A posted play ends at its end or at its stop, even a stop that comes before it begins.
TEST_F(AudioPlayerService, PostedPlaysAreWaitedForAndStopped) {
  const int beep = proxy.post_playSoundSetFile("tones", "beep", 0, 0.3, 0, 0);
  EXPECT_FALSE(proxy.wait(beep, 0));  // 0: no limit; false: the play ended
  EXPECT_TRUE(waiter.waitFor("ZUAudioPlayer", "soundEnded"));

  const int id = proxy.post_playSoundSetFile("tones", "Long", 0, 0.3, 0, 0);
  ASSERT_TRUE(waiter.waitFor("ZUAudioPlayer", "playSoundSetFile", 2));
  EXPECT_TRUE(proxy.wait(id, 1));  // still playing
  proxy.stop(id);
  EXPECT_FALSE(proxy.wait(id, kBoundMs));
  EXPECT_TRUE(waiter.waitFor("ZUAudioPlayer", "soundStopped"));

  // A stop that comes before the play begins ends it as it begins: the player's four
  // threads play loops while the fifth play waits for one.
  std::vector<int> loops;
  for (int n = 0; n < 4; ++n)
    loops.push_back(proxy.post_playSoundSetFile("tones", "Long", 0, 1.0, 0, 1));
  ASSERT_TRUE(waiter.waitFor("ZUAudioPlayer", "playSoundSetFile", 6));
  const int waiting = proxy.post_playSoundSetFile("tones", "Long", 0, 1.0, 0, 1);
  proxy.stop(waiting);
  proxy.stop(loops[0]);
  EXPECT_FALSE(proxy.wait(waiting, kBoundMs));
  generic.call<void>("stopAll");
}

TEST_F(AudioPlayerService, StopAllEndsEveryPlay) {
  const int posted = proxy.post_playSoundSetFile("tones", "beep", 0, 1.0, 0, 1);  // looping
  auto direct = std::async(std::launch::async, [this] {
    ZU::ZUAudioPlayerProxy(robot.broker()).playSoundSetFile("tones", "Long", 0, 1.0, 0, 0);
  });
  ASSERT_TRUE(waiter.waitFor("ZUAudioPlayer", "playSoundSetFile", 2));
  generic.call<void>("stopAll");
  EXPECT_FALSE(proxy.wait(posted, kBoundMs));
  ASSERT_EQ(direct.wait_for(std::chrono::milliseconds(kBoundMs)), std::future_status::ready);
  direct.get();
  EXPECT_EQ(count("soundStopped"), 2u);
}

// Each refusal is an error to the caller, and on the timeline with its reason.
TEST_F(AudioPlayerService, BadPlaysAreErrors) {
  const struct {
    const char* set;
    const char* file;
    double position;
    const char* reason;
  } cases[] = {
      {"tones", "boop", 0, "No sound \"boop\" in the sound set \"tones\""},
      {"bells", "ding", 0, "Sound set \"bells\" is not loaded"},
      {"tones", "beep", -1, "The position must be a number of seconds from 0"},
  };
  for (const auto& c : cases) {
    EXPECT_THAT(ko::test::errorOf([&] {
                  generic.call<void>("playSoundSetFile", c.set, c.file, c.position, 1.0, 0.0,
                                     false);
                }),
                HasSubstr(c.reason));
  }
  // A posted play that fails ends its task with the error; nothing keeps playing.
  const int id = proxy.post_playSoundSetFile("tones", "boop", 0, 1.0, 0, 0);
  EXPECT_FALSE(proxy.wait(id, kBoundMs));
  EXPECT_EQ(count("playSoundSetFile"), 0u);
  const auto refused = robot.timeline()->entries("ZUAudioPlayer", "playFailed");
  ASSERT_EQ(refused.size(), std::size(cases) + 1);
  for (std::size_t k = 0; k < std::size(cases); ++k)
    EXPECT_THAT(refused[k].result.to<std::string>(), HasSubstr(cases[k].reason));
}

}  // namespace
}  // namespace robotsim
