// zefoko: the host of the robot's services, and its tools.
#include <CLI/CLI.hpp>

#include "commands.h"
#include "ko/os.hpp"

int main(int argc, char** argv) {
  // The speech and motion threads run in real time: no page faults to re-grow the heap.
  ko::os::keepFreedMemory();
  CLI::App app{"zefoko: the simulated robot and its tools"};
  app.require_subcommand(1);
  int status = 0;
  zefoko::addSpeakCommand(app, status);
  zefoko::addBodyTalkCommand(app, status);
  zefoko::addServeCommand(app, status);
  zefoko::addKeysCommand(app, status);
  CLI11_PARSE(app, argc, argv);
  return status;
}
