#include "zu/enums.h"

namespace ZU {

const char* const kBodyLanguageModeNames[4] = {"disabled", "random", "contextual", "endOfEnum"};
const char* const kPostureFamilyNames[4] = {"Standing", "Sitting", "SittingOnChair", "Unknown"};
const char* const kPostureFamilyFolders[3] = {"Stand", "Sit", "SitOnPod"};

BodyLanguageMode bodyLanguageModeFromStr(std::string_view name) noexcept {
  for (BodyLanguageMode m = 0; m < BODY_LANGUAGE_MODE_END_OF_ENUM; ++m) {
    if (name == kBodyLanguageModeNames[m])
      return m;
  }
  return BODY_LANGUAGE_MODE_END_OF_ENUM;
}

const char* bodyLanguageModeToStr(BodyLanguageMode mode) noexcept {
  if (mode < 0 || mode >= BODY_LANGUAGE_MODE_END_OF_ENUM)
    return kBodyLanguageModeNames[3];
  return kBodyLanguageModeNames[mode];
}

std::string bodyLanguageModeNameList() {
  std::string out;
  for (BodyLanguageMode m = 0; m < BODY_LANGUAGE_MODE_END_OF_ENUM; ++m) {
    if (m > 0)
      out += (m == BODY_LANGUAGE_MODE_END_OF_ENUM - 1) ? " and " : ", ";
    out += '"';
    out += kBodyLanguageModeNames[m];
    out += '"';
  }
  return out;
}

PostureFamily postureFamilyFromStr(std::string_view name) noexcept {
  for (PostureFamily f = 0; f < Unknown; ++f) {
    if (name == kPostureFamilyNames[f])
      return f;
  }
  return Unknown;
}

const char* postureFamilyToStr(PostureFamily family) noexcept {
  if (family < 0 || family > Unknown)
    return kPostureFamilyNames[Unknown];
  return kPostureFamilyNames[family];
}

}  // namespace ZU
