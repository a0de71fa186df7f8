#pragma once
// The subcommands of the `mokuto` command. Each registers itself on the application;
// its callback stores the process exit status in `status` (cli_common.h).
#include <CLI/CLI.hpp>

namespace mokuto::cli {

// mokuto config --apply JSON
void addConfigCommand(CLI::App& app, int& status);
// mokuto parse [--language L] [TEXT]
void addParseCommand(CLI::App& app, int& status);
// mokuto lookup [--language L | --database FILE] [--json] WORD...
void addLookupCommand(CLI::App& app, int& status);
// mokuto analyse [--language L] [--mode M] [--pause MS] [--tags-to-words JSON]
//                [--structures] [TEXT]
void addAnalyseCommand(CLI::App& app, int& status);
// mokuto emotion [--language L] [--json] [TEXT]
void addEmotionCommand(CLI::App& app, int& status);
// mokuto say [--mode M] [--language L] [--posture P] [--speech espeak|timing] [--fast]
//            [--config JSON] [--tags-to-words JSON] [--tags-to-animations JSON]
//            [--package NAME]... [--check-times] [--wav FILE] [--html FILE] [--timeline FILE]
//            [--dry-run] [--quiet] [TEXT]
void addSayCommand(CLI::App& app, int& status);
// mokuto syntax
void addSyntaxCommand(CLI::App& app, int& status);
// mokuto methods | tags | animations [TAG] | sounds | diagnosis | page
void addInspectCommands(CLI::App& app, int& status);

}  // namespace mokuto::cli
