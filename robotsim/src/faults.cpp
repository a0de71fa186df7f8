#include "robotsim/faults.h"

#include <algorithm>
#include <charconv>
#include <sstream>
#include <thread>

#include "ko/log.hpp"
#include "zu/zuerror.h"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.faults";
constexpr const char* kBookmarks = "bookmarks";
constexpr const char* kBehaviorStopped = "behaviorStopped";
constexpr const char* kSpeech = "ZUTextToSpeech";
constexpr const char* kBehaviors = "ZUBehaviorManager";
// How often a hanging posted call looks at its task's stop flag.
constexpr auto kStopPoll = std::chrono::milliseconds(5);

// The published methods of the robot's services (the built-in ones apart), which the
// robot's tests keep in step with the services.
const std::map<std::string_view, std::vector<std::string_view>>& serviceOperations() {
  static const std::map<std::string_view, std::vector<std::string_view>> operations = {
      {"ZUMemory",
       {"declareEvent", "raiseEvent", "insertData", "getData", "subscribeToEvent",
        "subscribeToMicroEvent", "unsubscribeToEvent", "unsubscribeToMicroEvent", "getEventList",
        "getSubscribers"}},
      {"ZUMotion",
       {"getAngles", "setAngles", "angleInterpolationBezier", "areResourcesAvailable",
        "getBreathEnabled", "setBreathEnabled", "_startBezierMove", "_stopMove", "_isMoveRunning"}},
      {kBehaviors,
       {"getInstalledBehaviors", "getBehaviorTags", "resolveBehaviorName", "preloadBehavior",
        "startBehavior", "runBehavior", "stopBehavior", "stopAllBehaviors", "isBehaviorRunning",
        "getRunningBehaviors", "installBehavior", "removeBehavior", "rescan"}},
      {"ZUAudioPlayer",
       {"loadSoundSet", "unloadSoundSet", "getLoadedSoundSetsList", "playSoundSetFile", "stopAll"}},
      {"ZURobotPosture", {"getPostureFamily", "setPostureFamily", "getPostureFamilyList"}},
      {"ZURobotModel", {"_getRobotType", "_setRobotType"}},
      {"ZUAutonomousMoves", {"_moveForward", "_moveBackward", "_moveSides"}},
      {kSpeech,
       {"say", "stopAll", "setParameter", "getParameter", "getLanguage", "setLanguage",
        "getAvailableLanguages", "enableNotifications", "disableNotifications",
        "areNotificationsEnabled", "_saveRecording"}},
  };
  return operations;
}

constexpr std::string_view kBuiltIns[] = {
    "version",   "ping", "getMethodList", "getMethodHelp", "getModuleHelp", "wait",
    "isRunning", "stop", "getBrokerName", "getUsage",      "exit"};

std::string_view trim(std::string_view text) {
  const auto first = text.find_first_not_of(" \t\r\n");
  if (first == std::string_view::npos)
    return {};
  const auto last = text.find_last_not_of(" \t\r\n");
  return text.substr(first, last - first + 1);
}

std::string join(const std::vector<std::string_view>& names) {
  std::string out;
  for (const auto& name : names)
    out += (out.empty() ? "" : ", ") + std::string(name);
  return out;
}

[[noreturn]] void refuse(std::string_view fault, const std::string& why) {
  throw FaultSpecError("fault \"" + std::string(fault) + "\": " + why);
}

std::int64_t number(std::string_view text, std::string_view fault, const char* what) {
  std::int64_t value = 0;
  const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (text.empty() || ec != std::errc() || end != text.data() + text.size() || value < 0)
    refuse(fault, std::string(what) + " \"" + std::string(text) + "\" is not a number");
  return value;
}

std::chrono::milliseconds duration(std::string_view text, std::string_view fault) {
  std::int64_t scale = 0;
  if (text.size() > 2 && text.substr(text.size() - 2) == "ms") {
    scale = 1;
    text.remove_suffix(2);
  } else if (text.size() > 1 && text.back() == 's') {
    scale = 1000;
    text.remove_suffix(1);
  } else {
    refuse(fault, "a delay is a number followed by ms or s (\"300ms\", \"2s\")");
  }
  const std::int64_t value = number(text, fault, "the delay");
  if (value > 24 * 3600 * 1000 / scale)
    refuse(fault, "a delay of more than a day");
  return std::chrono::milliseconds(value * scale);
}

std::vector<std::int32_t> bookmarkList(std::string_view text, std::string_view fault) {
  std::vector<std::int32_t> numbers;
  while (true) {
    const auto comma = text.find(',');
    const std::int64_t n = number(trim(text.substr(0, comma)), fault, "the bookmark");
    if (n < 1 || n > INT32_MAX)
      refuse(fault, "bookmarks are numbered from 1");
    numbers.push_back(static_cast<std::int32_t>(n));
    if (comma == std::string_view::npos)
      return numbers;
    text.remove_prefix(comma + 1);
  }
}

