#pragma once
// Stand-ins for the robot's services that the body talk and the loader call, for their
// tests: each records the calls it receives (method, arguments as ZUValues, time) and
// answers as the test set it up, at once. Calls arrive on the body talk's worker threads,
// the event loop and the loader's thread; the test thread configures, reads and waits
// (every wait is bounded). Log lines are read from a ko::log::ScopedCapture.

#include <atomic>
#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
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

class CallLog : public ko::test::Recorded<Call> {
 public:
  void add(std::string method, std::vector<ZU::ZUValue> args) {
    Recorded::add({std::move(method), std::move(args), std::chrono::steady_clock::now()});
  }
  // Every call, or those of one method, in arrival order.
  std::vector<Call> calls(const std::string& method = "") const;
  std::size_t count(const std::string& method) const { return calls(method).size(); }
  // Waits (bounded) until `count` calls of `method` have come.
  bool waitFor(const std::string& method, std::size_t count) const {
    return ko::test::eventually([&] { return this->count(method) >= count; });
  }
};

// The lines of a capture with that category and level that contain `part`.
std::vector<ko::log::Record> linesOf(ko::log::ScopedCapture& log, std::string_view category,
                                     ko::log::Level level, std::string_view part = "");
// Waits (bounded) until `count` such lines have come.
inline bool waitForLines(ko::log::ScopedCapture& log, std::string_view category,
                         ko::log::Level level, std::string_view part, std::size_t count = 1) {
  return ko::test::eventually([&] { return linesOf(log, category, level, part).size() >= count; });
}

class FakeMotion : public ZU::ZUModule {
 public:
  FakeMotion(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);

  bool areResourcesAvailable(const ZU::ZUValue& resourceNames) {
    log.add("areResourcesAvailable", {resourceNames});
    return available.load();
  }
  std::vector<float> getAngles(const ZU::ZUValue& names, bool useSensors);
  // Posted: lasts `moveMs` unless its task is asked to stop.
  void angleInterpolationBezier(const ZU::ZUValue& jointNames, const ZU::ZUValue& times,
                                const ZU::ZUValue& controlPoints) {
    log.add("angleInterpolationBezier", {jointNames, times, controlPoints});
    if (const auto task = currentTask())
      task->waitForStopRequest(moveMs.load());
  }
  void setAngles(const ZU::ZUValue& names, const ZU::ZUValue& angles, float fractionMaxSpeed) {
    log.add("setAngles", {names, angles, fractionMaxSpeed});
  }
  bool wait(int id, int timeoutPeriod) override {
    log.add("wait", {id, timeoutPeriod});
    return ZU::ZUModule::wait(id, timeoutPeriod);
  }
  void stop(int id) override {
    log.add("stop", {id});
    ZU::ZUModule::stop(id);
  }

  std::atomic<bool> available{true};
  std::atomic<float> angle{0.0f};
  std::atomic<int> moveMs{0};
  std::atomic<bool> failGetAngles{false};
  CallLog log;
};

// A behaviour manager over a library that the test sets (path to tags).
class FakeBehaviorManager : public ZU::ZUModule {
 public:
  FakeBehaviorManager(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);

  std::vector<std::string> getInstalledBehaviors();
  // Runs `onTagQuery` first.
  std::vector<std::string> getBehaviorTags(const std::string& behavior);
  // The path itself when it is in the library; "" otherwise.
  std::string resolveBehaviorName(const std::string& name) {
    std::lock_guard lock(fMutex);
    return fLibrary.count(name) ? name : "";
  }
  bool preloadBehavior(const std::string& behavior) {
    log.add("preloadBehavior", {behavior});
    xFailIfAsked("preloadBehavior", behavior);
    return true;
  }
  void startBehavior(const std::string& behavior) {
    xFailIfAsked("startBehavior", behavior);
    log.add("startBehavior", {behavior});
  }
  void stopBehavior(const std::string& behavior) { log.add("stopBehavior", {behavior}); }

  void setLibrary(std::map<std::string, std::vector<std::string>> library) {
    std::lock_guard lock(fMutex);
    fLibrary = std::move(library);
  }
  // That method raises a ZUError for that behaviour ("" for getInstalledBehaviors).
  void failOn(const std::string& method, const std::string& behavior) {
    std::lock_guard lock(fMutex);
    fFailing.insert({method, behavior});
  }
  void setTagQueryHook(std::function<void(const std::string&)> hook) {
    std::lock_guard lock(fMutex);
    fTagQueryHook = std::move(hook);
  }
  // The behaviours of that method's calls, in order (startBehavior: the starts that
  // succeeded).
  std::vector<std::string> behaviorsOf(const std::string& method) const;
  std::vector<std::string> started() const { return behaviorsOf("startBehavior"); }
  CallLog log;

 private:
  void xFailIfAsked(const std::string& method, const std::string& behavior);

  mutable std::mutex fMutex;
  std::map<std::string, std::vector<std::string>> fLibrary;
  std::set<std::pair<std::string, std::string>> fFailing;
  std::function<void(const std::string&)> fTagQueryHook;
};

// A robot of type 1.
class FakeRobotModel : public ZU::ZUModule {
 public:
  FakeRobotModel(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  int _getRobotType() { return 1; }
};

class FakeRobotPosture : public ZU::ZUModule {
 public:
  FakeRobotPosture(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  std::string getPostureFamily();
  void setFamily(const std::string& family) {
    std::lock_guard lock(fMutex);
    fFamily = family;
  }
  std::atomic<bool> fail{false};

 private:
  std::mutex fMutex;
  std::string fFamily = "Standing";
};

class FakeMemory : public ZU::ZUModule {
 public:
  FakeMemory(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  void declareEvent(const std::string& key, const std::string& module) {
    log.add("declareEvent", {key, module});
  }
  void subscribeToEvent(const std::string& name, const std::string& callbackModule,
                        const std::string& callbackMethod);
  void unsubscribeToEvent(const std::string& name, const std::string& callbackModule);
  std::atomic<bool> fail{false};
  CallLog log;
};

// A process with these services under their robot names.
struct FakeRobot {
  FakeRobot();
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
  BodyTalkHandle(const std::shared_ptr<ZU::ZUBroker>& broker, double timeScale)
      : fBodyTalk(ZU::ZURobotBodyTalk::getInstance(broker, {timeScale, nullptr})) {}
  ~BodyTalkHandle() { ZU::ZURobotBodyTalk::releaseInstance(); }
  BodyTalkHandle(const BodyTalkHandle&) = delete;
  BodyTalkHandle& operator=(const BodyTalkHandle&) = delete;
  ZU::ZURobotBodyTalk* operator->() const { return fBodyTalk; }
  ZU::ZURobotBodyTalk& operator*() const { return *fBodyTalk; }

 private:
  ZU::ZURobotBodyTalk* fBodyTalk;
};

// The fake robot, a capture of every log line and the body talk on that robot, its posture
// watcher started: what most body talk tests begin with.
struct BodyTalkOnFakeRobot {
  explicit BodyTalkOnFakeRobot(double timeScale) : bodyTalk(robot.broker, timeScale) {
    bodyTalk->getPosture()->init();
  }
  FakeRobot robot;
  ko::log::ScopedCapture log;
  BodyTalkHandle bodyTalk;
};

}  // namespace bodytalktest
