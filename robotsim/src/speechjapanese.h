#pragma once
// JapaneseReadings: a Japanese text as espeak-ng's Japanese voice reads it well, in kana.
// espeak-ng reads kana only; kanji come out as filler. MeCab with IPADIC (Debian's
// mecab-ipadic-utf8) cuts the whole text, its tags taken out, into words, and each word
// is written as its pronunciation ("今日は" → "キョー ワ" with the particle read "wa"):
// numbers written in digits as Japanese numbers, full-width letters and digits as ASCII,
// Latin words in an English span, kanji that the dictionary cannot read left out (each
// logged once). Words are parted by blanks, as kana-only Japanese is written, with
// particles, endings and punctuation kept with the word before them. Each bookmark and
// pause moves to the nearest edge of the word it was written in, in the order written,
// so a reading never depends on where the tags are.
//
// Threads: read() may run in any number of threads at once; shared() makes the process's
// one model on its first successful call.

#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <string_view>

#include "robotsim/speechscript.h"

namespace robotsim {

class JapaneseReadings {
 public:
  // Where Debian installs the UTF-8 dictionary.
  static constexpr const char* kDictionary = "/var/lib/mecab/dic/ipadic-utf8";

  // The process's reader, on the dictionary at kDictionary. Raises std::runtime_error,
  // saying what is missing, when it cannot be made; a later call tries again.
  static const JapaneseReadings& shared();

  // Raises std::runtime_error when `dictionary` holds no MeCab dictionary.
  explicit JapaneseReadings(const std::string& dictionary);
  ~JapaneseReadings();
  JapaneseReadings(const JapaneseReadings&) = delete;
  JapaneseReadings& operator=(const JapaneseReadings&) = delete;

  // `written`'s text as read, with the same marks, pauses and notes. Its parts map back
  // to the caller's text as a whole (SpeechScriptPart::reading). Raises
  // std::runtime_error when MeCab fails.
  SpeechScript read(const SpeechScript& written) const;

 private:
  struct Model;
  // Logs a kanji without a reading the first time it is met.
  void xUnreadable(std::string_view kanji) const;

  std::unique_ptr<Model> fModel;
  mutable std::mutex fMutex;
  mutable std::set<std::string, std::less<>> fUnreadable;  // logged already
};

// A number written in ASCII digits, with "," between thousands and "." before decimals,
// read in katakana ("2024" → "ニセンニジュウヨン", "3.14" → "サンテンイチヨン"); digits
// one by one when it starts with a zero or is too long to name.
std::string japaneseNumberReading(std::string_view number);

}  // namespace robotsim