Fault parseFault(std::string_view text) {
  Fault fault;
  const auto colon = text.find(':');
  const auto dot = text.substr(0, colon).find('.');
  if (colon == std::string_view::npos || dot == std::string_view::npos)
    refuse(text, "write SERVICE.OPERATION:ACTION");
  fault.service = std::string(trim(text.substr(0, dot)));
  fault.operation = std::string(trim(text.substr(dot + 1, colon - dot - 1)));
  std::string_view action = trim(text.substr(colon + 1));
  std::string_view argument;
  bool hasArgument = false;
  if (const auto equals = action.find('='); equals != std::string_view::npos) {
    argument = trim(action.substr(equals + 1));
    action = trim(action.substr(0, equals));
    hasArgument = true;
  }

  const auto& operations = serviceOperations();
  const auto service = operations.find(fault.service);
  if (service == operations.end()) {
    std::vector<std::string_view> names;
    for (const auto& entry : operations)
      names.push_back(entry.first);
    refuse(text, "no service \"" + fault.service + "\" on the robot (" + join(names) + ")");
  }

  const bool bookmarks = fault.service == kSpeech && fault.operation == kBookmarks;
  const bool stops = fault.service == kBehaviors && fault.operation == kBehaviorStopped;
  if (bookmarks) {
    if (action == "drop" || action == "duplicate" || action == "reorder") {
      fault.action = action == "drop"        ? Fault::Action::Drop
                     : action == "duplicate" ? Fault::Action::Duplicate
                                             : Fault::Action::Reorder;
      if (hasArgument)
        fault.bookmarks = bookmarkList(argument, text);
    } else if (action == "delay" && hasArgument) {
      fault.action = Fault::Action::Delay;
      const auto at = argument.find('@');
      fault.delay = duration(trim(argument.substr(0, at)), text);
      if (at != std::string_view::npos)
        fault.bookmarks = bookmarkList(argument.substr(at + 1), text);
    } else {
      refuse(text,
             "the bookmarks may be drop[=N,...], duplicate[=N,...], reorder[=N,...] or "
             "delay=DURATION[@N,...]");
    }
    return fault;
  }
  if (stops) {
    if (action != "never" || hasArgument)
      refuse(text, "the signal behaviorStopped may only be \"never\"");
    fault.action = Fault::Action::Never;
    return fault;
  }

  const auto& names = service->second;
  const bool known =
      std::find(names.begin(), names.end(), fault.operation) != names.end() ||
      std::find(std::begin(kBuiltIns), std::end(kBuiltIns), fault.operation) != std::end(kBuiltIns);
  if (!known) {
    std::string others = join(names);
    if (fault.service == kSpeech)
      others += ", and bookmarks";
    if (fault.service == kBehaviors)
      others += ", and behaviorStopped";
    refuse(text, fault.service + " has no operation \"" + fault.operation + "\" (" + others +
                     ", and the built-in ones)");
  }
  if (action == "throw" && !hasArgument) {
    fault.action = Fault::Action::Throw;
  } else if (action == "hang" && !hasArgument) {
    fault.action = Fault::Action::Hang;
  } else if (action == "delay" && hasArgument) {
    fault.action = Fault::Action::Delay;
    fault.delay = duration(argument, text);
  } else {
    refuse(text, "a call may throw, hang or delay=DURATION");
  }
  return fault;
}

bool concerns(const Fault& fault, std::int32_t bookmark) {
  return fault.bookmarks.empty() || std::find(fault.bookmarks.begin(), fault.bookmarks.end(),
                                              bookmark) != fault.bookmarks.end();
}

std::string key(const std::string& service, const std::string& operation) {
  return service + "." + operation;
}

}  // namespace

std::vector<std::string> faultOperations(std::string_view service) {
  const auto& operations = serviceOperations();
  const auto it = operations.find(service);
  if (it == operations.end())
    return {};
  return {it->second.begin(), it->second.end()};
}

std::vector<Fault> parseFaults(std::string_view spec) {
  std::vector<Fault> faults;
  while (!spec.empty()) {
    const auto semicolon = spec.find(';');
    const std::string_view text = trim(spec.substr(0, semicolon));
    if (!text.empty())
      faults.push_back(parseFault(text));
    if (semicolon == std::string_view::npos)
      break;
    spec.remove_prefix(semicolon + 1);
  }
  return faults;
}

FaultPlan::FaultPlan(std::vector<Fault> faults, double timeScale)
    : fTimeScale(timeScale), fFaults(std::move(faults)) {}

FaultPlan::FaultPlan(std::string_view spec, double timeScale)
    : FaultPlan(parseFaults(spec), timeScale) {}

void FaultPlan::set(std::vector<Fault> faults) {
  std::lock_guard lock(fMutex);
  fFaults = std::move(faults);
}

