#include "robotsim/zuaudioplayer.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cmath>
#include <utility>

#include "ko/eventloop.hpp"
#include "ko/log.hpp"
#include "ko/path.hpp"
#include "robotsim/behaviorlibrary.h"
#include "zu/zuerror.h"

namespace robotsim {

namespace fs = std::filesystem;

namespace {

constexpr const char* kCategory = "robotsim.audioplayer";
constexpr const char* kClass = "ZUAudioPlayer";
constexpr std::size_t kLoopThreads = 4;
constexpr std::size_t kHistorySize = 256;

fs::path defaultRoot(std::string root) {
  if (root.empty())
    root = ko::path::findData("zefoko", "sounds");
  return root.empty() ? fs::path() : fs::path(root).lexically_normal();
}

std::string quoted(const std::string& text) {
  return "\"" + text + "\"";
}

// "ding.wav" and "ding" name the same file.
std::string soundName(const std::string& file) {
  if (file.size() > 4) {
    std::string extension = file.substr(file.size() - 4);
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    if (extension == ".wav")
      return file.substr(0, file.size() - 4);
  }
  return file;
}

}  // namespace

ZUAudioPlayer::ZUAudioPlayer(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                             std::shared_ptr<Timeline> timeline, std::string root)
    : ZU::ZUModule(broker, name),
      fTimeline(std::move(timeline)),
      fRoot(defaultRoot(std::move(root))) {
  setModuleDescription("The simulated robot's audio player: sound sets of WAV files.");
  // Posted plays last as long as the sound; they get threads of their own.
  setEventLoop(std::make_shared<ko::EventLoop>(name, kLoopThreads));
  if (fRoot.empty()) {
    KO_LOG_WARNING(kCategory) << "No sound set folder found (zefoko/sounds)";
  }
  xBindMethods();
}

ZUAudioPlayer::~ZUAudioPlayer() = default;

void ZUAudioPlayer::xBindMethods() {
  const ZU::ZUMethodParameter soundSet{"soundSet", "The name of a loaded sound set."};
  const ZU::ZUMethodParameter soundFile{"soundFile", "The file's name, with or without \".wav\"."};
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"loadSoundSet",
       &ZUAudioPlayer::loadSoundSet,
       "Loads a sound set.",
       {{"soundSet", "The name of the sound set (its folder)."}}},
      {"unloadSoundSet", &ZUAudioPlayer::unloadSoundSet, "Unloads a sound set.", {soundSet}},
      {"getLoadedSoundSetsList",
       &ZUAudioPlayer::getLoadedSoundSetsList,
       "Lists the loaded sound sets.",
       {},
       {"soundSets", "Their names, in ascending order."}},
      {"playSoundSetFile",
       ZU::overload<void(const std::string&, const std::string&)>(&ZUAudioPlayer::playSoundSetFile),
       "Plays a file of a loaded sound set to its end.",
       {soundSet, soundFile}},
      {"playSoundSetFile",
       ZU::overload<void(const std::string&, const std::string&, double, double, double, bool)>(
           &ZUAudioPlayer::playSoundSetFile),
       "Plays a file of a loaded sound set.",
       {soundSet,
        soundFile,
        {"position", "Where to begin in the file, in seconds."},
        {"volume", "The volume, from 0 to 1."},
        {"balance", "The balance, from -1 (left) to 1 (right)."},
        {"loop", "True to play the file again and again until stopped."}}},
      {"stopAll", &ZUAudioPlayer::stopAll, "Stops every play."},
  };
  bindMethods(kClass, methods);
}

void ZUAudioPlayer::xRecord(const std::string& operation, ko::AnyValue arguments,
                            ko::AnyValue result) {
  if (fTimeline)
    fTimeline->record(getName(), operation, std::move(arguments), std::move(result));
}

void ZUAudioPlayer::loadSoundSet(const std::string& soundSet) {
  if (!isValidBehaviorPath(soundSet) || fRoot.empty())
    ZU_THROW_ERROR(getName(), "loadSoundSet", "Unknown sound set " + quoted(soundSet));
  SoundSet set;
  try {
    set = readSoundSet(fRoot / soundSet);
  } catch (const SoundFileError&) {
    ZU_THROW_ERROR(getName(), "loadSoundSet", "Unknown sound set " + quoted(soundSet));
  }
  for (const auto& [file, reason] : set.rejected)
    KO_LOG_WARNING(kCategory) << "Sound set " << quoted(soundSet) << ": " << file
                              << " skipped: " << reason;
  if (set.files.empty()) {
    KO_LOG_WARNING(kCategory) << "Sound set " << quoted(soundSet) << " has no WAV file";
  }
  const auto count = set.files.size();
  {
    std::lock_guard lock(fMutex);
    fLoaded[soundSet] = std::move(set);
  }
  xRecord("loadSoundSet", ko::AnyValue::list({soundSet}), count);
}

