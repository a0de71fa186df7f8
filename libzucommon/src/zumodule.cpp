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
  static const std::vector<ZUMethodDeclaration> builtIns = {
      {"version",
       &ZUModuleCore::version,
       "Returns the version of the module.",
       {},
       {"result", "A string containing the version of the module."}},
      {"ping",
       &ZUModule::ping,
       "Just a ping. Always returns true",
       {},
       {"alwaysTrue", "returns true"}},
      {"getMethodList",
       &ZUModule::getMethodList,
       "Retrieves the module's method list.",
       {},
       {"methodList", "An array of method names."}},
      {"getMethodHelp",
       &ZUModule::getMethodHelp,
       "Retrieves a method's description.",
       {{"methodName", "The name of the method."}},
       {"methodHelp", "A structure containing the method's description."}},
      {"getModuleHelp",
       &ZUModule::getModuleHelp,
       "Retrieves the module's description.",
       {},
       {"moduleHelp", "A structure describing the module."}},
      {"wait",
       &ZUModuleCore::wait,
       "Wait for the end of a long running method that was called using 'post'",
       {{"id", kTaskIdDescription},
        {"timeoutPeriod",
         "The timeout period in ms. To wait indefinately, use a timeoutPeriod of zero."}},
       {"timedOut", "True if the timeout period terminated. False if the method returned."}},
      {"isRunning",
       &ZUModuleCore::isRunning,
       "Returns true if the method is currently running.",
       {{"id", kTaskIdDescription}},
       {"running", "True if the method is currently running"}},
      {"stop",
       &ZUModuleCore::stop,
       "returns true if the method is currently running",
       {{"id", "the ID of the method to wait for"}}},
      {"getBrokerName",
       &ZUModuleCore::getBrokerName,
       "Gets the name of the parent broker.",
       {},
       {"brokerName", "The name of the parent broker."}},
      {"getUsage",
       &ZUModuleCore::getUsage,
       "Gets the method usage string. This summarises how to use the method.",
       {{"name", "The name of the method."}},
       {"methodUsage", "A string that summarises the usage of the method."}},
      {"exit", &ZUModuleCore::exit, "Exits and unregisters the module."},
      {"__pCall", &ZUModuleCore::pCallById, "Internal function to pCall methods"},
      {"pCall", &ZUModuleCore::pCall, "ZEFOko1 pCall method."},
  };
  bindMethods(kModuleClass, builtIns);
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
