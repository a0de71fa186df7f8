#pragma once
// The director's state of one text: its job, the bookmarks received for it, and its sync
// telemetry. Everything here but the constant members is guarded by the job's mutex.

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <memory>
#include <utility>
#include <vector>

#include "mokuto/directortask.h"

namespace ZU {

// Asks the audio player to stop each play (from any thread); a failure is logged.
void stopPlays(const ZUAudioPlayerProxy* audio, const std::vector<int>& plays);

struct DirectorTask::Text {
  static constexpr std::size_t kNone = std::numeric_limits<std::size_t>::max();

  // What the director learnt of one action, kept only while an observer listens.
  struct Trace {
    MKTaskActionType type = UNKNOWN;
    std::int64_t bookmarkUs = -1;
    std::int64_t beginUs = -1;
    std::int64_t endUs = -1;
    DirectorActionReport::Outcome outcome = DirectorActionReport::Outcome::Executed;
    bool done = false;
    bool reported = false;
  };

  Text(std::shared_ptr<MKTaskInstruction> job, std::shared_ptr<DirectorObserver> listener)
      : instruction(std::move(job)), observer(std::move(listener)) {}

  const std::shared_ptr<MKTaskInstruction> instruction;  // never null
  const std::shared_ptr<DirectorObserver> observer;      // null: no telemetry

  // Positions in the action list whose bookmark came but which are not executed yet.
  std::vector<std::size_t> receivedBookmarks;
  // Notified when a bookmark arrives and when the text is stopped; waited on by process.
  std::condition_variable bookmarkCondition;
  // The action that process is executing; kNone between actions.
  std::size_t executing = kNone;
  // The speech has ended: a late "started" status changes nothing any more.
  bool speechOver = false;
  std::vector<Trace> traces;  // one per action, with an observer only
};

}  // namespace ZU
