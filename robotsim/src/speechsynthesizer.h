#pragma once
// The speech engine's synthesis backends: espeak-ng (real audio, on the one thread of the
// process that owns espeak-ng, with the words' audio times; Japanese read into kana
// first, in the caller's thread) and a timing-only estimate from the text. Both write
// into a SpeechPerformance and report the same bookmarks in the same order.
//
// A synthesizer's functions may be called from any thread.

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "robotsim/speechscript.h"
#include "speechperformance.h"

namespace robotsim {

// The voice that a text is spoken with; a copy travels with each text.
struct SpeechVoiceSettings {
  std::string language = "English";
  float speed = 100.0F;     // percent of the normal speed
  float pitchShift = 1.0F;  // 1 normal; 0 leaves the pitch alone
  float volume = 1.0F;      // 0 to 1
};

// The languages that the engine knows, by their names ("English") and espeak-ng voices.
const std::vector<std::pair<std::string, std::string>>& speechLanguageVoices();

class SpeechSynthesizer {
 public:
  virtual ~SpeechSynthesizer();
  virtual int sampleRate() const = 0;
  virtual bool producesAudio() const = 0;
  // The names of the languages that the backend can speak, in the table's order.
  virtual std::vector<std::string> languages() const = 0;
  // Starts the synthesis of `script`; the performance receives the audio, the marks and
  // the end (or the error). May return before synthesis is done.
  virtual void synthesize(const SpeechScript& script, const SpeechVoiceSettings& voice,
                          std::shared_ptr<SpeechPerformance> performance) = 0;
};

// Raises std::runtime_error when espeak-ng cannot be initialised.
std::unique_ptr<SpeechSynthesizer> makeEspeakSynthesizer();
// How many characters of a text, as written, espeak-ng speaks a second in `language` at
// speed 100.
double speechCharactersPerSecond(const std::string& language);
// Durations of the text at `charactersPerSecond` characters a second at speed 100 (0: the
// language's own rate), pauses as written; no audio, at espeak-ng's sample rate, and no
// words.
std::unique_ptr<SpeechSynthesizer> makeTimingSynthesizer(double charactersPerSecond);

}  // namespace robotsim
