#include "scripted_speech.h"

#include <algorithm>
#include <sstream>
#include <utility>

#include "ko/log.hpp"
#include "zu/zuserviceproxies.h"

namespace mokutotest {

namespace {
constexpr const char* kModuleClass = "ScriptedSpeech";
constexpr std::size_t kHoldThreads = 4;
}  // namespace

ScriptedSpeech::ScriptedSpeech(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
    : ZU::ZUModule(broker, name),
      fHoldLoop(std::make_shared<ko::EventLoop>(name + ".mrkpause", kHoldThreads)) {
  setEventLoop(std::make_shared<ko::EventLoop>(name, 1));

  bindMethods(kModuleClass,
              {{"say",
                &ScriptedSpeech::say,
                "Waits until the test ends the text.",
                {{"text", "The text with its bookmarks."}}},
               {"setParameter",
                &ScriptedSpeech::setParameter,
                "Records the parameter.",
                {{"name", "The parameter."}, {"value", "Its value."}}},
               {"enableNotifications", &ScriptedSpeech::enableNotifications, "Records the call."}});
}

ScriptedSpeech::~ScriptedSpeech() {
  xEndSays();
  fHoldLoop->stop();
}

void ScriptedSpeech::exit() {
  xEndSays();
  ZU::ZUModule::exit();
  fHoldLoop->stop();
}

void ScriptedSpeech::xEndSays() {
  {
    std::lock_guard lock(fMutex);
    fExiting = true;
  }
  fChanged.notify_all();
}

void ScriptedSpeech::stop(int id) {
  xRecord("stop(" + std::to_string(id) + ")");
  ZU::ZUModule::stop(id);
  finish(id);
}

void ScriptedSpeech::say(const std::string& text) {
  const auto task = currentTask();
  std::unique_lock lock(fMutex);
  const int id = task ? task->id() : fNextDirectId++;
  fSays.push_back({id, text});
  fCalls.push_back("say(" + std::to_string(id) + ")");
  fChanged.notify_all();
  fChanged.wait(lock, [&] {
    return fExiting || fFinished.count(id) != 0 || (task && task->isStopRequested());
  });
  fEnded.insert(id);
  fChanged.notify_all();
}

void ScriptedSpeech::setParameter(const std::string& name, float value) {
  std::ostringstream call;
  call << "setParameter(" << name << ", " << value << ")";
  xRecord(call.str());
}

void ScriptedSpeech::enableNotifications() {
  xRecord("enableNotifications()");
}

void ScriptedSpeech::xRecord(std::string call) {
  {
    std::lock_guard lock(fMutex);
    fCalls.push_back(std::move(call));
  }
  fChanged.notify_all();
}

std::optional<ScriptedSpeech::Say> ScriptedSpeech::waitForSay(
    std::size_t index, std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  if (!fChanged.wait_for(lock, bound, [&] { return fSays.size() > index; }))
    return std::nullopt;
  return fSays[index];
}

void ScriptedSpeech::xRaise(const std::string& key, const ZU::ZUValue& value) {
  const ko::AnyObject memory = findService("ZUMemory");
  if (!memory) {
    KO_LOG_ERROR("mokutotest") << "No memory service to raise " << key;
    return;
  }
  ZU::ZUMemoryProxy(memory).raiseEvent(key, value);
}

void ScriptedSpeech::raiseBookmark(const ZU::ZUValue& value) {
  xRaise("ZUTextToSpeech/CurrentBookMark", value);
}

void ScriptedSpeech::raiseStatus(int id, const std::string& status) {
  xRaise("ZUTextToSpeech/Status", ZU::ZUValue::makeArray({ZU::ZUValue(id), ZU::ZUValue(status)}));
}

ko::Future<void> ScriptedSpeech::mrkpause(int bookmark) {
  ko::AnyObject handler = findService("ZUMokuto");
  if (!handler)
    return ko::makeFutureError<void>("No module ZUMokuto");
  return fHoldLoop->async([handler = std::move(handler), bookmark] {
    handler->call<void>("_mrkpauseCallback", bookmark);
  });
}

void ScriptedSpeech::finish(int id) {
  {
    std::lock_guard lock(fMutex);
    fFinished.insert(id);
  }
  fChanged.notify_all();
}

bool ScriptedSpeech::hasEnded(int id) const {
  std::lock_guard lock(fMutex);
  return fEnded.count(id) != 0;
}

std::size_t ScriptedSpeech::sayCount() const {
  std::lock_guard lock(fMutex);
  return fSays.size();
}

std::vector<std::string> ScriptedSpeech::calls() const {
  std::lock_guard lock(fMutex);
  return fCalls;
}

bool ScriptedSpeech::waitForCall(const std::string& call, std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fChanged.wait_for(
      lock, bound, [&] { return std::find(fCalls.begin(), fCalls.end(), call) != fCalls.end(); });
}

}  // namespace mokutotest
