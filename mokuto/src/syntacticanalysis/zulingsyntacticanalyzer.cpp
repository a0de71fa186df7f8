#include "mokuto/zulingsyntacticanalyzer.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <mutex>
#include <utility>

namespace ZU {

const char* const kLingStructureKindNames[4] = {"nominal", "verb", "and", "or"};
const char* const kLingGrammaticalFunctionNames[3] = {"subject", "direct object", "complement"};
const char* const kLingColourNames[3] = {"blue", "green", "black"};

namespace {

using Chunk = ZULingSyntacticAnalyzerChunk;
using Structure = ZULingSyntacticAnalyzerStructure;

constexpr std::array<std::string_view, 14> kNegationWords = {
    "ne",      "n",      "pas",     "not",    "shouldn't", "can't", "don't",
    "doesn't", "didn't", "haven't", "hadn't", "hasn't",    "won't", "wouldn't"};

// Coordinating words, compared with the lowercased chunk text. The Japanese particles
// also mark case and questions: they coordinate nominal groups only.
constexpr std::array<std::string_view, 8> kAndWords = {"and",  "et",     "と",     "や",
                                                       "及び", "および", "並びに", "ならびに"};
constexpr std::array<std::string_view, 10> kOrWords = {
    "or", "ou", "か", "または", "又は", "あるいは", "或いは", "もしくは", "若しくは", "それとも"};
constexpr std::array<std::string_view, 3> kParticles = {"と", "や", "か"};
// The agent of a passive: "run by dpkg".
constexpr std::array<std::string_view, 2> kAgentWords = {"by", "par"};
// Determiners that are also the preposition "de": they follow nouns as often as verbs.
constexpr std::array<std::string_view, 4> kPartitives = {"d", "de", "du", "des"};
// Prepositions whose complement is rather a list than a verb's: the complement of a noun
// ("a review of the text and package name") or a pair ("between each directory or file").
constexpr std::array<std::string_view, 7> kListPrepositions = {"of",  "de",      "d",    "du",
                                                               "des", "between", "entre"};
// The preposition of an infinitive that complements a verb: "helps to identify", "aide à
// identifier".
constexpr std::array<std::string_view, 2> kInfinitiveWords = {"to", "à"};
// Prepositions that lead a French infinitive of a second action ("et de le placer").
constexpr std::array<std::string_view, 4> kInfinitiveLeads = {"de", "d", "à", "pour"};
// Words that begin an indirect question or a relative clause.
constexpr std::array<std::string_view, 14> kQuestionWords = {
    "how",  "why",   "what",    "whether", "comment", "pourquoi", "combien",
    "quoi", "quand", "lorsque", "quel",    "quelle",  "quels",    "quelles"};
// The conjunction that begins a second subordinate clause ("si vous n'êtes pas ... et que
// vous utilisez").
constexpr std::array<std::string_view, 2> kThatWords = {"que", "qu"};
constexpr std::array<std::string_view, 9> kRelativeWords = {
    "that", "which", "who", "whom", "whose", "qui", "que", "dont", "où"};
// The relative pronouns that follow a preposition ("sur lequel", "à qui", "on which"), and
// the forms that hold the preposition.
constexpr std::array<std::string_view, 8> kPrepositionRelatives = {
    "lequel", "laquelle", "lesquels", "lesquelles", "quoi", "qui", "which", "whom"};
constexpr std::array<std::string_view, 6> kContractedRelatives = {
    "auquel", "auxquels", "auxquelles", "duquel", "desquels", "desquelles"};
// French subject pronouns that no coordinating word joins to another subject ("Paul et
// elle sont", but never "Paul et il sont").
constexpr std::array<std::string_view, 6> kCliticSubjects = {"il", "ils", "on", "je", "j", "tu"};
constexpr std::array<std::string_view, 4> kItemSeparators = {",", "、", "，", "､"};
// Prefixes that make a verb of a verb ("recompresser", "désarchiver", "repack"), longest
// first.
constexpr std::array<std::string_view, 4> kVerbPrefixes = {"dés", "ré", "dé", "re"};
// The particles of phrasal verbs before their object: "set up a network".
constexpr std::array<std::string_view, 6> kVerbParticles = {"up",   "out",  "off",
                                                            "down", "back", "away"};
// The negations that stand for a whole clause after "or" ("ou non", "or not").
constexpr std::array<std::string_view, 2> kNotWords = {"non", "not"};
// Adverbs of sequence: after a coordinating word they announce a second action ("and then
// insert the comments").
constexpr std::array<std::string_view, 2> kThenWords = {"then", "ensuite"};
// What a verb of checking asks: "and check if anyone is there".
constexpr std::array<std::string_view, 3> kIfWords = {"if", "whether", "si"};

template <std::size_t N>
bool isOneOf(std::string_view word, const std::array<std::string_view, N>& words) {
  return std::find(words.begin(), words.end(), word) != words.end();
}

// The first bytes of the coordinating words: most words are none of them at once.
constexpr std::array<bool, 256> coordinationFirstBytes() {
  std::array<bool, 256> first{};
  for (const std::string_view word : kAndWords)
    first[static_cast<unsigned char>(word[0])] = true;
  for (const std::string_view word : kOrWords)
    first[static_cast<unsigned char>(word[0])] = true;
  return first;
}
constexpr std::array<bool, 256> kCoordinationFirstBytes = coordinationFirstBytes();

char lowerByte(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

std::string lowercase(std::string_view text) {
  std::string lower(text);
  for (char& c : lower)
    c = lowerByte(c);
  return lower;
}

// One character of UTF-8 text; a byte that does not start a valid sequence is a
// character of its own.
struct CodePoint {
  char32_t value = 0;
  std::size_t length = 1;
};

CodePoint decode(std::string_view s, std::size_t p) noexcept {
  const auto b0 = static_cast<unsigned char>(s[p]);
  if (b0 < 0x80)
    return {b0, 1};
  std::size_t length = 0;
  char32_t value = 0;
  if ((b0 & 0xE0) == 0xC0) {
    length = 2;
    value = b0 & 0x1Fu;
  } else if ((b0 & 0xF0) == 0xE0) {
    length = 3;
    value = b0 & 0x0Fu;
  } else if ((b0 & 0xF8) == 0xF0) {
    length = 4;
    value = b0 & 0x07u;
  } else {
    return {0xFFFD, 1};
  }
  if (p + length > s.size())
    return {0xFFFD, 1};
  for (std::size_t k = 1; k < length; ++k) {
    const auto b = static_cast<unsigned char>(s[p + k]);
    if ((b & 0xC0) != 0x80)
      return {0xFFFD, 1};
    value = (value << 6) | (b & 0x3Fu);
  }
  return {value, length};
}

bool isSpace(char32_t c) noexcept {
  return c == ' ' || (c >= '\t' && c <= '\r') || c == 0xA0 || c == 0x1680 ||
         (c >= 0x2000 && c <= 0x200B) || c == 0x2028 || c == 0x2029 || c == 0x202F || c == 0x205F ||
         c == 0x3000;
}

// Apostrophes and hyphens: inside a word they link its parts, elsewhere they are
// punctuation.
bool isLink(char32_t c) noexcept {
  return c == '\'' || c == '-' || c == 0x2019 || c == 0x2010 || c == 0x2011;
}

bool isPunctuation(char32_t c) noexcept {
  if (c < 0x80)
    return (c >= '!' && c <= '/') || (c >= ':' && c <= '@') || (c >= '[' && c <= '`') ||
           (c >= '{' && c <= '~');
  return c == 0xA1 || c == 0xA7 || c == 0xAB || c == 0xB6 || c == 0xB7 || c == 0xBB || c == 0xBF ||
         (c >= 0x2010 && c <= 0x2027) || (c >= 0x2030 && c <= 0x205E) ||
         (c >= 0x3001 && c <= 0x3004) || (c >= 0x3008 && c <= 0x3011) ||
         (c >= 0x3014 && c <= 0x301F) || c == 0x3030 || c == 0x303D || c == 0x30FB ||
         (c >= 0xFF01 && c <= 0xFF0F) || (c >= 0xFF1A && c <= 0xFF20) ||
         (c >= 0xFF3B && c <= 0xFF40) || (c >= 0xFF5B && c <= 0xFF65);
}

bool isWordCharacter(char32_t c) noexcept {
  return !isSpace(c) && !isPunctuation(c) && !isLink(c);
}

bool isDigit(char c) noexcept {
  return c >= '0' && c <= '9';
}

bool isAsciiAlnum(char32_t c) noexcept {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

// The scripts whose unknown runs stay one chunk where words are not spaced.
constexpr int kKatakana = 2;
int unknownRunScript(char32_t c) noexcept {
  if (isAsciiAlnum(c))
    return 1;
  if ((c >= 0x30A1 && c <= 0x30FA) || (c >= 0x30FC && c <= 0x30FE))
    return kKatakana;  // and the prolonged sound mark
  if ((c >= 0xFF10 && c <= 0xFF19) || (c >= 0xFF21 && c <= 0xFF3A) || (c >= 0xFF41 && c <= 0xFF5A))
    return 3;  // full-width letters and digits
  return 0;
}

// Cuts plain text (between the speech-engine tags) into chunks.
//
// At each word position the longest stored word starting there is taken. Where words
// are spaced (the database's flag set, or no database), a stored word counts only when
// it ends where the written word ends or with an apostrophe or hyphen (an elided "l'",
// "n'", "qu'", which becomes the word and a link); otherwise the written word, up to the
// next space, punctuation or link, is one unknown word. Numbers follow the digit rule.
// Where words are not spaced (flag 0), the stored word is taken wherever it ends, and
// unknown text is cut by character, except runs of latin letters and digits, of katakana
// or of full-width letters, which stay whole. A katakana run is a written word of its
// own: a stored word counts there only when it ends with the run or after it.
class Cutter {
 public:
  Cutter(const ZULingSyntacticAnalyzerBinaryDatabase* database, std::string_view text,
         std::string_view lower, std::vector<Chunk>& chunks)
      : fDatabase(database),
        fText(text),
        fLower(lower),
        fChunks(chunks),
        fSpaced(database == nullptr || database->flag != 0) {}

  void cut(std::size_t begin, std::size_t end) {
    bool afterWord = false;
    std::size_t p = begin;
    while (p < end) {
      const CodePoint cp = decode(fText.substr(0, end), p);
      if (isSpace(cp.value)) {
        std::size_t q = p + cp.length;
        while (q < end) {
          const CodePoint next = decode(fText.substr(0, end), q);
          if (!isSpace(next.value))
            break;
          q += next.length;
        }
        xPush(p, q, WORD_CLASS_INTERSPACE);
        afterWord = false;
        p = q;
      } else if (isLink(cp.value) && afterWord && xWordStartsAt(p + cp.length, end)) {
        xPush(p, p + cp.length, WORD_CLASS_LINK_BETWEEN_WORDS);
        afterWord = false;
        p += cp.length;
      } else if (isPunctuation(cp.value) || isLink(cp.value)) {
        // A repeated mark ("...", "!!!") is one chunk.
        std::size_t q = p + cp.length;
        while (q + cp.length <= end && fText.compare(q, cp.length, fText, p, cp.length) == 0)
          q += cp.length;
        xPush(p, q, WORD_CLASS_PUNCTUATION);
        afterWord = false;
        p = q;
      } else {
        p = fSpaced ? xSpacedWord(p, end, afterWord) : xUnspacedWord(p, end, cp);
        if (!fSpaced)
          afterWord = true;
      }
    }
  }

  void pushTag(std::size_t begin, std::size_t end) {
    Chunk chunk;
    chunk.text.reserve(end - begin + 2);
    chunk.text += ' ';
    chunk.text.append(fText, begin, end - begin);
    chunk.text += ' ';
    chunk.classes.push_back({WORD_CLASS_BOOKMARK, {}});
    fChunks.push_back(std::move(chunk));
  }

 private:
  bool xWordStartsAt(std::size_t p, std::size_t end) const {
    return p < end && isWordCharacter(decode(fText.substr(0, end), p).value);
  }

  // The length of the longest stored word at p, and its node.
  std::size_t xLongestStored(std::size_t p, std::size_t end,
                             std::optional<std::uint32_t>& node) const {
    std::size_t longest = 0;
    if (fDatabase != nullptr)
      node = fDatabase->findLongest(fLower.substr(0, end), p, longest);
    return longest;
  }

  // The node of exactly these bytes, when they are a stored word.
  std::optional<std::uint32_t> xStored(std::size_t begin, std::size_t end) const {
    std::size_t longest = 0;
    if (fDatabase == nullptr)
      return std::nullopt;
    return fDatabase->find(fLower.substr(begin, end - begin), 0, longest);
  }

  // Returns the position after what was taken; afterWord tells whether that ends with
  // a word.
  std::size_t xSpacedWord(std::size_t p, std::size_t end, bool& afterWord) {
    afterWord = true;
    if (isDigit(fText[p])) {
      // Digits, with single spaces, commas or full stops between digits: "1 000",
      // "3,5", "1,000.50".
      std::size_t q = p;
      while (q < end && isDigit(fText[q]))
        ++q;
      while (q + 1 < end && (fText[q] == ' ' || fText[q] == ',' || fText[q] == '.') &&
             isDigit(fText[q + 1])) {
        ++q;
        while (q < end && isDigit(fText[q]))
          ++q;
      }
      xPushWord(p, q, xStored(p, q));
      return q;
    }
    std::optional<std::uint32_t> node;
    const std::size_t stored = xLongestStored(p, end, node);
    if (stored > 0) {
      const std::size_t m = p + stored;
      const char last = fLower[m - 1];
      if ((last == '\'' || last == '-') && stored > 1) {
        xPushWord(p, m - 1, xStored(p, m - 1));
        xPush(m - 1, m, WORD_CLASS_LINK_BETWEEN_WORDS);
        afterWord = false;
        return m;
      }
      if (!xWordStartsAt(m, end)) {
        xPushWord(p, m, node);
        return m;
      }
    }
    std::size_t q = p;
    while (q < end) {
      const CodePoint cp = decode(fText.substr(0, end), q);
      if (!isWordCharacter(cp.value))
        break;
      q += cp.length;
    }
    // A stored word can be shorter than the longest stored prefix ("peut" of "peut-êtres").
    const std::optional<std::uint32_t> own = stored > q - p ? xStored(p, q) : std::nullopt;
    std::vector<ZULingClassFeatures> derived;
    if (!own)
      derived = xRepeatedVerb(p, q);
    if (derived.empty())
      xPushWord(p, q, own);
    else
      xPushWord(p, q, std::move(derived));
    return q;
  }

  // An unknown word made of a prefix of repetition or undoing and a stored verb
  // ("recompresse", "réattache", "désarchiver", "repack"): the verb records of the verb,
  // with no base form (the word's is not the verb's).
  std::vector<ZULingClassFeatures> xRepeatedVerb(std::size_t p, std::size_t q) const {
    std::vector<ZULingClassFeatures> classes;
    if (fDatabase == nullptr)
      return classes;
    for (const std::string_view prefix : kVerbPrefixes) {
      if (q - p <= prefix.size() + 1 || fLower.compare(p, prefix.size(), prefix) != 0)
        continue;
      if (const std::optional<std::uint32_t> verb = xStored(p + prefix.size(), q)) {
        for (ZULingClassFeatures& record : fDatabase->wordClassesAt(*verb)) {
          if (record.wordClass == WORD_CLASS_VERB)
            classes.push_back(std::move(record));
        }
        if (!classes.empty())
          break;
      }
    }
    return classes;
  }

  std::size_t xUnspacedWord(std::size_t p, std::size_t end, CodePoint cp) {
    std::optional<std::uint32_t> node;
    const std::size_t stored = xLongestStored(p, end, node);
    // A run of katakana is written as one word: a stored word that ends inside it does
    // not count ("プロンプト" although "プロ" is stored, "ファイルシステム").
    const int script = unknownRunScript(cp.value);
    if (script == kKatakana && p >= fRunEnd) {
      fRunEnd = xRunEnd(p, end, script);
      if (p + stored < fRunEnd) {
        xPushWord(p, fRunEnd, std::nullopt);
        return fRunEnd;
      }
    }
    if (stored > 0 &&
        (p + stored == end || (static_cast<unsigned char>(fText[p + stored]) & 0xC0) != 0x80)) {
      xPushWord(p, p + stored, node);
      return p + stored;
    }
    const std::size_t q = script != 0 ? xRunEnd(p, end, script) : p + cp.length;
    // Not stored: a stored word would have been the longest prefix.
    xPushWord(p, q, std::nullopt);
    return q;
  }

  std::size_t xRunEnd(std::size_t p, std::size_t end, int script) const {
    while (p < end) {
      const CodePoint next = decode(fText.substr(0, end), p);
      if (unknownRunScript(next.value) != script)
        break;
      p += next.length;
    }
    return p;
  }

  void xPush(std::size_t begin, std::size_t end, ZULingWordClass wordClass) {
    Chunk chunk;
    chunk.text.assign(fText, begin, end - begin);
    chunk.length = static_cast<std::int32_t>(end - begin);
    chunk.classes.push_back({wordClass, {}});
    fChunks.push_back(std::move(chunk));
  }

  void xPushWord(std::size_t begin, std::size_t end, std::optional<std::uint32_t> node) {
    xPushWord(begin, end,
              node ? fDatabase->wordClassesAt(*node)
                   : std::vector<ZULingClassFeatures>{{WORD_CLASS_UNKNOWN, {}}},
              node);
  }

  void xPushWord(std::size_t begin, std::size_t end, std::vector<ZULingClassFeatures> classes,
                 std::optional<std::uint32_t> node = std::nullopt) {
    Chunk chunk;
    chunk.text.assign(fText, begin, end - begin);
    chunk.length = static_cast<std::int32_t>(end - begin);
    chunk.classes = std::move(classes);
    chunk.node = node;
    if (fText[begin] >= 'A' && fText[begin] <= 'Z') {
      if (chunk.classes.size() == 1 && chunk.classes.front().wordClass == WORD_CLASS_UNKNOWN)
        chunk.classes.front() = {WORD_CLASS_PROPER_NOUN, {}};
      else
        chunk.classes.push_back({WORD_CLASS_PROPER_NOUN, {}});
    }
    fChunks.push_back(std::move(chunk));
  }

  const ZULingSyntacticAnalyzerBinaryDatabase* fDatabase;
  std::string_view fText;
  std::string_view fLower;
  std::vector<Chunk>& fChunks;
  bool fSpaced;
  // The end of the last run of one script that was checked, where words are not spaced.
  std::size_t fRunEnd = 0;
};

// ---- structures --------------------------------------------------------------------

// What a word does in its group, from its classes and its neighbours.
enum class Role : std::uint8_t {
  Noun,
  Pronoun,
  Determiner,
  Adjective,
  Adverb,
  Verb,
  Auxiliary,
  Clitic,
  Preposition,
  Conjunction,
  Subordinator,
  Interjection,
};

Role roleOfClass(ZULingWordClass wordClass) noexcept {
  switch (wordClass) {
    case WORD_CLASS_ADJECTIVE:
      return Role::Adjective;
    case WORD_CLASS_ADVERB:
      return Role::Adverb;
    case WORD_CLASS_CONJUNCTIVE:
      return Role::Conjunction;
    case WORD_CLASS_SUB_CONJ:
      return Role::Subordinator;
    case WORD_CLASS_DETERMINANT:
      return Role::Determiner;
    case WORD_CLASS_INTERJECTION:
      return Role::Interjection;
    case WORD_CLASS_PREPOSITION:
      return Role::Preposition;
    case WORD_CLASS_PRONOUN:
      return Role::Pronoun;
    case WORD_CLASS_VERB:
      return Role::Verb;
    case WORD_CLASS_AUXILIARY:
      return Role::Auxiliary;
    case WORD_CLASS_PRONOUN_COMP:
      return Role::Clitic;
    default:
      return Role::Noun;
  }
}

bool isVerbal(Role role) noexcept {
  return role == Role::Verb || role == Role::Auxiliary || role == Role::Clitic;
}

enum class Coordination : std::uint8_t { None, And, Or };

// A word or a separator of the structure analysis; spaces, links and speech-engine tags
// are left out, so they never part a group.
struct Token {
  enum Type : std::uint8_t { Word, Comma, Break };
  Type type = Break;
  std::size_t chunk = 0;
  Role role = Role::Noun;
  Coordination coordination = Coordination::None;
  bool particle = false;
  // The word lowercased, in the builder's buffer.
  std::string_view lower;
  std::uint32_t records = 0;                        // bit per word class the word has
  ZULingWordClass firstClass = WORD_CLASS_UNKNOWN;  // the class of its first record
  bool infinitive = false;                          // a verb record of the infinitive
  bool participle = false;                          // a verb record of a participle
  bool gerund = false;                              // a verb record of a present participle
  bool simplePast = false;                          // a verb record of the simple past
  bool negativeDeterminer = false;                  // a determiner record of negation ("no")
  bool finite = false;         // a verb or auxiliary record of a tense, none of a participle
  bool thirdSingular = false;  // a verb record of a tense in the third person singular

  bool has(ZULingWordClass wordClass) const noexcept { return (records >> wordClass) & 1u; }
};

struct Group {
  std::size_t firstToken = 0;
  std::size_t lastToken = 0;
  ZULingStructureKind kind = STRUCTURE_NOMINAL;
  Role lastRole = Role::Noun;
  bool used = false;
};

class StructureBuilder {
 public:
  StructureBuilder(const std::vector<Chunk>& chunks, bool spaced)
      : fChunks(chunks), fSpaced(spaced) {}

  std::vector<Structure> build() {
    xTokens();
    if (fSpaced)
      xSpacedRoles();
    else
      xUnspacedRoles();
    xGroups();
    // Both lists are in text order.
    std::vector<Structure> coordinations = xCoordinations();
    std::vector<Structure> structures;
    structures.reserve(fGroups.size());
    auto next = coordinations.begin();
    for (const Group& group : fGroups) {
      if (group.used)
        continue;
      Structure structure = xGroupStructure(group);
      for (; next != coordinations.end() && next->first < structure.first; ++next)
        structures.push_back(std::move(*next));
      structures.push_back(std::move(structure));
    }
    for (; next != coordinations.end(); ++next)
      structures.push_back(std::move(*next));
    return structures;
  }

 private:
  static constexpr std::size_t kNone = static_cast<std::size_t>(-1);

  void xTokens() {
    std::size_t bytes = 0;
    for (const Chunk& chunk : fChunks)
      bytes += chunk.text.size();
    fLower.reserve(bytes);
    for (std::size_t c = 0; c < fChunks.size(); ++c) {
      const Chunk& chunk = fChunks[c];
      const ZULingWordClass wordClass = chunk.wordClass();
      if (wordClass == WORD_CLASS_PUNCTUATION) {
        Token token;
        token.type = chunk.text.size() <= 3 && isOneOf(chunk.text, kItemSeparators) ? Token::Comma
                                                                                    : Token::Break;
        token.chunk = c;
        fTokens.push_back(std::move(token));
        continue;
      }
      if (wordClass < WORD_CLASS_UNKNOWN || xHyphenatedPrefix(c))
        continue;
      Token token;
      token.type = Token::Word;
      token.chunk = c;
      const std::size_t from = fLower.size();
      for (const char b : chunk.text)
        fLower += lowerByte(b);
      token.lower = std::string_view(fLower).substr(from);
      token.role = roleOfClass(wordClass);
      token.firstClass = wordClass;
      for (const ZULingClassFeatures& record : chunk.classes) {
        if (record.wordClass >= 0 && record.wordClass < 32)
          token.records |= 1u << record.wordClass;
        if (record.wordClass == WORD_CLASS_VERB && record.features.find('W') != std::string::npos)
          token.infinitive = true;
        if (record.wordClass == WORD_CLASS_VERB &&
            record.features.find_first_of("KG") != std::string::npos)
          token.participle = true;
        if (record.wordClass == WORD_CLASS_VERB && record.features.find('G') != std::string::npos)
          token.gerund = true;
        if (record.wordClass == WORD_CLASS_VERB && record.features.find('J') != std::string::npos)
          token.simplePast = true;
        if ((record.wordClass == WORD_CLASS_VERB || record.wordClass == WORD_CLASS_AUXILIARY) &&
            record.features.find_first_of("PIJFCST") != std::string::npos)
          token.finite = true;
        if (record.wordClass == WORD_CLASS_VERB &&
            record.features.find_first_of("PIJFCST") != std::string::npos &&
            record.features.find('3') != std::string::npos &&
            record.features.find('s') != std::string::npos)
          token.thirdSingular = true;
        if (record.wordClass == WORD_CLASS_DETERMINANT &&
            record.features.find('n') != std::string::npos)
          token.negativeDeterminer = true;
      }
      token.finite = token.finite && (!token.participle || wordClass == WORD_CLASS_AUXILIARY);
      if (kCoordinationFirstBytes[static_cast<unsigned char>(token.lower[0])]) {
        if (isOneOf(token.lower, kAndWords))
          token.coordination = Coordination::And;
        else if (isOneOf(token.lower, kOrWords))
          token.coordination = Coordination::Or;
        token.particle = isOneOf(token.lower, kParticles);
      }
      if (token.coordination != Coordination::None)
        token.role = Role::Conjunction;
      else if (lingIsNegationWord(chunk.text) && !isVerbal(token.role))
        token.role = Role::Adverb;
      fTokens.push_back(std::move(token));
    }
  }

  bool xIsWord(std::size_t t) const { return t < fTokens.size() && fTokens[t].type == Token::Word; }

  // Whether chunk c is a prefix of repetition or undoing joined by a hyphen to the verb it
  // qualifies ("re-save", "ré-installer"): the verb stands for both.
  bool xHyphenatedPrefix(std::size_t c) const {
    if (c + 2 >= fChunks.size() || fChunks[c + 1].text != "-" ||
        fChunks[c + 1].wordClass() != WORD_CLASS_LINK_BETWEEN_WORDS ||
        std::none_of(fChunks[c + 2].classes.begin(), fChunks[c + 2].classes.end(),
                     [](const ZULingClassFeatures& r) { return r.wordClass == WORD_CLASS_VERB; }))
      return false;
    return isOneOf(lowercase(fChunks[c].text), kVerbPrefixes);
  }

  // Where words are spaced: the first class is the word's guess, which its neighbours
  // correct. After a comma or a coordinating word, a word that can be read as the word
  // before the separator is read so ("speak, listen and move", "pommes et prunes"). A
  // word read as a noun or preposition after a subject, an auxiliary or an object
  // pronoun (adverbs between), or after "to", is a verb when it can be one ("I like
  // apples"); after a determiner, an adjective or a preposition, a verb that can be a
  // noun is one ("les pommes", "the walk"), unless an infinitive follows a preposition
  // ("de manger"); a determiner that can be an object pronoun before a verb is one ("je
  // le mange"), after a subject even before a word that can be a noun ("et je les range").
  // But after a comma or a coordinating word (adverbs between), a word that is
  // first an auxiliary, or first a verb and takes an object (a determiner, a pronoun, a
  // name or a word the lexicon does not know), begins a second action ("and are not
  // requirements", "build it with dpkg-buildpackage and run lintian"), and so does any
  // word that can be a verb after "then" ("and then insert the comments"); a word that can
  // be a verb before a known noun, or written with a capital, stays a noun ("the directory
  // and file names", "et Chapitre 9"). A quantifier between a subject that begins its clause
  // and a verb is an adverb of that verb ("and they all have").
  void xSpacedRoles() {
    enum class List : std::uint8_t { None, Nominal, Verbal };
    const auto listOf = [](Role role) {
      if (role == Role::Verb || role == Role::Auxiliary)
        return List::Verbal;
      if (role == Role::Noun || role == Role::Pronoun || role == Role::Adjective ||
          role == Role::Determiner)
        return List::Nominal;
      return List::None;
    };
    bool verbContext = false;
    bool clauseStart = false;  // after a comma or a coordinating word, adverbs between
    bool then = false;         // and after "then"
    bool adverbs = false;      // and after an adverb there
    List list = List::None;
    Role previous = Role::Conjunction;
    Role lastContent = Role::Conjunction;
    std::string_view previousWord;
    bool subjectBefore = false;  // the word before is a pronoun that begins its clause
    for (std::size_t t = 0; t < fTokens.size(); ++t) {
      Token& token = fTokens[t];
      const bool beginsClause = clauseStart || t == 0 || !xIsWord(t - 1);
      if (token.type != Token::Word) {
        subjectBefore = false;
        verbContext = false;
        clauseStart = token.type == Token::Comma;
        adverbs = false;
        then = false;
        list = token.type == Token::Comma ? listOf(lastContent) : List::None;
        previousWord = {};
        continue;
      }
      if (token.coordination != Coordination::None) {
        subjectBefore = false;
        verbContext = false;
        clauseStart = true;
        adverbs = false;
        then = false;
        list = listOf(lastContent);
        previous = token.role;
        previousWord = token.lower;
        continue;
      }
      Role role = token.role;
      const bool nounContext = t > 0 && xIsWord(t - 1) &&
                               (previous == Role::Determiner || previous == Role::Adjective ||
                                (previous == Role::Preposition && previousWord != "to"));
      const bool canBeVerb = token.has(WORD_CLASS_VERB);
      const bool canBeNoun = token.has(WORD_CLASS_NOUN);
      const bool auxiliary = token.firstClass == WORD_CLASS_AUXILIARY;
      const bool action =
          clauseStart && canBeVerb &&
          (then ||
           (!token.has(WORD_CLASS_PROPER_NOUN) &&
            (auxiliary || (token.firstClass == WORD_CLASS_VERB && xObjectAt(t + 1)) ||
             ((token.infinitive || token.thirdSingular) && xParticleAt(t + 1) &&
              xObjectAt(t + 2)) ||
             (adverbs && token.infinitive && !token.thirdSingular &&
              (xObjectAt(t + 1) || (xIsWord(t + 1) && fTokens[t + 1].role == Role::Preposition)) &&
              xBaseVerbBefore(t)))));
      if (action) {
        role = auxiliary ? Role::Auxiliary : Role::Verb;
      } else if (list == List::Verbal && canBeVerb &&
                 (role == Role::Noun || role == Role::Preposition || role == Role::Adjective)) {
        role = Role::Verb;
      } else if (list == List::Nominal && canBeNoun &&
                 (role == Role::Verb || role == Role::Auxiliary)) {
        role = Role::Noun;
      } else if ((role == Role::Verb || role == Role::Auxiliary) && canBeNoun && !verbContext &&
                 nounContext && !(previous == Role::Preposition && token.infinitive)) {
        role = Role::Noun;
      } else if ((role == Role::Noun || role == Role::Preposition) && canBeVerb &&
                 (verbContext || previousWord == "to")) {
        role = Role::Verb;
      }
      if (role == Role::Determiner && token.has(WORD_CLASS_PRONOUN_COMP) && xIsWord(t + 1)) {
        const Token& next = fTokens[t + 1];
        if ((next.has(WORD_CLASS_VERB) || next.has(WORD_CLASS_AUXILIARY)) &&
            (subjectBefore || (!next.has(WORD_CLASS_NOUN) && !next.has(WORD_CLASS_ADJECTIVE))))
          role = Role::Clitic;
      }
      if (role == Role::Determiner && subjectBefore &&
          (token.has(WORD_CLASS_ADVERB) || token.has(WORD_CLASS_PRONOUN)) && xIsWord(t + 1) &&
          (fTokens[t + 1].has(WORD_CLASS_VERB) || fTokens[t + 1].has(WORD_CLASS_AUXILIARY)))
        role = Role::Adverb;
      // "de" before an infinitive, its object pronoun between or not, is its preposition
      // ("et de déboguer", "et de le mentionner"), not a partitive.
      if (role == Role::Determiner && token.has(WORD_CLASS_PREPOSITION) &&
          (token.lower == "de" || token.lower == "d") && xIsWord(t + 1) &&
          (fTokens[t + 1].infinitive || (fTokens[t + 1].has(WORD_CLASS_PRONOUN_COMP) &&
                                         xIsWord(t + 2) && fTokens[t + 2].infinitive)))
        role = Role::Preposition;
      // A pronoun that can be an object, between a subject and its verb, is the verb's
      // ("et vous vous apprêtez", "nous nous levons").
      if (role == Role::Pronoun && previous == Role::Pronoun && t > 0 && xIsWord(t - 1) &&
          token.has(WORD_CLASS_PRONOUN_COMP) && xIsWord(t + 1) &&
          (fTokens[t + 1].has(WORD_CLASS_VERB) || fTokens[t + 1].has(WORD_CLASS_AUXILIARY)))
        role = Role::Clitic;
      // "This" before a word of the third person singular is the subject of that verb: as
      // a determiner it would stand before a plural ("this bypasses the channel").
      if (role == Role::Noun && token.thirdSingular && t > 0 && xIsWord(t - 1) &&
          fTokens[t - 1].lower == "this" && fTokens[t - 1].has(WORD_CLASS_PRONOUN)) {
        fTokens[t - 1].role = Role::Pronoun;
        role = Role::Verb;
      }
      // An adjective that can be an adverb, between an auxiliary and an infinitive, is the
      // verb's adverb ("should better be version agnostic").
      if (role == Role::Adjective && token.has(WORD_CLASS_ADVERB) && previous == Role::Auxiliary &&
          t > 0 && xIsWord(t - 1) && xIsWord(t + 1) && fTokens[t + 1].infinitive)
        role = Role::Adverb;
      // The answer "No." or "No, ..." rather than the determiner of "no file".
      if (role == Role::Determiner && token.negativeDeterminer &&
          token.has(WORD_CLASS_INTERJECTION) && !xIsWord(t + 1))
        role = Role::Interjection;
      // A conjunction that is no coordinating word and can be an adverb, right after a verb,
      // is that verb's adverb ("revêt donc une importance").
      if (role == Role::Conjunction && token.has(WORD_CLASS_ADVERB) && t > 0 && xIsWord(t - 1) &&
          (previous == Role::Verb || previous == Role::Auxiliary))
        role = Role::Adverb;
      token.role = role;
      subjectBefore = role == Role::Pronoun && beginsClause;
      clauseStart = clauseStart && role == Role::Adverb;
      adverbs = clauseStart;
      then = clauseStart && (then || isOneOf(token.lower, kThenWords));
      verbContext = role == Role::Pronoun || role == Role::Auxiliary || role == Role::Clitic ||
                    (verbContext && role == Role::Adverb);
      if (role != Role::Adverb && role != Role::Determiner)
        list = List::None;
      if (listOf(role) != List::None)
        lastContent = role;
      previous = role;
      previousWord = token.lower;
    }
  }

  // Whether token t is the particle of a phrasal verb ("set up", "turn off").
  bool xParticleAt(std::size_t t) const {
    return xIsWord(t) && isOneOf(fTokens[t].lower, kVerbParticles) &&
           (fTokens[t].has(WORD_CLASS_PREPOSITION) || fTokens[t].has(WORD_CLASS_ADVERB));
  }

  // Whether the last verb before the coordinating word or comma that leads to token t (past
  // adverbs), in the same sentence, is of the base form: after "to" or an auxiliary, or at
  // the head of its clause ("to stay out of such debates, and maybe skim through").
  bool xBaseVerbBefore(std::size_t t) const {
    while (t > 0 && xIsWord(t - 1) && fTokens[t - 1].role == Role::Adverb)
      --t;
    while (t > 0) {
      --t;
      const Token& token = fTokens[t];
      if (token.type == Token::Break) {
        if (xInWordMark(t))
          continue;
        return false;
      }
      if (token.type == Token::Comma || token.coordination != Coordination::None)
        continue;
      if (token.role == Role::Subordinator || isOneOf(token.lower, kRelativeWords) ||
          isOneOf(token.lower, kQuestionWords))
        return false;
      if (token.role == Role::Verb || token.role == Role::Auxiliary) {
        if (!token.infinitive || token.role == Role::Auxiliary)
          return false;
        return t == 0 || !xIsWord(t - 1) || fTokens[t - 1].lower == "to" ||
               fTokens[t - 1].role == Role::Auxiliary;
      }
    }
    return false;
  }

  // Whether token t may begin the object of a verb before it: a determiner, a pronoun, a
  // name or an unknown word ("run lintian").
  bool xObjectAt(std::size_t t) const {
    if (!xIsWord(t) || fTokens[t].coordination != Coordination::None)
      return false;
    switch (fTokens[t].firstClass) {
      case WORD_CLASS_DETERMINANT:
      case WORD_CLASS_PRONOUN:
      case WORD_CLASS_PRONOUN_COMP:
      case WORD_CLASS_PROPER_NOUN:
      case WORD_CLASS_UNKNOWN:
        return true;
      default:
        return false;
    }
  }

  // Whether token t is an adjective or an adverb, and the words after it up to a noun are
  // too ("quick replies", "precise data").
  bool xQualifiedNounAt(std::size_t t) const {
    if (!xIsWord(t) || (fTokens[t].role != Role::Adjective && fTokens[t].role != Role::Adverb))
      return false;
    while (xIsWord(t) && (fTokens[t].role == Role::Adjective || fTokens[t].role == Role::Adverb))
      ++t;
    return xIsWord(t) && fTokens[t].has(WORD_CLASS_NOUN);
  }

  // Whether token t is a verb of the base form led by "to" ("to avoid").
  bool xToInfinitiveAt(std::size_t t) const {
    return t > 0 && xIsWord(t) && fTokens[t].role == Role::Verb && fTokens[t].infinitive &&
           xIsWord(t - 1) && fTokens[t - 1].lower == "to";
  }

  // Where words are not spaced (Japanese): after a verb or an auxiliary, a word that
  // can be an auxiliary is one ("食べ" + "ない").
  void xUnspacedRoles() {
    for (std::size_t t = 1; t < fTokens.size(); ++t) {
      Token& token = fTokens[t];
      if (token.type != Token::Word || !xIsWord(t - 1))
        continue;
      const Role previous = fTokens[t - 1].role;
      if ((previous == Role::Verb || previous == Role::Auxiliary) &&
          token.has(WORD_CLASS_AUXILIARY) && token.role != Role::Verb &&
          token.coordination == Coordination::None)
        token.role = Role::Auxiliary;
    }
  }

  Role xNextWordRole(std::size_t t) const {
    return xIsWord(t + 1) ? fTokens[t + 1].role : Role::Conjunction;
  }

  // Groups: runs of nominal words (determiners, adjectives, nouns, pronouns) and runs of
  // verbal words (verbs, auxiliaries, object pronouns, adverbs), with an adverb joining
  // the nominal group of the adjective or noun it stands before. Prepositions,
  // conjunctions, commas and other punctuation part groups; an interjection is a group
  // of its own.
  void xGroups() {
    fGroupOfToken.assign(fTokens.size(), kNone);
    std::size_t current = kNone;
    const auto start = [&](std::size_t t, ZULingStructureKind kind) {
      fGroups.push_back({t, t, kind, fTokens[t].role, false});
      current = fGroups.size() - 1;
      fGroupOfToken[t] = current;
    };
    const auto extend = [&](std::size_t t) {
      fGroups[current].lastToken = t;
      fGroups[current].lastRole = fTokens[t].role;
      fGroupOfToken[t] = current;
    };
    const auto currentKind = [&]() {
      return current == kNone ? STRUCTURE_AND : fGroups[current].kind;
    };
    for (std::size_t t = 0; t < fTokens.size(); ++t) {
      const Token& token = fTokens[t];
      if (token.type != Token::Word) {
        current = kNone;
        continue;
      }
      switch (token.role) {
        case Role::Subordinator:
          // "食べ" + "て" + "いる": inside a verb group where words are not spaced.
          if (!fSpaced && currentKind() == STRUCTURE_VERB && isVerbal(xNextWordRole(t))) {
            extend(t);
            break;
          }
          current = kNone;
          break;
        case Role::Preposition:
        case Role::Conjunction:
          current = kNone;
          break;
        case Role::Interjection:
          start(t, STRUCTURE_NOMINAL);
          current = kNone;
          break;
        case Role::Verb:
        case Role::Auxiliary:
        case Role::Clitic:
          if (currentKind() == STRUCTURE_VERB)
            extend(t);
          else
            start(t, STRUCTURE_VERB);
          break;
        case Role::Adverb: {
          const Role next = xNextWordRole(t);
          if (currentKind() == STRUCTURE_VERB)
            extend(t);
          else if (next == Role::Adjective || next == Role::Adverb || next == Role::Determiner ||
                   next == Role::Noun)
            currentKind() == STRUCTURE_NOMINAL ? extend(t) : start(t, STRUCTURE_NOMINAL);
          else
            start(t, STRUCTURE_VERB);
          break;
        }
        default: {
          // A determiner of negation ("with no file") belongs to no group: it asks for
          // no gesture of its own, the head shake being the answer "No."'s.
          if (token.role == Role::Determiner && token.negativeDeterminer)
            break;
          // Nominal words. Where words are spaced, a determiner or a pronoun after a
          // noun or pronoun, or a word after a pronoun, begins another group.
          bool same = currentKind() == STRUCTURE_NOMINAL;
          if (same && fSpaced) {
            const Role last = fGroups[current].lastRole;
            if (((last == Role::Noun || last == Role::Pronoun) &&
                 (token.role == Role::Determiner || token.role == Role::Pronoun)) ||
                last == Role::Pronoun)
              same = false;
          }
          same ? extend(t) : start(t, STRUCTURE_NOMINAL);
          break;
        }
      }
    }
  }

  std::size_t xGroupStartingAt(std::size_t t) const {
    if (t >= fTokens.size() || fGroupOfToken[t] == kNone)
      return kNone;
    const std::size_t g = fGroupOfToken[t];
    return fGroups[g].firstToken == t && !fGroups[g].used ? g : kNone;
  }

  std::size_t xGroupEndingAt(std::size_t t) const {
    if (t >= fTokens.size() || fGroupOfToken[t] == kNone)
      return kNone;
    const std::size_t g = fGroupOfToken[t];
    return fGroups[g].lastToken == t && !fGroups[g].used ? g : kNone;
  }

  bool xIsPreposition(std::size_t t) const {
    return fSpaced && xIsWord(t) && fTokens[t].role == Role::Preposition;
  }

  struct Item {
    std::size_t firstToken;
    std::size_t group;
  };

  // The item that begins at token t: a group, with a preposition before it where words
  // are spaced ("in Paris, in London and in Tokyo").
  bool xItemAt(std::size_t t, Item& item) const {
    const std::size_t from = xIsPreposition(t) ? t + 1 : t;
    const std::size_t g = xGroupStartingAt(from);
    if (g == kNone)
      return false;
    item = {t, g};
    return true;
  }

  // The item that ends at token t.
  bool xItemBefore(std::size_t t, Item& item) const {
    const std::size_t g = xGroupEndingAt(t);
    if (g == kNone)
      return false;
    const std::size_t first = fGroups[g].firstToken;
    item = {first > 0 && xIsPreposition(first - 1) ? first - 1 : first, g};
    return true;
  }

  // Coordinations: around each "and" or "or" word, the item after it (more items after
  // further same words) and the items before it, separated by commas or by the same
  // word ("apples, pears and plums", "A と B と C"). The items are things: nominal
  // groups, all ending in an adjective or all in another word, and in a noun or pronoun
  // for the Japanese particles. Items begin with a preposition only when the last one
  // does; otherwise a preposition ends the list. Verbs and clauses joined by the word
  // coordinate nothing (see xStartsClause).
  std::vector<Structure> xCoordinations() {
    std::vector<Structure> structures;
    std::vector<bool> consumed(fTokens.size(), false);
    for (std::size_t c = 0; c < fTokens.size(); ++c) {
      const Token& word = fTokens[c];
      if (word.type != Token::Word || word.coordination == Coordination::None || consumed[c])
        continue;
      std::vector<Item> after;
      Item item{};
      if (!xItemAt(c + 1, item))
        continue;
      // Things only: verbs joined by the word ("read, write and remove") are actions,
      // and make no enumeration.
      const ZULingStructureKind kind = fGroups[item.group].kind;
      if (kind != STRUCTURE_NOMINAL || (word.particle && !xNounHeaded(item.group)))
        continue;
      // "garder les fichiers ou non": the choice of doing or not doing, no list.
      const Group& right = fGroups[item.group];
      if (right.firstToken == right.lastToken &&
          isOneOf(fTokens[right.firstToken].lower, kNotWords))
        continue;
      const bool adjectives = fGroups[item.group].lastRole == Role::Adjective;
      const auto sameKind = [&](std::size_t g) {
        return fGroups[g].kind == kind && (fGroups[g].lastRole == Role::Adjective) == adjectives &&
               (!word.particle || xNounHeaded(g));
      };
      after.push_back(item);
      std::vector<std::size_t> words{c};
      for (std::size_t k = fGroups[item.group].lastToken + 1;
           xIsWord(k) && fTokens[k].coordination == word.coordination && xItemAt(k + 1, item) &&
           sameKind(item.group);
           k = fGroups[item.group].lastToken + 1) {
        words.push_back(k);
        after.push_back(item);
      }
      std::vector<Item> before;
      std::size_t end = c;
      const bool commaBefore = end > 0 && fTokens[end - 1].type == Token::Comma && fSpaced;
      if (commaBefore)
        --end;  // "apples, pears, and plums"
      const bool prepositions = after.front().firstToken != fGroups[after.front().group].firstToken;
      while (end > 0 && xItemBefore(end - 1, item) && sameKind(item.group)) {
        if (item.firstToken != fGroups[item.group].firstToken && !prepositions) {
          // "for example apples, pears and plums": the preposition leads the list.
          item.firstToken = fGroups[item.group].firstToken;
          before.push_back(item);
          break;
        }
        before.push_back(item);
        if (item.firstToken == 0)
          break;
        const std::size_t separator = item.firstToken - 1;
        const Token& s = fTokens[separator];
        if (s.type == Token::Comma) {
          end = separator;
        } else if (s.type == Token::Word && s.coordination == word.coordination &&
                   !consumed[separator]) {
          words.push_back(separator);
          end = separator;
        } else {
          break;
        }
      }
      if (before.empty())
        continue;
      // "A and B and C" with no comma, where B begins with a word that can be a verb before
      // its object: the first word joins a second action, and the things are those that the
      // second joins ("they are delegates of the leader and moderate news and
      // announcements").
      if (after.size() >= 2 && !commaBefore && before.size() == 1 &&
          xVerbBeforeObject(after.front().group)) {
        consumed[c] = true;
        continue;
      }
      if (fSpaced && xStartsClause(after.front(), before.back(), commaBefore, before.size()))
        continue;
      for (std::size_t w : words)
        consumed[w] = true;
      Structure structure;
      structure.kind = word.coordination == Coordination::And ? STRUCTURE_AND : STRUCTURE_OR;
      structure.first = fTokens[before.back().firstToken].chunk;
      structure.last = fTokens[fGroups[after.back().group].lastToken].chunk;
      std::reverse(before.begin(), before.end());
      before.insert(before.end(), after.begin(), after.end());
      for (const Item& i : before) {
        fGroups[i.group].used = true;
        structure.children.push_back(xGroupStructure(fGroups[i.group]));
      }
      structure.itemCount = static_cast<std::int32_t>(before.size());
      structure.notNegated = xNotNegated(structure.first, structure.last);
      structures.push_back(std::move(structure));
    }
    return structures;
  }

  // Whether nominal group g begins with a word that can be a verb of a tense or of the base
  // form, and goes on.
  bool xVerbBeforeObject(std::size_t g) const {
    const Token& first = fTokens[fGroups[g].firstToken];
    return fGroups[g].firstToken < fGroups[g].lastToken && first.has(WORD_CLASS_VERB) &&
           (first.infinitive || first.thirdSingular) && !first.has(WORD_CLASS_PROPER_NOUN) &&
           (first.role == Role::Noun || first.role == Role::Adjective);
  }

  // A nominal group ending in its noun or pronoun: the only items of a Japanese particle,
  // which also quotes ("ないと思います") and marks case.
  bool xNounHeaded(std::size_t g) const {
    const Group& group = fGroups[g];
    return group.kind == STRUCTURE_NOMINAL &&
           (group.lastRole == Role::Noun || group.lastRole == Role::Pronoun);
  }

  // Two clauses, not a list, where the group after the coordinating word
  // - begins with a question word or "que" ("learn how it works and how you can help",
  //   "si vous n'êtes pas un porteur et que vous utilisez");
  // - is a lone word that can be a verb followed by its object, an adverb, "by" or "if", a
  //   participle followed by a preposition, a lone word that is first a verb followed by
  //   a preposition where the first item follows a verb, an infinitive followed by a
  //   preposition where the last verb group before the first item is a verb of a tense
  //   and an infinitive ("vous devriez envoyer le paquet vers DELAYED/7 et dire au
  //   responsable"), or an unknown word followed by an object pronoun or a determiner: a
  //   second action ("type your name and press the Enter key", "put in the archive and
  //   run by dpkg", "provided by the team and sent to the list", "it does more and comes
  //   with examples", "unpack it and repack it", "book a holiday and check if");
  // - begins with a verb that is first a verb, or a word that can be one before a
  //   determiner, when the first item follows a verb ("copy the files and run the tool",
  //   "aid developers and free their time");
  // - or is a subject, followed by a verb (past a participle that qualifies it, with its
  //   preposition; after a comma, past its prepositional groups) and without a
  //   preposition before it, while the first item does not begin a clause ("the skeleton
  //   of our package and it uses debhelper", "in the patches directory and the source
  //   tree is untouched"), or the first item follows a verb or a preposition ("I like tea
  //   and he likes coffee", "I was born in Paris and I was happy", "it has packages for
  //   most programs, and the number of packages is larger", "there were problems and a
  //   few of them were hard"), or stands alone before a comma ("there is one disk, and
  //   everything is there"; but "apples, pears, and plums are ripe" stays a list).
  bool xStartsClause(const Item& right, const Item& firstLeft, bool commaBefore,
                     std::size_t leftItems) const {
    const Group& group = fGroups[right.group];
    const Token& lone = fTokens[group.firstToken];
    if (isOneOf(lone.lower, kQuestionWords) || isOneOf(lone.lower, kThatWords))
      return true;
    // An aside in brackets after an item led by a determiner is read as if it were left out
    // ("and the whole session (input and display) will be secure"); after a name it rather
    // spells the name out, and the list goes on ("Reporting and Conformance (DMARC) are"),
    // unless it is a relative clause ("and Xfce (which we present later) has xfwm").
    const std::size_t bracket = group.lastToken + 1;
    const std::size_t next =
        lone.role == Role::Determiner ||
                (xIsWord(bracket + 1) && isOneOf(fTokens[bracket + 1].lower, kRelativeWords))
            ? xPastAside(bracket)
            : bracket;
    const std::size_t previous = firstLeft.firstToken;
    // A path or a name with marks inside is one word; the first item begins with it, or
    // with its leading mark ("is ip6.arpa and", "goes to /etc/ssl/certs/host.crt, and").
    std::size_t lead = xPathStart(previous);
    if (lead > 0 && xInWordMark(lead - 1))
      --lead;
    // The verb before the first item, or before the path that the item ends ("is
    // example.org and").
    const bool afterVerb = lead > 0 && fGroupOfToken[lead - 1] != kNone &&
                           fGroups[fGroupOfToken[lead - 1]].kind == STRUCTURE_VERB;
    const bool single = group.firstToken == group.lastToken;
    // A relative word before the rest of its clause, or before an auxiliary read as a noun
    // ("and that for this purpose it can", "des paquets de base et dont l'intégration",
    // "in Testing, or that can be moved"; but "this and that", "the name of the source and
    // that of the binary").
    // So does one before a subject pronoun and more words ("and that they properly
    // reconfigure the devices"; not "this and that one"), and one before a determiner ("and
    // that an earlier entry has precedence").
    if (isOneOf(lone.lower, kRelativeWords) &&
        (single ? xIsWord(next) && !isOneOf(fTokens[next].lower, kListPrepositions)
                : fTokens[group.firstToken + 1].firstClass == WORD_CLASS_AUXILIARY ||
                      fTokens[group.firstToken + 1].role == Role::Determiner ||
                      (fTokens[group.firstToken + 1].role == Role::Pronoun &&
                       (group.firstToken + 2 <= group.lastToken ||
                        (xIsWord(next) && (fTokens[next].has(WORD_CLASS_VERB) ||
                                           fTokens[next].has(WORD_CLASS_AUXILIARY)))))))
      return true;
    // A relative pronoun after a preposition leads a relative clause ("qui permet de relier
    // les commutateurs et sur lequel tout le trafic passe", "et auquel il tient").
    if ((right.firstToken != group.firstToken && isOneOf(lone.lower, kPrepositionRelatives)) ||
        isOneOf(lone.lower, kContractedRelatives))
      return true;
    // A French subject pronoun before its verb begins a clause, whatever leads the first item
    // ("ne pas donner plus que les droits utiles et il convient de").
    if (single && lone.role == Role::Pronoun && isOneOf(lone.lower, kCliticSubjects) &&
        xIsWord(next) && fGroupOfToken[next] != kNone &&
        fGroups[fGroupOfToken[next]].kind == STRUCTURE_VERB)
      return true;
    // "ce" before a relative word, or before a preposition and "quoi" or a relative word,
    // leads a relative clause ("ce qui se passe dans la communauté et ce à quoi ses membres
    // sont occupés").
    if (single && lone.lower == "ce" && xIsWord(next) &&
        (isOneOf(fTokens[next].lower, kRelativeWords) ||
         (xIsPreposition(next) && xIsWord(next + 1) &&
          (fTokens[next + 1].lower == "quoi" || isOneOf(fTokens[next + 1].lower, kRelativeWords)))))
      return true;
    if (leftItems == 1 && right.firstToken == group.firstToken && xGappedClause(group, lead, next))
      return true;
    // A word that can be a verb, before its object. After an infinitive led by "to" and its
    // object, a word that is first a verb or a noun may also begin a second action before an
    // object that an adjective or an adverb leads ("to skip the usual traps and get quick
    // replies", "to filter results and target precise data"; not "to buy red apples and green
    // organic pears", nor "shows the open bugs and release critical issues").
    if (!single && afterVerb && lone.infinitive &&
        (xObjectAt(group.firstToken + 1) ||
         ((lone.firstClass == WORD_CLASS_VERB || lone.firstClass == WORD_CLASS_NOUN) &&
          xQualifiedNounAt(group.firstToken + 1) && xToInfinitiveAt(lead - 1))))
      return true;
    // A verb of the third person before its object (adverbs between), after a clause whose
    // verb is one too or of the simple past ("it loads the image to the memory and hands
    // control over", "détecte les systèmes installés sur l'ordinateur et ajoute
    // automatiquement des choix").
    std::size_t object = group.firstToken + 1;
    while (object < group.lastToken && fTokens[object].role == Role::Adverb)
      ++object;
    if (!single && lone.thirdSingular &&
        (xObjectAt(object) || fTokens[object].role == Role::Noun) &&
        xThirdSingularVerbBefore(previous))
      return true;
    // A lone verb of the third person before a preposition, after a clause whose verb is one
    // too: a second action ("it considers the sender/recipient triplet and checks in its
    // database whether").
    if (single && lone.thirdSingular && lone.firstClass == WORD_CLASS_VERB &&
        xIsPreposition(next) && !isOneOf(fTokens[next].lower, kListPrepositions) &&
        xThirdSingularVerbBefore(previous))
      return true;
    // A subject led by a determiner, with a noun between, whose last word can be a verb of
    // the third person before that verb's object, where the clause's verb is one too ("handles
    // activation and configuration of interfaces and a user interface controls this daemon").
    if (lone.role == Role::Determiner && group.lastToken > group.firstToken + 1 &&
        fTokens[group.lastToken].thirdSingular && xIsWord(next) &&
        fTokens[next].role == Role::Determiner && !isOneOf(fTokens[next].lower, kPartitives) &&
        xThirdSingularVerbBefore(previous))
      return true;
    // After a comma and a lone item, a word that is first a verb of the third person: a
    // second action ("it is smaller, with only 50 workers, and produces amplifiers").
    if (commaBefore && leftItems == 1 && lone.firstClass == WORD_CLASS_VERB && lone.thirdSingular)
      return true;
    // The item followed by the word and the preposition that lead the first item: a second
    // clause of the same verb ("X goes to Y, and pki/private/host.key goes to
    // /etc/ssl/private").
    const std::size_t pathEnd = xPathEnd(next);
    if (lead >= 2 && xIsWord(pathEnd) && xIsPreposition(pathEnd + 1) && xIsPreposition(lead - 1) &&
        fTokens[lead - 1].lower == fTokens[pathEnd + 1].lower && xIsWord(lead - 2) &&
        fTokens[lead - 2].lower == fTokens[pathEnd].lower)
      return true;
    // After a comma and a lone item, an item between commas before a pronoun and its verb:
    // the second clause and a phrase that leads it ("it has various responsibilities, and
    // as official members, they have great influence"; not "and debuild, which is").
    if (commaBefore && leftItems == 1 && next + 2 < fTokens.size() &&
        fTokens[next].type == Token::Comma && xIsWord(next + 1) &&
        fTokens[next + 1].role == Role::Pronoun &&
        !isOneOf(fTokens[next + 1].lower, kRelativeWords) && fGroupOfToken[next + 2] != kNone &&
        fGroups[fGroupOfToken[next + 2]].kind == STRUCTURE_VERB &&
        xFiniteGroup(fGroupOfToken[next + 2]))
      return true;
    // A lone word that can be a verb of the same form as the verb whose preposition leads
    // the first item, before a preposition of its own: a second action of that subject
    // ("which they compile for the Unstable version and place on the server", "qu'il
    // compile pour Unstable et place sur le serveur"; not "assist with the translation and
    // review of documentation").
    if (single && lone.has(WORD_CLASS_VERB) && xIsPreposition(next) &&
        !isOneOf(fTokens[next].lower, kListPrepositions) && previous > 1 &&
        xIsPreposition(previous - 1) && !isOneOf(fTokens[previous - 1].lower, kListPrepositions) &&
        xSameVerbForm(lone, previous - 2))
      return true;
    // A lone present participle after an item that follows a verb, in a sentence led by
    // another: a second action of the same form ("creating the file to set MACROs and
    // editing the template"; not "I like apples and swimming").
    if (single && lone.gerund && afterVerb && xGerundBefore(previous))
      return true;
    // A present participle before its object, after an item that is the object of one that
    // leads its phrase: the next action of a series ("by choosing a set of packages, adding
    // some software, and running scripts"; not "by adding salt and pepper", "our bug
    // tracking system and mailing lists").
    if (!single && lone.gerund && afterVerb && xLeadingGerund(fGroupOfToken[lead - 1]))
      return true;
    // So does one before its object, adverbs between, after an item led by the preposition of
    // such a participle ("relying on the new one and shipping only the basic files";
    // not "relying on the tracking system and mailing lists").
    if (!single && lone.gerund && lead >= 2 && xIsPreposition(lead - 1) &&
        !isOneOf(fTokens[lead - 1].lower, kListPrepositions) && fGroupOfToken[lead - 2] != kNone &&
        fGroups[fGroupOfToken[lead - 2]].kind == STRUCTURE_VERB &&
        fGroups[fGroupOfToken[lead - 2]].lastToken == lead - 2 &&
        xLeadingGerund(fGroupOfToken[lead - 2]) && xObjectAt(object))
      return true;
    // "de", "à" or "pour" before an infinitive, its object pronouns between or not, after
    // an item that is the object of an infinitive led by one of those: a second action
    // ("de renommer le document notes.txt et de le ranger", "pour copier les fichiers et
    // pour les lancer").
    if (right.firstToken != group.firstToken &&
        isOneOf(fTokens[right.firstToken].lower, kInfinitiveLeads) &&
        fTokens[group.lastToken].infinitive && xPronounsBefore(group) && xLedInfinitiveBefore(lead))
      return true;
    // A noun or verb that can be an infinitive, before its object or a preposition, after
    // an item that is the complement of a verb of that form and its object: a second action
    // of the same form ("to give privileges to users and log root activity", "provide
    // information for maintainers or help with the work"; not "allow a review of the text
    // and package name", "ship the documents in PDF and plain text"). The complement may be
    // an address or a path ("send it to debian-l10n-english@lists.debian.org and request").
    std::size_t complement = previous;
    while (complement > 1 && xInWordMark(complement - 1) && fGroupOfToken[complement - 2] != kNone)
      complement = fGroups[fGroupOfToken[complement - 2]].firstToken;
    if (lone.infinitive &&
        (lone.firstClass == WORD_CLASS_NOUN || lone.firstClass == WORD_CLASS_VERB) &&
        complement > 0 && xIsPreposition(complement - 1) &&
        !isOneOf(fTokens[complement - 1].lower, kListPrepositions) &&
        xBaseVerbAndObjectBefore(complement - 1) &&
        (single
             ? xIsPreposition(group.lastToken + 1)
             : fTokens[group.firstToken + 1].role == Role::Noun || xObjectAt(group.firstToken + 1)))
      return true;
    // A lone verb of the third person after a pronoun, where the clause's verb is one too:
    // no list joins a pronoun and such a word ("it returns the addresses for it and exits").
    if (single && lone.thirdSingular && leftItems == 1 && xIsPronoun(firstLeft.group) &&
        xThirdSingularVerbBefore(previous))
      return true;
    // A lone verb of the third person before the infinitive it governs, where the clause's
    // verb is one too ("it has features and helps to identify", "il a des fonctionnalités et
    // aide à identifier"; not "it should be on disks and machines to withstand").
    if (single && lone.thirdSingular && xIsWord(group.lastToken + 2) &&
        isOneOf(fTokens[group.lastToken + 1].lower, kInfinitiveWords) &&
        fTokens[group.lastToken + 2].infinitive && xThirdSingularVerbBefore(previous))
      return true;
    // The last verb group before the first item: whether it has a verb of a tense ("n'est
    // pas une personne", not "se servant de gettext"), and ends in an infinitive after it
    // ("vous devriez envoyer", "should better be").
    const std::size_t leftGroup = commaBefore ? kNone : xVerbGroupBefore(previous);
    const bool leftVerb = leftGroup != kNone && xFiniteGroup(leftGroup);
    const std::size_t leftLast = leftVerb ? fGroups[leftGroup].lastToken : 0;
    const bool leftInfinitive =
        leftVerb && fTokens[leftLast].infinitive &&
        (!fTokens[leftLast].finite || xFiniteBetween(fGroups[leftGroup].firstToken, leftLast) ||
         (fGroups[leftGroup].firstToken < leftLast &&
          fTokens[fGroups[leftGroup].firstToken].role == Role::Auxiliary));
    // After a comma, a name whose words are joined by marks goes on past a group led by a
    // determiner ("and the smtpd_recipient_restrictions parameter needs"; but "ltmain.sh, and
    // Makefile.in may be ignored" stays a list).
    if (next >= fTokens.size() ||
        (fTokens[next].type != Token::Word && !(leftVerb && xInWordMark(next)) &&
         !(commaBefore && lone.role == Role::Determiner && xJoiningMark(next))))
      return false;
    const bool beginsClause = lead == 0 || xBeginsClause(lead - 1);
    const Role after = fTokens[next].type == Token::Word ? fTokens[next].role : Role::Interjection;
    const bool canBeVerb = lone.has(WORD_CLASS_VERB) || lone.has(WORD_CLASS_AUXILIARY);
    const bool objectAfter = after == Role::Pronoun || after == Role::Clitic;
    // A verb first.
    if (!single && afterVerb && lone.firstClass == WORD_CLASS_VERB && lone.infinitive)
      return true;
    if (single && ((canBeVerb && (objectAfter || after == Role::Determiner || after == Role::Noun ||
                                  after == Role::Adverb || after == Role::Adjective ||
                                  isOneOf(fTokens[next].lower, kAgentWords) ||
                                  isOneOf(fTokens[next].lower, kIfWords))) ||
                   (after == Role::Preposition &&
                    (lone.participle || (lone.firstClass == WORD_CLASS_VERB && afterVerb) ||
                     (lone.infinitive && leftInfinitive))) ||
                   (lone.firstClass == WORD_CLASS_UNKNOWN &&
                    (objectAfter ||
                     (after == Role::Determiner && !isOneOf(fTokens[next].lower, kPartitives))))))
      return true;
    // The verb of a subject; after a comma, past its prepositional groups ("the number of
    // packages in the archive is"), which without a comma would rather belong to the list
    // ("changing its owner or its rights of a file changes") unless the clause of the
    // first item has a verb of its own: then a verb of a tense there begins the second
    // clause ("n'est pas une personne et les écrans de debconf ne parlent pas").
    // The prepositional groups are passed over too where an object pronoun and a verb of a
    // tense follow them, and the first item's clause has a verb of a tense before the
    // participles that qualify its nouns ("est intégré dans les noyaux fournis par Debian et
    // les programmes Unix de base le gèrent"; not "changer le propriétaire ou les droits
    // d'un fichier le modifie").
    const bool cliticVerb =
        !commaBefore && !leftVerb && xCliticVerbAfter(next) && xFiniteClauseBefore(previous);
    std::size_t k = next;
    bool afterRelative = false;
    bool afterParticiple = false;
    // After a subject led by a determiner and a participle phrase, an aside in brackets, then
    // a word that can be a verb of the third person before its object: that verb, which its
    // neighbours made a noun ("et chaque ligne débutant par From (suivi d'une espace) marque
    // le début").
    bool asideVerb = false;
    while (k < fTokens.size()) {
      if (afterParticiple && lone.role == Role::Determiner && xPastAside(k) != k) {
        k = xPastAside(k);
        asideVerb = xIsWord(k) && fTokens[k].has(WORD_CLASS_VERB) && fTokens[k].thirdSingular &&
                    xIsWord(k + 1) && fTokens[k + 1].role == Role::Determiner;
        break;
      }
      if (fGroupOfToken[k] != kNone && fGroups[fGroupOfToken[k]].kind == STRUCTURE_VERB) {
        // A participle that qualifies the item, before its preposition ("the pears picked
        // in May", "all of the packages listed in this field must be"), unless the item is
        // a lone word that can be a verb ("and get used to").
        const std::size_t end = xParticipleGroupEnd(fGroupOfToken[k]);
        if ((single && canBeVerb) || end == kNone || !xIsWord(end) ||
            fTokens[end].role != Role::Preposition)
          break;
        k = end;
        afterParticiple = true;
        continue;
      }
      if (!commaBefore && !leftVerb && !cliticVerb)
        break;
      // A relative clause after a subject led by a determiner is passed over up to its
      // verb, so that the subject's verb follows ("and the files that we keep there are",
      // "et les composants qui sont listés sont"; not "et les fichiers qui sont listés.").
      // The two verbs may stand in one group: the second begins at a verb of a tense after
      // a participle.
      if (lone.role == Role::Determiner && xIsWord(k) &&
          isOneOf(fTokens[k].lower, kRelativeWords)) {
        std::size_t verb = k + 1;
        while (xIsWord(verb) && (fGroupOfToken[verb] == kNone ||
                                 fGroups[fGroupOfToken[verb]].kind != STRUCTURE_VERB))
          ++verb;
        if (!xIsWord(verb))
          break;
        k = fGroups[fGroupOfToken[verb]].lastToken + 1;
        for (std::size_t t = verb + 1; t + 1 < k; ++t) {
          if (fTokens[t].participle && fTokens[t + 1].finite &&
              (fTokens[t + 1].role == Role::Verb || fTokens[t + 1].role == Role::Auxiliary)) {
            k = t + 1;
            break;
          }
        }
        afterRelative = true;
        if (k == fGroups[fGroupOfToken[verb]].lastToken + 1)
          continue;
        break;
      }
      const Token& token = fTokens[k];
      const bool skipped = token.type == Token::Word
                               ? token.role == Role::Preposition || token.role == Role::Adverb ||
                                     ((token.role == Role::Noun || token.role == Role::Determiner ||
                                       token.role == Role::Adjective) &&
                                      !isOneOf(token.lower, kRelativeWords))
                               : xInWordMark(k);
      if (!skipped)
        break;
      ++k;
    }
    if (!asideVerb && (k >= fTokens.size() || fGroupOfToken[k] == kNone ||
                       fGroups[fGroupOfToken[k]].kind != STRUCTURE_VERB))
      return false;
    // Not the verb of a preposition or of a determiner ("in order to ease", "this install
    // file"); but the pronoun of a preposition may come before the verb ("a few of them
    // were").
    if (leftVerb && k != next && !asideVerb &&
        (!xFiniteGroup(fGroupOfToken[k]) || fTokens[k - 1].type != Token::Word ||
         (fTokens[k - 1].role == Role::Preposition && fTokens[k].role != Role::Pronoun &&
          fTokens[k].role != Role::Clitic && !xAdverbialPreposition(k - 1)) ||
         fTokens[k - 1].role == Role::Determiner))
      return false;
    // A verb right after an item with a preposition, where the items before have none:
    // the item is a complement of the verb ("edit those files and in those lines replace
    // the path").
    const bool rightPreposition = right.firstToken != group.firstToken;
    if (rightPreposition && k == next &&
        firstLeft.firstToken == fGroups[firstLeft.group].firstToken)
      return true;
    // A subject has no preposition before it ("of books and of documents are", "de
    // livres et de documents sont"), but for a partitive before its verb after an item of
    // another preposition ("à Debian LTS, et d'autres ont préféré").
    const auto isDe = [&](std::size_t t) {
      return fTokens[t].lower == "de" || fTokens[t].lower == "d";
    };
    const bool partitive = k == next && isDe(right.firstToken) &&
                           xIsPreposition(firstLeft.firstToken) && !isDe(firstLeft.firstToken);
    if (!partitive && (rightPreposition || isDe(group.firstToken)))
      return false;
    // The verb stands apart from the word before it: a piece of a name is no verb ("or
    // debian-release@lists", "that gets posted to debian-devel-changes@lists").
    if (!xSpacedBefore(k) && (k == next || afterRelative || xInWordMark(k - 1)))
      return false;
    if (k == next && !beginsClause)
      return true;
    if (commaBefore && leftItems == 1)
      return true;
    // The first item follows a verb or a preposition, or is led by a preposition of its own
    // in a clause with a verb of a tense ("correspond aux erreurs sur le site de Debian et
    // lists.debian.org rassemble").
    return afterVerb || (previous > 0 && xIsPreposition(previous - 1)) ||
           (leftVerb && (previous != fGroups[firstLeft.group].firstToken ||
                         isOneOf(fTokens[previous].lower, kPartitives)));
  }

  // A second clause whose verb is left out: a subject like the first clause's, then a
  // complement like the first item ("le premier pourra être /dev/sdb et le second
  // /dev/sdc", "if SLAAC is activated in your network and IPv6 on your computer", "si SLAAC
  // est actif sur le réseau et IPv6 actif sur un ordinateur"). The first item, or the path
  // that it ends, which begins at lead, follows the verb of its clause, maybe through a
  // preposition and a word of the predicate that the right group then ends with; the
  // clause's subject begins it; next is the token after the right group.
  bool xGappedClause(const Group& right, std::size_t lead, std::size_t next) const {
    if (next >= fTokens.size() || lead < 2)
      return false;
    std::size_t p = lead - 1;
    const bool preposition = xIsPreposition(p);
    if (preposition)
      --p;
    if (fGroupOfToken[p] == kNone)
      return false;
    if (fGroups[fGroupOfToken[p]].kind == STRUCTURE_NOMINAL) {
      const Group& predicate = fGroups[fGroupOfToken[p]];
      if (predicate.firstToken != p || right.firstToken == right.lastToken ||
          fTokens[right.lastToken].lower != fTokens[p].lower || p == 0)
        return false;
      --p;
    }
    const std::size_t g = fGroupOfToken[p];
    if (g == kNone || fGroups[g].kind != STRUCTURE_VERB || fGroups[g].lastToken != p ||
        !xFiniteGroup(g) || fGroups[g].firstToken == 0)
      return false;
    const std::size_t s = fGroupOfToken[fGroups[g].firstToken - 1];
    if (s == kNone || fGroups[s].kind != STRUCTURE_NOMINAL ||
        (fGroups[s].firstToken > 0 && fTokens[fGroups[s].firstToken - 1].type == Token::Break))
      return false;
    if (fGroups[s].firstToken > 0 && !xBeginsClause(fGroups[s].firstToken - 1))
      return false;
    // Both subjects led by a determiner, both pronouns or both names.
    const auto subjectKind = [](const Token& token) {
      if (token.role == Role::Determiner || token.role == Role::Pronoun)
        return static_cast<int>(token.role);
      return token.has(WORD_CLASS_PROPER_NOUN) || token.firstClass == WORD_CLASS_UNKNOWN ? -1 : 0;
    };
    const int kind = subjectKind(fTokens[fGroups[s].firstToken]);
    if (kind == 0 || kind != subjectKind(fTokens[right.firstToken]))
      return false;
    if (preposition)
      return xIsPreposition(next) && !isOneOf(fTokens[next].lower, kListPrepositions);
    // A path, or a nominal group led by a determiner, right after the subject, as the first
    // item after the verb (not the complement of a noun: "et toute la panoplie des modules").
    return xInWordMark(next) || (xIsWord(next) && fTokens[next].role == Role::Determiner &&
                                 !isOneOf(fTokens[next].lower, kPartitives));
  }

  // A mark inside a path, an option or an address, right before the word it leads
  // ("/usr/bin/truc", "libtruc.so", "--add-gnu-debuglink", "debian-l10n@lists.debian.org"):
  // it parts no clause.
  bool xInWordMark(std::size_t t) const {
    if (t >= fTokens.size() || fTokens[t].type != Token::Break)
      return false;
    const std::size_t c = fTokens[t].chunk;
    return c + 1 < fChunks.size() && fChunks[c + 1].wordClass() >= WORD_CLASS_UNKNOWN &&
           fChunks[c].text.find_first_not_of("/._~:-@") == std::string::npos;
  }

  // Whether token t follows a space, or the apostrophe of an elided word ("c'est").
  bool xSpacedBefore(std::size_t t) const {
    const std::size_t c = fTokens[t].chunk;
    if (c == 0 || fChunks[c - 1].wordClass() >= WORD_CLASS_UNKNOWN)
      return false;
    const std::string& before = fChunks[c - 1].text;
    return before.find_first_not_of(' ') == std::string::npos || before == "'" ||
           before == "\u2019";
  }

  // Whether the mark at token t joins the words right before and after it into one path or
  // name ("vpn.example.com", "pki/private").
  bool xJoiningMark(std::size_t t) const {
    return t > 0 && xInWordMark(t) && fTokens[t - 1].type == Token::Word &&
           fTokens[t - 1].chunk + 1 == fTokens[t].chunk;
  }

  // The first word of the path or name whose word is at token t.
  std::size_t xPathStart(std::size_t t) const {
    while (t >= 2 && xJoiningMark(t - 1))
      t -= 2;
    return t;
  }

  // The token after the path or name whose last word so far is right before token t.
  std::size_t xPathEnd(std::size_t t) const {
    while (t + 1 < fTokens.size() && xJoiningMark(t))
      t += 2;
    return t;
  }

  // The token after the closing bracket of an aside that opens at token t, in the same
  // sentence; t when none opens there.
  std::size_t xPastAside(std::size_t t) const {
    if (t >= fTokens.size() || fTokens[t].type != Token::Break ||
        fChunks[fTokens[t].chunk].text.find_first_of("([") == std::string::npos ||
        fChunks[fTokens[t].chunk].text.find_first_of(")]") != std::string::npos)
      return t;
    for (std::size_t k = t + 1; k < fTokens.size(); ++k) {
      if (fTokens[k].type != Token::Break)
        continue;
      const std::string& mark = fChunks[fTokens[k].chunk].text;
      if (mark.find_first_of(")]") != std::string::npos)
        return k + 1;
      if (mark.find_first_of(".!?;:([") != std::string::npos && !xInWordMark(k))
        return t;
    }
    return t;
  }

  // The token after verb group g when its verbs are all participles of no tense, kNone
  // otherwise.
  std::size_t xParticipleGroupEnd(std::size_t g) const {
    for (std::size_t t = fGroups[g].firstToken; t <= fGroups[g].lastToken; ++t) {
      const Token& token = fTokens[t];
      if ((token.role == Role::Verb || token.role == Role::Auxiliary) &&
          (token.finite || !token.participle))
        return kNone;
    }
    return fGroups[g].lastToken + 1;
  }

  // Whether a verb group that begins with an object pronoun and has a verb of a tense
  // follows token t, past prepositions, nouns, determiners, adjectives and adverbs ("de base
  // le gèrent").
  bool xCliticVerbAfter(std::size_t t) const {
    while (xIsWord(t) && !isOneOf(fTokens[t].lower, kRelativeWords)) {
      const Token& token = fTokens[t];
      if (token.role == Role::Clitic) {
        const std::size_t g = fGroupOfToken[t];
        return g != kNone && fGroups[g].firstToken == t && xFiniteGroup(g);
      }
      if (token.role != Role::Preposition && token.role != Role::Noun &&
          token.role != Role::Determiner && token.role != Role::Adjective &&
          token.role != Role::Adverb)
        return false;
      ++t;
    }
    return false;
  }

  // Whether the clause before token t has a verb of a tense, past the participles that
  // qualify its nouns ("est intégré dans les noyaux fournis par Debian").
  bool xFiniteClauseBefore(std::size_t t) const {
    std::size_t g = xVerbGroupBefore(t);
    while (g != kNone && !xFiniteGroup(g) && xParticipleGroupEnd(g) != kNone)
      g = xVerbGroupBefore(fGroups[g].firstToken);
    return g != kNone && xFiniteGroup(g);
  }

  // Whether group g has a verb of a tense.
  bool xFiniteGroup(std::size_t g) const {
    return xFiniteBetween(fGroups[g].firstToken, fGroups[g].lastToken + 1);
  }

  // Whether the tokens from first to end (excluded) hold a verb of a tense.
  bool xFiniteBetween(std::size_t first, std::size_t end) const {
    for (std::size_t t = first; t < end; ++t) {
      if (fTokens[t].finite &&
          (fTokens[t].role == Role::Verb || fTokens[t].role == Role::Auxiliary))
        return true;
    }
    return false;
  }

  // The last verb group of the clause before token t, back to a mark, a comma, a
  // coordinating or subordinating word, a relative or a question word; kNone if none.
  std::size_t xVerbGroupBefore(std::size_t t) const {
    while (t > 0) {
      --t;
      const Token& token = fTokens[t];
      if (token.type != Token::Word) {
        if (xInWordMark(t))
          continue;
        return kNone;
      }
      if (token.role == Role::Subordinator || token.role == Role::Conjunction ||
          isOneOf(token.lower, kRelativeWords) || isOneOf(token.lower, kQuestionWords))
        return kNone;
      if (fGroupOfToken[t] != kNone && fGroups[fGroupOfToken[t]].kind == STRUCTURE_VERB)
        return fGroupOfToken[t];
    }
    return kNone;
  }

  // Whether the clause before token t, past the coordinating words of its things, has a
  // verb of the third person singular as its last verb ("it loads the image and the data
  // to the memory").
  bool xThirdSingularVerbBefore(std::size_t t) const {
    while (t > 0) {
      --t;
      const Token& token = fTokens[t];
      if (token.type != Token::Word) {
        if (xInWordMark(t))
          continue;
        return false;
      }
      // A piece of a path or name is no verb ("the address/sender/recipient triplet").
      if (token.coordination != Coordination::None || xJoiningMark(t + 1))
        continue;
      if (token.role == Role::Subordinator || isOneOf(token.lower, kRelativeWords) ||
          isOneOf(token.lower, kQuestionWords))
        return false;
      // A participle that qualifies a noun is no verb of the clause ("les systèmes déjà
      // installés").
      if (token.role == Role::Verb && token.participle && !token.finite && !token.simplePast)
        continue;
      if (token.role == Role::Verb || token.role == Role::Auxiliary)
        return (token.thirdSingular || token.simplePast) && fGroupOfToken[t] != kNone &&
               fGroups[fGroupOfToken[t]].kind == STRUCTURE_VERB;
    }
    return false;
  }

  // Whether token t is the last of a verb group whose verb has a form of the word: both of
  // the third person singular, or both of the base form.
  bool xSameVerbForm(const Token& word, std::size_t t) const {
    if (!xIsWord(t) || fTokens[t].role != Role::Verb || fGroupOfToken[t] == kNone ||
        fGroups[fGroupOfToken[t]].lastToken != t)
      return false;
    const Token& verb = fTokens[t];
    return word.thirdSingular ? verb.thirdSingular
                              : word.infinitive && verb.infinitive && !verb.thirdSingular;
  }

  // Whether preposition p stands for an adverb, after one and before a verb of the third
  // person singular ("the one even before becomes", "celle d'encore avant devient").
  bool xAdverbialPreposition(std::size_t p) const {
    return p > 0 && xIsWord(p - 1) && fTokens[p - 1].role == Role::Adverb && xIsWord(p + 1) &&
           fTokens[p + 1].thirdSingular;
  }

  // Whether verb group g has a present participle and begins the text, or follows a comma,
  // a preposition or a coordinating word ("by choosing", ", adding", "and running").
  bool xLeadingGerund(std::size_t g) const {
    const Group& verb = fGroups[g];
    bool gerund = false;
    for (std::size_t t = verb.firstToken; t <= verb.lastToken; ++t)
      gerund = gerund || (fTokens[t].type == Token::Word && fTokens[t].role == Role::Verb &&
                          fTokens[t].gerund);
    if (!gerund || verb.firstToken == 0)
      return gerund;
    const Token& before = fTokens[verb.firstToken - 1];
    return before.type == Token::Comma || xIsPreposition(verb.firstToken - 1) ||
           (before.type == Token::Word && before.coordination != Coordination::None);
  }

  // Whether every word of group g before its last one can be an object pronoun.
  bool xPronounsBefore(const Group& g) const {
    for (std::size_t t = g.firstToken; t < g.lastToken; ++t)
      if (!fTokens[t].has(WORD_CLASS_PRONOUN_COMP))
        return false;
    return true;
  }

  // Whether the nominal groups and marks that end before token t follow a verb group
  // whose last word is an infinitive, led by "de", "à" or "pour" ("de nommer le fichier
  // preseed.cfg").
  bool xLedInfinitiveBefore(std::size_t t) const {
    const auto nominal = [&](std::size_t u) {
      return fGroupOfToken[u] != kNone && fGroups[fGroupOfToken[u]].kind == STRUCTURE_NOMINAL;
    };
    while (t > 0 && (xInWordMark(t - 1) || nominal(t - 1)))
      t = xInWordMark(t - 1) ? t - 1 : fGroups[fGroupOfToken[t - 1]].firstToken;
    if (t < 2 || fGroupOfToken[t - 1] == kNone)
      return false;
    const Group& verb = fGroups[fGroupOfToken[t - 1]];
    return verb.kind == STRUCTURE_VERB && fTokens[verb.lastToken].infinitive &&
           verb.firstToken > 0 && xIsWord(verb.firstToken - 1) &&
           isOneOf(fTokens[verb.firstToken - 1].lower, kInfinitiveLeads);
  }

  // Whether the sentence before token t has a verb of the present participle.
  bool xGerundBefore(std::size_t t) const {
    while (t > 0) {
      --t;
      const Token& token = fTokens[t];
      if (token.type == Token::Break && !xInWordMark(t) &&
          fChunks[token.chunk].text.find_first_of(".!?;:") != std::string::npos)
        return false;
      if (token.type == Token::Word && token.role == Role::Verb && token.gerund)
        return true;
    }
    return false;
  }

  // Whether the tokens before preposition p are a verb group with a verb of the base form
  // and its object, or its objects joined by commas and coordinating words ("give limited
  // root privileges to", "use CD-R and DVD-R by", "send it along to").
  bool xBaseVerbAndObjectBefore(std::size_t p) const {
    // A particle between the object and the preposition ("send it along to").
    if (xIsPreposition(p - 1))
      --p;
    std::size_t end = p;
    std::size_t first = kNone;
    while (end > 0 && fGroupOfToken[end - 1] != kNone) {
      const Group& object = fGroups[fGroupOfToken[end - 1]];
      if (object.kind != STRUCTURE_NOMINAL || object.lastToken != end - 1)
        break;
      first = object.firstToken;
      if (first == 0)
        break;
      const Token& separator = fTokens[first - 1];
      if (separator.type != Token::Comma && separator.coordination == Coordination::None)
        break;
      end = first - 1;
    }
    if (first == kNone || first == 0 || fGroupOfToken[first - 1] == kNone)
      return false;
    const Group& verb = fGroups[fGroupOfToken[first - 1]];
    if (verb.kind != STRUCTURE_VERB)
      return false;
    for (std::size_t t = verb.firstToken; t <= verb.lastToken; ++t) {
      if (fTokens[t].role == Role::Verb && fTokens[t].infinitive)
        return true;
    }
    return false;
  }

  // Whether group g is a lone pronoun.
  bool xIsPronoun(std::size_t g) const {
    return fGroups[g].firstToken == fGroups[g].lastToken && fGroups[g].lastRole == Role::Pronoun;
  }

  // Whether a clause may begin after token t: a comma, a mark other than a slash
  // ("debian/patches"), a subordinating or coordinating word ("although").
  bool xBeginsClause(std::size_t t) const {
    const Token& token = fTokens[t];
    if (token.type != Token::Word)
      return token.type == Token::Comma || fChunks[token.chunk].text != "/";
    return token.role == Role::Subordinator || token.role == Role::Conjunction;
  }

  Structure xGroupStructure(const Group& group) const {
    Structure structure;
    structure.kind = group.kind;
    structure.first = fTokens[group.firstToken].chunk;
    structure.last = fTokens[group.lastToken].chunk;
    structure.notNegated = xNotNegated(structure.first, structure.last);
    return structure;
  }

  bool xNotNegated(std::size_t first, std::size_t last) const {
    for (std::size_t c = first; c <= last; ++c) {
      if (lingIsNegationWord(fChunks[c].text))
        return false;
    }
    return true;
  }

  const std::vector<Chunk>& fChunks;
  bool fSpaced;
  std::string fLower;
  std::vector<Token> fTokens;
  std::vector<Group> fGroups;
  std::vector<std::size_t> fGroupOfToken;
};

}  // namespace

bool lingIsNegationWord(std::string_view chunkText) noexcept {
  // Most chunks are none of them at once.
  if (chunkText.empty() || chunkText.size() > 9)
    return false;
  switch (chunkText[0]) {
    case 'n':
    case 'p':
    case 's':
    case 'c':
    case 'd':
    case 'h':
    case 'w':
      return isOneOf(chunkText, kNegationWords);
    default:
      return false;
  }
}

ZULingSpeechTag lingSpeechTag(const ZULingSyntacticAnalyzerChunk& chunk) noexcept {
  ZULingSpeechTag tag;
  const std::string_view text = chunk.text;
  if (chunk.wordClass() != WORD_CLASS_BOOKMARK || text.size() < 4)
    return tag;
  // " \name=value\ "
  const std::string_view inner = text.substr(2, text.size() - 4);
  const std::size_t equals = inner.find('=');
  tag.name = inner.substr(0, equals);
  if (equals == std::string_view::npos)
    return tag;
  const std::string_view value = inner.substr(equals + 1);
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), number);
  if (error != std::errc() || end != value.data() + value.size() || value.empty() || number < 0)
    return tag;
  if (tag.name == "mrk" || tag.name == "mrkpause")
    tag.kind = ZULingSpeechTag::Bookmark;
  else if (tag.name == "pau")
    tag.kind = ZULingSpeechTag::Pause;
  tag.value = number;
  return tag;
}

ZULingSyntacticAnalyzer::ZULingSyntacticAnalyzer(std::shared_ptr<const ZULingLanguageMap> languages)
    : fDatabase(std::move(languages)) {}

void ZULingSyntacticAnalyzer::setLanguage(const std::string& language) {
  fDatabase.setLanguage(language);
}

ZULingSyntacticAnalysis ZULingSyntacticAnalyzer::analyse(std::string_view text) const {
  ZULingSyntacticAnalysis analysis;
  const std::string lower = lowercase(text);
  const std::lock_guard<std::mutex> lock(ZULingDatabaseCache::mutex());
  analysis.database = fDatabase.database();
  analysis.chunks.reserve(text.size() / 3 + 4);
  Cutter cutter(analysis.database.get(), text, lower, analysis.chunks);

  // Speech-engine tags: from a backslash to the next one, with no space between.
  std::size_t plainFrom = 0;
  std::size_t pos = 0;
  while (pos < text.size()) {
    const std::size_t s = text.find('\\', pos);
    if (s == std::string_view::npos)
      break;
    std::size_t e = s + 1;
    while (e < text.size() && text[e] != '\\' && text[e] != ' ')
      ++e;
    if (e == text.size()) {
      pos = s + 1;
      continue;
    }
    if (text[e] == ' ') {
      pos = e;
      continue;
    }
    cutter.cut(plainFrom, s);
    cutter.pushTag(s, e + 1);
    plainFrom = pos = e + 1;
  }
  cutter.cut(plainFrom, text.size());

  const bool spaced = analysis.database == nullptr || analysis.database->flag != 0;
  analysis.structures = StructureBuilder(analysis.chunks, spaced).build();
  return analysis;
}

}  // namespace ZU
