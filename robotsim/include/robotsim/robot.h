#pragma once
// The whole simulated robot: a session with a broker, the shared timeline, and every
// service the speech-animation service drives ("ZUMemory", "ZUTextToSpeech",
// "ZUBehaviorManager", "ZUMotion", "ZUAudioPlayer", "ZURobotPosture", "ZURobotModel",
// "ZUAutonomousMoves"), registered under those names, and the timeline itself as the service
// "ZUTimeline" (robotsim/zutimelineservice.h).
//
// Built and destroyed by one thread; the services themselves serve any thread. On
// destruction every service exits (stopping what it plays) in the reverse order of its
// start.

#include <memory>
#include <string>
#include <vector>

#include "robotsim/faults.h"
#include "robotsim/timeline.h"
#include "robotsim/zuaudioplayer.h"
#include "robotsim/zumemory.h"
#include "robotsim/zumotion.h"
#include "robotsim/zutexttospeech.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"

namespace robotsim {

struct RobotOptions {
  // The speech engine; its timeline is the robot's.
  ZUTextToSpeechOptions speech;
  // Library folders; empty for the data folders "zefoko/behaviors" and "zefoko/sounds".
  std::string behaviorsRoot;
  std::string soundsRoot;
  int robotType = 1;
  // Faults that strike the services' calls, the speech engine's bookmarks and the
  // behaviour manager's stops (null: none). The robot lifts them when it shuts down.
  std::shared_ptr<FaultPlan> faults;
  // How often the motion service records the angles of the joints that move on the
  // timeline (ZUMotion::sampleAngles); 0 for never.
  double angleSamplesPerSecond = 0;
};

class Robot {
 public:
  // Starts every service on `broker`, or on a broker of a new session when it is null.
  // Raises ZUError when a service cannot start (a name already registered, no speech
  // engine); the services started before it exit again.
  explicit Robot(RobotOptions options = {}, std::shared_ptr<ZU::ZUBroker> broker = nullptr);
  ~Robot();
  Robot(const Robot&) = delete;
  Robot& operator=(const Robot&) = delete;

  const std::shared_ptr<ZU::ZUBroker>& broker() const noexcept { return fBroker; }
  const std::shared_ptr<Timeline>& timeline() const noexcept { return fTimeline; }
  const std::shared_ptr<ZUMemory>& memory() const noexcept { return fMemory; }
  const std::shared_ptr<ZUTextToSpeech>& speech() const noexcept { return fSpeech; }
  // The plan of the options; null when there is none.
  const std::shared_ptr<FaultPlan>& faults() const noexcept { return fFaults; }
  const std::shared_ptr<ZUMotion>& motion() const noexcept { return fMotion; }
  const std::shared_ptr<ZUAudioPlayer>& audioPlayer() const noexcept { return fAudioPlayer; }

 private:
  void xShutdown() noexcept;
  // Starts a service, behind the faults when there are some.
  template <class Service, class... A>
  std::shared_ptr<Service> xStart(const std::string& name, A&&... args);

  std::shared_ptr<ZU::ZUBroker> fBroker;
  std::shared_ptr<FaultPlan> fFaults;
  std::shared_ptr<Timeline> fTimeline;
  std::shared_ptr<ZUMemory> fMemory;
  std::shared_ptr<ZUTextToSpeech> fSpeech;
  std::shared_ptr<ZUMotion> fMotion;
  std::shared_ptr<ZUAudioPlayer> fAudioPlayer;
  std::vector<std::shared_ptr<ZU::ZUModuleCore>> fServices;  // in start order
};

}  // namespace robotsim
