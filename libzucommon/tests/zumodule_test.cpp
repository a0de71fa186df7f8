#include "zu/zumodule.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "zu/zuproxy.h"
#include "zutest_modules.h"

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using zutest::Greeter;

const std::vector<std::string> kBuiltIns = {
    "version", "ping",      "getMethodList", "getMethodHelp", "getModuleHelp",
    "wait",    "isRunning", "stop",          "getBrokerName", "getUsage",
    "exit",    "__pCall",   "pCall"};

class ModuleTest : public ::testing::Test {
 protected:
  zutest::Process process_;
  std::shared_ptr<Greeter> greeter_ =
      ZU::ZUModule::createModule<Greeter>(process_.broker, "Greeter");
};

TEST_F(ModuleTest, PublishesTheBuiltInsFirstThenTheModulesMethodsInBindingOrder) {
  std::vector<std::string> expected = kBuiltIns;
  for (const char* m : {"say", "say", "echo", "add", "fail", "waitForRelease", "waitForStop"})
    expected.emplace_back(m);

  std::vector<std::string> published;
  for (const auto& m : greeter_->metaObject().methods())
    published.push_back(m.name);
  EXPECT_EQ(published, expected);
  EXPECT_EQ(greeter_->getMethodList(), expected);

  const auto says = greeter_->metaObject().findMethod("say");
  ASSERT_EQ(says.size(), 2u);
  EXPECT_EQ(says[0]->parametersSignature, "(s)");
  EXPECT_EQ(says[1]->parametersSignature, "(sm)");
}

struct HelpCase {
  const char* method;
  const char* dump;
};

void PrintTo(const HelpCase& c, std::ostream* os) {
  *os << '"' << c.method << '"';
}

class MethodHelpTest : public ModuleTest, public ::testing::WithParamInterface<HelpCase> {};

TEST_P(MethodHelpTest, IsTheFiveElementArray) {
  const ZU::ZUValue help = greeter_->getMethodHelp(GetParam().method);
  ASSERT_EQ(help.arraySize(), 5);
  EXPECT_EQ(help.toString(1), GetParam().dump);
}

INSTANTIATE_TEST_SUITE_P(
    Methods, MethodHelpTest,
    ::testing::Values(
        HelpCase{
            "version",
            R"(["version", "Returns the version of the module.", [], "", "A string containing the version of the module."])"},
        HelpCase{
            "getMethodHelp",
            R"(["getMethodHelp", "Retrieves a method's description.", [["methodName", "The name of the method."]], "", "A structure containing the method's description."])"},
        HelpCase{
            "wait",
            R"(["wait", "Wait for the end of a long running method that was called using 'post'", [["id", "The ID of the method that was returned when calling the method using 'post'"], ["timeoutPeriod", "The timeout period in ms. To wait indefinately, use a timeoutPeriod of zero."]], "", "True if the timeout period terminated. False if the method returned."])"},
        HelpCase{
            "stop",
            R"(["stop", "returns true if the method is currently running", [["id", "the ID of the method to wait for"]], "", ""])"},
        HelpCase{
            "getUsage",
            R"(["getUsage", "Gets the method usage string. This summarises how to use the method.", [["name", "The name of the method."]], "", "A string that summarises the usage of the method."])"},
        HelpCase{"pCall", R"(["pCall", "ZEFOko1 pCall method.", [], "", ""])"},
        // The first overload of an overloaded name.
        HelpCase{"say", R"(["say", "Says a text.", [["text", "The text to say."]], "", ""])"},
        HelpCase{
            "add",
            R"(["add", "Adds two integers.", [["a", "First."], ["b", "Second."]], "", "a + b"])"}));

TEST_F(ModuleTest, MethodHelpOfAnUnboundNameRaises) {
  try {
    greeter_->getMethodHelp("sing");
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.methodName(), "getMethodHelp");
    EXPECT_EQ(e.description(), "ERROR: unknown method: 'sing'");
  }
  // The same through a call by name from another service.
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  EXPECT_EQ(zutest::errorOf([&] { proxy.call<ZU::ZUValue>("getMethodHelp", "sing"); }),
            "ERROR: unknown method: 'sing'");
}

