#include "robotsim/speechscript.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <limits>
#include <optional>

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

void appendText(SpeechScript& script, std::string_view text) {
  if (text.empty())
    return;
  if (!script.parts.empty() && script.parts.back().kind == SpeechScriptPart::Kind::Text) {
    script.parts.back().text.append(text);
    return;
  }
  SpeechScriptPart part;
  part.text = std::string(text);
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

void appendEscaped(std::string& out, std::string_view text) {
  for (const char c : text) {
    switch (c) {
      case '&':
        out += "&amp;";
        break;
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      default:
        // XML allows no control characters but tab and line breaks.
        if (static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n' && c != '\r')
          out += ' ';
        else
          out += c;
    }
  }
}

bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

// Where a bookmark written at the end of `out` must go: before the punctuation of a
// sentence that ends with a full stop (espeak-ng drops a mark after ". "), otherwise
// at the end.
std::size_t markPosition(const std::string& out) {
  std::size_t end = out.size();
  while (end > 0 && isBlank(out[end - 1]))
    --end;
  if (end == 0 || out[end - 1] != '.')
    return out.size();
  std::size_t start = end;
  while (start > 0 && (out[start - 1] == '.' || out[start - 1] == '!' || out[start - 1] == '?'))
    --start;
  return start;
}

}  // namespace

SpeechScript parseSpeechText(std::string_view text) {
  SpeechScript script;
  std::size_t pos = 0;
  while (pos < text.size()) {
    const auto open = text.find('\\', pos);
    if (open == std::string_view::npos) {
      appendText(script, text.substr(pos));
      break;
    }
    appendText(script, text.substr(pos, open - pos));
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

std::string toEspeakSsml(const SpeechScript& script) {
  std::string out = "<speak>";
  for (const auto& part : script.parts) {
    switch (part.kind) {
      case SpeechScriptPart::Kind::Text:
        appendEscaped(out, part.text);
        break;
      case SpeechScriptPart::Kind::Mark:
        out.insert(markPosition(out), "<mark name=\"" + std::to_string(part.mark) + "\"/>");
        break;
      case SpeechScriptPart::Kind::Break:
        out += "<break strength=\"x-weak\" time=\"" + std::to_string(part.breakMs) + "ms\"/>";
        break;
    }
  }
  out += "</speak>";
  return out;
}

}  // namespace robotsim
