#include "robotsim/performanceaudio.h"

#include <samplerate.h>
#include <sndfile.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <memory>

#include "robotsim/robot.h"

namespace robotsim {

namespace {

using SoundFilePtr = std::unique_ptr<SNDFILE, int (*)(SNDFILE*)>;

std::size_t samplesAt(std::int64_t us, int rate) {
  return us <= 0 ? 0 : static_cast<std::size_t>(static_cast<double>(us) * rate / 1e6 + 0.5);
}

// A sound file's samples as mono floats at `rate`.
std::vector<float> readMono(const std::filesystem::path& path, int rate) {
  SF_INFO info{};
  SoundFilePtr file(sf_open(path.c_str(), SFM_READ, &info), &sf_close);
  if (!file)
    throw PerformanceAudioError(path.string() + ": " + sf_strerror(nullptr));
  if (info.channels <= 0 || info.samplerate <= 0)
    throw PerformanceAudioError(path.string() + ": no sound");
  std::vector<float> frames(static_cast<std::size_t>(info.frames) *
                            static_cast<std::size_t>(info.channels));
  const sf_count_t read = sf_readf_float(file.get(), frames.data(), info.frames);
  std::vector<float> mono(static_cast<std::size_t>(std::max<sf_count_t>(read, 0)));
  const auto channels = static_cast<std::size_t>(info.channels);
  for (std::size_t i = 0; i < mono.size(); ++i) {
    float sum = 0;
    for (std::size_t c = 0; c < channels; ++c)
      sum += frames[i * channels + c];
    mono[i] = sum / static_cast<float>(channels);
  }
  if (info.samplerate == rate || mono.empty())
    return mono;
  const double ratio = static_cast<double>(rate) / info.samplerate;
  std::vector<float> out(
      static_cast<std::size_t>(std::ceil(static_cast<double>(mono.size()) * ratio)) + 1);
  SRC_DATA data{};
  data.data_in = mono.data();
  data.input_frames = static_cast<long>(mono.size());
  data.data_out = out.data();
  data.output_frames = static_cast<long>(out.size());
  data.src_ratio = ratio;
  if (const int error = src_simple(&data, SRC_SINC_MEDIUM_QUALITY, 1); error != 0)
    throw PerformanceAudioError(path.string() + ": " + src_strerror(error));
  out.resize(static_cast<std::size_t>(data.output_frames_gen));
  return out;
}

// libsndfile's virtual file over a string, for writing.
struct MemoryFile {
  std::string bytes;
  sf_count_t at = 0;
};

SF_VIRTUAL_IO memoryIo() {
  SF_VIRTUAL_IO io{};
  io.get_filelen = [](void* user) {
    return static_cast<sf_count_t>(static_cast<MemoryFile*>(user)->bytes.size());
  };
  io.seek = [](sf_count_t offset, int whence, void* user) {
    auto* file = static_cast<MemoryFile*>(user);
    const sf_count_t base = whence == SEEK_CUR   ? file->at
                            : whence == SEEK_END ? static_cast<sf_count_t>(file->bytes.size())
                                                 : 0;
    file->at = std::max<sf_count_t>(0, base + offset);
    return file->at;
  };
  io.read = [](void* out, sf_count_t count, void* user) {
    auto* file = static_cast<MemoryFile*>(user);
    const auto size = static_cast<sf_count_t>(file->bytes.size());
    const sf_count_t n = std::clamp<sf_count_t>(size - file->at, 0, count);
    std::memcpy(out, file->bytes.data() + file->at, static_cast<std::size_t>(n));
    file->at += n;
    return n;
  };
  io.write = [](const void* in, sf_count_t count, void* user) {
    auto* file = static_cast<MemoryFile*>(user);
    const auto end = static_cast<std::size_t>(file->at + count);
    if (file->bytes.size() < end)
      file->bytes.resize(end);
    std::memcpy(file->bytes.data() + file->at, in, static_cast<std::size_t>(count));
    file->at += count;
    return count;
  };
  io.tell = [](void* user) { return static_cast<MemoryFile*>(user)->at; };
  return io;
}

void writeSamples(SNDFILE* file, const PerformanceAudio& audio, const std::string& name) {
  const auto count = static_cast<sf_count_t>(audio.samples.size());
  if (sf_write_short(file, audio.samples.data(), count) != count)
    throw PerformanceAudioError("cannot write " + name + ": " + sf_strerror(file));
}

SF_INFO wavInfo(const PerformanceAudio& audio) {
  SF_INFO info{};
  info.samplerate = audio.sampleRate;
  info.channels = 1;
  info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
  return info;
}

}  // namespace

PerformanceAudio mixPerformanceAudio(const PerformanceSpeech& speech,
                                     const std::vector<PerformanceSound>& sounds,
                                     std::int64_t fromUs, std::int64_t toUs,
                                     std::vector<std::string>* skipped) {
  PerformanceAudio out;
  out.sampleRate = speech.sampleRate > 0 ? speech.sampleRate : 22050;
  const int rate = out.sampleRate;
  std::vector<float> mix(samplesAt(toUs - fromUs, rate), 0.0F);
  // Adds `track` (from its sample `skip` on, `count` samples, looping when asked) at
  // sample `at` of the mix, which grows to hold it.
  const auto add = [&mix](const std::vector<float>& track, std::int64_t at, std::size_t skip,
                          std::size_t count, bool loop, float gain) {
    if (track.empty())
      return;
    if (at < 0) {
      const auto before = static_cast<std::size_t>(-at);
      if (before >= count)
        return;
      skip += before;
      count -= before;
      at = 0;
    }
    const auto start = static_cast<std::size_t>(at);
    if (mix.size() < start + count)
      mix.resize(start + count, 0.0F);
    for (std::size_t i = 0; i < count; ++i) {
      const std::size_t k = skip + i;
      if (!loop && k >= track.size())
        break;
      mix[start + i] += gain * track[k % track.size()];
    }
  };

  if (speech.startUs && !speech.samples.empty()) {
    std::vector<float> track(speech.samples.size());
    std::transform(speech.samples.begin(), speech.samples.end(), track.begin(),
                   [](std::int16_t s) { return static_cast<float>(s) / 32768.0F; });
    const auto at = static_cast<std::int64_t>(samplesAt(*speech.startUs - fromUs, rate)) -
                    static_cast<std::int64_t>(samplesAt(fromUs - *speech.startUs, rate));
    add(track, at, 0, track.size(), false, 1.0F);
  }
  for (const auto& sound : sounds) {
    std::vector<float> track;
    try {
      track = readMono(sound.file, rate);
    } catch (const PerformanceAudioError& e) {
      if (skipped)
        skipped->push_back(e.what());
      continue;
    }
    const std::size_t skip = std::min(
        track.size(), static_cast<std::size_t>(std::max(0.0, sound.position) * rate + 0.5));
    std::size_t count = sound.loop ? samplesAt(toUs - sound.startUs, rate) : track.size() - skip;
    if (sound.endUs)
      count = std::min(count, samplesAt(*sound.endUs - sound.startUs, rate));
    const auto at = static_cast<std::int64_t>(samplesAt(sound.startUs - fromUs, rate)) -
                    static_cast<std::int64_t>(samplesAt(fromUs - sound.startUs, rate));
    add(track, at, skip, count, sound.loop, static_cast<float>(std::clamp(sound.volume, 0.0, 1.0)));
  }

  out.samples.resize(mix.size());
  std::transform(mix.begin(), mix.end(), out.samples.begin(), [](float v) {
    return static_cast<std::int16_t>(std::lrint(std::clamp(v, -1.0F, 1.0F) * 32767.0F));
  });
  return out;
}

PerformanceAudio mixPerformanceAudio(const Robot& robot, std::int64_t fromUs, std::int64_t toUs,
                                     std::vector<std::string>* skipped) {
  const Timeline& timeline = *robot.timeline();
  PerformanceSpeech speech;
  if (robot.speech()) {
    SpeechAudio audio = robot.speech()->recordedAudio();
    speech.sampleRate = audio.sampleRate;
    speech.samples = std::move(audio.samples);
    if (audio.start)
      speech.startUs = timeline.usAt(*audio.start);
  }
  std::vector<PerformanceSound> sounds;
  if (robot.audioPlayer()) {
    for (const auto& play : robot.audioPlayer()->playRecords()) {
      PerformanceSound sound;
      sound.file = play.file;
      sound.position = play.position;
      sound.volume = play.volume;
      sound.loop = play.loop;
      sound.startUs = timeline.usAt(play.start);
      if (play.end)
        sound.endUs = timeline.usAt(*play.end);
      sounds.push_back(std::move(sound));
    }
  }
  return mixPerformanceAudio(speech, sounds, fromUs, toUs, skipped);
}

void writeWav(const PerformanceAudio& audio, const std::filesystem::path& path) {
  SF_INFO info = wavInfo(audio);
  SoundFilePtr file(sf_open(path.c_str(), SFM_WRITE, &info), &sf_close);
  if (!file)
    throw PerformanceAudioError("cannot write " + path.string() + ": " + sf_strerror(nullptr));
  writeSamples(file.get(), audio, path.string());
}

std::string wavBytes(const PerformanceAudio& audio) {
  SF_INFO info = wavInfo(audio);
  MemoryFile memory;
  SF_VIRTUAL_IO io = memoryIo();
  {
    SoundFilePtr file(sf_open_virtual(&io, SFM_WRITE, &info, &memory), &sf_close);
    if (!file)
      throw PerformanceAudioError(std::string("cannot make a WAV: ") + sf_strerror(nullptr));
    writeSamples(file.get(), audio, "the WAV");
  }
  return std::move(memory.bytes);
}

}  // namespace robotsim
