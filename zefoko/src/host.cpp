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

Host::Host(HostOptions options) {
  if (!options.postureFamily.empty() &&
      ZU::postureFamilyFromStr(options.postureFamily) == ZU::Unknown) {
    throw HostError("Unknown posture family '" + options.postureFamily +
                    "': it has to be Standing, Sitting or SittingOnChair");
  }
  fRobot = std::make_unique<robotsim::Robot>(std::move(options.robot));
  if (!options.postureFamily.empty())
    ZU::ZUProxy("ZURobotPosture", fRobot->broker())
        .call<void>("setPostureFamily", options.postureFamily);
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
  const auto session = broker()->session();
  const std::vector<std::string> before = session->services();
  int status = 0;
  try {
    status = create(broker());
  } catch (const std::exception& e) {
    throw HostError("The module of " + path + " cannot be created: " + e.what());
  }
  if (status != 0) {
    throw HostError("The module of " + path + " cannot be created: _createModule answered " +
                    std::to_string(status));
  }
  Library library{path, handle, {}};
  for (const auto& name : session->services()) {
    if (std::find(before.begin(), before.end(), name) == before.end())
      library.modules.push_back(name);
  }
  std::string names;
  for (const auto& name : library.modules)
    names += " " + name;
  KO_LOG_INFO(kCategory) << "Loaded " << path << ", modules:" << names;
  fLibraries.push_back(library);
  return library.modules;
}

std::vector<std::string> Host::moduleNames() const {
  std::vector<std::string> names;
  for (const auto& library : fLibraries)
    names.insert(names.end(), library.modules.begin(), library.modules.end());
  return names;
}

void Host::shutdown() noexcept {
  while (!fLibraries.empty()) {
    const Library library = std::move(fLibraries.back());
    fLibraries.pop_back();
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
  if (fRobot) {
    fRobot.reset();
    // A module that a framework thread held last dies on the reaper: before the process
    // leaves, and while its library's code is there.
    ko::waitForReaper();
  }
}

}  // namespace zefoko
