// The director's actions: animations (with their priorities and the body talk around them),
// sounds, calls of other services, body language modes, memory events.
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <exception>
#include <set>
#include <utility>
#include <vector>

#include "directortask_text.h"
#include "ko/log.hpp"
#include "mokuto/directortask.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "mokuto.director";
constexpr int kStopLimitMs = 200;
constexpr auto kNotificationCheck = std::chrono::seconds(5);
constexpr ZURobotBodyTalkParts kHeadAndArms{true, true};

// The service object's proxy, or a ZUError as a call through a missing proxy gives.
template <class Proxy>
const Proxy& live(const std::shared_ptr<Proxy>& proxy, const char* method) {
  if (!proxy)
    ZU_THROW_ERROR("ZUProxy", method, "module destroyed");
  return *proxy;
}

}  // namespace

void stopPlays(const ZUAudioPlayerProxy* audio, const std::vector<int>& plays) {
  for (const int play : plays) {
    try {
      if (!audio)
        ZU_THROW_ERROR("ZUProxy", "stop", "module destroyed");
      audio->stop(play);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUAudioPlayer has thrown an exception: " << e.what();
    }
  }
}

void DirectorTask::xDoAction(Text& text, const std::shared_ptr<MKTaskAction>& action) {
  MKTaskInstruction& job = *text.instruction;
  const auto mismatch = [&action] {
    KO_LOG_ERROR(kCategory) << "The action " << action->text << " of type "
                            << MKTaskActionType_toStr(action->type)
                            << " does not carry what its type needs: skipped.";
  };
  switch (action->type) {
    case AUTO_START_TAG:
    case START_TAG:
    case START:
    case RUN_TAG:
    case RUN:
    case WAIT:
    case WAIT_TAG:
    case STOP:
    case STOP_TAG: {
      auto* animation = dynamic_cast<MKAnimationAction*>(action.get());
      if (!animation)
        return mismatch();
      switch (animation->type) {
        case AUTO_START_TAG: {
          const MKAnimationAction copy = *animation;
          if (std::rand() % 2 == 1)
            xNotifyAutonomousMoves(copy.tag);
          bool contextual = false;
          {
            std::lock_guard lock(job.mutex);
            contextual = job.config.bodyLanguageMode == BODY_LANGUAGE_MODE_CONTEXTUAL;
          }
          if (contextual)
            xStartAnimation(text, copy);
          return;
        }
        case START_TAG:
        case START:
          return xStartAnimation(text, *animation);
        case RUN_TAG:
        case RUN: {
          {
            // The job's printed form (the diagnosis) reads the type under the job's mutex.
            std::lock_guard lock(job.mutex);
            animation->type = animation->type == RUN ? START : START_TAG;
          }
          xStartAnimation(text, *animation);
          AnimationLock lock(animationsMutex);
          return xWaitAnimation(lock, animation->animation, animation->type, -1);
        }
        case WAIT: {
          AnimationLock lock(animationsMutex);
          return xWaitAnimation(lock, animation->animation, START, -1);
        }
        case WAIT_TAG:
          return xWaitTag(animation->tag);
        case STOP:
        case STOP_TAG: {
          AnimationLock lock(animationsMutex);
          const bool byName = animation->type == STOP;
          for (const auto& entry : runningAnimations) {
            if (byName ? entry.type == START && entry.animation == animation->animation
                       : entry.type == START_TAG && entry.tag == animation->tag) {
              const MKAnimationAction found = entry;
              return xStopAnimation(lock, found);
            }
          }
          return;
        }
        default:
          return;
      }
    }
    case MODE: {
      const auto* mode = dynamic_cast<const MKModeAction*>(action.get());
      if (!mode)
        return mismatch();
      return xSetMode(text, mode->mode);
    }
    case START_SOUND:
    case RUN_SOUND:
    case STOP_SOUND:
    case WAIT_SOUND: {
      const auto* sound = dynamic_cast<const MKSoundAction*>(action.get());
      if (!sound)
        return mismatch();
      if (sound->type == STOP_SOUND)
        return xStopASound(*sound);
      if (sound->type == WAIT_SOUND)
        return xWaitASound(*sound);
      return xPlayASound(*sound);
    }
    case CALL:
    case PCALL: {
      const auto* call = dynamic_cast<const MKCallAction*>(action.get());
      if (!call)
        return mismatch();
      return xCall(*call);
    }
    case AFFECTATION: {
      const auto* affectation = dynamic_cast<const MKAffectationAction*>(action.get());
      if (!affectation)
        return mismatch();
      try {
        live(memory, "raiseEvent").raiseEvent(affectation->name, ZUValue(affectation->value));
      } catch (const std::exception& e) {
        KO_LOG_ERROR(kCategory) << "An error as been thrown when raising the event: "
                                << affectation->name << ":" << affectation->value
                                << " with this error: " << e.what();
      }
      return;
    }
    default:  // INPUT_MODE2, UNKNOWN and anything else: nothing
      return;
  }
}

