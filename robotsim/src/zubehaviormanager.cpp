#include "robotsim/zubehaviormanager.h"

#include <algorithm>
#include <fstream>
#include <system_error>
#include <utility>

#include "ko/eventloop.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/path.hpp"
#include "ko/reaper.hpp"
#include "robotsim/faults.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"

namespace robotsim {

namespace fs = std::filesystem;

namespace {

constexpr const char* kCategory = "robotsim.behaviormanager";
constexpr const char* kClass = "ZUBehaviorManager";
constexpr const char* kMotionService = "ZUMotion";
constexpr const char* kAddedEvent = "ZUBehaviorManager/BehaviorsAdded";
constexpr const char* kRemovedEvent = "ZUBehaviorManager/BehaviorsRemoved";
constexpr std::size_t kLoopThreads = 4;

fs::path defaultRoot(std::string root) {
  if (root.empty())
    root = ko::path::findData("zefoko", "behaviors");
  return root.empty() ? fs::path() : fs::path(root).lexically_normal();
}

std::string quoted(const std::string& behavior) {
  return "\"" + behavior + "\"";
}

}  // namespace

ZUBehaviorManager::ZUBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker,
                                     const std::string& name, std::shared_ptr<Timeline> timeline,
                                     std::string root, std::shared_ptr<FaultPlan> faults)
    : ZU::ZUModule(broker, name),
      fTimeline(std::move(timeline)),
      fRoot(defaultRoot(std::move(root))),
      fFaults(std::move(faults)) {
  setModuleDescription("The simulated robot's behaviours: the animation library on disk.");
  setEventLoop(std::make_shared<ko::EventLoop>(name, kLoopThreads));
  advertiseSignal<std::string>("behaviorStopped");
  fBehaviorStopped = signal<std::string>("behaviorStopped");
  xBindMethods();

  if (fRoot.empty()) {
    KO_LOG_WARNING(kCategory) << "No behaviour library found (zefoko/behaviors)";
  }
  ScannedLibrary scanned = scanBehaviorLibrary(fRoot);
  xLogRejected(scanned.rejected);
  for (auto& [behavior, descriptor] : scanned.behaviors)
    fInstalled.emplace(behavior, Installed{std::move(descriptor), xModified(behavior)});
  KO_LOG_INFO(kCategory) << fInstalled.size() << " behaviours installed in " << fRoot.string();

  fDeliveryThread = std::thread([this] { xDeliver(); });
}

ZUBehaviorManager::~ZUBehaviorManager() {
  xShutdown();
  // Left by an exit from a subscriber. Only a module made without ko::makeShared could die
  // on that thread, and would then be used freed once the thread goes on: modules are
  // made with ko::makeShared (ZUModule::createModule) for that reason.
  if (fDeliveryThread.joinable()) {
    if (fDeliveryThread.get_id() == std::this_thread::get_id())
      fDeliveryThread.detach();
    else
      fDeliveryThread.join();
  }
}

void ZUBehaviorManager::xShutdown() {
  try {
    stopAllBehaviors();
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot stop the behaviours: " << e.what();
  }
  xDisconnectMotion();
  {
    std::lock_guard lock(fMutex);
    fQuit = true;
  }
  fDeliveryWake.notify_all();
  // From a subscriber of the signal, the thread is left to the destructor.
  std::lock_guard lock(fJoinMutex);
  if (fDeliveryThread.joinable() && fDeliveryThread.get_id() != std::this_thread::get_id())
    fDeliveryThread.join();
}

