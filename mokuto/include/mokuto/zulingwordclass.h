#pragma once
// The word classes of the linguistic analysis: a plain 32-bit integer with a parallel
// name table indexed by value. Values 0 to 3 are given by the tokeniser (bookmarks,
// spaces, links inside words, punctuation), 4 to 17 by the linguistic databases; 4 is
// also the class of a word that a database does not hold.

#include <cstdint>
#include <string_view>

namespace ZU {

using ZULingWordClass = std::int32_t;
enum : ZULingWordClass {
  WORD_CLASS_BOOKMARK = 0,
  WORD_CLASS_INTERSPACE = 1,
  WORD_CLASS_LINK_BETWEEN_WORDS = 2,
  WORD_CLASS_PUNCTUATION = 3,
  WORD_CLASS_UNKNOWN = 4,
  WORD_CLASS_ADJECTIVE = 5,
  WORD_CLASS_ADVERB = 6,
  WORD_CLASS_CONJUNCTIVE = 7,
  WORD_CLASS_SUB_CONJ = 8,
  WORD_CLASS_DETERMINANT = 9,
  WORD_CLASS_INTERJECTION = 10,
  WORD_CLASS_NOUN = 11,
  WORD_CLASS_PREPOSITION = 12,
  WORD_CLASS_PRONOUN = 13,
  WORD_CLASS_VERB = 14,
  WORD_CLASS_AUXILIARY = 15,
  WORD_CLASS_PRONOUN_COMP = 16,
  WORD_CLASS_PROPER_NOUN = 17,
  WORD_CLASS_END_OF_ENUM = 18,
};

// "bookmark", "interspace", "linkbetweenwords", "punctuation", "unkonwn", "adjective",
// "adverb", "conjunctive", "sub_conj", "determinant", "interjection", "noun",
// "preposition", "pronoun", "verb", "auxiliary", "pronoun_comp", "proper_noun",
// "end of enum".
extern const char* const kLingWordClassNames[19];

// The name of a class; "end of enum" for any value outside 0..17.
const char* lingWordClassToStr(ZULingWordClass wordClass) noexcept;
// Exact match of the names of 0..17; WORD_CLASS_END_OF_ENUM for anything else.
ZULingWordClass lingWordClassFromStr(std::string_view name) noexcept;

}  // namespace ZU
