#include "mokuto/zumokuto.h"

#include <exception>
#include <optional>
#include <span>
#include <utility>

#include "ko/eventloop.hpp"
#include "loadertask.h"
#include "mokuto/mokutotimechecker.h"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {

constexpr const char* kMain = "mokuto.main";
constexpr const char* kNotInitialized =
    "ZUMokuto is not well initialized, please restart your robot.";
constexpr const char* kMicroEvent = "WordRecognized";
constexpr const char* kMicroEventCallback = "_dialogMatchedInputCallback";

// Builds one member of the module; a failure is logged and leaves the member empty, so
// that the methods that need it report the module as not well initialized.
template <class T, class Make>
std::shared_ptr<T> makeMember(const char* what, Make&& make) {
  try {
    return make();
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kMain) << "Cannot create the " << what << ": " << e.what();
    return nullptr;
  }
}

// The compiler asks the speech engine for its language; without one it goes on without.
std::shared_ptr<CompilerTask> makeCompiler(const std::shared_ptr<ZUBroker>& broker) {
  std::shared_ptr<ZUTextToSpeechProxy> tts;
  try {
    tts = std::make_shared<ZUTextToSpeechProxy>(broker);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kMain) << "The compiler works without the speech engine: " << e.what();
  }
  return std::make_shared<CompilerTask>(std::move(tts));
}

