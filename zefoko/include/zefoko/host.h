#pragma once
// Host: a process of the robot. It starts the simulated robot's services on one broker,
// loads module libraries into the process (each makes its modules with `_createModule` on
// that broker) and, at the end, has every loaded module exit, closes the libraries'
// modules with `_closeModule`, then stops the robot's services.
//
// Its session may link it with other processes (ko/remote.hpp): listening, the robot and
// the modules are reachable by the processes that connect; connecting, the host has no
// robot of its own and its modules use the services of the listening process, and are made
// again (exit, `_closeModule`, `_createModule`) when that process comes back after it went
// away, since a module is made for the services it found when it was made.
//
// Built, used and destroyed by one thread (the process's main thread); the services and
// modules it hosts serve any thread. The libraries stay loaded until the process ends: a
// module that another thread still holds may be destroyed after the shutdown, and its
// code must still be there.

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "ko/remote.hpp"
#include "ko/session.hpp"
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
  // At most one: the endpoint to listen on, or the one of the robot's process.
  std::string listen;
  std::string connect;
  ko::RemoteOptions remote;
};

class Host {
 public:
  // Raises ZUError when a service of the robot cannot start, HostError for a bad posture or
  // an endpoint that cannot be used.
  explicit Host(HostOptions options = {});
  // As shutdown().
  ~Host();
  Host(const Host&) = delete;
  Host& operator=(const Host&) = delete;

  // Raises HostError for a host whose robot is another process's.
  robotsim::Robot& robot();
  bool hasRobot() const noexcept { return fRobot != nullptr; }
  const std::shared_ptr<ZU::ZUBroker>& broker() const noexcept { return fBroker; }
  const std::shared_ptr<ko::Session>& session() const noexcept { return fSession; }
  // The endpoint listened on (the port chosen for "tcp://host:*") or connected to; empty
  // for a host that is not linked.
  const std::string& endpoint() const noexcept { return fEndpoint; }

  // Loads the module library at `path` and calls its `_createModule` with the broker.
  // Raises HostError when the library cannot be loaded, lacks an entry point, or its
  // `_createModule` fails or answers other than 0. Answers the names of the modules that
  // the library registered.
  std::vector<std::string> loadModuleLibrary(const std::string& path);
  // The modules registered by the libraries, in load order.
  std::vector<std::string> moduleNames() const;
  // Makes the libraries' modules again: each exits and its library's `_closeModule` runs,
  // then its `_createModule`. Failures are logged; answers whether every library made its
  // modules again.
  bool reloadModules();

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

  // Has the modules of `library` exit and closes them.
  void xClose(const Library& library) noexcept;
  // Makes the modules of `library` (its handle set); raises HostError.
  void xCreate(Library& library);

  std::shared_ptr<ko::Session> fSession;
  std::shared_ptr<ZU::ZUBroker> fBroker;
  std::string fEndpoint;
  std::unique_ptr<robotsim::Robot> fRobot;
  std::vector<Library> fLibraries;
};

}  // namespace zefoko
