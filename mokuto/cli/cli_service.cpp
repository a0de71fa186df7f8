#include "cli_service.h"

#include <chrono>
#include <exception>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zubroker.h"
#include "zu/zuerror.h"

namespace mokuto::cli {

namespace {

// Generous: the starter library is indexed in milliseconds, a large one in seconds.
constexpr std::chrono::milliseconds kIndexBound{60'000};

}  // namespace

EmbeddedService::EmbeddedService(const EmbeddedServiceOptions& options) {
  // As in the service's host: the allocator keeps the memory it frees.
  ko::os::keepFreedMemory();
  zefoko::HostOptions host;
  host.robot.speech.language = options.language;
  host.robot.speech.recordAudio = options.recordAudio;
  host.robot.angleSamplesPerSecond = options.angleSamplesPerSecond;
  if (options.speech == "timing")
    host.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (options.fast)
    host.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  host.postureFamily = options.posture;
  try {
    fHost = std::make_unique<zefoko::Host>(std::move(host));
    // As the module library's _createModule does, with the stage hook.
    const auto& broker = fHost->broker();
    ZU::ZUBrokerManager::setInstance(broker->getBrokerManager());
    broker->getBrokerManager()->addBroker(broker);
    ZU::ZUMokutoOptions moduleOptions;
    moduleOptions.onStage = [hook = fStageHook](ZU::ZUMokutoStage stage, ZU::MKID id) {
      StageObserver observer;
      {
        std::lock_guard lock(hook->mutex);
        observer = hook->observer;
      }
      if (observer)
        observer(stage, id);
    };
    fService = ZU::ZUModule::createModule<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName,
                                                        std::move(moduleOptions));
  } catch (const ZU::ZUError& e) {
    throw ServiceError(e.description());
  } catch (const std::exception& e) {
    throw ServiceError(e.what());
  }
  if (!fService)
    throw ServiceError("the module ZUMokuto was not registered");
  if (!fService->waitForIndex(kIndexBound))
    throw ServiceError("the animation index was not built within 60 s");
}

void EmbeddedService::setStageObserver(StageObserver observer) {
  std::lock_guard lock(fStageHook->mutex);
  fStageHook->observer = std::move(observer);
}

EmbeddedService::~EmbeddedService() {
  if (fService) {
    try {
      fService->exit();
    } catch (const std::exception& e) {
      KO_LOG_ERROR("mokuto.cli") << "ZUMokuto failed to exit: " << e.what();
    }
    fService.reset();
  }
  if (fHost)
    fHost->shutdown();
}

}  // namespace mokuto::cli
