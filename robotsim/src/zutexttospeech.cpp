#include "robotsim/zutexttospeech.h"

#include <algorithm>
#include <cmath>
#include <optional>
#include <thread>
#include <utility>

#include "ko/log.hpp"
#include "robotsim/faults.h"
#include "speechplayer.h"
#include "speechrecording.h"
#include "speechsynthesizer.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalueconverter.h"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.texttospeech";
constexpr const char* kModuleClass = "ZUTextToSpeech";
constexpr std::size_t kHistorySize = 256;

ko::AnyValue markResult(const SpeechMarkRecord& record) {
  ko::AnyValue::Map result{{"audioUs", record.audioUs}, {"playbackUs", record.playbackUs}};
  if (record.blocking)
    result.emplace_back("heldUs", record.heldUs);
  else
    result.emplace_back("latenessUs", record.playbackUs - record.audioUs);
  return ko::AnyValue::map(std::move(result));
}

}  // namespace

// The player's listener: the events, the blocking calls and the timeline records, with
// the bookmark faults of the plan, if any. Its members run on the notifier thread only.
class ZUTextToSpeech::Listener : public SpeechPlayerListener {
 public:
  explicit Listener(ZUTextToSpeech& tts) : fTts(tts) {}

  void onStarted(const SpeechUtterance& u) override {
    fTts.xRecord("started", ko::AnyValue::List{u.id});
    if (fTts.xNotificationsEnabled())
      fTts.xRaise(kStatusEvent, ZU::ZUValue::makeArray({u.id, "started"}));
  }

  void onBookmark(const SpeechUtterance& /*u*/, std::int32_t number) override {
    if (!fTts.xNotificationsEnabled())
      return;
    const BookmarkFate fate = xFate(number, false);
    const std::optional<std::int32_t> held = std::exchange(fHeld, std::nullopt);
    if (fate.reorder && !fate.drop) {
      fHeld = number;
    } else if (!fate.drop) {
      for (int k = fate.duplicate ? 2 : 1; k > 0; --k)
        fTts.xRaiseBookmark(number, fate.delay);
    }
    if (held)
      fTts.xRaiseBookmark(*held, {});
  }

  ko::Future<void> onBlockingBookmark(const SpeechUtterance& u, std::int32_t number) override {
    const std::string& handler = fTts.fOptions.blockingBookmarkModule;
    fTts.xRecord("hold", ko::AnyValue::List{u.id, number});
    const BookmarkFate fate = xFate(number, true);
    ko::AnyObject object = fate.drop ? nullptr : fTts.findService(handler);
    if (!object) {
      if (!fate.drop) {
        KO_LOG_WARNING(kCategory) << "No module " << handler << " to hold text " << u.id
                                  << " at bookmark " << number;
      }
      xReleaseHeld();
      return ko::makeFutureValue();
    }
    // A call still queued when its text is stopped is withdrawn: it would hold whatever
    // text is spoken when it comes.
    auto held = fTts.fHoldLoop->async([object = std::move(object), handler, number, fate,
                                       performance = u.performance, id = u.id] {
      std::this_thread::sleep_for(fate.delay);
      for (int k = fate.duplicate ? 2 : 1; k > 0; --k) {
        if (performance->isCancelled()) {
          KO_LOG_VERBOSE(kCategory) << "Text " << id << " was stopped: no call of " << handler
                                    << "._mrkpauseCallback(" << number << ")";
          return;
        }
        try {
          object->call<void>("_mrkpauseCallback", number);
        } catch (const std::exception& e) {
          KO_LOG_ERROR(kCategory) << handler << "._mrkpauseCallback(" << number
                                  << ") failed: " << e.what();
        }
      }
    });
    xReleaseHeld();
    return held;
  }

  void onMarkDone(const SpeechUtterance& u, const SpeechMarkRecord& record) override {
    fTts.xRecord(record.blocking ? "mrkpause" : "bookmark", ko::AnyValue::List{u.id, record.number},
                 markResult(record));
  }