void FaultPlan::lift() {
  {
    std::lock_guard lock(fMutex);
    fFaults.clear();
    ++fLifts;
  }
  fChanged.notify_all();
}

std::chrono::steady_clock::duration FaultPlan::xScaled(std::chrono::milliseconds delay) const {
  return std::chrono::duration_cast<std::chrono::steady_clock::duration>(delay * fTimeScale);
}

void FaultPlan::xCount(const std::string& service, const std::string& operation) {
  ++fStrikes[key(service, operation)];
  fChanged.notify_all();
}

void FaultPlan::strike(const std::string& service, const std::string& operation,
                       const std::shared_ptr<ZU::ZUPCallTask>& task) {
  std::unique_lock lock(fMutex);
  std::vector<Fault> faults;
  for (const auto& fault : fFaults) {
    if (fault.service == service && fault.operation == operation)
      faults.push_back(fault);
  }
  if (faults.empty())
    return;
  xCount(service, operation);
  const std::string where = key(service, operation);
  for (const auto& fault : faults) {
    switch (fault.action) {
      case Fault::Action::Throw:
        lock.unlock();
        KO_LOG_WARNING(kCategory) << where << ": fails (injected fault)";
        ZU_THROW_ERROR(service, operation, "injected fault");
      case Fault::Action::Hang: {
        KO_LOG_WARNING(kCategory) << where << ": hangs (injected fault)"
                                  << (task ? ", until its task is stopped" : "");
        const std::uint64_t lifts = fLifts;
        ++fHanging;
        fChanged.notify_all();
        const auto released = [&] { return fLifts != lifts || (task && task->isStopRequested()); };
        while (!released()) {
          if (task)
            fChanged.wait_for(lock, kStopPoll);
          else
            fChanged.wait(lock);
        }
        --fHanging;
        KO_LOG_WARNING(kCategory) << where << ": answers again";
        return;
      }
      case Fault::Action::Delay: {
        KO_LOG_WARNING(kCategory) << where << ": answers " << fault.delay.count()
                                  << " ms late (injected fault)";
        lock.unlock();
        std::this_thread::sleep_for(xScaled(fault.delay));
        lock.lock();
        break;
      }
      default:
        break;
    }
  }
}

BookmarkFate FaultPlan::bookmarkFate(std::int32_t number, bool blocking) {
  BookmarkFate fate;
  std::lock_guard lock(fMutex);
  bool struck = false;
  for (const auto& fault : fFaults) {
    if (fault.service != kSpeech || fault.operation != kBookmarks || !concerns(fault, number))
      continue;
    switch (fault.action) {
      case Fault::Action::Drop:
        fate.drop = struck = true;
        break;
      case Fault::Action::Duplicate:
        fate.duplicate = struck = true;
        break;
      case Fault::Action::Reorder:
        fate.reorder = !blocking;
        struck = struck || !blocking;
        break;
      case Fault::Action::Delay:
        fate.delay = xScaled(fault.delay);
        struck = true;
        break;
      default:
        break;
    }
  }
  if (!struck)
    return fate;
  xCount(kSpeech, kBookmarks);
  std::ostringstream what;
  what << kSpeech << '.' << kBookmarks << ": " << (blocking ? "blocking bookmark " : "bookmark ")
       << number;
  if (fate.drop) {
    what << " dropped";
  } else {
    if (fate.duplicate)
      what << " reported twice";
    if (fate.reorder)
      what << " held back until the next mark";
    if (fate.delay.count() > 0)
      what << " reported late";
  }
  KO_LOG_WARNING(kCategory) << what.str() << " (injected fault)";
  return fate;
}

bool FaultPlan::hidesStop(const std::string& behavior) {
  std::lock_guard lock(fMutex);
  for (const auto& fault : fFaults) {
    if (fault.service == kBehaviors && fault.operation == kBehaviorStopped) {
      xCount(kBehaviors, kBehaviorStopped);
      KO_LOG_WARNING(kCategory) << kBehaviors << '.' << kBehaviorStopped << ": the stop of \""
                                << behavior << "\" is never reported (injected fault)";
      return true;
    }
  }
  return false;
}

std::size_t FaultPlan::strikes(const std::string& service, const std::string& operation) const {
  std::lock_guard lock(fMutex);
  const auto it = fStrikes.find(key(service, operation));
  return it == fStrikes.end() ? 0 : it->second;
}

bool FaultPlan::waitForStrikes(const std::string& service, const std::string& operation,
                               std::size_t count, std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fChanged.wait_for(lock, bound, [&] {
    const auto it = fStrikes.find(key(service, operation));
    return it != fStrikes.end() && it->second >= count;
  });
}

std::size_t FaultPlan::hanging() const {
  std::lock_guard lock(fMutex);
  return fHanging;
}

std::uint64_t FaultPlan::lifts() const {
  std::lock_guard lock(fMutex);
  return fLifts;
}

}  // namespace robotsim
