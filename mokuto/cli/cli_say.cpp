// mokuto say [options] [TEXT]: speaks an annotated text on the simulated robot with the
// service embedded in the process, or through the running service of other processes
// (mokuto --connect), prints the live timeline and a summary, and can write the audio (WAV,
// in the process only) and the whole timeline (JSON lines). --dry-run shows the prepared
// job without speaking.
#include <algorithm>
#include <atomic>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "cli_commands.h"
#include "cli_common.h"
#include "cli_json.h"
#include "cli_sayperformance.h"
#include "cli_saytimeline.h"
#include "cli_service.h"
#include "cli_signals.h"
#include "cli_textcheck.h"
#include "ko/json.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/path.hpp"
#include "mokuto/mokutoconfig.h"
#include "robotsim/faults.h"
#include "robotsim/soundlibrary.h"
#include "zu/zuerror.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace mokuto::cli {

namespace {

// At most this many warnings about the text are written; the others are counted.
constexpr std::size_t kShownWarnings = 10;

struct SayOptions {
  std::string mode;
  std::string language = "English";
  std::string posture;
  std::string speech = "espeak";
  bool fast = false;
  std::string config;
  std::string tagsToWords;
  std::string tagsToAnimations;
  std::vector<std::string> packages;
  bool checkTimes = false;
  std::string wav;
  std::string html;
  std::string timeline;
  bool dryRun = false;
  bool quiet = false;
  std::string faults;
  std::optional<std::string> text;
};

// An unusable argument or option: what to write (the status is kUsage).
struct Refusal {
  std::string message;
};

// A usable option value, or the message that says why it is not.
struct Parsed {
  std::optional<ZU::ZUValue> value;
  std::string error;
};

Parsed parseJsonOption(const std::string& option, const std::string& json) {
  Parsed parsed;
  try {
    const ko::AnyValue value = ko::fromJson(json);
    if (value.kind() != ko::Kind::List)
      parsed.error = option + " takes a JSON array";
    else
      parsed.value = ZU::fromAnyReference(value);
  } catch (const ko::JsonError& e) {
    parsed.error = option + ": invalid JSON: " + e.what();
  } catch (const ZU::ZUError& e) {
    parsed.error = option + ": cannot convert the value: " + e.description();
  }
  if (!parsed.error.empty())
    parsed.value.reset();
  return parsed;
}

// What the service logs (or throws) as it takes a configuration value, tried on a copy of
// the configuration first: the service logs these and goes on, the command refuses them.
std::vector<std::string> configurationErrors(ZU::MokutoConfig probe,
                                             const std::function<void(ZU::MokutoConfig&)>& take) {
  ko::log::ScopedCapture capture(ko::log::Error, true);
  try {
    take(probe);
  } catch (const std::exception& e) {
    return {e.what()};
  }
  std::vector<std::string> errors;
  for (const auto& record : capture.sink().records()) {
    if (record.level <= ko::log::Error)
      errors.push_back(record.message);
  }
  return errors;
}

// A file the command is to write: its folder must exist.
std::string checkOutputPath(const std::string& option, const std::string& path) {
  if (path.empty())
    return {};
  const std::filesystem::path parent = std::filesystem::path(path).parent_path();
  std::error_code error;
  if (!parent.empty() && !std::filesystem::is_directory(parent, error))
    return option + ": no folder " + parent.string();
  if (std::filesystem::is_directory(path, error))
    return option + ": " + path + " is a folder";
  return {};
}

// The option values, checked as the service will take them, before the robot starts.
struct Values {
  std::optional<ZU::ZUValue> configuration;
  std::optional<ZU::ZUValue> tagsToWords;
  std::optional<ZU::ZUValue> tagsToAnimations;
};

std::optional<Refusal> checkValues(const SayOptions& o, Values& values) {
  for (auto [option, json, target] :
       {std::tuple{"--config", &o.config, &values.configuration},
        std::tuple{"--tags-to-words", &o.tagsToWords, &values.tagsToWords},
        std::tuple{"--tags-to-animations", &o.tagsToAnimations, &values.tagsToAnimations}}) {
    if (json->empty())
      continue;
    Parsed parsed = parseJsonOption(option, *json);
    if (!parsed.value)
      return Refusal{parsed.error};
    *target = std::move(parsed.value);
  }
  // The packages as the service declares them: with a "/" appended.
  ZU::MokutoConfig probe;
  for (const auto& package : o.packages) {
    const std::string declared = package + "/";
    if (std::find(probe.animationsPackages.begin(), probe.animationsPackages.end(), declared) ==
        probe.animationsPackages.end())
      probe.animationsPackages.push_back(declared);
  }
  using Take = std::function<void(ZU::MokutoConfig&)>;
  const std::vector<std::tuple<const char*, const std::optional<ZU::ZUValue>*, Take>> takes = {
      {"--config", &values.configuration,
       [&values](ZU::MokutoConfig& c) { c.fromZUValue(*values.configuration); }},
      {"--tags-to-words", &values.tagsToWords,
       [&values](ZU::MokutoConfig& c) { c.updateWordsToTags(*values.tagsToWords); }},
      {"--tags-to-animations", &values.tagsToAnimations,
       [&values](ZU::MokutoConfig& c) { c.updateTagsToAnimations(*values.tagsToAnimations); }}};
  for (const auto& [option, value, take] : takes) {
    if (!*value)
      continue;
    const std::vector<std::string> errors = configurationErrors(probe, take);
    if (!errors.empty()) {
      std::string message;
      for (const auto& error : errors)
        message += (message.empty() ? "" : "\nmokuto say: ") + std::string(option) + ": " + error;
      return Refusal{message};
    }
  }
  for (const auto& [option, path] :
       {std::pair{"--wav", &o.wav}, {"--html", &o.html}, {"--timeline", &o.timeline}}) {
    if (const std::string error = checkOutputPath(option, *path); !error.empty())
      return Refusal{error};
  }
  if (o.dryRun && !o.wav.empty())
    return Refusal{"--wav has no audio to write with --dry-run"};
  if (o.dryRun && !o.html.empty())
    return Refusal{"--html has no performance to draw with --dry-run"};
  return std::nullopt;
}

// With --connect, the options that belong to the robot's process or that need the service
// in this one.
std::optional<Refusal> checkRemote(const CLI::App& command) {
  if (!connected())
    return std::nullopt;
  for (const char* option : {"--speech", "--fast", "--language", "--posture"}) {
    if (command.count(option) > 0)
      return Refusal{std::string(option) +
                     " belongs to the robot's process with --connect (zefoko serve --listen)"};
  }
  if (command.count("--dry-run") > 0)
    return Refusal{"--dry-run needs the service in this process (without --connect)"};
  for (const char* option : {"--wav", "--html", "--faults"}) {
    if (command.count(option) > 0)
      return Refusal{std::string(option) + " needs the robot in this process (without --connect)"};
  }
  return std::nullopt;
}

// The configuration calls, before the text: each package must hold animations.
std::optional<Refusal> configureService(const SayOptions& o, const Values& values,
                                        ServiceHandle& service) {
  try {
    const std::vector<std::string> installed =
        o.packages.empty() ? std::vector<std::string>() : service.installedBehaviors();
    for (const auto& package : o.packages) {
      const std::string declared = package + "/";
      if (std::none_of(installed.begin(), installed.end(), [&declared](const std::string& path) {
            return path.rfind(declared, 0) == 0;
          })) {
        return Refusal{"--package " + package + ": no installed animation begins with \"" +
                       declared + "\" (the service appends \"/\" to the package)"};
      }
      service.declareAnimationsPackage(package);
    }
    if (!o.mode.empty())
      service.setBodyLanguageModeFromStr(o.mode);
    if (values.tagsToWords)
      service.addTagsToWords(*values.tagsToWords);
    if (values.tagsToAnimations)
      service.declareTagForAnimations(*values.tagsToAnimations);
  } catch (const ZU::ZUError& e) {
    return Refusal{e.description()};
  } catch (const std::exception& e) {
    return Refusal{e.what()};
  }
  if (o.checkTimes)
    service._setCheckExecutionTimes(true);
  return std::nullopt;
}

void warnAboutText(const std::string& text) {
  const std::vector<TextWarning> warnings = checkInstructions(text);
  const bool lines = text.find('\n') != std::string::npos;
  for (std::size_t k = 0; k < std::min(warnings.size(), kShownWarnings); ++k) {
    const TextWarning& w = warnings[k];
    std::cerr << "mokuto say: warning: "
              << (lines ? "line " + std::to_string(w.line) + ", " : std::string()) << "column "
              << w.column << ": " << w.message << '\n';
  }
  if (warnings.size() > kShownWarnings) {
    std::cerr << "mokuto say: warning: " << warnings.size() - kShownWarnings
              << " more like these\n";
  }
  std::cerr << std::flush;
}

// What the director's calls will make of an action that the loader accepted, as far as it
// can be known before: a sound that its set lacks, a call whose arguments are not a JSON
// list or that no method of the service takes; an automatic tag without an animation.
class DryRunCheck {
 public:
  std::optional<std::string> operator()(const ZU::MKTaskAction& action) {
    if (actionErrorCode(action))
      return std::nullopt;
    if (action.type == ZU::UNKNOWN && dynamic_cast<const ZU::MKAnimationAction*>(&action))
      return "no animation";
    if (const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(&action)) {
      if (action.type == ZU::START_SOUND || action.type == ZU::RUN_SOUND)
        return xSound(*sound);
    } else if (const auto* call = dynamic_cast<const ZU::MKCallAction*>(&action)) {
      if (call->proxy)
        return xCall(*call);
    }
    return std::nullopt;
  }

