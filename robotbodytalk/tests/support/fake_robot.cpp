#include "support/fake_robot.h"

#include <algorithm>

#include "zu/zuerror.h"

namespace bodytalktest {

std::vector<Call> CallLog::calls(const std::string& method) const {
  const std::vector<Call> recorded = all();
  std::vector<Call> out;
  std::copy_if(recorded.begin(), recorded.end(), std::back_inserter(out),
               [&](const Call& c) { return method.empty() || c.method == method; });
  return out;
}

std::vector<ko::log::Record> linesOf(ko::log::ScopedCapture& log, std::string_view category,
                                     ko::log::Level level, std::string_view part) {
  std::vector<ko::log::Record> out;
  for (auto& r : log->records()) {
    if (r.category == category && r.level == level && r.message.find(part) != std::string::npos)
      out.push_back(std::move(r));
  }
  return out;
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

std::vector<float> FakeMotion::getAngles(const ZU::ZUValue& names, bool useSensors) {
  log.add("getAngles", {names, ZU::ZUValue::makeBool(useSensors)});
  if (failGetAngles.load())
    ZU_THROW_ERROR(getName(), "getAngles", "joints unplugged");
  return {angle.load()};
}

// ---- behaviours -----------------------------------------------------------------------------

FakeBehaviorManager::FakeBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker,
                                         const std::string& name)
    : ZU::ZUModule(broker, name) {
  using M = FakeBehaviorManager;
  bindMethods("FakeBehaviorManager", {{"getInstalledBehaviors", &M::getInstalledBehaviors},
                                      {"getBehaviorTags", &M::getBehaviorTags},
                                      {"resolveBehaviorName", &M::resolveBehaviorName},
                                      {"preloadBehavior", &M::preloadBehavior},
                                      {"startBehavior", &M::startBehavior},
                                      {"stopBehavior", &M::stopBehavior}});
}

void FakeBehaviorManager::xFailIfAsked(const std::string& method, const std::string& behavior) {
  std::lock_guard lock(fMutex);
  if (fFailing.count({method, behavior}))
    ZU_THROW_ERROR(getName(), method, "\"" + behavior + "\" is out of reach");
}

std::vector<std::string> FakeBehaviorManager::getInstalledBehaviors() {
  log.add("getInstalledBehaviors", {});
  xFailIfAsked("getInstalledBehaviors", "");
  std::lock_guard lock(fMutex);
  std::vector<std::string> paths;
  for (const auto& [path, tags] : fLibrary)
    paths.push_back(path);
  return paths;
}

std::vector<std::string> FakeBehaviorManager::getBehaviorTags(const std::string& behavior) {
  log.add("getBehaviorTags", {behavior});
  std::function<void(const std::string&)> hook;
  {
    std::lock_guard lock(fMutex);
    hook = fTagQueryHook;
  }
  if (hook)
    hook(behavior);
  xFailIfAsked("getBehaviorTags", behavior);
  std::lock_guard lock(fMutex);
  const auto found = fLibrary.find(behavior);
  return found == fLibrary.end() ? std::vector<std::string>{} : found->second;
}

std::vector<std::string> FakeBehaviorManager::behaviorsOf(const std::string& method) const {
  std::vector<std::string> out;
  for (const auto& call : log.calls(method))
    out.push_back(call.args.at(0).asString());
  return out;
}

// ---- posture, model, memory -------------------------------------------------------------------

FakeRobotModel::FakeRobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name) {
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

FakeMemory::FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("FakeMemory", {{"declareEvent", &FakeMemory::declareEvent},
                             {"subscribeToEvent", &FakeMemory::subscribeToEvent},
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

FakeRobot::FakeRobot()
    : session(std::make_shared<ko::Session>()),
      broker(ZU::ZUBroker::create(session, "BodyTalkTestBroker",
                                  std::make_shared<ZU::ZUBrokerManager>())) {
  using ZU::ZUModule;
  memory = ZUModule::createModule<FakeMemory>(broker, "ZUMemory");
  motion = ZUModule::createModule<FakeMotion>(broker, "ZUMotion");
  behaviors = ZUModule::createModule<FakeBehaviorManager>(broker, "ZUBehaviorManager");
  posture = ZUModule::createModule<FakeRobotPosture>(broker, "ZURobotPosture");
  model = ZUModule::createModule<FakeRobotModel>(broker, "ZURobotModel");
}

FakeRobot::~FakeRobot() {
  for (const auto& module :
       std::vector<std::shared_ptr<ZU::ZUModule>>{model, posture, behaviors, motion, memory}) {
    module->exit();
  }
}

}  // namespace bodytalktest
