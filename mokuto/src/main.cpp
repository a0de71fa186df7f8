// mokuto: the command line of the speech-animation service.
#include <CLI/CLI.hpp>

#include "cli_commands.h"

int main(int argc, char** argv) {
  CLI::App app{"mokuto: speech animation for a humanoid robot"};
  app.require_subcommand(1);
  int status = 0;
  mokuto::cli::addConfigCommand(app, status);
  mokuto::cli::addParseCommand(app, status);
  mokuto::cli::addLookupCommand(app, status);
  mokuto::cli::addAnalyseCommand(app, status);
  mokuto::cli::addEmotionCommand(app, status);
  CLI11_PARSE(app, argc, argv);
  return status;
}
