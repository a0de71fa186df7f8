// mokuto config --apply JSON: applies a configuration value to the default
// configuration and prints the result. Log lines go to standard error.
#include <iostream>
#include <memory>
#include <string>

#include "cli_commands.h"
#include "ko/json.hpp"
#include "mokuto/mokutoconfig.h"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace mokuto::cli {

namespace {

int applyConfig(const std::string& text) {
  ko::AnyValue any;
  try {
    any = ko::fromJson(text);
  } catch (const ko::JsonError& e) {
    std::cerr << "mokuto config: invalid JSON: " << e.what() << std::endl;
    return 1;
  }
  ZU::ZUValue value;
  try {
    value = ZU::fromAnyReference(any);
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto config: cannot convert the value: " << e.description() << std::endl;
    return 1;
  }
  ZU::MokutoConfig config;
  config.fromZUValue(value);
  std::cout << config << std::endl;
  return 0;
}

}  // namespace

void addConfigCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "config", "Apply a configuration value to the default configuration and print it");
  auto json = std::make_shared<std::string>();
  command
      ->add_option("--apply", *json,
                   "The configuration as JSON: an array of [key, value] pairs, for example "
                   "[[\"bodyLanguageMode\", \"random\"], [\"msPauseBeforeSpeech\", 0]]")
      ->required();
  command->callback([json, &status] { status = applyConfig(*json); });
}

}  // namespace mokuto::cli
