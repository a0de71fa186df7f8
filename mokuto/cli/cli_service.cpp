#include "cli_service.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <condition_variable>
#include <exception>
#include <random>
#include <set>
#include <tuple>

#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/remote.hpp"
#include "zu/zubroker.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zu/zuvalueconverter.h"

namespace mokuto::cli {

namespace {

// Generous: the starter library is indexed in milliseconds, a large one in seconds.
constexpr std::chrono::milliseconds kIndexBound{60'000};

}  // namespace

EmbeddedService::EmbeddedService(const EmbeddedServiceOptions& options) {
  // As in the service's host: the allocator keeps the memory it frees.
  ko::os::keepFreedMemory();
  zefoko::HostOptions host;
  host.robot.speech.language = options.language;
  host.robot.speech.recordAudio = options.recordAudio;
  host.robot.angleSamplesPerSecond = options.angleSamplesPerSecond;
  if (options.speech == "timing")
    host.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (options.fast)
    host.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  host.postureFamily = options.posture;
  try {
    if (!options.faults.empty())
      host.robot.faults = std::make_shared<robotsim::FaultPlan>(options.faults);
    fHost = std::make_unique<zefoko::Host>(std::move(host));
    // As the module library's _createModule does, with the stage hook.
    const auto& broker = fHost->broker();
    ZU::ZUBrokerManager::setInstance(broker->getBrokerManager());
    broker->getBrokerManager()->addBroker(broker);
    ZU::ZUMokutoOptions moduleOptions;
    moduleOptions.onStage = [hook = fStageHook](ZU::ZUMokutoStage stage, ZU::MKID id) {
      StageObserver observer;
      {
        std::lock_guard lock(hook->mutex);
        observer = hook->observer;
      }
      if (observer)
        observer(stage, id);
    };
    fService = ZU::ZUModule::createModule<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName,
                                                        std::move(moduleOptions));
  } catch (const ZU::ZUError& e) {
    throw ServiceError(e.description());
  } catch (const std::exception& e) {
    throw ServiceError(e.what());
  }
  if (!fService)
    throw ServiceError("the module ZUMokuto was not registered");
  if (!fService->waitForIndex(kIndexBound))
    throw ServiceError("the animation index was not built within 60 s");
}

std::vector<std::string> EmbeddedService::installedBehaviors() {
  return ZU::ZUBehaviorManagerProxy(robot().broker()).getInstalledBehaviors();
}

void EmbeddedService::setStageObserver(StageObserver observer) {
  std::lock_guard lock(fStageHook->mutex);
  fStageHook->observer = std::move(observer);
}

void EmbeddedService::stopText(ZU::MKID /*id*/) {
  fService->_stopAll(false);
  if (robot().faults())
    robot().faults()->lift();
}

EmbeddedService::~EmbeddedService() {
  if (fService) {
    try {
      fService->exit();
    } catch (const std::exception& e) {
      KO_LOG_ERROR("mokuto.cli") << "ZUMokuto failed to exit: " << e.what();
    }
    fService.reset();
  }
  if (fHost)
    fHost->shutdown();
}

}  // namespace mokuto::cli

// ---- the service of another process --------------------------------------------------

