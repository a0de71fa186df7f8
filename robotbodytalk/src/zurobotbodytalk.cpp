#include "robotbodytalk/zurobotbodytalk.h"

#include <exception>

#include "ko/log.hpp"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkarms.h"
#include "zurobotbodytalkhead.h"
#include "zurobotbodytalkthread.h"
#include "zurobotbodytalktime.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "robotbodytalk";
constexpr std::size_t kWorkerThreads = 2;

struct Instance {
  std::mutex mutex;
  ZURobotBodyTalk* controller = nullptr;
  int count = 0;
};

Instance& instance() {
  static Instance* const global = new Instance;  // never destroyed: usable at exit
  return *global;
}

}  // namespace

// ---- the process's instance ---------------------------------------------------------------

ZURobotBodyTalk* ZURobotBodyTalk::getInstance(const std::shared_ptr<ZUBroker>& broker,
                                              const ZURobotBodyTalkOptions& options) {
  Instance& global = instance();
  std::lock_guard lock(global.mutex);
  if (!global.controller)
    global.controller = new ZURobotBodyTalk(broker, options);
  ++global.count;
  return global.controller;
}

void ZURobotBodyTalk::releaseInstance() {
  Instance& global = instance();
  std::lock_guard lock(global.mutex);
  if (global.count == 0) {
    KO_LOG_WARNING(kCategory) << "The body talk was released more often than it was taken";
    return;
  }
  if (--global.count == 0) {
    delete global.controller;
    global.controller = nullptr;
  }
}

int ZURobotBodyTalk::getInstanceCount() {
  Instance& global = instance();
  std::lock_guard lock(global.mutex);
  return global.count;
}

ZURobotBodyTalkInstance::ZURobotBodyTalkInstance(const std::shared_ptr<ZUBroker>& broker,
                                                 const ZURobotBodyTalkOptions& options)
    : bodyTalk(ZURobotBodyTalk::getInstance(broker, options)) {}

ZURobotBodyTalkInstance::~ZURobotBodyTalkInstance() {
  ZURobotBodyTalk::releaseInstance();
}

// ---- the controller ---------------------------------------------------------------------

ZURobotBodyTalk::ZURobotBodyTalk(const std::shared_ptr<ZUBroker>& broker,
                                 const ZURobotBodyTalkOptions& options)
    : fTimeScale(ZURobotBodyTalkTime(options.timeScale).scale()),
      fLoop(options.eventLoop ? options.eventLoop
                              : std::make_shared<ko::EventLoop>("BodyTalk", kWorkerThreads)),
      fPosture(std::make_shared<ZURobotBodyTalkPosture>(broker)) {
  const ZURobotBodyTalkTime time(fTimeScale);
  try {
    fRobotModel = std::make_shared<ZURobotModelProxy>(broker);
    fHeadThread = std::make_unique<ZURobotBodyTalkThread>(fLoop, time);
    fArmsThread = std::make_unique<ZURobotBodyTalkThread>(fLoop, time);

    fArmsSpeaking = std::make_unique<ZURobotBodyTalkArms>(broker, fPosture,
                                                          ZURobotBodyTalkArms::kSpeaking, time);
    fArmsListening = std::make_unique<ZURobotBodyTalkArms>(broker, fPosture,
                                                           ZURobotBodyTalkArms::kListening, time);
    fArmsThread->setBodyPart(fArmsSpeaking.get());

    fHeadSpeaking = std::make_unique<ZURobotBodyTalkHeadSpeaking>(broker, fPosture, time);
    const int robotType = fRobotModel->_getRobotType();
    fHeadListening =
        std::make_unique<ZURobotBodyTalkHeadListening>(broker, fPosture, time, robotType);
    fHeadThread->setBodyPart(fHeadSpeaking.get());
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << e.what();
  }
}

ZURobotBodyTalk::~ZURobotBodyTalk() {
  stop();
  std::lock_guard lock(fMutex);
  fHeadThread.reset();
  fArmsThread.reset();
}

