#pragma once
// ZUProxy: calls the methods of another service by name.

#include <memory>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

#include "ko/anyvalue.hpp"
#include "ko/error.hpp"
#include "ko/genericobject.hpp"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace ZU {

class ZUBroker;

// A handle on a service through which its methods are called by name, in the calling
// thread, or posted as tasks of the remote module. The handle does not keep the service
// alive. A proxy never changes after construction, so any number of threads may use it
// at once. Every failure is raised as ZUError: the proxy's own with module "ZUProxy",
// those of the remote method as the remote module raised them.
class ZUProxy {
 public:
  // Looks the service up through the broker. Raises "Broker is invalid" without a broker
  // and "Can't find service: <name>" when the lookup finds nothing.
  ZUProxy(const std::string& name, const std::shared_ptr<ZUBroker>& broker);
  // A proxy on a service object; `name` defaults to the object's label. Raises "Object
  // is invalid" for an empty object.
  explicit ZUProxy(ko::AnyObject object, std::string name = "");
  virtual ~ZUProxy();
  ZUProxy(const ZUProxy&) = default;
  ZUProxy& operator=(const ZUProxy&) = default;

  const std::string& getServiceName() const noexcept { return fServiceName; }
  const ko::AnyObject& getObject() const noexcept { return fObject; }
  // Whether the service object is still alive.
  bool isValid() const noexcept { return fObject && fObject->isValid(); }

  // Calls `method` with the arguments (each converted to a ko value) and converts the
  // result to R. "This object is null" when the service is gone; "Return argument
  // conversion error: Unable to convert call result to target type: from <s> to <t>"
  // when the result does not convert.
  template <class R = ko::AnyValue, class... A>
  requires(!ko::detail::isSingleArgVector<A...>) R call(std::string_view method, A&&... args)
  const {
    return callArgs<R>(method,
                       std::vector<ko::AnyValue>{ko::detail::toAnyValue(std::forward<A>(args))...});
  }
  template <class R = ko::AnyValue>
  R callArgs(std::string_view method, const std::vector<ko::AnyValue>& args) const {
    return xConvert<R>(method, xCall(method, args, kNullObject));
  }

  // Start `method` as a task of the remote module (through its "__pCall") and answer the
  // task id. "ZUProxy(<service>).pcall Can't find single match for <method>\n
  //   Candidate(s):\n<signatures>" when not exactly one overload takes the arguments.
  template <class... A>
  requires(!ko::detail::isSingleArgVector<A...>) int post(std::string_view method,
                                                          A&&... args) const {
    return pCall(method,
                 std::vector<ko::AnyValue>{ko::detail::toAnyValue(std::forward<A>(args))...});
  }
  int pCall(std::string_view method, const std::vector<ko::AnyValue>& args) const {
    return xPCall(method, args, kNullObject);
  }

  // The remote module's built-in task methods.
  bool wait(int id, int timeoutPeriod) const;
  void stop(int id) const;
  bool isRunning(int id) const;

 protected:
  static constexpr const char* kNullObject = "This object is null";
  static constexpr const char* kModuleDestroyed = "module destroyed";

  // Calls by name; `goneText` is the error raised when the service object is gone.
  ko::AnyValue xCall(std::string_view method, const std::vector<ko::AnyValue>& args,
                     const char* goneText) const;
  int xPCall(std::string_view method, const std::vector<ko::AnyValue>& args,
             const char* goneText) const;

  template <class R>
  R xConvert(std::string_view method, ko::AnyValue&& result) const {
    if constexpr (std::is_void_v<R>) {
      (void)method;
      (void)result;
    } else {
      try {
        return ko::detail::convertResult<R>(std::move(result));
      } catch (const ko::ResultConversionError& e) {
        xThrowConversionError(method, e);
      }
    }
  }

  // The calls of the generated service proxies: arguments packed as ko values, and
  // "module destroyed" when the service is gone.
  template <class R, class... A>
  R xCallService(std::string_view method, const std::tuple<A...>& args) const {
    return xConvert<R>(method, xCall(method, xPack(args), kModuleDestroyed));
  }
  template <class... A>
  int xPostService(std::string_view method, const std::tuple<A...>& args) const {
    return xPCall(method, xPack(args), kModuleDestroyed);
  }

 private:
  template <class... A>
  static std::vector<ko::AnyValue> xPack(const std::tuple<A...>& args) {
    return std::apply(
        [](const auto&... a) { return std::vector<ko::AnyValue>{ko::AnyValue::from(a)...}; }, args);
  }
  [[noreturn]] void xThrowConversionError(std::string_view method,
                                          const ko::ResultConversionError& e) const;
  [[noreturn]] void xThrowGone(std::string_view method, const char* goneText) const;
  // The service's object, held by the caller for the call; raises the "gone" error when
  // the proxy has none or the service is gone.
  std::shared_ptr<ko::DynamicObject> xLiveObject(std::string_view method,
                                                 const char* goneText) const;

  ko::AnyObject fObject;
  std::string fServiceName;
};

}  // namespace ZU
