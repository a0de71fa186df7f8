#include "cli_commands.h"
namespace mokuto::cli {
void addParseCommand(CLI::App& app, int& status) { (void)app; (void)status; }
}  // namespace mokuto::cli
