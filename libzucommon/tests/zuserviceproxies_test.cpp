#include "zu/zuserviceproxies.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "ko/log.hpp"
#include "zu/zumodule.h"
#include "zutest_modules.h"

namespace {

using ko::AnyValue;
using ZU::ZUValue;

// A stand-in for one robot service: publishes the methods it is given and records every
// call as "method(argument signature) [arguments]".
class FakeService : public ZU::ZUModule {
 public:
  using Handler = std::function<AnyValue(const std::vector<AnyValue>&)>;
  struct Method {
    std::string name;
    std::string parameters;
    std::string returns;
    Handler handler;
  };

  FakeService(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
              const std::vector<Method>& methods)
      : ZUModule(broker, name) {
    for (const auto& m : methods) {
      advertiseMethod(
          m.name, m.parameters, m.returns,
          [this, name = m.name, handler = m.handler](const std::vector<AnyValue>& args) {
            record(name, args);
            return handler(args);
          });
    }
  }

  std::vector<std::string> calls() const {
    std::lock_guard lock(fMutex);
    return fCalls;
  }

 private:
  void record(const std::string& name, const std::vector<AnyValue>& args) {
    std::string signature = "(";
    for (const auto& a : args)
      signature += a.signature();
    std::lock_guard lock(fMutex);
    fCalls.push_back(name + signature + ") " + AnyValue::list(args).toString());
  }
  mutable std::mutex fMutex;
  std::vector<std::string> fCalls;
};

FakeService::Handler reply(AnyValue value) {
  return [value](const std::vector<AnyValue>&) { return value; };
}

template <class T>
std::string print(const T& result) {
  return AnyValue::from(result).toString();
}

using Broker = std::shared_ptr<ZU::ZUBroker>;

struct ServiceCase {
  const char* name;
  const char* service;
  // The method that the fake publishes; none for the built-in task methods.
  const char* method;
  const char* parameters;
  const char* returns;
  AnyValue answer;
  // Makes the proxy, calls it and prints the result.
  std::function<std::string(const Broker&)> call;
  const char* expectedCall;  // "" when the fake records nothing
  const char* expectedResult;
};

void PrintTo(const ServiceCase& c, std::ostream* os) {
  *os << '"' << c.name << '"';
}

class ServiceProxyTest : public ::testing::TestWithParam<ServiceCase> {};

TEST_P(ServiceProxyTest, CallsTheRemoteMethodByNameAndConvertsTheResult) {
  const ServiceCase& c = GetParam();
  zutest::Process process;
  std::vector<FakeService::Method> methods;
  if (*c.method)
    methods.push_back({c.method, c.parameters, c.returns, reply(c.answer)});
  auto fake =
      ZU::ZUModule::createModule<FakeService>(process.broker, c.service, std::move(methods));

  EXPECT_EQ(c.call(process.broker), c.expectedResult);
  if (*c.expectedCall)
    EXPECT_THAT(fake->calls(), ::testing::ElementsAre(c.expectedCall));
  else
    EXPECT_TRUE(fake->calls().empty());
}

// Posts wait for their task through the service's built-in wait and print its answer.
INSTANTIATE_TEST_SUITE_P(
    Services, ServiceProxyTest,
    ::testing::Values(
        // ZUMemory
        ServiceCase{"declareEvent", "ZUMemory", "declareEvent", "(ss)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMemoryProxy(b).declareEvent("ZUMokuto/EndOfMokuto", "ZUMokuto");
                      return std::string("void");
                    },
                    R"(declareEvent(ss) ["ZUMokuto/EndOfMokuto", "ZUMokuto"])", "void"},
        ServiceCase{"raiseEvent", "ZUMemory", "raiseEvent", "(sm)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMemoryProxy(b).raiseEvent("ZUMokuto/EndOfMokuto", ZUValue(3));
                      return std::string("void");
                    },
                    R"(raiseEvent(si) ["ZUMokuto/EndOfMokuto", 3])", "void"},
        ServiceCase{
            "subscribeToEvent", "ZUMemory", "subscribeToEvent", "(sss)", "v", AnyValue(),
            [](const Broker& b) {
              ZU::ZUMemoryProxy(b).subscribeToEvent("PostureFamilyChanged", "ZUMokuto",
                                                    "_postureFamilyChangedCallback");
              return std::string("void");
            },
            R"(subscribeToEvent(sss) ["PostureFamilyChanged", "ZUMokuto", "_postureFamilyChangedCallback"])",
            "void"},
        ServiceCase{
            "subscribeToMicroEvent", "ZUMemory", "subscribeToMicroEvent", "(ssss)", "v", AnyValue(),
            [](const Broker& b) {
              ZU::ZUMemoryProxy(b).subscribeToMicroEvent("WordRecognized", "ZUMokuto",
                                                         "_dialogMatchedInputCallback",
                                                         "_dialogMatchedInputCallback");
              return std::string("void");
            },
            R"(subscribeToMicroEvent(ssss) ["WordRecognized", "ZUMokuto", "_dialogMatchedInputCallback", "_dialogMatchedInputCallback"])",
            "void"},
        ServiceCase{"unsubscribeToEvent", "ZUMemory", "unsubscribeToEvent", "(ss)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMemoryProxy(b).unsubscribeToEvent("PostureFamilyChanged", "ZUMokuto");
                      return std::string("void");
                    },
                    R"(unsubscribeToEvent(ss) ["PostureFamilyChanged", "ZUMokuto"])", "void"},
        // ZUTextToSpeech
        ServiceCase{"say", "ZUTextToSpeech", "say", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUTextToSpeechProxy(b).say("Hello");
                      return std::string("void");
                    },
                    R"(say(s) ["Hello"])", "void"},
        ServiceCase{"postSay", "ZUTextToSpeech", "say", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      const ZU::ZUTextToSpeechProxy tts(b);
                      const int id = tts.post_say("Hello \\mrk=1\\ world");
                      return print(tts.wait(id, 0));
                    },
                    R"(say(s) ["Hello \\mrk=1\\ world"])", "false"},
        ServiceCase{"ttsIsRunning", "ZUTextToSpeech", "", "", "", AnyValue(),
                    [](const Broker& b) { return print(ZU::ZUTextToSpeechProxy(b).isRunning(77)); },
                    "", "false"},
        ServiceCase{"ttsWait", "ZUTextToSpeech", "", "", "", AnyValue(),
                    [](const Broker& b) { return print(ZU::ZUTextToSpeechProxy(b).wait(77, 0)); },
                    "", "false"},
        ServiceCase{"ttsStop", "ZUTextToSpeech", "", "", "", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUTextToSpeechProxy(b).stop(77);
                      return std::string("void");
                    },
                    "", "void"},
        ServiceCase{"setParameter", "ZUTextToSpeech", "setParameter", "(sf)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUTextToSpeechProxy(b).setParameter("inputMode", 2.0f);
                      return std::string("void");
                    },
                    R"(setParameter(sf) ["inputMode", 2])", "void"},
        ServiceCase{"enableNotifications", "ZUTextToSpeech", "enableNotifications", "()", "v",
                    AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUTextToSpeechProxy(b).enableNotifications();
                      return std::string("void");
                    },
                    "enableNotifications() []", "void"},
        ServiceCase{"getLanguage", "ZUTextToSpeech", "getLanguage", "()", "s", AnyValue("French"),
                    [](const Broker& b) { return print(ZU::ZUTextToSpeechProxy(b).getLanguage()); },
                    "getLanguage() []", R"("French")"},
        // ZUBehaviorManager
        ServiceCase{"resolveBehaviorName", "ZUBehaviorManager", "resolveBehaviorName", "(s)", "s",
                    AnyValue("animations/Stand/Gestures/Hey_1"),
                    [](const Broker& b) {
                      return print(ZU::ZUBehaviorManagerProxy(b).resolveBehaviorName("Hey_1"));
                    },
                    R"(resolveBehaviorName(s) ["Hey_1"])", R"("animations/Stand/Gestures/Hey_1")"},
        ServiceCase{"preloadBehavior", "ZUBehaviorManager", "preloadBehavior", "(s)", "b",
                    AnyValue(true),
                    [](const Broker& b) {
                      return print(ZU::ZUBehaviorManagerProxy(b).preloadBehavior("a/Hey_1"));
                    },
                    R"(preloadBehavior(s) ["a/Hey_1"])", "true"},
        ServiceCase{"postPreloadBehavior", "ZUBehaviorManager", "preloadBehavior", "(s)", "b",
                    AnyValue(true),
                    [](const Broker& b) {
                      const ZU::ZUBehaviorManagerProxy bm(b);
                      return print(bm.wait(bm.post_preloadBehavior("a/Hey_1"), 0));
                    },
                    R"(preloadBehavior(s) ["a/Hey_1"])", "false"},
        ServiceCase{"getInstalledBehaviors", "ZUBehaviorManager", "getInstalledBehaviors", "()",
                    "[s]", AnyValue::list({"a/Hey_1", "a/Hey_2"}),
                    [](const Broker& b) {
                      return print(ZU::ZUBehaviorManagerProxy(b).getInstalledBehaviors());
                    },
                    "getInstalledBehaviors() []", R"(["a/Hey_1", "a/Hey_2"])"},
        ServiceCase{"getBehaviorTags", "ZUBehaviorManager", "getBehaviorTags", "(s)", "[s]",
                    AnyValue::list({"hello", "hi"}),
                    [](const Broker& b) {
                      return print(ZU::ZUBehaviorManagerProxy(b).getBehaviorTags("a/Hey_1"));
                    },
                    R"(getBehaviorTags(s) ["a/Hey_1"])", R"(["hello", "hi"])"},
        ServiceCase{"startBehavior", "ZUBehaviorManager", "startBehavior", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUBehaviorManagerProxy(b).startBehavior("a/Hey_1");
                      return std::string("void");
                    },
                    R"(startBehavior(s) ["a/Hey_1"])", "void"},
        ServiceCase{"stopBehavior", "ZUBehaviorManager", "stopBehavior", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUBehaviorManagerProxy(b).stopBehavior("a/Hey_1");
                      return std::string("void");
                    },
                    R"(stopBehavior(s) ["a/Hey_1"])", "void"},
        ServiceCase{"postStopBehavior", "ZUBehaviorManager", "stopBehavior", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      const ZU::ZUBehaviorManagerProxy bm(b);
                      return print(bm.wait(bm.post_stopBehavior("a/Hey_1"), 0));
                    },
                    R"(stopBehavior(s) ["a/Hey_1"])", "false"},
        ServiceCase{"runBehavior", "ZUBehaviorManager", "runBehavior", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUBehaviorManagerProxy(b).runBehavior("a/End");
                      return std::string("void");
                    },
                    R"(runBehavior(s) ["a/End"])", "void"},
        ServiceCase{"postRunBehavior", "ZUBehaviorManager", "runBehavior", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      const ZU::ZUBehaviorManagerProxy bm(b);
                      return print(bm.wait(bm.post_runBehavior("a/End"), 0));
                    },
                    R"(runBehavior(s) ["a/End"])", "false"},
        ServiceCase{"isBehaviorRunning", "ZUBehaviorManager", "isBehaviorRunning", "(s)", "b",
                    AnyValue(false),
                    [](const Broker& b) {
                      return print(ZU::ZUBehaviorManagerProxy(b).isBehaviorRunning("a/Hey_1"));
                    },
                    R"(isBehaviorRunning(s) ["a/Hey_1"])", "false"},
        // ZUMotion
        ServiceCase{"areResourcesAvailable", "ZUMotion", "areResourcesAvailable", "([s])", "b",
                    AnyValue(true),
                    [](const Broker& b) {
                      return print(ZU::ZUMotionProxy(b).areResourcesAvailable({"Head"}));
                    },
                    R"(areResourcesAvailable([s]) [["Head"]])", "true"},
        ServiceCase{
            "getAngles", "ZUMotion", "getAngles", "(mb)", "[f]", AnyValue::list({AnyValue(0.25f)}),
            [](const Broker& b) { return print(ZU::ZUMotionProxy(b).getAngles("HeadYaw", false)); },
            R"(getAngles(sb) ["HeadYaw", false])", "[0.25]"},
        ServiceCase{
            "angleInterpolationBezier", "ZUMotion", "angleInterpolationBezier", "(mmm)", "v",
            AnyValue(),
            [](const Broker& b) {
              ZU::ZUMotionProxy(b).angleInterpolationBezier(
                  ZUValue::makeArray({"HeadYaw"}), ZUValue::makeArray({ZUValue::makeArray({0.5f})}),
                  ZUValue::makeArray({ZUValue::makeArray({0.25f})}));
              return std::string("void");
            },
            R"(angleInterpolationBezier([s][[f]][[f]]) [["HeadYaw"], [[0.5]], [[0.25]]])", "void"},
        ServiceCase{"postAngleInterpolationBezier", "ZUMotion", "angleInterpolationBezier", "(mmm)",
                    "v", AnyValue(),
                    [](const Broker& b) {
                      const ZU::ZUMotionProxy motion(b);
                      const int id = motion.post_angleInterpolationBezier(
                          ZUValue::makeArray({"HeadPitch"}),
                          ZUValue::makeArray({ZUValue::makeArray({1.0f})}),
                          ZUValue::makeArray({ZUValue::makeArray({0.0f})}));
                      return print(motion.wait(id, 10000));
                    },
                    R"(angleInterpolationBezier([s][[f]][[f]]) [["HeadPitch"], [[1]], [[0]]])",
                    "false"},
        ServiceCase{"setAngles", "ZUMotion", "setAngles", "(mmf)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMotionProxy(b).setAngles("HeadYaw", 0.25f, 1.0f);
                      return std::string("void");
                    },
                    R"(setAngles(sff) ["HeadYaw", 0.25, 1])", "void"},
        ServiceCase{"motionWait", "ZUMotion", "", "", "", AnyValue(),
                    [](const Broker& b) { return print(ZU::ZUMotionProxy(b).wait(77, 10000)); }, "",
                    "false"},
        ServiceCase{"motionStop", "ZUMotion", "", "", "", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMotionProxy(b).stop(77);
                      return std::string("void");
                    },
                    "", "void"},
        ServiceCase{
            "getBreathEnabled", "ZUMotion", "getBreathEnabled", "(s)", "b", AnyValue(true),
            [](const Broker& b) { return print(ZU::ZUMotionProxy(b).getBreathEnabled("Arms")); },
            R"(getBreathEnabled(s) ["Arms"])", "true"},
        ServiceCase{"setBreathEnabled", "ZUMotion", "setBreathEnabled", "(sb)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUMotionProxy(b).setBreathEnabled("Arms", false);
                      return std::string("void");
                    },
                    R"(setBreathEnabled(sb) ["Arms", false])", "void"},
        // ZUAudioPlayer
        ServiceCase{"loadSoundSet", "ZUAudioPlayer", "loadSoundSet", "(s)", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAudioPlayerProxy(b).loadSoundSet("bells");
                      return std::string("void");
                    },
                    R"(loadSoundSet(s) ["bells"])", "void"},
        ServiceCase{"playSoundSetFile", "ZUAudioPlayer", "playSoundSetFile", "(ssidii)", "v",
                    AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAudioPlayerProxy(b).playSoundSetFile("bells", "ding", 0, 0.5, 0, 0);
                      return std::string("void");
                    },
                    R"(playSoundSetFile(ssidii) ["bells", "ding", 0, 0.5, 0, 0])", "void"},
        ServiceCase{"postPlaySoundSetFile", "ZUAudioPlayer", "playSoundSetFile", "(ssidii)", "v",
                    AnyValue(),
                    [](const Broker& b) {
                      const ZU::ZUAudioPlayerProxy audio(b);
                      return print(audio.wait(
                          audio.post_playSoundSetFile("bells", "ding", 0, 1.0, 0, 0), 0));
                    },
                    R"(playSoundSetFile(ssidii) ["bells", "ding", 0, 1, 0, 0])", "false"},
        ServiceCase{"audioStop", "ZUAudioPlayer", "", "", "", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAudioPlayerProxy(b).stop(77);
                      return std::string("void");
                    },
                    "", "void"},
        ServiceCase{"audioWait", "ZUAudioPlayer", "", "", "", AnyValue(),
                    [](const Broker& b) { return print(ZU::ZUAudioPlayerProxy(b).wait(77, 0)); },
                    "", "false"},
        // ZURobotPosture, ZURobotModel, ZUAutonomousMoves
        ServiceCase{
            "getPostureFamily", "ZURobotPosture", "getPostureFamily", "()", "s",
            AnyValue("Sitting"),
            [](const Broker& b) { return print(ZU::ZURobotPostureProxy(b).getPostureFamily()); },
            "getPostureFamily() []", R"("Sitting")"},
        ServiceCase{"getRobotType", "ZURobotModel", "_getRobotType", "()", "i", AnyValue(2),
                    [](const Broker& b) { return print(ZU::ZURobotModelProxy(b)._getRobotType()); },
                    "_getRobotType() []", "2"},
        ServiceCase{"moveForward", "ZUAutonomousMoves", "_moveForward", "()", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAutonomousMovesProxy(b)._moveForward();
                      return std::string("void");
                    },
                    "_moveForward() []", "void"},
        ServiceCase{"moveBackward", "ZUAutonomousMoves", "_moveBackward", "()", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAutonomousMovesProxy(b)._moveBackward();
                      return std::string("void");
                    },
                    "_moveBackward() []", "void"},
        ServiceCase{"moveSides", "ZUAutonomousMoves", "_moveSides", "()", "v", AnyValue(),
                    [](const Broker& b) {
                      ZU::ZUAutonomousMovesProxy(b)._moveSides();
                      return std::string("void");
                    },
                    "_moveSides() []", "void"}),
    [](const auto& param) { return std::string(param.param.name); });

