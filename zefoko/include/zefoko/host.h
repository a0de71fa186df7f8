#pragma once
// Host: a process of the robot. It starts the simulated robot's services on one broker,
// loads module libraries into the process (each makes its modules with `_createModule` on
// that broker) and, at the end, has every loaded module exit, closes the libraries'
// modules with `_closeModule`, then stops the robot's services.
//
// Built, used and destroyed by one thread (the process's main thread); the services and
// modules it hosts serve any thread. The libraries stay loaded until the process ends: a
// module that another thread still holds may be destroyed after the shutdown, and its
// code must still be there.

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "robotsim/robot.h"
#include "zu/zubroker.h"

namespace zefoko {

// A library that cannot be loaded or whose module cannot be made.
class HostError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct HostOptions {
  robotsim::RobotOptions robot;
  // "Standing", "Sitting" or "SittingOnChair"; empty keeps the robot's own.
  std::string postureFamily;
};

class Host {
 public:
  // Raises ZUError when a service of the robot cannot start, HostError for a bad posture.
  explicit Host(HostOptions options = {});
  // As shutdown().
  ~Host();
  Host(const Host&) = delete;
  Host& operator=(const Host&) = delete;

  robotsim::Robot& robot() noexcept { return *fRobot; }
  const std::shared_ptr<ZU::ZUBroker>& broker() const noexcept { return fRobot->broker(); }

  // Loads the module library at `path` and calls its `_createModule` with the broker.
  // Raises HostError when the library cannot be loaded, lacks an entry point, or its
  // `_createModule` fails or answers other than 0. Answers the names of the modules that
  // the library registered.
  std::vector<std::string> loadModuleLibrary(const std::string& path);
  // The modules registered by the libraries, in load order.
  std::vector<std::string> moduleNames() const;

  // Has every module of the libraries exit (the last loaded first) and calls each
  // library's `_closeModule`, then has the robot's services exit. Failures are logged.
  // Idempotent.
  void shutdown() noexcept;

 private:
  struct Library {
    std::string path;
    void* handle = nullptr;
    std::vector<std::string> modules;
  };

  std::unique_ptr<robotsim::Robot> fRobot;
  std::vector<Library> fLibraries;
};

}  // namespace zefoko
