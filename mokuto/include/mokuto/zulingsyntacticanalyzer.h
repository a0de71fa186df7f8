#pragma once
// The syntactic analysis of a speech text: the text cut into chunks (the speech
// engine's tags, spaces, links inside words, punctuation, and words with their classes
// from the main linguistic database of the language) and the structures over them
// (nominal and verb groups, coordinations around "and" and "or").
//
// An analyser belongs to one caller (the compiler stage's pipeline, or the emotion
// estimate) and is used from one thread at a time. Its selection and its lookups run
// under the process-wide database mutex (ZULingDatabaseCache::mutex()), so analysers of
// different callers may work at the same time.

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"
#include "mokuto/zulingwordclass.h"

namespace ZU {

// A piece of the speech text: a speech-engine tag (" \mrk=3\ ", " \pau=300\ ", class
// 0), a run of spaces (1), a link inside a word (2), punctuation (3) or a word (4 and
// above). The text keeps the bytes as written; the class of the chunk is the class of
// its first pair.
struct ZULingSyntacticAnalyzerChunk {
  std::string text;
  // Bytes of the chunk's text, 0 for a speech-engine tag.
  std::int32_t length = 0;
  std::vector<ZULingClassFeatures> classes;
  // The word's node in the database of the analysis, when the word is stored there.
  std::optional<std::uint32_t> node;

  ZULingWordClass wordClass() const noexcept {
    return classes.empty() ? WORD_CLASS_UNKNOWN : classes.front().wordClass;
  }
  bool isWord() const noexcept { return wordClass() >= WORD_CLASS_UNKNOWN; }
};

using ZULingStructureKind = std::int32_t;
enum : ZULingStructureKind {
  STRUCTURE_NOMINAL = 0,
  STRUCTURE_VERB = 1,
  STRUCTURE_AND = 2,
  STRUCTURE_OR = 3,
};
// "nominal", "verb", "and", "or".
extern const char* const kLingStructureKindNames[4];
// Names the analysis carries without using them in the tag insertion.
extern const char* const
    kLingGrammaticalFunctionNames[3];          // "subject", "direct object", "complement"
extern const char* const kLingColourNames[3];  // "blue", "green", "black"

// A run of chunks, from `first` to `last` (indexes in the chunk list, both included).
// A coordination ("and", "or") has its items as children.
struct ZULingSyntacticAnalyzerStructure {
  std::size_t first = 0;
  std::size_t last = 0;
  ZULingStructureKind kind = STRUCTURE_NOMINAL;
  std::vector<ZULingSyntacticAnalyzerStructure> children;
  // The number of coordinated items of an "and" or an "or"; 0 for a group.
  std::int32_t itemCount = 0;
  // False when a chunk of the run is a negation word.
  bool notNegated = true;
};

// Whether a chunk's text is one of the negation words ("ne", "n", "pas", "not",
// "don't", ...), compared exactly.
bool lingIsNegationWord(std::string_view chunkText) noexcept;

// What a speech-engine tag chunk stands for: a bookmark ("mrk" or "mrkpause" and its
// number), a pause (its milliseconds), or another tag of the engine.
struct ZULingSpeechTag {
  enum Kind { Other, Bookmark, Pause };
  Kind kind = Other;
  // "mrk", "mrkpause", "pau", or the other tag's name.
  std::string_view name;
  std::int64_t value = 0;
};
// The tag of a class-0 chunk (" \name=value\ "); Other for anything else.
ZULingSpeechTag lingSpeechTag(const ZULingSyntacticAnalyzerChunk& chunk) noexcept;

struct ZULingSyntacticAnalysis {
  // In text order.
  std::vector<ZULingSyntacticAnalyzerChunk> chunks;
  // The top-level structures, in text order of their first chunks.
  std::vector<ZULingSyntacticAnalyzerStructure> structures;
  // The main database the analysis used (it gives the base forms and the flag to the
  // tag insertion); null when no language was selected.
  ZULingDatabasePtr database;
};

class ZULingSyntacticAnalyzer {
 public:
  explicit ZULingSyntacticAnalyzer(std::shared_ptr<const ZULingLanguageMap> languages);

  // Selects the main database of a language key ("English", "fr_FR", ...); an unknown
  // key or a database that cannot be loaded leaves none (every word "unkonwn").
  void setLanguage(const std::string& language);
  const ZULingDatabasePtr& database() const noexcept { return fDatabase.database(); }

  // Chunks and structures of a speech text.
  ZULingSyntacticAnalysis analyse(std::string_view text) const;

 private:
  ZULingDatabaseUser fDatabase;
};

}  // namespace ZU
