// The director stage: the speech, the bookmarks and the order of the actions, the stop of a
// text and the end of a text. The actions themselves are in directortaskactions.cpp.
#include "mokuto/directortask.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdlib>
#include <exception>
#include <string_view>
#include <system_error>
#include <utility>

#include "directortask_text.h"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "mokuto/mkidregister.h"
#include "mokuto/mokutotimechecker.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "mokuto.director";
constexpr const char* kModuleName = "ZUMokuto";
constexpr const char* kBookmarkEvent = "ZUTextToSpeech/CurrentBookMark";
constexpr const char* kBookmarkCallback = "_speechBookMarkCallback";
constexpr const char* kStatusEvent = "ZUTextToSpeech/Status";
constexpr const char* kStatusCallback = "_speechStatusCallback";
constexpr const char* kBehaviorStopped = "behaviorStopped";
constexpr auto kBookmarkRound = std::chrono::milliseconds(500);
constexpr auto kBookmarkGrace = std::chrono::milliseconds(400);

// A proxy of the service, or null (logged) when the service is not there.
template <class Proxy>
std::shared_ptr<Proxy> makeProxy(const std::shared_ptr<ZUBroker>& broker) {
  try {
    return std::make_shared<Proxy>(broker);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Module " << Proxy::kServiceName << " not found: " << e.what();
    return nullptr;
  }
}

// A decimal 32-bit integer, an optional sign then digits only.
bool parseInt32(std::string_view text, std::int32_t& out) {
  if (!text.empty() && text.front() == '+')
    text.remove_prefix(1);
  if (text.empty() || text.front() == '+')
    return false;
  const char* end = text.data() + text.size();
  const auto [ptr, ec] = std::from_chars(text.data(), end, out);
  return ec == std::errc() && ptr == end;
}

}  // namespace

std::cv_status DirectorClock::waitFor(std::condition_variable& condition,
                                      std::unique_lock<std::mutex>& lock,
                                      std::chrono::milliseconds duration) {
  return condition.wait_for(lock, duration);
}

bool DirectorTask::AnimationOrder::operator()(const MKAnimationAction& a,
                                              const MKAnimationAction& b) const noexcept {
  return a.type != b.type ? a.type < b.type : a.id < b.id;
}

DirectorTask::DirectorTask(const std::shared_ptr<ZUBroker>& broker,
                           ZURobotBodyTalk* bodyTalkController, MKIDRegister& textRegister)
    : mkidRegister(textRegister),
      bodyTalk(bodyTalkController),
      fSession(broker ? broker->session() : nullptr),
      currentText(std::make_shared<Text>(std::make_shared<MKTaskInstruction>(), nullptr)),
      fClock(std::make_shared<DirectorClock>()) {
  tts = makeProxy<ZUTextToSpeechProxy>(broker);
  if (!tts)
    throw ZUError(kModuleName, "Constructor", "Module ZUTextToSpeech not found",
                  "mokuto/src/directortask", 81);
  behaviorManager = makeProxy<ZUBehaviorManagerProxy>(broker);
  audioPlayer = makeProxy<ZUAudioPlayerProxy>(broker);
  memory = makeProxy<ZUMemoryProxy>(broker);
  motion = makeProxy<ZUMotionProxy>(broker);
  if (fSession) {
    try {
      behaviorManagerService = fSession->service(ZUBehaviorManagerProxy::kServiceName).value();
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "Module ZUBehaviorManager not found: " << e.what();
    }
  }
  timeChecker = std::make_shared<MokutoTimeChecker>(memory);
  try {
    tts->enableNotifications();
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "tts.enableNotifications has thrown an exception: " << e.what();
  }
}

DirectorTask::~DirectorTask() {
  // The signal's subscriber uses this object.
  std::lock_guard lock(fLinkMutex);
  if (fBehaviorStoppedLink != ko::kInvalidSignalLink && behaviorManagerService) {
    try {
      behaviorManagerService->disconnect(fBehaviorStoppedLink);
    } catch (const std::exception&) {
      // The behaviour manager is gone, and its signal with it.
    }
  }
}

// ---- subscriptions ----------------------------------------------------------------------

void DirectorTask::subscribeToEvents() {
  for (const auto& [event, callback] :
       {std::pair{kBookmarkEvent, kBookmarkCallback}, std::pair{kStatusEvent, kStatusCallback}}) {
    try {
      if (!memory)
        ZU_THROW_ERROR("ZUProxy", "subscribeToEvent", "module destroyed");
      memory->subscribeToEvent(event, kModuleName, callback);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "Exception caught when subscribing to the event: \"" << event
                              << "\" with this error: " << e.what();
    }
  }
  std::lock_guard lock(fLinkMutex);
  try {
    if (!behaviorManagerService)
      ZU_THROW_ERROR("ZUProxy", "connect", "module destroyed");
    if (fBehaviorStoppedLink == ko::kInvalidSignalLink) {
      fBehaviorStoppedLink = behaviorManagerService->connect(
          kBehaviorStopped, [this](std::string path) { xOnBehaviorStopped(path); });
    }
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Exception caught when connecting to the signal: \""
                            << kBehaviorStopped << "\" with this error: " << e.what();
  }
}

