#include "mokuto/mkidregister.h"

#include <utility>

#include "ko/log.hpp"
#include "zu/zumodulecore.h"

namespace ZU {

namespace {

// The release's line belongs to the module's xFreeMKID, which this register carries out.
constexpr const char* kFreeFunction = "void ZU::ZUMokuto::xFreeMKID(ZU::MKID)";

}  // namespace

MKID MKIDRegister::newMKID(const std::shared_ptr<MKTaskInstruction>& instruction,
                           const ZUModuleCore& module) {
  std::optional<std::int32_t> taskId;
  if (const auto task = module.currentTask())
    taskId = task->id();
  return newMKID(instruction, taskId);
}

MKID MKIDRegister::newMKID(const std::shared_ptr<MKTaskInstruction>& instruction,
                           std::optional<std::int32_t> taskId) {
  std::lock_guard lock(textsMutex);
  const MKID id = taskId ? *taskId : nextTextId++;
  runningTexts[id] = instruction;
  if (instruction)
    instruction->id = id;
  return id;
}

void MKIDRegister::freeMKID(MKID id) {
  {
    std::lock_guard lock(textsMutex);
    const auto it = runningTexts.find(id);
    if (it == runningTexts.end()) {
      const ko::log::Category& category = KO_CATEGORY("mokuto.main");
      if (category.enabled(ko::log::Error)) {
        ko::log::write(category, ko::log::Error, kFreeFunction,
                       "Cannot remove the id of the current text because it doesn't exist "
                       "anymore.",
                       __FILE__, __LINE__);
      }
      return;
    }
    textsToStop.erase(id);
    runningTexts.erase(it);
  }
  textsCondition.notify_all();
}

bool MKIDRegister::isMKIDStopped(MKID id) {
  std::lock_guard lock(textsMutex);
  return textsToStop.count(id) != 0;
}

}  // namespace ZU
