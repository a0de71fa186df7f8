// The bound methods of ZUMokuto that read and change the current configuration.
#include <mutex>
#include <shared_mutex>
#include <string>

#include "mokuto/mokutotimechecker.h"
#include "mokuto/zumokuto.h"
#include "zu/enums.h"

namespace ZU {

namespace {
constexpr const char* kMain = "mokuto.main";
}  // namespace

void ZUMokuto::_reset() {
  std::unique_lock lock(configLock);
  config.reset();
}

void ZUMokuto::setBodyTalkEnabled(bool enable) {
  KO_LOG_WARNING(kMain) << "Method setBodyTalkEnabled is deprecated since 1.18. "
                        << "Use method setBodyLanguageMode instead.";
  std::unique_lock lock(configLock);
  config.bodyLanguageMode = enable ? BODY_LANGUAGE_MODE_RANDOM : BODY_LANGUAGE_MODE_DISABLED;
}

void ZUMokuto::setBodyLanguageEnabled(bool enable) {
  KO_LOG_WARNING(kMain) << "Method setBodyLanguageEnabled is deprecated since 1.22. "
                        << "Use method setBodyLanguageMode instead.";
  std::unique_lock lock(configLock);
  config.bodyLanguageMode = enable ? BODY_LANGUAGE_MODE_RANDOM : BODY_LANGUAGE_MODE_DISABLED;
}

bool ZUMokuto::isBodyTalkEnabled() {
  KO_LOG_WARNING(kMain) << "Method isBodyTalkEnabled is deprecated since 1.18. "
                        << "Use method getBodyLanguageMode instead.";
  std::shared_lock lock(configLock);
  return config.bodyLanguageMode != BODY_LANGUAGE_MODE_DISABLED;
}

bool ZUMokuto::isBodyLanguageEnabled() {
  KO_LOG_WARNING(kMain) << "Method isBodyLanguageEnabled is deprecated since 1.22. "
                        << "Use method getBodyLanguageMode instead.";
  std::shared_lock lock(configLock);
  return config.bodyLanguageMode != BODY_LANGUAGE_MODE_DISABLED;
}

void ZUMokuto::setBodyLanguageModeFromStr(const std::string& stringBodyLanguageMode) {
  if (stringBodyLanguageMode == "contextual_0") {
    KO_LOG_ERROR(kMain) << "contextual_0 is deprecated and will soon be removed, "
                        << "so call: " << '\n'
                        << "setBodyLanguageModeFromStr(\"contextual\") and"
                        << "_setMSPauseBeforeSpeech(0) instead.";
    setBodyLanguageModeFromStr("contextual");
    std::unique_lock lock(configLock);
    config.msPauseBeforeSpeech = 0;
    return;
  }
  const BodyLanguageMode mode = bodyLanguageModeFromStr(stringBodyLanguageMode);
  if (mode == BODY_LANGUAGE_MODE_END_OF_ENUM) {
    ZU_THROW_ERROR(
        kModuleName, "setBodyLanguageModeFromStr",
        "Invalid body language mode: \"" + stringBodyLanguageMode +
            "\"\nAll the possible body language modes are: " + bodyLanguageModeNameList() + ".");
  }
  std::unique_lock lock(configLock);
  config.bodyLanguageMode = mode;
}

void ZUMokuto::setBodyLanguageMode(unsigned int bodyLanguageMode) {
  if (bodyLanguageMode >= static_cast<unsigned int>(BODY_LANGUAGE_MODE_END_OF_ENUM)) {
    std::string message = "Invalid body language mode: " + std::to_string(bodyLanguageMode) +
                          "\nThe body language modes values have to be between 0 and " +
                          std::to_string(BODY_LANGUAGE_MODE_END_OF_ENUM - 1) + ".";
    static const char* const kEnumNames[] = {"BODY_LANGUAGE_MODE_DISABLED",
                                             "BODY_LANGUAGE_MODE_RANDOM",
                                             "BODY_LANGUAGE_MODE_CONTEXTUAL"};
    for (int i = 0; i < BODY_LANGUAGE_MODE_END_OF_ENUM; ++i)
      message += "\n" + std::to_string(i) + ": " + kEnumNames[i];
    ZU_THROW_ERROR(kModuleName, "setBodyLanguageMode", message);
  }
  std::unique_lock lock(configLock);
  config.bodyLanguageMode = static_cast<BodyLanguageMode>(bodyLanguageMode);
}

std::string ZUMokuto::getBodyLanguageModeToStr() {
  std::shared_lock lock(configLock);
  return bodyLanguageModeToStr(config.bodyLanguageMode);
}

unsigned int ZUMokuto::getBodyLanguageMode() {
  std::shared_lock lock(configLock);
  return static_cast<unsigned int>(config.bodyLanguageMode);
}

void ZUMokuto::_setMSPauseBeforeSpeech(int pause) {
  if (pause < 0)
    ZU_THROW_ERROR(kModuleName, "setMSPauseBeforeSpeech", "pause time can't be negative.");
  std::unique_lock lock(configLock);
  config.msPauseBeforeSpeech = pause;
}

int ZUMokuto::_getMSPauseBeforeSpeech() {
  std::shared_lock lock(configLock);
  return config.msPauseBeforeSpeech;
}

bool ZUMokuto::_isCheckExecutionTimesEnabled() {
  return director && director->getTimeChecker() && director->getTimeChecker()->enabled();
}

void ZUMokuto::_setCheckExecutionTimes(bool pause) {
  if (director && director->getTimeChecker())
    director->getTimeChecker()->setEnabled(pause);
}

void ZUMokuto::addTagsToWords(const ZUValue& tagsToWords) {
  std::unique_lock lock(configLock);
  config.updateWordsToTags(tagsToWords);
}

void ZUMokuto::declareTagForAnimations(const ZUValue& tagsToAnimations) {
  std::unique_lock lock(configLock);
  config.updateTagsToAnimations(tagsToAnimations);
}

}  // namespace ZU
