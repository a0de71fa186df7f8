// mokuto say [options] [TEXT]: speaks an annotated text on the simulated robot with the
// service embedded in the process, prints the live timeline and a summary, and can write
// the audio (WAV) and the whole timeline (JSON lines). --dry-run shows the prepared job
// without speaking.
#include <pthread.h>

#include <atomic>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <iterator>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include "cli_commands.h"
#include "cli_json.h"
#include "cli_sayperformance.h"
#include "cli_saytimeline.h"
#include "cli_service.h"
#include "ko/json.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zuerror.h"
#include "zu/zuvalue.h"
#include "zu/zuvalueconverter.h"

namespace mokuto::cli {

namespace {

constexpr int kUsage = 2;
constexpr int kFailure = 1;
// The shell's status for a command ended by SIGINT.
constexpr int kInterrupted = 128 + SIGINT;

// SIGINT and SIGTERM blocked in the constructing thread (and in every thread it starts
// afterwards) for the object's life.
class InterruptMask {
 public:
  InterruptMask() {
    sigemptyset(&fSignals);
    sigaddset(&fSignals, SIGINT);
    sigaddset(&fSignals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &fSignals, &fPrevious);
  }
  ~InterruptMask() { pthread_sigmask(SIG_SETMASK, &fPrevious, nullptr); }
  InterruptMask(const InterruptMask&) = delete;
  InterruptMask& operator=(const InterruptMask&) = delete;

  const sigset_t& signals() const { return fSignals; }

 private:
  sigset_t fSignals{};
  sigset_t fPrevious{};
};

// While a text is spoken, Ctrl-C (SIGINT) or SIGTERM stops it rather than the process, so
// that the summary and the files still come. A thread of its own waits for the signal;
// the destructor wakes and joins it.
class InterruptWatcher {
 public:
  InterruptWatcher(const InterruptMask& mask, std::function<void()> stop)
      : fThread([this, signals = mask.signals(), stop = std::move(stop)] {
          int received = 0;
          sigwait(&signals, &received);
          if (!fDone.load()) {
            fInterrupted.store(true);
            std::cerr << "mokuto say: " << (received == SIGINT ? "SIGINT" : "SIGTERM")
                      << ", stopping the text" << std::endl;
            stop();
          }
        }) {}
  ~InterruptWatcher() {
    fDone.store(true);
    pthread_kill(fThread.native_handle(), SIGTERM);
    fThread.join();
  }
  InterruptWatcher(const InterruptWatcher&) = delete;
  InterruptWatcher& operator=(const InterruptWatcher&) = delete;

  bool interrupted() const { return fInterrupted.load(); }