void DirectorTask::xCall(const MKCallAction& call) {
  try {
    if (!call.proxy)
      ZU_THROW_ERROR(call.module, call.method, "Module " + call.module + " not found");
    const std::vector<ko::AnyValue> arguments = call.argumentList();
    if (call.type == CALL)
      call.proxy->callArgs<ko::AnyValue>(call.method, arguments);
    else
      call.proxy->pCall(call.method, arguments);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "An exception as been thrown during this call: " << call.module
                            << "." << call.method << "(" << call.arguments
                            << ") with this error: " << e.what();
  }
}

// ---- body talk and arm breathing ----------------------------------------------------------

void DirectorTask::xSpeechStarted(const std::shared_ptr<Text>& text) {
  MKTaskInstruction& job = *text->instruction;
  {
    AnimationLock animations(animationsMutex);
    std::lock_guard lock(job.mutex);
    // A status that comes after the speech (or after another text began) starts nothing.
    if (text->speechOver || text != xCurrentText() || !bodyTalk)
      return;
    if (job.config.bodyLanguageMode != BODY_LANGUAGE_MODE_DISABLED && runningAnimations.empty()) {
      bodyTalk->start(ZURobotBodyTalk::kSpeaking, kHeadAndArms, true);
      return;
    }
    bodyTalk->prepare(ZURobotBodyTalk::kSpeaking, kHeadAndArms, true);
  }
  // The motion service is asked without the locks, which a stop of the text takes.
  if (!job.config.armsBreathingAllowed && xArmsBreathingEnabled())
    xDisableArmsBreathing(*text);
}

bool DirectorTask::xArmsBreathingEnabled() {
  try {
    return live(motion, "getBreathEnabled").getBreathEnabled("Arms");
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUMotion.getBreathEnabled has thrown an exception: " << e.what();
    return false;
  }
}

void DirectorTask::xDisableArmsBreathing(Text& text) {
  // Held across the call, as the end of the text holds it to turn breathing back on: a
  // speech-start handler that met a slow motion service after the text ended (it was
  // stopped meanwhile) leaves breathing as the end of the text left it.
  std::lock_guard breath(fBreathMutex);
  {
    std::lock_guard lock(text.instruction->mutex);
    if (text.speechOver)
      return;
  }
  try {
    live(motion, "setBreathEnabled").setBreathEnabled("Arms", false);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUMotion.setBreathEnabled has thrown an exception: " << e.what();
    return;
  }
  armsBreathingDisabled = true;
}

void DirectorTask::xSetMode(Text& text, BodyLanguageMode mode) {
  MKTaskInstruction& job = *text.instruction;
  bool breathingAllowed = true;
  {
    std::lock_guard lock(job.mutex);
    job.config.bodyLanguageMode = mode;
    breathingAllowed = job.config.armsBreathingAllowed;
  }
  if (mode == BODY_LANGUAGE_MODE_RANDOM || mode == BODY_LANGUAGE_MODE_CONTEXTUAL) {
    AnimationLock lock(animationsMutex);
    if (mode == BODY_LANGUAGE_MODE_RANDOM)
      xStopAnimationsBelow(lock, START_TAG);
    if (runningAnimations.empty() && bodyTalk)
      bodyTalk->resume();
  } else if (mode == BODY_LANGUAGE_MODE_DISABLED) {
    if (!breathingAllowed && xArmsBreathingEnabled())
      xDisableArmsBreathing(text);
    if (bodyTalk)
      bodyTalk->pause();
    AnimationLock lock(animationsMutex);
    xStopAnimationsBelow(lock, START_TAG);
  }
}

void DirectorTask::xNotifyAutonomousMoves(const std::string& tag) {
  if (!autonomousMoves) {
    ko::AnyObject object;
    if (fSession) {
      for (const char* scope : {"local", ""}) {
        const auto found = fSession->service(ZUAutonomousMovesProxy::kServiceName, scope);
        if (found.wait(ZUBroker::deadlockTimeout()) == ko::FutureState::FinishedWithValue &&
            found.value() && found.value()->isValid()) {
          object = found.value();
          break;
        }
      }
    }
    if (!object) {
      KO_LOG_ERROR(kCategory) << "ZUAutonomousMoves module has not been found.";
      return;
    }
    autonomousMoves = std::make_shared<ZUAutonomousMovesProxy>(std::move(object));
  }
  try {
    if (tag == "yeah")
      autonomousMoves->_moveForward();
    else if (tag == "oppose")
      autonomousMoves->_moveBackward();
    else if (tag == "medidate")
      autonomousMoves->_moveSides();
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUAutonomousMoves has thrown an exception: " << e.what();
  }
}