TEST(ServiceProxyTest, AServiceThatIsGoneRaisesModuleDestroyed) {
  zutest::Process process;
  auto tts = ZU::ZUModule::createModule<FakeService>(
      process.broker, "ZUTextToSpeech",
      std::vector<FakeService::Method>{{"getLanguage", "()", "s", reply(AnyValue("French"))},
                                       {"say", "(s)", "v", reply(AnyValue())}});
  const ZU::ZUTextToSpeechProxy proxy(process.broker);
  EXPECT_EQ(proxy.getLanguage(), "French");

  tts->exit();
  tts.reset();
  for (const auto& call : std::vector<std::function<void()>>{[&] { proxy.getLanguage(); },
                                                             [&] { proxy.post_say("Hello"); },
                                                             [&] { proxy.wait(1, 0); }}) {
    try {
      call();
      FAIL() << "no error";
    } catch (const ZU::ZUError& e) {
      EXPECT_EQ(e.moduleName(), "ZUProxy");
      EXPECT_EQ(e.description(), "module destroyed");
    }
  }
}

TEST(ServiceProxyTest, AMissingServiceLeavesNoProxy) {
  zutest::Process process;
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUMotionProxy motion(process.broker); }),
            "Can't find service: ZUMotion");
}

TEST(ServiceProxyTest, TheRemoteErrorReachesTheCaller) {
  zutest::Process process;
  auto fake = ZU::ZUModule::createModule<FakeService>(
      process.broker, "ZUAudioPlayer",
      std::vector<FakeService::Method>{
          {"loadSoundSet", "(s)", "v", [](const std::vector<AnyValue>&) -> AnyValue {
             ZU_THROW_ERROR("ZUAudioPlayer", "loadSoundSet", "unknown sound set");
           }}});
  EXPECT_EQ(zutest::errorOf([&] { ZU::ZUAudioPlayerProxy(process.broker).loadSoundSet("x"); }),
            "unknown sound set");
}

