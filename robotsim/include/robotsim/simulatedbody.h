#pragma once
// SimulatedBody: the joints of the simulated upper body and the moves that drive them in
// real time. A motion thread of its own ticks while moves run (every 10 ms by default) and
// sleeps otherwise.
//
// A move owns the joints it drives; a later move that names one of them takes it over, and
// a move left without joints ends as interrupted. Angles always stay within the joint
// limits. Every function may be called from any thread. The end listener runs outside the
// body's lock, in the motion thread for a move that ends by itself and in the calling
// thread for a move that is stopped or taken over; it may call the body again. The angle
// sampler runs in the motion thread, outside the lock.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "robotsim/bezier.h"

namespace robotsim {

class SimulatedBody {
 public:
  using Clock = std::chrono::steady_clock;
  // (move id, interrupted): interrupted when stopped or left without joints.
  using MoveEndListener = std::function<void(int, bool)>;

  explicit SimulatedBody(std::chrono::microseconds tick = std::chrono::milliseconds(10));
  ~SimulatedBody();
  SimulatedBody(const SimulatedBody&) = delete;
  SimulatedBody& operator=(const SimulatedBody&) = delete;

  // Set before moves start.
  void setMoveEndListener(MoveEndListener listener);

  // (joint, angle) of the joints whose angle changed since the last sample.
  using AngleSampler = std::function<void(const std::vector<std::pair<std::size_t, double>>&)>;
  // While moves run, tells the joints that moved every `period`, and once more where the
  // moves leave them; null stops sampling.
  void setAngleSampler(std::chrono::microseconds period, AngleSampler sampler);

  // The current (commanded) angles of those joints.
  std::vector<double> angles(const std::vector<std::size_t>& joints) const;

  // Starts a Bezier move from the joints' current angles; the move lasts until its last key,
  // or `minDuration` seconds if that is longer (holding the joints meanwhile). Answers the
  // move id (positive).
  int startBezierMove(const std::vector<JointTrack>& tracks, double minDuration = 0);
  // Moves each joint towards its target at `fractionMaxSpeed` (0 to 1] of its maximum
  // speed; targets are clamped to the limits.
  int startSpeedMove(const std::vector<std::size_t>& joints, const std::vector<double>& targets,
                     double fractionMaxSpeed);

  // Waits at most `timeoutMs` (negative: no limit) for the end of the move; true when it
  // has ended (an unknown id has).
  bool waitMove(int id, int timeoutMs) const;
  // Ends the move at once, leaving its joints where they are; false when it was not running.
  bool stopMove(int id);
  void stopAllMoves();
  bool isMoveRunning(int id) const;
  // Whether a move holds one of these joints.
  bool isAnyJointHeld(const std::vector<std::size_t>& joints) const;

 private:
  struct Move {
    bool bezier = true;
    Clock::time_point start;
    double duration = 0;                        // Bezier: seconds
    std::map<std::size_t, BezierCurve> curves;  // Bezier: joint -> curve
    std::map<std::size_t, double> targets;      // speed: joint -> target
    double fraction = 1;                        // speed
    std::vector<std::size_t> joints;            // joints still owned
  };

  // With fMutex held: gives the joints to `id`, answering the moves left without joints.
  std::vector<int> xClaim(int id, const std::vector<std::size_t>& joints);
  // With fMutex held: removes the move and frees its joints.
  void xErase(int id);
  void xNotifyEnded(const std::vector<int>& ids, bool interrupted);
  void xRun();
  // With fMutex held by `lock` (released while the sampler runs): tells the joints that
  // moved, once a period has passed since the last sample or at once when `now` is set.
  void xSample(std::unique_lock<std::mutex>& lock, bool now);
  // With fMutex held: advances every move to `now`; answers the moves that finished.
  std::vector<int> xTick(Clock::time_point now);

  const std::chrono::microseconds fTick;
  MoveEndListener fListener;  // written before moves start

  mutable std::mutex fMutex;
  mutable std::condition_variable fWake;   // the motion thread: moves or quit
  mutable std::condition_variable fEnded;  // waiters of moves
  std::vector<double> fAngles;
  std::vector<int> fOwner;  // joint -> move id, 0 when free
  std::map<int, Move> fMoves;
  int fNextId = 1;
  Clock::time_point fLastTick;
  AngleSampler fSampler;
  std::chrono::microseconds fSamplePeriod{0};
  std::vector<double> fSampled;  // the angles told last
  Clock::time_point fLastSample;
  bool fQuit = false;
  std::thread fThread;
};

}  // namespace robotsim