void DirectorTask::unsubscribeToEvents() {
  for (const char* event : {kBookmarkEvent, kStatusEvent}) {
    try {
      if (!memory)
        ZU_THROW_ERROR("ZUProxy", "unsubscribeToEvent", "module destroyed");
      memory->unsubscribeToEvent(event, kModuleName);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "Exception caught when unsubscribing to the event: \"" << event
                              << "\" with this error: " << e.what();
    }
  }
  std::lock_guard lock(fLinkMutex);
  try {
    if (!behaviorManagerService)
      ZU_THROW_ERROR("ZUProxy", "disconnect", "module destroyed");
    const ko::SignalLink link = std::exchange(fBehaviorStoppedLink, ko::kInvalidSignalLink);
    behaviorManagerService->disconnect(link);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Exception caught when disconnecting to the signal: \""
                            << kBehaviorStopped << "\" with this error: " << e.what();
  }
}

// ---- the current text -------------------------------------------------------------------

std::shared_ptr<DirectorTask::Text> DirectorTask::xCurrentText() const {
  std::lock_guard lock(fCurrentMutex);
  return currentText;
}

void DirectorTask::xSetCurrentText(std::shared_ptr<Text> text) {
  std::lock_guard lock(fCurrentMutex);
  currentText = std::move(text);
}

void DirectorTask::setObserver(std::shared_ptr<DirectorObserver> observer) {
  std::lock_guard lock(fObserverMutex);
  fObserver = std::move(observer);
}

void DirectorTask::setClock(std::shared_ptr<DirectorClock> clock) {
  std::lock_guard lock(fObserverMutex);
  fClock = clock ? std::move(clock) : std::make_shared<DirectorClock>();
}

void DirectorTask::xDropRemainingActions(Text& text) {
  MKTaskInstruction& job = *text.instruction;
  const std::int64_t now = text.observer ? ko::os::ustime() : 0;
  for (; job.currentAction < job.actions.size(); ++job.currentAction) {
    const std::size_t index = job.currentAction;
    if (text.observer && index != text.executing && index < text.traces.size()) {
      Text::Trace& trace = text.traces[index];
      trace.outcome = DirectorActionReport::Outcome::Dropped;
      trace.endUs = now;
      trace.done = true;
    }
    if (const auto& action = job.actions[index])
      action->condition->notify_all();
  }
}

void DirectorTask::xReport(Text& text, std::size_t index) {
  // With the job's mutex held by the caller's unique_lock, which this releases meanwhile.
  MKTaskInstruction& job = *text.instruction;
  Text::Trace& trace = text.traces[index];
  if (trace.reported || !trace.done)
    return;
  trace.reported = true;
  DirectorActionReport report;
  report.textId = job.id;
  report.bookmark = job.actions[index] ? job.actions[index]->id : 0;
  report.type = trace.type;
  report.outcome = trace.outcome;
  report.bookmarkUs = trace.bookmarkUs;
  report.beginUs = trace.beginUs;
  report.endUs = trace.endUs;
  report.action = job.actions[index];
  job.mutex.unlock();
  try {
    text.observer->onAction(report);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "The sync observer has thrown an exception: " << e.what();
  }
  job.mutex.lock();
}

void DirectorTask::xReportDropped(Text& text) {
  for (std::size_t index = 0; index < text.traces.size(); ++index)
    xReport(text, index);
}

// ---- the stage --------------------------------------------------------------------------