void ZUBehaviorManager::xBindMethods() {
  const std::vector<ZU::ZUMethodParameter> behavior = {
      {"behavior", "The installed path of the behaviour."}};
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"getInstalledBehaviors",
       &ZUBehaviorManager::getInstalledBehaviors,
       "Lists the installed behaviours.",
       {},
       {"behaviors", "Their paths, in ascending order."}},
      {"getBehaviorTags",
       &ZUBehaviorManager::getBehaviorTags,
       "Gets the tags of a behaviour.",
       behavior,
       {"tags", "Its tags."}},
      {"resolveBehaviorName",
       &ZUBehaviorManager::resolveBehaviorName,
       "Finds the installed path of a behaviour.",
       {{"name", "An installed path, or its end after a '/'."}},
       {"behavior", "The installed path, or an empty string when none or several fit."}},
      {"preloadBehavior",
       &ZUBehaviorManager::preloadBehavior,
       "Loads a behaviour so that it starts at once.",
       behavior,
       {"loaded", "True when the behaviour is ready."}},
      {"startBehavior", &ZUBehaviorManager::startBehavior,
       "Starts a behaviour and returns at once.", behavior},
      {"runBehavior", &ZUBehaviorManager::runBehavior, "Runs a behaviour and returns at its end.",
       behavior},
      {"stopBehavior", &ZUBehaviorManager::stopBehavior, "Stops a behaviour if it runs.", behavior},
      {"stopAllBehaviors", &ZUBehaviorManager::stopAllBehaviors, "Stops every running behaviour."},
      {"isBehaviorRunning",
       &ZUBehaviorManager::isBehaviorRunning,
       "Whether a behaviour runs.",
       behavior,
       {"running", "True while it runs."}},
      {"getRunningBehaviors",
       &ZUBehaviorManager::getRunningBehaviors,
       "Lists the running behaviours.",
       {},
       {"behaviors", "Their paths, in ascending order."}},
      {"installBehavior",
       &ZUBehaviorManager::installBehavior,
       "Installs a behaviour in the library.",
       {{"behavior", "The path to install it under."},
        {"descriptor", "The JSON text of its behavior.json."}}},
      {"removeBehavior",
       &ZUBehaviorManager::removeBehavior,
       "Removes a behaviour from the library.",
       behavior,
       {"removed", "False when it was not installed."}},
      {"rescan", &ZUBehaviorManager::rescan, "Reads the library folder again."},
  };
  bindMethods(kClass, methods);
}

void ZUBehaviorManager::xLogRejected(const std::map<std::string, std::string>& rejected) {
  for (const auto& [behavior, reason] : rejected)
    KO_LOG_WARNING(kCategory) << "Behavior " << quoted(behavior) << " skipped: " << reason;
}

fs::file_time_type ZUBehaviorManager::xModified(const std::string& behavior) const {
  std::error_code ec;
  const auto time = fs::last_write_time(fRoot / behavior / kBehaviorFileName, ec);
  return ec ? fs::file_time_type() : time;
}

void ZUBehaviorManager::xRecord(const std::string& operation, ko::AnyValue arguments,
                                ko::AnyValue result) {
  if (fTimeline)
    fTimeline->record(getName(), operation, std::move(arguments), std::move(result));
}

// ---- the library -----------------------------------------------------------------

std::vector<std::string> ZUBehaviorManager::getInstalledBehaviors() {
  std::lock_guard lock(fMutex);
  std::vector<std::string> out;
  out.reserve(fInstalled.size());
  for (const auto& [behavior, installed] : fInstalled)
    out.push_back(behavior);
  return out;
}

std::vector<std::string> ZUBehaviorManager::getBehaviorTags(const std::string& behavior) {
  std::lock_guard lock(fMutex);
  const auto it = fInstalled.find(behavior);
  if (it == fInstalled.end())
    ZU_THROW_ERROR(getName(), "getBehaviorTags",
                   "Behavior " + quoted(behavior) + " is not installed");
  return it->second.descriptor.tags;
}

std::string ZUBehaviorManager::resolveBehaviorName(const std::string& name) {
  if (name.empty())
    return {};
  std::lock_guard lock(fMutex);
  if (fInstalled.count(name))
    return name;
  const std::string suffix = "/" + name;
  std::string found;
  for (const auto& [behavior, installed] : fInstalled) {
    if (behavior.size() > suffix.size() &&
        behavior.compare(behavior.size() - suffix.size(), suffix.size(), suffix) == 0) {
      if (!found.empty())
        return {};
      found = behavior;
    }
  }
  return found;
}

bool ZUBehaviorManager::preloadBehavior(const std::string& behavior) {
  fs::file_time_type known;
  {
    std::lock_guard lock(fMutex);
    const auto it = fInstalled.find(behavior);
    if (it == fInstalled.end()) {
      ZU_THROW_ERROR(getName(), "preloadBehavior",
                     "Behavior " + quoted(behavior) + " is not installed");
    }
    known = it->second.modified;
  }
  const auto modified = xModified(behavior);
  if (modified != known) {
    BehaviorDescriptor descriptor;
    try {
      descriptor = readBehaviorDescriptor(fRoot / behavior / kBehaviorFileName);
    } catch (const DescriptorError& e) {
      ZU_THROW_ERROR(getName(), "preloadBehavior",
                     "Behavior " + quoted(behavior) + " cannot be loaded: " + e.what());
    }
    std::lock_guard lock(fMutex);
    const auto it = fInstalled.find(behavior);
    if (it != fInstalled.end())
      it->second = Installed{std::move(descriptor), modified};
  }
  xRecord("preloadBehavior", ko::AnyValue::list({behavior}));
  return true;
}

