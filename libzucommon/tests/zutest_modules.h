#pragma once
// Modules and helpers shared by the module-layer tests. Every wait is bounded.

#include <atomic>
#include <functional>
#include <memory>
#include <string>

#include "ko/anyvalue.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace zutest {

inline constexpr int kBoundMs = 10000;
using ko::test::Gate;

// A session with its broker, as a process of the robot has them.
struct Process {
  std::shared_ptr<ko::Session> session = std::make_shared<ko::Session>();
  std::shared_ptr<ZU::ZUBroker> broker =
      ZU::ZUBroker::create(session, "TestBroker", std::make_shared<ZU::ZUBrokerManager>());
};

// The description of the ZUError that f raises; "<no error>" when it raises none.
inline std::string errorOf(const std::function<void()>& f) {
  try {
    f();
  } catch (const ZU::ZUError& e) {
    return e.description();
  }
  return "<no error>";
}

// A module with methods of each kind: overloads, ZUValue in and out, a failure, and two
// methods that block until the test lets them go (for posted calls).
class Greeter : public ZU::ZUModule {
 public:
  Greeter(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZUModule(broker, name) {
    setModuleDescription("A module of the tests.");
    const ZU::ZUMethodParameter text{"text", "The text to say."};
    bindMethods(
        "Greeter",
        {{"say", ZU::overload<void(const std::string&)>(&Greeter::say), "Says a text.", {text}},
         {"say",
          ZU::overload<void(const std::string&, const ZU::ZUValue&)>(&Greeter::say),
          "Says a text with a configuration.",
          {text, {"configuration", "The configuration."}}},
         {"echo",
          &Greeter::echo,
          "Answers its argument.",
          {{"value", "Any value."}},
          {"echoed", "The same value."}},
         {"add",
          &Greeter::add,
          "Adds two integers.",
          {{"a", "First."}, {"b", "Second."}},
          {"sum", "a + b"}},
         {"fail", &Greeter::fail, "Always fails."},
         {"waitForRelease", &Greeter::waitForRelease, "Blocks until the test releases it."},
         {"waitForStop", &Greeter::waitForStop, "Blocks until its task is asked to stop."}});
  }

  void say(const std::string& text) { said.add(text); }
  void say(const std::string& text, const ZU::ZUValue& configuration) {
    said.add(text + " with " + configuration.toString(1));
  }
  ZU::ZUValue echo(const ZU::ZUValue& value) { return value; }
  int add(int a, int b) const { return a + b; }
  void fail() { ZU_THROW_ERROR("Greeter", "fail", "engine overheated"); }

  int waitForRelease() {
    started.open();
    release.wait();
    const auto task = currentTask();
    return task ? task->id() : -1;
  }
  bool waitForStop() {
    const auto task = currentTask();
    taskId = task ? task->id() : -1;
    started.open();
    stopSeen = task && task->waitForStopRequest(kBoundMs);
    return stopSeen;
  }

  Gate started;
  Gate release;
  std::atomic<int> taskId{-2};
  std::atomic<bool> stopSeen{false};
  ko::test::Recorded<std::string> said;
};

}  // namespace zutest
