// The event callbacks of ZUMokuto, the animation library queries and packages, the
// diagnosis and the tag page.
#include <mutex>
#include <shared_mutex>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "loadertask.h"
#include "mokuto/zumokuto.h"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "zu/enums.h"
#include "zu/zuhtml.h"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {

constexpr const char* kMain = "mokuto.main";
// The diagnosis logs under the name of the robot's original method.
constexpr const char* kDiagnosisFunction = "void ZU::ZUMokuto::diagnosis()";

// The pieces of the tag page.
constexpr const char* kPageHead = "<html><body><script>";
constexpr const char* kPageScript =
    "function runBehavior (behavior) {\n"
    "var xhr_object = null;\n"
    "if (window.XMLHttpRequest) {\n"
    "xhr_object = new XMLHttpRequest();\n"
    "}\n"
    "else if (window.ActiveXObject) {\n"
    "xhr_object = new ActiveXObject(\"Microsoft.XMLHTTP\");\n"
    "}\n"
    "else {\n"
    "return;\n"
    "}\n"
    "var evalUrl = document.URL.substring(0, document.URL.lastIndexOf(\"/\") + 1) + "
    "\"?eval=\";\n"
    "xhr_object.onreadystatechange = function () {\n"
    "if (xhr_object.readyState == 4 && xhr_object.status == 200) {\n"
    "xhr_object.onreadystatechange = null;\n"
    "}\n"
    "}\n"
    "xhr_object.open(\"GET\", evalUrl + \"ZUBehaviorManager.runBehavior('\" + behavior + "
    "\"')\");\n"
    "xhr_object.send(null);\n"
    "}\n";
constexpr const char* kScriptEnd = "</script>";
constexpr const char* kTableHead =
    "<b><u><i>Available tags</i></u></b><br><table cellspacing=\"5\" cellpadding=\"5\" "
    "border=\"1\"><tr><td><b>Tag name</b></td><td><b>Corresponding behaviors</b><br/><i>(click "
    "to run the behavior)</i></td></tr>";
constexpr const char* kRowStart = "<tr><td>";
constexpr const char* kCellBreak = "</td><td>";
constexpr const char* kFirstLink = "<a href=\"javascript:runBehavior('";
constexpr const char* kLinkMiddle = "');\">";
constexpr const char* kLinkEnd = "</a>";
constexpr const char* kNextLink = "<br/><a href=\"javascript:runBehavior('";
constexpr const char* kTableEnd = "</table>";
constexpr const char* kPageEnd = "</body></html>";

// A name inside runBehavior('...') in a link's javascript: address: every character that
// the quoted string, the address's percent-decoding or the attribute could read otherwise
// is written as a JavaScript escape, so the link runs the behaviour of that very name.
std::string scriptArgument(const std::string& name) {
  std::string out;
  for (const char c : name) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x20 || byte == 0x7f ||
        std::string_view("\\'\"<>&%").find(c) != std::string_view::npos) {
      static constexpr char kHex[] = "0123456789abcdef";
      out += "\\x";
      out += kHex[byte >> 4];
      out += kHex[byte & 0xf];
    } else {
      out += c;
    }
  }
  return out;
}

const char* trueFalse(bool value) {
  return value ? "true" : "false";
}

}  // namespace

// ---- callbacks ----

void ZUMokuto::_speechBookMarkCallback(const std::string& /*memoryKey*/, const ZUValue& value,
                                       const std::string& /*message*/) {
  if (director)
    director->xOnBookmark(value);
}

void ZUMokuto::_mrkpauseCallback(int pBookmark) {
  if (director)
    director->xBookmarkReached(pBookmark, true);
}

void ZUMokuto::_speechStatusCallback(const std::string& /*memoryKey*/, const ZUValue& value,
                                     const std::string& /*message*/) {
  if (director)
    director->xOnSpeechStatus(value);
}

void ZUMokuto::_postureFamilyChangedCallback(const std::string& /*memoryKey*/, const ZUValue& value,
                                             const std::string& /*message*/) {
  if (!value.isString() || !bodyTalk)
    return;
  bodyTalk->bodyTalk->getPosture()->setPostureFamily(postureFamilyFromStr(value.asString()));
}

void ZUMokuto::_updateRepresentations(const std::string& /*memoryKey*/, const ZUValue& value,
                                      const std::string& /*message*/) {
  if (!loader)
    return;
  std::vector<std::string> names;
  value.ToStringArray(names);
  std::vector<std::string> handled;
  for (const auto& name : names) {
    if (name.empty())
      continue;
    std::shared_lock lock(configLock);
    for (const auto& package : config.animationsPackages) {
      if (std::find(handled.begin(), handled.end(), package) != handled.end())
        continue;
      if (name.compare(0, package.size(), package) == 0 && name.size() >= package.size()) {
        handled.push_back(package);
        loader->updateRepresentations(package);
        break;
      }
    }
  }
}

void ZUMokuto::_dialogMatchedInputCallback(const std::string& /*memoryKey*/, const ZUValue& value,
                                           const std::string& /*message*/) {
  if (!compiler)
    return;
  const double confidence = value[1].asFloat();
  const std::string text = value[0].asString();
  if (const auto emotion = compiler->asrEmotion(text, confidence))
    memory->raiseEvent(kEmotionEvent, ZUValue(*emotion));
}

