#pragma once
// Writes the WAV files of the sound tests.

#include <sndfile.h>

#include <cmath>
#include <filesystem>
#include <numbers>
#include <stdexcept>
#include <vector>

namespace robotsim::simtest {

// A 16-bit WAV file (its folders made as needed): `silence` seconds of silence, then
// `seconds` of a 440 Hz tone of that amplitude of full scale, in every channel.
inline void writeTone(const std::filesystem::path& file, double seconds, int rate = 16000,
                      int channels = 1, double amplitude = 0.5, double silence = 0) {
  std::filesystem::create_directories(file.parent_path());
  SF_INFO info{};
  info.samplerate = rate;
  info.channels = channels;
  info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
  SNDFILE* sound = sf_open(file.c_str(), SFM_WRITE, &info);
  if (!sound)
    throw std::runtime_error(sf_strerror(nullptr));
  const auto quiet = static_cast<std::size_t>(std::lround(silence * rate) * channels);
  std::vector<float> samples(quiet +
                             static_cast<std::size_t>(std::lround(seconds * rate) * channels));
  for (std::size_t i = quiet; i < samples.size(); ++i) {
    const double t = static_cast<double>(i / static_cast<std::size_t>(channels)) / rate;
    samples[i] = static_cast<float>(amplitude * std::sin(2 * std::numbers::pi * 440.0 * t));
  }
  sf_write_float(sound, samples.data(), static_cast<sf_count_t>(samples.size()));
  sf_close(sound);
}

}  // namespace robotsim::simtest
