#include "robotsim/robot.h"

#include "ko/log.hpp"
#include "robotsim/zuaudioplayer.h"
#include "robotsim/zubehaviormanager.h"
#include "robotsim/zumemory.h"
#include "robotsim/zumotion.h"
#include "robotsim/zurobotstate.h"
#include "robotsim/zutimelineservice.h"

namespace robotsim {

template <class Service, class... A>
std::shared_ptr<Service> Robot::xStart(const std::string& name, A&&... args) {
  std::shared_ptr<Service> service;
  if (fFaults) {
    service = ZU::ZUModule::createModule<WithFaults<Service>>(fBroker, name, fFaults,
                                                              std::forward<A>(args)...);
  } else {
    service = ZU::ZUModule::createModule<Service>(fBroker, name, std::forward<A>(args)...);
  }
  fServices.push_back(service);
  return service;
}

Robot::Robot(RobotOptions options, std::shared_ptr<ZU::ZUBroker> broker)
    : fBroker(broker ? std::move(broker) : ZU::ZUBroker::create(std::make_shared<ko::Session>())),
      fFaults(std::move(options.faults)),
      fTimeline(std::make_shared<Timeline>()) {
  try {
    ZUMemoryOptions memory;
    memory.timeline = fTimeline;
    fMemory = xStart<ZUMemory>("ZUMemory", memory);
    fMotion = xStart<ZUMotion>("ZUMotion", fTimeline);
    fMotion->sampleAngles(options.angleSamplesPerSecond);
    xStart<ZUBehaviorManager>("ZUBehaviorManager", fTimeline, options.behaviorsRoot, fFaults);
    fAudioPlayer = xStart<ZUAudioPlayer>("ZUAudioPlayer", fTimeline, options.soundsRoot);
    xStart<ZURobotPosture>("ZURobotPosture", fTimeline);
    xStart<ZURobotModel>("ZURobotModel", options.robotType);
    xStart<ZUAutonomousMoves>("ZUAutonomousMoves", fTimeline);
    options.speech.timeline = fTimeline;
    options.speech.faults = fFaults;
    fSpeech = xStart<ZUTextToSpeech>("ZUTextToSpeech", options.speech);
    // The timeline is the simulation's own record, not a service of the robot: no faults.
    fServices.push_back(ZU::ZUModule::createModule<ZUTimelineService>(
        fBroker, ZUTimelineService::kServiceName, fTimeline));
  } catch (...) {
    xShutdown();
    throw;
  }
  KO_LOG_INFO("robotsim") << "The simulated robot is up with " << fServices.size() << " services";
}

Robot::~Robot() {
  xShutdown();
}

void Robot::xShutdown() noexcept {
  // The calls that hang would hold the services' threads.
  if (fFaults)
    fFaults->lift();
  while (!fServices.empty()) {
    auto service = std::move(fServices.back());
    fServices.pop_back();
    try {
      service->exit();
    } catch (const std::exception& e) {
      KO_LOG_ERROR("robotsim") << "Service " << service->getName()
                               << " failed to exit: " << e.what();
    }
  }
  fSpeech.reset();
  fMotion.reset();
  fAudioPlayer.reset();
}

}  // namespace robotsim
