#include "mokuto/compilertask.h"

#include <exception>
#include <mutex>
#include <utility>

#include "ko/log.hpp"
#include "mokuto/zulingsyntacticanalyzertagger.h"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "mokuto.compiler";
constexpr const char* kLanguageError = "TTS.getLanguage() has thrown an error: ";
}  // namespace

CompilerTask::CompilerTask(std::shared_ptr<ZUTextToSpeechProxy> textToSpeech,
                           std::shared_ptr<const ZULingLanguageMap> languages)
    : fTextToSpeech(std::move(textToSpeech)),
      fLanguages(languages ? std::move(languages)
                           : std::make_shared<const ZULingLanguageMap>(makeLingLanguageMap())),
      fTagging(std::make_unique<ZULingAutomaticTagging>(fLanguages)),
      fEmotions(std::make_unique<ZULingEmotionEstimator>(fLanguages)) {}

CompilerTask::~CompilerTask() = default;

std::optional<std::string> CompilerTask::xLanguage(std::string& language) const {
  language.clear();
  if (!fTextToSpeech)
    return std::nullopt;
  try {
    language = fTextToSpeech->getLanguage();
  } catch (const std::exception& e) {
    return std::string(e.what());
  }
  return std::nullopt;
}

void CompilerTask::process(const std::shared_ptr<MKTaskInstruction>& job) {
  std::string language;
  if (const auto error = xLanguage(language)) {
    KO_LOG_ERROR(kCategory) << kLanguageError << *error;
  }
  std::lock_guard lock(job->mutex);
  fParser.parse(job, job->text, language == "Japanese");
  fTagging->process(*job, language);
}

std::int32_t CompilerTask::getEmotion(const std::string& text) {
  std::string language;
  if (const auto error = xLanguage(language)) {
    KO_LOG_ERROR(kCategory) << kLanguageError << *error;
  }
  return fEmotions->getEmotion(language, text);
}

std::optional<std::int32_t> CompilerTask::asrEmotion(const std::string& text, double confidence) {
  if (!(confidence >= kAsrEmotionMinConfidence))
    return std::nullopt;
  const std::int32_t emotion = getEmotion(text);
  if (emotion == 0)
    return std::nullopt;
  return emotion;
}

}  // namespace ZU
