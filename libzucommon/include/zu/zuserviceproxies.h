#pragma once
// The proxies of the robot services: one class ZU<Service>Proxy per service, with one
// member per remote method, all built from the table in zuserviceproxies.def.
//
// Each is a ZUProxy (thread-safe, never keeps the service alive); each member calls the
// remote method by name and converts the result, raising ZUError "module destroyed" when
// the service is gone. The post_<method> members start the method as a task of the
// service and answer its task id (for wait, stop and isRunning).

#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/eventloop.hpp"
#include "ko/future.hpp"
#include "zu/zubroker.h"
#include "zu/zuproxy.h"
#include "zu/zuvalue.h"

namespace ZU {

#define ZU_PROXY_SERVICE(Service)                                    \
  class Service##Proxy : public ZUProxy {                            \
   public:                                                           \
    static constexpr const char* kServiceName = #Service;            \
    explicit Service##Proxy(const std::shared_ptr<ZUBroker>& broker) \
        : ZUProxy(kServiceName, broker) {}                           \
    explicit Service##Proxy(ko::AnyObject object) : ZUProxy(std::move(object), #Service) {}
#define ZU_PROXY_METHOD(Result, method, parameters, names)             \
  Result method parameters const {                                     \
    return xCallService<Result>(#method, std::forward_as_tuple names); \
  }
#define ZU_PROXY_POST(method, parameters, names)               \
  int post_##method parameters const {                         \
    return xPostService(#method, std::forward_as_tuple names); \
  }
#define ZU_PROXY_END() \
  }                    \
  ;

#include "zu/zuserviceproxies.def"

#undef ZU_PROXY_SERVICE
#undef ZU_PROXY_METHOD
#undef ZU_PROXY_POST
#undef ZU_PROXY_END

// Preloads a behaviour through the behaviour manager and waits for it. A failure is
// logged at warning level and answered as false; so is a missing proxy.
bool preloadABehavior(const std::shared_ptr<ZUBehaviorManagerProxy>& behaviorManager,
                      const std::string& path);

// Runs preloadABehavior as a job of `loop` (the process-wide loop when null) and answers at
// once; the future holds its answer when the preload has ended. A job that a stopping loop
// drops finishes the future with an error.
ko::Future<bool> preloadABehaviorAsync(std::shared_ptr<ZUBehaviorManagerProxy> behaviorManager,
                                       std::string path,
                                       std::shared_ptr<ko::EventLoop> loop = nullptr);

}  // namespace ZU
