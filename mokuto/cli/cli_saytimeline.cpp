#include "cli_saytimeline.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <string_view>
#include <utility>

#include "ko/json.hpp"
#include "ko/os.hpp"

namespace mokuto::cli {

namespace {

using Json = nlohmann::ordered_json;

constexpr const char* kService = "ZUMokuto";
constexpr const char* kEndEvent = "ZUMokuto/EndOfMokuto";
constexpr const char* kBookmarkEvent = "ZUTextToSpeech/CurrentBookMark";

constexpr std::array<std::string_view, ZU::kMKTaskActionTypeCount> kTypeNames = {
    "AUTO_START_TAG", "START_TAG",   "START",       "RUN_TAG",   "RUN",
    "WAIT",           "WAIT_TAG",    "STOP",        "STOP_TAG",  "MODE",
    "START_SOUND",    "STOP_SOUND",  "WAIT_SOUND",  "RUN_SOUND", "CALL",
    "PCALL",          "INPUT_MODE2", "AFFECTATION", "UNKNOWN"};

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

}  // namespace

std::string actionTypeName(ZU::MKTaskActionType type) {
  if (type < 0 || static_cast<std::size_t>(type) >= kTypeNames.size())
    return std::string(kTypeNames[ZU::UNKNOWN]);
  return std::string(kTypeNames[static_cast<std::size_t>(type)]);
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

std::shared_ptr<SayTimeline> SayTimeline::create(std::shared_ptr<robotsim::Timeline> timeline,
                                                 std::ostream* live) {
  std::shared_ptr<SayTimeline> self(new SayTimeline(std::move(timeline), live));
  // The timeline keeps its listeners as long as the robot lives.
  self->fTimeline->addListener([weak = std::weak_ptr<SayTimeline>(self)](const auto& entry) {
    if (const auto strong = weak.lock())
      strong->xOnEntry(entry);
  });
  return self;
}

SayTimeline::SayTimeline(std::shared_ptr<robotsim::Timeline> timeline, std::ostream* live)
    : fTimeline(std::move(timeline)), fLive(live) {}

void SayTimeline::begin(const std::string& text) {
  std::lock_guard lock(fMutex);
  fText = text;
  const std::int64_t before = fTimeline->now();
  const std::int64_t ustime = ko::os::ustime();
  const std::int64_t after = fTimeline->now();
  fClockOffsetUs = ustime - (before + after) / 2;
  fBeginUs = after;
}

void SayTimeline::accepted(ZU::MKID id) {
  std::string text;
  {
    std::lock_guard lock(fMutex);
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
    switch (report.outcome) {
      case ZU::DirectorActionReport::Outcome::Executed:
        action.outcome = action.error ? "skipped" : "executed";
        break;
      case ZU::DirectorActionReport::Outcome::Skipped:
        action.outcome = "skipped";
        break;
      case ZU::DirectorActionReport::Outcome::Dropped:
        action.outcome = "stopped";
        break;
    }
    action.arrivedUs = xToTimeline(report.bookmarkUs);
    action.startUs = xToTimeline(report.beginUs);
    action.endUs = xToTimeline(report.endUs);
    xResolveBookmark(action);
    index = fActions.size();
    fActions.push_back(std::move(action));
  }
  // The entry's place on the timeline; its fields are filled in when it is written, once
  // the speech engine has reported every bookmark.
  fTimeline->record(kService, "action",
                    ko::AnyValue::map({{"index", static_cast<std::int64_t>(index)}}));
}

SaySummary SayTimeline::end(ZU::MKID* id) {
  SaySummary summary;
  ZU::MKID textId = 0;
  {
    std::lock_guard lock(fMutex);
    for (auto& action : fActions)
      xResolveBookmark(action);
    summary = xSummary();
    summary.durationUs = fTimeline->now() - fBeginUs;
    // What comes later (the body talk settling) goes to the file only, not amid the summary.
    fEnded = true;
    textId = fId;
  }
  if (id)
    *id = textId;
  const auto optional = [&summary](std::int64_t us) {
    return summary.syncCount > 0 ? ko::AnyValue(us) : ko::AnyValue::none();
  };
  fTimeline->record(kService, "end", ko::AnyValue::List{textId},
                    ko::AnyValue::map({{"executed", summary.executed},
                                       {"skipped", summary.skipped},
                                       {"stopped", summary.stopped},
                                       {"instructionErrors", summary.instructionErrors},
                                       {"syncMedianUs", optional(summary.syncMedianUs)},
                                       {"syncMaxUs", optional(summary.syncMaxUs)}}));
  return summary;
}

void SayTimeline::printSummary(std::ostream& os, ZU::MKID id, const SaySummary& s) {
  os << "Text " << id << (s.stopped > 0 ? " stopped after " : " done in ")
     << milliseconds(s.durationUs) << "\n"
     << "  actions: " << s.executed << " executed, " << s.skipped << " skipped";
  if (s.stopped > 0)
    os << ", " << s.stopped << " stopped";
  os << "\n  instruction errors: " << s.instructionErrors << "\n";
  if (s.syncCount > 0) {
    os << "  sync, from a bookmark's audio time to its action's start (" << s.syncCount
       << (s.syncCount == 1 ? " action" : " actions") << "): median "
       << milliseconds(s.syncMedianUs) << ", max " << milliseconds(s.syncMaxUs) << "\n";
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
    if (operation == "startBehavior")
      xPrint(entry.us, "behaviour started " + shown(argument(0)));
    else if (operation == "behaviorStopped")
      xPrint(entry.us, "behaviour stopped " + shown(argument(0)));
  } else if (service == "ZUAudioPlayer") {
    if (operation == "playSoundSetFile")
      xPrint(entry.us, "sound " + shown(argument(0)) + "/" + shown(argument(1)) + " (volume " +
                           shown(argument(2)) + ")");
    else if (operation == "soundEnded")
      xPrint(entry.us, "sound " + shown(argument(0)) + "/" + shown(argument(1)) + " ended");
    else if (operation == "stop")
      xPrint(entry.us, "sound " + shown(argument(0)) + " stopped");
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
      xPrint(entry.us, "say " + shown(argument(0)) + ": " + shown(argument(1)));
    } else if (operation == "action") {
      const Json index = arguments.is_object() ? arguments["index"] : Json();
      if (!index.is_number_integer() || index.get<std::size_t>() >= fActions.size())
        return;
      const Action& action = fActions[index.get<std::size_t>()];
      // An erroneous action's text starts with its code, shown after the outcome instead.
      std::string line =
          action.error ? action.text.substr(std::min(action.text.size(), action.error->size() + 1))
                       : action.text;
      line += "  " + action.outcome;
      if (action.error)
        line += ": " + *action.error;
      if (action.outcome == "executed") {
        if (action.bookmarkUs && action.startUs)
          line += ", started " + milliseconds(*action.startUs - *action.bookmarkUs) +
                  " after bookmark " + std::to_string(action.report.bookmark);
        if (action.startUs && action.endUs)
          line += ", ran " + milliseconds(*action.endUs - *action.startUs);
      } else if (action.outcome == "skipped" && !action.error) {
        line += ": its bookmark " + std::to_string(action.report.bookmark) + " came too late";
      }
      xPrint(entry.us, line);
    }
  }
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
      {"error", action.error ? ko::AnyValue(*action.error) : ko::AnyValue::none()},
      {"outcome", action.outcome},
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
    summary.syncMaxUs = delays.back();
  }
  return summary;
}

}  // namespace mokuto::cli