// ---- the animation library ----

void ZUMokuto::declareAnimationsPackage(const std::string& animationsPackage) {
  const std::string package = animationsPackage + "/";
  std::unique_lock lock(configLock);
  auto& packages = config.animationsPackages;
  if (std::find(packages.begin(), packages.end(), package) != packages.end())
    return;
  packages.push_back(package);
  if (loader)
    loader->updateRepresentations(package);
}

std::vector<std::string> ZUMokuto::_getTagList() {
  std::vector<std::string> tags;
  if (!loader)
    return tags;
  LoaderTask::TagMap merged;
  loader->getMergedTags(merged);
  tags.reserve(merged.size());
  for (const auto& entry : merged)
    tags.push_back(entry.first);
  return tags;
}

std::vector<std::string> ZUMokuto::_getAnimationsByTag(const std::string& tag) {
  if (!loader)
    return {};
  LoaderTask::TagMap merged;
  loader->getMergedTags(merged);
  const auto it = merged.find(tag);
  if (it == merged.end())
    return {};
  return {it->second.begin(), it->second.end()};
}

// ---- the page ----

std::string ZUMokuto::httpGet() {
  LoaderTask::TagMap merged;
  if (loader) {
    try {
      loader->getMergedTags(merged);
    } catch (const ZUError&) {
      return {};
    }
  }
  std::string page = std::string(kPageHead) + kPageScript + kScriptEnd;
  if (!merged.empty()) {
    page += kTableHead;
    for (const auto& [tag, animations] : merged) {
      if ((!tag.empty() && tag.front() == '.') || tag == "animationMode")
        continue;
      page += kRowStart;
      page += escapeHtml(tag);
      page += kCellBreak;
      if (animations.empty() || animations.begin()->empty())
        continue;
      bool first = true;
      for (const auto& animation : animations) {
        page += first ? kFirstLink : kNextLink;
        page += scriptArgument(animation);
        page += kLinkMiddle;
        page += escapeHtml(animation);
        page += kLinkEnd;
        first = false;
      }
    }
    page += kTableEnd;
  }
  page += kPageEnd;
  return page;
}

std::string ZUMokuto::tagPage() {
  return httpGet();
}

// ---- the diagnosis ----

std::vector<ZUMokuto::DiagnosisLine> ZUMokuto::xDiagnosis() {
  using ko::log::Error;
  using ko::log::Info;
  std::vector<DiagnosisLine> lines;
  lines.push_back({Info, "Diagnosis of Mokuto:"});
  lines.push_back({Info, std::string(28, '-')});
  lines.push_back({Info, "get body language mode: " + getBodyLanguageModeToStr()});
  {
    std::shared_lock lock(configLock);
    lines.push_back({Info, "get time pause before the sentence: " +
                               std::to_string(config.msPauseBeforeSpeech) + "ms"});
  }
  lines.push_back({Info, std::string("is Mokuto running: ") + trueFalse(_isRunning())});
  if (bodyTalk) {
    lines.push_back(
        {Info, std::string("is bodytalk running: ") + trueFalse(bodyTalk->bodyTalk->isRunning())});
  }
  if (director) {
    lines.push_back({Info, std::string("is TextToSpeech running: ") +
                               trueFalse(director->isTextToSpeechRunning())});
  }
  // A snapshot of the register: a job may be held by its loader stage for as long as a
  // preload lasts, and the register must not wait on it meanwhile.
  std::vector<std::shared_ptr<MKTaskInstruction>> texts;
  std::size_t toStop = 0;
  {
    std::lock_guard lock(textRegister.textsMutex);
    for (const auto& entry : textRegister.runningTexts)
      texts.push_back(entry.second);
    toStop = textRegister.textsToStop.size();
  }
  const std::size_t running = texts.size();
  lines.push_back({Info, "number of texts in the stack: " + std::to_string(running)});
  if (toStop <= running)
    lines.push_back({Info, "number of texts asked to stop: " + std::to_string(toStop)});
  else
    lines.push_back(
        {Error, "the number of texts asked to stop is too big: " + std::to_string(toStop)});
  if (running == 0)
    return lines;
  lines.push_back({Info, running == 1 ? "print the text:" : "print the texts:"});
  std::size_t k = 0;
  for (const auto& instruction : texts) {
    ++k;
    std::ostringstream text;
    text << "Text number " << k << ": ";
    if (instruction) {
      std::lock_guard textLock(instruction->mutex);
      text << *instruction << '\n' << instruction->config;
    }
    lines.push_back({Info, text.str()});
  }
  return lines;
}

void ZUMokuto::_diagnosis() {
  const ko::log::Category& category = KO_CATEGORY(kMain);
  for (auto& line : xDiagnosis()) {
    if (category.enabled(line.level))
      ko::log::write(category, line.level, kDiagnosisFunction, std::move(line.text), __FILE__,
                     __LINE__);
  }
}

std::vector<std::string> ZUMokuto::diagnosisLines() {
  std::vector<std::string> texts;
  for (auto& line : xDiagnosis())
    texts.push_back(std::move(line.text));
  return texts;
}

}  // namespace ZU
