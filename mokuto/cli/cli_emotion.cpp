// mokuto emotion [--language L] [--json] TEXT: the emotion of a recognised text, -2
// (very negative) to 2 (very positive), and the words that carry a label.
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "cli_commands.h"
#include "cli_json.h"
#include "mokuto/zulingsyntacticanalyzertagger.h"

namespace mokuto::cli {

namespace {

struct EmotionOptions {
  std::string language = "English";
  bool json = false;
  std::string text;
};

int emotion(const EmotionOptions& options) {
  auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
  if (languages->count(options.language) == 0 ||
      languages->count(options.language + "Emotions") == 0)
    std::cerr << "mokuto emotion: \"" << options.language
              << "\" has no emotion database: the estimate is 0\n";
  ZU::ZULingEmotionEstimator estimator(languages);
  std::vector<ZU::ZULingEmotionWord> words;
  const std::int32_t estimate = estimator.getEmotion(options.language, options.text, &words);
  if (options.json) {
    Json labelled = Json::array();
    for (const auto& word : words)
      labelled.push_back({{"word", word.word}, {"label", word.label}});
    Json out;
    out["text"] = options.text;
    out["language"] = options.language;
    out["emotion"] = estimate;
    out["words"] = std::move(labelled);
    std::cout << dumpJson(out) << '\n';
  } else {
    std::cout << "emotion: " << estimate << '\n';
    for (const auto& word : words)
      std::cout << "  " << Json(word.word).dump(-1, ' ', false, Json::error_handler_t::replace)
                << ": " << word.label << '\n';
  }
  return std::cout.good() ? 0 : 1;
}

}  // namespace

void addEmotionCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "emotion", "Estimate the emotion of a recognised text (-2 to 2) and list its labelled words");
  auto options = std::make_shared<EmotionOptions>();
  command->add_option("--language", options->language,
                      "The speech engine's language (English, French, Japanese, ja_JP); default "
                      "English");
  command->add_flag(
      "--json", options->json,
      "Print {\"text\", \"language\", \"emotion\", \"words\": [{\"word\", \"label\"}]}");
  command->add_option("text", options->text, "The recognised word or phrase")->required();
  command->callback([options, &status]() { status = emotion(*options); });
}

}  // namespace mokuto::cli
