#pragma once
// ScriptedSpeech: a speech engine for the director's tests, registered as "ZUTextToSpeech".
// It speaks nothing: a posted say waits until the test finishes it or someone stops it,
// and the test plays the speech engine's part by hand, raising the bookmark and status
// events through the memory service and making the blocking "mrkpause" calls of
// "ZUMokuto". Every call it receives is recorded.
//
// Threads: calls arrive on ko threads; posted says run on the module's own loop (one at a
// time, in order); the "mrkpause" calls on a hold loop of its own; the test drives and
// reads from its thread. One mutex and condition variable guard the records.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "ko/eventloop.hpp"
#include "ko/future.hpp"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace mokutotest {

inline constexpr auto kBound = std::chrono::seconds(10);

class ScriptedSpeech : public ZU::ZUModule {
 public:
  struct Say {
    int id = 0;
    std::string text;
  };

  ScriptedSpeech(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name);
  ~ScriptedSpeech() override;

  // Ends every say, then the module's service and the hold loop.
  void exit() override;
  // Ends the say `id`, whether it runs or is still queued.
  void stop(int id) override;

  // ---- bound methods ----
  // Posted, the text is known by the task id.
  void say(const std::string& text);
  void setParameter(const std::string& name, float value);
  void enableNotifications();

  // ---- test side ----
  // The index-th say received (from 0), once it has arrived; nullopt after the bound.
  std::optional<Say> waitForSay(std::size_t index, std::chrono::milliseconds bound = kBound) const;
  // "ZUTextToSpeech/CurrentBookMark" with that value, and "ZUTextToSpeech/Status" [id,
  // status], through the memory service.
  void raiseBookmark(const ZU::ZUValue& value);
  void raiseStatus(int id, const std::string& status);
  // Calls ZUMokuto._mrkpauseCallback(bookmark) on the hold loop; the future ends with it.
  ko::Future<void> mrkpause(int bookmark);
  // Ends the say `id` as spoken to its end.
  void finish(int id);
  bool hasEnded(int id) const;
  std::size_t sayCount() const;

  // Every call, in order: "say(<id>)", "stop(<id>)", "setParameter(<name>, <value>)",
  // "enableNotifications()".
  std::vector<std::string> calls() const;
  bool waitForCall(const std::string& call, std::chrono::milliseconds bound = kBound) const;

 private:
  void xRecord(std::string call);
  void xEndSays();
  void xRaise(const std::string& key, const ZU::ZUValue& value);

  std::shared_ptr<ko::EventLoop> fHoldLoop;

  mutable std::mutex fMutex;
  mutable std::condition_variable fChanged;
  std::vector<Say> fSays;
  std::vector<std::string> fCalls;
  std::set<int> fFinished;  // finished or stopped, maybe before they began
  std::set<int> fEnded;     // returned
  bool fExiting = false;
  int fNextDirectId = 1 << 30;
};

}  // namespace mokutotest
