#include "director_rig.h"

#include <utility>

#include "ko/reaper.hpp"
#include "ko/session.hpp"
#include "mokuto/zumokutoparser.h"
#include "robotsim/robot.h"
#include "robotsim/zuaudioplayer.h"
#include "robotsim/zubehaviormanager.h"
#include "robotsim/zumemory.h"
#include "robotsim/zumotion.h"
#include "robotsim/zurobotstate.h"
#include "support/behavior_files.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace mokutotest {

namespace {

struct Gesture {
  const char* path;
  double seconds;
  const char* joint;
  std::vector<std::string> tags;
};
// Each on joints of its own: no gesture takes another's joints over.
const Gesture kGestures[] = {
    {kShort, 0.3, "LWristYaw", {"short"}},          {kMid, 1.0, "LShoulderRoll", {"mid"}},
    {kLongA, 30.0, "LElbowYaw", {"hello", "long"}}, {kLongB, 30.0, "RElbowYaw", {"hello"}},
    {kLongC, 30.0, "RWristYaw", {"yeah"}},          {kEnd, 0.2, "RShoulderRoll", {"end"}},
};

}  // namespace

std::string firstArgument(const robotsim::TimelineEntry& entry) {
  try {
    const auto list = entry.arguments.to<std::vector<ko::AnyValue>>();
    return list.empty() ? std::string() : list.front().to<std::string>();
  } catch (const std::exception&) {
    return {};
  }
}

std::vector<std::pair<std::string, ko::AnyValue>> raisedEvents(const robotsim::Timeline& timeline) {
  std::vector<std::pair<std::string, ko::AnyValue>> events;
  for (const auto& entry : timeline.entries("ZUMemory", "raiseEvent")) {
    try {
      const auto arguments = entry.arguments.to<std::vector<ko::AnyValue>>();
      events.emplace_back(arguments.at(0).to<std::string>(), arguments.at(1));
    } catch (const std::exception&) {
    }
  }
  return events;
}

const std::string& writeGestureLibrary(const ko::test::ScratchFolder& folder) {
  for (const auto& [path, seconds, joint, tags] : kGestures)
    folder.write(std::string(path) + "/behavior.json",
                 robotsim::simtest::descriptor(tags, seconds, joint, 0.2));
  return folder.path().native();
}

DirectorRig::DirectorRig(Speech kind, bool director) {
  using ZU::ZUModule;
  const std::string& library = writeGestureLibrary(fLibrary);
  if (kind == Speech::Espeak) {
    robotsim::RobotOptions options;
    options.behaviorsRoot = library;
    fRobot = std::make_unique<robotsim::Robot>(options);
    broker = fRobot->broker();
    timeline = fRobot->timeline();
  } else {
    broker = ZU::ZUBroker::create(std::make_shared<ko::Session>());
    timeline = std::make_shared<robotsim::Timeline>();
    robotsim::ZUMemoryOptions memory;
    memory.timeline = timeline;
    fServices.push_back(ZUModule::createModule<robotsim::ZUMemory>(broker, "ZUMemory", memory));
    fServices.push_back(ZUModule::createModule<robotsim::ZUMotion>(broker, "ZUMotion", timeline));
    fServices.push_back(ZUModule::createModule<robotsim::ZUBehaviorManager>(
        broker, "ZUBehaviorManager", timeline, library));
    fServices.push_back(
        ZUModule::createModule<robotsim::ZUAudioPlayer>(broker, "ZUAudioPlayer", timeline));
    fServices.push_back(
        ZUModule::createModule<robotsim::ZURobotPosture>(broker, "ZURobotPosture", timeline));
    fServices.push_back(ZUModule::createModule<robotsim::ZURobotModel>(broker, "ZURobotModel"));
    fServices.push_back(
        ZUModule::createModule<robotsim::ZUAutonomousMoves>(broker, "ZUAutonomousMoves", timeline));
    speech = ZUModule::createModule<ScriptedSpeech>(broker, "ZUTextToSpeech");
    fServices.push_back(speech);
  }
  fWaiter.emplace(*timeline);
  ZU::ZUAudioPlayerProxy(broker).loadSoundSet("bells");
  if (!director)
    return;
  host = ZUModule::createModule<DirectorHost>(broker, "ZUMokuto");
  // As the posture watcher would report it: the body talk moves the head.
  host->bodyTalk()->getPosture()->setPostureFamily(ZU::Standing);
}

DirectorRig::~DirectorRig() {
  if (host)
    host->exit();
  host.reset();
  fRobot.reset();
  while (!fServices.empty()) {
    fServices.back()->exit();
    fServices.pop_back();
  }
  speech.reset();
  broker.reset();
  ko::waitForReaper();
}

std::shared_ptr<robotsim::ZUTextToSpeech> DirectorRig::espeak() const {
  return fRobot ? fRobot->speech() : nullptr;
}

std::shared_ptr<ZU::MKTaskInstruction> DirectorRig::job(
    const std::string& annotated, const ZU::MokutoConfig& config,
    const std::map<std::string, std::string>& tags) {
  auto job = std::make_shared<ZU::MKTaskInstruction>();
  job->config = config;
  ZU::ZUMokutoParser().parse(job, annotated, false);
  for (const auto& action : job->actions) {
    if (auto* animation = dynamic_cast<ZU::MKAnimationAction*>(action.get())) {
      if (animation->animation.empty()) {
        const auto it = tags.find(animation->tag);
        animation->animation = it != tags.end() ? it->second : animation->tag;
      }
    } else if (auto* call = dynamic_cast<ZU::MKCallAction*>(action.get())) {
      try {
        call->proxy = std::make_shared<ZU::ZUProxy>(call->module, broker);
      } catch (const std::exception&) {
        call->markAsError("MODULE_NOT_FOUND");
      }
    }
  }
  return job;
}

std::future<ZU::MKID> DirectorRig::sayAsync(std::shared_ptr<ZU::MKTaskInstruction> job) {
  return std::async(std::launch::async,
                    [host = host, job = std::move(job)] { return host->say(job); });
}

std::size_t DirectorRig::count(const std::string& service, const std::string& operation,
                               const std::string& first) const {
  std::size_t n = 0;
  for (const auto& entry : timeline->entries(service, operation)) {
    if (first.empty() || firstArgument(entry) == first)
      ++n;
  }
  return n;
}

bool DirectorRig::waitFor(const std::string& service, const std::string& operation,
                          const std::string& first, std::size_t wanted) const {
  return fWaiter->waitUntil([&] { return count(service, operation, first) >= wanted; }, kBound);
}

}  // namespace mokutotest
