#pragma once
// The small services of the simulated robot: its posture family, its model and its
// autonomous moves. Each is a module of its own, registered under the robot's service
// name; every method may be called from any thread.

#include <atomic>
#include <memory>
#include <mutex>
#include <string>

#include "robotsim/timeline.h"
#include "zu/enums.h"
#include "zu/zumodule.h"

namespace robotsim {

// "ZURobotPosture": the posture family of the robot ("Standing" at start). Setting
// another family raises "PostureFamilyChanged" with its name through "ZUMemory".
class ZURobotPosture : public ZU::ZUModule {
 public:
  ZURobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                 std::shared_ptr<Timeline> timeline);

  std::string getPostureFamily();
  // "Standing", "Sitting" or "SittingOnChair"; anything else raises a ZUError. Setting
  // the family the robot already has raises no event.
  void setPostureFamily(const std::string& family);
  std::vector<std::string> getPostureFamilyList();

 private:
  std::shared_ptr<Timeline> fTimeline;
  std::mutex fMutex;
  ZU::PostureFamily fFamily = ZU::Standing;
};

// "ZURobotModel": what kind of robot this is.
class ZURobotModel : public ZU::ZUModule {
 public:
  ZURobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
               int robotType = kDefaultRobotType);

  static constexpr int kDefaultRobotType = 1;

  int _getRobotType();
  void _setRobotType(int robotType);

 private:
  std::atomic<int> fRobotType;
};

// "ZUAutonomousMoves": the small steps that some gestures call for. The simulated robot
// has no legs to move; it records each step on the timeline.
class ZUAutonomousMoves : public ZU::ZUModule {
 public:
  ZUAutonomousMoves(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                    std::shared_ptr<Timeline> timeline);

  void _moveForward();
  void _moveBackward();
  void _moveSides();

 private:
  void xRecord(const char* move);
  std::shared_ptr<Timeline> fTimeline;
};

}  // namespace robotsim
