#include "zu/zumodule.h"

#include "ko/log.hpp"

namespace ZU {

namespace {

constexpr const char* kModuleClass = "ZUModule";
constexpr const char* kTaskIdDescription =
    "The ID of the method that was returned when calling the method using 'post'";

ZUValue pair(const std::string& first, const std::string& second) {
  return ZUValue::makeArray({ZUValue(first), ZUValue(second)});
}

ZUValue methodHelp(const ZUMethodInfo& method) {
  ZUValue parameters;
  parameters.arraySetSize(0);
  for (const auto& p : method.parameters)
    parameters.arrayPush(pair(p.name, p.description));
  ZUValue help;
  help.arrayPush(ZUValue(method.name));
  help.arrayPush(ZUValue(method.description));
  help.arrayPush(parameters);
  help.arrayPush(ZUValue(std::string()));
  help.arrayPush(ZUValue(method.returnValue ? method.returnValue->description : std::string()));
  return help;
}

}  // namespace

ZUModule::ZUModule(const std::shared_ptr<ZUBroker>& broker, const std::string& name)
    : ZUModuleCore(broker, name) {
  beginMethod("version", kModuleClass, "Returns the version of the module.");
  describeReturn("result", "A string containing the version of the module.");
  bindMethod(&ZUModuleCore::version);

  beginMethod("ping", kModuleClass, "Just a ping. Always returns true");
  describeReturn("alwaysTrue", "returns true");
  bindMethod(&ZUModule::ping);

  beginMethod("getMethodList", kModuleClass, "Retrieves the module's method list.");
  describeReturn("methodList", "An array of method names.");
  bindMethod(&ZUModule::getMethodList);

  beginMethod("getMethodHelp", kModuleClass, "Retrieves a method's description.");
  describeParameter("methodName", "The name of the method.");
  describeReturn("methodHelp", "A structure containing the method's description.");
  bindMethod(&ZUModule::getMethodHelp);

  beginMethod("getModuleHelp", kModuleClass, "Retrieves the module's description.");
  describeReturn("moduleHelp", "A structure describing the module.");
  bindMethod(&ZUModule::getModuleHelp);

  beginMethod("wait", kModuleClass,
              "Wait for the end of a long running method that was called using 'post'");
  describeParameter("id", kTaskIdDescription);
  describeParameter("timeoutPeriod",
                    "The timeout period in ms. To wait indefinately, use a timeoutPeriod of zero.");
  describeReturn("timedOut",
                 "True if the timeout period terminated. False if the method returned.");
  bindMethod(&ZUModuleCore::wait);

  beginMethod("isRunning", kModuleClass, "Returns true if the method is currently running.");
  describeParameter("id", kTaskIdDescription);
  describeReturn("running", "True if the method is currently running");
  bindMethod(&ZUModuleCore::isRunning);

  beginMethod("stop", kModuleClass, "returns true if the method is currently running");
  describeParameter("id", "the ID of the method to wait for");
  bindMethod(&ZUModuleCore::stop);

  beginMethod("getBrokerName", kModuleClass, "Gets the name of the parent broker.");
  describeReturn("brokerName", "The name of the parent broker.");
  bindMethod(&ZUModuleCore::getBrokerName);

  beginMethod("getUsage", kModuleClass,
              "Gets the method usage string. This summarises how to use the method.");
  describeParameter("name", "The name of the method.");
  describeReturn("methodUsage", "A string that summarises the usage of the method.");
  bindMethod(&ZUModuleCore::getUsage);

  beginMethod("exit", kModuleClass, "Exits and unregisters the module.");
  bindMethod(&ZUModuleCore::exit);

  beginMethod("__pCall", kModuleClass, "Internal function to pCall methods");
  bindMethod(&ZUModuleCore::pCallById);

  beginMethod("pCall", kModuleClass, "ZEFOko1 pCall method.");
  bindMethod(&ZUModuleCore::pCall);
}

ZUModule::~ZUModule() = default;

std::string ZUModule::httpGet() {
  const std::string text = "ZUModule::httpGet not implemented";
  KO_LOG_ERROR("ZUModule") << text;
  return text;
}

ZUValue ZUModule::moduleHelp() {
  ZUValue methods;
  methods.arraySetSize(0);
  for (const auto& m : getMethodInfos())
    methods.arrayPush(methodHelp(m));
  ZUValue help;
  help.arrayPush(ZUValue(getName()));
  help.arrayPush(ZUValue(getModuleDescription()));
  help.arrayPush(methods);
  return help;
}

std::string ZUModule::getBrokerName() {
  if (auto broker = getParentBroker())
    return broker->getName();
  return ZUModuleCore::getBrokerName();
}

bool ZUModule::ping() {
  return true;
}

std::vector<std::string> ZUModule::getMethodList() {
  std::vector<std::string> names;
  for (const auto& m : getMethodInfos())
    names.push_back(m.name);
  return names;
}

ZUValue ZUModule::getMethodHelp(const std::string& methodName) {
  const std::optional<ZUMethodInfo> method = getMethodInfo(methodName);
  if (!method)
    ZU_THROW_ERROR(getName(), "getMethodHelp", "ERROR: unknown method: '" + methodName + "'");
  return methodHelp(*method);
}

ZUValue ZUModule::getModuleHelp() {
  return moduleHelp();
}

}  // namespace ZU
