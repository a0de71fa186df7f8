#include <espeak-ng/speak_lib.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <condition_variable>
#include <deque>
#include <functional>
#include <future>
#include <mutex>
#include <stdexcept>
#include <thread>

#include "ko/log.hpp"
#include "speechjapanese.h"
#include "speechsynthesizer.h"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.texttospeech";

// The one thread of the process that owns espeak-ng (which keeps global state and is
// not thread-safe): it initialises the library and runs every call into it, one job at a
// time. Shared by every espeak-ng synthesizer of the process; jobs
// are posted from any thread.
class SpeechEspeakThread {
 public:
  // Started on first use and never stopped: espeak-ng cannot be terminated and
  // initialised again reliably, so the thread lives as long as the process.
  static SpeechEspeakThread& instance() {
    static SpeechEspeakThread* const thread = new SpeechEspeakThread();
    return *thread;
  }

  SpeechEspeakThread(const SpeechEspeakThread&) = delete;
  SpeechEspeakThread& operator=(const SpeechEspeakThread&) = delete;

  int sampleRate() const noexcept { return fSampleRate; }
  const std::vector<std::string>& languages() const noexcept { return fLanguages; }

  void post(std::function<void()> job) {
    {
      std::lock_guard lock(fMutex);
      fJobs.push_back(std::move(job));
    }
    fQueued.notify_one();
  }

  // On the thread: speaks `ssml` into the performance; `sources` maps its characters to
  // the caller's text, for the words.
  void synthesize(const std::string& ssml, const std::vector<SpeechSourceSpan>& sources,
                  const SpeechVoiceSettings& voice,
                  const std::shared_ptr<SpeechPerformance>& performance) {
    const auto& table = speechLanguageVoices();
    const auto it = std::find_if(table.begin(), table.end(),
                                 [&](const auto& entry) { return entry.first == voice.language; });
    const std::string voiceName = it != table.end() ? it->second : "en";
    if (voiceName != fVoice) {
      if (espeak_SetVoiceByName(voiceName.c_str()) != EE_OK) {
        performance->fail("espeak-ng has no voice " + voiceName);
        return;
      }
      fVoice = voiceName;
    }
    const double speed = std::clamp(static_cast<double>(voice.speed), 10.0, 1000.0) / 100.0;
    const int rate =
        static_cast<int>(std::clamp(std::lround(espeakRATE_NORMAL * speed),
                                    long{espeakRATE_MINIMUM}, long{espeakRATE_MAXIMUM}));
    const float shift = voice.pitchShift > 0 ? voice.pitchShift : 1.0F;
    const int pitch = static_cast<int>(std::clamp(std::lround(50.0F * shift), 0L, 100L));
    const int volume = static_cast<int>(std::clamp(std::lround(100.0F * voice.volume), 0L, 200L));
    espeak_SetParameter(espeakRATE, rate, 0);
    espeak_SetParameter(espeakPITCH, pitch, 0);
    espeak_SetParameter(espeakVOLUME, volume, 0);

    fPerformance = performance.get();
    fSources = &sources;
    fLastWord = std::string::npos;
    fSamples = 0;
    const espeak_ERROR result = espeak_Synth(ssml.c_str(), ssml.size() + 1, 0, POS_CHARACTER, 0,
                                             espeakCHARS_UTF8 | espeakSSML, nullptr, nullptr);
    fPerformance = nullptr;
    fSources = nullptr;
    if (result != EE_OK && !performance->isCancelled()) {
      performance->fail("espeak-ng could not synthesise the text (error " +
                        std::to_string(static_cast<int>(result)) + ")");
      return;
    }
    performance->finish(fSamples);
  }

 private:
  SpeechEspeakThread() {
    std::promise<void> ready;
    auto started = ready.get_future();
    fThread = std::thread([this, ready = std::move(ready)]() mutable { run(ready); });
    try {
      started.get();
    } catch (...) {
      fThread.join();
      throw;
    }
    fThread.detach();
  }

  void run(std::promise<void>& ready) {
    const int rate =
        espeak_Initialize(AUDIO_OUTPUT_SYNCHRONOUS, 100, nullptr, espeakINITIALIZE_DONT_EXIT);
    if (rate <= 0) {
      ready.set_exception(
          std::make_exception_ptr(std::runtime_error("espeak-ng could not be initialised")));
      return;
    }
    fSampleRate = rate;
    sCurrent = this;
    espeak_SetSynthCallback(&SpeechEspeakThread::onSynth);
    for (const auto& [name, voice] : speechLanguageVoices()) {
      if (espeak_SetVoiceByName(voice.c_str()) == EE_OK)
        fLanguages.push_back(name);
    }
    ready.set_value();

    for (;;) {
      std::function<void()> job;
      {
        std::unique_lock lock(fMutex);
        fQueued.wait(lock, [this] { return !fJobs.empty(); });
        job = std::move(fJobs.front());
        fJobs.pop_front();
      }
      try {
        job();
      } catch (const std::exception& e) {
        KO_LOG_ERROR(kCategory) << "espeak-ng job failed: " << e.what();
      }
    }
  }

