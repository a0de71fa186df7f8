#pragma once
// What the subcommands of `mokuto` share: their exit statuses, the text argument (standard
// input for "-" or nothing), the language option and a printable echo of a text.
#include <CLI/CLI.hpp>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace mokuto::cli {

// Exit statuses, the same for every subcommand (and for `zefoko`).
constexpr int kSuccess = 0;
// The work could not be done: a service that fails, nothing found, an unwritable output.
constexpr int kFailure = 1;
// An unusable argument or option, before anything is done.
constexpr int kUsage = 2;
// SIGINT or SIGTERM stopped the command (the shell's status for SIGINT).
constexpr int kStopped = 130;

// The languages of the robot's speech engine.
const std::vector<std::string>& speechLanguages();
// The language keys of the linguistic databases: the main ones (what the analysis reads for
// a speech language), those with an emotion database, and every key.
std::vector<std::string> analysisLanguages();
std::vector<std::string> emotionLanguages();
std::vector<std::string> databaseKeys();

// "--language", taking one of `allowed` (another is a usage error), with its default shown.
CLI::Option* addLanguageOption(CLI::App& command, std::string& language,
                               const std::vector<std::string>& allowed, const std::string& help);
// The positional TEXT: standard input when it is absent or "-".
CLI::Option* addTextArgument(CLI::App& command, std::optional<std::string>& text,
                             const std::string& what);
std::string readText(const std::optional<std::string>& argument);

// At most `limit` characters of `text` (UTF-8), each line break or tab shown as a space and
// every other control character or invalid byte as U+FFFD, with "…" when it is cut.
// `length` receives the whole text's count of characters (an invalid byte counts as one).
std::string printable(const std::string& text, std::size_t limit, std::size_t* length = nullptr);

}  // namespace mokuto::cli
