#include "zefoko/host.h"

#include <dlfcn.h>

#include <algorithm>
#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "ko/reaper.hpp"
#include "zu/enums.h"
#include "zu/zumoduleentry.h"
#include "zu/zuproxy.h"

namespace zefoko {

namespace {

constexpr const char* kCategory = "zefoko.host";

std::string lastDlError() {
  const char* error = dlerror();
  return error ? error : "unknown error";
}

}  // namespace

Host::Host(HostOptions options) : fSession(std::make_shared<ko::Session>()) {
  if (!options.postureFamily.empty() &&
      ZU::postureFamilyFromStr(options.postureFamily) == ZU::Unknown) {
    throw HostError("Unknown posture family '" + options.postureFamily +
                    "': it has to be Standing, Sitting or SittingOnChair");
  }
  if (!options.listen.empty() && !options.connect.empty())
    throw HostError("A host listens or connects, not both");
  try {
    if (!options.connect.empty()) {
      fSession->connect(options.connect, options.remote);
      fEndpoint = options.connect;
    }
  } catch (const ko::Error& e) {
    throw HostError(e.what());
  }
  fBroker = ZU::ZUBroker::create(fSession);
  if (!options.connect.empty())
    return;  // the robot is the listening process's
  fRobot = std::make_unique<robotsim::Robot>(std::move(options.robot), fBroker);
  if (!options.postureFamily.empty())
    ZU::ZUProxy("ZURobotPosture", fRobot->broker())
        .call<void>("setPostureFamily", options.postureFamily);
  // Only once the robot's services stand: a process that connects at once (a host of modules
  // waiting for this robot to come back) looks them up as soon as the link is up.
  try {
    if (!options.listen.empty())
      fEndpoint = fSession->listen(options.listen, options.remote);
  } catch (const ko::Error& e) {
    throw HostError(e.what());
  }
}

robotsim::Robot& Host::robot() {
  if (!fRobot)
    throw HostError("This host has no robot of its own: its robot is the process at " + fEndpoint);
  return *fRobot;
}

Host::~Host() {
  shutdown();
}

std::vector<std::string> Host::loadModuleLibrary(const std::string& path) {
  dlerror();
  void* handle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!handle)
    throw HostError("Cannot load the module library " + path + ": " + lastDlError());
  const auto create =
      reinterpret_cast<ZU::ZUCreateModuleFunction>(dlsym(handle, ZU::kCreateModuleSymbol));
  const auto close =
      reinterpret_cast<ZU::ZUCloseModuleFunction>(dlsym(handle, ZU::kCloseModuleSymbol));
  if (!create || !close) {
    throw HostError("The library " + path + " is not a module library: it lacks " +
                    (!create ? ZU::kCreateModuleSymbol : ZU::kCloseModuleSymbol));
  }
  Library library{path, handle, {}};
  xCreate(library);
  std::string names;
  for (const auto& name : library.modules)
    names += " " + name;
  KO_LOG_INFO(kCategory) << "Loaded " << path << ", modules:" << names;
  fLibraries.push_back(library);
  return library.modules;
}

void Host::xCreate(Library& library) {
  const auto create =
      reinterpret_cast<ZU::ZUCreateModuleFunction>(dlsym(library.handle, ZU::kCreateModuleSymbol));
  const std::vector<std::string> before = fSession->services();
  int status = 0;
  try {
    status = create(broker());
  } catch (const std::exception& e) {
    throw HostError("The module of " + library.path + " cannot be created: " + e.what());
  }
  if (status != 0) {
    throw HostError("The module of " + library.path +
                    " cannot be created: _createModule answered " + std::to_string(status));
  }
  library.modules.clear();
  for (const auto& name : fSession->services()) {
    if (std::find(before.begin(), before.end(), name) == before.end())
      library.modules.push_back(name);
  }
}

bool Host::reloadModules() {
  bool ok = true;
  for (auto library = fLibraries.rbegin(); library != fLibraries.rend(); ++library)
    xClose(*library);
  for (auto& library : fLibraries) {
    try {
      xCreate(library);
      KO_LOG_INFO(kCategory) << "Made the modules of " << library.path << " again";
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << e.what();
      ok = false;
    }
  }
  return ok;
}

std::vector<std::string> Host::moduleNames() const {
  std::vector<std::string> names;
  for (const auto& library : fLibraries)
    names.insert(names.end(), library.modules.begin(), library.modules.end());
  return names;
}

void Host::xClose(const Library& library) noexcept {
  for (auto name = library.modules.rbegin(); name != library.modules.rend(); ++name) {
    try {
      if (const auto module = broker()->getModuleByName(*name))
        module->exit();
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "Module " << *name << " failed to exit: " << e.what();
    }
  }
  const auto close =
      reinterpret_cast<ZU::ZUCloseModuleFunction>(dlsym(library.handle, ZU::kCloseModuleSymbol));
  try {
    if (close && close(broker()) != 0) {
      KO_LOG_WARNING(kCategory) << "The library " << library.path << " failed to close";
    }
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "The library " << library.path << " failed to close: " << e.what();
  }
}

void Host::shutdown() noexcept {
  while (!fLibraries.empty()) {
    const Library library = std::move(fLibraries.back());
    fLibraries.pop_back();
    xClose(library);
  }
  if (fRobot)
    fRobot.reset();
  if (fSession)
    fSession->closeLink();
  // A module that a framework thread held last dies on the reaper: before the process
  // leaves, and while its library's code is there.
  ko::waitForReaper();
}

}  // namespace zefoko