  void onWord(const SpeechUtterance& u, const SpeechPerformance::Word& word, std::int64_t audioUs,
              std::int64_t playbackUs) override {
    const std::string text =
        word.offset < u.text.size() ? u.text.substr(word.offset, word.length) : std::string();
    fTts.xRecord("word",
                 ko::AnyValue::List{u.id, static_cast<std::int64_t>(word.offset),
                                    static_cast<std::int64_t>(word.length), text},
                 ko::AnyValue::map({{"audioUs", audioUs}, {"playbackUs", playbackUs}}));
  }

  void onEnded(const SpeechUtterance& u, bool stopped, std::int64_t playedUs,
               const std::string& error) override {
    xReleaseHeld();
    if (!error.empty()) {
      KO_LOG_ERROR(kCategory) << "Text " << u.id << " could not be spoken: " << error;
    }
    fTts.xRecord(stopped || !error.empty() ? "stopped" : "done", ko::AnyValue::List{u.id},
                 ko::AnyValue::map({{"playedUs", playedUs}}));
    if (fTts.xNotificationsEnabled())
      fTts.xRaise(kStatusEvent,
                  ZU::ZUValue::makeArray({u.id, stopped || !error.empty() ? "stopped" : "done"}));
  }

 private:
  BookmarkFate xFate(std::int32_t number, bool blocking) const {
    return fTts.fOptions.faults ? fTts.fOptions.faults->bookmarkFate(number, blocking)
                                : BookmarkFate{};
  }
  // A bookmark held back by a reorder fault comes after the next mark.
  void xReleaseHeld() {
    if (const auto held = std::exchange(fHeld, std::nullopt); held && fTts.xNotificationsEnabled())
      fTts.xRaiseBookmark(*held, {});
  }

  ZUTextToSpeech& fTts;
  std::optional<std::int32_t> fHeld;
};

ZUTextToSpeech::ZUTextToSpeech(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                               ZUTextToSpeechOptions options)
    : ZU::ZUModule(broker, name), fOptions(std::move(options)) {
  try {
    fSynthesizer = fOptions.backend == ZUTextToSpeechOptions::Backend::Espeak
                       ? makeEspeakSynthesizer()
                       : makeTimingSynthesizer(fOptions.charactersPerSecond);
  } catch (const std::exception& e) {
    ZU_THROW_ERROR(name, "ZUTextToSpeech", e.what());
  }
  const auto languages = fSynthesizer->languages();
  if (std::find(languages.begin(), languages.end(), fOptions.language) == languages.end())
    ZU_THROW_ERROR(name, "ZUTextToSpeech", "Unknown language: " + fOptions.language);
  fSettings.language = fOptions.language;
  fSettings.notifications = fOptions.notifications;

  // One thread: posted texts are spoken in the order they were posted.
  setEventLoop(std::make_shared<ko::EventLoop>(name, 1));
  fHoldLoop =
      std::make_shared<ko::EventLoop>(name + ".mrkpause", 2, ko::EventLoop::Scheduling::Realtime);
  fRecording = std::make_shared<SpeechRecording>(fSynthesizer->sampleRate());
  fListener = std::make_unique<Listener>(*this);
  fPlayer = std::make_unique<SpeechPlayer>(*fListener, fOptions.playbackRate, fRecording);
  xBindMethods();
}

ZUTextToSpeech::~ZUTextToSpeech() {
  xStopThreads();
}

void ZUTextToSpeech::xStopThreads() {
  fPlayer->shutdown();
  fHoldLoop->stop();
}