 private:
  std::atomic<bool> fDone{false};
  std::atomic<bool> fInterrupted{false};
  std::thread fThread;  // last: it uses the flags
};

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
  std::optional<std::string> text;
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

Json preparedJobToJson(const ZU::MKTaskInstruction& job) {
  Json out = jobToJson(job);
  Json& actions = out["actions"];
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
  }
  return out;
}

int say(SayOptions& o) {
  const auto usage = [](const std::string& message) {
    std::cerr << "mokuto say: " << message << std::endl;
    return kUsage;
  };
  if (!o.text || *o.text == "-") {
    o.text.emplace(std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>());
  }
  if (o.text->find_first_not_of(" \t\r\n") == std::string::npos)
    return usage("the text is empty");
  std::optional<ZU::ZUValue> configuration;
  std::optional<ZU::ZUValue> tagsToWords;
  std::optional<ZU::ZUValue> tagsToAnimations;
  for (auto [option, json, target] :
       {std::tuple{"--config", &o.config, &configuration},
        std::tuple{"--tags-to-words", &o.tagsToWords, &tagsToWords},
        std::tuple{"--tags-to-animations", &o.tagsToAnimations, &tagsToAnimations}}) {
    if (json->empty())
      continue;
    Parsed parsed = parseJsonOption(option, *json);
    if (!parsed.value)
      return usage(parsed.error);
    *target = std::move(parsed.value);
  }
  for (const auto& [option, path] :
       {std::pair{"--wav", &o.wav}, {"--html", &o.html}, {"--timeline", &o.timeline}}) {
    if (const std::string error = checkOutputPath(option, *path); !error.empty())
      return usage(error);
  }
  if (o.dryRun && !o.wav.empty())
    return usage("--wav has no audio to write with --dry-run");
  if (o.dryRun && !o.html.empty())
    return usage("--html has no performance to draw with --dry-run");
  std::ofstream timelineFile;
  if (!o.timeline.empty()) {
    timelineFile.open(o.timeline);
    if (!timelineFile)
      return usage("--timeline: cannot write " + o.timeline);
  }
  int status = 0;
  // The live timeline is the command's output; the service's log keeps to its warnings
  // unless ZEFOKO_LOG says otherwise.
  if (ko::os::getenv("ZEFOKO_LOG").empty())
    ko::log::setLevels("*=warning");

  try {
    EmbeddedServiceOptions serviceOptions;
    serviceOptions.speech = o.speech;
    serviceOptions.fast = o.fast;
    serviceOptions.language = o.language;
    serviceOptions.posture = o.posture;
    serviceOptions.recordAudio = !o.wav.empty() || !o.html.empty();
    if (!o.html.empty() || !o.timeline.empty())
      serviceOptions.angleSamplesPerSecond = kAngleSamplesPerSecond;
    // Blocked before the robot's threads start, so that they all inherit the mask and the
    // watcher below alone takes the signals.
    const InterruptMask interruptMask;
    EmbeddedService embedded(serviceOptions);
    ZU::ZUMokuto& service = embedded.service();
    robotsim::Robot& robot = embedded.robot();

    try {
      if (!o.mode.empty())
        service.setBodyLanguageModeFromStr(o.mode);
      if (tagsToWords)
        service.addTagsToWords(*tagsToWords);
      if (tagsToAnimations)
        service.declareTagForAnimations(*tagsToAnimations);
      for (const auto& package : o.packages)
        service.declareAnimationsPackage(package);
    } catch (const ZU::ZUError& e) {
      return usage(e.description());
    } catch (const std::exception& e) {
      return usage(e.what());
    }
    if (o.checkTimes)
      service._setCheckExecutionTimes(true);
    const ZU::ZUValue noConfiguration;

    if (o.dryRun) {
      robot.timeline()->clear();
      const auto job = service.prepare(*o.text, configuration ? *configuration : noConfiguration);
      std::cout << dumpJson(preparedJobToJson(*job)) << std::endl;
      if (timelineFile.is_open())
        robot.timeline()->writeJsonLines(timelineFile);
    } else {
      const auto recorder = SayTimeline::create(robot.timeline(), o.quiet ? nullptr : &std::cout);
      service.setDirectorObserver(recorder);
      const bool drawn = serviceOptions.angleSamplesPerSecond > 0;
      embedded.setStageObserver([recorder, drawn, &robot](ZU::ZUMokutoStage stage, ZU::MKID id) {
        if (stage != ZU::ZUMokutoStage::Compiler)
          return;
        recorder->accepted(id);
        // The pose the performance starts from; the samples tell the joints that move.
        if (drawn)
          robot.motion()->recordPose();
      });
      robot.timeline()->clear();
      const std::int64_t originUs = robot.timeline()->now();
      recorder->begin(*o.text);
      bool interrupted = false;
      {
        const InterruptWatcher watcher(interruptMask, [&service] { service._stopAll(false); });
        if (configuration)
          service.say(*o.text, *configuration);
        else
          service.say(*o.text);
        interrupted = watcher.interrupted();
      }
      if (interrupted)
        status = kInterrupted;
      ZU::MKID id = 0;
      const SaySummary summary = recorder->end(&id);
      embedded.setStageObserver(nullptr);
      service.setDirectorObserver(nullptr);
      const std::int64_t endUs = robot.timeline()->now();
      SayTimeline::printSummary(std::cout, id, summary);
      std::ostringstream summaryText;
      SayTimeline::printSummary(summaryText, id, summary);
      writePerformanceFiles({o.wav, o.html}, robot, *recorder, *o.text, summaryText.str(),
                            originUs, endUs, std::cout);
      if (timelineFile.is_open()) {
        recorder->writeJsonLines(timelineFile);
        std::cout << "Timeline written to " << o.timeline << std::endl;
      }
    }
    if (timelineFile.is_open() && !timelineFile.flush()) {
      std::cerr << "mokuto say: cannot write " << o.timeline << std::endl;
      return kFailure;
    }
  } catch (const ServiceError& e) {
    std::cerr << "mokuto say: the service cannot start: " << e.what() << std::endl;
    return kFailure;
  } catch (const ZU::ZUError& e) {
    std::cerr << "mokuto say: " << e.description() << std::endl;
    return kFailure;
  } catch (const std::exception& e) {
    std::cerr << "mokuto say: " << e.what() << std::endl;
    return kFailure;
  }
  return std::cout.good() ? status : kFailure;
}

}  // namespace