TEST_F(ModuleTest, ModuleHelpDescribesEveryMethod) {
  const ZU::ZUValue help = greeter_->getModuleHelp();
  ASSERT_EQ(help.arraySize(), 3);
  EXPECT_EQ(help[0].asString(), "Greeter");
  EXPECT_EQ(help[1].asString(), "A module of the tests.");
  ASSERT_EQ(help[2].arraySize(), static_cast<int>(kBuiltIns.size()) + 7);
  EXPECT_EQ(help[2][13].toString(1), greeter_->getMethodHelp("say").toString(1));
}

TEST_F(ModuleTest, BuiltInsAnswerThroughCallsByName) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  EXPECT_EQ(proxy.call<std::string>("version"), "2.1.4");
  EXPECT_TRUE(proxy.call<bool>("ping"));
  EXPECT_EQ(proxy.call<std::string>("getBrokerName"), "TestBroker");
  EXPECT_EQ(proxy.call<std::vector<std::string>>("getMethodList").size(), kBuiltIns.size() + 7);
}

TEST_F(ModuleTest, ExitUnregistersTheModule) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  proxy.call<void>("exit");
  EXPECT_EQ(process_.broker->getModuleByName("Greeter"), nullptr);
  EXPECT_THAT(process_.session->services(), ::testing::IsEmpty());
  // This test still holds the module, so the old proxy reaches it.
  EXPECT_TRUE(proxy.call<bool>("ping"));
}

TEST_F(ModuleTest, ACallByAnUnknownIdIsRefused) {
  const ko::Future<ko::AnyValue> result = greeter_->metaCall(9999, {});
  EXPECT_THAT(result.error(), HasSubstr("Cant call methodId:9999 on module:Greeter"));

  const ko::AnyObject object = ko::GenericObject::makeWeak(greeter_, "Greeter");
  try {
    object->callById(9999, {});
    FAIL() << "no error";
  } catch (const ko::FutureError& e) {
    EXPECT_THAT(e.what(), HasSubstr("Cant call methodId:9999 on module:Greeter"));
  }
}

TEST_F(ModuleTest, ZUValueParametersAndResultsTravelThroughKo) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  ZU::ZUValue value = ZU::ZUValue::makeArray({42, 0.5, "abc", ZU::ZUValue::makeBool(true)});
  EXPECT_EQ(proxy.call<ZU::ZUValue>("echo", value).toString(1), R"([42, 0.5, "abc", true])");
  proxy.call<void>("say", "hello", ZU::ZUValue::makeArray({"mode", 1}));
  proxy.call<void>("say", "bye");
  EXPECT_THAT(greeter_->said(), ElementsAre(R"(hello with ["mode", 1])", "bye"));
}

class BareModule : public ZU::ZUModuleCore {
 public:
  using ZUModuleCore::ZUModuleCore;
};

struct DefaultCase {
  const char* name;
  std::function<std::string(ZU::ZUModuleCore&)> run;
  std::string result;
  const char* category;
  const char* function;
  const char* message;
};

void PrintTo(const DefaultCase& c, std::ostream* os) {
  *os << '"' << c.name << '"';
}

class DefaultOperationTest : public ::testing::TestWithParam<DefaultCase> {};

TEST_P(DefaultOperationTest, LogsFromItsOwnFunction) {
  const DefaultCase& c = GetParam();
  zutest::Process process;
  std::shared_ptr<ZU::ZUModuleCore> module;
  if (std::string(c.category) == "ZUModule")
    module = std::make_shared<ZU::ZUModule>(process.broker, "Plain");
  else
    module = std::make_shared<BareModule>(nullptr, "Bare");

  ko::log::ScopedCapture cap;
  EXPECT_EQ(c.run(*module), c.result);
  const auto records = cap->records();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_EQ(records[0].level, ko::log::Error);
  EXPECT_EQ(records[0].category, c.category);
  EXPECT_EQ(records[0].function, c.function);
  EXPECT_EQ(records[0].message, c.message);
}