// ---- animations -------------------------------------------------------------------------

void DirectorTask::xStartAnimation(Text& text, const MKAnimationAction& action) {
  if (action.type != START) {
    MKTaskInstruction& job = *text.instruction;
    std::lock_guard lock(job.mutex);
    if (bodyTalk && job.postureFamily != bodyTalk->getPostureFamily()) {
      KO_LOG_WARNING(kCategory) << "Tag \"" << action.tag
                                << "\" not launched because the robot posture has changed from "
                                   "the begin of the text";
      return;
    }
  }
  AnimationLock lock(animationsMutex);
  for (auto it = runningAnimations.begin(); it != runningAnimations.end(); ++it) {
    if (it->animation != action.animation)
      continue;
    if (action.type <= it->type)
      return;
    const MKAnimationAction entry = *it;
    xPostStopBehavior(entry.animation);
    xWaitAnimation(lock, entry.animation, entry.type, kStopLimitMs);
    break;
  }
  runningAnimations.insert(action);
  // The behaviour manager is called without the lock, which a stop of the text takes.
  std::string error;
  lock.unlock();
  try {
    live(behaviorManager, "startBehavior").startBehavior(action.animation);
  } catch (const std::exception& e) {
    error = e.what();
  }
  lock.lock();
  if (!error.empty()) {
    KO_LOG_ERROR(kCategory) << "Error caught while starting the animation: " << action.animation
                            << ", with this error: " << error;
    xRemoveRunningAnimation(lock, action.animation);
    return;
  }
  if (runningAnimations.count(action) == 0) {
    // Stopped (or over) while it started: what the start began goes too.
    xPostStopBehavior(action.animation);
    return;
  }
  xStopAnimationsBelow(lock, action.type);
  // Paused before the lock goes, so that the end of a short animation (which resumes the
  // body talk under the lock) cannot come first and leave the body talk paused.
  if (bodyTalk)
    bodyTalk->pause();
}

void DirectorTask::xWaitAnimation(AnimationLock& lock, const std::string& path,
                                  MKTaskActionType type, int limitMs) {
  const auto running = [this, &path, type] {
    for (const auto& entry : runningAnimations) {
      if (entry.type == type && entry.animation == path)
        return true;
    }
    return false;
  };
  // Each notification begins a fresh wait: the limit counts from the last change of the table.
  if (limitMs >= 0) {
    while (running()) {
      if (fClock->waitFor(animationsCondition, lock, std::chrono::milliseconds(limitMs),
                          MokutoClock::Wait::Limit) == std::cv_status::timeout &&
          running()) {
        KO_LOG_ERROR(kCategory) << "Behavior " << path << " did not stop before " << limitMs
                                << "ms, timeout expired.";
        xRemoveRunningAnimation(lock, path);
        return;
      }
    }
    return;
  }
  while (running()) {
    if (fClock->waitFor(animationsCondition, lock, kNotificationCheck, MokutoClock::Wait::Limit) !=
            std::cv_status::timeout ||
        !running())
      continue;
    bool stillRunning = false;
    lock.unlock();  // as for a start
    try {
      stillRunning = live(behaviorManager, "isBehaviorRunning").isBehaviorRunning(path);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUBehaviorManager.isBehaviorRunning has thrown an exception: "
                              << e.what();
    }
    lock.lock();
    if (stillRunning || !running())
      continue;
    KO_LOG_ERROR(kCategory) << "MK hasn't been notified that the behavior: \"" << path
                            << "\" has stopped.\nMake sure that the animation name follow the "
                               "pattern: \"package/animationPath\"";
    xRemoveRunningAnimation(lock, path);
    return;
  }
}

void DirectorTask::xPostStopBehavior(const std::string& path) {
  try {
    live(behaviorManager, "stopBehavior").post_stopBehavior(path);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUBehaviorManager.stopBehavior has thrown an exception: "
                            << e.what();
  }
}

void DirectorTask::xStopAnimation(AnimationLock& lock, const MKAnimationAction& entry) {
  xPostStopBehavior(entry.animation);
  xWaitAnimation(lock, entry.animation, entry.type, kStopLimitMs);
}

void DirectorTask::xStopAnimationsBelow(AnimationLock& lock, MKTaskActionType limit) {
  std::set<std::string> asked;
  for (const auto& entry : runningAnimations) {
    if (entry.type < limit && asked.insert(entry.animation).second)
      xPostStopBehavior(entry.animation);
  }
  // An entry that came meanwhile (a start in another thread) is asked in its turn.
  while (!runningAnimations.empty() && runningAnimations.begin()->type < limit) {
    const MKAnimationAction first = *runningAnimations.begin();
    if (asked.insert(first.animation).second)
      xPostStopBehavior(first.animation);
    xWaitAnimation(lock, first.animation, first.type, kStopLimitMs);
  }
}

