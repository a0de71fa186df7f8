// mokuto analyse [--language L] [--mode M] [--pause MS] [--tags-to-words JSON]
// [--structures] [TEXT]: the job that the compiler stage makes of a text in contextual
// mode, parsed and with its automatic tags, as JSON (the form of mokuto parse), so that
// the automatic gestures of a text can be checked without a robot.
#include <iostream>
#include <iterator>
#include <memory>
#include <string>

#include "cli_commands.h"
#include "cli_json.h"
#include "ko/json.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zulingsyntacticanalyzer.h"
#include "mokuto/zulingsyntacticanalyzertagger.h"
#include "mokuto/zumokutoparser.h"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace mokuto::cli {

namespace {

struct AnalyseOptions {
  std::string language = "English";
  std::string mode = "contextual";
  std::int32_t pause = 500;
  std::string tagsToWords;
  bool structures = false;
  std::string text;
};

Json structureToJson(const ZU::ZULingSyntacticAnalysis& analysis,
                     const ZU::ZULingSyntacticAnalyzerStructure& structure) {
  Json words = Json::array();
  for (std::size_t c = structure.first; c <= structure.last; ++c) {
    if (analysis.chunks[c].isWord())
      words.push_back(analysis.chunks[c].text);
  }
  Json out;
  out["kind"] = ZU::kLingStructureKindNames[structure.kind];
  out["words"] = std::move(words);
  if (structure.kind == ZU::STRUCTURE_AND || structure.kind == ZU::STRUCTURE_OR)
    out["itemCount"] = structure.itemCount;
  out["notNegated"] = structure.notNegated;
  if (!structure.children.empty()) {
    Json children = Json::array();
    for (const auto& child : structure.children)
      children.push_back(structureToJson(analysis, child));
    out["children"] = std::move(children);
  }
  return out;
}

Json analysisToJson(const ZU::ZULingSyntacticAnalysis& analysis) {
  Json chunks = Json::array();
  for (const auto& chunk : analysis.chunks)
    chunks.push_back({chunk.text, ZU::lingWordClassToStr(chunk.wordClass())});
  Json structures = Json::array();
  for (const auto& structure : analysis.structures)
    structures.push_back(structureToJson(analysis, structure));
  Json out;
  out["chunks"] = std::move(chunks);
  out["structures"] = std::move(structures);
  return out;
}

int analyse(const AnalyseOptions& options) {
  ZU::MokutoConfig config;
  config.bodyLanguageMode = ZU::bodyLanguageModeFromStr(options.mode);
  if (config.bodyLanguageMode == ZU::BODY_LANGUAGE_MODE_END_OF_ENUM) {
    std::cerr << "mokuto analyse: the mode must be disabled, random or contextual\n";
    return 1;
  }
  if (options.pause < 0) {
    std::cerr << "mokuto analyse: the pause cannot be negative\n";
    return 1;
  }
  config.msPauseBeforeSpeech = options.pause;
  if (!options.tagsToWords.empty()) {
    try {
      config.updateWordsToTags(ZU::fromAnyReference(ko::fromJson(options.tagsToWords)));
    } catch (const ko::JsonError& e) {
      std::cerr << "mokuto analyse: invalid JSON: " << e.what() << '\n';
      return 1;
    } catch (const ZU::ZUError& e) {
      std::cerr << "mokuto analyse: cannot convert the value: " << e.description() << '\n';
      return 1;
    }
  }
  auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
  if (languages->count(options.language) == 0)
    std::cerr << "mokuto analyse: \"" << options.language
              << "\" is not a language key: no automatic tags but those of --tags-to-words\n";

  auto job = std::make_shared<ZU::MKTaskInstruction>(1, options.text, config, ZU::Standing);
  ZU::ZUMokutoParser().parse(job, options.text, options.language == "Japanese");
  Json structures;
  if (options.structures) {
    ZU::ZULingSyntacticAnalyzer analyzer(languages);
    analyzer.setLanguage(options.language);
    structures = analysisToJson(analyzer.analyse(job->text));
  }
  ZU::ZULingAutomaticTagging tagging(languages);
  tagging.process(*job, options.language);

  Json out = jobToJson(*job);
  if (options.structures)
    out["analysis"] = std::move(structures);
  std::cout << dumpJson(out) << '\n';
  return std::cout.good() ? 0 : 1;
}

}  // namespace

void addAnalyseCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "analyse",
      "Parse a text and add its automatic tags as in contextual mode; print the job as JSON");
  auto options = std::make_shared<AnalyseOptions>();
  command->add_option("--language", options->language,
                      "The speech engine's language (English, French, Japanese, fr_FR, ...); "
                      "default English");
  command->add_option("--mode", options->mode,
                      "The body language mode: disabled, random or contextual (default)");
  command->add_option("--pause", options->pause,
                      "The pause before speech in milliseconds (default 500)");
  command->add_option("--tags-to-words", options->tagsToWords,
                      "Words bound to tags, as addTagsToWords takes them: "
                      "[[\"tag\", [\"word\", ...]], ...]");
  command->add_flag("--structures", options->structures,
                    "Also print the analysis of the speech text: its chunks with their "
                    "classes and its structures");
  CLI::Option* text = command->add_option("text", options->text,
                                          "The annotated text; read from standard input if absent");
  command->callback([options, text, &status]() {
    if (text->count() == 0)
      options->text.assign(std::istreambuf_iterator<char>(std::cin),
                           std::istreambuf_iterator<char>());
    status = analyse(*options);
  });
}

}  // namespace mokuto::cli
