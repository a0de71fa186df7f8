#include "zu/zuproxy.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "zu/zumodule.h"
#include "zu/zuserviceproxies.h"
#include "zutest_modules.h"

namespace {

using ko::AnyValue;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ZU::ZUValue;
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

TEST_F(ProxyTest, PostedCallsAreControlledThroughTheRemoteBuiltIns) {
  const ZU::ZUProxy proxy("Greeter", process_.broker);
  const int id = proxy.post("waitForStop");
  ASSERT_TRUE(greeter_->started.wait());
  EXPECT_TRUE(proxy.isRunning(id));
  EXPECT_TRUE(proxy.wait(id, 1));
  proxy.stop(id);
  EXPECT_FALSE(proxy.wait(id, 0));
  EXPECT_FALSE(proxy.isRunning(id));
  EXPECT_TRUE(greeter_->stopSeen);
}

// A stand-in for one robot service: publishes the methods it is given and records every
// call as "method(argument signature) [arguments]".
class FakeService : public ZU::ZUModule {
 public:
  using Handler = std::function<AnyValue(const std::vector<AnyValue>&)>;
  struct Method {
    std::string name, parameters, returns;
    Handler handler;
  };

  FakeService(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
              const std::vector<Method>& methods)
      : ZUModule(broker, name) {
    for (const auto& m : methods) {
      advertiseMethod(
          m.name, m.parameters, m.returns,
          [this, name = m.name, handler = m.handler](const std::vector<AnyValue>& args) {
            std::string signature;
            for (const auto& a : args)
              signature += a.signature();
            std::lock_guard lock(fMutex);
            fCalls.push_back(name + "(" + signature + ") " + AnyValue::list(args).toString());
            return handler(args);
          });
    }
  }

  std::vector<std::string> calls() const {
    std::lock_guard lock(fMutex);
    return fCalls;
  }

 private:
  mutable std::mutex fMutex;
  std::vector<std::string> fCalls;
};

FakeService::Handler reply(AnyValue value) {
  return [value](const std::vector<AnyValue>&) { return value; };
}

FakeService::Handler raise(const char* service, const char* method, const char* text) {
  return [=](const std::vector<AnyValue>&) -> AnyValue { ZU_THROW_ERROR(service, method, text); };
}

// The robot services whose proxies take arguments, with the methods that the program calls
// as their fakes publish them (the simulated robot's suites call the others).
class ServiceProxyTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const std::map<std::string, std::vector<FakeService::Method>> services = {
        {"ZUMemory",
         {{"declareEvent", "(ss)", "v", reply({})},
          {"raiseEvent", "(sm)", "v", reply({})},
          {"subscribeToEvent", "(sss)", "v", reply({})},
          {"subscribeToMicroEvent", "(ssss)", "v", reply({})},
          {"unsubscribeToEvent", "(ss)", "v", reply({})}}},
        {"ZUTextToSpeech",
         {{"say", "(s)", "v", reply({})},
          {"setParameter", "(sf)", "v", reply({})},
          {"enableNotifications", "()", "v", reply({})},
          {"getLanguage", "()", "s", reply("French")}}},
        {"ZUBehaviorManager",
         {{"resolveBehaviorName", "(s)", "s", reply("animations/Stand/Gestures/Hey_1")},
          {"preloadBehavior", "(s)", "b", reply(true)},
          {"getInstalledBehaviors", "()", "[s]", reply(AnyValue::list({"a/Hey_1", "a/Hey_2"}))},
          {"getBehaviorTags", "(s)", "[s]", reply(AnyValue::list({"hello", "hi"}))},
          {"startBehavior", "(s)", "v", reply({})},
          {"stopBehavior", "(s)", "v", reply({})},
          {"runBehavior", "(s)", "v", reply({})},
          {"isBehaviorRunning", "(s)", "b", reply(false)}}},
        {"ZUMotion",
         {{"areResourcesAvailable", "([s])", "b", reply(true)},
          {"getAngles", "(mb)", "[f]", reply(AnyValue::list({AnyValue(0.25f)}))},
          {"angleInterpolationBezier", "(mmm)", "v", reply({})},
          {"setAngles", "(mmf)", "v", reply({})},
          {"getBreathEnabled", "(s)", "b", reply(true)},
          {"setBreathEnabled", "(sb)", "v", reply({})}}},
        {"ZUAudioPlayer",
         {{"loadSoundSet", "(s)", "v", raise("ZUAudioPlayer", "loadSoundSet", "unknown set")},
          {"playSoundSetFile", "(ssidii)", "v", reply({})}}},
    };
    for (const auto& [name, methods] : services)
      fakes_[name] = ZU::ZUModule::createModule<FakeService>(process_.broker, name, methods);
  }
  std::vector<std::string> calls(const std::string& service) { return fakes_[service]->calls(); }

  zutest::Process process_;
  std::map<std::string, std::shared_ptr<FakeService>> fakes_;
};