 private:
  std::optional<std::string> xSound(const ZU::MKSoundAction& sound) {
    auto set = fSets.find(sound.soundSet);
    if (set == fSets.end()) {
      robotsim::SoundSet read;
      try {
        read = robotsim::readSoundSet(
            std::filesystem::path(ko::path::findData("zefoko", "sounds")) / sound.soundSet);
      } catch (const robotsim::SoundFileError&) {
      }
      set = fSets.emplace(sound.soundSet, std::move(read)).first;
    }
    const std::string name = soundFileName(sound.soundName);
    if (set->second.files.count(name) > 0)
      return std::nullopt;
    return "No sound \"" + name + "\" in the sound set \"" + sound.soundSet + "\"";
  }

  static std::optional<std::string> xCall(const ZU::MKCallAction& call) {
    std::vector<ko::AnyValue> arguments;
    try {
      arguments = ko::fromJson(call.arguments).to<std::vector<ko::AnyValue>>();
    } catch (const ko::JsonError& e) {
      return failureReason(e.what());
    } catch (const ko::ConversionError&) {
      return "the arguments are not a list";
    }
    try {
      call.proxy->getObject()->resolveMethod(call.method, arguments);
    } catch (const std::exception& e) {
      return std::string(e.what());
    }
    return std::nullopt;
  }

