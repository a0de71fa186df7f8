#include "cli_service.h"

#include <chrono>
#include <exception>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zuerror.h"
#include "zu/zumoduleentry.h"

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
  if (options.speech == "timing")
    host.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (options.fast)
    host.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  host.postureFamily = options.posture;
  try {
    fHost = std::make_unique<zefoko::Host>(std::move(host));
    const auto& broker = fHost->broker();
    ZU::createLibraryModule<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName);
    fService =
        std::dynamic_pointer_cast<ZU::ZUMokuto>(broker->getModuleByName(ZU::ZUMokuto::kModuleName));
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
