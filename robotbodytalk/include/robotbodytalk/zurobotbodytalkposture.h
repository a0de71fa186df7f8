#pragma once
// ZURobotBodyTalkPosture: the robot's posture family as the body talk and the module see
// it. It keeps two values: the latest family that the posture service reported, and the
// active family that the head and arms use, which follows the latest one only when the
// body talk starts or resumes (or when the arms find it unknown), so that a body talk in
// progress keeps the animations of the posture it began in.
//
// Threads: init() and exit() run on the module's thread; setPostureFamily() on the memory
// service's delivery thread; the readers on the body talk workers and the say pipeline;
// updateActivePostureFamily() on the thread that starts or resumes the body talk and on
// the arms worker. Each family is one atomic word, read and written whole, without a lock.

#include <atomic>
#include <memory>

#include "zu/enums.h"

namespace ZU {

class ZUBroker;

class ZURobotBodyTalkPosture {
 public:
  static constexpr const char* kEventName = "PostureFamilyChanged";
  static constexpr const char* kModuleName = "ZUMokuto";
  static constexpr const char* kCallbackName = "_postureFamilyChangedCallback";

  // Both families start Unknown. The broker is held weakly; the services are looked up by
  // init() and exit().
  explicit ZURobotBodyTalkPosture(const std::shared_ptr<ZUBroker>& broker);
  ZURobotBodyTalkPosture(const ZURobotBodyTalkPosture&) = delete;
  ZURobotBodyTalkPosture& operator=(const ZURobotBodyTalkPosture&) = delete;

  // Subscribes the module "ZUMokuto" to "PostureFamilyChanged", then sets both families
  // from the posture service. Each failure is logged and the rest goes on.
  void init();
  // Ends the subscription; a failure is logged.
  void exit();

  // A value outside the enumeration is taken as Unknown.
  void setPostureFamily(PostureFamily family) noexcept;
  PostureFamily getPostureFamily() const noexcept;
  // The active family takes the latest one.
  void updateActivePostureFamily() noexcept;
  PostureFamily getActivePostureFamily() const noexcept;

 private:
  const std::weak_ptr<ZUBroker> fBroker;
  std::atomic<PostureFamily> fLatest{Unknown};
  std::atomic<PostureFamily> fActive{Unknown};
};

}  // namespace ZU
