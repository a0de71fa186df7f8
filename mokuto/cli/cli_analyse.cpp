// mokuto analyse [--language L] [--mode M] [--pause MS] [--tags-to-words JSON]
// [--structures] [TEXT]: the job that the compiler stage makes of a text in contextual
// mode, parsed and with its automatic tags, as JSON (the form of mokuto parse), so that
// the automatic gestures of a text can be checked without a robot.
#include <cstdint>
#include <filesystem>
#include <iostream>
#include <iterator>
#include <limits>
#include <memory>
#include <optional>
#include <string>

#include "cli_commands.h"
#include "cli_common.h"
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
  std::optional<std::string> text;
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

int analyse(const AnalyseOptions& options, const std::string& text) {
  ZU::MokutoConfig config;
  config.bodyLanguageMode = ZU::bodyLanguageModeFromStr(options.mode);
  config.msPauseBeforeSpeech = options.pause;
  if (!options.tagsToWords.empty()) {
    try {
      const ko::AnyValue value = ko::fromJson(options.tagsToWords);
      if (value.kind() != ko::Kind::List) {
        std::cerr << "mokuto analyse: --tags-to-words takes a JSON array\n";
        return kUsage;
      }
      config.updateWordsToTags(ZU::fromAnyReference(value));
    } catch (const ko::JsonError& e) {
      std::cerr << "mokuto analyse: --tags-to-words: invalid JSON: " << e.what() << '\n';
      return kUsage;
    } catch (const ZU::ZUError& e) {
      std::cerr << "mokuto analyse: --tags-to-words: cannot convert the value: " << e.description()
                << '\n';
      return kUsage;
    }
  }
  auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
  if (!std::filesystem::is_regular_file(languages->at(options.language)))
    std::cerr << "mokuto analyse: no linguistic database for " << options.language
              << ": no automatic tags but those of --tags-to-words\n";
  auto job = std::make_shared<ZU::MKTaskInstruction>(1, text, config, ZU::Standing);
  ZU::ZUMokutoParser().parse(job, text, options.language == "Japanese");
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
  return std::cout.flush().good() ? kSuccess : kFailure;
}

}  // namespace

void addAnalyseCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "analyse",
      "Parse a text and add its automatic tags as in contextual mode; print the job as JSON");
  auto options = std::make_shared<AnalyseOptions>();
  addLanguageOption(*command, options->language, analysisLanguages(),
                    "The speech engine's language, a key of the linguistic databases");
  command->add_option("--mode", options->mode, "The body language mode")
      ->check(CLI::IsMember({"disabled", "random", "contextual"}))
      ->capture_default_str();
  command->add_option("--pause", options->pause, "The pause before speech in milliseconds")
      ->check(CLI::Range(0, std::numeric_limits<std::int32_t>::max()))
      ->capture_default_str();
  command
      ->add_option("--tags-to-words", options->tagsToWords,
                   "Words bound to tags, as addTagsToWords takes them: "
                   "[[\"tag\", [\"word\", ...]], ...] (default: none)")
      ->type_name("JSON");
  command->add_flag("--structures", options->structures,
                    "Also print the analysis of the speech text: its chunks with their "
                    "classes and its structures");
  addTextArgument(*command, options->text, "The annotated text");
  command->callback([options, &status]() { status = analyse(*options, readText(options->text)); });
}

}  // namespace mokuto::cli
