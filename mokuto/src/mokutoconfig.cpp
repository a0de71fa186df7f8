#include "mokuto/mokutoconfig.h"

#include <exception>
#include <stdexcept>
#include <string_view>

#include "ko/log.hpp"
#include "zu/zuvalue.h"

namespace ZU {

namespace {

constexpr const char* kDefaultAnimationsPackage = "animations/";

// An array of exactly two elements whose first is a string.
bool isKeyedPair(const ZUValue& element) {
  return element.isArray() && element.arraySize() == 2 && element[0].isString();
}

}  // namespace

MokutoConfig::MokutoConfig()
    : bodyLanguageMode(BODY_LANGUAGE_MODE_CONTEXTUAL),
      msPauseBeforeSpeech(500),
      ifBehaviorAtEndOfMokutoIsBlocking(true),
      armsBreathingAllowed(true),
      animationsPackages{kDefaultAnimationsPackage},
      inputMode2(false) {}

void MokutoConfig::reset() {
  bodyLanguageMode = BODY_LANGUAGE_MODE_CONTEXTUAL;
  msPauseBeforeSpeech = 500;
  behaviorAtEndOfMokuto.clear();
  ifBehaviorAtEndOfMokutoIsBlocking = true;
  armsBreathingAllowed = true;
  animationsPackages.resize(1);
  wordsToTags.clear();
  for (auto& tagToAnimations : tagsToAnimations)
    tagToAnimations.clear();
  inputMode2 = false;
}

void MokutoConfig::fromZUValue(const ZUValue& value) {
  if (!value.isArray())
    return;
  try {
    for (int i = 0; i < value.arraySize(); ++i) {
      const ZUValue& element = value[i];
      if (!isKeyedPair(element))
        continue;
      const std::string& key = element[0].asString();
      const ZUValue& field = element[1];
      if (key == "bodyLanguageMode" && field.isString()) {
        const std::string& name = field.asString();
        const BodyLanguageMode mode = bodyLanguageModeFromStr(name);
        if (mode != BODY_LANGUAGE_MODE_END_OF_ENUM) {
          bodyLanguageMode = mode;
        } else {
          KO_LOG_ERROR("MokutoConfig")
              << "Invalid body language mode: \"" << name << "\"\n"
              << "All the possible body language modes are: " << bodyLanguageModeNameList() << ".";
        }
      } else if (key == "msPauseBeforeSpeech" && field.isInt()) {
        const int pause = field.asInt();
        if (pause >= 0) {
          msPauseBeforeSpeech = pause;
        } else {
          KO_LOG_ERROR("MokutoConfig") << "pause time can't be negative.";
        }
      } else if (key == "behaviorAtEndOfMokuto" && field.isString()) {
        behaviorAtEndOfMokuto = field.asString();
      } else if (key == "ifBehaviorAtEndOfMokutoIsBlocking" && field.isBool()) {
        ifBehaviorAtEndOfMokutoIsBlocking = field.asBool();
      } else if (key == "armsBreathingAllowed" && field.isBool()) {
        armsBreathingAllowed = field.asBool();
      } else {
        KO_LOG_ERROR("MokutoConfig")
            << "uknown key \"" << key << "\" with the value: " << field.toString(1);
      }
    }
  } catch (const std::exception& e) {
    KO_LOG_ERROR("MokutoConfig") << "Convertion from ZUValue of the MokutoConfig "
                                 << "has thrown an error: " << e.what();
  }
}

void MokutoConfig::updateWordsToTags(const ZUValue& value) {
  if (!value.isArray()) {
    KO_LOG_ERROR("MokutoConfig") << "The new tags to words should be an array";
    return;
  }
  for (int i = 0; i < value.arraySize(); ++i) {
    const ZUValue& element = value[i];
    if (!isKeyedPair(element) || !element[1].isArray())
      continue;
    const std::string& tag = element[0].asString();
    const ZUValue& words = element[1];
    for (int w = 0; w < words.arraySize(); ++w) {
      if (words[w].isString())
        wordsToTags[words[w].asString()].push_back(tag);
    }
  }
}

void MokutoConfig::updateTagsToAnimations(const ZUValue& value) {
  // The first element that is not a [tag, [animation...]] pair ends the walk; what the
  // pairs before it added stays.
  bool wellFormed = value.isArray();
  for (int i = 0; wellFormed && i < value.arraySize(); ++i) {
    const ZUValue& element = value[i];
    if (!isKeyedPair(element) || !element[1].isArray()) {
      wellFormed = false;
      break;
    }
    const std::string& tag = element[0].asString();
    const ZUValue& animations = element[1];
    for (int a = 0; a < animations.arraySize(); ++a) {
      const ZUValue& animation = animations[a];
      if (!animation.isString()) {
        KO_LOG_ERROR("MokutoConfig")
            << "The animation: \"" << animation.toString(1) << "\" is not formatted as a string";
        continue;
      }
      const std::string& path = animation.asString();
      const PostureFamily family = xPostureFamilyFormAnimPath(path);
      if (family != Unknown) {
        tagsToAnimations[static_cast<std::size_t>(family)][tag].insert(path);
      }
    }
  }
  if (!wellFormed) {
    KO_LOG_ERROR("MokutoConfig")
        << "The new tags to animations should be an array following this pattern: "
        << "[ [tag1, [anim1, anim2, anim3]], [tag2, [anim4]] ]";
  }
}

PostureFamily MokutoConfig::xPostureFamilyFormAnimPath(const std::string& path) const {
  for (const std::string& package : animationsPackages) {
    if (path.size() < package.size()) {
      throw std::out_of_range("animation path \"" + path + "\" is shorter than the package \"" +
                              package + "\"");
    }
    const std::string_view rest = std::string_view(path).substr(package.size());
    for (PostureFamily family = Standing; family < Unknown; ++family) {
      const std::string_view folder = kPostureFamilyFolders[family];
      if (rest.size() > folder.size() && rest.starts_with(folder) && rest[folder.size()] == '/') {
        return family;
      }
    }
  }
  KO_LOG_ERROR("MokutoConfig") << "Unknown posture of animation: " << path
                               << " the root folder after declareAnimationsPackage has to be: "
                               << "Stand, Sit or SitOnPod";
  return Unknown;
}

std::ostream& operator<<(std::ostream& os, const MokutoConfig& config) {
  const auto trueFalse = [](bool b) { return b ? "True" : "False"; };
  os << "config: bodyLanguageMode: " << bodyLanguageModeToStr(config.bodyLanguageMode);
  os << std::endl << "        msPauseBeforeSpeech: " << config.msPauseBeforeSpeech;
  os << std::endl << "        behaviorAtEndOfMokuto: \"" << config.behaviorAtEndOfMokuto << '"';
  os << std::endl
     << "        ifBehaviorAtEndOfMokutoIsBlocking: "
     << trueFalse(config.ifBehaviorAtEndOfMokutoIsBlocking);
  os << std::endl << "        armsBreathingAllowed: " << trueFalse(config.armsBreathingAllowed);
  if (!config.animationsPackages.empty()) {
    os << std::endl << "        animationsPackages:";
    for (const std::string& package : config.animationsPackages)
      os << " \"" << package << '"';
  }
  if (!config.wordsToTags.empty()) {
    std::map<std::string, std::vector<std::string>> tagsToWords;
    for (const auto& [word, tags] : config.wordsToTags) {
      for (const std::string& tag : tags)
        tagsToWords[tag].push_back(word);
    }
    os << std::endl << "        tagsToWords: ";
    for (const auto& [tag, words] : tagsToWords) {
      os << std::endl << "                    tag: \"" << tag << "\" have words";
      for (const std::string& word : words)
        os << " \"" << word << '"';
    }
  }
  return os;
}

}  // namespace ZU