void ZUBehaviorManager::installBehavior(const std::string& behavior,
                                        const std::string& descriptor) {
  if (!isValidBehaviorPath(behavior)) {
    ZU_THROW_ERROR(getName(), "installBehavior",
                   "Invalid behavior path " + quoted(behavior) +
                       ": a relative path of folder names separated by '/'");
  }
  if (fRoot.empty())
    ZU_THROW_ERROR(getName(), "installBehavior", "No behaviour library folder");
  BehaviorDescriptor parsed;
  try {
    parsed = parseBehaviorDescriptor(descriptor);
  } catch (const DescriptorError& e) {
    ZU_THROW_ERROR(getName(), "installBehavior",
                   "Malformed descriptor for " + quoted(behavior) + ": " + e.what());
  }

  const fs::path folder = fRoot / behavior;
  const fs::path file = folder / kBehaviorFileName;
  const fs::path temporary = folder / (std::string(kBehaviorFileName) + ".tmp");
  std::error_code ec;
  fs::create_directories(folder, ec);
  if (!ec) {
    std::ofstream out(temporary, std::ios::binary | std::ios::trunc);
    out << descriptor;
    out.close();
    if (!out)
      ec = std::make_error_code(std::errc::io_error);
  }
  if (!ec)
    fs::rename(temporary, file, ec);
  if (ec) {
    fs::remove(temporary, ec);
    ZU_THROW_ERROR(getName(), "installBehavior",
                   "Cannot write " + file.string() + ": " + ec.message());
  }
  {
    std::lock_guard lock(fMutex);
    fInstalled[behavior] = Installed{std::move(parsed), xModified(behavior)};
  }
  xRecord("installBehavior", ko::AnyValue::list({behavior}));
  xRaise(kAddedEvent, {behavior});
}

bool ZUBehaviorManager::removeBehavior(const std::string& behavior) {
  {
    std::lock_guard lock(fMutex);
    if (!fInstalled.count(behavior))
      return false;
  }
  stopBehavior(behavior);
  std::error_code ec;
  fs::path folder = fRoot / behavior;
  fs::remove(folder / kBehaviorFileName, ec);
  if (ec) {
    ZU_THROW_ERROR(getName(), "removeBehavior",
                   "Cannot delete the descriptor of " + quoted(behavior) + ": " + ec.message());
  }
  // Folders left empty go too, up to the library root.
  for (auto depth = std::count(behavior.begin(), behavior.end(), '/') + 1; depth > 0; --depth) {
    if (!fs::is_empty(folder, ec) || ec || !fs::remove(folder, ec))
      break;
    folder = folder.parent_path();
  }
  {
    std::lock_guard lock(fMutex);
    fInstalled.erase(behavior);
  }
  xRecord("removeBehavior", ko::AnyValue::list({behavior}));
  xRaise(kRemovedEvent, {behavior});
  return true;
}

void ZUBehaviorManager::rescan() {
  ScannedLibrary scanned = scanBehaviorLibrary(fRoot);
  xLogRejected(scanned.rejected);
  std::map<std::string, Installed> library;
  for (auto& [behavior, descriptor] : scanned.behaviors)
    library.emplace(behavior, Installed{std::move(descriptor), xModified(behavior)});

  std::vector<std::string> added;
  std::vector<std::string> removed;
  {
    std::lock_guard lock(fMutex);
    for (const auto& [behavior, installed] : library) {
      const auto it = fInstalled.find(behavior);
      if (it == fInstalled.end() || it->second.modified != installed.modified)
        added.push_back(behavior);
    }
    for (const auto& [behavior, installed] : fInstalled) {
      if (!library.count(behavior))
        removed.push_back(behavior);
    }
    fInstalled.swap(library);
  }
  xRecord("rescan", ko::AnyValue::list({}),
          ko::AnyValue::list({ko::AnyValue::from(added), ko::AnyValue::from(removed)}));
  xRaise(kAddedEvent, added);
  xRaise(kRemovedEvent, removed);
}

void ZUBehaviorManager::xRaise(const std::string& key, const std::vector<std::string>& behaviors) {
  if (behaviors.empty())
    return;
  ZU::ZUValue value;
  value.arraySetSize(0);
  for (const auto& behavior : behaviors)
    value.arrayPush(ZU::ZUValue(behavior));
  try {
    ZU::ZUMemoryProxy(findService(ZU::ZUMemoryProxy::kServiceName)).raiseEvent(key, value);
  } catch (const std::exception& e) {
    KO_LOG_WARNING(kCategory) << "Cannot raise " << key << ": " << e.what();
  }
}

