// mokuto parse [--language L] [TEXT]: the speech text and the actions that a text gives,
// as JSON, so that a robot programmer can check a text before the robot speaks it.
#include <iostream>
#include <memory>
#include <optional>
#include <string>

#include "cli_commands.h"
#include "cli_common.h"
#include "cli_json.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace mokuto::cli {

namespace {

struct ParseOptions {
  std::string language = "English";
  std::optional<std::string> text;
};

}  // namespace

void addParseCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "parse", "Parse an annotated text and print its speech text and actions as JSON");
  auto options = std::make_shared<ParseOptions>();
  addLanguageOption(*command, options->language, speechLanguages(),
                    "The speech engine's language (Japanese puts a comma before a pause that "
                    "follows a bookmark)");
  addTextArgument(*command, options->text, "The annotated text");
  command->callback([options, &status]() {
    const std::string text = readText(options->text);
    auto job = std::make_shared<ZU::MKTaskInstruction>();
    ZU::ZUMokutoParser().parse(job, text, options->language == "Japanese");
    std::cout << dumpJson(jobToJson(*job)) << '\n';
    status = std::cout.flush().good() ? kSuccess : kFailure;
  });
}

}  // namespace mokuto::cli