void ZURobotBodyTalk::xStopWorkers() {
  if (fArmsThread)
    fArmsThread->requestStop();
  if (fHeadThread)
    fHeadThread->requestStop();
  if (fHeadThread)
    fHeadThread->stop();
  if (fArmsThread)
    fArmsThread->stop();
}

void ZURobotBodyTalk::xAttachParts(Mode mode) {
  if (!fHeadThread || !fArmsThread)
    return;
  if (mode == kSpeaking) {
    fHeadThread->setBodyPart(fHeadSpeaking.get());
    fArmsThread->setBodyPart(fArmsSpeaking.get());
  } else if (mode == kListening) {
    fHeadThread->setBodyPart(fHeadListening.get());
    fArmsThread->setBodyPart(fArmsListening.get());
  }
}

void ZURobotBodyTalk::xStartWorkers() {
  if (fParts.arms && fArmsThread)
    fArmsThread->start();
  if (fParts.head && fHeadThread)
    fHeadThread->start();
}

void ZURobotBodyTalk::start(Mode mode, ZURobotBodyTalkParts parts, bool restart) {
  std::lock_guard lock(fMutex);
  if (fRunning.load()) {
    if (!restart)
      return;
    xStopWorkers();
    fRunning.store(false);
    fPaused.store(false);
  }
  fMode.store(mode);
  fParts = parts;
  xAttachParts(mode);
  fPosture->updateActivePostureFamily();
  xStartWorkers();
  fRunning.store(true);
  fPaused.store(false);
}

void ZURobotBodyTalk::prepare(Mode mode, ZURobotBodyTalkParts parts, bool restart) {
  std::lock_guard lock(fMutex);
  if (fRunning.load()) {
    if (!restart)
      return;
    xStopWorkers();
    fRunning.store(false);
  }
  fMode.store(mode);
  fParts = parts;
  xAttachParts(mode);
  fPaused.store(true);
}

void ZURobotBodyTalk::pause() {
  std::lock_guard lock(fMutex);
  if (!fRunning.load() || fPaused.load())
    return;
  xStopWorkers();
  fRunning.store(false);
  fPaused.store(true);
}

void ZURobotBodyTalk::resume() {
  std::lock_guard lock(fMutex);
  if (fRunning.load() || !fPaused.load())
    return;
  fPosture->updateActivePostureFamily();
  xStartWorkers();
  fRunning.store(true);
  fPaused.store(false);
}

void ZURobotBodyTalk::stop() {
  std::lock_guard lock(fMutex);
  xStopWorkers();
  fRunning.store(false);
  fPaused.store(false);
}

void ZURobotBodyTalk::onBehaviorStopped(const std::string& name) {
  std::lock_guard lock(fMutex);
  if (fRunning.load() && fArmsThread)
    fArmsThread->notifyBehaviorStopped(name);
}

void ZURobotBodyTalk::setSpeakingAnimations(PostureFamily postureFamily,
                                            const std::vector<std::string>& names) {
  if (fArmsSpeaking)
    fArmsSpeaking->setAnimations(names, postureFamily);
}

void ZURobotBodyTalk::setListeningAnimations(PostureFamily postureFamily,
                                             const std::vector<std::string>& names) {
  if (fArmsListening)
    fArmsListening->setAnimations(names, postureFamily);
}

std::vector<std::string> ZURobotBodyTalk::getSpeakingAnimations(PostureFamily postureFamily) const {
  return fArmsSpeaking ? fArmsSpeaking->getAnimations(postureFamily) : std::vector<std::string>{};
}

std::vector<std::string> ZURobotBodyTalk::getListeningAnimations(
    PostureFamily postureFamily) const {
  return fArmsListening ? fArmsListening->getAnimations(postureFamily) : std::vector<std::string>{};
}

bool ZURobotBodyTalk::areWorkersStopped() const {
  std::lock_guard lock(fMutex);
  return (!fHeadThread || !fHeadThread->isRunning()) && (!fArmsThread || !fArmsThread->isRunning());
}

}  // namespace ZU