INSTANTIATE_TEST_SUITE_P(
    Operations, DefaultOperationTest,
    ::testing::Values(
        DefaultCase{"execute",
                    [](ZU::ZUModuleCore& m) {
                      m.execute();
                      return std::string();
                    },
                    "", "zucommon.zumodulecore", "ZU::ZUModuleCore::execute",
                    "ZUModuleCore::execute not implemented"},
        DefaultCase{"httpGet", [](ZU::ZUModuleCore& m) { return m.httpGet(); },
                    "ZUModuleCore::httpGet not implemented", "zucommon.zumodulecore",
                    "ZU::ZUModuleCore::httpGet", "ZUModuleCore::httpGet not implemented"},
        DefaultCase{"getUsage", [](ZU::ZUModuleCore& m) { return m.getUsage("say"); },
                    "ZUModuleCore::getUsage not implemented", "zucommon.zumodulecore",
                    "ZU::ZUModuleCore::getUsage", "ZUModuleCore::getUsage not implemented"},
        DefaultCase{
            "moduleHelp",
            [](ZU::ZUModuleCore& m) { return ZU::ZUValue::TypeToString(m.moduleHelp().getType()); },
            "Invalid", "zucommon.zumodulecore", "ZU::ZUModuleCore::moduleHelp",
            "ZUModuleCore::moduleHelp not implemented"},
        DefaultCase{"getBrokerName", [](ZU::ZUModuleCore& m) { return m.getBrokerName(); },
                    "ZUModuleCore::getBrokerName not implemented", "zucommon.zumodulecore",
                    "ZU::ZUModuleCore::getBrokerName",
                    "ZUModuleCore::getBrokerName not implemented"},
        DefaultCase{"moduleHttpGet", [](ZU::ZUModuleCore& m) { return m.httpGet(); },
                    "ZUModule::httpGet not implemented", "ZUModule", "ZU::ZUModule::httpGet",
                    "ZUModule::httpGet not implemented"}),
    [](const auto& param) { return std::string(param.param.name); });

TEST(ModuleCoreTest, VersionAndTheQuietDefaults) {
  auto module = std::make_shared<BareModule>(nullptr, "Bare");
  ko::log::ScopedCapture cap;
  EXPECT_EQ(module->version(), "2.1.4");
  module->init();
  module->exit();  // no broker: nothing to unregister
  EXPECT_EQ(cap->count(), 0u);
}

TEST(ModuleCoreTest, BindingMistakesRaise) {
  auto module = std::make_shared<Greeter>(nullptr, "Greeter");
  EXPECT_EQ(zutest::errorOf([&] { module->bindMethod(&Greeter::echo); }),
            "a method is bound without beginMethod");
  EXPECT_THAT(zutest::errorOf([&] { module->describeParameter("x", "y"); }),
              HasSubstr("before beginMethod"));
  module->beginMethod("echo", "Greeter", "Again.");
  EXPECT_THAT(zutest::errorOf([&] { module->bindMethod(&Greeter::echo); }),
              HasSubstr("Cannot bind method 'echo'"));
  // A refused binding leaves the table as it was.
  EXPECT_EQ(module->metaObject().findMethod("echo").size(), 1u);
  EXPECT_EQ(module->getMethodInfos().size(), module->metaObject().methods().size());

  auto bare = std::make_shared<BareModule>(nullptr, "Bare");
  EXPECT_THAT(zutest::errorOf([&] {
                bare->bindMethods("Bare", {{"echo", &Greeter::echo}});
              }),
              HasSubstr("does not belong to this module's class"));
  EXPECT_TRUE(bare->getMethodInfos().empty());
}

TEST(ModuleCoreTest, TheFunctorBaseOnlyLogs) {
  ZU::ZUFunctorBase functor;
  ko::log::ScopedCapture cap;
  EXPECT_TRUE(functor.call({}).isVoid());
  EXPECT_TRUE(
      cap->contains("zucommon.ZUFunctor", ko::log::Error, "ZUFunctor::call not implemented"));
}

}  // namespace
