#include "zu/zuserviceproxies.h"

#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "zu/zuerror.h"

namespace ZU {

bool preloadABehavior(const std::shared_ptr<ZUBehaviorManagerProxy>& behaviorManager,
                      const std::string& path) {
  try {
    if (!behaviorManager)
      ZU_THROW_ERROR("ZUProxy", "preloadBehavior", "module destroyed");
    return behaviorManager->preloadBehavior(path);
  } catch (const ZUError& e) {
    KO_LOG_WARNING("zucommon.zuproxy") << "ZUBehaviorManager can't preload the behavior \"" << path
                                       << "\" exception: " << e.what();
    return false;
  }
}

ko::Future<bool> preloadABehaviorAsync(std::shared_ptr<ZUBehaviorManagerProxy> behaviorManager,
                                       std::string path, std::shared_ptr<ko::EventLoop> loop) {
  try {
    if (!loop)
      loop = ko::getEventLoop();
    return loop->async([manager = std::move(behaviorManager), behavior = std::move(path)] {
      return preloadABehavior(manager, behavior);
    });
  } catch (const std::exception& e) {
    return ko::makeFutureError<bool>(e.what());
  }
}

}  // namespace ZU
