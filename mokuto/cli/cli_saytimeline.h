#pragma once
// SayTimeline: what `mokuto say` shows of a performance. It listens to the simulated
// robot's timeline and to the director's sync reports, prints a readable line for each
// thing the robot does (bookmarks, actions run or skipped, behaviours, sounds, memory
// events, the end of the text) as it happens, adds the service's own entries ("say",
// "action", "end" of the service "ZUMokuto") to the timeline, and at the end gives the
// summary and the whole timeline as JSON lines.
//
// Threads: the timeline's listener runs in whatever thread records an entry (the robot's
// services, the director); the sync reports come in the director's thread. One mutex
// guards the state and the live output; it is never held while an entry is recorded,
// since recording calls the listener.
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "mokuto/directortask.h"
#include "robotsim/timeline.h"

namespace mokuto::cli {

// The name of an action type as the loader left it ("START", "RUN_SOUND", "UNKNOWN").
std::string actionTypeName(ZU::MKTaskActionType type);
// The error code in front of an action's text ("ANIMATION_NOT_FOUND"), if it has one.
std::optional<std::string> actionErrorCode(const ZU::MKTaskAction& action);

struct SaySummary {
  int executed = 0;
  int skipped = 0;
  int stopped = 0;
  int instructionErrors = 0;
  // For the executed actions whose bookmark the speech engine reported: from the
  // bookmark's audio time to the action's start.
  int syncCount = 0;
  std::int64_t syncMedianUs = 0;
  std::int64_t syncMaxUs = 0;
  std::int64_t durationUs = 0;
};

class SayTimeline : public ZU::DirectorObserver, public std::enable_shared_from_this<SayTimeline> {
 public:
  // `live` receives the readable lines; null prints nothing as it happens.
  static std::shared_ptr<SayTimeline> create(std::shared_ptr<robotsim::Timeline> timeline,
                                             std::ostream* live);

  // The text is handed to the service now: times are shown from here.
  void begin(const std::string& text);
  // The service has taken the text up as `id`: the "say" entry.
  void accepted(ZU::MKID id);
  // The text's identifier once accepted, else 0.
  ZU::MKID id() const;
  void onAction(const ZU::DirectorActionReport& report) override;
  // The service's say has returned: the "end" entry, with the summary as its result.
  // `id` (when given) receives the text's identifier.
  SaySummary end(ZU::MKID* id = nullptr);

  static void printSummary(std::ostream& os, ZU::MKID id, const SaySummary& summary);
  // The robot's entries and the service's, in their order, one JSON object per line.
  void writeJsonLines(std::ostream& os) const;

 private:
  struct Action {
    ZU::DirectorActionReport report;
    std::string text;
    std::string type;
    std::optional<std::string> error;
    std::string outcome;
    // On the timeline's clock.
    std::optional<std::int64_t> bookmarkUs, arrivedUs, startUs, endUs;
  };

  SayTimeline(std::shared_ptr<robotsim::Timeline> timeline, std::ostream* live);
  void xOnEntry(const robotsim::TimelineEntry& entry);
  // With fMutex held.
  void xBookmarkReached(std::int32_t number, std::int64_t us, bool blocking);
  void xPrint(std::int64_t us, const std::string& line);
  void xResolveBookmark(Action& action) const;
  std::optional<std::int64_t> xToTimeline(std::int64_t ustime) const;
  ko::AnyValue xActionArguments(const Action& action) const;
  SaySummary xSummary() const;

  const std::shared_ptr<robotsim::Timeline> fTimeline;
  std::ostream* const fLive;

  mutable std::mutex fMutex;
  std::string fText;
  ZU::MKID fId = 0;
  std::int64_t fBeginUs = 0;
  // ko::os::ustime() minus the timeline's time.
  std::int64_t fClockOffsetUs = 0;
  // The speech engine's identifier of the text's speech, and where its bookmarks were
  // reached (timeline time by bookmark number).
  std::optional<std::int64_t> fSpeechId;
  std::vector<std::pair<std::int32_t, std::int64_t>> fBookmarks;
  std::vector<Action> fActions;
  bool fEnded = false;
};

}  // namespace mokuto::cli
