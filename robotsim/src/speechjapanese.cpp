#include "speechjapanese.h"

#include <mecab.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <utility>
#include <vector>

#include "ko/log.hpp"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.texttospeech";
// The voice of Latin words in a Japanese text.
constexpr const char* kLatinVoice = "en";

// ---- characters ----------------------------------------------------------------------

struct CodePoint {
  char32_t value = 0;
  std::size_t size = 1;
  bool valid = false;
};

CodePoint decode(std::string_view s, std::size_t pos) {
  const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(s[i]); };
  const unsigned char lead = byte(pos);
  if (lead < 0x80)
    return {lead, 1, true};
  const std::size_t size = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC2 ? 2 : 0;
  if (size == 0 || lead > 0xF4 || pos + size > s.size())
    return {};
  char32_t value = lead & (0x7F >> size);
  for (std::size_t i = 1; i < size; ++i) {
    if ((byte(pos + i) & 0xC0) != 0x80)
      return {};
    value = (value << 6) | (byte(pos + i) & 0x3F);
  }
  return {value, size, true};
}

std::size_t characterCount(std::string_view s) {
  return static_cast<std::size_t>(std::count_if(
      s.begin(), s.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; }));
}

bool isKanji(char32_t c) {
  return (c >= 0x3400 && c <= 0x4DBF) || (c >= 0x4E00 && c <= 0x9FFF) ||
         (c >= 0xF900 && c <= 0xFAFF) || (c >= 0x20000 && c <= 0x3FFFF) || c == 0x3005 ||
         c == 0x3006;
}

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

bool isLetter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

bool isPunctuation(char c) {
  return std::string_view(".,!?;:").find(c) != std::string_view::npos;
}

