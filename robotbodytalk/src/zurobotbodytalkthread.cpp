#include "zurobotbodytalkthread.h"

#include <exception>

#include "ko/log.hpp"
#include "zurobotbodytalkbodypart.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "robotbodytalk";
}  // namespace

ZURobotBodyTalkThread::ZURobotBodyTalkThread(std::shared_ptr<ko::EventLoop> loop,
                                             ZURobotBodyTalkTime time)
    : ko::PeriodicTask(std::move(loop)), fTime(time) {
  setName(kNameWithoutPart);
  setCallback([this] { xLoop(); });
}

ZURobotBodyTalkThread::~ZURobotBodyTalkThread() {
  {
    std::shared_lock partLock(fPartMutex);
    if (fPart)
      fPart->setRunning(false);
  }
  ko::PeriodicTask::stop();
}

void ZURobotBodyTalkThread::setBodyPart(ZURobotBodyTalkBodyPart* part) {
  std::unique_lock partLock(fPartMutex);
  fPart = part;
  setName(part ? kNamePrefix + part->getName() : std::string(kNameWithoutPart));
}

ZURobotBodyTalkBodyPart* ZURobotBodyTalkThread::getBodyPart() const {
  std::shared_lock partLock(fPartMutex);
  return fPart;
}

void ZURobotBodyTalkThread::start() {
  std::lock_guard controlLock(fControlMutex);
  std::shared_lock partLock(fPartMutex);
  if (!fPart || fPart->isRunning())
    return;
  fPart->setRunning(true);
  try {
    const int delay = fPart->getStartDelay();
    if (delay < 1) {
      setUsPeriod(fTime.usOf(fPart->getPause()));
      ko::PeriodicTask::start(true);
    } else {
      setUsPeriod(fTime.usOf(delay));
      ko::PeriodicTask::start(false);
    }
  } catch (const std::exception& e) {
    fPart->setRunning(false);
    KO_LOG_ERROR(kCategory) << "Cannot start " << name() << ": " << e.what();
  }
}

void ZURobotBodyTalkThread::requestStop() {
  std::lock_guard controlLock(fControlMutex);
  std::shared_lock partLock(fPartMutex);
  if (fPart && fPart->isRunning()) {
    fPart->setRunning(false);
    fPart->stop();
  }
}

void ZURobotBodyTalkThread::stop() {
  std::lock_guard controlLock(fControlMutex);
  ko::PeriodicTask::stop();
}

void ZURobotBodyTalkThread::notifyBehaviorStopped(const std::string& name) {
  std::shared_lock partLock(fPartMutex);
  if (fPart)
    fPart->onBehaviorStopped(name);
}

void ZURobotBodyTalkThread::xLoop() {
  std::lock_guard iterationLock(fIterationMutex);
  std::shared_lock partLock(fPartMutex);
  if (!fPart)
    return;
  while (fPart->isRunning()) {
    fPart->doOneIteration();
    fPart->afterIteration();
    const int pause = fPart->getPause();
    if (pause != 0) {
      setUsPeriod(fTime.usOf(pause));
      return;
    }
  }
}

}  // namespace ZU
