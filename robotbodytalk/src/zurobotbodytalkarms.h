#pragma once
// The arms of the body talk: short arm animations, installed behaviours chosen in turn
// from a shuffled list per posture family, played one after the other. The controller owns
// two of them, the part named "speaking" and the part named "listening".
//
// Threads: doOneIteration and xAfterAnIteration run on the arms worker's task thread;
// onBehaviorStopped on the thread that forwards the behaviour manager's notifications;
// stop on the thread that stops the body talk; setAnimations on the loader's thread. They
// meet on the lock of the animation set; the wait for the end of an animation releases
// it, so that notifications and stops get through meanwhile. The preloads run as jobs of
// the process-wide event loop.

#include <array>
#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "ko/future.hpp"
#include "zu/enums.h"
#include "zurobotbodytalkbodypart.h"
#include "zurobotbodytalktime.h"

namespace ZU {

class ZUBroker;
class ZUBehaviorManagerProxy;

class ZURobotBodyTalkArms : public ZURobotBodyTalkBodyPart {
 public:
  static constexpr const char* kSpeaking = "speaking";
  static constexpr const char* kListening = "listening";
  static constexpr int kPreloadWaitMs = 1000;
  static constexpr double kAnimationLimitSeconds = 10.0;

  // What the last iteration did, which decides what comes after it.
  enum : std::int32_t {
    kPlayed = 0,
    kUnknownPosture = 1,
    kNoAnimation = 2,
  };

  // Creates the ZUBehaviorManager proxy (raises ZUError when the service cannot be found).
  ZURobotBodyTalkArms(const std::shared_ptr<ZUBroker>& broker,
                      std::shared_ptr<ZURobotBodyTalkPosture> posture, std::string partName,
                      ZURobotBodyTalkTime time);
  ~ZURobotBodyTalkArms() override;

  // Replaces the animations of a posture family: each is preloaded (waiting at most 1 s
  // for each), then the list is shuffled. A family outside the enumeration is logged and
  // ignored.
  void setAnimations(const std::vector<std::string>& names, PostureFamily postureFamily);
  // The animations of a posture family in their current order.
  std::vector<std::string> getAnimations(PostureFamily postureFamily) const;

  void onBehaviorStopped(const std::string& name) override;
  std::string getName() const override;
  void doOneIteration() override;
  void afterIteration() override;
  // 1 for the listening part, 0 for the speaking one.
  int getStartDelay() override;
  int getPause() override;
  void stop() override;

  const std::string& getPartName() const noexcept { return fPartName; }
  // How many times a list was shuffled, setAnimations included.
  std::uint64_t getShuffleCount() const noexcept { return fShuffleCount.load(); }

 private:
  struct Entry {
    std::string name;
    ko::Future<bool> preload;
  };
  struct AnimationSet {
    mutable std::mutex mutex;
    std::condition_variable stopped;
    bool stopSignalled = false;  // with `stopped`: the awaited behaviour has stopped
    std::size_t currentIndex = 0;
    std::string currentBehavior;
    std::vector<Entry> entries;
  };

  AnimationSet& xActiveSet();
  // With the set's lock held.
  void xShuffle(AnimationSet& set);
  void xAfterAnIteration();

  const ZURobotBodyTalkTime fTime;
  const std::shared_ptr<ZUBehaviorManagerProxy> fBehaviorManager;
  const std::string fPartName;
  std::array<AnimationSet, 4> fSets;
  std::atomic<std::int32_t> fWhatToDoAfterIteration{kPlayed};
  std::atomic<std::int32_t> fPause{0};
  // The last iteration failed with an exception: the next one comes after a rest.
  std::atomic<bool> fFailed{false};
  std::atomic<std::uint64_t> fShuffleCount{0};
};

}  // namespace ZU
