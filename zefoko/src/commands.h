#pragma once
// The subcommands of the `zefoko` command. Each registers itself on the application; its
// callback stores the process exit status in `status`.
#include <CLI/CLI.hpp>

namespace zefoko {

// zefoko speak [--wav FILE] [--speech espeak|timing] [--fast] [--language L] [--json] [TEXT]
void addSpeakCommand(CLI::App& app, int& status);
// zefoko bodytalk [--seconds N] [--posture Standing|Sitting|SittingOnChair] [--json]
void addBodyTalkCommand(CLI::App& app, int& status);
// zefoko serve [--speech espeak|timing] [--fast] [--posture P] [--timeline-entries N]
//              [--listen E | --connect E]
//              [--heartbeat MS] [--max-message BYTES] [--secret-key F] [--client-key F]...
//              [--server-key F] [--http ADDRESS:PORT [--http-token T]]
//              [MODULE.so...]
void addServeCommand(CLI::App& app, int& status);
// zefoko keys DIR [--name NAME] [--force]
void addKeysCommand(CLI::App& app, int& status);

}  // namespace zefoko