  std::map<std::string, robotsim::SoundSet> fSets;
};

Json preparedJobToJson(const ZU::MKTaskInstruction& job) {
  Json out = jobToJson(job);
  Json& actions = out["actions"];
  DryRunCheck check;
  std::size_t k = 0;
  for (const auto& action : job.actions) {
    if (!action)
      continue;
    Json& entry = actions[k++];
    entry["typeName"] = actionTypeName(action->type);
    Json resolved;
    const auto error = actionErrorCode(*action);
    if (!error) {
      if (const auto* animation = dynamic_cast<const ZU::MKAnimationAction*>(action.get())) {
        if (!animation->animation.empty())
          resolved = {{"animation", animation->animation}};
      } else if (const auto* sound = dynamic_cast<const ZU::MKSoundAction*>(action.get())) {
        if (action->type == ZU::START_SOUND || action->type == ZU::RUN_SOUND)
          resolved = {{"soundSet", sound->soundSet}};
      } else if (const auto* call = dynamic_cast<const ZU::MKCallAction*>(action.get())) {
        if (call->proxy)
          resolved = {{"service", call->module}};
      }
    }
    entry["resolved"] = resolved;
    entry["error"] = error ? Json(*error) : Json();
    const auto failure = check(*action);
    entry["failure"] = failure ? Json(*failure) : Json();
  }
  return out;
}

int say(SayOptions& o, const CLI::App& command) {
  // First: the signals are blocked before any thread starts.
  StopSignals signals("mokuto say");
  const auto refuse = [](const Refusal& refusal) {
    std::cerr << "mokuto say: " << refusal.message << std::endl;
    return kUsage;
  };
  if (const auto refusal = checkRemote(command))
    return refuse(*refusal);
  const std::string text = readText(o.text);
  if (text.find_first_not_of(" \t\r\n") == std::string::npos)
    return refuse({"the text is empty"});
  Values values;
  if (const auto refusal = checkValues(o, values))
    return refuse(*refusal);
  std::ofstream timelineFile;
  if (!o.timeline.empty()) {
    timelineFile.open(o.timeline);
    if (!timelineFile)
      return refuse({"--timeline: cannot write " + o.timeline});
  }
  // The live timeline is the command's output; the service's log keeps to its warnings
  // unless ZEFOKO_LOG says otherwise.
  if (ko::os::getenv("ZEFOKO_LOG").empty())
    ko::log::setLevels("*=warning");

  int status = kSuccess;
  try {
    EmbeddedServiceOptions serviceOptions;
    serviceOptions.speech = o.speech;
    serviceOptions.fast = o.fast;
    serviceOptions.language = o.language;
    serviceOptions.posture = o.posture;
    serviceOptions.recordAudio = !o.wav.empty() || !o.html.empty();
    if (!o.html.empty() || !o.timeline.empty())
      serviceOptions.angleSamplesPerSecond = kAngleSamplesPerSecond;
    serviceOptions.faults = o.faults;
    const std::unique_ptr<ServiceHandle> handle = openService(serviceOptions);
    ServiceHandle& service = *handle;
    // In this process alone: with --connect, the audio and the samples stay with the robot.
    robotsim::Robot* const robot = service.localRobot();
    if (const auto refusal = configureService(o, values, service))
      return refuse(*refusal);
    warnAboutText(text);
    const ZU::ZUValue noConfiguration;
    const ZU::ZUValue& configuration =
        values.configuration ? *values.configuration : noConfiguration;

    if (o.dryRun) {
      service.timeline()->clear();
      const auto job = service.prepare(text, configuration);
      std::cout << dumpJson(preparedJobToJson(*job)) << std::endl;
      if (timelineFile.is_open())
        service.timeline()->writeJsonLines(timelineFile);
    } else {
      const auto recorder =
          SayTimeline::create(service.timeline(), o.quiet ? nullptr : &std::cout, o.fast);
      // Set once a signal has asked the text to stop while the service had it.
      std::atomic<bool> stopAsked{false};
      service.setDirectorObserver(recorder);
      const bool drawn = robot != nullptr && serviceOptions.angleSamplesPerSecond > 0;
      service.setStageObserver([&](ZU::ZUMokutoStage stage, ZU::MKID id) {
        recorder->stage(stage, id);
        if (stage != ZU::ZUMokutoStage::Compiler)
          return;
        // The pose the performance starts from; the samples tell the joints that move.
        if (drawn)
          robot->motion()->recordPose();
        // A signal that came before the service registered the text stopped nothing yet.
        if (signals.received()) {
          stopAsked.store(true);
          service.stop(id);
        }
      });
      service.timeline()->clear();
      const std::int64_t originUs = service.timeline()->now();
      recorder->begin(text);
      {
        // Whatever say does, the signals and the service forget the callbacks on its way
        // out; a signal after it is only remembered, so that the summary and files come.
        const std::shared_ptr<void> detach(nullptr, [&](void*) {
          signals.onStop([] {});
          service.setStageObserver(nullptr);
          service.setDirectorObserver(nullptr);
        });
        signals.onStop([&] {
          stopAsked.store(true);
          service.stopText(recorder->id());
        });
        if (!signals.received()) {
          if (values.configuration)
            service.say(text, configuration);
          else
            service.say(text);
        }
        // From a service of another process, the last reports and the robot's last entries
        // may still be on their way.
        service.settle(recorder->id());
      }
      ZU::MKID id = 0;
      const SaySummary summary = recorder->end(stopAsked.load() || signals.received(), &id);
      const std::int64_t endUs = service.timeline()->now();
      SayTimeline::printSummary(std::cout, id, summary);
      if (robot) {
        std::ostringstream summaryText;
        SayTimeline::printSummary(summaryText, id, summary);
        writePerformanceFiles({o.wav, o.html}, *robot, *recorder, text, summaryText.str(), originUs,
                              endUs, std::cout);
      }
      if (timelineFile.is_open()) {
        recorder->writeJsonLines(timelineFile);
        std::cout << "Timeline written to " << o.timeline << '\n';
      }
      std::cout << std::flush;
    }
    if (timelineFile.is_open() && !timelineFile.flush()) {
      std::cerr << "mokuto say: cannot write " << o.timeline << std::endl;
      status = kFailure;
    }
  } catch (const ServiceError& e) {
    std::cerr << "mokuto say: the service cannot start: " << e.what() << std::endl;
    status = kFailure;
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto say: " << e.description() << std::endl;
    status = kFailure;
  } catch (const std::exception& e) {
    std::cerr << "mokuto say: " << e.what() << std::endl;
    status = kFailure;
  }
  if (signals.received())
    return kStopped;
  return std::cout.good() ? status : kFailure;
}

}  // namespace

