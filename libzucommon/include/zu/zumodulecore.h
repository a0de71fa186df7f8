#pragma once
// ZUModuleCore: the part of a service module that the module layer owns: its name and
// broker, its method table with descriptions, and the posted calls (tasks) that it runs.

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <span>
#include <string>
#include <type_traits>
#include <vector>

#include "ko/dynamicobject.hpp"
#include "ko/future.hpp"
#include "ko/session.hpp"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace ZU {

class ZUBroker;
class ZUModuleCore;

// One posted call of a module. Created by the thread that posts the call, run by a thread
// of the ko event loop; any thread may ask it to stop or wait for its end. The method that
// runs finds its task through ZUModuleCore::currentTask() and polls isStopRequested() (or
// waits in waitForStopRequest()).
class ZUPCallTask {
 public:
  ZUPCallTask(const ZUModuleCore* owner, std::string methodName);
  ZUPCallTask(const ZUPCallTask&) = delete;
  ZUPCallTask& operator=(const ZUPCallTask&) = delete;

  // -1 until the module assigns it.
  std::int32_t id() const noexcept { return fId; }
  const std::string& methodName() const noexcept { return fMethodName; }
  const ZUModuleCore* owner() const noexcept { return fOwner; }

  bool isStopRequested() const noexcept { return fStop.load(std::memory_order_acquire); }
  void requestStop();
  // Waits at most `timeoutMs` (negative: no limit) for a stop request; answers whether
  // one came.
  bool waitForStopRequest(int timeoutMs) const;

  // Finishes when the call has ended (with the call's error text if it failed).
  ko::Future<void> future() const { return fPromise.future(); }

 private:
  friend class ZUModuleCore;

  const ZUModuleCore* const fOwner;
  const std::string fMethodName;
  std::int32_t fId = -1;
  std::atomic<bool> fStop{false};
  mutable std::mutex fStopMutex;
  mutable std::condition_variable fStopCondition;
  ko::Promise<void> fPromise;
};

// The callable of a bound method. The base class is a placeholder that runs nothing.
class ZUFunctorBase {
 public:
  ZUFunctorBase() = default;
  ZUFunctorBase(const ZUFunctorBase&) = delete;
  ZUFunctorBase& operator=(const ZUFunctorBase&) = delete;
  virtual ~ZUFunctorBase();
  virtual ko::AnyValue call(const std::vector<ko::AnyValue>& args);
};

// A bound member function, as ko runs it.
class ZUFunctor : public ZUFunctorBase {
 public:
  explicit ZUFunctor(ko::MethodFunction function) : fFunction(std::move(function)) {}
  ko::AnyValue call(const std::vector<ko::AnyValue>& args) override { return fFunction(args); }

 private:
  ko::MethodFunction fFunction;
};

struct ZUMethodParameter {
  std::string name;
  std::string description;
};

// The member function that runs a published method: a member of the module's class or of
// one of its bases. Bound on a module, it runs on that module, and the method's ko
// signatures are those of the member's argument and result types. Made implicitly from
// the member (&ZUMokuto::_reset); overload<Signature> picks one of overloaded members.
class ZUMethodMember {
 public:
  template <class M>
  requires std::is_member_function_pointer_v<M> ZUMethodMember(M member)
      : fBind([member](ZUModuleCore& module) -> std::optional<ko::MethodBinding> {
          using C = typename ClassOf<M>::type;
          static_assert(std::is_base_of_v<ZUModuleCore, C>, "bind a member function of a module");
          C* self = dynamic_cast<C*>(&module);
          if (!self)
            return std::nullopt;
          return ko::bindMethod(self, member);
        }) {}

  // The member bound on `module`; none when `module` is not of the member's class.
  std::optional<ko::MethodBinding> bindOn(ZUModuleCore& module) const { return fBind(module); }

 private:
  template <class M>
  struct ClassOf;
  template <class T, class C>
  struct ClassOf<T C::*> {
    using type = C;
  };

  std::function<std::optional<ko::MethodBinding>(ZUModuleCore&)> fBind;
};

// One of the overloads of a member function: overload<void(const std::string&)>(&ZUMokuto::say).
template <class Signature, class C>
requires std::is_function_v<Signature>
constexpr Signature C::*overload(Signature C::*member) {
  return member;
}

