#pragma once
// SayTimeline: what `mokuto say` shows of a performance. It listens to the simulated
// robot's timeline, to the director's sync reports and to the director's error lines about
// the action it runs, prints a readable line for each thing the robot does (bookmarks,
// actions with their outcome, behaviours, sounds, memory events, the end of the text) as it
// happens, adds the service's own entries ("say", "action", "end" of the service
// "ZUMokuto") to the timeline, and at the end gives the summary and the whole timeline as
// JSON lines.
//
// An action's outcome is what happened: "executed"; "failed" (the director's call failed:
// a sound refused by the audio player, a method missing, arguments that are not JSON, a
// behaviour that did not start), with the reason; "no animation" (an automatic tag for
// which the posture has none); "skipped" (an instruction error, or a bookmark that came too
// late); "stopped" (the text was stopped first). A "^wait" of an animation that was not
// running is executed, with a note that says so.
//
// Threads: the timeline's listener runs in whatever thread records an entry (the robot's
// services, the director); the sync reports and the director's error lines come in the say
// caller's thread (the one that called begin). With the service in another process, the
// reports come with the director's lines (onRemoteAction), and they and the robot's entries
// in the session's serving threads. One mutex guards the state and the live
// output; it is never held while an entry is recorded, since recording calls the listener.
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <ostream>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "cli_service.h"
#include "mokuto/directortask.h"
#include "mokuto/zumokuto.h"
#include "robotsim/timeline.h"

namespace mokuto::cli {

// The name of an action type as the loader left it ("START", "RUN_SOUND", "UNKNOWN").
std::string actionTypeName(ZU::MKTaskActionType type);
// The error code in front of an action's text ("ANIMATION_NOT_FOUND"), if it has one.
std::optional<std::string> actionErrorCode(const ZU::MKTaskAction& action);
// A sound's name as the audio player gives it: without ".wav" (in any case).
std::string soundFileName(std::string name);
// The reason in a log line of a failed call: the error's own description, first line.
std::string failureReason(const std::string& message);

struct SaySummary {
  int executed = 0;
  int failed = 0;
  int noAnimation = 0;
  int skipped = 0;
  int stopped = 0;
  int instructionErrors = 0;
  // The command stopped the text (a signal), and whether its speech had begun by then.
  bool textStopped = false;
  bool spoken = false;
  // The speech played without waiting in real time: no sync figures.
  bool fast = false;
  // For the executed actions whose bookmark the speech engine reported: from the
  // bookmark's audio time to the action's start.
  int syncCount = 0;
  std::int64_t syncMedianUs = 0;
  std::int64_t syncMaxUs = 0;
  std::int64_t durationUs = 0;
};

class DirectorFailures;

class SayTimeline : public ActionObserver, public std::enable_shared_from_this<SayTimeline> {
 public:
  // At most this many stopped actions are listed one by one; the others are counted.
  static constexpr int kListedStops = 3;
  // At most this many characters of the text are echoed.
  static constexpr std::size_t kEchoed = 200;

  // `live` receives the readable lines; null prints nothing as it happens. `fast`: the
  // speech plays without waiting in real time.
  static std::shared_ptr<SayTimeline> create(std::shared_ptr<robotsim::Timeline> timeline,
                                             std::ostream* live, bool fast);
  ~SayTimeline() override;

  // The text is handed to the service now, from the thread that will call say: times are
  // shown from here, and that thread's director lines are heard.
  void begin(const std::string& text);
  // The text entered a stage of the service as `id`: the "say" entry at the compiler.
  void stage(ZU::ZUMokutoStage stage, ZU::MKID id);
  // The text's identifier once the service took it up, else 0.
  ZU::MKID id() const;
  void onAction(const ZU::DirectorActionReport& report) override;
  void onRemoteAction(const ZU::DirectorActionReport& report,
                      const std::vector<DirectorLine>& lines) override;
  // The service's say has returned (`stopped`: the command stopped the text): the "end"
  // entry, with the summary as its result. `id` (when given) receives the text's
  // identifier, 0 when the service never took it up.
  SaySummary end(bool stopped, ZU::MKID* id = nullptr);

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
    std::optional<std::string> failure;
    std::optional<std::string> note;
    // For a sound that plays: its set and name as the audio player names them.
    std::string sound;
    // A posted sound whose play the audio player has not recorded yet.
    bool awaitingPlay = false;
    // Its "action" entry has been seen; its line has been printed (or counted).
    bool entered = false;
    bool listed = false;
    // On the timeline's clock.
    std::optional<std::int64_t> bookmarkUs, arrivedUs, startUs, endUs;
  };
  // A play that the audio player recorded ("playSoundSetFile") or refused ("playFailed").
  struct Play {
    std::string sound;
    std::optional<std::string> refusal;
  };

  SayTimeline(std::shared_ptr<robotsim::Timeline> timeline, std::ostream* live, bool fast);
  void xOnEntry(const robotsim::TimelineEntry& entry);
  void xAction(const ZU::DirectorActionReport& report, std::vector<std::string> failures);
  // The rest with fMutex held.
  void xOutcome(Action& action, std::vector<std::string> failures);
  void xPlayed(Play play, std::int64_t us);
  bool xWasRunning(const Action& action) const;
  void xList(std::size_t index, std::int64_t us);
  void xBookmarkReached(std::int32_t number, std::int64_t us, bool blocking);
  void xPrint(std::int64_t us, const std::string& line);
  void xResolveBookmark(Action& action) const;
  std::optional<std::int64_t> xToTimeline(std::int64_t ustime) const;
  ko::AnyValue xActionArguments(const Action& action) const;
  SaySummary xSummary() const;

  const std::shared_ptr<robotsim::Timeline> fTimeline;
  std::ostream* const fLive;
  const bool fFast;
  const std::shared_ptr<DirectorFailures> fFailures;

  mutable std::mutex fMutex;
  // Notified when a posted sound's play is known.
  std::condition_variable fPlayed;
  std::string fText;
  ZU::MKID fId = 0;
  bool fSpoken = false;
  std::int64_t fBeginUs = 0;
  // ko::os::ustime() minus the timeline's time.
  std::int64_t fClockOffsetUs = 0;
  // The speech engine's identifier of the text's speech, and where its bookmarks were
  // reached (timeline time by bookmark number).
  std::optional<std::int64_t> fSpeechId;
  std::vector<std::pair<std::int32_t, std::int64_t>> fBookmarks;
  std::vector<Action> fActions;
  // Plays not matched with a sound action yet.
  std::vector<Play> fPlays;
  // Behaviours that stopped (timeline time), and the animations that the text's tag
  // actions started, by tag.
  std::vector<std::pair<std::string, std::int64_t>> fStoppedBehaviors;
  std::map<std::string, std::set<std::string>> fTagAnimations;
  int fListedStops = 0;
  int fUnlistedStops = 0;
  bool fEnded = false;
};

}  // namespace mokuto::cli
