// mokuto config --apply JSON: applies a configuration value to the default
// configuration and prints the result. What the service would log and skip (an unknown
// key, a value of the wrong type, a mode that does not exist) is an error of the command.
#include <iostream>
#include <memory>
#include <string>

#include "cli_commands.h"
#include "cli_common.h"
#include "ko/json.hpp"
#include "ko/log.hpp"
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
    std::cerr << "mokuto config: --apply: invalid JSON: " << e.what() << std::endl;
    return kUsage;
  }
  if (any.kind() != ko::Kind::List) {
    std::cerr << "mokuto config: --apply takes a JSON array" << std::endl;
    return kUsage;
  }
  ZU::ZUValue value;
  try {
    value = ZU::fromAnyReference(any);
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto config: --apply: cannot convert the value: " << e.description()
              << std::endl;
    return kUsage;
  }
  ZU::MokutoConfig config;
  std::vector<std::string> errors;
  {
    ko::log::ScopedCapture capture(ko::log::Error, true);
    config.fromZUValue(value);
    for (const auto& record : capture.sink().records())
      errors.push_back(record.message);
  }
  for (const auto& error : errors)
    std::cerr << "mokuto config: --apply: " << error << std::endl;
  if (!errors.empty())
    return kUsage;
  std::cout << config << std::endl;
  return std::cout.good() ? kSuccess : kFailure;
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
      ->type_name("JSON")
      ->required();
  command->callback([json, &status] { status = applyConfig(*json); });
}

}  // namespace mokuto::cli
