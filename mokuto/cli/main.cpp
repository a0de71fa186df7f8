// mokuto: the command line of the speech-animation service.
#include <CLI/CLI.hpp>

#include "cli_commands.h"
#include "cli_common.h"
#include "cli_service.h"

int main(int argc, char** argv) {
  CLI::App app{"mokuto: speech animation for a humanoid robot"};
  app.set_version_flag("--version", std::string("mokuto ") + MOKUTO_VERSION);
  app.require_subcommand(1);
  app.footer(
      "Exit status, for every command: 0 done; 1 the work could not be done; 2 an "
      "unusable argument or option; 130 stopped by SIGINT or SIGTERM.");
  int status = mokuto::cli::kSuccess;
  mokuto::cli::addSayCommand(app, status);
  mokuto::cli::addSyntaxCommand(app, status);
  mokuto::cli::addParseCommand(app, status);
  mokuto::cli::addAnalyseCommand(app, status);
  mokuto::cli::addEmotionCommand(app, status);
  mokuto::cli::addLookupCommand(app, status);
  mokuto::cli::addConfigCommand(app, status);
  mokuto::cli::addInspectCommands(app, status);
  mokuto::cli::addConnectOptions(app,
                                 {"say", "methods", "tags", "animations", "diagnosis", "page"});
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    // Help and the version are a success; an unusable argument or option is a usage error.
    return app.exit(e) == 0 ? mokuto::cli::kSuccess : mokuto::cli::kUsage;
  }
  return status;
}
