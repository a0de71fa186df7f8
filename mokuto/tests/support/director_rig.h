#pragma once
// DirectorRig: the director on the simulated robot, for the director's tests and benchmark.
// One session and broker with the memory service, motion, the behaviour manager on a small
// library of its own (short and long gestures, each on joints of its own), the audio player
// with the "bells" set loaded, posture, model and autonomous moves; a speech engine (the
// scripted one, or espeak-ng in real time); and the host module "ZUMokuto" with the
// director. Jobs are built as the compiler and loader leave them.
//
// Built and destroyed by one thread; the destruction ends the host first, then the speech
// engine, then the other services.

#include <future>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "director_host.h"
#include "ko_test_helpers.hpp"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/mokutoconfig.h"
#include "robotsim/timeline.h"
#include "scripted_speech.h"
#include "support/timeline_waiter.h"
#include "zu/zubroker.h"
#include "zu/zumodule.h"

namespace robotsim {
class Robot;
class ZUTextToSpeech;
}  // namespace robotsim

namespace mokutotest {

// The gestures of the rig's library.
inline constexpr const char* kShort = "animations/Stand/Gestures/Short_1";  // 0.3 s
inline constexpr const char* kMid = "animations/Stand/Gestures/Mid_1";      // 1 s
inline constexpr const char* kLongA = "animations/Stand/Gestures/Long_1";   // 30 s
inline constexpr const char* kLongB = "animations/Stand/Gestures/Long_2";   // 30 s
inline constexpr const char* kLongC = "animations/Stand/Gestures/Long_3";   // 30 s
inline constexpr const char* kEnd = "animations/Stand/Gestures/End_1";      // 0.2 s

// Writes the gestures above, each on joints of its own, into the folder; answers its path.
const std::string& writeGestureLibrary(const ko::test::ScratchFolder& folder);

// The first argument of a timeline entry when it is a string; "" otherwise.
std::string firstArgument(const robotsim::TimelineEntry& entry);
// The key and the value of each ZUMemory.raiseEvent on the timeline, in order.
std::vector<std::pair<std::string, ko::AnyValue>> raisedEvents(const robotsim::Timeline& timeline);

class DirectorRig {
 public:
  enum class Speech { Scripted, Espeak };

  // Without `director`, no host: a test may register the service "ZUMokuto" itself.
  explicit DirectorRig(Speech speech = Speech::Scripted, bool director = true);
  ~DirectorRig();
  DirectorRig(const DirectorRig&) = delete;
  DirectorRig& operator=(const DirectorRig&) = delete;

  // The job of an annotated text: parsed, each tag turned into the animation `tags` gives
  // (the tag itself when none), each call given its service, with `config`.
  std::shared_ptr<ZU::MKTaskInstruction> job(const std::string& annotated,
                                             const ZU::MokutoConfig& config = {},
                                             const std::map<std::string, std::string>& tags = {});
  // host->say(job) on a thread of its own.
  std::future<ZU::MKID> sayAsync(std::shared_ptr<ZU::MKTaskInstruction> job);

  // The timeline entries of a service's operation whose first argument is `first`.
  std::size_t count(const std::string& service, const std::string& operation,
                    const std::string& first = "") const;
  // Waits (bounded) until `count` entries of that kind are on the timeline.
  bool waitFor(const std::string& service, const std::string& operation, const std::string& first,
               std::size_t count = 1) const;

  std::shared_ptr<ZU::ZUBroker> broker;
  std::shared_ptr<robotsim::Timeline> timeline;
  std::shared_ptr<ScriptedSpeech> speech;  // Speech::Scripted only
  // The speech engine of Speech::Espeak; null otherwise.
  std::shared_ptr<robotsim::ZUTextToSpeech> espeak() const;
  std::shared_ptr<DirectorHost> host;  // null without a director

 private:
  ko::test::ScratchFolder fLibrary;
  std::unique_ptr<robotsim::Robot> fRobot;                   // Speech::Espeak
  std::vector<std::shared_ptr<ZU::ZUModuleCore>> fServices;  // in start order
  std::optional<robotsim::simtest::TimelineWaiter> fWaiter;
};

}  // namespace mokutotest
