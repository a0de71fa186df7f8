#include "zu/zuserviceproxies.h"

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

}  // namespace ZU
