#pragma once
// CompilerTask: the first stage of the say pipeline. For one job it asks the speech
// engine for its current language, parses the annotated text into the speech text and
// its actions, and, in contextual mode, adds the automatic gestures that the analysis of
// the words proposes (with the pause before speech, once per text id). It also gives
// the emotion of a recognised text.
//
// One per service. `process` runs in the thread of the say call that owns the job, under
// the pipeline's compiler lock, so two jobs never compile at once. `getEmotion` and
// `asrEmotion` may be called from any thread (the recognised-word callback's), at the
// same time as `process`: the emotion estimate keeps a language selection of its own and
// serialises its calls; the lookups of both run under the process-wide database mutex.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "mokuto/mktaskinstruction.h"
#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"
#include "mokuto/zumokutoparser.h"

namespace ZU {

class ZUTextToSpeechProxy;
class ZULingAutomaticTagging;
class ZULingEmotionEstimator;

class CompilerTask {
 public:
  // The least recognition confidence for which a recognised text's emotion is raised.
  static constexpr double kAsrEmotionMinConfidence = 0.5;

  // `textToSpeech` may be null: the language is then unknown (not Japanese, no
  // database). `languages` maps a language key ("French", "en_US", "JapaneseEmotions",
  // ...) to its linguistic database file; null (the service's case) takes
  // makeLingLanguageMap(), the files found by ko::path::findData("zefoko",
  // "mokuto/syntacticanalysis/<file>"), that is under ZEFOKO_DATA_PATH or the share/
  // folder of the build or of the installation. The map is built once, here; the
  // databases are loaded when a language first selects them.
  explicit CompilerTask(std::shared_ptr<ZUTextToSpeechProxy> textToSpeech,
                        std::shared_ptr<const ZULingLanguageMap> languages = nullptr);
  ~CompilerTask();
  CompilerTask(const CompilerTask&) = delete;
  CompilerTask& operator=(const CompilerTask&) = delete;

  // Fills the job from its annotated text; in contextual mode (the job's configuration)
  // adds the automatic tags and the pause before speech. A failing speech engine is
  // logged; the parse goes on, and a language without a database adds only the tags of
  // the configuration's words and of the structures found without one. The job's mutex
  // is held while the job changes, not while the speech engine is asked.
  void process(const std::shared_ptr<MKTaskInstruction>& job);

  // The emotion of a recognised word or phrase in the speech engine's language: 2 very
  // positive, 1 positive, 0 neutral or undecided (or no database), -1 negative, -2 very
  // negative.
  std::int32_t getEmotion(const std::string& text);

  // What `_dialogMatchedInputCallback` raises as "AsrEmotion" for a recognised text and
  // its confidence: nothing below kAsrEmotionMinConfidence (the estimate is then not
  // computed) nor for an estimate of 0; otherwise the estimate.
  std::optional<std::int32_t> asrEmotion(const std::string& text, double confidence);

 private:
  // Puts the speech engine's language in `language` ("" when it cannot tell) and gives
  // the message of its failure, which the caller logs under its own name.
  std::optional<std::string> xLanguage(std::string& language) const;

  const ZUMokutoParser fParser;
  const std::shared_ptr<ZUTextToSpeechProxy> fTextToSpeech;
  const std::shared_ptr<const ZULingLanguageMap> fLanguages;
  // The analyser and tagger of the pipeline's jobs (used under the compiler lock).
  const std::unique_ptr<ZULingAutomaticTagging> fTagging;
  // The emotion estimate, with its own analyser, tagger and selection.
  const std::unique_ptr<ZULingEmotionEstimator> fEmotions;
};

}  // namespace ZU
