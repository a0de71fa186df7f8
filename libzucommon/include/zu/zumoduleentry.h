#pragma once
// The entry points of a module library: a shared library that a host loads into its
// process and whose `_createModule` makes the library's module on the host's broker.
//
//   extern "C" int _createModule(const std::shared_ptr<ZU::ZUBroker>& broker) {
//     return ZU::createLibraryModule<MyModule>(broker, "MyModule");
//   }
//   extern "C" int _closeModule(const std::shared_ptr<ZU::ZUBroker>&) { return 0; }
//
// The host calls them from the thread that loads or unloads the library. The framework
// libraries are shared, so the library and its host use one framework.

#include <memory>
#include <string>

#include "zu/zubroker.h"
#include "zu/zumodule.h"

namespace ZU {

// The signatures of the two entry points, and their symbol names.
using ZUCreateModuleFunction = int (*)(const std::shared_ptr<ZUBroker>& broker);
using ZUCloseModuleFunction = int (*)(const std::shared_ptr<ZUBroker>& broker);
inline constexpr const char* kCreateModuleSymbol = "_createModule";
inline constexpr const char* kCloseModuleSymbol = "_closeModule";

// What `_createModule` does: the broker manager that the broker carries becomes the
// process's, the broker is added to it, and the module T is created and initialised on
// the broker (ZUModule::createModule). Answers 0; a failure is raised.
template <class T>
int createLibraryModule(const std::shared_ptr<ZUBroker>& broker, const std::string& name) {
  if (!broker)
    ZU_THROW_ERROR(name, "_createModule", "Broker is invalid");
  ZUBrokerManager::setInstance(broker->getBrokerManager());
  broker->getBrokerManager()->addBroker(broker);
  ZUModule::createModule<T>(broker, name);
  return 0;
}

}  // namespace ZU
