#pragma once
// MokutoTimeChecker: times, when switched on, what the service does before the speech of a
// text begins and after it ends. It logs both durations in "mokuto.times" and raises
// "ZUMokuto/StartOfMK" and "ZUMokuto/StopOfMK" with the text's identifier, so that an
// observer can time each text.
//
// Owned by the director. The marks come from the say callers' threads and the director's;
// `mutex` serialises them and the switch (the events are raised under it). The switch is
// also an atomic flag that callers read without the lock before each mark.

#include <array>
#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>

#include "mokuto/mktaskinstruction.h"

namespace ZU {

class ZUMemoryProxy;

class MokutoTimeChecker {
 public:
  static constexpr const char* kStartEvent = "ZUMokuto/StartOfMK";
  static constexpr const char* kStopEvent = "ZUMokuto/StopOfMK";

  // `memory` may be null: the events are then left out.
  explicit MokutoTimeChecker(std::shared_ptr<ZUMemoryProxy> memory);
  MokutoTimeChecker(const MokutoTimeChecker&) = delete;
  MokutoTimeChecker& operator=(const MokutoTimeChecker&) = delete;

  // Switching on declares both events (once: they are never undeclared); switching off
  // forgets the texts being timed.
  void setEnabled(bool flag);
  bool enabled() const noexcept { return fEnabled.load(std::memory_order_acquire); }

  // The text was accepted: its first stamp, then "ZUMokuto/StartOfMK".
  void startOfMokuto(MKID id);
  // The speech is handed to the speech engine / has ended (texts being timed only).
  void startOfTTS(MKID id);
  void stopOfTTS(MKID id);
  // The text's handling is over: with all three stamps taken, logs both durations (whole
  // milliseconds), forgets the text and raises "ZUMokuto/StopOfMK"; otherwise nothing.
  void stopOfMokuto(MKID id);

 private:
  enum Stamp : std::size_t { kStartOfMokuto, kStartOfTTS, kStopOfTTS };
  using Stamps = std::array<std::int64_t, 3>;

  // With `fMutex` held; failures are logged.
  void xRaise(const char* event, MKID id);

  const std::shared_ptr<ZUMemoryProxy> fMemory;
  std::mutex fMutex;
  std::atomic<bool> fEnabled{false};
  bool fDeclared = false;         // under fMutex
  std::map<MKID, Stamps> fMarks;  // under fMutex; microseconds, 0 until taken
};

}  // namespace ZU
