#include "support/fake_robot.h"

#include <algorithm>

#include "zu/zuerror.h"

namespace bodytalktest {

void CallLog::add(std::string method, std::vector<ZU::ZUValue> args) {
  {
    std::lock_guard lock(fMutex);
    fCalls.push_back({std::move(method), std::move(args), std::chrono::steady_clock::now()});
  }
  fAdded.notify_all();
}

std::vector<Call> CallLog::calls() const {
  std::lock_guard lock(fMutex);
  return fCalls;
}

std::vector<Call> CallLog::calls(const std::string& method) const {
  std::lock_guard lock(fMutex);
  std::vector<Call> out;
  std::copy_if(fCalls.begin(), fCalls.end(), std::back_inserter(out),
               [&](const Call& c) { return c.method == method; });
  return out;
}

std::size_t CallLog::count(const std::string& method) const {
  return calls(method).size();
}

bool CallLog::waitFor(const std::string& method, std::size_t count,
                      std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fAdded.wait_for(lock, bound, [&] {
    return static_cast<std::size_t>(std::count_if(fCalls.begin(), fCalls.end(), [&](const Call& c) {
             return c.method == method;
           })) >= count;
  });
}

// ---- motion ---------------------------------------------------------------------------------

FakeMotion::FakeMotion(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name) {
  setEventLoop(std::make_shared<ko::EventLoop>(name, 2));
  bindMethods("FakeMotion", {{"areResourcesAvailable", &FakeMotion::areResourcesAvailable},
                             {"getAngles", &FakeMotion::getAngles},
                             {"angleInterpolationBezier", &FakeMotion::angleInterpolationBezier},
                             {"setAngles", &FakeMotion::setAngles}});
}

FakeMotion::~FakeMotion() = default;

bool FakeMotion::areResourcesAvailable(const ZU::ZUValue& resourceNames) {
  log.add("areResourcesAvailable", {resourceNames});
  return available.load();
}

std::vector<float> FakeMotion::getAngles(const ZU::ZUValue& names, bool useSensors) {
  log.add("getAngles", {names, ZU::ZUValue::makeBool(useSensors)});
  if (failGetAngles.load())
    ZU_THROW_ERROR(getName(), "getAngles", "joints unplugged");
  return {angle.load()};
}

void FakeMotion::angleInterpolationBezier(const ZU::ZUValue& jointNames, const ZU::ZUValue& times,
                                          const ZU::ZUValue& controlPoints) {
  log.add("angleInterpolationBezier", {jointNames, times, controlPoints});
  const auto task = currentTask();
  if (task)
    task->waitForStopRequest(moveMs.load());
}

void FakeMotion::setAngles(const ZU::ZUValue& names, const ZU::ZUValue& angles,
                           float fractionMaxSpeed) {
  log.add("setAngles", {names, angles, fractionMaxSpeed});
}

bool FakeMotion::wait(int id, int timeoutPeriod) {
  log.add("wait", {id, timeoutPeriod});
  return ZU::ZUModule::wait(id, timeoutPeriod);
}

void FakeMotion::stop(int id) {
  log.add("stop", {id});
  ZU::ZUModule::stop(id);
}

// ---- behaviours -----------------------------------------------------------------------------

FakeBehaviorManager::FakeBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker,
                                         const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("FakeBehaviorManager", {{"preloadBehavior", &FakeBehaviorManager::preloadBehavior},
                                      {"startBehavior", &FakeBehaviorManager::startBehavior},
                                      {"stopBehavior", &FakeBehaviorManager::stopBehavior}});
}

bool FakeBehaviorManager::preloadBehavior(const std::string& behavior) {
  log.add("preloadBehavior", {behavior});
  std::lock_guard lock(fMutex);
  if (fFailPreload.count(behavior))
    ZU_THROW_ERROR(getName(), "preloadBehavior", "Behavior \"" + behavior + "\" is not installed");
  return true;
}