class PreloadTest : public ::testing::Test {
 protected:
  void publish(FakeService::Handler handler) {
    fake_ = ZU::ZUModule::createModule<FakeService>(
        process_.broker, "ZUBehaviorManager",
        std::vector<FakeService::Method>{{"preloadBehavior", "(s)", "b", std::move(handler)}});
    proxy_ = std::make_shared<ZU::ZUBehaviorManagerProxy>(process_.broker);
  }
  zutest::Process process_;
  std::shared_ptr<FakeService> fake_;
  std::shared_ptr<ZU::ZUBehaviorManagerProxy> proxy_;
};

TEST_F(PreloadTest, PreloadsAndWaits) {
  publish(reply(AnyValue(true)));
  EXPECT_TRUE(ZU::preloadABehavior(proxy_, "animations/Stand/Gestures/Hey_1"));
  EXPECT_THAT(fake_->calls(),
              ::testing::ElementsAre(R"(preloadBehavior(s) ["animations/Stand/Gestures/Hey_1"])"));
}

TEST_F(PreloadTest, AFailureIsLoggedAsAWarning) {
  publish([](const std::vector<AnyValue>&) -> AnyValue {
    ZU_THROW_ERROR("ZUBehaviorManager", "preloadBehavior", "no such behavior");
  });
  ko::log::ScopedCapture cap;
  EXPECT_FALSE(ZU::preloadABehavior(proxy_, "animations/Hey_9"));
  EXPECT_TRUE(cap->contains("zucommon.zuproxy", ko::log::Warning,
                            "ZUBehaviorManager can't preload the behavior \"animations/Hey_9\" "
                            "exception: \tZUBehaviorManager::preloadBehavior\n\tno such behavior"));
  EXPECT_FALSE(ZU::preloadABehavior(nullptr, "animations/Hey_9"));
  EXPECT_TRUE(cap->containsPart("zucommon.zuproxy", ko::log::Warning, "module destroyed"));
}

}  // namespace