namespace mokuto::cli {

namespace {

struct ConnectOptions {
  std::string endpoint;
  std::string serverKey;
  std::string secretKey;
  // Read from the files once the options are parsed.
  ko::CurveKeys keys;
};

ConnectOptions& connectOptions() {
  static ConnectOptions options;
  return options;
}

constexpr std::chrono::seconds kRemoteBound{10};
constexpr const char* kEndEvent = "ZUMokuto/EndOfMokuto";

ZU::DirectorActionReport::Outcome outcomeOf(const std::string& name) {
  if (name == "skipped")
    return ZU::DirectorActionReport::Outcome::Skipped;
  if (name == "dropped")
    return ZU::DirectorActionReport::Outcome::Dropped;
  return ZU::DirectorActionReport::Outcome::Executed;
}

ko::AnyValue field(const ko::AnyValue& map, const std::string& key) {
  for (const auto& [k, v] : map.asMap())
    if (k.kind() == ko::Kind::String && k.asString() == key)
      return v;
  return ko::AnyValue();
}

std::string textField(const ko::AnyValue& map, const std::string& key) {
  const ko::AnyValue value = field(map, key);
  return value.kind() == ko::Kind::String ? value.asString() : std::string();
}

// The action of an "actionReported" value, of the class the loader made, with what the
// commands read of it.
std::shared_ptr<ZU::MKTaskAction> actionOf(const ko::AnyValue& value) {
  const int type = field(value, "actionType").to<int>();
  if (type < 0)
    return nullptr;
  const auto actionType = static_cast<ZU::MKTaskActionType>(type);
  const std::string kind = textField(value, "kind");
  std::shared_ptr<ZU::MKTaskAction> action;
  if (kind == "animation") {
    auto animation = std::make_shared<ZU::MKAnimationAction>(actionType);
    animation->animation = textField(value, "animation");
    animation->tag = textField(value, "tag");
    action = animation;
  } else if (kind == "sound") {
    auto sound = std::make_shared<ZU::MKSoundAction>(actionType);
    sound->soundSet = textField(value, "soundSet");
    sound->soundName = textField(value, "soundName");
    action = sound;
  } else if (kind == "call") {
    auto call = std::make_shared<ZU::MKCallAction>(actionType);
    call->module = textField(value, "module");
    call->method = textField(value, "method");
    action = call;
  } else {
    action = std::make_shared<ZU::MKTaskAction>(actionType);
  }
  action->text = textField(value, "actionText");
  return action;
}

std::vector<DirectorLine> linesOf(const ko::AnyValue& value) {
  std::vector<DirectorLine> lines;
  const ko::AnyValue list = field(value, "directorLines");
  if (list.kind() != ko::Kind::List)
    return lines;
  for (const auto& line : list.asList()) {
    if (line.kind() == ko::Kind::List && line.asList().size() == 2 &&
        line.asList()[0].kind() == ko::Kind::String && line.asList()[1].kind() == ko::Kind::String)
      lines.push_back({line.asList()[0].asString(), line.asList()[1].asString()});
  }
  return lines;
}

int newTrace() {
  std::random_device device;
  return std::uniform_int_distribution<int>(1, INT_MAX)(device);
}

}  // namespace

void addConnectOptions(CLI::App& app, const std::vector<std::string>& services) {
  ConnectOptions& o = connectOptions();
  std::string names;
  for (const auto& name : services)
    names += (names.empty() ? "" : ", ") + name;
  CLI::Option* connect =
      app.add_option("--connect", o.endpoint,
                     "Use the running service of the processes linked at this endpoint (zefoko "
                     "serve --listen) instead of one in this process, for " +
                         names + " (default: none, the service in this process)")
          ->type_name("ENDPOINT");
  for (auto [name, file, whose] :
       {std::tuple{"--server-key", &o.serverKey, "the listening process's public key file"},
        std::tuple{"--secret-key", &o.secretKey, "this process's secret key file"}}) {
    app.add_option(name, *file,
                   std::string("With --connect through the network: ") + whose + " (default: none)")
        ->check(CLI::ExistingFile)
        ->type_name("PATH")
        ->needs(connect);
  }
  // Before the subcommand runs: one that does not use the service takes no --connect, and
  // the network needs keys.
  app.parse_complete_callback([&app, &o, connect, services] {
    if (connect->count() == 0)
      return;
    for (const CLI::App* command : app.get_subcommands()) {
      if (std::find(services.begin(), services.end(), command->get_name()) == services.end())
        throw CLI::ValidationError(
            "--connect", "mokuto " + command->get_name() + " does not use the running service");
    }
    try {
      if (!o.secretKey.empty())
        o.keys.secretKey = ko::remote::readKeyFile(o.secretKey);
      if (!o.serverKey.empty())
        o.keys.serverKey = ko::remote::readKeyFile(o.serverKey);
    } catch (const ko::Error& e) {
      throw CLI::ValidationError("--connect", e.what());
    }
    if (const std::string missing = ko::remote::missingKeys(o.endpoint, false, o.keys);
        !missing.empty())
      throw CLI::ValidationError("--connect", missing);
  });
}

bool connected() {
  return !connectOptions().endpoint.empty();
}

std::unique_ptr<ServiceHandle> openService(const EmbeddedServiceOptions& options) {
  const ConnectOptions& c = connectOptions();
  if (c.endpoint.empty())
    return std::make_unique<EmbeddedService>(options);
  ko::RemoteOptions remote;
  remote.processName = "mokuto (pid " + std::to_string(::getpid()) + ")";
  remote.curve = c.keys;
  return std::make_unique<RemoteService>(c.endpoint, std::move(remote));
}

// The observers, shared with the subscribers (which may run after the handle is gone).
struct RemoteService::Relay {
  std::mutex mutex;
  std::condition_variable changed;
  StageObserver stage;
  std::shared_ptr<ActionObserver> director;
  std::set<int> synced;
  std::vector<ZU::MKID> ended;

