#include "service_rig.h"

#include <utility>

#include "director_rig.h"
#include "ko/reaper.hpp"
#include "scripted_speech.h"
#include "zu/zuserviceproxies.h"

namespace mokutotest {

namespace {

constexpr const char* kBookmarkEvent = "ZUTextToSpeech/CurrentBookMark";

}  // namespace

ServiceRig::ServiceRig(double scale)
    : clock(std::make_shared<DrivenClock>(scale)),
      faults(std::make_shared<robotsim::FaultPlan>(std::vector<robotsim::Fault>{}, scale)) {
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  options.speech.recordAudio = false;
  options.behaviorsRoot = writeGestureLibrary(fLibrary);
  options.faults = faults;
  robot = std::make_unique<robotsim::Robot>(options);
  // The director's limits wait for bookmarks, which the robot's memory delivers.
  clock->watchDeliveries([memory = robot->memory()] { return memory->undelivered(kBookmarkEvent); },
                         [memory = robot->memory()] { return memory->delivered(kBookmarkEvent); });
  fWaiter.emplace(*robot->timeline());
  ZU::ZUAudioPlayerProxy(robot->broker()).loadSoundSet("bells");

  ZU::ZUMokutoOptions moduleOptions;
  moduleOptions.clock = clock;
  moduleOptions.bodyTalk.timeScale = 0.01;
  moduleOptions.onStage = [hook = fHook](ZU::ZUMokutoStage stage, ZU::MKID id) {
    std::function<void(ZU::ZUMokutoStage, ZU::MKID)> call;
    {
      std::lock_guard lock(hook->mutex);
      call = hook->call;
    }
    if (call)
      call(stage, id);
  };
  mokuto = ZU::ZUModule::createModule<ZU::ZUMokuto>(robot->broker(), ZU::ZUMokuto::kModuleName,
                                                    std::move(moduleOptions));
  mokuto->setBodyLanguageModeFromStr("disabled");
  mokuto->waitForIndex(kBound);
}

ServiceRig::~ServiceRig() {
  faults->lift();
  mokuto->exit();
  mokuto.reset();
  robot.reset();
  ko::waitForReaper();
}

std::future<void> ServiceRig::sayAsync(const std::string& text, const ZU::ZUValue& configuration) {
  return std::async(std::launch::async, [module = mokuto, text, configuration] {
    if (configuration.isValid())
      module->say(text, configuration);
    else
      module->say(text);
  });
}

std::size_t ServiceRig::endEvents(ZU::MKID id) const {
  std::size_t n = 0;
  for (const auto& [key, value] : raisedEvents(*robot->timeline()))
    n += key == ZU::ZUMokuto::kEndEvent && value.to<int>() == id ? 1U : 0U;
  return n;
}

std::size_t ServiceRig::events(const std::string& key) const {
  std::size_t n = 0;
  for (const auto& event : raisedEvents(*robot->timeline()))
    n += event.first == key ? 1U : 0U;
  return n;
}

bool ServiceRig::waitForTimeline(const std::string& service, const std::string& operation,
                                 std::size_t count) const {
  return fWaiter->waitUntil(
      [&] { return robot->timeline()->entries(service, operation).size() >= count; }, kBound);
}

void ServiceRig::setStageHook(std::function<void(ZU::ZUMokutoStage, ZU::MKID)> hook) {
  std::lock_guard lock(fHook->mutex);
  fHook->call = std::move(hook);
}

}  // namespace mokutotest
