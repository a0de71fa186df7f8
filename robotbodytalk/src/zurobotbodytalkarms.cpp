#include "zurobotbodytalkarms.h"

#include <chrono>
#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkshuffle.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "robotbodytalk";

bool isFamily(PostureFamily family) {
  return family >= Standing && family <= Unknown;
}
}  // namespace

ZURobotBodyTalkArms::ZURobotBodyTalkArms(const std::shared_ptr<ZUBroker>& broker,
                                         std::shared_ptr<ZURobotBodyTalkPosture> posture,
                                         std::string partName, ZURobotBodyTalkTime time)
    : ZURobotBodyTalkBodyPart(std::move(posture)),
      fTime(time),
      fBehaviorManager(std::make_shared<ZUBehaviorManagerProxy>(broker)),
      fPartName(std::move(partName)) {}

ZURobotBodyTalkArms::~ZURobotBodyTalkArms() = default;

ZURobotBodyTalkArms::AnimationSet& ZURobotBodyTalkArms::xActiveSet() {
  const PostureFamily family = fPosture->getActivePostureFamily();
  return fSets[static_cast<std::size_t>(isFamily(family) ? family : Unknown)];
}

void ZURobotBodyTalkArms::xShuffle(AnimationSet& set) {
  bodyTalkShuffle(set.entries);
  fShuffleCount.fetch_add(1);
}

void ZURobotBodyTalkArms::setAnimations(const std::vector<std::string>& names,
                                        PostureFamily postureFamily) {
  if (!isFamily(postureFamily)) {
    KO_LOG_ERROR(kCategory) << "No animation set for the posture family " << postureFamily << " ("
                            << fPartName << " part)";
    return;
  }
  AnimationSet& set = fSets[static_cast<std::size_t>(postureFamily)];
  std::lock_guard lock(set.mutex);
  set.entries.clear();
  set.currentIndex = 0;
  for (const auto& name : names) {
    set.entries.push_back({name, preloadABehaviorAsync(fBehaviorManager, name)});
    set.entries.back().preload.wait(std::chrono::milliseconds(fTime.msOf(kPreloadWaitMs)));
  }
  xShuffle(set);
}

std::vector<std::string> ZURobotBodyTalkArms::getAnimations(PostureFamily postureFamily) const {
  if (!isFamily(postureFamily))
    return {};
  const AnimationSet& set = fSets[static_cast<std::size_t>(postureFamily)];
  std::lock_guard lock(set.mutex);
  std::vector<std::string> names;
  for (const auto& entry : set.entries)
    names.push_back(entry.name);
  return names;
}

void ZURobotBodyTalkArms::onBehaviorStopped(const std::string& name) {
  AnimationSet& set = xActiveSet();
  {
    std::lock_guard lock(set.mutex);
    if (set.currentBehavior.empty() || name != set.currentBehavior)
      return;
    set.stopSignalled = true;
  }
  set.stopped.notify_all();
}

std::string ZURobotBodyTalkArms::getName() const {
  return "Arms";
}

void ZURobotBodyTalkArms::doOneIteration() {
  std::size_t index = 0;
  try {
    if (fPosture->getActivePostureFamily() == Unknown) {
      fPosture->updateActivePostureFamily();
      if (fPosture->getActivePostureFamily() == Unknown) {
        fWhatToDoAfterIteration.store(kUnknownPosture);
        return;
      }
    }
    AnimationSet& set = xActiveSet();
    std::unique_lock lock(set.mutex);
    if (set.entries.empty()) {
      fWhatToDoAfterIteration.store(kNoAnimation);
      return;
    }
    index = set.currentIndex;
    set.entries[index].preload.wait(std::chrono::milliseconds(fTime.msOf(kPreloadWaitMs)));
    if (isRunning()) {
      const std::string name = set.entries[index].name;
      set.currentBehavior = name;
      set.stopSignalled = false;
      // The current behaviour is cleared however the wait ends.
      struct Clear {
        AnimationSet& set;
        ~Clear() { set.currentBehavior.clear(); }
      } clear{set};
      // The limit counts from the start request, however long the start takes.
      const auto deadline =
          std::chrono::steady_clock::now() + fTime.durationOf(kAnimationLimitSeconds);
      fBehaviorManager->startBehavior(name);
      if (!set.stopped.wait_until(lock, deadline, [&set] { return set.stopSignalled; })) {
        KO_LOG_ERROR(kCategory) << "Error: the bodytalk animation \"" << name
                                << "\" makes too much time to stop";
      }
    }
    fWhatToDoAfterIteration.store(kPlayed);
    lock.unlock();
    xAfterAnIteration();
  } catch (const ZUError& e) {
    fWhatToDoAfterIteration.store(kPlayed);
    fFailed.store(true);
    KO_LOG_WARNING(kCategory) << "Behavior " << index << " raised an "
                              << "exception: " << e.what();
  } catch (const std::exception& e) {
    fWhatToDoAfterIteration.store(kPlayed);
    fFailed.store(true);
    KO_LOG_ERROR(kCategory) << "Error caught running behavior " << index << ": " << e.what();
  }
}

void ZURobotBodyTalkArms::afterIteration() {
  xAfterAnIteration();
}

void ZURobotBodyTalkArms::xAfterAnIteration() {
  switch (fWhatToDoAfterIteration.load()) {
    case kPlayed: {
      AnimationSet& set = xActiveSet();
      std::lock_guard lock(set.mutex);
      if (set.currentIndex < set.entries.size()) {
        Entry& played = set.entries[set.currentIndex];
        played.preload = preloadABehaviorAsync(fBehaviorManager, played.name);
      }
      if (set.currentIndex + 1 < set.entries.size()) {
        ++set.currentIndex;
      } else {
        set.currentIndex = 0;
        xShuffle(set);
      }
      // After a failed start, rest before the next animation rather than spin.
      fPause.store(fFailed.exchange(false) ? 1 : 0);
      break;
    }
    case kUnknownPosture:
      KO_LOG_WARNING(kCategory) << "Cannot move the arms in that posture";
      fPause.store(1);
      break;
    case kNoAnimation:
      KO_LOG_WARNING(kCategory) << "No bodytalk animations found for the "
                                << postureFamilyToStr(fPosture->getActivePostureFamily())
                                << " posture and during the " << fPartName << " part.\n"
                                << "Please update your \"animations\" package.";
      fPause.store(1);
      break;
    default:
      KO_LOG_ERROR(kCategory) << "Impossible case: fWhatToDoAfterIteration is out of range";
      fPause.store(1);
      break;
  }
}

int ZURobotBodyTalkArms::getStartDelay() {
  return fPartName == kListening ? 1 : 0;
}

int ZURobotBodyTalkArms::getPause() {
  return fPause.load();
}

void ZURobotBodyTalkArms::stop() {
  AnimationSet& set = xActiveSet();
  std::string behavior;
  {
    std::lock_guard lock(set.mutex);
    if (set.currentBehavior.empty())
      return;
    behavior = set.currentBehavior;
    set.stopSignalled = true;
  }
  set.stopped.notify_all();
  try {
    fBehaviorManager->stopBehavior(behavior);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Error while stopping the behavior " << behavior << e.what();
  }
}

}  // namespace ZU