void DirectorTask::xWaitTag(const std::string& tag) {
  AnimationLock lock(animationsMutex);
  for (;;) {
    std::string path;
    for (const auto& entry : runningAnimations) {
      if (entry.type == START_TAG && entry.tag == tag) {
        path = entry.animation;
        break;
      }
    }
    if (path.empty())
      return;
    xWaitAnimation(lock, path, START_TAG, -1);
  }
}

void DirectorTask::xStopAllAnimations() {
  if (bodyTalk)
    bodyTalk->stop();
  AnimationLock lock(animationsMutex);
  xStopAnimationsBelow(lock, UNKNOWN);
}

void DirectorTask::xOnBehaviorStopped(const std::string& path) {
  bool handled = false;
  {
    AnimationLock lock(animationsMutex);
    handled = xRemoveRunningAnimation(lock, path);
  }
  if (!handled && bodyTalk)
    bodyTalk->onBehaviorStopped(path);
}

bool DirectorTask::xRemoveRunningAnimation(AnimationLock& /*lock*/, const std::string& path) {
  auto it = runningAnimations.begin();
  while (it != runningAnimations.end() && it->animation != path)
    ++it;
  if (it == runningAnimations.end())
    return false;
  runningAnimations.erase(it);
  animationsCondition.notify_all();
  {
    const std::shared_ptr<Text> text = xCurrentText();
    MKTaskInstruction& job = *text->instruction;
    std::lock_guard lock(job.mutex);
    if (job.config.bodyLanguageMode != BODY_LANGUAGE_MODE_DISABLED && runningAnimations.empty() &&
        bodyTalk) {
      bodyTalk->resume();
    }
  }
  try {
    behaviorStoppedSignal(path);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "A receiver of the stop of " << path
                            << " has thrown an exception: " << e.what();
  }
  return true;
}

// ---- sounds -----------------------------------------------------------------------------

void DirectorTask::xPlayASound(const MKSoundAction& action) {
  const double volume = static_cast<double>(static_cast<std::uint32_t>(action.volume)) / 100.0;
  try {
    const ZUAudioPlayerProxy& player = live(audioPlayer, "playSoundSetFile");
    if (action.type == START_SOUND) {
      const int playId =
          player.post_playSoundSetFile(action.soundSet, action.soundName, 0, volume, 0, 0);
      std::lock_guard lock(soundsMutex);
      runningSounds.push_back({action, playId});
    } else {
      player.playSoundSetFile(action.soundSet, action.soundName, 0, volume, 0, 0);
    }
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "the play of a file: \"" << action.soundSet << "/"
                            << action.soundName << "\" throw an error: " << e.what();
  }
}

void DirectorTask::xStopASound(const MKSoundAction& action) {
  // The audio player is called without the lock, which a stop of the text takes.
  std::vector<int> plays;
  {
    std::lock_guard lock(soundsMutex);
    for (auto it = runningSounds.begin(); it != runningSounds.end(); ++it) {
      if (it->action.soundSet == action.soundSet && it->action.soundName == action.soundName) {
        plays.push_back(it->playId);
        runningSounds.erase(it);
        break;
      }
    }
  }
  stopPlays(audioPlayer.get(), plays);
}

void DirectorTask::xWaitASound(const MKSoundAction& action) {
  // The wait is made without the lock, so that a stop of the text ends the sound at once.
  int playId = -1;
  {
    std::lock_guard lock(soundsMutex);
    for (const auto& sound : runningSounds) {
      if (sound.action.soundSet == action.soundSet && sound.action.soundName == action.soundName) {
        playId = sound.playId;
        break;
      }
    }
  }
  if (playId == -1)
    return;
  try {
    live(audioPlayer, "wait").wait(playId, 0);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUAudioPlayer.wait has thrown an error: " << e.what();
  }
  std::lock_guard lock(soundsMutex);
  for (auto it = runningSounds.begin(); it != runningSounds.end(); ++it) {
    if (it->playId == playId) {
      runningSounds.erase(it);
      return;
    }
  }
}

std::vector<int> DirectorTask::xTakeRunningSounds() {
  std::vector<int> plays;
  std::lock_guard lock(soundsMutex);
  for (const auto& sound : runningSounds)
    plays.push_back(sound.playId);
  runningSounds.clear();
  return plays;
}

void DirectorTask::xStopAllSounds() {
  stopPlays(audioPlayer.get(), xTakeRunningSounds());
}

}  // namespace ZU
