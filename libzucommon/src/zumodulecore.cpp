#include "zu/zumodulecore.h"

#include <chrono>
#include <exception>
#include <limits>
#include <utility>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "zu/zubroker.h"
#include "zu/zuproxy.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "zucommon.zumodulecore";

// The posted call that this thread runs, if any.
thread_local std::shared_ptr<ZUPCallTask> tCurrentTask;

}  // namespace

// Marks the calling thread as running a task for the life of the scope.
class ZUModuleCore::CurrentTaskScope {
 public:
  explicit CurrentTaskScope(std::shared_ptr<ZUPCallTask> task)
      : fPrevious(std::exchange(tCurrentTask, std::move(task))) {}
  ~CurrentTaskScope() { tCurrentTask = std::move(fPrevious); }
  CurrentTaskScope(const CurrentTaskScope&) = delete;
  CurrentTaskScope& operator=(const CurrentTaskScope&) = delete;

 private:
  std::shared_ptr<ZUPCallTask> fPrevious;
};

// A posted call as the event loop holds it. When the loop drops the job without running
// it (a stopped loop), the last copy removes the task so that it does not stay "running";
// its waiters then see the broken promise.
class ZUModuleCore::TaskJob {
 public:
  TaskJob(std::shared_ptr<ZUModuleCore> module, std::shared_ptr<ZUPCallTask> task)
      : fModule(std::move(module)), fTask(std::move(task)) {}
  ~TaskJob() {
    if (!fRan)
      fModule->xRemoveRemoteTask(fTask->id());
  }
  TaskJob(const TaskJob&) = delete;
  TaskJob& operator=(const TaskJob&) = delete;

  void run(unsigned methodId, const std::vector<ko::AnyValue>& args) {
    fRan = true;
    if (fModule->hasExited()) {
      fModule->xDropTask(fTask);
      return;
    }
    fModule->xRunTask(fTask, methodId, args);
  }

 private:
  std::shared_ptr<ZUModuleCore> fModule;
  std::shared_ptr<ZUPCallTask> fTask;
  bool fRan = false;
};

// ---- ZUPCallTask -------------------------------------------------------------

ZUPCallTask::ZUPCallTask(const ZUModuleCore* owner, std::string methodName)
    : fOwner(owner), fMethodName(std::move(methodName)) {}

void ZUPCallTask::requestStop() {
  {
    std::lock_guard lock(fStopMutex);
    fStop.store(true, std::memory_order_release);
  }
  fStopCondition.notify_all();
}

bool ZUPCallTask::waitForStopRequest(int timeoutMs) const {
  std::unique_lock lock(fStopMutex);
  const auto requested = [this] { return fStop.load(std::memory_order_acquire); };
  if (timeoutMs < 0) {
    fStopCondition.wait(lock, requested);
    return true;
  }
  return fStopCondition.wait_for(lock, std::chrono::milliseconds(timeoutMs), requested);
}

// ---- ZUFunctorBase -----------------------------------------------------------

ZUFunctorBase::~ZUFunctorBase() = default;

ko::AnyValue ZUFunctorBase::call(const std::vector<ko::AnyValue>& /*args*/) {
  KO_LOG_ERROR("zucommon.ZUFunctor") << "ZUFunctor::call not implemented";
  return ko::AnyValue();
}

// ---- ZUModuleCore ------------------------------------------------------------

ZUModuleCore::ZUModuleCore(const std::shared_ptr<ZUBroker>& broker, std::string name)
    : fName(std::move(name)), fBroker(broker), fSession(broker ? broker->session() : nullptr) {}

ZUModuleCore::~ZUModuleCore() = default;

ko::Future<ko::AnyValue> ZUModuleCore::metaCall(unsigned methodId,
                                                const std::vector<ko::AnyValue>& args,
                                                ko::MetaCallType callType) {
  if (!metaObject().method(methodId)) {
    const ZUError error(fName, "metaCall",
                        "Cant call methodId:" + std::to_string(methodId) + " on module:" + fName);
    return ko::makeFutureError<ko::AnyValue>(error.what());
  }
  return DynamicObject::metaCall(methodId, args, callType);
}

void ZUModuleCore::execute() {
  KO_LOG_ERROR(kCategory) << "ZUModuleCore::execute not implemented";
}

std::string ZUModuleCore::version() {
  return "2.1.4";
}