// ---- running behaviours ----------------------------------------------------------

ko::AnyObject ZUBehaviorManager::xMotion(const std::string& method) {
  std::lock_guard lock(fMotionMutex);
  if (fMotion && fMotion->isValid())
    return fMotion;
  fMotion.reset();
  fMotionLink = ko::kInvalidSignalLink;
  ko::AnyObject motion = findService(kMotionService);
  if (!motion)
    ZU_THROW_ERROR(getName(), method, std::string(kMotionService) + " is not available");
  std::weak_ptr<ZU::ZUModuleCore> weak = weak_from_this();
  fMotionLink = motion->connect("moveEnded", [weak](int moveId, bool interrupted) {
    if (const auto self = weak.lock())
      static_cast<ZUBehaviorManager*>(self.get())->xOnMoveEnded(moveId, interrupted);
  });
  fMotion = std::move(motion);
  return fMotion;
}

void ZUBehaviorManager::xDisconnectMotion() {
  std::lock_guard lock(fMotionMutex);
  if (fMotion && fMotionLink != ko::kInvalidSignalLink) {
    try {
      fMotion->disconnect(fMotionLink);
    } catch (const std::exception& e) {
      KO_LOG_VERBOSE(kCategory) << "Cannot disconnect from " << kMotionService << ": " << e.what();
    }
  }
  fMotion.reset();
  fMotionLink = ko::kInvalidSignalLink;
}

std::uint64_t ZUBehaviorManager::xStart(const std::string& method, const std::string& behavior) {
  BehaviorDescriptor descriptor;
  std::uint64_t serial = 0;
  {
    std::lock_guard lock(fMutex);
    const auto it = fInstalled.find(behavior);
    if (it == fInstalled.end())
      ZU_THROW_ERROR(getName(), method, "Behavior " + quoted(behavior) + " is not installed");
    if (fRunning.count(behavior))
      ZU_THROW_ERROR(getName(), method, "Behavior " + quoted(behavior) + " is already running");
    descriptor = it->second.descriptor;
    serial = fNextSerial++;
    fRunning[behavior] = Running{serial, 0, false};
    // The stop of an earlier run that is not told yet would be heard after this start
    // returns, as the stop of this run: it is recorded but not signalled.
    for (auto& delivery : fDeliveries) {
      if (!delivery.started && delivery.behavior == behavior)
        delivery.superseded = true;
    }
  }
  auto pendingStarts = [this] {
    return std::any_of(fRunning.begin(), fRunning.end(),
                       [](const auto& r) { return r.second.moveId == 0; });
  };

  ko::AnyObject motion;
  int moveId = 0;
  try {
    motion = xMotion(method);
    moveId = motion->call<int>("_startBezierMove", descriptor.names, descriptor.times,
                               descriptor.keys, static_cast<float>(descriptor.duration));
  } catch (const std::exception& e) {
    {
      std::lock_guard lock(fMutex);
      fRunning.erase(behavior);
      if (!pendingStarts())
        fEarlyEnds.clear();
    }
    fRunEnded.notify_all();
    if (const auto* error = dynamic_cast<const ZU::ZUError*>(&e))
      throw *error;
    ZU_THROW_ERROR(getName(), method,
                   "Behavior " + quoted(behavior) + " cannot move the body: " + e.what());
  }

  // The entry says when the body began to move, not when the delivery thread writes it.
  const std::int64_t startUs = fTimeline ? fTimeline->now() : -1;
  bool stopNow = false;
  {
    std::lock_guard lock(fMutex);
    Running& run = fRunning[behavior];
    run.moveId = moveId;
    fMoves[moveId] = behavior;
    fDeliveries.push_back({behavior, true, false, false, startUs});
    fDeliveryWake.notify_all();
    if (const auto early = fEarlyEnds.find(moveId); early != fEarlyEnds.end()) {
      const bool interrupted = early->second;
      fEarlyEnds.erase(early);
      xFinish(behavior, interrupted);
    } else {
      stopNow = run.stopRequested;
    }
    if (!pendingStarts())
      fEarlyEnds.clear();
  }
  if (stopNow)
    stopBehavior(behavior);
  return serial;
}

void ZUBehaviorManager::xOnMoveEnded(int moveId, bool interrupted) {
  std::lock_guard lock(fMutex);
  const auto it = fMoves.find(moveId);
  if (it != fMoves.end()) {
    xFinish(it->second, interrupted);
    return;
  }
  // The move may be one whose start has not been recorded yet.
  const bool starting = std::any_of(fRunning.begin(), fRunning.end(),
                                    [](const auto& r) { return r.second.moveId == 0; });
  if (starting)
    fEarlyEnds[moveId] = interrupted;
}