void ZUTextToSpeech::xBindMethods() {
  setModuleDescription("The speech engine of the simulated robot.");
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"say",
       &ZUTextToSpeech::say,
       "Says the text, with its bookmarks and pauses; returns when it is done or stopped.",
       {{"stringToSay", "The text to say."}}},
      {"stopAll", &ZUTextToSpeech::stopAll, "Stops the text being spoken and every text waiting."},
      {"setParameter",
       &ZUTextToSpeech::setParameter,
       "Sets a parameter: speed, pitchShift, volume or inputMode.",
       {{"parameter", "The parameter's name."}, {"value", "Its value."}}},
      {"getParameter",
       &ZUTextToSpeech::getParameter,
       "Returns a parameter's value.",
       {{"parameter", "The parameter's name."}},
       {"value", "Its value."}},
      {"getLanguage",
       &ZUTextToSpeech::getLanguage,
       "Returns the language the texts are spoken in.",
       {},
       {"language", "The language's name, for example \"English\"."}},
      {"setLanguage",
       &ZUTextToSpeech::setLanguage,
       "Sets the language the texts are spoken in.",
       {{"language", "The language's name, for example \"French\"."}}},
      {"getAvailableLanguages",
       &ZUTextToSpeech::getAvailableLanguages,
       "Returns the languages the engine speaks.",
       {},
       {"languages", "Their names."}},
      {"enableNotifications", &ZUTextToSpeech::enableNotifications,
       "Raises the bookmark and status events of the texts."},
      {"disableNotifications", &ZUTextToSpeech::disableNotifications,
       "Stops raising the bookmark and status events."},
      {"areNotificationsEnabled",
       &ZUTextToSpeech::areNotificationsEnabled,
       "Whether the bookmark and status events are raised.",
       {},
       {"enabled", "True when they are."}},
      {"_saveRecording",
       &ZUTextToSpeech::saveRecording,
       "Writes everything spoken so far to a WAV file, silences included.",
       {{"path", "The file to write."}}},
  };
  bindMethods(kModuleClass, methods);
}

void ZUTextToSpeech::exit() {
  stopAll();
  // The posted says end with their stopped texts, then the player and the blocking calls
  // stop: a say's end is told by the player.
  if (const auto loop = ownEventLoop())
    loop->stop();
  xStopThreads();
  ZU::ZUModule::exit();
}

void ZUTextToSpeech::xStopText(int id) {
  if (fPlayer->stop(id))
    return;
  // A text that is not queued yet: stopped as soon as it is.
  std::lock_guard lock(fMutex);
  const auto it = fTexts.find(id);
  if (it != fTexts.end())
    it->second->performance->cancel();
}

void ZUTextToSpeech::stop(int id) {
  // The task's flag first, then the texts: say() registers its text, then reads the flag,
  // so one of the two sees the other.
  ZU::ZUModule::stop(id);
  xStopText(id);
}

