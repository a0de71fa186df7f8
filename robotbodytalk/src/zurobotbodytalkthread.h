#pragma once
// ZURobotBodyTalkThread: a worker of the body talk. A periodic task repeats the gesture of
// one body part: iteration after iteration while the part's pause is 0, then a rest of
// that many seconds before the next run of the task.
//
// Threads: the callback runs on a thread of the task's event loop (one run at a time,
// under the iteration lock); setBodyPart, start, requestStop, stop and
// notifyBehaviorStopped come from the controller's callers, serialised by the controller.
// The part lock is shared everywhere but in setBodyPart, so a stop request or a
// notification reaches the part while an iteration runs.

#include <memory>
#include <mutex>
#include <shared_mutex>
#include <string>

#include "ko/eventloop.hpp"
#include "ko/periodictask.hpp"
#include "zurobotbodytalktime.h"

namespace ZU {

class ZURobotBodyTalkBodyPart;

class ZURobotBodyTalkThread : public ko::PeriodicTask {
 public:
  static constexpr const char* kNameWithoutPart = "BodyTalk loop without body part set";
  static constexpr const char* kNamePrefix = "BodyTalk loop of the ";

  ZURobotBodyTalkThread(std::shared_ptr<ko::EventLoop> loop, ZURobotBodyTalkTime time);
  // Clears the running flag of the attached part (without calling its stop) and stops the
  // task.
  ~ZURobotBodyTalkThread() override;

  // Attaches a part (not owned; nullptr detaches) and renames the task after it.
  void setBodyPart(ZURobotBodyTalkBodyPart* part);
  ZURobotBodyTalkBodyPart* getBodyPart() const;

  // Starts the attached part unless it runs: at once when its start delay is below 1 s,
  // otherwise after that delay.
  void start();
  // Clears the part's running flag and stops its gesture in progress; the loop ends after
  // the current iteration.
  void requestStop();
  // Stops the task, waiting for a running iteration to end.
  void stop();
  // Hands a behaviour-stopped notification to the part.
  void notifyBehaviorStopped(const std::string& name);

 private:
  void xLoop();

  const ZURobotBodyTalkTime fTime;
  std::mutex fIterationMutex;
  std::mutex fControlMutex;
  mutable std::shared_mutex fPartMutex;
  ZURobotBodyTalkBodyPart* fPart = nullptr;
};

}  // namespace ZU