// Each member calls its remote method by name with its arguments as ko values, and converts
// the result; a post answers a task id that the service's built-in wait knows.
TEST_F(ServiceProxyTest, EachMemberCallsItsMethodByNameAndConvertsTheResult) {
  const auto& b = process_.broker;
  const ZU::ZUMemoryProxy memory(b);
  memory.declareEvent("ZUMokuto/EndOfMokuto", "ZUMokuto");
  memory.raiseEvent("ZUMokuto/EndOfMokuto", ZUValue(3));
  memory.subscribeToEvent("PostureFamilyChanged", "ZUMokuto", "_postureCallback");
  memory.subscribeToMicroEvent("WordRecognized", "ZUMokuto", "message", "_dialogCallback");
  memory.unsubscribeToEvent("PostureFamilyChanged", "ZUMokuto");
  EXPECT_THAT(
      calls("ZUMemory"),
      ElementsAre(
          R"(declareEvent(ss) ["ZUMokuto/EndOfMokuto", "ZUMokuto"])",
          R"(raiseEvent(si) ["ZUMokuto/EndOfMokuto", 3])",
          R"(subscribeToEvent(sss) ["PostureFamilyChanged", "ZUMokuto", "_postureCallback"])",
          R"(subscribeToMicroEvent(ssss) ["WordRecognized", "ZUMokuto", "message", "_dialogCallback"])",
          R"(unsubscribeToEvent(ss) ["PostureFamilyChanged", "ZUMokuto"])"));

  const ZU::ZUTextToSpeechProxy tts(b);
  tts.say("Hello");
  EXPECT_FALSE(tts.wait(tts.post_say("Hello \\mrk=1\\ world"), 0));
  EXPECT_FALSE(tts.isRunning(77));
  EXPECT_FALSE(tts.wait(77, 0));
  tts.stop(77);
  tts.setParameter("inputMode", 2.0f);
  tts.enableNotifications();
  EXPECT_EQ(tts.getLanguage(), "French");
  EXPECT_THAT(calls("ZUTextToSpeech"),
              ElementsAre(R"(say(s) ["Hello"])", R"(say(s) ["Hello \\mrk=1\\ world"])",
                          R"(setParameter(sf) ["inputMode", 2])", "enableNotifications() []",
                          "getLanguage() []"));

  const ZU::ZUBehaviorManagerProxy bm(b);
  EXPECT_EQ(bm.resolveBehaviorName("Hey_1"), "animations/Stand/Gestures/Hey_1");
  EXPECT_TRUE(bm.preloadBehavior("a/Hey_1"));
  EXPECT_FALSE(bm.wait(bm.post_preloadBehavior("a/Hey_2"), 0));
  EXPECT_THAT(bm.getInstalledBehaviors(), ElementsAre("a/Hey_1", "a/Hey_2"));
  EXPECT_THAT(bm.getBehaviorTags("a/Hey_1"), ElementsAre("hello", "hi"));
  bm.startBehavior("a/Hey_1");
  bm.stopBehavior("a/Hey_1");
  EXPECT_FALSE(bm.wait(bm.post_stopBehavior("a/Hey_2"), 0));
  bm.runBehavior("a/End");
  EXPECT_FALSE(bm.wait(bm.post_runBehavior("a/End2"), 0));
  EXPECT_FALSE(bm.isBehaviorRunning("a/Hey_1"));
  EXPECT_THAT(calls("ZUBehaviorManager"),
              ElementsAre(R"(resolveBehaviorName(s) ["Hey_1"])",
                          R"(preloadBehavior(s) ["a/Hey_1"])", R"(preloadBehavior(s) ["a/Hey_2"])",
                          "getInstalledBehaviors() []", R"(getBehaviorTags(s) ["a/Hey_1"])",
                          R"(startBehavior(s) ["a/Hey_1"])", R"(stopBehavior(s) ["a/Hey_1"])",
                          R"(stopBehavior(s) ["a/Hey_2"])", R"(runBehavior(s) ["a/End"])",
                          R"(runBehavior(s) ["a/End2"])", R"(isBehaviorRunning(s) ["a/Hey_1"])"));

  const ZU::ZUMotionProxy motion(b);
  const ZUValue joints = ZUValue::makeArray({"HeadYaw"});
  const ZUValue times = ZUValue::makeArray({ZUValue::makeArray({0.5f})});
  const ZUValue points = ZUValue::makeArray({ZUValue::makeArray({0.25f})});
  EXPECT_TRUE(motion.areResourcesAvailable({"Head"}));
  EXPECT_THAT(motion.getAngles("HeadYaw", false), ElementsAre(0.25f));
  motion.angleInterpolationBezier(joints, times, points);
  EXPECT_FALSE(motion.wait(motion.post_angleInterpolationBezier(points, joints, times), 10000));
  motion.setAngles("HeadYaw", 0.25f, 1.0f);
  EXPECT_FALSE(motion.wait(77, 0));
  motion.stop(77);
  EXPECT_TRUE(motion.getBreathEnabled("Arms"));
  motion.setBreathEnabled("Arms", false);
  EXPECT_THAT(
      calls("ZUMotion"),
      ElementsAre(R"(areResourcesAvailable([s]) [["Head"]])", R"(getAngles(sb) ["HeadYaw", false])",
                  R"(angleInterpolationBezier([s][[f]][[f]]) [["HeadYaw"], [[0.5]], [[0.25]]])",
                  R"(angleInterpolationBezier([[f]][s][[f]]) [[[0.25]], ["HeadYaw"], [[0.5]]])",
                  R"(setAngles(sff) ["HeadYaw", 0.25, 1])", R"(getBreathEnabled(s) ["Arms"])",
                  R"(setBreathEnabled(sb) ["Arms", false])"));

  const ZU::ZUAudioPlayerProxy audio(b);
  audio.playSoundSetFile("bells", "ding", 1, 0.5, 2, 3);
  EXPECT_FALSE(audio.wait(audio.post_playSoundSetFile("bells", "dong", 0, 1.0, 0, 0), 0));
  audio.stop(77);
  EXPECT_EQ(zutest::errorOf([&] { audio.loadSoundSet("x"); }), "unknown set");
  EXPECT_THAT(calls("ZUAudioPlayer"),
              ElementsAre(R"(playSoundSetFile(ssidii) ["bells", "ding", 1, 0.5, 2, 3])",
                          R"(playSoundSetFile(ssidii) ["bells", "dong", 0, 1, 0, 0])",
                          R"(loadSoundSet(s) ["x"])"));
}