void ZUTextToSpeech::say(const std::string& text) {
  const auto task = currentTask();
  SpeechScript script = parseSpeechText(text);
  Settings settings;
  int id = 0;
  std::uint64_t generation = 0;
  {
    std::lock_guard lock(fMutex);
    settings = fSettings;
    id = task ? task->id() : fNextDirectId++;
    generation = fStopAllGeneration;
  }
  for (const auto& note : script.notes) {
    KO_LOG_WARNING(kCategory) << "Text " << id << ": " << note;
  }
  xRecord("say", ko::AnyValue::List{id, text});

  const std::size_t markCount = script.marks.size();
  auto performance = std::make_shared<SpeechPerformance>(
      markCount, fSynthesizer->sampleRate(), fOptions.recordAudio && fSynthesizer->producesAudio());
  auto utterance = std::make_shared<SpeechUtterance>(id, text, std::move(script), performance);
  const ko::Future<bool> ended = utterance->ended.future();
  bool stoppedAll = false;
  {
    std::lock_guard lock(fMutex);
    fTexts[id] = utterance;
    stoppedAll = fStopAllGeneration != generation;
  }
  // A stop that came before the text was known.
  if (stoppedAll || (task && task->isStopRequested()))
    performance->cancel();

  SpeechVoiceSettings voice;
  voice.language = settings.language;
  voice.speed = settings.speed;
  voice.pitchShift = settings.pitchShift;
  voice.volume = settings.volume;
  fSynthesizer->synthesize(utterance->script, voice, performance);
  fPlayer->enqueue(utterance);

  const ko::FutureState state = ended.wait();
  {
    std::lock_guard lock(fMutex);
    fTexts.erase(id);
    Spoken& spoken = fHistory[id];
    spoken.marks = utterance->marks;
    for (const auto& word : performance->words()) {
      spoken.words.push_back(SpeechWordRecord{
          word.offset, word.length, text.substr(word.offset, word.length),
          static_cast<std::int64_t>(word.sample * 1'000'000 /
                                    static_cast<std::uint64_t>(performance->sampleRate()))});
    }
    while (fHistory.size() > kHistorySize)
      fHistory.erase(fHistory.begin());
  }
  // A stopped text's synthesis gives up before its last bookmarks: nothing to warn about.
  if (!performance->isCancelled()) {
    for (const std::size_t index : performance->placedMarks()) {
      KO_LOG_WARNING(kCategory) << "Text " << id << ": bookmark "
                                << utterance->script.marks[index].number
                                << " was not reported by the synthesis; placed by its neighbours";
    }
  }
  if (state != ko::FutureState::FinishedWithValue)
    ZU_THROW_ERROR(getName(), "say", ended.error());
}

void ZUTextToSpeech::stopAll() {
  // Posted says that have not begun end as soon as they do; those that have begun but are
  // not registered yet see the new generation.
  xStopTasks("say");
  std::vector<std::shared_ptr<SpeechUtterance>> pending;
  {
    std::lock_guard lock(fMutex);
    ++fStopAllGeneration;
    for (const auto& [id, u] : fTexts)
      pending.push_back(u);
  }
  for (const auto& u : pending)
    u->performance->cancel();
  fPlayer->stopAll();
}

void ZUTextToSpeech::setParameter(const std::string& name, float value) {
  if (!std::isfinite(value)) {
    KO_LOG_ERROR(kCategory) << "Parameter " << name << " cannot be " << value;
    return;
  }
  {
    std::lock_guard lock(fMutex);
    if (name == "speed") {
      fSettings.speed = std::clamp(value, 50.0F, 400.0F);
    } else if (name == "pitchShift") {
      fSettings.pitchShift = value <= 0.0F ? 0.0F : std::clamp(value, 1.0F, 4.0F);
    } else if (name == "volume") {
      fSettings.volume = std::clamp(value, 0.0F, 1.0F);
    } else if (name == "inputMode") {
      fSettings.inputMode = value;
    } else {
      KO_LOG_WARNING(kCategory) << "Unknown parameter: " << name;
      return;
    }
  }
  xRecord("setParameter", ko::AnyValue::List{name, value});
}

float ZUTextToSpeech::getParameter(const std::string& name) {
  std::lock_guard lock(fMutex);
  if (name == "speed")
    return fSettings.speed;
  if (name == "pitchShift")
    return fSettings.pitchShift;
  if (name == "volume")
    return fSettings.volume;
  if (name == "inputMode")
    return fSettings.inputMode;
  ZU_THROW_ERROR(getName(), "getParameter", "Unknown parameter: " + name);
}

std::string ZUTextToSpeech::getLanguage() {
  std::lock_guard lock(fMutex);
  return fSettings.language;
}

void ZUTextToSpeech::setLanguage(const std::string& language) {
  const auto languages = fSynthesizer->languages();
  if (std::find(languages.begin(), languages.end(), language) == languages.end())
    ZU_THROW_ERROR(getName(), "setLanguage", "Unknown language: " + language);
  {
    std::lock_guard lock(fMutex);
    fSettings.language = language;
  }
  xRecord("setLanguage", ko::AnyValue::List{language});
}

