// The audio player driven through its proxy as the director drives it: sound sets, plays
// that last the real duration of their WAV files, posted plays stopped and waited for.

#include <chrono>
#include <cmath>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sndfile.h>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "robotsim/soundlibrary.h"
#include "robotsim/timeline.h"
#include "robotsim/zuaudioplayer.h"
#include "support/scratch_folder.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {
namespace {

namespace fs = std::filesystem;
using simtest::ScratchFolder;
using simtest::TimelineWaiter;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr auto kBound = std::chrono::seconds(10);
constexpr int kBoundMs = 10000;

// A WAV file of `frames` frames of a quiet tone.
void writeWav(const fs::path& file, int rate, int channels, sf_count_t frames) {
  fs::create_directories(file.parent_path());
  SF_INFO info{};
  info.samplerate = rate;
  info.channels = channels;
  info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
  SNDFILE* sound = sf_open(file.c_str(), SFM_WRITE, &info);
  ASSERT_NE(sound, nullptr) << sf_strerror(nullptr);
  std::vector<short> samples(static_cast<std::size_t>(frames * channels));
  for (std::size_t i = 0; i < samples.size(); ++i)
    samples[i] = static_cast<short>(1000.0 * std::sin(static_cast<double>(i) * 0.05));
  EXPECT_EQ(sf_writef_short(sound, samples.data(), frames), frames);
  sf_close(sound);
}

struct DurationCase {
  const char* name;
  int rate;
  int channels;
  sf_count_t frames;
  double seconds;
};

TEST(SoundFiles, DurationsComeFromTheFiles) {
  const DurationCase cases[] = {
      {"short.wav", 8000, 1, 2000, 0.25},
      {"stereo.wav", 16000, 2, 4000, 0.25},
      {"odd.wav", 44100, 1, 22050, 0.5},
      {"empty.wav", 8000, 1, 0, 0.0},
  };
  ScratchFolder folder;
  for (const auto& c : cases) {
    writeWav(folder.path() / "set" / c.name, c.rate, c.channels, c.frames);
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
}

class AudioPlayerService : public testing::Test {
 protected:
  AudioPlayerService() {
    writeWav(folder_.path() / "tones" / "beep.wav", 8000, 1, 1600);   // 0.2 s
    writeWav(folder_.path() / "tones" / "Long.WAV", 8000, 1, 80000);  // 10 s
    session_ = std::make_shared<ko::Session>();
    broker_ = ZU::ZUBroker::create(session_);
    timeline_ = std::make_shared<Timeline>();
    waiter_ = std::make_unique<TimelineWaiter>(*timeline_);
    player_ = ZU::ZUModule::createModule<ZUAudioPlayer>(broker_, "ZUAudioPlayer", timeline_,
                                                        folder_.path().string());
    proxy_ = std::make_unique<ZU::ZUAudioPlayerProxy>(broker_);
    generic_ = std::make_unique<ZU::ZUProxy>("ZUAudioPlayer", broker_);
  }

  ScratchFolder folder_;
  std::shared_ptr<ko::Session> session_;
  std::shared_ptr<ZU::ZUBroker> broker_;
  std::shared_ptr<Timeline> timeline_;
  std::unique_ptr<TimelineWaiter> waiter_;
  std::shared_ptr<ZUAudioPlayer> player_;
  std::unique_ptr<ZU::ZUAudioPlayerProxy> proxy_;
  std::unique_ptr<ZU::ZUProxy> generic_;
};

TEST_F(AudioPlayerService, LoadsAndUnloadsSoundSets) {
  proxy_->loadSoundSet("tones");
  proxy_->loadSoundSet("tones");  // again: read anew
  EXPECT_THAT(generic_->call<std::vector<std::string>>("getLoadedSoundSetsList"),
              ElementsAre("tones"));
  for (const std::string bad : {"bells", "", "../tones", "tones/beep.wav"}) {
    try {
      proxy_->loadSoundSet(bad);
      ADD_FAILURE() << bad << " loaded";
    } catch (const ZU::ZUError& e) {
      EXPECT_EQ(e.description(), "Unknown sound set \"" + bad + "\"");
    }
  }
  generic_->call<void>("unloadSoundSet", "tones");
  EXPECT_TRUE(generic_->call<std::vector<std::string>>("getLoadedSoundSetsList").empty());
  EXPECT_THROW(generic_->call<void>("unloadSoundSet", "tones"), ZU::ZUError);
}

TEST_F(AudioPlayerService, ARunSoundPlaysTheWholeFile) {
  proxy_->loadSoundSet("tones");
  // As "^runSound(tones/beep, 50)" plays it: synchronous, returning at the end.
  proxy_->playSoundSetFile("tones", "beep", 0, 0.5, 0, 0);
  const auto plays = timeline_->entries("ZUAudioPlayer", "playSoundSetFile");
  ASSERT_EQ(plays.size(), 1u);
  EXPECT_DOUBLE_EQ(plays[0].result.to<double>(), 0.2);
  EXPECT_EQ(timeline_->entries("ZUAudioPlayer", "soundEnded").size(), 1u);
  EXPECT_LE(plays[0].us, timeline_->entries("ZUAudioPlayer", "soundEnded")[0].us);

  // The name may carry its extension, in any case; the short form plays the whole file too.
  generic_->call<void>("playSoundSetFile", "tones", "beep.wav");
  // A volume above 1 plays at 1.
  proxy_->playSoundSetFile("tones", "beep.WAV", 0, 1.5, 0, 0);
  EXPECT_EQ(timeline_->entries("ZUAudioPlayer", "soundEnded").size(), 3u);
  const auto loud = timeline_->entries("ZUAudioPlayer", "playSoundSetFile").back();
  EXPECT_EQ(loud.arguments.asList().at(2).to<double>(), 1.0);
}

TEST_F(AudioPlayerService, PostedPlaysAreWaitedForAndStopped) {
  proxy_->loadSoundSet("tones");
  const int beep = proxy_->post_playSoundSetFile("tones", "beep", 0, 0.3, 0, 0);
  EXPECT_FALSE(proxy_->wait(beep, 0));  // 0: no limit; false: the play ended
  EXPECT_TRUE(waiter_->waitFor("ZUAudioPlayer", "soundEnded"));

  const int id = proxy_->post_playSoundSetFile("tones", "Long", 0, 0.3, 0, 0);
  ASSERT_TRUE(waiter_->waitFor("ZUAudioPlayer", "playSoundSetFile", 2));
  EXPECT_TRUE(proxy_->wait(id, 1));  // still playing
  proxy_->stop(id);
  EXPECT_FALSE(proxy_->wait(id, kBoundMs));
  EXPECT_TRUE(waiter_->waitFor("ZUAudioPlayer", "soundStopped"));
}

TEST_F(AudioPlayerService, AStopBeforeThePlayBeginsEndsIt) {
  proxy_->loadSoundSet("tones");
  const int id = proxy_->post_playSoundSetFile("tones", "Long", 0, 1.0, 0, 1);  // looping
  proxy_->stop(id);
  EXPECT_FALSE(proxy_->wait(id, kBoundMs));
}

TEST_F(AudioPlayerService, StopAllEndsEveryPlay) {
  proxy_->loadSoundSet("tones");
  const int posted = proxy_->post_playSoundSetFile("tones", "beep", 0, 1.0, 0, 1);  // looping
  auto direct = std::async(std::launch::async, [this] {
    ZU::ZUAudioPlayerProxy(broker_).playSoundSetFile("tones", "Long", 0, 1.0, 0, 0);
  });
  ASSERT_TRUE(waiter_->waitFor("ZUAudioPlayer", "playSoundSetFile", 2));
  generic_->call<void>("stopAll");
  EXPECT_FALSE(proxy_->wait(posted, kBoundMs));
  ASSERT_EQ(direct.wait_for(kBound), std::future_status::ready);
  direct.get();
  EXPECT_EQ(timeline_->entries("ZUAudioPlayer", "soundStopped").size(), 2u);
}

TEST_F(AudioPlayerService, BadPlaysAreErrors) {
  struct BadPlay {
    const char* set;
    const char* file;
    double position;
    const char* reason;
  };
  const BadPlay cases[] = {
      {"tones", "boop", 0, "No sound \"boop\" in the sound set \"tones\""},
      {"bells", "ding", 0, "Sound set \"bells\" is not loaded"},
      {"tones", "beep", -1, "The position must be a number of seconds from 0"},
  };
  proxy_->loadSoundSet("tones");
  for (const auto& c : cases) {
    try {
      generic_->call<void>("playSoundSetFile", c.set, c.file, c.position, 1.0, 0.0, false);
      ADD_FAILURE() << c.reason;
    } catch (const ZU::ZUError& e) {
      EXPECT_THAT(e.description(), HasSubstr(c.reason));
    }
  }
  // A posted play that fails ends its task with the error; nothing keeps playing.
  const int id = proxy_->post_playSoundSetFile("tones", "boop", 0, 1.0, 0, 0);
  EXPECT_FALSE(proxy_->wait(id, kBoundMs));
  EXPECT_TRUE(timeline_->entries("ZUAudioPlayer", "playSoundSetFile").empty());
  // Each refusal is on the timeline, with its reason.
  const auto refused = timeline_->entries("ZUAudioPlayer", "playFailed");
  ASSERT_EQ(refused.size(), std::size(cases) + 1);
  for (std::size_t k = 0; k < std::size(cases); ++k)
    EXPECT_THAT(refused[k].result.to<std::string>(), HasSubstr(cases[k].reason));
}

TEST(StarterSounds, BellsAreShortRealSounds) {
  auto session = std::make_shared<ko::Session>();
  auto broker = ZU::ZUBroker::create(session);
  auto timeline = std::make_shared<Timeline>();
  auto player = ZU::ZUModule::createModule<ZUAudioPlayer>(broker, "ZUAudioPlayer", timeline);
  ZU::ZUAudioPlayerProxy proxy(broker);
  proxy.loadSoundSet("bells");
  for (const std::string name : {"ding", "dong", "chime"}) {
    proxy.playSoundSetFile("bells", name, 0, 0.5, 0, 0);
    const auto plays = timeline->entries("ZUAudioPlayer", "playSoundSetFile");
    ASSERT_FALSE(plays.empty());
    const double seconds = plays.back().result.to<double>();
    EXPECT_GE(seconds, 0.1) << name;
    EXPECT_LE(seconds, 1.0) << name;
  }
}

}  // namespace
}  // namespace robotsim
