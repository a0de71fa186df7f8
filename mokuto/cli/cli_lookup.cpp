// mokuto lookup [--language L | --database FILE] [--json] WORD...: what a linguistic
// database holds for each word, looked up byte for byte as the analysis looks words up.
#include <iostream>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "cli_commands.h"
#include "cli_common.h"
#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

namespace mokuto::cli {

namespace {

using Json = nlohmann::ordered_json;

struct LookupOptions {
  std::string language = "English";
  std::string database;
  bool json = false;
  std::vector<std::string> words;
};

Json lookUp(const ZU::ZULingSyntacticAnalyzerBinaryDatabase& database, const std::string& word) {
  std::size_t longestPrefix = 0;
  const bool found = database.find(word, 0, longestPrefix).has_value();
  Json records = Json::array();
  for (const ZU::ZULingClassFeatures& record : database.wordClasses(word)) {
    std::string baseForm;
    const bool hasBaseForm = database.lemma(word, record.wordClass, baseForm) && !baseForm.empty();
    // The feature bytes as numbers: they are bytes, not text.
    Json features = Json::array();
    for (const char byte : record.features)
      features.push_back(static_cast<unsigned char>(byte));
    records.push_back({{"class", ZU::lingWordClassToStr(record.wordClass)},
                       {"classValue", record.wordClass},
                       {"features", std::move(features)},
                       {"lemma", hasBaseForm ? Json(baseForm) : Json(nullptr)}});
  }
  return {{"word", word},
          {"found", found},
          {"longestPrefix", longestPrefix},
          {"records", std::move(records)}};
}

void printText(const Json& entry) {
  const auto dump = [](const Json& value) {
    return value.dump(-1, ' ', false, Json::error_handler_t::replace);
  };
  std::cout << dump(entry["word"]) << ": " << (entry["found"].get<bool>() ? "found" : "not found")
            << ", longest stored prefix " << entry["longestPrefix"].get<std::size_t>() << '\n';
  for (const Json& record : entry["records"]) {
    std::string features;
    for (const Json& byte : record["features"])
      features += static_cast<char>(byte.get<unsigned char>());
    std::cout << "  " << record["class"].get<std::string>() << " ("
              << record["classValue"].get<int>() << ")  features " << dump(Json(features))
              << "  lemma " << (record["lemma"].is_null() ? "none" : dump(record["lemma"])) << '\n';
  }
}

}  // namespace

void addLookupCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "lookup", "Look words up in a linguistic database and print their records");
  auto options = std::make_shared<LookupOptions>();
  CLI::Option* language =
      addLanguageOption(*command, options->language, databaseKeys(),
                        "A key of the linguistic databases (French, fr_FR, English, Japanese, "
                        "EnglishEmotions, ...)");
  command->add_option("--database", options->database, "A database file to read instead")
      ->type_name("FILE")
      ->excludes(language);
  command->add_flag("--json", options->json,
                    "Print one JSON object per word: word, found, longestPrefix, records "
                    "(class, classValue, features as an array of byte values, lemma)");
  command->add_option("words", options->words, "The words, as stored (lowercase)")->required();
  command->callback([options, &status]() {
    ZU::ZULingDatabasePtr database;
    if (!options->database.empty()) {
      auto loaded = std::make_shared<ZU::ZULingSyntacticAnalyzerBinaryDatabase>();
      if (loaded->load(options->database))
        database = std::move(loaded);
    } else {
      auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
      ZU::ZULingDatabaseUser user(languages);
      user.setLanguage(options->language);
      database = user.database();
    }
    if (!database) {
      std::cerr << "mokuto lookup: no linguistic database to read\n";
      status = kFailure;
      return;
    }
    Json all = Json::array();
    for (const std::string& word : options->words) {
      Json entry = lookUp(*database, word);
      if (options->json)
        all.push_back(std::move(entry));
      else
        printText(entry);
    }
    if (options->json)
      std::cout << all.dump(2, ' ', false, Json::error_handler_t::replace) << '\n';
    status = std::cout.good() ? 0 : 1;
  });
}

}  // namespace mokuto::cli
