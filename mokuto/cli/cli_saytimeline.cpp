#include "cli_saytimeline.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <string_view>
#include <thread>
#include <utility>

#include "cli_common.h"
#include "ko/json.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"

namespace mokuto::cli {

namespace {

using Json = nlohmann::ordered_json;

constexpr const char* kService = "ZUMokuto";
constexpr const char* kEndEvent = "ZUMokuto/EndOfMokuto";
constexpr const char* kBookmarkEvent = "ZUTextToSpeech/CurrentBookMark";
constexpr const char* kDirectorCategory = "mokuto.director";
// How long the end of a text waits for the audio player to take up a posted sound.
constexpr std::chrono::seconds kPlayBound{5};

constexpr std::array<std::string_view, ZU::kMKTaskActionTypeCount> kTypeNames = {
    "AUTO_START_TAG", "START_TAG",   "START",       "RUN_TAG",   "RUN",
    "WAIT",           "WAIT_TAG",    "STOP",        "STOP_TAG",  "MODE",
    "START_SOUND",    "STOP_SOUND",  "WAIT_SOUND",  "RUN_SOUND", "CALL",
    "PCALL",          "INPUT_MODE2", "AFFECTATION", "UNKNOWN"};

// The director's functions that run an action: what they log at error level (or, for a
// tag that the posture change keeps from starting, at warning level) is that action's
// failure.
constexpr std::array<std::string_view, 6> kActionFunctions = {
    "ZU::DirectorTask::xDoAction",   "ZU::DirectorTask::xCall",
    "ZU::DirectorTask::xPlayASound", "ZU::DirectorTask::xStartAnimation",
    "ZU::DirectorTask::xStopASound", "ZU::DirectorTask::xWaitASound"};

std::string seconds(std::int64_t us) {
  char text[32];
  std::snprintf(text, sizeof text, "%8.3f", static_cast<double>(us) / 1e6);
  return text;
}

std::string milliseconds(std::int64_t us) {
  char text[32];
  std::snprintf(text, sizeof text, "%.2f ms", static_cast<double>(us) / 1e3);
  return text;
}

std::string shown(const Json& value) {
  return value.is_string() ? value.get<std::string>()
                           : value.dump(-1, ' ', false, Json::error_handler_t::replace);
}

ko::AnyValue optionalUs(const std::optional<std::int64_t>& us) {
  return us ? ko::AnyValue(*us) : ko::AnyValue::none();
}

ko::AnyValue optionalText(const std::optional<std::string>& text) {
  return text ? ko::AnyValue(*text) : ko::AnyValue::none();
}

// "set/name" as the audio player names a sound.
std::string soundKey(const std::string& set, const std::string& name) {
  return set + "/" + soundFileName(name);
}

}  // namespace

// The director's lines about the action it runs, logged in one thread (the say caller's).
// Any logging thread may call consume; take is called by the watched thread.
class DirectorFailures : public ko::log::Sink {
 public:
  void watch(std::thread::id thread) {
    std::lock_guard lock(fMutex);
    fThread = thread;
    fReasons.clear();
  }
  void consume(const ko::log::Record& record) override {
    if (record.category != kDirectorCategory || record.level > ko::log::Warning ||
        !isActionFailure(record.function)) {
      return;
    }
    std::lock_guard lock(fMutex);
    if (fThread == std::this_thread::get_id())
      fReasons.push_back(failureReason(record.message));
  }
  // Whether a warning or error line of the director's, logged by `function`, is about the
  // action it runs.
  static bool isActionFailure(const std::string& function) {
    return std::find(kActionFunctions.begin(), kActionFunctions.end(), function) !=
           kActionFunctions.end();
  }
  // The reasons logged since the last call.
  std::vector<std::string> take() {
    std::lock_guard lock(fMutex);
    return std::exchange(fReasons, {});
  }

