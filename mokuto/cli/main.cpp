// mokuto: the command line of the speech-animation service.
#include <CLI/CLI.hpp>

#include "cli_commands.h"
#include "cli_service.h"

int main(int argc, char** argv) {
  CLI::App app{"mokuto: speech animation for a humanoid robot"};
  app.require_subcommand(1);
  mokuto::cli::addConnectOptions(app);
  int status = 0;
  mokuto::cli::addConfigCommand(app, status);
  mokuto::cli::addParseCommand(app, status);
  mokuto::cli::addLookupCommand(app, status);
  mokuto::cli::addAnalyseCommand(app, status);
  mokuto::cli::addEmotionCommand(app, status);
  mokuto::cli::addSayCommand(app, status);
  mokuto::cli::addInspectCommands(app, status);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    // Help is a success; an unusable argument or option is status 2.
    return app.exit(e) == 0 ? 0 : 2;
  }
  return status;
}