// The published methods, in binding order. The constructor binds all but the last, which
// init binds before it subscribes it to the micro-event.
const std::vector<ZUMethodDeclaration>& publishedMethods() {
  static const std::vector<ZUMethodDeclaration> methods = [] {
    const ZUMethodParameter text{
        "text", "An annotated text (for example: \"Hello. ^start(Hey_1) My name is ZEFO\")."};
    const ZUMethodParameter enable{"enable",
                                   "The boolean value: true to enable, false to disable."};
    const ZUMethodParameter enabled{
        "enable", "The boolean value: true means it is enabled, false means it is disabled."};
    const ZUMethodParameter pause{"pause", "The pause's time in milliseconds before the speech."};
    const std::vector<ZUMethodParameter> callback = {
        {"memoryKey", "The subscribed memory key which changed."},
        {"value", "The new value of the memory key."},
        {"message", "The message that comes with the callback."}};
    const std::string say =
        "Say the annotated text given in parameter and animate it with animations inserted in the "
        "text.";
    const std::string modeFromStr =
        "Set the current body language mode.\n3 modes exist: \"disabled\", \"random\" and "
        "\"contextual\"\n(see BodyLanguageMode enum for more details)";
    const std::string mode =
        "Set the current body language mode.\n3 modes exist: BODY_LANGUAGE_MODE_DISABLED,"
        "BODY_LANGUAGE_MODE_RANDOM and BODY_LANGUAGE_MODE_CONTEXTUAL\n(see BodyLanguageMode enum "
        "for more details)";
    const std::string chosenMode = "The choosen body language mode.";
    const std::string currentMode = "The current body language mode.";
    return std::vector<ZUMethodDeclaration>{
        {"say", overload<void(const std::string&)>(&ZUMokuto::say), say, {text}},
        {"say",
         overload<void(const std::string&, const ZUValue&)>(&ZUMokuto::say),
         say,
         {text, {"configuration", "The mokuto configuration."}}},
        {"_reset", &ZUMokuto::_reset, "Reset the Mokuto configuration."},
        {"_stopAll",
         &ZUMokuto::_stopAll,
         "Stop all the speeches.",
         {{"blocking", "If this method wait for the end of the speeches."}}},
        {"_isRunning",
         &ZUMokuto::_isRunning,
         "Know if mokuto is running.",
         {},
         {"running", "True, if mokuto is running, False otherwise."}},
        {"setBodyTalkEnabled",
         &ZUMokuto::setBodyTalkEnabled,
         "DEPRECATED since 1.18: use setBodyLanguageMode instead.Enable or disable the automatic "
         "body talk on the speech.If it is enabled, anywhere you have not annotate your text with "
         "animation,the robot will fill the gap with automatically calculated gestures.If it is "
         "disabled, the robot will move only where you annotate it withanimations.",
         {enable}},
        {"setBodyLanguageEnabled",
         &ZUMokuto::setBodyLanguageEnabled,
         "DEPRECATED since 1.22: use setBodyLanguageMode instead.Enable or disable the automatic "
         "body language on the speech.If it is enabled, anywhere you have not annotate your text "
         "with animation,the robot will fill the gap with automatically calculated gestures.If it "
         "is disabled, the robot will move only where you annotate it withanimations.",
         {enable}},
        {"setBodyLanguageModeFromStr",
         &ZUMokuto::setBodyLanguageModeFromStr,
         modeFromStr,
         {{"stringBodyLanguageMode", chosenMode}}},
        {"setBodyLanguageMode",
         &ZUMokuto::setBodyLanguageMode,
         mode,
         {{"bodyLanguageMode", chosenMode}}},
        {"getBodyLanguageModeToStr",
         &ZUMokuto::getBodyLanguageModeToStr,
         modeFromStr,
         {},
         {"stringBodyLanguageMode", currentMode}},
        {"getBodyLanguageMode",
         &ZUMokuto::getBodyLanguageMode,
         mode,
         {},
         {"bodyLanguageMode", currentMode}},
        {"declareAnimationsPackage",
         &ZUMokuto::declareAnimationsPackage,
         "Add a new package that contains animations.",
         {{"animationsPackage", "The new package that contains animations."}}},
        {"_setMSPauseBeforeSpeech",
         &ZUMokuto::_setMSPauseBeforeSpeech,
         "Change the pause's time before the speech.",
         {pause}},
        {"_getMSPauseBeforeSpeech",
         &ZUMokuto::_getMSPauseBeforeSpeech,
         "Get the pause's time before the speech.",
         {},
         pause},
        {"_isCheckExecutionTimesEnabled",
         &ZUMokuto::_isCheckExecutionTimesEnabled,
         "If we need to check the execution times.",
         {},
         {"enable", "True, if we need to check the execution times, False otherwise."}},
        {"_setCheckExecutionTimes",
         &ZUMokuto::_setCheckExecutionTimes,
         "Set if we need to check the execution times.",
         {{"pause", "If we need to check the execution times."}}},
        {"addTagsToWords",
         &ZUMokuto::addTagsToWords,
         "Add some new links between tags and words.",
         {{"tagsToWords", "Map of tags to words."}}},
        {"declareTagForAnimations",
         &ZUMokuto::declareTagForAnimations,
         "Declare some tags with the associated animations.",
         {{"tagsToAnimations", "Map of Tags to Animations."}}},
        {"_diagnosis", &ZUMokuto::_diagnosis,
         "Print many debug informations about the current state of mokuto."},
        {"isBodyTalkEnabled",
         &ZUMokuto::isBodyTalkEnabled,
         "DEPRECATED since 1.18: use getBodyLanguageMode instead.Indicate if the body talk is "
         "enabled or not.",
         {},
         enabled},
        {"isBodyLanguageEnabled",
         &ZUMokuto::isBodyLanguageEnabled,
         "DEPRECATED since 1.22: use getBodyLanguageMode instead.Indicate if the body language is "
         "enabled or not.",
         {},
         enabled},
        {"_getTagList",
         &ZUMokuto::_getTagList,
         "Get tags found on installed animations which are in \"animation library\".",
         {},
         {"tags", "The list of tags found."}},
        {"_getAnimationsByTag",
         &ZUMokuto::_getAnimationsByTag,
         "Get all installed animations for a tag. Currently: animations = \"behaviors of the "
         "animation library.\"",
         {{"tag", "A tag to filter the list of animations with."}},
         {"animations", "The animation list."}},
        {"_speechBookMarkCallback", &ZUMokuto::_speechBookMarkCallback,
         "Callback for ZUMemory subscription for speech bookmark tracking.", callback},
        {"_mrkpauseCallback",
         &ZUMokuto::_mrkpauseCallback,
         "Method called by the tts when \"mrkpause\" bookmark is reached.This method is blocking "
         "until the action is finish.",
         {{"pBookmark", "Id of the bookmark."}}},
        {"_speechStatusCallback", &ZUMokuto::_speechStatusCallback,
         "Callback for ZUMemory subscription for speech status tracking.", callback},
        {"_postureFamilyChangedCallback", &ZUMokuto::_postureFamilyChangedCallback,
         "Callback for ZUMemory subscription to postureFamilyChanged.", callback},
        {"_updateRepresentations", &ZUMokuto::_updateRepresentations,
         "Callback for ZUMemory subscription when the behavior list of the Behavior Manager is "
         "updated.",
         callback},
        {kMicroEventCallback, &ZUMokuto::_dialogMatchedInputCallback,
         "Get the emotions from a text.", callback},
    };
  }();
  return methods;
}

}  // namespace

