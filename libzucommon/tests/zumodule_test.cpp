#include "zu/zumodule.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "ko/genericobject.hpp"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"
#include "zutest_modules.h"

namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using zutest::Greeter;

class ModuleTest : public ::testing::Test {
 protected:
  zutest::Process process_;
  std::shared_ptr<Greeter> greeter_ =
      ZU::ZUModule::createModule<Greeter>(process_.broker, "Greeter");
  ZU::ZUProxy proxy_{"Greeter", process_.broker};
};

TEST_F(ModuleTest, PublishesTheBuiltInsFirstThenTheModulesMethodsInBindingOrder) {
  const std::vector<std::string> expected = {
      "version",        "ping",       "getMethodList", "getMethodHelp", "getModuleHelp", "wait",
      "isRunning",      "stop",       "getBrokerName", "getUsage",      "exit",          "__pCall",
      "pCall",          "say",        "say",           "echo",          "add",           "fail",
      "waitForRelease", "waitForStop"};
  std::vector<std::string> published;
  for (const auto& m : greeter_->metaObject().methods())
    published.push_back(m.name);
  EXPECT_EQ(published, expected);
  EXPECT_EQ(proxy_.call<std::vector<std::string>>("getMethodList"), expected);

  const auto says = greeter_->metaObject().findMethod("say");
  ASSERT_EQ(says.size(), 2u);
  EXPECT_EQ(says[0]->parametersSignature + says[1]->parametersSignature, "(s)(sm)");

  const ZU::ZUValue help = greeter_->getModuleHelp();
  EXPECT_EQ(help[0].asString() + "|" + help[1].asString(), "Greeter|A module of the tests.");
  ASSERT_EQ(help[2].arraySize(), static_cast<int>(expected.size()));
  EXPECT_EQ(help[2][13].toString(1), greeter_->getMethodHelp("say").toString(1));
}

TEST_F(ModuleTest, MethodHelpIsTheFiveElementArray) {
  const std::pair<const char*, const char*> cases[] = {
      {"wait",
       R"(["wait", "Wait for the end of a long running method that was called using 'post'", [["id", "The ID of the method that was returned when calling the method using 'post'"], ["timeoutPeriod", "The timeout period in ms. To wait indefinately, use a timeoutPeriod of zero."]], "", "True if the timeout period terminated. False if the method returned."])"},
      {"stop",
       R"(["stop", "returns true if the method is currently running", [["id", "the ID of the method to wait for"]], "", ""])"},
      {"pCall", R"(["pCall", "ZEFOko1 pCall method.", [], "", ""])"},
      // The first overload of an overloaded name.
      {"say", R"(["say", "Says a text.", [["text", "The text to say."]], "", ""])"},
      {"add",
       R"(["add", "Adds two integers.", [["a", "First."], ["b", "Second."]], "", "a + b"])"}};
  for (const auto& [method, dump] : cases)
    EXPECT_EQ(greeter_->getMethodHelp(method).toString(1), dump);

  EXPECT_EQ(ko::test::errorOf([&] { greeter_->getMethodHelp("sing"); }),
            "\tGreeter::getMethodHelp\n\tERROR: unknown method: 'sing'");
  // The same through a call by name from another service.
  EXPECT_EQ(zutest::errorOf([&] { proxy_.call<ZU::ZUValue>("getMethodHelp", "sing"); }),
            "ERROR: unknown method: 'sing'");
}

TEST_F(ModuleTest, BuiltInsAnswerThroughCallsByNameAndExitUnregisters) {
  EXPECT_EQ(proxy_.call<std::string>("version"), "2.1.4");
  EXPECT_TRUE(proxy_.call<bool>("ping"));
  EXPECT_EQ(proxy_.call<std::string>("getBrokerName"), "TestBroker");
  // ZUValue arguments and results travel through ko; overloads are told by their arguments.
  const auto value = ZU::ZUValue::makeArray({42, 0.5, "abc", ZU::ZUValue::makeBool(true)});
  EXPECT_EQ(proxy_.call<ZU::ZUValue>("echo", value).toString(1), R"([42, 0.5, "abc", true])");
  proxy_.call<void>("say", "hello", ZU::ZUValue::makeArray({"mode", 1}));
  proxy_.call<void>("say", "bye");
  EXPECT_THAT(greeter_->said.all(), ElementsAre(R"(hello with ["mode", 1])", "bye"));

  proxy_.call<void>("exit");
  EXPECT_EQ(process_.broker->getModuleByName("Greeter"), nullptr);
  EXPECT_THAT(process_.session->services(), ::testing::IsEmpty());
  // This test still holds the module, so the old proxy reaches it.
  EXPECT_TRUE(proxy_.call<bool>("ping"));
}