void DirectorTask::process(const std::shared_ptr<MKTaskInstruction>& instruction) {
  if (!instruction)
    return;
  std::shared_ptr<DirectorObserver> observer;
  std::shared_ptr<DirectorClock> clock;
  {
    std::lock_guard lock(fObserverMutex);
    observer = fObserver;
    clock = fClock;
  }
  const auto text = std::make_shared<Text>(instruction, std::move(observer));
  MKTaskInstruction& job = *instruction;
  const MKID id = job.id;

  std::unique_lock lock(job.mutex);
  if (text->observer) {
    text->traces.resize(job.actions.size());
    for (std::size_t k = 0; k < job.actions.size(); ++k)
      text->traces[k].type = job.actions[k] ? job.actions[k]->type : UNKNOWN;
  }
  xSetCurrentText(text);
  lock.unlock();
  // A stop that came after the module's last check found another text current: it takes
  // effect now, as if it had come an instant later.
  if (mkidRegister.isMKIDStopped(id))
    stop(id);
  lock.lock();

  const bool inputMode2 = job.config.inputMode2;
  if (inputMode2) {
    try {
      tts->setParameter("inputMode", 2.0F);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUTextToSpeech.setParameter has thrown an exception: "
                              << e.what();
    }
  }
  if (timeChecker->enabled())
    timeChecker->startOfTTS(id);
  {
    // No notification goes on to the job's mutex while postId is -1.
    std::unique_lock speech(ttsMutex);
    try {
      postId = tts->post_say(job.text);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUTextToSpeech.say has thrown an exception: " << e.what();
    }
  }

  // The actions, in list order, each once its bookmark has come.
  const auto received = [&text](std::size_t index) {
    const auto& r = text->receivedBookmarks;
    return std::find(r.begin(), r.end(), index) != r.end();
  };
  const auto done = [&](std::size_t index, DirectorActionReport::Outcome outcome) {
    // The current action is over: the next one, and its "mrkpause" caller goes on.
    if (job.currentAction >= job.actions.size())
      return;
    auto& r = text->receivedBookmarks;
    r.erase(std::remove(r.begin(), r.end(), job.currentAction), r.end());
    if (const auto& action = job.actions[job.currentAction])
      action->condition->notify_all();
    ++job.currentAction;
    if (text->observer && outcome == DirectorActionReport::Outcome::Skipped) {
      Text::Trace& trace = text->traces[index];
      trace.outcome = outcome;
      trace.endUs = ko::os::ustime();
      trace.done = true;
      xReport(*text, index);
    }
  };
  while (job.currentAction < job.actions.size()) {
    const std::size_t index = job.currentAction;
    if (received(index)) {
      const std::shared_ptr<MKTaskAction> action = job.actions[index];
      text->executing = index;
      if (text->observer)
        text->traces[index].beginUs = ko::os::ustime();
      lock.unlock();
      if (action) {
        try {
          xDoAction(*text, action);
        } catch (const std::exception& e) {
          KO_LOG_ERROR(kCategory) << "The action " << action->text
                                  << " has thrown an exception: " << e.what();
        }
      }
      lock.lock();
      text->executing = Text::kNone;
      if (text->observer) {
        Text::Trace& trace = text->traces[index];
        trace.endUs = ko::os::ustime();
        trace.outcome = DirectorActionReport::Outcome::Executed;
        trace.done = true;
      }
      if (job.currentAction == index)
        done(index, DirectorActionReport::Outcome::Executed);
      if (text->observer)
        xReport(*text, index);
      continue;
    }
    const bool running = xIsSpeechRunning();
    if (text->receivedBookmarks.empty() && running) {
      clock->waitFor(text->bookmarkCondition, lock, kBookmarkRound);
      continue;
    }
    if (clock->waitFor(text->bookmarkCondition, lock, kBookmarkGrace) == std::cv_status::no_timeout)
      continue;
    if (job.currentAction < job.actions.size()) {
      const std::size_t late = job.currentAction;
      KO_LOG_ERROR(kCategory) << "The instruction with id "
                              << (job.actions[late] ? job.actions[late]->id : 0)
                              << " has not been received in time.";
      done(late, DirectorActionReport::Outcome::Skipped);
    }
  }
  if (text->observer)
    xReportDropped(*text);
  lock.unlock();

  xEndOfText(*text);
  xSetCurrentText(std::make_shared<Text>(std::make_shared<MKTaskInstruction>(), nullptr));
}

bool DirectorTask::xIsSpeechRunning() {
  std::shared_lock speech(ttsMutex);
  if (postId == -1)
    return false;
  try {
    return tts->isRunning(postId);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "ZUTextToSpeech.isRunning has thrown an exception: " << e.what();
    return false;
  }
}

bool DirectorTask::isTextToSpeechRunning() {
  return xIsSpeechRunning();
}

