// zefoko: the host of the robot's services, and its tools.
#include <CLI/CLI.hpp>

#include "commands.h"

int main(int argc, char** argv) {
  CLI::App app{"zefoko: the simulated robot and its tools"};
  app.require_subcommand(1);
  int status = 0;
  zefoko::addSpeakCommand(app, status);
  CLI11_PARSE(app, argc, argv);
  return status;
}