// One published method as its module declares it. A module declares its methods once, in
// a table of these in binding order, and binds them with ZUModuleCore::bindMethods: the
// method table that getMethodList, getMethodHelp and the ko meta object show is made from
// that table alone.
struct ZUMethodDeclaration {
  ZUMethodDeclaration(std::string methodName, ZUMethodMember function, std::string text = "",
                      std::vector<ZUMethodParameter> parameterList = {},
                      ZUMethodParameter result = {})
      : name(std::move(methodName)),
        member(std::move(function)),
        description(std::move(text)),
        parameters(std::move(parameterList)),
        returnValue(std::move(result)) {}

  std::string name;
  ZUMethodMember member;
  std::string description;
  std::vector<ZUMethodParameter> parameters;  // in order
  ZUMethodParameter returnValue;              // none when its name is empty
};

// What a module publishes about one bound method.
struct ZUMethodInfo {
  unsigned id = 0;  // the ko method id
  std::string name;
  std::string moduleClass;
  std::string description;
  std::vector<ZUMethodParameter> parameters;
  std::optional<ZUMethodParameter> returnValue;  // absent for a void method
  std::string parametersSignature;               // "(is)"
  std::string returnSignature;                   // "s", "v"
  std::shared_ptr<ZUFunctorBase> functor;
};

// The base of every module: a ko dynamic object with a name, a weak link to its broker, a
// method table and a table of posted calls.
//
// Methods are bound by the module's constructor (and possibly its init), one thread at a
// time: a table of declarations with bindMethods, or one method with beginMethod /
// describeParameter / describeReturn / bindMethod.
// Calls arrive on ko threads, several at once; posted calls run on the module's event loop
// (its own when it set one, otherwise the process's). The task table is guarded by a
// reader/writer lock, the method table and the module description by their own locks.
//
// Lifetime. A module is owned by a std::shared_ptr made by ZUModule::createModule (or
// ko::makeShared), so that it is never destroyed on a framework thread (see ko/reaper.hpp).
// The threads that serve a module (its event loop, its workers) are stopped and joined by
// its exit() or by its destructor, never by themselves, and never hold the broker: they
// find services through findService(). exit() may be called from any thread, a posted
// call of the module's own included, and more than once, unless a service's own header
// narrows this (the speech engine's does).
class ZUModuleCore : public ko::DynamicObject, public std::enable_shared_from_this<ZUModuleCore> {
 public:
  ZUModuleCore(const std::shared_ptr<ZUBroker>& broker, std::string name);
  ~ZUModuleCore() override;
  ZUModuleCore(const ZUModuleCore&) = delete;
  ZUModuleCore& operator=(const ZUModuleCore&) = delete;

  // The call of a method by id; an id that is no method of this module gives the error
  // "Cant call methodId:<id> on module:<name>".
  ko::Future<ko::AnyValue> metaCall(unsigned methodId, const std::vector<ko::AnyValue>& args,
                                    ko::MetaCallType callType = ko::MetaCallType::Auto) override;

  virtual void execute();
  virtual std::string version();
  // Ends the module's service: posted calls are refused from now on, every posted call is
  // asked to stop and those not begun yet never run (they end with the error "Module
  // <name> has exited"); the module's own event loop, if it has one, is stopped, which
  // waits for the posted calls running on it (but the caller's own); then the module is
  // unregistered from its broker. An override stops and joins the module's own workers
  // first, then calls this.
  virtual void exit();
  virtual std::string httpGet();
  virtual void init();
  // Asks the posted call `id` to stop (sets its stop flag).
  virtual void stop(int id);
  // Waits at most `timeoutPeriod` ms (0 or less: no limit) for the end of the posted call
  // `id`; true when the time ran out, false when the call ended or is unknown.
  virtual bool wait(int id, int timeoutPeriod);
  virtual bool isRunning(int id);
  virtual std::string getUsage(const std::string& name);
  virtual ZUValue moduleHelp();
  virtual std::string getBrokerName();

