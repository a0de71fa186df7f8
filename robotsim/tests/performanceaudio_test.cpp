// The whole audio of a performance: the speech and the sounds mixed at their times,
// resampled, cut where they were stopped, looped, clipped; measured as the loudness (RMS)
// of stretches of the mix.

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "ko_test_helpers.hpp"
#include "robotsim/performanceaudio.h"
#include "support/sound_files.h"

namespace robotsim {
namespace {

namespace fs = std::filesystem;
using ko::test::ScratchFolder;
using simtest::writeTone;

constexpr int kSpeechRate = 22050;

double rms(const PerformanceAudio& audio, double from, double to) {
  const auto begin = static_cast<std::size_t>(from * audio.sampleRate);
  const auto end = std::min(audio.samples.size(), static_cast<std::size_t>(to * audio.sampleRate));
  double sum = 0;
  for (std::size_t i = begin; i < end; ++i)
    sum += std::pow(audio.samples[i] / 32768.0, 2);
  return end > begin ? std::sqrt(sum / static_cast<double>(end - begin)) : -1.0;
}

struct Sound {
  const char* file;
  double startS;
  std::optional<double> endS;
  double volume;
  bool loop;
  double position;
};

struct Loudness {
  double from, to, rms;
};

struct MixCase {
  const char* name;
  std::vector<Sound> sounds;
  std::optional<double> speechStartS = std::nullopt;  // 0.1 s of speech at half of full scale
  double toS;
  double seconds;  // of the mix
  std::vector<Loudness> loudness = {};
  int peak = -1;  // the largest magnitude, when checked (-1: not)
};

TEST(PerformanceAudio, MixesEverySoundAtItsTime) {
  const ScratchFolder folder;
  writeTone(folder.path() / "tone.wav", 0.3);
  writeTone(folder.path() / "short.wav", 0.1);
  writeTone(folder.path() / "loud.wav", 0.2, 16000, 1, 0.9);
  writeTone(folder.path() / "late.wav", 0.2, 16000, 1, 0.5, 0.2);
  folder.write("broken.wav", "not a sound");
  const double tone = 0.5 / std::sqrt(2.0);  // the RMS of the tone at full volume
  const auto none = std::nullopt;
  const std::vector<MixCase> cases = {
      {.name = "a sound at its time, at its volume",
       .sounds = {{"tone.wav", 0.2, none, 0.5, false, 0}},
       .toS = 0.6,
       .seconds = 0.6,
       .loudness = {{0.0, 0.19, 0}, {0.21, 0.49, tone / 2}, {0.51, 0.6, 0}}},
      {.name = "a stopped sound cut at its stop",
       .sounds = {{"tone.wav", 0.1, 0.25, 1, false, 0}},
       .toS = 0.4,
       .seconds = 0.4,
       .loudness = {{0.11, 0.24, tone}, {0.26, 0.4, 0}}},
      {.name = "a sound past the end lengthens the mix",
       .sounds = {{"tone.wav", 0.2, none, 1, false, 0}},
       .toS = 0.1,
       .seconds = 0.5,
       .loudness = {{0.21, 0.49, tone}}},
      {.name = "a loop until the end",
       .sounds = {{"short.wav", 0, none, 1, true, 0}},
       .toS = 0.5,
       .seconds = 0.5,
       .loudness = {{0.01, 0.49, tone}}},
      {.name = "played from a position",
       .sounds = {{"late.wav", 0.0, none, 1, false, 0.2}},
       .toS = 0.3,
       .seconds = 0.3,
       .loudness = {{0.01, 0.19, tone}, {0.21, 0.3, 0}}},
      {.name = "a sound begun before the start is heard from the start",
       .sounds = {{"tone.wav", -0.2, none, 1, false, 0}},
       .toS = 0.2,
       .seconds = 0.2,
       .loudness = {{0.01, 0.09, tone}, {0.11, 0.2, 0}}},
      {.name = "the speech at its time",
       .sounds = {},
       .speechStartS = 0.05,
       .toS = 0.2,
       .seconds = 0.2,
       .loudness = {{0, 0.049, 0}, {0.05, 0.15, 0.5}, {0.151, 0.2, 0}}},
      {.name = "the speech and a sound add up",
       .sounds = {{"tone.wav", 0.0, none, 1, false, 0}},
       .speechStartS = 0.0,
       .toS = 0.1,
       .seconds = 0.3,
       .loudness = {{0.0, 0.1, std::sqrt(0.25 + tone * tone)}}},
      {.name = "a sum beyond full scale is clipped",
       .sounds = {{"loud.wav", 0, none, 1, false, 0}, {"loud.wav", 0, none, 1, false, 0}},
       .toS = 0.2,
       .seconds = 0.2,
       .peak = 32767},
      {.name = "an unreadable file is left out",
       .sounds = {{"broken.wav", 0, none, 1, false, 0}},
       .toS = 0.1,
       .seconds = 0.1,
       .loudness = {{0, 0.1, 0}}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    PerformanceSpeech speech;
    speech.sampleRate = kSpeechRate;
    if (c.speechStartS) {
      speech.samples.assign(kSpeechRate / 10, 16384);
      speech.startUs = static_cast<std::int64_t>(*c.speechStartS * 1e6);
    }
    std::vector<PerformanceSound> sounds;
    for (const auto& s : c.sounds) {
      PerformanceSound sound;
      sound.file = folder.path() / s.file;
      sound.startUs = static_cast<std::int64_t>(s.startS * 1e6);
      if (s.endS)
        sound.endUs = static_cast<std::int64_t>(*s.endS * 1e6);
      sound.volume = s.volume;
      sound.loop = s.loop;
      sound.position = s.position;
      sounds.push_back(sound);
    }
    std::vector<std::string> skipped;
    const PerformanceAudio audio =
        mixPerformanceAudio(speech, sounds, 0, static_cast<std::int64_t>(c.toS * 1e6), &skipped);
    EXPECT_EQ(audio.sampleRate, kSpeechRate);
    EXPECT_NEAR(audio.seconds(), c.seconds, 0.002);
    EXPECT_EQ(skipped.size(),
              std::string(c.name).find("unreadable") != std::string::npos ? 1u : 0u);
    for (const auto& l : c.loudness)
      EXPECT_NEAR(rms(audio, l.from, l.to), l.rms, 0.02 + l.rms * 0.05)
          << l.from << " s to " << l.to << " s";
    if (c.peak >= 0) {
      int peak = 0;
      for (const auto s : audio.samples)
        peak = std::max(peak, std::abs(static_cast<int>(s)));
      EXPECT_EQ(peak, c.peak);
    }
  }
}

}  // namespace
}  // namespace robotsim
