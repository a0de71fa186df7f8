#include "robotsim/robot.h"

#include "ko/log.hpp"
#include "robotsim/zuaudioplayer.h"
#include "robotsim/zubehaviormanager.h"
#include "robotsim/zumemory.h"
#include "robotsim/zumotion.h"
#include "robotsim/zurobotstate.h"
#include "robotsim/zutimelineservice.h"

namespace robotsim {

Robot::Robot(RobotOptions options, std::shared_ptr<ZU::ZUBroker> broker)
    : fBroker(broker ? std::move(broker) : ZU::ZUBroker::create(std::make_shared<ko::Session>())),
      fTimeline(std::make_shared<Timeline>()) {
  using ZU::ZUModule;
  try {
    ZUMemoryOptions memory;
    memory.timeline = fTimeline;
    fServices.push_back(ZUModule::createModule<ZUMemory>(fBroker, "ZUMemory", memory));
    fMotion = ZUModule::createModule<ZUMotion>(fBroker, "ZUMotion", fTimeline);
    fMotion->sampleAngles(options.angleSamplesPerSecond);
    fServices.push_back(fMotion);
    fServices.push_back(ZUModule::createModule<ZUBehaviorManager>(
        fBroker, "ZUBehaviorManager", fTimeline, options.behaviorsRoot));
    fAudioPlayer = ZUModule::createModule<ZUAudioPlayer>(fBroker, "ZUAudioPlayer", fTimeline,
                                                         options.soundsRoot);
    fServices.push_back(fAudioPlayer);
    fServices.push_back(
        ZUModule::createModule<ZURobotPosture>(fBroker, "ZURobotPosture", fTimeline));
    fServices.push_back(
        ZUModule::createModule<ZURobotModel>(fBroker, "ZURobotModel", options.robotType));
    fServices.push_back(
        ZUModule::createModule<ZUAutonomousMoves>(fBroker, "ZUAutonomousMoves", fTimeline));
    options.speech.timeline = fTimeline;
    fSpeech = ZUModule::createModule<ZUTextToSpeech>(fBroker, "ZUTextToSpeech", options.speech);
    fServices.push_back(fSpeech);
    fServices.push_back(ZUModule::createModule<ZUTimelineService>(
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
