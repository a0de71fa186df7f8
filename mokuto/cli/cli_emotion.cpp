// mokuto emotion [--language L] [--json] TEXT: the emotion of a recognised text, -2
// (very negative) to 2 (very positive), and the words that carry a label.
#include <filesystem>
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "cli_commands.h"
#include "cli_common.h"
#include "cli_json.h"
#include "mokuto/zulingsyntacticanalyzertagger.h"

namespace mokuto::cli {

namespace {

struct EmotionOptions {
  std::string language = "English";
  bool json = false;
  std::optional<std::string> text;
};

int emotion(const EmotionOptions& options, const std::string& text) {
  auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
  const std::string& database = languages->at(options.language + "Emotions");
  if (!std::filesystem::is_regular_file(database)) {
    std::cerr << "mokuto emotion: no emotion database for " << options.language << " (" << database
              << ")\n";
    return kFailure;
  }
  ZU::ZULingEmotionEstimator estimator(languages);
  std::vector<ZU::ZULingEmotionWord> words;
  const std::int32_t estimate = estimator.getEmotion(options.language, text, &words);
  if (options.json) {
    Json labelled = Json::array();
    for (const auto& word : words)
      labelled.push_back({{"word", word.word}, {"label", word.label}});
    Json out;
    out["text"] = text;
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
  return std::cout.flush().good() ? kSuccess : kFailure;
}

}  // namespace

void addEmotionCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "emotion", "Estimate the emotion of a recognised text (-2 to 2) and list its labelled words");
  auto options = std::make_shared<EmotionOptions>();
  addLanguageOption(*command, options->language, emotionLanguages(),
                    "The speech engine's language, a key with an emotion database");
  command->add_flag(
      "--json", options->json,
      "Print {\"text\", \"language\", \"emotion\", \"words\": [{\"word\", \"label\"}]}");
  addTextArgument(*command, options->text, "The recognised word or phrase");
  command->callback([options, &status]() { status = emotion(*options, readText(options->text)); });
}

}  // namespace mokuto::cli
