#include "support/recording_module.h"

#include <algorithm>
#include <string>

#include "zu/zuerror.h"

namespace robotsim::testing {

RecordingModule::RecordingModule(const std::shared_ptr<ZU::ZUBroker>& broker,
                                 const std::string& name)
    : ZU::ZUModule(broker, name) {
  bindMethods("RecordingModule", {{"onEvent", &RecordingModule::onEvent, "Records a memory event."},
                                  {"failingCallback", &RecordingModule::failingCallback, "Fails."},
                                  {"_mrkpauseCallback", &RecordingModule::_mrkpauseCallback,
                                   "Records a blocking bookmark."}});
}

void RecordingModule::onEvent(const std::string& memoryKey, const ZU::ZUValue& value,
                              const std::string& message) {
  {
    std::lock_guard lock(fMutex);
    fEvents.push_back(ReceivedEvent{memoryKey, value, message, std::this_thread::get_id(),
                                    std::chrono::steady_clock::now()});
  }
  fChanged.notify_all();
  if (fHook)
    fHook(*this, memoryKey);
}

void RecordingModule::failingCallback(const std::string& memoryKey, const ZU::ZUValue& /*value*/,
                                      const std::string& /*message*/) {
  ZU_THROW_ERROR(getName(), "failingCallback", "refused " + memoryKey);
}

void RecordingModule::_mrkpauseCallback(int bookmark) {
  std::unique_lock lock(fMutex);
  fBlocking.push_back(bookmark);
  fChanged.notify_all();
  fChanged.wait(lock, [this] { return !fHold; });
}

void RecordingModule::releaseBlockingBookmarks() {
  {
    std::lock_guard lock(fMutex);
    fHold = false;
  }
  fChanged.notify_all();
}

std::vector<ReceivedEvent> RecordingModule::events(const std::string& key) const {
  std::vector<ReceivedEvent> out;
  std::lock_guard lock(fMutex);
  for (const auto& e : fEvents) {
    if (e.key == key)
      out.push_back(e);
  }
  return out;
}

bool RecordingModule::waitForEvents(
    const std::function<bool(const std::vector<ReceivedEvent>&)>& condition,
    std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fChanged.wait_for(lock, bound, [&] { return condition(fEvents); });
}

bool RecordingModule::waitForEvents(const std::string& key, std::size_t count,
                                    std::chrono::milliseconds bound) const {
  return waitForEvents(
      [&](const auto& all) {
        return std::count_if(all.begin(), all.end(), [&](const auto& e) { return e.key == key; }) >=
               static_cast<std::ptrdiff_t>(count);
      },
      bound);
}

bool RecordingModule::waitForBlockingBookmarks(std::size_t count,
                                               std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fChanged.wait_for(lock, bound, [&] { return fBlocking.size() >= count; });
}

std::vector<std::string> statusesOf(const std::vector<ReceivedEvent>& events, int id) {
  std::vector<std::string> out;
  for (const auto& e : events) {
    if (e.key == "ZUTextToSpeech/Status" && e.value.isArray() && e.value.arraySize() == 2 &&
        e.value[0].isInt() && e.value[0].asInt() == id && e.value[1].isString())
      out.push_back(e.value[1].asString());
  }
  return out;
}

bool hasStatus(const std::vector<ReceivedEvent>& events, int id, const std::string& word) {
  const auto statuses = statusesOf(events, id);
  return std::find(statuses.begin(), statuses.end(), word) != statuses.end();
}

}  // namespace robotsim::testing
