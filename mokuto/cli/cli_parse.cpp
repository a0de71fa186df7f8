// mokuto parse [--japanese] [TEXT]: the speech text and the actions that a text gives,
// as JSON, so that a robot programmer can check a text before the robot speaks it.
#include <iostream>
#include <iterator>
#include <memory>
#include <string>

#include "cli_commands.h"
#include "cli_json.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace mokuto::cli {

void addParseCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "parse", "Parse an annotated text and print its speech text and actions as JSON");
  auto japanese = std::make_shared<bool>(false);
  auto text = std::make_shared<std::string>();
  command->add_flag("--japanese", *japanese,
                    "Parse as for the Japanese voice (a comma before a pause that follows a "
                    "bookmark)");
  CLI::Option* textOption =
      command->add_option("text", *text, "The annotated text; read from standard input if absent");
  command->callback([japanese, text, textOption, &status]() {
    if (textOption->count() == 0) {
      text->assign(std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>());
    }
    auto job = std::make_shared<ZU::MKTaskInstruction>();
    ZU::ZUMokutoParser().parse(job, *text, *japanese);
    std::cout << dumpJson(jobToJson(*job)) << '\n';
    status = std::cout.good() ? 0 : 1;
  });
}

}  // namespace mokuto::cli