void ZUBehaviorManager::xFinish(std::string behavior, bool interrupted) {
  const auto it = fRunning.find(behavior);
  if (it == fRunning.end())
    return;
  fMoves.erase(it->second.moveId);
  fRunning.erase(it);
  fDeliveries.push_back({std::move(behavior), false, interrupted});
  fDeliveryWake.notify_all();
  fRunEnded.notify_all();
}

void ZUBehaviorManager::xDeliver() {
  const ko::FrameworkThreadScope framework;
  std::unique_lock lock(fMutex);
  for (;;) {
    fDeliveryWake.wait(lock, [this] { return fQuit || !fDeliveries.empty(); });
    if (fDeliveries.empty())
      return;
    const Delivery delivery = std::move(fDeliveries.front());
    fDeliveries.pop_front();
    lock.unlock();
    // The thread outlives whatever a news throws.
    try {
      if (delivery.started) {
        if (fTimeline)
          fTimeline->recordAt(delivery.startUs, getName(), "startBehavior",
                              ko::AnyValue::list({delivery.behavior}));
      } else {
        xRecord("behaviorStopped", ko::AnyValue::list({delivery.behavior}),
                delivery.interrupted ? "stopped" : "ended");
        if (!delivery.superseded && !(fFaults && fFaults->hidesStop(delivery.behavior)))
          (*fBehaviorStopped)(delivery.behavior);
      }
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "The news of " << quoted(delivery.behavior)
                              << " could not be told: " << e.what();
    }
    lock.lock();
  }
}

void ZUBehaviorManager::startBehavior(const std::string& behavior) {
  xStart("startBehavior", behavior);
}

void ZUBehaviorManager::runBehavior(const std::string& behavior) {
  const auto task = currentTask();
  const std::uint64_t serial = xStart("runBehavior", behavior);
  // stop(id) looks the run up after setting the task's flag; the flag is read after the run
  // is registered, so one of the two sees the other.
  if (task) {
    {
      std::lock_guard lock(fMutex);
      fTaskRuns[task->id()] = behavior;
    }
    if (task->isStopRequested())
      stopBehavior(behavior);
  }
  std::unique_lock lock(fMutex);
  fRunEnded.wait(lock, [&] {
    const auto it = fRunning.find(behavior);
    return it == fRunning.end() || it->second.serial != serial;
  });
  if (task)
    fTaskRuns.erase(task->id());
}

void ZUBehaviorManager::stopBehavior(const std::string& behavior) {
  int moveId = 0;
  {
    std::lock_guard lock(fMutex);
    const auto it = fRunning.find(behavior);
    if (it == fRunning.end())
      return;
    if (it->second.moveId == 0) {
      // Still starting: the starting thread stops it once the move is known.
      it->second.stopRequested = true;
      return;
    }
    moveId = it->second.moveId;
  }
  xRecord("stopBehavior", ko::AnyValue::list({behavior}));
  try {
    xMotion("stopBehavior")->call<bool>("_stopMove", moveId);
  } catch (const std::exception& e) {
    // Without the motion service the move is gone with it.
    KO_LOG_ERROR(kCategory) << "Cannot stop the move of " << quoted(behavior) << ": " << e.what();
    std::lock_guard lock(fMutex);
    const auto it = fRunning.find(behavior);
    if (it != fRunning.end() && it->second.moveId == moveId)
      xFinish(behavior, true);
  }
}

void ZUBehaviorManager::stopAllBehaviors() {
  for (const auto& behavior : getRunningBehaviors())
    stopBehavior(behavior);
}

bool ZUBehaviorManager::isBehaviorRunning(const std::string& behavior) {
  std::lock_guard lock(fMutex);
  return fRunning.count(behavior) != 0;
}

std::vector<std::string> ZUBehaviorManager::getRunningBehaviors() {
  std::lock_guard lock(fMutex);
  std::vector<std::string> out;
  for (const auto& [behavior, run] : fRunning)
    out.push_back(behavior);
  return out;
}

void ZUBehaviorManager::exit() {
  xShutdown();
  ZU::ZUModule::exit();
}

void ZUBehaviorManager::stop(int id) {
  ZU::ZUModule::stop(id);
  std::string behavior;
  {
    std::lock_guard lock(fMutex);
    const auto it = fTaskRuns.find(id);
    if (it == fTaskRuns.end())
      return;
    behavior = it->second;
  }
  stopBehavior(behavior);
}

}  // namespace robotsim