 private:
  std::mutex fMutex;
  std::optional<std::thread::id> fThread;
  std::vector<std::string> fReasons;
};

std::string actionTypeName(ZU::MKTaskActionType type) {
  if (type < 0 || static_cast<std::size_t>(type) >= kTypeNames.size())
    return std::string(kTypeNames[ZU::UNKNOWN]);
  return std::string(kTypeNames[static_cast<std::size_t>(type)]);
}

std::string soundFileName(std::string name) {
  if (name.size() > 4) {
    std::string extension = name.substr(name.size() - 4);
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    if (extension == ".wav")
      name.resize(name.size() - 4);
  }
  return name;
}

std::optional<std::string> actionErrorCode(const ZU::MKTaskAction& action) {
  if (action.type != ZU::UNKNOWN)
    return std::nullopt;
  const std::string code = action.text.substr(0, action.text.find(' '));
  const bool isCode = code.find('_') != std::string::npos &&
                      std::all_of(code.begin(), code.end(),
                                  [](char c) { return (c >= 'A' && c <= 'Z') || c == '_'; });
  return isCode ? std::optional<std::string>(code) : std::nullopt;
}

std::string failureReason(const std::string& message) {
  // The director's line: what failed, then the error after one of these.
  std::size_t from = 0;
  std::size_t earliest = std::string::npos;
  for (const char* marker : {" with this error: ", " throw an error: ",
                             " has thrown an exception: ", " has thrown an error: "}) {
    const std::size_t at = message.find(marker);
    if (at < earliest) {
      earliest = at;
      from = at + std::strlen(marker);
    }
  }
  std::string reason = message.substr(from);
  // A ZUError's text: a tab, module::method, a line break, a tab and the description.
  if (!reason.empty() && reason[0] == '\t') {
    const std::size_t description = reason.find("\n\t");
    if (description != std::string::npos)
      reason.erase(0, description + 2);
  }
  reason = reason.substr(0, reason.find('\n'));
  // The JSON decoder's own words for arguments that are not JSON.
  if (reason.rfind("[json.exception.", 0) == 0) {
    const std::size_t end = reason.find("] ");
    reason = "the arguments are not JSON: " +
             (end == std::string::npos ? reason : reason.substr(end + 2));
  }
  const std::size_t first = reason.find_first_not_of(" \t");
  return first == std::string::npos ? message : reason.substr(first);
}

std::shared_ptr<SayTimeline> SayTimeline::create(std::shared_ptr<robotsim::Timeline> timeline,
                                                 std::ostream* live, bool fast) {
  std::shared_ptr<SayTimeline> self(new SayTimeline(std::move(timeline), live, fast));
  // The timeline keeps its listeners as long as the robot lives.
  self->fTimeline->addListener([weak = std::weak_ptr<SayTimeline>(self)](const auto& entry) {
    if (const auto strong = weak.lock())
      strong->xOnEntry(entry);
  });
  return self;
}

SayTimeline::SayTimeline(std::shared_ptr<robotsim::Timeline> timeline, std::ostream* live,
                         bool fast)
    : fTimeline(std::move(timeline)),
      fLive(live),
      fFast(fast),
      fFailures(std::make_shared<DirectorFailures>()) {}

SayTimeline::~SayTimeline() {
  ko::log::removeSink(fFailures);
}

void SayTimeline::begin(const std::string& text) {
  // The failures are read from the director's error lines: they must be written.
  if (!ko::log::category(kDirectorCategory).enabled(ko::log::Error))
    ko::log::setLevel(kDirectorCategory, ko::log::Error);
  fFailures->watch(std::this_thread::get_id());
  ko::log::addSink(fFailures);
  std::lock_guard lock(fMutex);
  fText = text;
  const std::int64_t before = fTimeline->now();
  const std::int64_t ustime = ko::os::ustime();
  const std::int64_t after = fTimeline->now();
  fClockOffsetUs = ustime - (before + after) / 2;
  fBeginUs = after;
}

void SayTimeline::stage(ZU::ZUMokutoStage stage, ZU::MKID id) {
  std::string text;
  {
    std::lock_guard lock(fMutex);
    if (stage == ZU::ZUMokutoStage::Director)
      fSpoken = true;
    if (stage != ZU::ZUMokutoStage::Compiler)
      return;
    fId = id;
    text = fText;
  }
  fTimeline->record(kService, "say", ko::AnyValue::List{id, std::move(text)});
}

ZU::MKID SayTimeline::id() const {
  std::lock_guard lock(fMutex);
  return fId;
}

void SayTimeline::onAction(const ZU::DirectorActionReport& report) {
  xAction(report, fFailures->take());
}

void SayTimeline::onRemoteAction(const ZU::DirectorActionReport& report,
                                 const std::vector<DirectorLine>& lines) {
  std::vector<std::string> failures;
  for (const auto& line : lines) {
    if (DirectorFailures::isActionFailure(line.function))
      failures.push_back(failureReason(line.message));
  }
  xAction(report, std::move(failures));
}

void SayTimeline::xAction(const ZU::DirectorActionReport& report,
                          std::vector<std::string> failures) {
  std::size_t index = 0;
  {
    std::lock_guard lock(fMutex);
    Action action;
    action.report = report;
    action.type = actionTypeName(report.type);
    if (report.action) {
      action.text = report.action->text;
      action.error = actionErrorCode(*report.action);
    }
    action.arrivedUs = xToTimeline(report.bookmarkUs);
    action.startUs = xToTimeline(report.beginUs);
    action.endUs = xToTimeline(report.endUs);
    xResolveBookmark(action);
    xOutcome(action, std::move(failures));
    index = fActions.size();
    fActions.push_back(std::move(action));
  }
  // The entry's place on the timeline; its fields are filled in when it is written, once
  // the speech engine has reported every bookmark.
  fTimeline->record(kService, "action",
                    ko::AnyValue::map({{"index", static_cast<std::int64_t>(index)}}));
}

void SayTimeline::xOutcome(Action& action, std::vector<std::string> failures) {
  using Outcome = ZU::DirectorActionReport::Outcome;
  const ZU::DirectorActionReport& report = action.report;
  const auto* animation = dynamic_cast<const ZU::MKAnimationAction*>(report.action.get());
  if (report.outcome == Outcome::Dropped) {
    action.outcome = "stopped";
    return;
  }
  // An automatic tag for which the loader found no animation carries no error code.
  if (report.type == ZU::UNKNOWN && !action.error && animation) {
    action.outcome = "no animation";
    return;
  }
  if (action.error || report.outcome == Outcome::Skipped) {
    action.outcome = "skipped";
    return;
  }
  action.outcome = "executed";
  if (!failures.empty()) {
    action.outcome = "failed";
    action.failure = failures.front();
  }
  const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(report.action.get());
  if (sound && (report.type == ZU::START_SOUND || report.type == ZU::RUN_SOUND)) {
    // The audio player recorded the play, or its refusal; a posted one may come later.
    action.sound = soundKey(sound->soundSet, sound->soundName);
    const auto play = std::find_if(fPlays.begin(), fPlays.end(),
                                   [&action](const Play& p) { return p.sound == action.sound; });
    if (play != fPlays.end()) {
      if (play->refusal && !action.failure) {
        action.outcome = "failed";
        action.failure = play->refusal;
      }
      fPlays.erase(play);
    } else if (report.type == ZU::START_SOUND && !action.failure) {
      action.awaitingPlay = true;
    }
  }
  if (animation && action.outcome == "executed") {
    if (report.type == ZU::START_TAG || report.type == ZU::RUN_TAG)
      fTagAnimations[animation->tag].insert(animation->animation);
    if ((report.type == ZU::WAIT || report.type == ZU::WAIT_TAG) && !xWasRunning(action)) {
      action.note = report.type == ZU::WAIT ? "the animation was not running"
                                            : "no animation of the tag was running";
    }
  }
}

// Whether what a "^wait" or "^waitTag" waited for was running when it began: a behaviour it
// waits for stopped after that. (The behaviour manager records a stop before it tells the
// director, so the stop is known by the time the wait returns.)
bool SayTimeline::xWasRunning(const Action& action) const {
  const auto* animation = dynamic_cast<const ZU::MKAnimationAction*>(action.report.action.get());
  if (!animation || !action.startUs)
    return true;
  std::set<std::string> paths = {animation->animation};
  if (action.report.type == ZU::WAIT_TAG) {
    const auto tagged = fTagAnimations.find(animation->tag);
    paths = tagged == fTagAnimations.end() ? std::set<std::string>{} : tagged->second;
  }
  return std::any_of(fStoppedBehaviors.begin(), fStoppedBehaviors.end(), [&](const auto& stop) {
    return stop.second >= *action.startUs && paths.count(stop.first) > 0;
  });
}

void SayTimeline::xPlayed(Play play, std::int64_t us) {
  for (std::size_t k = 0; k < fActions.size(); ++k) {
    Action& action = fActions[k];
    if (!action.awaitingPlay || action.sound != play.sound)
      continue;
    action.awaitingPlay = false;
    if (play.refusal) {
      action.outcome = "failed";
      action.failure = play.refusal;
    }
    xList(k, us);
    fPlayed.notify_all();
    return;
  }
  fPlays.push_back(std::move(play));
}

SaySummary SayTimeline::end(bool stopped, ZU::MKID* id) {
  SaySummary summary;
  ZU::MKID textId = 0;
  {
    std::unique_lock lock(fMutex);
    // A posted sound's play is recorded once the audio player takes it up, which may come
    // after the text's end.
    fPlayed.wait_for(lock, kPlayBound, [this] {
      return std::none_of(fActions.begin(), fActions.end(),
                          [](const Action& action) { return action.awaitingPlay; });
    });
    const std::int64_t now = fTimeline->now();
    for (std::size_t k = 0; k < fActions.size(); ++k) {
      xResolveBookmark(fActions[k]);
      // A posted sound that the audio player never took up.
      if (fActions[k].awaitingPlay) {
        fActions[k].awaitingPlay = false;
        xList(k, now);
      }
    }
    if (fUnlistedStops > 0) {
      xPrint(now, "... and " + std::to_string(fUnlistedStops) + " more action" +
                      (fUnlistedStops == 1 ? "" : "s") + " stopped");
    }
    summary = xSummary();
    summary.durationUs = now - fBeginUs;
    summary.textStopped = stopped;
    summary.spoken = fSpoken;
    summary.fast = fFast;
    // What comes later (the body talk settling) goes to the file only, not amid the summary.
    fEnded = true;
    textId = fId;
  }
  ko::log::removeSink(fFailures);
  if (id)
    *id = textId;
  const bool withSync = summary.syncCount > 0 && !summary.fast;
  const auto sync = [withSync](std::int64_t us) {
    return withSync ? ko::AnyValue(us) : ko::AnyValue::none();
  };
  fTimeline->record(
      kService, "end", ko::AnyValue::List{textId},
      ko::AnyValue::map({{"outcome", stopped ? "stopped" : "done"},
                         {"executed", summary.executed},
                         {"failed", summary.failed},
                         {"noAnimation", summary.noAnimation},
                         {"skipped", summary.skipped},
                         {"stopped", summary.stopped},
                         {"instructionErrors", summary.instructionErrors},
                         {"syncMedianUs", sync(summary.syncMedianUs)},
                         {"syncP99Us", summary.syncCount >= kSyncP99Count ? sync(summary.syncP99Us)
                                                                          : ko::AnyValue::none()},
                         {"syncMaxUs", sync(summary.syncMaxUs)}}));
  return summary;
}

void SayTimeline::printSummary(std::ostream& os, ZU::MKID id, const SaySummary& s) {
  const std::string text = id > 0 ? "Text " + std::to_string(id) : std::string("The text");
  if (!s.textStopped)
    os << text << " done in " << milliseconds(s.durationUs) << "\n";
  else if (id == 0)
    os << text << " stopped before the service took it up\n";
  else
    os << text << " stopped after " << milliseconds(s.durationUs)
       << (s.spoken ? "" : ", before its speech began") << "\n";
  os << "  actions: " << s.executed << " executed";
  for (const auto& [count, name] : {std::pair{s.failed, "failed"}, {s.noAnimation, "no animation"}})
    if (count > 0)
      os << ", " << count << " " << name;
  os << ", " << s.skipped << " skipped";
  if (s.stopped > 0)
    os << ", " << s.stopped << " stopped";
  os << "\n  instruction errors: " << s.instructionErrors << "\n";
  if (s.fast) {
    os << "  sync figures are meaningless with --fast\n";
  } else if (s.syncCount > 0) {
    os << "  sync, from a bookmark's audio time to its action's start (" << s.syncCount
       << (s.syncCount == 1 ? " action" : " actions") << "): median "
       << milliseconds(s.syncMedianUs);
    if (s.syncCount >= kSyncP99Count)
      os << ", p99 " << milliseconds(s.syncP99Us);
    os << ", max " << milliseconds(s.syncMaxUs) << "\n";
  } else {
    os << "  sync: no executed action at a bookmark\n";
  }
}

void SayTimeline::writeJsonLines(std::ostream& os) const {
  const auto entries = fTimeline->entries();
  std::lock_guard lock(fMutex);
  for (const auto& entry : entries) {
    Json line;
    line["us"] = entry.us;
    line["service"] = entry.service;
    line["operation"] = entry.operation;
    ko::AnyValue arguments = entry.arguments;
    if (entry.service == kService && entry.operation == "action") {
      const auto index = static_cast<std::size_t>(ko::toJson(entry.arguments)["index"].get<int>());
      if (index < fActions.size())
        arguments = xActionArguments(fActions[index]);
    }
    line["arguments"] = ko::toJson(arguments);
    if (!entry.result.isVoid())
      line["result"] = ko::toJson(entry.result);
    os << line.dump(-1, ' ', false, Json::error_handler_t::replace) << '\n';
  }
}

void SayTimeline::xOnEntry(const robotsim::TimelineEntry& entry) {
  std::lock_guard lock(fMutex);
  const Json arguments = ko::toJson(entry.arguments);
  const auto argument = [&arguments](std::size_t k) {
    return arguments.is_array() && k < arguments.size() ? arguments[k] : Json();
  };
  const std::string& service = entry.service;
  const std::string& operation = entry.operation;
  if (service == "ZUTextToSpeech") {
    const Json speechId = argument(0);
    if (operation == "say" && !fSpeechId && speechId.is_number_integer()) {
      fSpeechId = speechId.get<std::int64_t>();
      xPrint(entry.us, "speech posted");
      return;
    }
    if (!fSpeechId || speechId != Json(*fSpeechId))
      return;
    if (operation == "started") {
      xPrint(entry.us, "speech started");
    } else if ((operation == "bookmark" || operation == "hold") &&
               argument(1).is_number_integer()) {
      xBookmarkReached(argument(1).get<std::int32_t>(), entry.us, operation == "hold");
    } else if (operation == "done" || operation == "stopped") {
      xPrint(entry.us, "speech " + operation);
    }
  } else if (service == "ZUBehaviorManager") {
    if (operation == "startBehavior") {
      xPrint(entry.us, "behaviour started " + shown(argument(0)));
    } else if (operation == "behaviorStopped") {
      fStoppedBehaviors.emplace_back(shown(argument(0)), entry.us);
      xPrint(entry.us, "behaviour stopped " + shown(argument(0)));
    }
  } else if (service == "ZUAudioPlayer") {
    const std::string sound = shown(argument(0)) + "/" + shown(argument(1));
    if (operation == "playSoundSetFile") {
      xPrint(entry.us, "sound " + sound + " (volume " + shown(argument(2)) + ")");
      xPlayed({sound, std::nullopt}, entry.us);
    } else if (operation == "playFailed") {
      xPlayed({sound, shown(ko::toJson(entry.result))}, entry.us);
    } else if (operation == "soundEnded") {
      xPrint(entry.us, "sound " + sound + " ended");
    } else if (operation == "stop") {
      xPrint(entry.us, "sound " + shown(argument(0)) + " stopped");
    }
  } else if (service == "ZUMemory" && operation == "raiseEvent") {
    const std::string key = shown(argument(0));
    // The engine raises the bookmark's event before it records the bookmark: whichever
    // comes first is when the speech reached it.
    if (key == kBookmarkEvent && fSpeechId && argument(1).is_number_integer())
      xBookmarkReached(argument(1).get<std::int32_t>(), entry.us, false);
    if (key.rfind("ZUTextToSpeech/", 0) == 0)
      return;
    if (key == kEndEvent)
      xPrint(entry.us, "end of text " + shown(argument(1)) + " (" + key + ")");
    else
      xPrint(entry.us, "event " + key + " = " + shown(argument(1)));
  } else if (service == kService) {
    if (operation == "say") {
      std::size_t length = 0;
      const std::string echo = printable(shown(argument(1)), kEchoed, &length);
      xPrint(entry.us,
             "say " + shown(argument(0)) + " (" + std::to_string(length) + " characters): " + echo);
    } else if (operation == "action") {
      const Json index = arguments.is_object() ? arguments["index"] : Json();
      if (!index.is_number_integer() || index.get<std::size_t>() >= fActions.size())
        return;
      fActions[index.get<std::size_t>()].entered = true;
      xList(index.get<std::size_t>(), entry.us);
    }
  }
}

void SayTimeline::xList(std::size_t index, std::int64_t us) {
  Action& action = fActions[index];
  if (!action.entered || action.awaitingPlay || action.listed)
    return;
  action.listed = true;
  if (action.outcome == "stopped" && fListedStops++ >= kListedStops) {
    ++fUnlistedStops;
    return;
  }
  // An erroneous action's text starts with its code, shown after the outcome instead.
  std::string line =
      action.error ? action.text.substr(std::min(action.text.size(), action.error->size() + 1))
                   : action.text;
  line += "  " + action.outcome;
  if (action.error)
    line += ": " + *action.error;
  if (action.failure)
    line += ": " + *action.failure;
  if (action.outcome == "executed") {
    if (action.bookmarkUs && action.startUs)
      line += ", started " + milliseconds(*action.startUs - *action.bookmarkUs) +
              " after bookmark " + std::to_string(action.report.bookmark);
    if (action.startUs && action.endUs)
      line += ", ran " + milliseconds(*action.endUs - *action.startUs);
    if (action.note)
      line += " (" + *action.note + ")";
  } else if (action.outcome == "skipped" && !action.error) {
    line += ": its bookmark " + std::to_string(action.report.bookmark) + " came too late";
  }
  xPrint(us, line);
}

void SayTimeline::xBookmarkReached(std::int32_t number, std::int64_t us, bool blocking) {
  for (const auto& known : fBookmarks) {
    if (known.first == number)
      return;
  }
  fBookmarks.emplace_back(number, us);
  xPrint(us, "bookmark " + std::to_string(number) +
                 (blocking ? " (the speech waits for its action)" : ""));
}

void SayTimeline::xPrint(std::int64_t us, const std::string& line) {
  if (fLive && !fEnded)
    *fLive << seconds(us - fBeginUs) << "  " << line << std::endl;
}

void SayTimeline::xResolveBookmark(Action& action) const {
  for (const auto& [number, us] : fBookmarks) {
    if (number >= 0 && static_cast<std::uint32_t>(number) == action.report.bookmark) {
      action.bookmarkUs = us;
      return;
    }
  }
}

std::optional<std::int64_t> SayTimeline::xToTimeline(std::int64_t ustime) const {
  if (ustime < 0)
    return std::nullopt;
  return ustime - fClockOffsetUs;
}

ko::AnyValue SayTimeline::xActionArguments(const Action& action) const {
  return ko::AnyValue::map({
      {"bookmark", static_cast<std::int64_t>(action.report.bookmark)},
      {"type", action.type},
      {"text", action.text},
      {"error", optionalText(action.error)},
      {"outcome", action.outcome},
      {"failure", optionalText(action.failure)},
      {"note", optionalText(action.note)},
      {"bookmarkUs", optionalUs(action.bookmarkUs)},
      {"arrivedUs", optionalUs(action.arrivedUs)},
      {"startUs", optionalUs(action.startUs)},
      {"endUs", optionalUs(action.endUs)},
  });
}

SaySummary SayTimeline::xSummary() const {
  SaySummary summary;
  std::vector<std::int64_t> delays;
  for (const auto& action : fActions) {
    if (action.outcome == "executed")
      ++summary.executed;
    else if (action.outcome == "failed")
      ++summary.failed;
    else if (action.outcome == "no animation")
      ++summary.noAnimation;
    else if (action.outcome == "skipped")
      ++summary.skipped;
    else
      ++summary.stopped;
    if (action.error)
      ++summary.instructionErrors;
    if (action.outcome == "executed" && action.bookmarkUs && action.startUs)
      delays.push_back(*action.startUs - *action.bookmarkUs);
  }
  if (!delays.empty()) {
    std::sort(delays.begin(), delays.end());
    const std::size_t n = delays.size();
    summary.syncCount = static_cast<int>(n);
    summary.syncMedianUs = n % 2 ? delays[n / 2] : (delays[n / 2 - 1] + delays[n / 2]) / 2;
    if (n >= kSyncP99Count)
      summary.syncP99Us = delays[(n * 99 + 99) / 100 - 1];  // the nearest rank
    summary.syncMaxUs = delays.back();
  }
  return summary;
}

}  // namespace mokuto::cli
