#pragma once
// The text register of the service: which texts are running, which of them were asked to
// stop, and the identifiers (MKID) that it hands out.
//
// The module embeds one register. Its say callers register and free texts (newMKID and
// freeMKID, the logic of the module's xNewMKID and xFreeMKID); its stop operations mark
// texts in `textsToStop` and wake the waiters of `textsCondition` themselves; the director
// asks isMKIDStopped. Every thread that comes to the module may use it: the fields change
// only under `textsMutex`, which is taken inside a stage lock or the director's own locks,
// never the other way round.

#include <condition_variable>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>

#include "mokuto/mktaskinstruction.h"

namespace ZU {

class ZUModuleCore;

class MKIDRegister {
 public:
  MKIDRegister() = default;
  MKIDRegister(const MKIDRegister&) = delete;
  MKIDRegister& operator=(const MKIDRegister&) = delete;

  // Registers the text as running and gives it its identifier, which it also writes into
  // the instruction: the identifier of the module's posted call (pCall) that the calling
  // thread runs, otherwise the next local identifier (1, 2, 3, ... in the order of the
  // calls). A text already registered under that identifier is replaced.
  MKID newMKID(const std::shared_ptr<MKTaskInstruction>& instruction, const ZUModuleCore& module);
  // The same with the task identifier given: std::nullopt for a call that is no task.
  MKID newMKID(const std::shared_ptr<MKTaskInstruction>& instruction,
               std::optional<std::int32_t> taskId);
  // Releases the identifier (from both tables) and wakes every waiter of textsCondition.
  // An identifier that is not running is logged as the module's xFreeMKID logs it, and
  // nothing changes.
  void freeMKID(MKID id);
  // Whether the text was asked to stop and is not freed yet.
  bool isMKIDStopped(MKID id);

  std::mutex textsMutex;
  std::condition_variable textsCondition;
  // "The stack": every text between newMKID and freeMKID.
  std::map<MKID, std::shared_ptr<MKTaskInstruction>> runningTexts;
  // Running texts asked to stop; always a subset of runningTexts.
  std::set<MKID> textsToStop;
  MKID nextTextId = 1;
};

}  // namespace ZU
