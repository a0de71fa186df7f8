#include <cmath>

#include "speechsynthesizer.h"

namespace robotsim {

namespace {

constexpr int kTimingSampleRate = 22050;

// Characters of UTF-8 text (continuation bytes are not counted), white space or not.
std::size_t characterCount(const std::string& text, bool countBlanks) {
  std::size_t n = 0;
  for (const char c : text) {
    if ((static_cast<unsigned char>(c) & 0xC0) != 0x80 &&
        (countBlanks || (c != ' ' && c != '\t' && c != '\n' && c != '\r')))
      ++n;
  }
  return n;
}

class TimingSynthesizer : public SpeechSynthesizer {
 public:
  explicit TimingSynthesizer(double charactersPerSecond)
      : fCharactersPerSecond(charactersPerSecond) {}

  int sampleRate() const override { return kTimingSampleRate; }
  bool producesAudio() const override { return false; }

  std::vector<std::string> languages() const override {
    std::vector<std::string> out;
    for (const auto& [name, voice] : speechLanguageVoices())
      out.push_back(name);
    return out;
  }

  void synthesize(const SpeechScript& script, const SpeechVoiceSettings& voice,
                  std::shared_ptr<SpeechPerformance> performance) override {
    const double speed = voice.speed > 0 ? static_cast<double>(voice.speed) / 100.0 : 1.0;
    const double rate =
        fCharactersPerSecond > 0 ? fCharactersPerSecond : speechCharactersPerSecond(voice.language);
    const double samplesPerCharacter = kTimingSampleRate / (rate * speed);
    // Japanese is written without blanks: those of a text are the ones put around its tags.
    const bool countBlanks = voice.language != "Japanese";
    double position = 0;
    for (const auto& part : script.parts) {
      switch (part.kind) {
        case SpeechScriptPart::Kind::Text:
          position +=
              static_cast<double>(characterCount(part.text, countBlanks)) * samplesPerCharacter;
          break;
        case SpeechScriptPart::Kind::Break:
          position += part.breakMs * (kTimingSampleRate / 1000.0);
          break;
        case SpeechScriptPart::Kind::Mark:
          performance->reportMark(part.mark, static_cast<std::uint64_t>(std::llround(position)));
          break;
      }
    }
    performance->finish(static_cast<std::uint64_t>(std::llround(position)));
  }

 private:
  const double fCharactersPerSecond;
};

}  // namespace

double speechCharactersPerSecond(const std::string& language) {
  // Measured on espeak-ng: Japanese counts kanji, kana and punctuation alike (a kanji
  // often reads as two kana or more), without blanks.
  return language == "Japanese" ? 5.9 : 14.0;
}

std::unique_ptr<SpeechSynthesizer> makeTimingSynthesizer(double charactersPerSecond) {
  return std::make_unique<TimingSynthesizer>(charactersPerSecond);
}

}  // namespace robotsim
