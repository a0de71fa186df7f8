#pragma once
// The speech engine's reading of a text with inline tags: the words to speak, the
// bookmarks ("\mrk=N\" reported as the current bookmark, "\mrkpause=N\" that holds the
// speech until the blocking-bookmark handler returns) and the pauses ("\pau=N\", in
// milliseconds). Other backslash tags are dropped from the spoken text.
//
// Plain values and pure functions: any thread may use them.

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace robotsim {

struct SpeechMark {
  std::int32_t number = 0;
  bool blocking = false;  // "\mrkpause=N\"
};

struct SpeechScriptPart {
  enum class Kind { Text, Mark, Break };
  Kind kind = Kind::Text;
  std::string text;          // Text: the words, as written (or as read, see `reading`)
  std::size_t mark = 0;      // Mark: its index in SpeechScript::marks
  std::int32_t breakMs = 0;  // Break
  // Text: where the words stand in the caller's text, in bytes. Words as written map byte
  // for byte; a reading maps as a whole to its source (a reading without one, such as
  // the blank between two words, maps to nothing).
  std::size_t source = 0;
  std::size_t sourceLength = 0;
  bool reading = false;
  // Text: the language of a span spoken in another voice than the text's ("en"); empty
  // for the text's own.
  std::string voice;
};

struct SpeechScript {
  std::vector<SpeechScriptPart> parts;
  std::vector<SpeechMark> marks;  // in text order
  // What was dropped or changed while reading, one line each, for the engine's log.
  std::vector<std::string> notes;
};

// What playback made of one bookmark of a text. Times are on the text's playback clock,
// which starts with the text and stands still while a blocking bookmark holds it; the
// audio time is where synthesis put the mark.
struct SpeechMarkRecord {
  std::int32_t number = 0;
  bool blocking = false;
  std::int64_t audioUs = 0;     // the mark's position in the audio
  std::int64_t playbackUs = 0;  // when the player reached it
  std::int64_t heldUs = 0;      // how long a blocking mark held the speech
};

// A word as espeak-ng spoke it: its bytes in the caller's text and its audio time.
struct SpeechWordRecord {
  std::size_t offset = 0;
  std::size_t length = 0;
  std::string text;  // the caller's bytes
  std::int64_t audioUs = 0;
};

// The longest pause a "\pau=N\" tag asks for; longer ones are shortened to it.
inline constexpr std::int32_t kSpeechMaxBreakMs = 60000;

SpeechScript parseSpeechText(std::string_view text);

// Bytes [begin, end) of the caller's text.
struct SpeechSourceSpan {
  std::size_t begin = 0;
  std::size_t end = 0;
};

// The script as SSML for espeak-ng. The text is escaped; each bookmark becomes
// <mark name="I"/> with I its index in `marks`; each pause a break with strength
// "x-weak" (espeak-ng ignores a plain break at the start of a text); a span in another
// voice a <voice xml:lang="…"> element. A bookmark that follows the end of a sentence
// (".", or the Japanese "。", "！", "？", "．") goes before its punctuation, where
// espeak-ng reports it without the pause. `sources`, when given, receives for each
// character (code point) of the SSML the bytes of the caller's text that it stands for
// (an empty span for markup and for blanks that readings add).
std::string toEspeakSsml(const SpeechScript& script,
                         std::vector<SpeechSourceSpan>* sources = nullptr);

}  // namespace robotsim
