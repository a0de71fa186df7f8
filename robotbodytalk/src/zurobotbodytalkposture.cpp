#include "robotbodytalk/zurobotbodytalkposture.h"

#include <exception>

#include "ko/log.hpp"
#include "zu/zubroker.h"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "robotbodytalk.posture";
}  // namespace

ZURobotBodyTalkPosture::ZURobotBodyTalkPosture(const std::shared_ptr<ZUBroker>& broker)
    : fBroker(broker) {}

void ZURobotBodyTalkPosture::init() {
  const auto broker = fBroker.lock();
  try {
    ZUMemoryProxy(broker).subscribeToEvent(kEventName, kModuleName, kCallbackName);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot subscribe to event " << kEventName << ": " << e.what();
  }
  try {
    const PostureFamily family =
        postureFamilyFromStr(ZURobotPostureProxy(broker).getPostureFamily());
    fLatest.store(family);
    fActive.store(family);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZURobotPosture.getPostureFamily() has thrown an exception: "
                            << e.what();
  }
}

void ZURobotBodyTalkPosture::exit() {
  try {
    ZUMemoryProxy(fBroker.lock()).unsubscribeToEvent(kEventName, kModuleName);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot unsubscribe to event " << kEventName << ": " << e.what();
  }
}

void ZURobotBodyTalkPosture::setPostureFamily(PostureFamily family) noexcept {
  fLatest.store(family >= Standing && family <= Unknown ? family : Unknown);
}

PostureFamily ZURobotBodyTalkPosture::getPostureFamily() const noexcept {
  return fLatest.load();
}

void ZURobotBodyTalkPosture::updateActivePostureFamily() noexcept {
  fActive.store(fLatest.load());
}

PostureFamily ZURobotBodyTalkPosture::getActivePostureFamily() const noexcept {
  return fActive.load();
}

}  // namespace ZU
