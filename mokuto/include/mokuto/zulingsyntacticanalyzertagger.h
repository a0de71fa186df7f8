#pragma once
// Automatic gestures and the emotion of a text, from the syntactic analysis.
//
// The tagger turns the analysis of a job's speech text into AUTO_START_TAG actions:
// the pause before speech (once per text id), an enumeration's "two" to "five", a
// choice's "pick", a negated group's "oppose", and for the words of the other groups
// the tags that the configuration binds to them or else their base forms. A proposal
// within 1300 ms of speech after a gesture or blocking sound that the caller wrote is
// dropped; where the language's database asks for it, a gesture's bookmark goes about
// 1300 ms of speech ahead of its word. It also computes the emotion of a text from the
// labels of its words in the emotion database.
//
// ZULingAutomaticTagging is what the compiler stage runs for a job in contextual mode;
// ZULingEmotionEstimator is the emotion estimate of a recognised text. Each holds its
// own analyser and tagger, so that each caller keeps its own language selection.
//
// Threads: a tagger and a ZULingAutomaticTagging are used from one thread at a time
// (the compiler stage's lock). ZULingEmotionEstimator may be called from any thread:
// it serialises its calls. Lookups run under the process-wide database mutex.

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "mokuto/mktaskinstruction.h"
#include "mokuto/zulingsyntacticanalyzer.h"

namespace ZU {

// A word of a text and its label in the emotion database ("positive", "negation", ...).
struct ZULingEmotionWord {
  std::string word;
  std::string label;

  bool operator==(const ZULingEmotionWord&) const = default;
};

// The emotion of a sequence of labels, -2 (very negative) to 2 (very positive): the
// strongest positive and negative labels, an intensifier, and an odd number of
// negations turning the result around.
std::int32_t lingEmotionOfLabels(const std::vector<std::string>& labels) noexcept;

class ZULingSyntacticAnalyzerTagger {
 public:
  // The look-back and anticipation window, and the speaking time of a byte.
  static constexpr std::int64_t kWindowMs = 1300;
  static constexpr std::int64_t kMsPerByte = 70;

  explicit ZULingSyntacticAnalyzerTagger(std::shared_ptr<const ZULingLanguageMap> languages);

  // Selects the emotion database: the language followed by "Emotions".
  void setLanguage(const std::string& key);
  const ZULingDatabasePtr& database() const noexcept { return fEmotions.database(); }

  // Adds the automatic tags of the analysis of job.text to the job, rewrites job.text
  // from the chunks with their bookmarks, and puts the job's actions in the order of
  // their bookmarks.
  void insertTags(ZULingSyntacticAnalysis analysis, MKTaskInstruction& job);

  // The emotion of the analysed words; the labelled words go to `labelled` when given.
  std::int32_t emotion(const ZULingSyntacticAnalysis& analysis,
                       std::vector<ZULingEmotionWord>* labelled = nullptr) const;

 private:
  ZULingDatabaseUser fEmotions;
  // The text id of the last job that received the pause before speech.
  std::optional<MKID> fLastTextId;
};

// The contextual gestures of one job, as the compiler stage adds them.
class ZULingAutomaticTagging {
 public:
  explicit ZULingAutomaticTagging(std::shared_ptr<const ZULingLanguageMap> languages);

  // When the job's body language mode is contextual (2 or more): selects the language
  // (the speech engine's name, "" when unknown) in the analyser and the tagger,
  // analyses job.text (the parser's speech text) and inserts the automatic tags.
  // Otherwise does nothing.
  void process(MKTaskInstruction& job, const std::string& language);

  ZULingSyntacticAnalyzer analyzer;
  ZULingSyntacticAnalyzerTagger tagger;
};

// The emotion of a recognised word or phrase, with a language selection of its own.
class ZULingEmotionEstimator {
 public:
  explicit ZULingEmotionEstimator(std::shared_ptr<const ZULingLanguageMap> languages);

  // -2 to 2; 0 when no database is found for the language.
  std::int32_t getEmotion(const std::string& language, std::string_view text,
                          std::vector<ZULingEmotionWord>* labelled = nullptr);

 private:
  std::mutex fMutex;
  ZULingSyntacticAnalyzer fAnalyzer;
  ZULingSyntacticAnalyzerTagger fTagger;
};

}  // namespace ZU
