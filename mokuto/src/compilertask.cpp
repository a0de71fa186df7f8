#include "mokuto/compilertask.h"

#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "mokuto.compiler";
}  // namespace

CompilerTask::CompilerTask(std::shared_ptr<ZUTextToSpeechProxy> textToSpeech)
    : fTextToSpeech(std::move(textToSpeech)) {}

CompilerTask::~CompilerTask() = default;

std::string CompilerTask::xLanguage() const {
  if (!fTextToSpeech)
    return {};
  try {
    return fTextToSpeech->getLanguage();
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "TTS.getLanguage() has thrown an error: " << e.what();
    return {};
  }
}

void CompilerTask::process(const std::shared_ptr<MKTaskInstruction>& job) {
  const std::string language = xLanguage();
  const bool isJapanese = language == "Japanese";
  fParser.parse(job, job->text, isJapanese);
}

}  // namespace ZU
