#pragma once
// The job of one text: the text and its speech form, the text's own copy of the
// configuration, and the actions that the speech's bookmarks trigger.
//
// A job is created by the say pipeline in the caller's thread and shared by the stages
// that work on it in turn. The compiler stage fills it and the loader prepares its
// actions, each holding `mutex` while it changes what the job prints (the diagnosis prints
// the jobs of the registered texts under it), never across a call of another service; the
// director and its bookmark callbacks, which run in the
// framework's threads, guard `currentAction` and the actions' progress with `mutex`.
// addAction itself takes no lock.

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "mokuto/mktaskaction.h"
#include "mokuto/mokutoconfig.h"
#include "zu/enums.h"

namespace ZU {

// The identifier of a text, one per say call.
using MKID = std::int32_t;

class MKTaskInstruction {
 public:
  MKTaskInstruction() = default;
  MKTaskInstruction(MKID textId, std::string callerText, MokutoConfig textConfig,
                    PostureFamily family);
  MKTaskInstruction(const MKTaskInstruction&) = delete;
  MKTaskInstruction& operator=(const MKTaskInstruction&) = delete;

  // Gives the action the next bookmark number (one above the last action's, skipping
  // every number already in usedBookmarks), records that number and appends the action;
  // currentAction goes back to the first action. The caller writes the bookmark text.
  void addAction(std::shared_ptr<MKTaskAction> action);

  std::mutex mutex;
  MKID id = 0;
  MokutoConfig config;
  std::string text;
  // Every bookmark number present in the speech text: the caller's own, then the
  // actions'. Only ever appended to.
  std::vector<std::int32_t> usedBookmarks;
  std::vector<std::shared_ptr<MKTaskAction>> actions;
  // Index in `actions` of the next action to run; actions.size() when none is left.
  std::size_t currentAction = 0;
  PostureFamily postureFamily = Unknown;

 private:
  // Numbers of usedBookmarks above the last number given, sorted, from
  // bookmarksAhead_[aheadFrom_] on: the only ones a new number can collide with.
  std::vector<std::int64_t> bookmarksAhead_;
  std::size_t aheadFrom_ = 0;
  // How many entries of usedBookmarks have been sorted into bookmarksAhead_.
  std::size_t usedSeen_ = 0;
  // The last number given; bookmarksAhead_ holds nothing at or below it.
  std::int64_t lastGiven_ = 0;
};

// The text, then one line per action: keyword, "=", number, ": ", text, and a tab and
// "action already done" for the actions before currentAction.
std::ostream& operator<<(std::ostream& os, const MKTaskInstruction& job);

}  // namespace ZU