void ZUAudioPlayer::unloadSoundSet(const std::string& soundSet) {
  {
    std::lock_guard lock(fMutex);
    if (fLoaded.erase(soundSet) == 0) {
      ZU_THROW_ERROR(getName(), "unloadSoundSet",
                     "Sound set " + quoted(soundSet) + " is not loaded");
    }
  }
  xRecord("unloadSoundSet", ko::AnyValue::list({soundSet}));
}

std::vector<std::string> ZUAudioPlayer::getLoadedSoundSetsList() {
  std::lock_guard lock(fMutex);
  std::vector<std::string> out;
  for (const auto& [name, set] : fLoaded)
    out.push_back(name);
  return out;
}

void ZUAudioPlayer::playSoundSetFile(const std::string& soundSet, const std::string& soundFile) {
  playSoundSetFile(soundSet, soundFile, 0.0, 1.0, 0.0, false);
}

void ZUAudioPlayer::playSoundSetFile(const std::string& soundSet, const std::string& soundFile,
                                     double position, double volume, double balance, bool loop) {
  const std::string name = soundName(soundFile);
  // A refused play is on the timeline too, with the reason, before the caller hears of it.
  const auto refuse = [&](const std::string& reason) {
    xRecord("playFailed", ko::AnyValue::list({soundSet, name}), reason);
    ZU_THROW_ERROR(getName(), "playSoundSetFile", reason);
  };
  if (!std::isfinite(position) || position < 0)
    refuse("The position must be a number of seconds from 0, not " + std::to_string(position));
  if (!std::isfinite(volume) || !std::isfinite(balance))
    refuse("The volume and balance must be numbers");
  volume = std::clamp(volume, 0.0, 1.0);
  balance = std::clamp(balance, -1.0, 1.0);

  const auto task = currentTask();
  double duration = 0;
  std::uint64_t play = 0;
  std::string refusal;
  {
    std::lock_guard lock(fMutex);
    const auto set = fLoaded.find(soundSet);
    if (set == fLoaded.end()) {
      refusal = "Sound set " + quoted(soundSet) + " is not loaded";
    } else if (const auto file = set->second.files.find(name); file == set->second.files.end()) {
      refusal = "No sound " + quoted(name) + " in the sound set " + quoted(soundSet);
    } else {
      duration = std::max(0.0, file->second.duration - position);
      // stop(id) sets the task's flag before it looks the play up, so a stop that finds no
      // play yet is seen here.
      play = fNextPlay++;
      fPlays[play] = Play{task ? task->id() : -1, task && task->isStopRequested()};
      fHistory.emplace_back(
          play, SoundPlayRecord{soundSet, name, file->second.path, position, volume, balance, loop,
                                std::chrono::steady_clock::now(), std::nullopt, false});
      while (fHistory.size() > kHistorySize)
        fHistory.pop_front();
    }
  }
  if (!refusal.empty())
    refuse(refusal);
  xRecord("playSoundSetFile", ko::AnyValue::list({soundSet, name, volume, balance, loop}),
          duration);

  bool stopped = false;
  {
    std::unique_lock lock(fMutex);
    auto isStopped = [&] { return fPlays.at(play).stopped; };
    if (loop) {
      fPlayStopped.wait(lock, isStopped);
    } else {
      const auto end = std::chrono::steady_clock::now() +
                       std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                           std::chrono::duration<double>(duration));
      fPlayStopped.wait_until(lock, end, isStopped);
    }
    stopped = fPlays.at(play).stopped;
    fPlays.erase(play);
    for (auto& [serial, record] : fHistory) {
      if (serial == play) {
        record.end = std::chrono::steady_clock::now();
        record.stopped = stopped;
      }
    }
  }
  xRecord(stopped ? "soundStopped" : "soundEnded", ko::AnyValue::list({soundSet, name}));
}

void ZUAudioPlayer::stop(int id) {
  ZU::ZUModule::stop(id);
  bool found = false;
  {
    std::lock_guard lock(fMutex);
    for (auto& [serial, play] : fPlays) {
      if (play.taskId == id) {
        play.stopped = true;
        found = true;
      }
    }
  }
  if (found) {
    fPlayStopped.notify_all();
    xRecord("stop", ko::AnyValue::list({id}));
  }
}

void ZUAudioPlayer::stopAll() {
  {
    std::lock_guard lock(fMutex);
    for (auto& [serial, play] : fPlays)
      play.stopped = true;
  }
  fPlayStopped.notify_all();
  xRecord("stopAll", ko::AnyValue::list({}));
}

std::vector<SoundPlayRecord> ZUAudioPlayer::playRecords() const {
  std::lock_guard lock(fMutex);
  std::vector<SoundPlayRecord> out;
  for (const auto& [serial, record] : fHistory)
    out.push_back(record);
  return out;
}

void ZUAudioPlayer::exit() {
  stopAll();
  ZU::ZUModule::exit();
}

}  // namespace robotsim
