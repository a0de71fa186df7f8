#pragma once
// ZURobotBodyTalkBodyPart: what a body talk worker drives, one gesture per iteration (the
// head's moves, the arms' animations).
//
// Threads: doOneIteration, afterIteration and getPause run on the worker's task thread;
// getStartDelay and getPause also on the thread that starts the worker, while the task is
// stopped; stop and onBehaviorStopped on the threads that stop the body talk or forward a
// notification, while an iteration may run. The `running` flag is written by the worker
// (set on start, cleared by a stop request) and read by the part during its iteration.

#include <atomic>
#include <memory>
#include <string>

namespace ZU {

class ZURobotBodyTalkPosture;

class ZURobotBodyTalkBodyPart {
 public:
  explicit ZURobotBodyTalkBodyPart(std::shared_ptr<ZURobotBodyTalkPosture> posture)
      : fPosture(std::move(posture)) {}
  virtual ~ZURobotBodyTalkBodyPart() = default;
  ZURobotBodyTalkBodyPart(const ZURobotBodyTalkBodyPart&) = delete;
  ZURobotBodyTalkBodyPart& operator=(const ZURobotBodyTalkBodyPart&) = delete;

  virtual void onBehaviorStopped(const std::string& name) = 0;
  virtual std::string getName() const = 0;
  virtual void doOneIteration() = 0;
  virtual void afterIteration() = 0;
  // Seconds before the first iteration; below 1, the first comes at once.
  virtual int getStartDelay() = 0;
  // Seconds to rest after an iteration; 0 goes straight on.
  virtual int getPause() = 0;
  // Ends the gesture in progress.
  virtual void stop() = 0;

  bool isRunning() const noexcept { return fRunning.load(); }
  void setRunning(bool running) noexcept { fRunning.store(running); }

 protected:
  const std::shared_ptr<ZURobotBodyTalkPosture> fPosture;

 private:
  std::atomic<bool> fRunning{false};
};

}  // namespace ZU