void ZUModuleCore::exit() {
  fExited.store(true, std::memory_order_release);
  xStopTasks();
  if (const auto loop = ownEventLoop())
    loop->stop();
  if (auto broker = getParentBroker())
    broker->unregisterModule(fName);
}

std::string ZUModuleCore::xExitedText() const {
  return "Module " + fName + " has exited";
}

void ZUModuleCore::xDropTask(const std::shared_ptr<ZUPCallTask>& task) {
  xRemoveRemoteTask(task->id());
  task->fPromise.trySetError(xExitedText());
}

void ZUModuleCore::xStopTasks(const std::string& method) {
  std::vector<std::shared_ptr<ZUPCallTask>> tasks;
  {
    std::shared_lock lock(fTasksMutex);
    for (const auto& [id, task] : fTasks) {
      if (method.empty() || task->methodName() == method)
        tasks.push_back(task);
    }
  }
  for (const auto& task : tasks)
    task->requestStop();
}

std::string ZUModuleCore::httpGet() {
  const std::string text = "ZUModuleCore::httpGet not implemented";
  KO_LOG_ERROR(kCategory) << text;
  return text;
}

void ZUModuleCore::init() {}

std::string ZUModuleCore::getUsage(const std::string& /*name*/) {
  const std::string text = "ZUModuleCore::getUsage not implemented";
  KO_LOG_ERROR(kCategory) << text;
  return text;
}

ZUValue ZUModuleCore::moduleHelp() {
  KO_LOG_ERROR(kCategory) << "ZUModuleCore::moduleHelp not implemented";
  return ZUValue();
}

std::string ZUModuleCore::getBrokerName() {
  const std::string text = "ZUModuleCore::getBrokerName not implemented";
  KO_LOG_ERROR(kCategory) << text;
  return text;
}

std::shared_ptr<ZUBroker> ZUModuleCore::getParentBroker() const {
  std::lock_guard lock(fStateMutex);
  return fBroker.lock();
}

void ZUModuleCore::setParentBroker(const std::weak_ptr<ZUBroker>& broker) {
  std::shared_ptr<ko::Session> session;
  if (const auto held = broker.lock())
    session = held->session();
  std::lock_guard lock(fStateMutex);
  fBroker = broker;
  if (session)
    fSession = std::move(session);
}

std::shared_ptr<ko::Session> ZUModuleCore::getSession() const {
  std::lock_guard lock(fStateMutex);
  return fSession;
}

ko::AnyObject ZUModuleCore::findService(const std::string& name) const {
  const auto session = getSession();
  if (!session)
    return nullptr;
  for (const char* scope : {"local", ""}) {
    const auto found = session->service(name, scope);
    if (found.wait(ZUBroker::deadlockTimeout()) == ko::FutureState::FinishedWithValue) {
      ko::AnyObject object = found.value();
      if (object && object->isValid())
        return object;
    }
  }
  return nullptr;
}

std::string ZUModuleCore::getModuleDescription() const {
  std::lock_guard lock(fStateMutex);
  return fModuleDescription;
}

void ZUModuleCore::setModuleDescription(const std::string& description) {
  {
    std::lock_guard lock(fStateMutex);
    fModuleDescription = description;
  }
  setDescription(description);
}

std::vector<ZUMethodInfo> ZUModuleCore::getMethodInfos() const {
  std::shared_lock lock(fMethodsMutex);
  return fMethods;
}

std::optional<ZUMethodInfo> ZUModuleCore::getMethodInfo(const std::string& name) const {
  std::shared_lock lock(fMethodsMutex);
  for (const auto& m : fMethods)
    if (m.name == name)
      return m;
  return std::nullopt;
}

// ---- binding -----------------------------------------------------------------

void ZUModuleCore::bindMethods(const std::string& moduleClass,
                               std::span<const ZUMethodDeclaration> methods) {
  for (const auto& method : methods) {
    beginMethod(method.name, moduleClass, method.description);
    for (const auto& parameter : method.parameters)
      describeParameter(parameter.name, parameter.description);
    if (!method.returnValue.name.empty())
      describeReturn(method.returnValue.name, method.returnValue.description);
    xBind(method.member);
  }
}

void ZUModuleCore::beginMethod(const std::string& name, const std::string& moduleClass,
                               const std::string& description) {
  std::lock_guard lock(fBindMutex);
  ZUMethodInfo info;
  info.name = name;
  info.moduleClass = moduleClass;
  info.description = description;
  fPendingMethod = std::move(info);
}