void FakeBehaviorManager::startBehavior(const std::string& behavior) {
  {
    std::lock_guard lock(fMutex);
    if (fFailStart.count(behavior)) {
      ZU_THROW_ERROR(getName(), "startBehavior",
                     "Behavior \"" + behavior + "\" is already running");
    }
  }
  log.add("startBehavior", {behavior});
}

void FakeBehaviorManager::stopBehavior(const std::string& behavior) {
  log.add("stopBehavior", {behavior});
}

void FakeBehaviorManager::failStartOf(const std::string& behavior) {
  std::lock_guard lock(fMutex);
  fFailStart.insert(behavior);
}

void FakeBehaviorManager::failPreloadOf(const std::string& behavior) {
  std::lock_guard lock(fMutex);
  fFailPreload.insert(behavior);
}

std::vector<std::string> FakeBehaviorManager::started() const {
  std::vector<std::string> out;
  for (const auto& call : log.calls("startBehavior"))
    out.push_back(call.args.at(0).asString());
  return out;
}

// ---- posture, model, memory -------------------------------------------------------------------

FakeRobotModel::FakeRobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                               int robotType)
    : ZU::ZUModule(broker, name), fRobotType(robotType) {
  bindMethods("FakeRobotModel", {{"_getRobotType", &FakeRobotModel::_getRobotType}});
}

FakeRobotPosture::FakeRobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker,
                                   const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("FakeRobotPosture", {{"getPostureFamily", &FakeRobotPosture::getPostureFamily}});
}

std::string FakeRobotPosture::getPostureFamily() {
  if (fail.load())
    ZU_THROW_ERROR(getName(), "getPostureFamily", "no posture sensor");
  std::lock_guard lock(fMutex);
  return fFamily;
}

void FakeRobotPosture::setFamily(const std::string& family) {
  std::lock_guard lock(fMutex);
  fFamily = family;
}

FakeMemory::FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("FakeMemory", {{"subscribeToEvent", &FakeMemory::subscribeToEvent},
                             {"unsubscribeToEvent", &FakeMemory::unsubscribeToEvent}});
}

void FakeMemory::subscribeToEvent(const std::string& name, const std::string& callbackModule,
                                  const std::string& callbackMethod) {
  log.add("subscribeToEvent", {name, callbackModule, callbackMethod});
  if (fail.load())
    ZU_THROW_ERROR(getName(), "subscribeToEvent", "memory full");
}

void FakeMemory::unsubscribeToEvent(const std::string& name, const std::string& callbackModule) {
  log.add("unsubscribeToEvent", {name, callbackModule});
  if (fail.load())
    ZU_THROW_ERROR(getName(), "unsubscribeToEvent", "memory full");
}

// ---- the process ------------------------------------------------------------------------------

FakeRobot::FakeRobot(int robotType)
    : session(std::make_shared<ko::Session>()),
      broker(ZU::ZUBroker::create(session, "BodyTalkTestBroker",
                                  std::make_shared<ZU::ZUBrokerManager>())) {
  using ZU::ZUModule;
  memory = ZUModule::createModule<FakeMemory>(broker, "ZUMemory");
  motion = ZUModule::createModule<FakeMotion>(broker, "ZUMotion");
  behaviors = ZUModule::createModule<FakeBehaviorManager>(broker, "ZUBehaviorManager");
  posture = ZUModule::createModule<FakeRobotPosture>(broker, "ZURobotPosture");
  model = ZUModule::createModule<FakeRobotModel>(broker, "ZURobotModel", robotType);
}

FakeRobot::~FakeRobot() {
  for (const auto& module :
       std::vector<std::shared_ptr<ZU::ZUModule>>{model, posture, behaviors, motion, memory}) {
    module->exit();
  }
}

BodyTalkHandle::BodyTalkHandle(const std::shared_ptr<ZU::ZUBroker>& broker, double timeScale)
    : fBodyTalk(ZU::ZURobotBodyTalk::getInstance(broker, {timeScale, nullptr})) {}

BodyTalkHandle::~BodyTalkHandle() {
  ZU::ZURobotBodyTalk::releaseInstance();
}

}  // namespace bodytalktest
