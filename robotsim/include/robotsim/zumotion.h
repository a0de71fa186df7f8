#pragma once
// ZUMotion: the motion service of the simulated robot, a humanoid upper body (head, two
// arms with wrists and hands) whose joints move in real time within their limits.
//
// Calls arrive on ko threads, several at once; posted calls run on the module's own event
// loop; the body's motion thread ticks the moves and reports their ends. The module's
// tables (posted moves, breathing) are guarded by its own mutex; the body by its own.
//
// Besides the robot's public methods it publishes, for the behaviour manager, moves that
// start at once and answer an id ("_startBezierMove", "_stopMove", "_isMoveRunning") and
// the signal "moveEnded"(move id, interrupted), triggered outside every lock in the thread
// that ended the move.

#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/signal.hpp"
#include "robotsim/bezier.h"
#include "robotsim/simulatedbody.h"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"

namespace robotsim {

class ZUMotion : public ZU::ZUModule {
 public:
  // `timeline` may be null (nothing is recorded).
  ZUMotion(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
           std::shared_ptr<Timeline> timeline = nullptr);
  ~ZUMotion() override;

  // ---- bound methods ----
  // `names`: a joint or chain name, or a list of them. The simulated sensors read the
  // commanded angles.
  std::vector<float> getAngles(const ko::AnyValue& names, bool useSensors);
  // Moves the joints towards `angles` (one per joint, or one for all) at that fraction of
  // their maximum speed and returns at once.
  void setAngles(const ko::AnyValue& names, const ko::AnyValue& angles, float fractionMaxSpeed);
  // Plays Bezier keys from the joints' current angles and returns at the end of the move;
  // posted, it is a task that stop(id) ends at once.
  void angleInterpolationBezier(const ko::AnyValue& jointNames, const ko::AnyValue& times,
                                const ko::AnyValue& controlPoints);
  // False while a move (a behaviour's included) holds a joint of one of the named joints
  // or chains.
  bool areResourcesAvailable(const ko::AnyValue& resourceNames);
  // Chains "Head", "LArm", "RArm", "Arms" (both arms) and "Body" (all three).
  bool getBreathEnabled(const std::string& chainName);
  void setBreathEnabled(const std::string& chainName, bool isEnabled);
  // Stops the posted call `id`; a posted move ends at once where the joints stand.
  void stop(int id) override;
  // Ends every move where the joints stand, then the module's service.
  void exit() override;

  // ---- for the behaviour manager ----
  // Starts a Bezier move and answers its id at once; the move holds its joints for at least
  // `minDuration` seconds.
  int _startBezierMove(const ko::AnyValue& jointNames, const ko::AnyValue& times,
                       const ko::AnyValue& controlPoints, float minDuration);
  // False when the move was not running.
  bool _stopMove(int moveId);
  bool _isMoveRunning(int moveId);

  // ---- for the readers of the timeline ----
  // Records the angles of the joints that move, `perSecond` times a second while moves run
  // and where they leave the joints, as "angles" entries {joint name: radians}; 0 stops.
  void sampleAngles(double perSecond);
  // Records every joint's angle now as one "angles" entry.
  void recordPose();

 private:
  void xBindMethods();
  void xOnMoveEnded(int moveId, bool interrupted);
  // Logs one warning per joint whose keys go beyond its limits (they will be clamped).
  void xWarnBeyondLimits(const std::string& method, const std::vector<JointTrack>& tracks);
  void xRecord(const std::string& operation, ko::AnyValue arguments, ko::AnyValue result = {});
  void xRecordAngles(const std::vector<std::pair<std::size_t, double>>& angles);
  // The breathing chains named by a chain name; raises ZUError for another name.
  std::vector<std::string> xBreathChains(const std::string& method, const std::string& chain);

  const std::shared_ptr<Timeline> fTimeline;
  ko::Signal<int, bool>* fMoveEnded = nullptr;

  std::mutex fMutex;
  std::map<int, int> fTaskMoves;  // posted call id -> move id
  std::map<std::string, bool> fBreath;

  // Last, so that its motion thread ends before the members that its listener uses.
  SimulatedBody fBody;
};

}  // namespace robotsim
