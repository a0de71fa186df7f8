// mokuto parse [--japanese] [TEXT]: the speech text and the actions that a text gives,
// as JSON, so that a robot programmer can check a text before the robot speaks it.
#include <iostream>
#include <iterator>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

#include "cli_commands.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace mokuto::cli {

namespace {

using Json = nlohmann::ordered_json;

Json actionToJson(const ZU::MKTaskAction& action) {
  Json out;
  out["type"] = action.type;
  out["keyword"] = ZU::MKTaskActionType_toStr(action.type);
  out["id"] = action.id;
  out["text"] = action.text;
  if (const auto* animation = dynamic_cast<const ZU::MKAnimationAction*>(&action)) {
    out["animation"] = animation->animation;
    out["tag"] = animation->tag;
  } else if (const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(&action)) {
    out["soundSet"] = sound->soundSet;
    out["soundName"] = sound->soundName;
    out["volume"] = sound->volume;
  } else if (const auto* call = dynamic_cast<const ZU::MKCallAction*>(&action)) {
    out["module"] = call->module;
    out["method"] = call->method;
    out["arguments"] = call->arguments;
  } else if (const auto* mode = dynamic_cast<const ZU::MKModeAction*>(&action)) {
    out["mode"] = mode->mode;
  } else if (const auto* affectation = dynamic_cast<const ZU::MKAffectationAction*>(&action)) {
    out["name"] = affectation->name;
    out["value"] = affectation->value;
  }
  return out;
}

Json jobToJson(const ZU::MKTaskInstruction& job) {
  Json out;
  out["text"] = job.text;
  out["usedBookmarks"] = job.usedBookmarks;
  out["inputMode2"] = job.config.inputMode2;
  Json actions = Json::array();
  for (const auto& action : job.actions) {
    if (action) {
      actions.push_back(actionToJson(*action));
    }
  }
  out["actions"] = std::move(actions);
  return out;
}

}  // namespace

void addParseCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "parse", "Parse an annotated text and print its speech text and actions as JSON");
  auto japanese = std::make_shared<bool>(false);
  auto text = std::make_shared<std::string>();
  command->add_flag("--japanese", *japanese,
                    "Parse as for the Japanese voice (a comma before a pause that follows a "
                    "bookmark)");
  CLI::Option* textOption =
      command->add_option("text", *text, "The annotated text; read from standard input if absent");
  command->callback([japanese, text, textOption, &status]() {
    if (textOption->count() == 0) {
      text->assign(std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>());
    }
    auto job = std::make_shared<ZU::MKTaskInstruction>();
    ZU::ZUMokutoParser().parse(job, *text, *japanese);
    std::cout << jobToJson(*job).dump(2, ' ', false, Json::error_handler_t::replace) << '\n';
    status = std::cout.good() ? 0 : 1;
  });
}

}  // namespace mokuto::cli
