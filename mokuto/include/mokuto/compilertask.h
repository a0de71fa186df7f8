#pragma once
// CompilerTask: the first stage of the say pipeline. For one job it asks the speech
// engine for its current language, parses the annotated text into the speech text and
// its actions, and, in contextual mode, adds the automatic gestures that the analysis of
// the words proposes.
//
// One per service. `process` runs in the thread of the say call that owns the job, under
// the pipeline's compiler lock, so two jobs never compile at once.

#include <cstdint>
#include <memory>
#include <string>

#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace ZU {

class ZUTextToSpeechProxy;

class CompilerTask {
 public:
  // `textToSpeech` may be null: the language is then unknown (not Japanese).
  explicit CompilerTask(std::shared_ptr<ZUTextToSpeechProxy> textToSpeech);
  ~CompilerTask();
  CompilerTask(const CompilerTask&) = delete;
  CompilerTask& operator=(const CompilerTask&) = delete;

  // Fills the job from its annotated text. A failing speech engine is logged; the parse
  // goes on.
  void process(const std::shared_ptr<MKTaskInstruction>& job);

 private:
  // The speech engine's language; "" when it cannot tell (logged).
  std::string xLanguage() const;

  const ZUMokutoParser fParser;
  const std::shared_ptr<ZUTextToSpeechProxy> fTextToSpeech;
};

}  // namespace ZU
