#include "robotsim/zurobotstate.h"

#include "ko/log.hpp"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace robotsim {

ZURobotPosture::ZURobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                               std::shared_ptr<Timeline> timeline)
    : ZU::ZUModule(broker, name), fTimeline(std::move(timeline)) {
  setModuleDescription("The posture family of the simulated robot.");

  beginMethod("getPostureFamily", "ZURobotPosture", "Returns the robot's posture family.");
  describeReturn("postureFamily", "\"Standing\", \"Sitting\" or \"SittingOnChair\"");
  bindMethod(&ZURobotPosture::getPostureFamily);

  beginMethod("setPostureFamily", "ZURobotPosture",
              "Puts the simulated robot in another posture family and raises "
              "PostureFamilyChanged.");
  describeParameter("postureFamily", "\"Standing\", \"Sitting\" or \"SittingOnChair\"");
  bindMethod(&ZURobotPosture::setPostureFamily);

  beginMethod("getPostureFamilyList", "ZURobotPosture", "Returns the known posture families.");
  describeReturn("families", "the names of the posture families");
  bindMethod(&ZURobotPosture::getPostureFamilyList);
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

  beginMethod("_getRobotType", "ZURobotModel", "Returns the type of the robot.");
  describeReturn("robotType", "the robot type, never 0 on this robot by default");
  bindMethod(&ZURobotModel::_getRobotType);

  beginMethod("_setRobotType", "ZURobotModel", "Changes the type the robot reports.");
  describeParameter("robotType", "the robot type");
  bindMethod(&ZURobotModel::_setRobotType);
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
  beginMethod("_moveForward", "ZUAutonomousMoves", "Makes a small step forward.");
  bindMethod(&ZUAutonomousMoves::_moveForward);
  beginMethod("_moveBackward", "ZUAutonomousMoves", "Makes a small step backward.");
  bindMethod(&ZUAutonomousMoves::_moveBackward);
  beginMethod("_moveSides", "ZUAutonomousMoves", "Sways from side to side.");
  bindMethod(&ZUAutonomousMoves::_moveSides);
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
