// zefoko: the host of the robot's services, and its tools.
#include <CLI/CLI.hpp>

#include "commands.h"
#include "ko/os.hpp"

int main(int argc, char** argv) {
  // The speech and motion threads run in real time: no page faults to re-grow the heap.
  ko::os::keepFreedMemory();
  CLI::App app{"zefoko: the simulated robot and its tools"};
  app.set_version_flag("--version", std::string("zefoko ") + ZEFOKO_VERSION);
  app.require_subcommand(1);
  app.footer(
      "Exit status, for every command: 0 done; 1 the work could not be done; 2 an "
      "unusable argument or option.");
  int status = 0;
  zefoko::addSpeakCommand(app, status);
  zefoko::addBodyTalkCommand(app, status);
  zefoko::addServeCommand(app, status);
  zefoko::addKeysCommand(app, status);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    // Help and the version are a success; an unusable argument or option is status 2.
    return app.exit(e) == 0 ? 0 : 2;
  }
  return status;
}