ZUMokuto::ZUMokuto(const std::shared_ptr<ZUBroker>& broker, const std::string& name,
                   ZUMokutoOptions options)
    : ZUModule(broker, name),
      fOptions(std::move(options)),
      memory(std::make_shared<ZUMemoryProxy>(broker)),
      bodyTalk(std::make_shared<ZURobotBodyTalkInstance>(broker, fOptions.bodyTalk)),
      compiler(makeMember<CompilerTask>("compiler", [&] { return makeCompiler(broker); })),
      loader(makeMember<LoaderTask>(
          "loader", [&] { return std::make_shared<LoaderTask>(broker, bodyTalk); })),
      // Without a speech engine the module cannot be built: the director's error goes on.
      director(std::make_shared<DirectorTask>(broker, bodyTalk->bodyTalk, textRegister,
                                              fOptions.clock)) {
  setModuleDescription("The Mokuto module makes ZEFO interpret a text annotated with behaviors.");
  const auto& methods = publishedMethods();
  bindMethods(kModuleName, std::span(methods).first(methods.size() - 1));
}

ZUMokuto::~ZUMokuto() = default;

// ---- start and exit ----

void ZUMokuto::init() {
  bindMethods(kModuleName, std::span(publishedMethods()).last(1));

  if (director && loader) {
    director->behaviorStoppedSignal.connect(
        [weakLoader = std::weak_ptr<LoaderTask>(loader)](const std::string& name) {
          if (const auto strongLoader = weakLoader.lock())
            strongLoader->onBehaviorStopped(name);
        });
  }

  memory->declareEvent(kEndEvent, kModuleName);
  memory->declareEvent(kEmotionEvent, kModuleName);

  if (loader) {
    const auto self = std::dynamic_pointer_cast<ZUMokuto>(shared_from_this());
    auto built = ko::getEventLoop()->async([weakSelf = std::weak_ptr<ZUMokuto>(self)] {
      const auto module = weakSelf.lock();
      if (!module)
        return;
      std::shared_lock lock(module->configLock);
      for (const auto& package : module->config.animationsPackages) {
        if (module->hasExited() || module->loader->isUpdateAborted())
          return;
        module->loader->updateRepresentations(package);
      }
    });
    std::lock_guard lock(fLifeMutex);
    fIndexBuilt = std::move(built);
  }

  bodyTalk->bodyTalk->getPosture()->init();
  if (loader)
    loader->subscribeToEvents();
  if (director)
    director->subscribeToEvents();

  try {
    memory->subscribeToMicroEvent(kMicroEvent, kModuleName, kMicroEventCallback,
                                  kMicroEventCallback);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kMain) << "Cannot subscribe to microEvent " << kMicroEvent << ": " << e.what();
  }
}

void ZUMokuto::exit() {
  {
    std::lock_guard lock(fLifeMutex);
    if (fExitDone)
      return;
    fExitDone = true;
  }
  _stopAll(true);
  bodyTalk->bodyTalk->getPosture()->exit();
  if (loader) {
    loader->unsubscribeToEvents();
    loader->abortUpdate();
  }
  if (director)
    director->unsubscribeToEvents();
  ZUModule::exit();
}

// ---- the say pipeline ----

std::shared_ptr<MKTaskInstruction> ZUMokuto::xNewInstruction(const std::string& text,
                                                             const ZUValue* configuration) {
  auto instruction = std::make_shared<MKTaskInstruction>();
  instruction->text = text;
  {
    std::shared_lock lock(configLock);
    instruction->config = config;
  }
  if (configuration)
    instruction->config.fromZUValue(*configuration);
  return instruction;
}

void ZUMokuto::say(const std::string& text) {
  xSay(xNewInstruction(text, nullptr));
}

void ZUMokuto::say(const std::string& text, const ZUValue& configuration) {
  xSay(xNewInstruction(text, &configuration));
}

MKID ZUMokuto::xNewMKID(const std::shared_ptr<MKTaskInstruction>& instruction) {
  return textRegister.newMKID(instruction, *this);
}

void ZUMokuto::xFreeMKID(MKID id) {
  textRegister.freeMKID(id);
}

void ZUMokuto::xCompileAndLoad(const std::shared_ptr<MKTaskInstruction>& instruction, MKID id) {
  // The stages change the job under its mutex (the diagnosis may print it meanwhile), but
  // call the robot's services without it.
  {
    std::lock_guard lock(compilerMutex);
    if (!textRegister.isMKIDStopped(id)) {
      xEnterStage(ZUMokutoStage::Compiler, id);
      compiler->process(instruction);
    }
  }
  std::lock_guard lock(loaderMutex);
  if (!textRegister.isMKIDStopped(id)) {
    xEnterStage(ZUMokutoStage::Loader, id);
    loader->process(*instruction, [this, id] { return textRegister.isMKIDStopped(id); });
  }
}

