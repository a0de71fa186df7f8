#include "zu/zuproxy.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "ko/genericobject.hpp"
#include "zu/zumodule.h"
#include "zu/zuserviceproxies.h"
#include "zutest_modules.h"

namespace {

using ::testing::HasSubstr;
using zutest::Greeter;

class ProxyTest : public ::testing::Test {
 protected:
  zutest::Process process_;
  std::shared_ptr<Greeter> greeter_ =
      ZU::ZUModule::createModule<Greeter>(process_.broker, "Greeter");
};

TEST_F(ProxyTest, ConstructionErrors) {
  try {
    ZU::ZUProxy("Greeter", nullptr);
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName() + ": " + e.description(), "ZUProxy: Broker is invalid");
  }
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUProxy("Nobody", process_.broker); }),
            "Can't find service: Nobody");
  EXPECT_EQ(zutest::errorOf([] { ZU::ZUProxy(ko::AnyObject()); }), "Object is invalid");
}

TEST_F(ProxyTest, ProxyOnAnObjectTakesItsLabelAsServiceName) {
  const ZU::ZUProxy proxy(ko::GenericObject::makeWeak(greeter_, "Greeter"));
  EXPECT_EQ(proxy.getServiceName(), "Greeter");
  EXPECT_EQ(proxy.call<int>("add", 2, 3), 5);
}

TEST_F(ProxyTest, AResultThatDoesNotConvertIsReported) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  EXPECT_EQ(zutest::errorOf([&] { proxy.call<int>("echo", "text"); }),
            "Return argument conversion error: Unable to convert call result to target type: "
            "from s to i");
  EXPECT_EQ(zutest::errorOf([&] { proxy.call<std::string>("say", "hi"); }),
            "Return argument conversion error: Unable to convert call result to target type: "
            "from v to s");
}

TEST_F(ProxyTest, TheRemoteModulesErrorComesBackAsItWasRaised) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  try {
    proxy.call<void>("fail");
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName(), "Greeter");
    EXPECT_EQ(e.methodName(), "fail");
    EXPECT_EQ(e.description(), "engine overheated");
  }
  // Failures of ko itself are the proxy's, named after the method.
  try {
    proxy.call<void>("sing");
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName(), "ZUProxy");
    EXPECT_EQ(e.methodName(), "sing");
    EXPECT_THAT(e.description(), HasSubstr("Cannot find method 'sing'"));
  }
  EXPECT_THAT(zutest::errorOf([&] { proxy.call<int>("add", "one", "two"); }),
              HasSubstr("Cannot convert argument 1"));
}

TEST_F(ProxyTest, ACallOnAServiceThatIsGoneRaises) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  process_.broker->unregisterModule("Greeter");
  greeter_.reset();
  EXPECT_FALSE(proxy.isValid());
  EXPECT_EQ(zutest::errorOf([&] { proxy.call<bool>("ping"); }), "This object is null");
  EXPECT_EQ(zutest::errorOf([&] { proxy.post("ping"); }), "This object is null");
}

TEST_F(ProxyTest, PCallNeedsExactlyOneMatchingOverload) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  try {
    proxy.post("say", 1, 2, 3);
    FAIL() << "no error";
  } catch (const ZU::ZUError& e) {
    EXPECT_EQ(e.moduleName(), "ZUProxy");
    EXPECT_EQ(e.methodName(), "pCall");
    EXPECT_EQ(e.description(),
              "ZUProxy(Greeter).pcall Can't find single match for say\n"
              "  Candidate(s):\n"
              "say::(s)\n"
              "say::(sm)");
  }
  EXPECT_EQ(zutest::errorOf([&] { proxy.post("sing"); }),
            "ZUProxy(Greeter).pcall Can't find single match for sing\n  Candidate(s):\n");
}

// The robot's service proxies are driven against the simulated robot in its own suites.
TEST(ServiceProxyTest, AServiceThatIsGoneRaisesModuleDestroyed) {
  zutest::Process process;
  auto speech = ZU::ZUModule::createModule<ZU::ZUModule>(process.broker, "ZUTextToSpeech");
  const ZU::ZUTextToSpeechProxy proxy(process.broker);
  speech->exit();
  speech.reset();
  for (const auto& call : std::vector<std::function<void()>>{[&] { proxy.getLanguage(); },
                                                             [&] { proxy.post_say("Hello"); },
                                                             [&] { proxy.wait(1, 0); }}) {
    try {
      call();
      ADD_FAILURE() << "no error";
    } catch (const ZU::ZUError& e) {
      EXPECT_EQ(e.moduleName() + ": " + e.description(), "ZUProxy: module destroyed");
    }
  }
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUTextToSpeechProxy again(process.broker); }),
            "Can't find service: ZUTextToSpeech");
}

}  // namespace