void ZUModuleCore::describeParameter(const std::string& name, const std::string& description) {
  std::lock_guard lock(fBindMutex);
  if (!fPendingMethod)
    xThrowBindError("describeParameter(" + name + ") before beginMethod");
  fPendingMethod->parameters.push_back({name, description});
}

void ZUModuleCore::describeReturn(const std::string& name, const std::string& description) {
  std::lock_guard lock(fBindMutex);
  if (!fPendingMethod)
    xThrowBindError("describeReturn(" + name + ") before beginMethod");
  fPendingMethod->returnValue = ZUMethodParameter{name, description};
}

void ZUModuleCore::xThrowBindError(const std::string& reason) const {
  ZU_THROW_ERROR(fName, "bindMethod", reason);
}

void ZUModuleCore::xBind(const ZUMethodMember& member) {
  std::optional<ko::MethodBinding> binding = member.bindOn(*this);
  if (!binding)
    xThrowBindError("the member function does not belong to this module's class");
  xBind(std::move(*binding));
}

void ZUModuleCore::xBind(ko::MethodBinding binding) {
  std::lock_guard lock(fBindMutex);
  if (!fPendingMethod)
    xThrowBindError("a method is bound without beginMethod");
  ZUMethodInfo info = std::move(*fPendingMethod);
  fPendingMethod.reset();

  std::vector<ko::MetaParameter> parameters;
  parameters.reserve(info.parameters.size());
  for (const auto& p : info.parameters)
    parameters.push_back({p.name, p.description});
  ko::MetaParameter returnValue;
  if (info.returnValue)
    returnValue = {info.returnValue->name, info.returnValue->description};

  info.functor = std::make_shared<ZUFunctor>(binding.function);
  try {
    info.id = advertiseMethod(info.name, std::move(binding), info.description,
                              std::move(parameters), std::move(returnValue));
  } catch (const ko::Error& e) {
    xThrowBindError("Cannot bind method '" + info.name + "': " + e.what());
  }
  const ko::MetaMethod* published = metaObject().method(info.id);
  info.parametersSignature = published->parametersSignature;
  info.returnSignature = published->returnSignature;

  std::unique_lock methodsLock(fMethodsMutex);
  fMethods.push_back(std::move(info));
}

// ---- posted calls ------------------------------------------------------------

std::shared_ptr<ZUPCallTask> ZUModuleCore::currentTask() const {
  if (tCurrentTask && tCurrentTask->owner() == this)
    return tCurrentTask;
  return nullptr;
}

int ZUModuleCore::pCallById(int methodId, const ko::AnyValue& args) {
  const ko::MetaMethod* method =
      methodId >= 0 ? metaObject().method(static_cast<unsigned>(methodId)) : nullptr;
  if (!method) {
    ZU_THROW_ERROR(fName, "__pCall",
                   "Cant find methodId #" + std::to_string(methodId) + " on module:" + fName);
  }
  std::vector<ko::AnyValue> arguments;
  if (!args.isVoid()) {
    try {
      arguments = args.to<std::vector<ko::AnyValue>>();
    } catch (const ko::ConversionError&) {
      ZU_THROW_ERROR(fName, "__pCall", "The arguments must be a list, not " + args.signature());
    }
  }
  std::shared_ptr<ZUModuleCore> self = weak_from_this().lock();
  if (!self)
    ZU_THROW_ERROR(fName, "__pCall", "The module is not owned by a shared pointer");
  if (hasExited())
    ZU_THROW_ERROR(fName, "__pCall", xExitedText());

  auto task = std::make_shared<ZUPCallTask>(this, method->name);
  std::int32_t id = 0;
  {
    std::unique_lock lock(fTasksMutex);
    do {
      id = fNextTaskId;
      fNextTaskId = fNextTaskId == std::numeric_limits<std::int32_t>::max() ? 1 : fNextTaskId + 1;
    } while (fTasks.count(id));
    task->fId = id;
    fTasks.emplace(id, task);
  }
  auto job = std::make_shared<TaskJob>(std::move(self), std::move(task));
  const auto methodIdU = static_cast<unsigned>(methodId);
  eventLoop()->post([job = std::move(job), methodIdU, arguments = std::move(arguments)] {
    job->run(methodIdU, arguments);
  });
  return id;
}

