#include "cli_commands.h"
namespace mokuto::cli {
void addConfigCommand(CLI::App& app, int& status) { (void)app; (void)status; }
}  // namespace mokuto::cli
