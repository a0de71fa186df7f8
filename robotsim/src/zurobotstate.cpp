#include "robotsim/zurobotstate.h"

#include "ko/log.hpp"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {

ZURobotPosture::ZURobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                               std::shared_ptr<Timeline> timeline)
    : ZU::ZUModule(broker, name), fTimeline(std::move(timeline)) {
  setModuleDescription("The posture family of the simulated robot.");

  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"getPostureFamily",
       &ZURobotPosture::getPostureFamily,
       "Returns the robot's posture family.",
       {},
       {"postureFamily", "\"Standing\", \"Sitting\" or \"SittingOnChair\""}},
      {"setPostureFamily",
       &ZURobotPosture::setPostureFamily,
       "Puts the simulated robot in another posture family and raises "
       "PostureFamilyChanged.",
       {{"postureFamily", "\"Standing\", \"Sitting\" or \"SittingOnChair\""}}},
      {"getPostureFamilyList",
       &ZURobotPosture::getPostureFamilyList,
       "Returns the known posture families.",
       {},
       {"families", "the names of the posture families"}},
  };
  bindMethods("ZURobotPosture", methods);
}

std::string ZURobotPosture::getPostureFamily() {
  std::lock_guard lock(fMutex);
  return ZU::postureFamilyToStr(fFamily);
}

std::vector<std::string> ZURobotPosture::getPostureFamilyList() {
  return {ZU::kPostureFamilyNames[ZU::Standing], ZU::kPostureFamilyNames[ZU::Sitting],
          ZU::kPostureFamilyNames[ZU::SittingOnChair]};
}

void ZURobotPosture::setPostureFamily(const std::string& family) {
  const ZU::PostureFamily next = ZU::postureFamilyFromStr(family);
  if (next == ZU::Unknown) {
    ZU_THROW_ERROR(getName(), "setPostureFamily",
                   "Unknown posture family \"" + family +
                       "\": it has to be Standing, Sitting or SittingOnChair");
  }
  {
    std::lock_guard lock(fMutex);
    if (next == fFamily)
      return;
    fFamily = next;
  }
  if (fTimeline)
    fTimeline->record(getName(), "setPostureFamily", ko::AnyValue::List{family});
  try {
    ZU::ZUMemoryProxy memory(findService(ZU::ZUMemoryProxy::kServiceName));
    memory.raiseEvent("PostureFamilyChanged", ZU::ZUValue(family));
  } catch (const std::exception& e) {
    KO_LOG_ERROR("robotsim.posture") << "Cannot raise PostureFamilyChanged: " << e.what();
  }
}

ZURobotModel::ZURobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                           int robotType)
    : ZU::ZUModule(broker, name), fRobotType(robotType) {
  setModuleDescription("The model of the simulated robot.");

  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"_getRobotType",
       &ZURobotModel::_getRobotType,
       "Returns the type of the robot.",
       {},
       {"robotType", "the robot type, never 0 on this robot by default"}},
      {"_setRobotType",
       &ZURobotModel::_setRobotType,
       "Changes the type the robot reports.",
       {{"robotType", "the robot type"}}},
  };
  bindMethods("ZURobotModel", methods);
}

int ZURobotModel::_getRobotType() {
  return fRobotType.load();
}
void ZURobotModel::_setRobotType(int robotType) {
  fRobotType.store(robotType);
}

ZUAutonomousMoves::ZUAutonomousMoves(const std::shared_ptr<ZU::ZUBroker>& broker,
                                     const std::string& name, std::shared_ptr<Timeline> timeline)
    : ZU::ZUModule(broker, name), fTimeline(std::move(timeline)) {
  setModuleDescription("The small autonomous steps of the simulated robot.");
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"_moveForward", &ZUAutonomousMoves::_moveForward, "Makes a small step forward."},
      {"_moveBackward", &ZUAutonomousMoves::_moveBackward, "Makes a small step backward."},
      {"_moveSides", &ZUAutonomousMoves::_moveSides, "Sways from side to side."},
  };
  bindMethods("ZUAutonomousMoves", methods);
}

void ZUAutonomousMoves::_moveForward() {
  xRecord("_moveForward");
}
void ZUAutonomousMoves::_moveBackward() {
  xRecord("_moveBackward");
}
void ZUAutonomousMoves::_moveSides() {
  xRecord("_moveSides");
}

void ZUAutonomousMoves::xRecord(const char* move) {
  KO_LOG_VERBOSE("robotsim.moves") << move;
  if (fTimeline)
    fTimeline->record(getName(), move);
}

}  // namespace robotsim