std::vector<std::string> ZUTextToSpeech::getAvailableLanguages() {
  return fSynthesizer->languages();
}

void ZUTextToSpeech::enableNotifications() {
  std::lock_guard lock(fMutex);
  fSettings.notifications = true;
}

void ZUTextToSpeech::disableNotifications() {
  std::lock_guard lock(fMutex);
  fSettings.notifications = false;
}

bool ZUTextToSpeech::areNotificationsEnabled() {
  return xNotificationsEnabled();
}

bool ZUTextToSpeech::xNotificationsEnabled() const {
  std::lock_guard lock(fMutex);
  return fSettings.notifications;
}

void ZUTextToSpeech::saveRecording(const std::string& path) {
  try {
    fRecording->writeWav(path);
  } catch (const std::exception& e) {
    ZU_THROW_ERROR(getName(), "saveRecording", e.what());
  }
}

std::vector<SpeechMarkRecord> ZUTextToSpeech::markRecords(int id) const {
  std::lock_guard lock(fMutex);
  const auto it = fHistory.find(id);
  return it == fHistory.end() ? std::vector<SpeechMarkRecord>{} : it->second.marks;
}

std::vector<SpeechWordRecord> ZUTextToSpeech::wordRecords(int id) const {
  std::lock_guard lock(fMutex);
  const auto it = fHistory.find(id);
  return it == fHistory.end() ? std::vector<SpeechWordRecord>{} : it->second.words;
}

int ZUTextToSpeech::sampleRate() const {
  return fSynthesizer->sampleRate();
}

SpeechAudio ZUTextToSpeech::recordedAudio() const {
  return SpeechAudio{fRecording->sampleRate(), fRecording->samples(), fRecording->start()};
}

void ZUTextToSpeech::xRecord(const std::string& operation, ko::AnyValue arguments,
                             ko::AnyValue result) {
  if (fOptions.timeline)
    fOptions.timeline->record(getName(), operation, std::move(arguments), std::move(result));
}

void ZUTextToSpeech::xRaiseBookmark(std::int32_t number,
                                    std::chrono::steady_clock::duration delay) {
  if (delay <= std::chrono::steady_clock::duration::zero()) {
    xRaise(kCurrentBookMarkEvent, ZU::ZUValue(number));
    return;
  }
  // Held back by the fault plan: withdrawn if the plan is lifted meanwhile, so that it never
  // comes into a text spoken without faults.
  const std::uint64_t lifts = fOptions.faults ? fOptions.faults->lifts() : 0;
  ko::getEventLoop()->postDelayed(
      [weakSelf = weak_from_this(), number, lifts] {
        const auto self = std::static_pointer_cast<ZUTextToSpeech>(weakSelf.lock());
        if (!self)
          return;
        if (self->fOptions.faults && self->fOptions.faults->lifts() != lifts) {
          KO_LOG_VERBOSE(kCategory)
              << "Bookmark " << number << " held back by the lifted faults: not reported";
          return;
        }
        self->xRaise(kCurrentBookMarkEvent, ZU::ZUValue(number));
      },
      delay);
}

void ZUTextToSpeech::xRaise(const std::string& key, const ZU::ZUValue& value) {
  ko::AnyObject memory;
  {
    std::lock_guard lock(fMutex);
    if (!fMemory || !fMemory->isValid())
      fMemory = findService(fOptions.memoryModule);
    memory = fMemory;
  }
  if (!memory) {
    KO_LOG_WARNING(kCategory) << "No module " << fOptions.memoryModule << " to raise " << key;
    return;
  }
  try {
    ZU::ZUMemoryProxy(memory).raiseEvent(key, value);
  } catch (const std::exception& e) {
    KO_LOG_ERROR(kCategory) << "Cannot raise " << key << ": " << e.what();
  }
}

}  // namespace robotsim