TEST_F(ServiceProxyTest, AServiceThatIsGoneRaisesModuleDestroyed) {
  const ZU::ZUTextToSpeechProxy proxy(process_.broker);
  fakes_["ZUTextToSpeech"]->exit();
  fakes_.erase("ZUTextToSpeech");
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
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUTextToSpeechProxy again(process_.broker); }),
            "Can't find service: ZUTextToSpeech");
}

TEST(PreloadTest, PreloadsAndWaitsAndLogsAFailureAsAWarning) {
  zutest::Process process;
  auto fake = ZU::ZUModule::createModule<FakeService>(
      process.broker, "ZUBehaviorManager",
      std::vector<FakeService::Method>{
          {"preloadBehavior", "(s)", "b", [](const std::vector<AnyValue>& args) -> AnyValue {
             if (args[0].to<std::string>() == "animations/Hey_9")
               ZU_THROW_ERROR("ZUBehaviorManager", "preloadBehavior", "no such behavior");
             return true;
           }}});
  const auto proxy = std::make_shared<ZU::ZUBehaviorManagerProxy>(process.broker);
  EXPECT_TRUE(ZU::preloadABehavior(proxy, "animations/Stand/Gestures/Hey_1"));
  EXPECT_THAT(fake->calls(),
              ElementsAre(R"(preloadBehavior(s) ["animations/Stand/Gestures/Hey_1"])"));

  ko::log::ScopedCapture cap;
  EXPECT_FALSE(ZU::preloadABehavior(proxy, "animations/Hey_9"));
  EXPECT_TRUE(cap->contains("zucommon.zuproxy", ko::log::Warning,
                            "ZUBehaviorManager can't preload the behavior \"animations/Hey_9\" "
                            "exception: \tZUBehaviorManager::preloadBehavior\n\tno such behavior"));
  EXPECT_FALSE(ZU::preloadABehavior(nullptr, "animations/Hey_9"));
  EXPECT_TRUE(cap->containsPart("zucommon.zuproxy", ko::log::Warning, "module destroyed"));
}

}  // namespace