void addSayCommand(CLI::App& app, int& status) {
  auto o = std::make_shared<SayOptions>();
  CLI::App* command = app.add_subcommand(
      "say",
      "Speak an annotated text on the simulated robot, with the service in the process: "
      "print the timeline live, then a summary of the actions and of their sync with the "
      "speech");
  command
      ->add_option("--mode", o->mode,
                   "The body language mode, set before the text: disabled, random or "
                   "contextual (default: the service's own)")
      ->check(CLI::IsMember({"disabled", "random", "contextual"}));
  command->add_option("--language", o->language, "The speech language")
      ->check(CLI::IsMember({"English", "French", "Japanese"}))
      ->capture_default_str();
  command->add_option("--posture", o->posture, "The robot's posture family at start")
      ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
  command
      ->add_option("--speech", o->speech,
                   "The speech engine: espeak (real speech) or timing (durations estimated "
                   "from the text, no audio)")
      ->check(CLI::IsMember({"espeak", "timing"}))
      ->capture_default_str();
  command->add_flag("--fast", o->fast, "Play the speech without waiting in real time");
  command
      ->add_option("--config", o->config,
                   "A configuration value form for the two-argument say: "
                   "[[\"bodyLanguageMode\", \"random\"], [\"msPauseBeforeSpeech\", 0], ...]")
      ->type_name("JSON");
  command
      ->add_option("--tags-to-words", o->tagsToWords,
                   "Words bound to tags, given to addTagsToWords before the text: "
                   "[[\"tag\", [\"word\", ...]], ...]")
      ->type_name("JSON");
  command
      ->add_option("--tags-to-animations", o->tagsToAnimations,
                   "Animations bound to tags, given to declareTagForAnimations before the "
                   "text: [[\"tag\", [\"animation\", ...]], ...]")
      ->type_name("JSON");
  command
      ->add_option("--package", o->packages,
                   "An animations package to declare before the text (repeatable)")
      ->type_name("NAME");
  command->add_flag("--check-times", o->checkTimes,
                    "Switch the timing checker on (ZUMokuto/StartOfMK and StopOfMK, and the "
                    "durations in the log category mokuto.times)");
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
                    "JSON, without speaking");
  command->add_flag("--quiet", o->quiet, "Print the summary only, not the live timeline");
  command->add_option("text", o->text,
                      "The annotated text; read from standard input when absent or \"-\"");
  command->footer(
      "Exit status: 0 when the text was spoken (instruction errors included), 2 for an "
      "unusable argument or option, 1 when the service fails, 130 when Ctrl-C (SIGINT) or "
      "SIGTERM stopped the text (its summary and files still come).\nLog lines go to standard "
      "error, warnings and errors only unless ZEFOKO_LOG sets the levels.");
  command->callback([o, &status] { status = say(*o); });
}

}  // namespace mokuto::cli