void DirectorTask::xEndOfText(Text& text) {
  MKTaskInstruction& job = *text.instruction;
  {
    std::shared_lock speech(ttsMutex);
    if (postId != -1) {
      try {
        tts->wait(postId, 0);
      } catch (const std::exception& e) {
        KO_LOG_ERROR(kCategory) << "ZUTextToSpeech.wait has thrown an exception: " << e.what();
      }
    }
  }
  {
    std::unique_lock speech(ttsMutex);
    postId = -1;
  }
  {
    std::lock_guard lock(job.mutex);
    text.speechOver = true;
  }
  if (timeChecker->enabled())
    timeChecker->stopOfTTS(job.id);
  if (job.config.inputMode2) {
    try {
      tts->setParameter("inputMode", 3.0F);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUTextToSpeech.setParameter has thrown an exception: "
                              << e.what();
    }
  }
  xStopAllAnimations();
  xStopAllSounds();

  bool restoreBreathing = false;
  {
    std::lock_guard lock(fBreathMutex);
    restoreBreathing = std::exchange(armsBreathingDisabled, false);
  }
  if (restoreBreathing) {
    try {
      if (!motion)
        ZU_THROW_ERROR("ZUProxy", "setBreathEnabled", "module destroyed");
      motion->setBreathEnabled("Arms", true);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "ZUMotion.setBreathEnabled has thrown an exception: " << e.what();
    }
  }

  const std::string& behavior = job.config.behaviorAtEndOfMokuto;
  if (!behavior.empty()) {
    try {
      if (!behaviorManager)
        ZU_THROW_ERROR("ZUProxy", "runBehavior", "module destroyed");
      if (job.config.ifBehaviorAtEndOfMokutoIsBlocking)
        behaviorManager->runBehavior(behavior);
      else
        behaviorManager->post_runBehavior(behavior);
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "error while playing the behavior \"" << behavior
                              << "\": " << e.what();
    }
  }
}

// ---- stop -------------------------------------------------------------------------------

void DirectorTask::stop(MKID id) {
  xStopAllAnimations();
  std::shared_ptr<Text> text;
  {
    std::shared_lock speech(ttsMutex);
    text = xCurrentText();
    if (id != text->instruction->id && id != -1)
      return;
    if (postId != -1) {
      try {
        tts->stop(postId);
      } catch (const std::exception& e) {
        KO_LOG_ERROR(kCategory) << "tts.stop() has thrown an exception: " << e.what();
      }
    }
  }
  {
    std::lock_guard lock(text->instruction->mutex);
    text->receivedBookmarks.clear();
    xDropRemainingActions(*text);
    text->bookmarkCondition.notify_all();
  }
  xStopAllAnimations();
  xStopAllSounds();
}

// ---- the speech engine's notifications ----------------------------------------------------

void DirectorTask::xOnBookmark(const ZUValue& value) {
  std::shared_lock speech(ttsMutex);
  if (postId == -1 || !value.isValid() || !(value.isInt() || value.isFloat()))
    return;
  const std::string printed = value.toString(1);
  std::int32_t number = 0;
  if (!parseInt32(printed, number)) {
    KO_LOG_ERROR(kCategory) << "The bookmark " << printed << " is not a number: ignored.";
    return;
  }
  if (number == 0)
    return;
  // The text of the posted say, taken under the speech lock; its job's mutex after it.
  std::shared_ptr<Text> text = xCurrentText();
  speech.unlock();
  xBookmarkReached(text, number, false);
}

void DirectorTask::xBookmarkReached(std::int32_t id, bool blocking) {
  xBookmarkReached(xCurrentText(), id, blocking);
}

void DirectorTask::xBookmarkReached(const std::shared_ptr<Text>& text, std::int32_t id,
                                    bool blocking) {
  if (id <= 0)
    return;
  MKTaskInstruction& job = *text->instruction;
  std::unique_lock lock(job.mutex);
  const auto bookmark = static_cast<std::uint32_t>(id);
  std::size_t index = job.currentAction;
  while (index < job.actions.size() && !(job.actions[index] && job.actions[index]->id == bookmark))
    ++index;
  if (index >= job.actions.size())
    return;
  text->receivedBookmarks.push_back(index);
  if (text->observer && text->traces[index].bookmarkUs < 0)
    text->traces[index].bookmarkUs = ko::os::ustime();
  text->bookmarkCondition.notify_all();
  if (blocking) {
    // Until process (or a stop) has gone past the action: a spurious wake-up is no end.
    job.actions[index]->condition->wait(lock, [&job, index] { return job.currentAction > index; });
  }
}

void DirectorTask::xOnSpeechStatus(const ZUValue& value) {
  std::shared_ptr<Text> text;
  {
    std::shared_lock speech(ttsMutex);
    if (postId == -1 || !value.isValid() || !value.isArray() || value.arraySize() != 2)
      return;
    if (std::atoi(value[0].toString(1).c_str()) != postId)
      return;
    if (!value[1].isString() || value[1].asString() != "started")
      return;
    text = xCurrentText();
  }
  const MKID id = text->instruction->id;
  if (mkidRegister.isMKIDStopped(id)) {
    stop(id);
    return;
  }
  xSpeechStarted(text);
}

}  // namespace ZU