  void enter(ZU::ZUMokutoStage stageEntered, int id) {
    StageObserver observer;
    {
      std::lock_guard lock(mutex);
      observer = stage;
    }
    if (observer)
      observer(stageEntered, id);
  }
};

RemoteService::RemoteService(const std::string& endpoint, ko::RemoteOptions options)
    : fSession(std::make_shared<ko::Session>()),
      fRelay(std::make_shared<Relay>()),
      fTrace(newTrace()) {
  try {
    fSession->connect(endpoint, std::move(options));
    if (!fSession->waitForLink(kRemoteBound))
      throw ServiceError("no process answers at " + endpoint + " within 10 s (is zefoko serve " +
                         "--listen running there?)");
    const auto found = fSession->service(ZU::ZUMokuto::kModuleName);
    if (found.wait(static_cast<int>(std::chrono::milliseconds(kRemoteBound).count())) !=
        ko::FutureState::FinishedWithValue)
      throw ServiceError("the service ZUMokuto is not among the services at " + endpoint + ": " +
                         found.error(ko::FutureTimeout_None));
    fService = found.value();
    // The robot's timeline, as the robot records it.
    if (const auto robot = fSession->service("ZUTimeline"); robot.hasValue(10000)) {
      fRobotTimeline = robot.value();
      fRobotTimeline->connect(
          "entryRecorded", [timeline = fTimeline, relay = fRelay](
                               std::int64_t us, std::string service, std::string operation,
                               ko::AnyValue arguments, ko::AnyValue result) {
            const bool end = service == "ZUMemory" && operation == "raiseEvent" &&
                             arguments.kind() == ko::Kind::List && arguments.asList().size() == 2 &&
                             arguments.asList()[0].kind() == ko::Kind::String &&
                             arguments.asList()[0].asString() == kEndEvent;
            const ko::AnyValue id = end ? arguments.asList()[1] : ko::AnyValue();
            timeline->recordAt(us - timeline->originUs(), std::move(service), std::move(operation),
                               std::move(arguments), std::move(result));
            if (end && id.kind() == ko::Kind::Int) {
              std::lock_guard lock(relay->mutex);
              relay->ended.push_back(static_cast<ZU::MKID>(id.asInt().value));
              relay->changed.notify_all();
            }
          });
    }
    for (const auto& [signal, stage] : {std::pair{"textAccepted", ZU::ZUMokutoStage::Compiler},
                                        std::pair{"textSpoken", ZU::ZUMokutoStage::Director}}) {
      fService->connect(signal, [relay = fRelay, mine = fTrace, stage = stage](int id, int trace) {
        if (trace == mine)
          relay->enter(stage, id);
      });
    }
    fService->connect("actionReported", [relay = fRelay, mine = fTrace](ko::AnyValue value) {
      if (value.kind() != ko::Kind::Map || field(value, "trace").to<int>() != mine)
        return;
      std::shared_ptr<ActionObserver> observer;
      {
        std::lock_guard lock(relay->mutex);
        observer = relay->director;
      }
      if (!observer)
        return;
      ZU::DirectorActionReport r;
      r.textId = field(value, "textId").to<int>();
      r.bookmark = field(value, "bookmark").to<std::uint32_t>();
      r.type = static_cast<ZU::MKTaskActionType>(field(value, "type").to<int>());
      r.outcome = outcomeOf(textField(value, "outcome"));
      r.bookmarkUs = field(value, "bookmarkUs").to<std::int64_t>();
      r.beginUs = field(value, "beginUs").to<std::int64_t>();
      r.endUs = field(value, "endUs").to<std::int64_t>();
      r.action = actionOf(value);
      observer->onRemoteAction(r, linesOf(value));
    });
    fService->connect("reportsSynced", [relay = fRelay](int token) {
      std::lock_guard lock(relay->mutex);
      relay->synced.insert(token);
      relay->changed.notify_all();
    });
  } catch (const ServiceError&) {
    throw;
  } catch (const std::exception& e) {
    throw ServiceError(e.what());
  }
}

RemoteService::~RemoteService() {
  fSession->closeLink();
}

void RemoteService::setStageObserver(StageObserver observer) {
  std::lock_guard lock(fRelay->mutex);
  fRelay->stage = std::move(observer);
}

void RemoteService::setDirectorObserver(std::shared_ptr<ActionObserver> observer) {
  std::lock_guard lock(fRelay->mutex);
  fRelay->director = std::move(observer);
}

void RemoteService::settle(ZU::MKID id) {
  // The reports sent before say returned come before the answer to this call, and the
  // robot recorded the end event before say returned: both are here or on their way.
  try {
    fService->call<void>("_syncReports", fTrace);
  } catch (const std::exception& e) {
    KO_LOG_WARNING("mokuto.cli") << "Cannot wait for the last reports: " << e.what();
    return;
  }
  std::unique_lock lock(fRelay->mutex);
  fRelay->changed.wait_for(lock, kRemoteBound, [&] {
    return fRelay->synced.count(fTrace) > 0 &&
           (!fRobotTimeline || id == 0 ||
            std::find(fRelay->ended.begin(), fRelay->ended.end(), id) != fRelay->ended.end());
  });
}

void RemoteService::stopText(ZU::MKID id) {
  // Before the service took the text up, the stage observer stops it as it enters.
  if (id != 0)
    stop(id);
}

std::vector<std::string> RemoteService::installedBehaviors() {
  const auto found = fSession->service("ZUBehaviorManager");
  if (!found.hasValue(static_cast<int>(std::chrono::milliseconds(kRemoteBound).count())))
    throw ServiceError("the robot's service ZUBehaviorManager is not among the services");
  return found.value()->call<std::vector<std::string>>("getInstalledBehaviors");
}

void RemoteService::setBodyLanguageModeFromStr(const std::string& mode) {
  fService->call<void>("setBodyLanguageModeFromStr", mode);
}
void RemoteService::addTagsToWords(const ZU::ZUValue& v) {
  fService->call<void>("addTagsToWords", ZU::toAnyReference(v));
}
void RemoteService::declareTagForAnimations(const ZU::ZUValue& v) {
  fService->call<void>("declareTagForAnimations", ZU::toAnyReference(v));
}
void RemoteService::declareAnimationsPackage(const std::string& p) {
  fService->call<void>("declareAnimationsPackage", p);
}
void RemoteService::_setCheckExecutionTimes(bool enable) {
  fService->call<void>("_setCheckExecutionTimes", enable);
}
std::shared_ptr<ZU::MKTaskInstruction> RemoteService::prepare(const std::string&,
                                                              const ZU::ZUValue&) {
  throw ServiceError("the prepared job stays in the service's process");
}
void RemoteService::say(const std::string& text) {
  fService->call<void>("_sayTraced", fTrace, text, ko::AnyValue::none());
}
void RemoteService::say(const std::string& text, const ZU::ZUValue& configuration) {
  fService->call<void>("_sayTraced", fTrace, text, ZU::toAnyReference(configuration));
}
void RemoteService::stop(ZU::MKID id) {
  fService->call<void>("stop", static_cast<int>(id));
}

std::vector<ZU::ZUMethodInfo> RemoteService::getMethodInfos() {
  // The bound methods are those of the method table, in binding order (the ids' order).
  std::vector<std::string> names = fService->call<std::vector<std::string>>("getMethodList");
  std::vector<ZU::ZUMethodInfo> out;
  const ko::MetaObject meta = fService->metaObject();
  for (const auto& m : meta.methods()) {
    const auto it = std::find(names.begin(), names.end(), m.name);
    if (it == names.end())
      continue;
    names.erase(it);
    ZU::ZUMethodInfo info;
    info.id = m.id;
    info.name = m.name;
    info.description = m.description;
    for (const auto& p : m.parameters)
      info.parameters.push_back({p.name, p.description});
    if (!m.returnValue.name.empty())
      info.returnValue = ZU::ZUMethodParameter{m.returnValue.name, m.returnValue.description};
    info.parametersSignature = m.parametersSignature;
    info.returnSignature = m.returnSignature;
    out.push_back(std::move(info));
  }
  return out;
}

std::vector<std::string> RemoteService::_getTagList() {
  return fService->call<std::vector<std::string>>("_getTagList");
}
std::vector<std::string> RemoteService::_getAnimationsByTag(const std::string& tag) {
  return fService->call<std::vector<std::string>>("_getAnimationsByTag", tag);
}
std::vector<std::string> RemoteService::diagnosisLines() {
  return fService->call<std::vector<std::string>>("_diagnosisLines");
}
std::string RemoteService::tagPage() {
  return fService->call<std::string>("_tagPage");
}

}  // namespace mokuto::cli
