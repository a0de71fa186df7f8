#include "cli_json.h"

namespace mokuto::cli {

namespace {

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

}  // namespace

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

std::string dumpJson(const Json& json) {
  return json.dump(2, ' ', false, Json::error_handler_t::replace);
}

}  // namespace mokuto::cli