TEST_F(ModuleTest, ACallByAnUnknownIdIsRefused) {
  EXPECT_THAT(greeter_->metaCall(9999, {}).error(),
              HasSubstr("Cant call methodId:9999 on module:Greeter"));
  const ko::AnyObject object = ko::GenericObject::makeWeak(greeter_, "Greeter");
  EXPECT_THAT(ko::test::errorOf<ko::FutureError>([&] { object->callById(9999, {}); }),
              HasSubstr("Cant call methodId:9999 on module:Greeter"));
  EXPECT_THAT(object->asyncById(9999, {}).error(10000),
              HasSubstr("Cant call methodId:9999 on module:Greeter"));
}

class BareModule : public ZU::ZUModuleCore {
 public:
  using ZUModuleCore::ZUModuleCore;
};

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

using ProxyTest = ModuleTest;

// A proxy on an object takes its label as service name.
TEST_F(ProxyTest, ConstructionByNameOrOnAnObject) {
  EXPECT_EQ(ko::test::errorOf([] { ZU::ZUProxy("Greeter", nullptr); }),
            "\tZUProxy::ZUProxy\n\tBroker is invalid");
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUProxy("Nobody", process_.broker); }),
            "Can't find service: Nobody");
  EXPECT_EQ(zutest::errorOf([] { ZU::ZUProxy(ko::AnyObject()); }), "Object is invalid");
  const ZU::ZUProxy proxy(ko::GenericObject::makeWeak(greeter_, "Greeter"));
  EXPECT_EQ(proxy.getServiceName(), "Greeter");
  EXPECT_EQ(proxy.call<int>("add", 2, 3), 5);
}

TEST_F(ProxyTest, ACallOnAServiceThatIsGoneRaises) {
  process_.broker->unregisterModule("Greeter");
  greeter_.reset();
  EXPECT_FALSE(proxy_.isValid());
  EXPECT_EQ(zutest::errorOf([&] { proxy_.call<bool>("ping"); }), "This object is null");
  EXPECT_EQ(zutest::errorOf([&] { proxy_.post("ping"); }), "This object is null");
}

// A failure of the remote module comes back as it was raised; the failures of ko itself are
// the proxy's, named after the method.
TEST_F(ProxyTest, EachFailureOfACallIsAZUErrorWithItsText) {
  const std::pair<std::function<void()>, std::string> cases[] = {
      {[&] { proxy_.call<void>("fail"); }, "\tGreeter::fail\n\tengine overheated"},
      {[&] { proxy_.call<void>("sing"); },
       "\tZUProxy::sing\n\tCannot find method 'sing' on Greeter"},
      {[&] { proxy_.call<int>("add", "one", "two"); },
       "\tZUProxy::add\n\tCannot convert argument 1 of add::(ii): Unable to convert from s to i "
       "(value: \"one\")"},
      {[&] { proxy_.call<int>("echo", "text"); },
       "\tZUProxy::echo\n\tReturn argument conversion error: Unable to convert call result to "
       "target type: from s to i"},
      {[&] { proxy_.call<std::string>("say", "hi"); },
       "\tZUProxy::say\n\tReturn argument conversion error: Unable to convert call result to "
       "target type: from v to s"},
      {[&] { proxy_.post("say", 1, 2, 3); },
       "\tZUProxy::pCall\n\tZUProxy(Greeter).pcall Can't find single match for say\n"
       "  Candidate(s):\nsay::(s)\nsay::(sm)"},
      {[&] { proxy_.post("sing"); },
       "\tZUProxy::pCall\n\tZUProxy(Greeter).pcall Can't find single match for sing\n"
       "  Candidate(s):\n"},
  };
  for (const auto& [call, text] : cases)
    EXPECT_EQ(ko::test::errorOf(call), text);
}

// The robot's service proxies are driven against the simulated robot in its own suites.
TEST(ServiceProxyTest, AServiceThatIsGoneRaisesModuleDestroyed) {
  zutest::Process process;
  auto speech = ZU::ZUModule::createModule<ZU::ZUModule>(process.broker, "ZUTextToSpeech");
  const ZU::ZUTextToSpeechProxy proxy(process.broker);
  speech->exit();
  speech.reset();
  const std::pair<std::function<void()>, const char*> calls[] = {
      {[&] { proxy.getLanguage(); }, "getLanguage"},
      {[&] { proxy.post_say("Hello"); }, "say"},
      {[&] { proxy.wait(1, 0); }, "wait"}};
  for (const auto& [call, method] : calls)
    EXPECT_EQ(ko::test::errorOf(call),
              std::string("\tZUProxy::") + method + "\n\tmodule destroyed");
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUTextToSpeechProxy again(process.broker); }),
            "Can't find service: ZUTextToSpeech");
}

}  // namespace