void addSayCommand(CLI::App& app, int& status) {
  auto o = std::make_shared<SayOptions>();
  CLI::App* command = app.add_subcommand(
      "say",
      "Speak an annotated text on the simulated robot, with the service in the process (or "
      "the running one, with mokuto --connect): print the timeline live, then a summary of "
      "the actions and of their sync with the speech");
  command
      ->add_option("--mode", o->mode,
                   "The body language mode, set before the text: disabled, random or "
                   "contextual (default: the service's own, contextual)")
      ->check(CLI::IsMember({"disabled", "random", "contextual"}));
  addLanguageOption(*command, o->language, speechLanguages(), "The speech engine's language");
  command
      ->add_option("--posture", o->posture,
                   "The robot's posture family at start (default: Standing, the robot's own)")
      ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
  command
      ->add_option("--speech", o->speech,
                   "The speech engine: espeak (real speech) or timing (durations estimated "
                   "from the text, no audio)")
      ->check(CLI::IsMember({"espeak", "timing"}))
      ->capture_default_str();
  command->add_flag("--fast", o->fast,
                    "Play the speech without waiting in real time (default: real time; the "
                    "sync figures mean nothing then)");
  command
      ->add_option("--config", o->config,
                   "A configuration value form for the two-argument say: "
                   "[[\"bodyLanguageMode\", \"random\"], [\"msPauseBeforeSpeech\", 0], ...] "
                   "(default: none)")
      ->type_name("JSON");
  command
      ->add_option("--tags-to-words", o->tagsToWords,
                   "Words bound to tags, given to addTagsToWords before the text: "
                   "[[\"tag\", [\"word\", ...]], ...] (default: none)")
      ->type_name("JSON");
  command
      ->add_option("--tags-to-animations", o->tagsToAnimations,
                   "Animations bound to tags, given to declareTagForAnimations before the "
                   "text: [[\"tag\", [\"animation\", ...]], ...] (default: none)")
      ->type_name("JSON");
  command
      ->add_option("--package", o->packages,
                   "An animations package to declare before the text, as "
                   "declareAnimationsPackage takes it (repeatable; default: only "
                   "\"animations/\")")
      ->type_name("NAME")
      ->allow_extra_args(false);
  command->add_flag("--check-times", o->checkTimes,
                    "Switch the timing checker on (ZUMokuto/StartOfMK and StopOfMK, and the "
                    "durations in the log category mokuto.times; default: off)");
  command
      ->add_option("--wav", o->wav,
                   "Write the audio of the whole performance to this WAV file: the speech and "
                   "every sound, mixed at the times they played")
      ->type_name("FILE");
  command
      ->add_option("--html", o->html,
                   "Write the viewer of the performance to this HTML file: one page, audio "
                   "included, that draws the timeline and the robot and plays them")
      ->type_name("FILE");
  command
      ->add_option("--timeline", o->timeline, "Write the whole timeline to this file as JSON lines")
      ->type_name("FILE");
  command->add_flag("--dry-run", o->dryRun,
                    "Run the compiler and loader stages only and print the prepared job as "
                    "JSON, with the error of each action that the loader knows or that its "
                    "call would meet, without speaking");
  command->add_flag("--quiet", o->quiet, "Print the summary only, not the live timeline");
  command
      ->add_option("--faults", o->faults,
                   "Faults of the robot's services, separated by \";\": "
                   "Service.operation:throw|hang|delay=300ms, "
                   "ZUTextToSpeech.bookmarks:drop[=N,...]|duplicate|reorder|delay=600ms[@N,...], "
                   "ZUBehaviorManager.behaviorStopped:never (a call that hangs answers at Ctrl-C)")
      ->type_name("SPEC")
      ->check(CLI::Validator(
          [](std::string& spec) {
            try {
              robotsim::parseFaults(spec);
              return std::string();
            } catch (const robotsim::FaultSpecError& e) {
              return std::string(e.what());
            }
          },
          "SPEC"));
  addTextArgument(*command, o->text, "The annotated text (see mokuto syntax)");
  command->footer(
      "Exit status: 0 when the text was spoken (instruction errors and failed actions "
      "included: the summary counts them); 2 for an unusable argument or option, or a "
      "configuration value that the service rejects, before anything is spoken; 1 when the "
      "service fails; 130 when SIGINT (Ctrl-C) or SIGTERM stopped the text (its summary and "
      "files still come; a second signal, or one before the text is handed to the service, "
      "ends the command at once).\nWith mokuto --connect, --speech, --fast, --language and "
      "--posture belong to the robot's process (zefoko serve --listen), and --wav, --html, "
      "--faults "
      "and --dry-run need the service in this one: they are usage errors.\nWarnings about the text "
      "and log lines go to standard error, warnings and errors only unless ZEFOKO_LOG sets "
      "the levels.");
  command->callback([o, command, &status] { status = say(*o, *command); });
}

}  // namespace mokuto::cli
