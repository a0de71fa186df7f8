#include "mokuto/zulingwordclass.h"

namespace ZU {

const char* const kLingWordClassNames[19] = {
    "bookmark",     "interspace",   "linkbetweenwords", "punctuation", "unkonwn",
    "adjective",    "adverb",       "conjunctive",      "sub_conj",    "determinant",
    "interjection", "noun",         "preposition",      "pronoun",     "verb",
    "auxiliary",    "pronoun_comp", "proper_noun",      "end of enum",
};

const char* lingWordClassToStr(ZULingWordClass wordClass) noexcept {
  if (wordClass < 0 || wordClass >= WORD_CLASS_END_OF_ENUM)
    return kLingWordClassNames[WORD_CLASS_END_OF_ENUM];
  return kLingWordClassNames[wordClass];
}

ZULingWordClass lingWordClassFromStr(std::string_view name) noexcept {
  for (ZULingWordClass c = 0; c < WORD_CLASS_END_OF_ENUM; ++c) {
    if (name == kLingWordClassNames[c])
      return c;
  }
  return WORD_CLASS_END_OF_ENUM;
}

}  // namespace ZU