  // espeak-ng's callback, on the thread, during espeak_Synth.
  static int onSynth(short* wav, int count, espeak_EVENT* events) {
    SpeechEspeakThread* self = sCurrent;
    if (!self || !self->fPerformance)
      return 0;
    SpeechPerformance& performance = *self->fPerformance;
    for (espeak_EVENT* e = events; e && e->type != espeakEVENT_LIST_TERMINATED; ++e) {
      const std::uint64_t sample =
          e->sample >= 0 ? static_cast<std::uint64_t>(e->sample)
                         : static_cast<std::uint64_t>(std::max(e->audio_position, 0)) *
                               static_cast<std::uint64_t>(self->fSampleRate) / 1000U;
      if (e->type == espeakEVENT_WORD) {
        self->xWord(*e, sample);
        continue;
      }
      if (e->type != espeakEVENT_MARK || !e->id.name)
        continue;
      std::size_t index = 0;
      const std::string_view name(e->id.name);
      const auto [end, ec] = std::from_chars(name.data(), name.data() + name.size(), index);
      if (ec != std::errc() || end != name.data() + name.size())
        continue;
      performance.reportMark(index, sample);
    }
    if (wav && count > 0) {
      performance.appendAudio(wav, static_cast<std::size_t>(count));
      self->fSamples += static_cast<std::uint64_t>(count);
    }
    return performance.isCancelled() ? 1 : 0;
  }

  // A word event: its characters of the SSML (from 1) back to the caller's text. espeak-ng
  // tells a word spelt letter by letter once per letter; it is kept once.
  void xWord(const espeak_EVENT& e, std::uint64_t sample) {
    if (!fSources || e.text_position <= 0)
      return;
    const auto first = static_cast<std::size_t>(e.text_position - 1);
    const std::size_t last =
        std::min(first + static_cast<std::size_t>(std::max(e.length, 1)), fSources->size());
    std::size_t begin = std::string::npos;
    std::size_t end = 0;
    for (std::size_t i = first; i < last; ++i) {
      const SpeechSourceSpan& span = (*fSources)[i];
      if (span.begin == span.end)
        continue;
      begin = std::min(begin, span.begin);
      end = std::max(end, span.end);
    }
    if (begin == std::string::npos || begin == fLastWord)
      return;
    fLastWord = begin;
    fPerformance->reportWord(begin, end - begin, sample);
  }

  static inline SpeechEspeakThread* sCurrent = nullptr;  // only the thread reads it

  std::thread fThread;
  std::mutex fMutex;
  std::condition_variable fQueued;
  std::deque<std::function<void()>> fJobs;
  // Touched by the thread only (the constructor reads the first two once it is ready).
  int fSampleRate = 0;
  std::vector<std::string> fLanguages;
  std::string fVoice;
  SpeechPerformance* fPerformance = nullptr;
  const std::vector<SpeechSourceSpan>* fSources = nullptr;
  std::size_t fLastWord = std::string::npos;  // where the last word began
  std::uint64_t fSamples = 0;
};

class EspeakSynthesizer : public SpeechSynthesizer {
 public:
  EspeakSynthesizer() : fThread(SpeechEspeakThread::instance()) {}

  int sampleRate() const override { return fThread.sampleRate(); }
  bool producesAudio() const override { return true; }
  std::vector<std::string> languages() const override { return fThread.languages(); }

  // Japanese is read into kana here, in the caller's thread.
  void synthesize(const SpeechScript& script, const SpeechVoiceSettings& voice,
                  std::shared_ptr<SpeechPerformance> performance) override {
    std::vector<SpeechSourceSpan> sources;
    std::string ssml;
    try {
      ssml = voice.language == "Japanese"
                 ? toEspeakSsml(JapaneseReadings::shared().read(script), &sources)
                 : toEspeakSsml(script, &sources);
    } catch (const std::exception& e) {
      performance->fail(e.what());
      return;
    }
    fThread.post([thread = &fThread, ssml = std::move(ssml), sources = std::move(sources), voice,
                  performance = std::move(performance)] {
      if (performance->isCancelled()) {
        performance->finish(0);
        return;
      }
      thread->synthesize(ssml, sources, voice, performance);
    });
  }

 private:
  SpeechEspeakThread& fThread;
};

}  // namespace

SpeechSynthesizer::~SpeechSynthesizer() = default;

const std::vector<std::pair<std::string, std::string>>& speechLanguageVoices() {
  static const std::vector<std::pair<std::string, std::string>> table = {
      {"English", "en"},    {"French", "fr"},       {"Japanese", "ja"}, {"German", "de"},
      {"Spanish", "es"},    {"Italian", "it"},      {"Chinese", "cmn"}, {"Korean", "ko"},
      {"Portuguese", "pt"}, {"Brazilian", "pt-BR"}, {"Dutch", "nl"},    {"Russian", "ru"},
      {"Polish", "pl"},     {"Swedish", "sv"},      {"Finnish", "fi"},  {"Danish", "da"},
      {"Czech", "cs"},      {"Greek", "el"},        {"Turkish", "tr"},  {"Arabic", "ar"},
  };
  return table;
}

std::unique_ptr<SpeechSynthesizer> makeEspeakSynthesizer() {
  return std::make_unique<EspeakSynthesizer>();
}

}  // namespace robotsim