  const std::string& getName() const noexcept { return fName; }
  std::shared_ptr<ZUBroker> getParentBroker() const;
  // The session of the module's broker, held strongly (a session never keeps a module alive).
  std::shared_ptr<ko::Session> getSession() const;
  // The service of that name, looked up through the session in the "local" scope, then in
  // any scope, each lookup waiting at most the broker's deadlock time-out; an empty handle
  // when it is not found. Takes no hold on the broker: for the module's own threads.
  ko::AnyObject findService(const std::string& name) const;
  // Whether exit() has begun.
  bool hasExited() const noexcept { return fExited.load(std::memory_order_acquire); }
  std::string getModuleDescription() const;
  void setModuleDescription(const std::string& description);

  // The bound methods, in binding order.
  std::vector<ZUMethodInfo> getMethodInfos() const;
  // The first bound method of that name.
  std::optional<ZUMethodInfo> getMethodInfo(const std::string& name) const;

  // ---- binding ----
  // Binds the declared methods in their order, each as beginMethod (with `moduleClass`),
  // describeParameter for each parameter, describeReturn when it has a return value and
  // bindMethod of its member would. Raises as bindMethod does; the methods declared before
  // the one refused stay bound.
  void bindMethods(const std::string& moduleClass, std::span<const ZUMethodDeclaration> methods);
  void bindMethods(const std::string& moduleClass,
                   const std::vector<ZUMethodDeclaration>& methods) {
    bindMethods(moduleClass, std::span(methods));
  }
  void beginMethod(const std::string& name, const std::string& moduleClass,
                   const std::string& description);
  void describeParameter(const std::string& name, const std::string& description);
  void describeReturn(const std::string& name, const std::string& description);
  // Completes the method record begun last with a member function of this module (of its
  // own class or a base): bindMethod(&ZUMokuto::_reset), or, to pick one overload,
  // bindMethod<void(const std::string&)>(&ZUMokuto::say). Raises ZUError when no record
  // was begun or ko refuses the method (same name and signature bound twice).
  template <class Signature, class C>
  requires std::is_function_v<Signature>
  void bindMethod(Signature C::*method) { xBind(ZUMethodMember(method)); }

  // ---- posted calls ----
  // Posts the method `methodId` with the arguments in the list `args` and answers the new
  // task's id at once. An unknown id raises "Cant find methodId #<id> on module:<name>".
  int pCallById(int methodId, const ko::AnyValue& args);
  // `args` is a list: the method name, then its arguments. Posts that method through a
  // proxy on this module and answers the task id; raises "missing function name" when the
  // list holds no name.
  int pCall(const ko::AnyValue& args);
  // The posted call of this module that the calling thread runs; nullptr when none.
  std::shared_ptr<ZUPCallTask> currentTask() const;

 protected:
  // Called by the broker that registers the module.
  friend class ZUBroker;
  void setParentBroker(const std::weak_ptr<ZUBroker>& broker);
  // Asks every posted call of `method` (every posted call when empty) to stop.
  void xStopTasks(const std::string& method = "");

 private:
  class CurrentTaskScope;
  class TaskJob;

  [[noreturn]] void xThrowBindError(const std::string& reason) const;
  std::string xExitedText() const;
  // Ends a posted call that came too late to run (the module has exited).
  void xDropTask(const std::shared_ptr<ZUPCallTask>& task);
  void xBind(const ZUMethodMember& member);
  void xBind(ko::MethodBinding binding);
  // Removes a task at its end, from the thread that runs it.
  void xRemoveTask(std::int32_t id);
  // Removes a task from any thread (a call that was dropped before it ran).
  void xRemoveRemoteTask(std::int32_t id);
  void xRunTask(const std::shared_ptr<ZUPCallTask>& task, unsigned methodId,
                const std::vector<ko::AnyValue>& args);

  const std::string fName;

  mutable std::mutex fStateMutex;  // broker link, session and description
  std::weak_ptr<ZUBroker> fBroker;
  std::shared_ptr<ko::Session> fSession;
  std::string fModuleDescription;
  std::atomic<bool> fExited{false};

  std::mutex fBindMutex;
  std::optional<ZUMethodInfo> fPendingMethod;
  mutable std::shared_mutex fMethodsMutex;
  std::vector<ZUMethodInfo> fMethods;

  mutable std::shared_mutex fTasksMutex;
  std::map<std::int32_t, std::shared_ptr<ZUPCallTask>> fTasks;
  std::int32_t fNextTaskId = 1;  // under the exclusive fTasksMutex
};

}  // namespace ZU
