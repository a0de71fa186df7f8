#pragma once
// ZUModule: the base class of application modules and of the robot's services. Its
// constructor binds the built-in methods that every module publishes.

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "ko/reaper.hpp"
#include "zu/zubroker.h"
#include "zu/zumodulecore.h"
#include "zu/zuvalue.h"

namespace ZU {

// A module with the built-in methods (version, ping, method help, posted-call control,
// exit, pCall). A subclass binds its own methods in its constructor after these. Threads:
// as ZUModuleCore; the built-ins only read the method table and the task table.
class ZUModule : public ZUModuleCore {
 public:
  ZUModule(const std::shared_ptr<ZUBroker>& broker, const std::string& name);
  ~ZUModule() override;

  std::string httpGet() override;
  // [name, description, [the getMethodHelp of each bound method, in binding order]].
  ZUValue moduleHelp() override;
  // The name of the broker that registered the module.
  std::string getBrokerName() override;

  // ---- built-in bound methods ----
  bool ping();
  // The names of the bound methods in binding order (an overloaded name once per overload).
  std::vector<std::string> getMethodList();
  // [name, description, [[parameter name, description], ...], "", return description];
  // raises ZUError "ERROR: unknown method: '<name>'" for a name that is not bound.
  ZUValue getMethodHelp(const std::string& methodName);
  ZUValue getModuleHelp();

  // Constructs a module T(broker, name, extra...) with ko::makeShared (so that it never dies
  // on a framework thread), registers it with the broker and calls its init(). A failing
  // init unregisters the module again and passes the error on.
  template <class T, class... A>
  static std::shared_ptr<T> createModule(const std::shared_ptr<ZUBroker>& broker,
                                         const std::string& name, A&&... extra) {
    static_assert(std::is_base_of_v<ZUModuleCore, T>, "a module derives from ZUModuleCore");
    if (!broker)
      ZU_THROW_ERROR(name, "createModule", "Broker is invalid");
    auto module = ko::makeShared<T>(broker, name, std::forward<A>(extra)...);
    broker->registerModule(module);
    try {
      module->init();
    } catch (...) {
      broker->unregisterModule(name);
      throw;
    }
    return module;
  }
};

}  // namespace ZU
