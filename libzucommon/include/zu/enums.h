#pragma once
// Enumerations shared by the service, the body talk and the robot's services: plain
// 32-bit integers with parallel name tables indexed by value.

#include <cstdint>
#include <string>
#include <string_view>

namespace ZU {

using BodyLanguageMode = std::int32_t;
enum : BodyLanguageMode {
  BODY_LANGUAGE_MODE_DISABLED = 0,
  BODY_LANGUAGE_MODE_RANDOM = 1,
  BODY_LANGUAGE_MODE_CONTEXTUAL = 2,
  BODY_LANGUAGE_MODE_END_OF_ENUM = 3,
};
// "disabled", "random", "contextual", "endOfEnum".
extern const char* const kBodyLanguageModeNames[4];
// Exact, case-sensitive match of the first three names; BODY_LANGUAGE_MODE_END_OF_ENUM
// for anything else ("endOfEnum" included).
BodyLanguageMode bodyLanguageModeFromStr(std::string_view name) noexcept;
// The name of a mode; "endOfEnum" for any value outside 0..2.
const char* bodyLanguageModeToStr(BodyLanguageMode mode) noexcept;
// "\"disabled\", \"random\" and \"contextual\"", as error messages list them.
std::string bodyLanguageModeNameList();

using PostureFamily = std::int32_t;
enum : PostureFamily {
  Standing = 0,
  Sitting = 1,
  SittingOnChair = 2,
  Unknown = 3,
};
// "Standing", "Sitting", "SittingOnChair", "Unknown".
extern const char* const kPostureFamilyNames[4];
PostureFamily postureFamilyFromStr(std::string_view name) noexcept;
const char* postureFamilyToStr(PostureFamily family) noexcept;
// The folder names that follow a package in an animation path: "Stand", "Sit", "SitOnPod".
extern const char* const kPostureFamilyFolders[3];

}  // namespace ZU