bool isAscii(std::string_view s) {
  return std::all_of(s.begin(), s.end(),
                     [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// ---- numbers ---------------------------------------------------------------------------

constexpr std::array<std::string_view, 10> kDigits = {"ゼロ", "イチ", "ニ",   "サン", "ヨン",
                                                      "ゴ",   "ロク", "ナナ", "ハチ", "キュウ"};

// 1 to 9999.
std::string belowTenThousand(std::size_t n) {
  std::string out;
  const std::size_t thousands = n / 1000;
  const std::size_t hundreds = n / 100 % 10;
  const std::size_t tens = n / 10 % 10;
  const std::size_t ones = n % 10;
  if (thousands == 1 || thousands == 3 || thousands == 8)
    out += thousands == 1 ? "セン" : thousands == 3 ? "サンゼン" : "ハッセン";
  else if (thousands > 0)
    out.append(kDigits[thousands]).append("セン");
  if (hundreds == 1 || hundreds == 3 || hundreds == 6 || hundreds == 8)
    out += hundreds == 1   ? "ヒャク"
           : hundreds == 3 ? "サンビャク"
           : hundreds == 6 ? "ロッピャク"
                           : "ハッピャク";
  else if (hundreds > 0)
    out.append(kDigits[hundreds]).append("ヒャク");
  if (tens > 1)
    out.append(kDigits[tens]);
  if (tens > 0)
    out += "ジュウ";
  if (ones > 0)
    out.append(kDigits[ones]);
  return out;
}

// "1", "8" and "10" before チョウ and ケイ are cut short (イッチョウ).
void shortenBefore(std::string& group) {
  for (const auto& [full, cut] : {std::pair<std::string_view, std::string_view>{"イチ", "イッ"},
                                  {"ハチ", "ハッ"},
                                  {"ジュウ", "ジュッ"}}) {
    if (std::string_view(group).ends_with(full)) {
      group.replace(group.size() - full.size(), full.size(), cut);
      return;
    }
  }
}

std::string digitByDigit(std::string_view digits) {
  std::string out;
  for (const char c : digits)
    out.append(kDigits[static_cast<std::size_t>(c - '0')]);
  return out;
}

// The number of bytes at `i` that make a number: digits, thousands after commas (when the
// first group has at most three digits), and decimals after a point.
std::size_t numberLength(std::string_view s, std::size_t i) {
  std::size_t j = i;
  while (j < s.size() && isDigit(s[j]))
    ++j;
  const auto digitsAt = [&](std::size_t k, std::size_t n) {
    for (std::size_t m = k; m < k + n; ++m) {
      if (m >= s.size() || !isDigit(s[m]))
        return false;
    }
    return true;
  };
  if (j - i <= 3) {
    while (j < s.size() && s[j] == ',' && digitsAt(j + 1, 3) &&
           (j + 4 == s.size() || !isDigit(s[j + 4])))
      j += 4;
  }
  if (j + 1 < s.size() && s[j] == '.' && isDigit(s[j + 1])) {
    j += 2;
    while (j < s.size() && isDigit(s[j]))
      ++j;
  }
  return j - i;
}

// ---- the text, its units and its tags --------------------------------------------------

// The text that MeCab reads: the script's words, full-width ASCII as ASCII, and for each
// byte the caller's bytes of its character.
struct NormalisedText {
  std::string text;
  std::vector<SpeechSourceSpan> sources;

  void append(std::string_view bytes, SpeechSourceSpan source) {
    text.append(bytes);
    sources.insert(sources.end(), bytes.size(), source);
  }

  // Full-width ASCII (U+FF01 to U+FF5E) and the ideographic space as ASCII, except the
  // Japanese "！", "？" and "．" that end sentences (a "．" between digits is a point).
  void appendWritten(const SpeechScriptPart& part) {
    const std::string_view s = part.text;
    for (std::size_t i = 0; i < s.size();) {
      const CodePoint c = decode(s, i);
      const SpeechSourceSpan source =
          part.reading ? SpeechSourceSpan{part.source, part.source + part.sourceLength}
                       : SpeechSourceSpan{part.source + i, part.source + i + c.size};
      const auto digitAt = [&](std::size_t k) {
        if (k >= s.size())
          return false;
        const CodePoint d = decode(s, k);
        return isDigit(s[k]) || (d.value >= 0xFF10 && d.value <= 0xFF19);
      };
      if (!c.valid || c.value == 0x3000) {
        append(" ", source);
      } else if (c.value == 0xFF0E && !text.empty() && isDigit(text.back()) &&
                 digitAt(i + c.size)) {
        append(".", source);
      } else if (c.value >= 0xFF01 && c.value <= 0xFF5E && c.value != 0xFF01 && c.value != 0xFF1F &&
                 c.value != 0xFF0E) {
        const char ascii = static_cast<char>(c.value - 0xFEE0);
        append(std::string_view(&ascii, 1), source);
      } else {
        append(s.substr(i, c.size), source);
      }
      i += c.size;
    }
  }

  SpeechSourceSpan sourceOf(std::size_t begin, std::size_t end) const {
    return {sources[begin].begin, sources[end - 1].end};
  }
};

// A word of MeCab's parse, in the normalised text.
struct Token {
  std::size_t begin = 0;
  std::size_t end = 0;
  bool spaced = false;  // white space before it
  std::string_view partOfSpeech;
  std::string_view subclass;
  std::string_view pronunciation;  // empty when the dictionary has none
};

// What is spoken of a stretch of the normalised text: the edges of units are where tags
// may stand.
struct Unit {
  std::size_t begin = 0;
  std::size_t end = 0;
  std::string text;
  std::string voice;
  bool startsWord = true;
};

Token makeToken(const MeCab::Node& node, const char* sentence) {
  Token token;
  token.begin = static_cast<std::size_t>(node.surface - sentence);
  token.end = token.begin + node.length;
  token.spaced = node.rlength > node.length;
  // IPADIC: part of speech, three subclasses, conjugation type and form, base form,
  // reading, pronunciation. Unknown words stop after the base form.
  std::array<std::string_view, 9> fields;
  std::string_view feature = node.feature ? node.feature : "";
  std::size_t count = 0;
  while (count < fields.size()) {
    const auto comma = feature.find(',');
    fields[count++] = feature.substr(0, comma);
    if (comma == std::string_view::npos)
      break;
    feature.remove_prefix(comma + 1);
  }
  token.partOfSpeech = fields[0];
  token.subclass = fields[1];
  if (count == fields.size() && fields[8] != "*")
    token.pronunciation = fields[8];
  return token;
}

// MeCab may take ASCII symbols and Japanese punctuation for one unknown word ("++、"):
// the two go apart, the Japanese as a symbol.
void addToken(const Token& token, std::string_view all, std::vector<Token>& tokens) {
  std::size_t begin = token.begin;
  while (begin < token.end) {
    const bool ascii = static_cast<unsigned char>(all[begin]) < 0x80;
    std::size_t end = begin + 1;
    while (end < token.end && (static_cast<unsigned char>(all[end]) < 0x80) == ascii)
      ++end;
    if (begin == token.begin && end == token.end) {
      tokens.push_back(token);
      return;
    }
    Token piece{begin, end, begin == token.begin && token.spaced, "記号", "", ""};
    tokens.push_back(piece);
    begin = end;
  }
}

// An ASCII stretch of adjacent tokens: a Latin word (with its trailing punctuation left
// out of the English span), or numbers, punctuation and symbols.
void addAsciiUnits(std::string_view text, std::size_t begin, std::size_t end, bool startsWord,
                   std::vector<Unit>& units) {
  const std::string_view run = text.substr(begin, end - begin);
  if (std::any_of(run.begin(), run.end(), isLetter)) {
    std::size_t stop = run.size();
    while (stop > 0 && isPunctuation(run[stop - 1]))
      --stop;
    units.push_back(
        Unit{begin, begin + stop, std::string(run.substr(0, stop)), kLatinVoice, startsWord});
    if (stop < run.size())
      units.push_back(Unit{begin + stop, end, std::string(run.substr(stop)), "", false});
    return;
  }
  for (std::size_t i = 0; i < run.size();) {
    const std::size_t length = isDigit(run[i]) ? numberLength(run, i) : 1;
    const std::string_view piece = run.substr(i, length);
    std::string spoken = isDigit(run[i]) ? japaneseNumberReading(piece) : std::string(piece);
    units.push_back(Unit{begin + i, begin + i + length, std::move(spoken), "",
                         i == 0 && startsWord && !isPunctuation(run[i])});
    i += length;
  }
}

// The units of MeCab's words: Japanese words as their pronunciation, ASCII stretches as
// Latin words, numbers and symbols.
std::vector<Unit> wordsOf(std::string_view all, const std::vector<Token>& tokens,
                          const std::function<void(std::string_view)>& unreadable) {
  std::vector<Unit> units;
  bool afterPrefix = false;
  for (std::size_t t = 0; t < tokens.size();) {
    const Token& token = tokens[t];
    const std::string_view surface = all.substr(token.begin, token.end - token.begin);
    if (isAscii(surface)) {
      std::size_t u = t + 1;
      while (u < tokens.size() && tokens[u].begin == tokens[u - 1].end &&
             isAscii(all.substr(tokens[u].begin, tokens[u].end - tokens[u].begin)))
        ++u;
      addAsciiUnits(all, token.begin, tokens[u - 1].end, token.spaced || !afterPrefix, units);
      afterPrefix = false;
      t = u;
      continue;
    }
    Unit unit{token.begin, token.end, std::string(token.pronunciation), "", true};
    if (token.pronunciation.empty()) {
      // As written, but for the kanji that the dictionary cannot read.
      for (std::size_t i = 0; i < surface.size();) {
        const CodePoint c = decode(surface, i);
        if (isKanji(c.value))
          unreadable(surface.substr(i, c.size));
        else
          unit.text.append(surface.substr(i, c.size));
        i += c.size;
      }
    }
    // Particles, auxiliaries, suffixes, punctuation and the word after a prefix or an
    // opening bracket belong to the word before them.
    const bool attached = token.partOfSpeech == "助詞" || token.partOfSpeech == "助動詞" ||
                          token.subclass == "接尾" ||
                          (token.partOfSpeech == "記号" && token.subclass != "括弧開") ||
                          afterPrefix;
    unit.startsWord = token.spaced || !attached;
    afterPrefix = token.partOfSpeech == "接頭詞" || token.subclass == "括弧開";
    units.push_back(std::move(unit));
    ++t;
  }
  return units;
}

// For each tag, in order, the edge of the units where it goes (edge k before unit k):
// where it stands, or the nearest edge of the unit it stands in (the start on a tie). Tags
// keep their order.
std::vector<std::size_t> tagEdges(
    std::string_view all, const std::vector<Unit>& units,
    const std::vector<std::pair<std::size_t, const SpeechScriptPart*>>& tags) {
  std::vector<std::size_t> edges;
  edges.reserve(tags.size());
  std::size_t k = 0;
  for (const auto& [at, part] : tags) {
    while (k < units.size() && units[k].end <= at)
      ++k;
    std::size_t edge = k;
    if (k < units.size() && units[k].begin < at) {
      const std::size_t before = characterCount(all.substr(units[k].begin, at - units[k].begin));
      const std::size_t after = characterCount(all.substr(at, units[k].end - at));
      edge = before <= after ? k : k + 1;
    }
    edges.push_back(edge);
  }
  return edges;
}

}  // namespace

// ---- numbers ---------------------------------------------------------------------------

std::string japaneseNumberReading(std::string_view number) {
  std::string digits;
  std::string_view decimals;
  for (std::size_t i = 0; i < number.size(); ++i) {
    if (number[i] == '.') {
      decimals = number.substr(i + 1);
      break;
    }
    if (isDigit(number[i]))
      digits += number[i];
  }
  std::string out;
  constexpr std::array<std::string_view, 5> kUnits = {"", "マン", "オク", "チョウ", "ケイ"};
  if (digits.empty() || digits == "0") {
    out = kDigits[0];
  } else if (digits[0] == '0' || digits.size() > 4 * kUnits.size()) {
    out = digitByDigit(digits);
  } else {
    const std::size_t groups = (digits.size() + 3) / 4;
    std::size_t taken = digits.size() - (groups - 1) * 4;
    std::size_t at = 0;
    for (std::size_t g = groups; g-- > 0;) {
      const std::size_t value = std::stoul(digits.substr(at, taken));
      at += taken;
      taken = 4;
      if (value == 0)
        continue;
      std::string group = value == 1 && g > 0 ? std::string(kDigits[1]) : belowTenThousand(value);
      if (g >= 3)
        shortenBefore(group);
      out += group;
      out.append(kUnits[g]);
    }
  }
  if (!decimals.empty())
    out.append("テン").append(digitByDigit(decimals));
  return out;
}

// ---- the reader ------------------------------------------------------------------------

struct JapaneseReadings::Model {
  struct Delete {
    void operator()(MeCab::Model* m) const { MeCab::deleteModel(m); }
    void operator()(MeCab::Tagger* t) const { MeCab::deleteTagger(t); }
    void operator()(MeCab::Lattice* l) const { MeCab::deleteLattice(l); }
  };
  std::unique_ptr<MeCab::Model, Delete> model;
  std::unique_ptr<MeCab::Tagger, Delete> tagger;  // its parse of a lattice is thread-safe
};

const JapaneseReadings& JapaneseReadings::shared() {
  // Never freed: texts may be read by threads that outlive static destruction.
  static const JapaneseReadings* instance = nullptr;
  static std::once_flag made;
  std::call_once(made, [] { instance = new JapaneseReadings(kDictionary); });
  return *instance;
}

JapaneseReadings::JapaneseReadings(const std::string& dictionary) : fModel(new Model) {
  const std::string missing =
      "Japanese is read with MeCab's IPADIC dictionary in UTF-8, expected in " + dictionary +
      " (Debian package mecab-ipadic-utf8)";
  std::error_code error;
  if (!std::filesystem::is_regular_file(std::filesystem::path(dictionary) / "sys.dic", error))
    throw std::runtime_error(missing + ": not found");
  // No resource file: the dictionary alone, whatever /etc/mecabrc says.
  std::string program = "mecab", rcOption = "-r", rcFile = "/dev/null", dicOption = "-d";
  std::string dicdir = dictionary;
  std::array<char*, 5> argv = {program.data(), rcOption.data(), rcFile.data(), dicOption.data(),
                               dicdir.data()};
  fModel->model.reset(MeCab::createModel(static_cast<int>(argv.size()), argv.data()));
  if (fModel->model)
    fModel->tagger.reset(fModel->model->createTagger());
  if (!fModel->tagger)
    throw std::runtime_error(missing + ": " + MeCab::getLastError());
}

JapaneseReadings::~JapaneseReadings() = default;

void JapaneseReadings::xUnreadable(std::string_view kanji) const {
  {
    std::lock_guard lock(fMutex);
    if (!fUnreadable.emplace(kanji).second)
      return;
  }
  const CodePoint c = decode(kanji, 0);
  char code[16];
  std::snprintf(code, sizeof code, "U+%04X", static_cast<unsigned>(c.value));
  KO_LOG_WARNING(kCategory) << "No reading for the kanji " << kanji << " (" << code
                            << "): it is not spoken";
}

SpeechScript JapaneseReadings::read(const SpeechScript& written) const {
  // The words without the tags, and where each tag stood in them.
  NormalisedText text;
  std::vector<std::pair<std::size_t, const SpeechScriptPart*>> tags;
  for (const auto& part : written.parts) {
    if (part.kind == SpeechScriptPart::Kind::Text)
      text.appendWritten(part);
    else
      tags.emplace_back(text.text.size(), &part);
  }

  // One parse of the whole text.
  std::vector<Unit> units;
  if (!text.text.empty()) {
    std::unique_ptr<MeCab::Lattice, Model::Delete> lattice(fModel->model->createLattice());
    lattice->set_sentence(text.text.data(), text.text.size());
    if (!fModel->tagger->parse(lattice.get()))
      throw std::runtime_error(std::string("MeCab could not read the text: ") + lattice->what());
    std::vector<Token> tokens;
    for (const MeCab::Node* node = lattice->bos_node(); node; node = node->next) {
      if (node->stat != MECAB_BOS_NODE && node->stat != MECAB_EOS_NODE && node->length > 0)
        addToken(makeToken(*node, text.text.data()), text.text, tokens);
    }
    units = wordsOf(text.text, tokens, [this](std::string_view kanji) { xUnreadable(kanji); });
  }

  const std::vector<std::size_t> edges = tagEdges(text.text, units, tags);

  // The units in order, a blank before each word, each tag at its edge.
  SpeechScript read;
  read.marks = written.marks;
  read.notes = written.notes;
  bool spoken = false;
  std::size_t next = 0;
  for (std::size_t e = 0; e <= units.size(); ++e) {
    const Unit* unit = e < units.size() ? &units[e] : nullptr;
    const bool speaks = unit && !unit->text.empty();
    if (speaks && spoken && unit->startsWord) {
      SpeechScriptPart blank;
      blank.text = " ";
      blank.reading = true;
      blank.voice = unit->voice;
      read.parts.push_back(std::move(blank));
    }
    for (; next < tags.size() && edges[next] == e; ++next)
      read.parts.push_back(*tags[next].second);
    if (speaks) {
      SpeechScriptPart part;
      part.text = unit->text;
      const SpeechSourceSpan source = text.sourceOf(unit->begin, unit->end);
      part.source = source.begin;
      part.sourceLength = source.end - source.begin;
      part.reading = true;
      part.voice = unit->voice;
      read.parts.push_back(std::move(part));
      spoken = true;
    }
  }
  return read;
}

}  // namespace robotsim
