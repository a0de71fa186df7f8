#pragma once
// Stand-ins for the robot's services that the body talk calls, for its tests: each records
// the calls it receives (method, arguments as ZUValues, time) and answers as the test set
// it up, at once. Calls arrive on the body talk's worker threads and the event loop; the
// test thread configures, reads and waits (every wait is bounded).

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "ko/session.hpp"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace bodytalktest {

inline constexpr std::chrono::milliseconds kBound{10000};

struct Call {
  std::string method;
  std::vector<ZU::ZUValue> args;
  std::chrono::steady_clock::time_point time;
};

class CallLog {
 public:
  void add(std::string method, std::vector<ZU::ZUValue> args);
  std::vector<Call> calls() const;
  std::vector<Call> calls(const std::string& method) const;
  std::size_t count(const std::string& method) const;
  // Waits at most `bound` until `count` calls of `method` have come.
  bool waitFor(const std::string& method, std::size_t count,
               std::chrono::milliseconds bound = kBound) const;

 private:
  mutable std::mutex fMutex;
  mutable std::condition_variable fAdded;
  std::vector<Call> fCalls;
};

class FakeMotion : public ZU::ZUModule {
 public:
  FakeMotion(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  ~FakeMotion() override;

  bool areResourcesAvailable(const ZU::ZUValue& resourceNames);
  std::vector<float> getAngles(const ZU::ZUValue& names, bool useSensors);
  // Posted: lasts `moveMs` unless its task is asked to stop.
  void angleInterpolationBezier(const ZU::ZUValue& jointNames, const ZU::ZUValue& times,
                                const ZU::ZUValue& controlPoints);
  void setAngles(const ZU::ZUValue& names, const ZU::ZUValue& angles, float fractionMaxSpeed);
  bool wait(int id, int timeoutPeriod) override;
  void stop(int id) override;

  std::atomic<bool> available{true};
  std::atomic<float> angle{0.0f};
  std::atomic<int> moveMs{0};
  std::atomic<bool> failGetAngles{false};
  CallLog log;
};

class FakeBehaviorManager : public ZU::ZUModule {
 public:
  FakeBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);

  bool preloadBehavior(const std::string& behavior);
  void startBehavior(const std::string& behavior);
  void stopBehavior(const std::string& behavior);

  // These raise a ZUError.
  void failStartOf(const std::string& behavior);
  void failPreloadOf(const std::string& behavior);
  // The behaviours started, in order.
  std::vector<std::string> started() const;
  CallLog log;

 private:
  mutable std::mutex fMutex;
  std::set<std::string> fFailStart;
  std::set<std::string> fFailPreload;
};

class FakeRobotModel : public ZU::ZUModule {
 public:
  FakeRobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                 int robotType);
  int _getRobotType() { return fRobotType; }

 private:
  const int fRobotType;
};

class FakeRobotPosture : public ZU::ZUModule {
 public:
  FakeRobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  std::string getPostureFamily();
  void setFamily(const std::string& family);
  std::atomic<bool> fail{false};

 private:
  std::mutex fMutex;
  std::string fFamily = "Standing";
};

class FakeMemory : public ZU::ZUModule {
 public:
  FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  void subscribeToEvent(const std::string& name, const std::string& callbackModule,
                        const std::string& callbackMethod);
  void unsubscribeToEvent(const std::string& name, const std::string& callbackModule);
  std::atomic<bool> fail{false};
  CallLog log;
};

// A process with the services that the body talk calls, under their robot names.
struct FakeRobot {
  explicit FakeRobot(int robotType = 1);
  ~FakeRobot();
  FakeRobot(const FakeRobot&) = delete;
  FakeRobot& operator=(const FakeRobot&) = delete;

  std::shared_ptr<ko::Session> session;
  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<FakeMemory> memory;
  std::shared_ptr<FakeMotion> motion;
  std::shared_ptr<FakeBehaviorManager> behaviors;
  std::shared_ptr<FakeRobotPosture> posture;
  std::shared_ptr<FakeRobotModel> model;
};

// The process's body talk for the life of the handle: taken with a time scale, released at
// the end (stopping it).
class BodyTalkHandle {
 public:
  BodyTalkHandle(const std::shared_ptr<ZU::ZUBroker>& broker, double timeScale);
  ~BodyTalkHandle();
  BodyTalkHandle(const BodyTalkHandle&) = delete;
  BodyTalkHandle& operator=(const BodyTalkHandle&) = delete;
  ZU::ZURobotBodyTalk* operator->() const { return fBodyTalk; }
  ZU::ZURobotBodyTalk& operator*() const { return *fBodyTalk; }

 private:
  ZU::ZURobotBodyTalk* fBodyTalk;
};

// The float that a table literal becomes.
inline double f32(double value) {
  return static_cast<double>(static_cast<float>(value));
}

}  // namespace bodytalktest
