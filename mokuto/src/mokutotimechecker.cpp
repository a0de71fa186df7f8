#include "mokuto/mokutotimechecker.h"

#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zuserviceproxies.h"

namespace ZU {

namespace {
constexpr const char* kCategory = "mokuto.times";
constexpr const char* kModuleName = "ZUMokuto";
}  // namespace

MokutoTimeChecker::MokutoTimeChecker(std::shared_ptr<ZUMemoryProxy> memory)
    : fMemory(std::move(memory)) {}

void MokutoTimeChecker::setEnabled(bool flag) {
  std::lock_guard lock(fMutex);
  if (flag == fEnabled.load(std::memory_order_relaxed))
    return;
  if (flag && !fDeclared && fMemory) {
    try {
      fMemory->declareEvent(kStartEvent, kModuleName);
      fMemory->declareEvent(kStopEvent, kModuleName);
      fDeclared = true;
    } catch (const std::exception& e) {
      KO_LOG_ERROR(kCategory) << "Cannot declare the timing events: " << e.what();
    }
  }
  if (!flag)
    fMarks.clear();
  fEnabled.store(flag, std::memory_order_release);
}

void MokutoTimeChecker::startOfMokuto(MKID id) {
  std::lock_guard lock(fMutex);
  fMarks[id][kStartOfMokuto] = ko::os::ustime();
  xRaise(kStartEvent, id);
}

void MokutoTimeChecker::startOfTTS(MKID id) {
  std::lock_guard lock(fMutex);
  if (const auto it = fMarks.find(id); it != fMarks.end())
    it->second[kStartOfTTS] = ko::os::ustime();
}

void MokutoTimeChecker::stopOfTTS(MKID id) {
  std::lock_guard lock(fMutex);
  if (const auto it = fMarks.find(id); it != fMarks.end())
    it->second[kStopOfTTS] = ko::os::ustime();
}

void MokutoTimeChecker::stopOfMokuto(MKID id) {
  std::lock_guard lock(fMutex);
  const auto it = fMarks.find(id);
  if (it == fMarks.end())
    return;
  const Stamps stamps = it->second;
  for (const std::int64_t stamp : stamps) {
    if (stamp == 0)
      return;
  }
  const std::int64_t now = ko::os::ustime();
  KO_LOG_INFO(kCategory) << "time between 'start of MK' and 'start of TTS': "
                         << (stamps[kStartOfTTS] - stamps[kStartOfMokuto]) / 1000 << "ms";
  KO_LOG_INFO(kCategory) << "time between 'stop of TTS' and 'stop of MK': "
                         << (now - stamps[kStopOfTTS]) / 1000 << "ms";
  fMarks.erase(it);
  xRaise(kStopEvent, id);
}

void MokutoTimeChecker::xRaise(const char* event, MKID id) {
  if (!fMemory)
    return;
  try {
    fMemory->raiseEvent(event, ZUValue(id));
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot raise " << event << ": " << e.what();
  }
}

}  // namespace ZU
