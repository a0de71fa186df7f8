#pragma once
// The head of the body talk: small gestures of one head joint, each a short Bezier move
// given relative to where the joint stands when it starts, after which the joint is put
// back where it was. ZURobotBodyTalkHeadSpeaking and ZURobotBodyTalkHeadListening differ
// only in their move tables and start delay.
//
// Threads: doOneIteration, afterIteration and getPause run on the head worker's task
// thread, which alone touches the move list and its index; stop runs on the thread that
// stops the body talk and touches only the id of the move in progress (atomic) and the
// motion service.

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "zu/zuvalue.h"
#include "zurobotbodytalkbodypart.h"
#include "zurobotbodytalktime.h"

namespace ZU {

class ZUBroker;
class ZUMotionProxy;

// One gesture: the joints it moves, and per joint the key times (seconds) and the keys
// [angle, [3, dTime, dAngle], [3, dTime, dAngle]] with angles relative to the start.
struct ZURobotBodyTalkHeadMove {
  ZUValue names;
  ZUValue times;
  ZUValue keys;
};

class ZURobotBodyTalkHead : public ZURobotBodyTalkBodyPart {
 public:
  static constexpr int kMoveLimitMs = 10000;

  // Creates the ZUMotion proxy (raises ZUError when the service cannot be found).
  ZURobotBodyTalkHead(const std::shared_ptr<ZUBroker>& broker,
                      std::shared_ptr<ZURobotBodyTalkPosture> posture, ZURobotBodyTalkTime time,
                      std::vector<ZURobotBodyTalkHeadMove> moves);
  ~ZURobotBodyTalkHead() override;

  void onBehaviorStopped(const std::string& name) override;
  std::string getName() const override;
  void doOneIteration() override;
  // The next move; after the last one, the list is shuffled and starts again.
  void afterIteration() override;
  int getPause() override;
  void stop() override;

  // The moves in their current order (for diagnosis and tests; not while an iteration
  // runs).
  const std::vector<ZURobotBodyTalkHeadMove>& getMoves() const noexcept { return fMoves; }
  std::size_t getCurrentMove() const noexcept { return fCurrentMove; }
  std::uint64_t getShuffleCount() const noexcept { return fShuffleCount.load(); }

 private:
  // Stops the move in progress, if any.
  void xStopMove();

  const ZURobotBodyTalkTime fTime;
  const std::shared_ptr<ZUMotionProxy> fMotion;
  const std::vector<std::string> fResources{"Head"};
  std::vector<ZURobotBodyTalkHeadMove> fMoves;
  std::size_t fCurrentMove = 0;
  std::atomic<int> fMotionTask{-1};
  std::atomic<std::uint64_t> fShuffleCount{0};
};

class ZURobotBodyTalkHeadSpeaking : public ZURobotBodyTalkHead {
 public:
  ZURobotBodyTalkHeadSpeaking(const std::shared_ptr<ZUBroker>& broker,
                              std::shared_ptr<ZURobotBodyTalkPosture> posture,
                              ZURobotBodyTalkTime time);
  // The first move comes at once.
  int getStartDelay() override;

  static std::vector<ZURobotBodyTalkHeadMove> makeMoves();
};

class ZURobotBodyTalkHeadListening : public ZURobotBodyTalkHead {
 public:
  // The moves depend on the robot type: one table for 0, another for the others.
  ZURobotBodyTalkHeadListening(const std::shared_ptr<ZUBroker>& broker,
                               std::shared_ptr<ZURobotBodyTalkPosture> posture,
                               ZURobotBodyTalkTime time, int robotType);
  // 1 to 5 s.
  int getStartDelay() override;

  static std::vector<ZURobotBodyTalkHeadMove> makeMoves(int robotType);
};

}  // namespace ZU
