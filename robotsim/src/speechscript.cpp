#include "robotsim/speechscript.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <limits>
#include <optional>
#include <span>

namespace robotsim {

namespace {

std::string lowered(std::string_view s) {
  std::string out(s);
  std::transform(out.begin(), out.end(), out.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return out;
}

// Digits only, within the 32-bit signed range.
std::optional<std::int32_t> parseCount(std::string_view s) {
  if (s.empty() ||
      !std::all_of(s.begin(), s.end(), [](unsigned char c) { return std::isdigit(c); }))
    return std::nullopt;
  std::int64_t value = 0;
  const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), value);
  if (ec != std::errc() || end != s.data() + s.size() ||
      value > std::numeric_limits<std::int32_t>::max())
    return std::nullopt;
  return static_cast<std::int32_t>(value);
}

// Text from `source` in the caller's text; it joins the text before it when nothing lies
// between the two.
void appendText(SpeechScript& script, std::string_view text, std::size_t source) {
  if (text.empty())
    return;
  if (!script.parts.empty()) {
    SpeechScriptPart& last = script.parts.back();
    if (last.kind == SpeechScriptPart::Kind::Text && last.source + last.sourceLength == source) {
      last.text.append(text);
      last.sourceLength += text.size();
      return;
    }
  }
  SpeechScriptPart part;
  part.text = std::string(text);
  part.source = source;
  part.sourceLength = text.size();
  script.parts.push_back(std::move(part));
}

// Reads one tag's content ("mrk=3"); answers false for a tag that is not ours.
bool readTag(SpeechScript& script, std::string_view content) {
  const auto eq = content.find('=');
  if (eq == std::string_view::npos)
    return false;
  const std::string name = lowered(content.substr(0, eq));
  const auto value = parseCount(content.substr(eq + 1));
  if (!value || (name != "mrk" && name != "mrkpause" && name != "pau"))
    return false;
  SpeechScriptPart part;
  if (name == "pau") {
    part.kind = SpeechScriptPart::Kind::Break;
    part.breakMs = *value;
    if (*value > kSpeechMaxBreakMs) {
      part.breakMs = kSpeechMaxBreakMs;
      script.notes.push_back("pause of " + std::to_string(*value) + " ms shortened to " +
                             std::to_string(kSpeechMaxBreakMs) + " ms");
    }
  } else {
    part.kind = SpeechScriptPart::Kind::Mark;
    part.mark = script.marks.size();
    script.marks.push_back(SpeechMark{*value, name == "mrkpause"});
  }
  script.parts.push_back(std::move(part));
  return true;
}

bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

// The punctuation of a sentence's end: a bookmark after one of the first group goes
// before the whole run (espeak-ng drops a mark after ". ", and reports one after "。" at
// the next sentence, after the pause).
constexpr std::string_view kFullStops[] = {".", "。", "！", "？", "．"};
constexpr std::string_view kSentenceEnds[] = {".", "!", "?", "。", "！", "？", "．"};

std::string_view endingWith(std::string_view text, std::span<const std::string_view> ends) {
  for (const std::string_view e : ends) {
    if (text.ends_with(e))
      return e;
  }
  return {};
}

// The SSML being written and, when asked for, the caller's bytes behind each of its bytes.
class SsmlWriter {
 public:
  explicit SsmlWriter(bool mapped) : fMapped(mapped) {}

  void markup(std::string_view s) { xAppend(s, {}); }

  // Escaped; a reading maps as a whole to its source, words as written byte for byte.
  void text(const SpeechScriptPart& part) {
    const SpeechSourceSpan whole{part.source, part.source + part.sourceLength};
    for (std::size_t i = 0; i < part.text.size(); ++i) {
      const SpeechSourceSpan span =
          part.reading ? whole : SpeechSourceSpan{part.source + i, part.source + i + 1};
      const char c = part.text[i];
      switch (c) {
        case '&':
          xAppend("&amp;", span);
          break;
        case '<':
          xAppend("&lt;", span);
          break;
        case '>':
          xAppend("&gt;", span);
          break;
        default:
          // XML allows no control characters but tab and line breaks.
          if (static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n' && c != '\r')
            xAppend(" ", span);
          else
            xAppend(std::string_view(&c, 1), span);
      }
    }
  }

  // A bookmark: at the end, or before the punctuation of a sentence that ends there.
  void mark(std::string_view tag) {
    std::size_t end = fOut.size();
    while (end > 0 && isBlank(fOut[end - 1]))
      --end;
    std::string_view head(fOut.data(), end);
    if (endingWith(head, kFullStops).empty()) {
      markup(tag);
      return;
    }
    for (std::string_view e = endingWith(head, kSentenceEnds); !e.empty();
         e = endingWith(head, kSentenceEnds))
      head.remove_suffix(e.size());
    fOut.insert(head.size(), tag);
    if (fMapped)
      fBytes.insert(fBytes.begin() + static_cast<std::ptrdiff_t>(head.size()), tag.size(),
                    SpeechSourceSpan{});
  }

  std::string finish(std::vector<SpeechSourceSpan>* sources) {
    if (sources) {
      sources->clear();
      for (std::size_t i = 0; i < fOut.size();) {
        std::size_t next = i + 1;
        while (next < fOut.size() && (static_cast<unsigned char>(fOut[next]) & 0xC0) == 0x80)
          ++next;
        sources->push_back(SpeechSourceSpan{fBytes[i].begin, fBytes[next - 1].end});
        i = next;
      }
    }
    return std::move(fOut);
  }

 private:
  void xAppend(std::string_view s, SpeechSourceSpan span) {
    fOut.append(s);
    if (fMapped)
      fBytes.insert(fBytes.end(), s.size(), span);
  }

  const bool fMapped;
  std::string fOut;
  std::vector<SpeechSourceSpan> fBytes;
};

}  // namespace

SpeechScript parseSpeechText(std::string_view text) {
  SpeechScript script;
  std::size_t pos = 0;
  while (pos < text.size()) {
    const auto open = text.find('\\', pos);
    if (open == std::string_view::npos) {
      appendText(script, text.substr(pos), pos);
      break;
    }
    appendText(script, text.substr(pos, open - pos), pos);
    const auto close = text.find('\\', open + 1);
    if (close == std::string_view::npos) {
      script.notes.push_back("unterminated tag dropped: " + std::string(text.substr(open)));
      break;
    }
    const std::string_view content = text.substr(open + 1, close - open - 1);
    if (!readTag(script, content))
      script.notes.push_back("tag dropped: \\" + std::string(content) + "\\");
    pos = close + 1;
  }
  return script;
}

std::string toEspeakSsml(const SpeechScript& script, std::vector<SpeechSourceSpan>* sources) {
  SsmlWriter out(sources != nullptr);
  out.markup("<speak>");
  std::string voice;  // of the span open
  for (const auto& part : script.parts) {
    switch (part.kind) {
      case SpeechScriptPart::Kind::Text:
        if (part.voice != voice) {
          if (!voice.empty())
            out.markup("</voice>");
          if (!part.voice.empty())
            out.markup("<voice name=\"" + part.voice + "\">");
          voice = part.voice;
        }
        out.text(part);
        break;
      case SpeechScriptPart::Kind::Mark:
        out.mark("<mark name=\"" + std::to_string(part.mark) + "\"/>");
        break;
      case SpeechScriptPart::Kind::Break:
        out.markup("<break strength=\"x-weak\" time=\"" + std::to_string(part.breakMs) + "ms\"/>");
        break;
    }
  }
  if (!voice.empty())
    out.markup("</voice>");
  out.markup("</speak>");
  return out.finish(sources);
}

}  // namespace robotsim
