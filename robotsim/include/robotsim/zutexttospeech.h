#pragma once
// ZUTextToSpeech: the speech engine of the simulated robot. It speaks texts with the
// inline tags "\mrk=N\", "\mrkpause=N\" and "\pau=N\" on espeak-ng, Japanese read into
// kana with MeCab first (or, for tests and benchmarks, on a timing-only estimate), plays
// them on a silent output with a real-time playback clock, raises
// "ZUTextToSpeech/CurrentBookMark" and "ZUTextToSpeech/Status" through ZUMemory, holds the
// speech at each "mrkpause" bookmark while the blocking bookmark handler's
// "_mrkpauseCallback" runs, records each word on the timeline as playback reaches it, and
// keeps a recording of what it played and the audio times of its words.
//
// Threads: calls arrive on ko threads; posted says run one at a time, in the order they
// were posted, on the module's own one-thread event loop and wait there until their text
// ends. Texts are played one at a time by the player thread; a notifier thread raises the
// events and starts the blocking calls, each on a thread of the module's hold loop, so
// that stopping a text never waits for the handler (a bookmark that a fault delays is
// raised from the process's event loop). espeak-ng runs on the one thread of the process
// that owns it; a Japanese text is read into kana in its say's thread. The settings and the
// table of texts in progress are guarded by one mutex. The module's threads find services
// through the session, never holding the broker.
//
// Stopping, from any thread (a blocking-bookmark handler included):
// - stop(id) stops the text of the posted say `id` whatever its state: queued, being
//   registered, playing or held at a blocking bookmark; a say not begun yet ends at once.
// - stopAll() stops every text in progress and every say posted before it, begun or not.
// - A blocking call still queued when its text is stopped is never made; one in progress
//   is not waited for: the text ends, the handler's call returns when it does.
// Each returns at once; the says end (with their "stopped" status) shortly after.
// exit() stops everything, waits for the posted says to end, then stops and joins the
// player, the notifier and the hold loop (waiting for blocking calls in progress), and
// unregisters. A say called afterwards ends at once, stopped. The destructor stops and
// joins the threads the same way; like exit(), it may run on any thread but the module's
// own (the framework sees to it, see ko/reaper.hpp).

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "ko/eventloop.hpp"
#include "robotsim/speechscript.h"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"

namespace robotsim {

class FaultPlan;
class SpeechPlayer;
class SpeechRecording;
class SpeechSynthesizer;
struct SpeechUtterance;

// A playback rate that plays without waiting (the timing backend's "as fast as possible").
inline constexpr double kSpeechAsFastAsPossible = std::numeric_limits<double>::infinity();

struct ZUTextToSpeechOptions {
  enum class Backend { Espeak, Timing };
  Backend backend = Backend::Espeak;
  // 1 real time, 2 twice as fast, kSpeechAsFastAsPossible without waiting.
  double playbackRate = 1.0;
  // The timing backend's reading rate at speed 100, in characters as written a second;
  // 0 for each language's own (Japanese 5.9, the others 14).
  double charactersPerSecond = 0;
  std::string language = "English";
  // The module whose "_mrkpauseCallback" handles blocking bookmarks.
  std::string blockingBookmarkModule = "ZUMokuto";
  std::string memoryModule = "ZUMemory";
  // Whether the events are raised from the start (enableNotifications turns them on).
  bool notifications = false;
  // Whether the audio is kept for saveRecording.
  bool recordAudio = true;
  std::shared_ptr<Timeline> timeline;
  // The bookmark faults of this plan strike the events and blocking calls (null: none).
  std::shared_ptr<FaultPlan> faults;
};

// Everything the engine played since it started, silences included.
struct SpeechAudio {
  int sampleRate = 0;
  std::vector<std::int16_t> samples;  // mono
  // When the first sample played; nothing before the first text.
  std::optional<std::chrono::steady_clock::time_point> start;
};

class ZUTextToSpeech : public ZU::ZUModule {
 public:
  static constexpr const char* kCurrentBookMarkEvent = "ZUTextToSpeech/CurrentBookMark";
  static constexpr const char* kStatusEvent = "ZUTextToSpeech/Status";

  // Raises ZUError when the backend cannot start or the language is unknown.
  ZUTextToSpeech(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                 ZUTextToSpeechOptions options = {});
  ~ZUTextToSpeech() override;

  // See above.
  void exit() override;
  void stop(int id) override;

  // ---- bound methods ----
  // Speaks the text and returns when it is done or stopped. Posted, its text is known by
  // the task id; called directly, by an id of the engine's own (from 2^30 up).
  void say(const std::string& text);
  void stopAll();
  // "speed" (percent, 50 to 400), "pitchShift" (0, or 1 to 4), "volume" (0 to 1),
  // "inputMode" (kept as given); other names are logged and ignored.
  void setParameter(const std::string& name, float value);
  // Raises ZUError for an unknown name.
  float getParameter(const std::string& name);
  std::string getLanguage();
  // Raises ZUError for a language that the backend cannot speak.
  void setLanguage(const std::string& language);
  std::vector<std::string> getAvailableLanguages();
  void enableNotifications();
  void disableNotifications();
  bool areNotificationsEnabled();
  // Writes everything played so far to a WAV file (mono, 16-bit); raises ZUError when
  // the file cannot be written.
  void saveRecording(const std::string& path);

  // ---- inspection ----
  // The marks of a text that ended (the last 256 texts are kept); empty when unknown.
  std::vector<SpeechMarkRecord> markRecords(int id) const;
  // The words of a text that ended, as espeak-ng spoke them (none from the timing
  // backend), in the same way; for Japanese, the words of the reading mapped back to the
  // caller's text.
  std::vector<SpeechWordRecord> wordRecords(int id) const;
  int sampleRate() const;
  // The recording (empty when the audio is not kept).
  SpeechAudio recordedAudio() const;

 private:
  class Listener;
  struct Settings {
    std::string language;
    float speed = 100.0F;
    float pitchShift = 1.0F;
    float volume = 1.0F;
    float inputMode = 0.0F;
    bool notifications = false;
  };

  void xBindMethods();
  void xRecord(const std::string& operation, ko::AnyValue arguments, ko::AnyValue result = {});
  void xRaise(const std::string& key, const ZU::ZUValue& value);
  // The bookmark event, raised now or, from another thread, `delay` later.
  void xRaiseBookmark(std::int32_t number, std::chrono::steady_clock::duration delay);
  bool xNotificationsEnabled() const;
  void xStopText(int id);
  void xStopThreads();

  const ZUTextToSpeechOptions fOptions;
  std::unique_ptr<SpeechSynthesizer> fSynthesizer;
  std::shared_ptr<SpeechRecording> fRecording;
  std::unique_ptr<Listener> fListener;
  std::shared_ptr<ko::EventLoop> fHoldLoop;  // the blocking calls

  mutable std::mutex fMutex;
  Settings fSettings;
  std::map<int, std::shared_ptr<SpeechUtterance>> fTexts;  // in progress
  struct Spoken {
    std::vector<SpeechMarkRecord> marks;
    std::vector<SpeechWordRecord> words;
  };
  std::map<int, Spoken> fHistory;  // ended
  int fNextDirectId = 1 << 30;
  std::uint64_t fStopAllGeneration = 0;  // counts the calls of stopAll
  ko::AnyObject fMemory;                 // cached lookup of the memory service

  std::unique_ptr<SpeechPlayer> fPlayer;  // last: stopped and joined first
};

}  // namespace robotsim