int ZUModuleCore::pCall(const ko::AnyValue& args) {
  std::vector<ko::AnyValue> items;
  try {
    if (!args.isVoid())
      items = args.to<std::vector<ko::AnyValue>>();
  } catch (const ko::ConversionError&) {
    items = {args};  // a lone method name
  }
  std::string method;
  try {
    if (!items.empty())
      method = items.front().to<std::string>();
  } catch (const ko::ConversionError&) {
  }
  if (method.empty())
    ZU_THROW_ERROR(fName, "pCall", "missing function name");
  items.erase(items.begin());

  std::shared_ptr<ZUModuleCore> self = weak_from_this().lock();
  if (!self)
    ZU_THROW_ERROR(fName, "pCall", "The module is not owned by a shared pointer");
  const ZUProxy proxy(ko::GenericObject::makeWeak(self, fName), fName);
  return proxy.pCall(method, items);
}

void ZUModuleCore::xRunTask(const std::shared_ptr<ZUPCallTask>& task, unsigned methodId,
                            const std::vector<ko::AnyValue>& args) {
  std::string error;
  {
    CurrentTaskScope scope(task);
    // An override of metaCall may throw: the task ends all the same.
    try {
      const ko::Future<ko::AnyValue> result = metaCall(methodId, args, ko::MetaCallType::Direct);
      error = result.error();
    } catch (const std::exception& e) {
      error = e.what();
    } catch (...) {
      error = "Unknown exception";
    }
    // Logged before the task leaves the table, so that whoever sees it gone sees the line.
    if (!error.empty()) {
      KO_LOG_WARNING(kCategory) << fName << " :Task " << task->id() << " (" << task->methodName()
                                << ") failed: " << error;
    }
    xRemoveTask(task->id());
  }
  if (error.empty()) {
    task->fPromise.trySetValue();
    return;
  }
  task->fPromise.trySetError(error);
}

void ZUModuleCore::xRemoveTask(std::int32_t id) {
  if (!tCurrentTask) {
    KO_LOG_ERROR(kCategory) << "Error: Asking to remove task " << id
                            << " but current thread is not assigned to a task.";
  } else if (tCurrentTask->owner() != this || tCurrentTask->id() != id) {
    KO_LOG_ERROR(kCategory) << "Error: Asking to remove task " << id
                            << " but current thread is assigned to task " << tCurrentTask->id();
  }
  std::shared_ptr<ZUPCallTask> removed;  // released outside the lock
  std::unique_lock lock(fTasksMutex);
  const auto it = fTasks.find(id);
  if (it != fTasks.end()) {
    removed = std::move(it->second);
    fTasks.erase(it);
  }
}

void ZUModuleCore::xRemoveRemoteTask(std::int32_t id) {
  std::shared_ptr<ZUPCallTask> removed;
  {
    std::unique_lock lock(fTasksMutex);
    const auto it = fTasks.find(id);
    if (it != fTasks.end()) {
      removed = std::move(it->second);
      fTasks.erase(it);
      return;
    }
  }
  KO_LOG_ERROR(kCategory) << "Error: Asking to remove non-existing task " << id;
}

void ZUModuleCore::stop(int id) {
  std::shared_lock lock(fTasksMutex);
  const auto it = fTasks.find(id);
  if (it == fTasks.end()) {
    KO_LOG_VERBOSE(kCategory) << "Cant stop task " << id << " because it is not found.";
    return;
  }
  KO_LOG_INFO(kCategory) << fName << " :Task " << id << " asked to stop";
  it->second->requestStop();
}

bool ZUModuleCore::wait(int id, int timeoutPeriod) {
  ko::Future<void> end;
  {
    std::shared_lock lock(fTasksMutex);
    const auto it = fTasks.find(id);
    if (it == fTasks.end()) {
      KO_LOG_VERBOSE(kCategory) << "Cant stop task " << id << " because it is not found.";
      return false;
    }
    end = it->second->future();
  }
  const int msecs = timeoutPeriod <= 0 ? ko::FutureTimeout_Infinite : timeoutPeriod;
  return end.wait(msecs) == ko::FutureState::Timeout;
}

bool ZUModuleCore::isRunning(int id) {
  std::shared_lock lock(fTasksMutex);
  return fTasks.count(id) != 0;
}

}  // namespace ZU