void ZUMokuto::xSay(const std::shared_ptr<MKTaskInstruction>& instruction) {
  if (!compiler || !loader || !director || !bodyTalk) {
    KO_LOG_ERROR(kMain) << kNotInitialized;
    return;
  }
  // Set while the identifier is registered: the guard frees it once.
  std::optional<MKID> registered;
  try {
    const MKID id = xNewMKID(instruction);
    registered = id;
    instruction->postureFamily = bodyTalk->bodyTalk->getPostureFamily();
    const auto& timeChecker = director->getTimeChecker();
    if (timeChecker && timeChecker->enabled())
      timeChecker->startOfMokuto(id);
    xCompileAndLoad(instruction, id);
    {
      std::lock_guard lock(directorMutex);
      if (!textRegister.isMKIDStopped(id)) {
        xEnterStage(ZUMokutoStage::Director, id);
        KO_LOG_INFO(kMain) << "Animated saying: " << *instruction;
        director->process(instruction);
      }
    }
    registered.reset();
    xFreeMKID(id);
    memory->raiseEvent(kEndEvent, ZUValue(id));
    if (timeChecker && timeChecker->enabled())
      timeChecker->stopOfMokuto(id);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kMain) << "say() method detects an exception: " << e.what();
    if (registered)
      xFreeMKID(*registered);
    throw;
  } catch (...) {
    // Not an error of the service's own making; the text must not stay registered.
    if (registered)
      xFreeMKID(*registered);
    throw;
  }
}

std::shared_ptr<MKTaskInstruction> ZUMokuto::prepare(const std::string& text) {
  return prepare(text, ZUValue());
}

std::shared_ptr<MKTaskInstruction> ZUMokuto::prepare(const std::string& text,
                                                     const ZUValue& configuration) {
  if (!compiler || !loader || !bodyTalk)
    ZU_THROW_ERROR(kModuleName, "prepare", kNotInitialized);
  auto instruction = xNewInstruction(text, &configuration);
  const MKID id = xNewMKID(instruction);
  try {
    instruction->postureFamily = bodyTalk->bodyTalk->getPostureFamily();
    xCompileAndLoad(instruction, id);
  } catch (...) {
    xFreeMKID(id);
    throw;
  }
  xFreeMKID(id);
  return instruction;
}

void ZUMokuto::stop(int id) {
  std::lock_guard lock(textRegister.textsMutex);
  if (!director || textRegister.runningTexts.count(id) == 0)
    return;
  textRegister.textsToStop.insert(id);
  director->stop(id);
}

void ZUMokuto::_stopAll(bool blocking) {
  if (!director) {
    KO_LOG_ERROR(kMain) << kNotInitialized;
    return;
  }
  std::unique_lock lock(textRegister.textsMutex);
  for (const auto& entry : textRegister.runningTexts)
    textRegister.textsToStop.insert(entry.first);
  for (const MKID id : textRegister.textsToStop)
    director->stop(id);
  if (!blocking)
    return;
  while (!textRegister.textsToStop.empty()) {
    const auto& clock = fOptions.clock ? fOptions.clock : MokutoClock::real();
    if (clock->waitFor(textRegister.textsCondition, lock, fOptions.stopAllWait,
                       MokutoClock::Wait::Limit) == std::cv_status::timeout) {
      KO_LOG_ERROR(kMain) << "ZUMokuto.stopAll() makes more than 3 seconds, we skip this method";
      break;
    }
  }
}

bool ZUMokuto::_isRunning() {
  std::lock_guard lock(textRegister.textsMutex);
  return !textRegister.runningTexts.empty();
}

void ZUMokuto::setDirectorObserver(std::shared_ptr<DirectorObserver> observer) {
  if (director)
    director->setObserver(std::move(observer));
}

bool ZUMokuto::waitForIndex(std::chrono::milliseconds bound) {
  std::optional<ko::Future<void>> built;
  {
    std::lock_guard lock(fLifeMutex);
    built = fIndexBuilt;
  }
  return !built || built->wait(static_cast<int>(bound.count())) != ko::FutureState::Timeout;
}

void ZUMokuto::xEnterStage(ZUMokutoStage stage, MKID id) const {
  if (fOptions.onStage)
    fOptions.onStage(stage, id);
}

}  // namespace ZU
