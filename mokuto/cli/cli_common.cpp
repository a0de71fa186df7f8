#include "cli_common.h"

#include <algorithm>
#include <iostream>
#include <iterator>

#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

namespace mokuto::cli {

namespace {

constexpr const char* kReplacement = "\xEF\xBF\xBD";  // U+FFFD

bool endsWith(const std::string& text, const std::string& end) {
  return text.size() >= end.size() && text.compare(text.size() - end.size(), end.size(), end) == 0;
}

// The length of the valid UTF-8 sequence at `at`, or 0.
std::size_t sequenceLength(const std::string& text, std::size_t at) {
  const auto byte = [&text](std::size_t k) { return static_cast<unsigned char>(text[k]); };
  const unsigned char lead = byte(at);
  std::size_t length = 0;
  unsigned char low = 0x80;
  unsigned char high = 0xBF;
  if (lead < 0x80)
    return 1;
  if (lead >= 0xC2 && lead <= 0xDF) {
    length = 2;
  } else if (lead >= 0xE0 && lead <= 0xEF) {
    length = 3;
    low = lead == 0xE0 ? 0xA0 : 0x80;
    high = lead == 0xED ? 0x9F : 0xBF;
  } else if (lead >= 0xF0 && lead <= 0xF4) {
    length = 4;
    low = lead == 0xF0 ? 0x90 : 0x80;
    high = lead == 0xF4 ? 0x8F : 0xBF;
  } else {
    return 0;
  }
  if (at + length > text.size() || byte(at + 1) < low || byte(at + 1) > high)
    return 0;
  for (std::size_t k = 2; k < length; ++k) {
    if (byte(at + k) < 0x80 || byte(at + k) > 0xBF)
      return 0;
  }
  return length;
}

}  // namespace

const std::vector<std::string>& speechLanguages() {
  static const std::vector<std::string> languages = {"English", "French", "Japanese"};
  return languages;
}

std::vector<std::string> databaseKeys() {
  std::vector<std::string> keys;
  for (const auto& [key, path] : ZU::makeLingLanguageMap())
    keys.push_back(key);
  return keys;
}

std::vector<std::string> analysisLanguages() {
  std::vector<std::string> keys;
  for (const auto& key : databaseKeys()) {
    if (!endsWith(key, "Emotions"))
      keys.push_back(key);
  }
  return keys;
}

std::vector<std::string> emotionLanguages() {
  const std::vector<std::string> all = databaseKeys();
  std::vector<std::string> keys;
  for (const auto& key : all) {
    if (std::find(all.begin(), all.end(), key + "Emotions") != all.end())
      keys.push_back(key);
  }
  return keys;
}

CLI::Option* addLanguageOption(CLI::App& command, std::string& language,
                               const std::vector<std::string>& allowed, const std::string& help) {
  return command.add_option("--language", language, help)
      ->check(CLI::IsMember(allowed))
      ->capture_default_str();
}

CLI::Option* addTextArgument(CLI::App& command, std::optional<std::string>& text,
                             const std::string& what) {
  return command.add_option("text", text, what + "; read from standard input when absent or \"-\"");
}

std::string readText(const std::optional<std::string>& argument) {
  if (argument && *argument != "-")
    return *argument;
  return {std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>()};
}

std::string printable(const std::string& text, std::size_t limit, std::size_t* length) {
  std::string out;
  std::size_t count = 0;
  for (std::size_t at = 0; at < text.size(); ++count) {
    const std::size_t size = sequenceLength(text, at);
    if (count < limit) {
      const unsigned char c = static_cast<unsigned char>(text[at]);
      if (size == 0)
        out += kReplacement;
      else if (c == '\n' || c == '\r' || c == '\t')
        out += ' ';
      else if (c < 0x20 || c == 0x7F ||
               (c == 0xC2 && static_cast<unsigned char>(text[at + 1]) < 0xA0))
        out += kReplacement;  // C0 and C1 controls
      else
        out.append(text, at, size);
    } else if (count == limit) {
      out += "\xE2\x80\xA6";  // …
      if (!length)
        break;
    }
    at += size == 0 ? 1 : size;
  }
  if (length)
    *length = count;
  return out;
}

}  // namespace mokuto::cli
