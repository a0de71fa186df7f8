#pragma once
// ZUAudioPlayer: the audio player of the simulated robot. Sound sets are folders of WAV
// files (see soundlibrary.h); a play lasts the real duration of its file, on a silent
// output.
//
// Calls arrive on ko threads, several at once; posted plays run on the module's own event
// loop and block one of its threads for their duration. The loaded sets, the plays in
// progress and the record of past plays are guarded by one mutex; a play waits on a
// condition variable that stop and stopAll notify.

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "robotsim/soundlibrary.h"
#include "robotsim/timeline.h"
#include "zu/zumodule.h"

namespace robotsim {

// One play of a sound file, for the whole audio of a performance.
struct SoundPlayRecord {
  std::string soundSet;
  std::string sound;
  std::filesystem::path file;
  double position = 0;  // seconds into the file
  double volume = 1;
  double balance = 0;
  bool loop = false;
  std::chrono::steady_clock::time_point start;
  // When it ended or was stopped; nothing while it plays.
  std::optional<std::chrono::steady_clock::time_point> end;
  bool stopped = false;
};

class ZUAudioPlayer : public ZU::ZUModule {
 public:
  // `root`: the folder of the sound sets; empty for the data folder "zefoko/sounds".
  // `timeline` may be null.
  ZUAudioPlayer(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                std::shared_ptr<Timeline> timeline = nullptr, std::string root = "");
  ~ZUAudioPlayer() override;

  // Stops every play, then unregisters.
  void exit() override;
  // Stops the posted call `id`; a posted play ends at once.
  void stop(int id) override;

  // ---- bound methods ----
  // Reads the set's files and their durations; raises ZUError for an unknown set. Loading
  // a loaded set reads it again.
  void loadSoundSet(const std::string& soundSet);
  // Raises ZUError for a set that is not loaded; plays of it go on.
  void unloadSoundSet(const std::string& soundSet);
  std::vector<std::string> getLoadedSoundSetsList();
  // Plays a file of a loaded set (its name with or without ".wav") and returns at its end.
  void playSoundSetFile(const std::string& soundSet, const std::string& soundFile);
  // The same from `position` seconds into the file, at `volume` (0 to 1) and `balance`
  // (-1 left to 1 right); a looping play lasts until it is stopped.
  void playSoundSetFile(const std::string& soundSet, const std::string& soundFile, double position,
                        double volume, double balance, bool loop);
  void stopAll();

  // ---- inspection ----
  // The last 256 plays, in the order they began, those in progress included.
  std::vector<SoundPlayRecord> playRecords() const;

 private:
  struct Play {
    int taskId = -1;  // -1 for a call that was not posted
    bool stopped = false;
  };

  void xBindMethods();
  void xRecord(const std::string& operation, ko::AnyValue arguments, ko::AnyValue result = {});

  const std::shared_ptr<Timeline> fTimeline;
  const std::filesystem::path fRoot;

  mutable std::mutex fMutex;
  std::condition_variable fPlayStopped;
  std::map<std::string, SoundSet> fLoaded;
  std::map<std::uint64_t, Play> fPlays;
  std::uint64_t fNextPlay = 1;
  std::deque<std::pair<std::uint64_t, SoundPlayRecord>> fHistory;  // by play serial
};

}  // namespace robotsim
