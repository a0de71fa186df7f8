#include "cli_service.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <exception>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "zu/zubroker.h"
#include "ko/genericobject.hpp"
#include "ko/remote.hpp"
#include "zu/zuerror.h"
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
  if (options.speech == "timing")
    host.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (options.fast)
    host.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  host.postureFamily = options.posture;
  try {
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

void EmbeddedService::setStageObserver(StageObserver observer) {
  std::lock_guard lock(fStageHook->mutex);
  fStageHook->observer = std::move(observer);
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

}  // namespace

void addConnectOptions(CLI::App& app) {
  ConnectOptions& o = connectOptions();
  app.add_option("--connect", o.endpoint,
                 "Use the running service of the processes linked at this endpoint (zefoko "
                 "serve --listen) instead of one in this process")
      ->type_name("ENDPOINT");
  app.add_option("--server-key", o.serverKey,
                 "With --connect through the network: the listening process's public key file")
      ->check(CLI::ExistingFile);
  app.add_option("--secret-key", o.secretKey,
                 "With --connect through the network: this process's secret key file")
      ->check(CLI::ExistingFile);
}

std::string remoteRefusal(const EmbeddedServiceOptions& options, bool dryRun, bool wav) {
  if (connectOptions().endpoint.empty())
    return {};
  const EmbeddedServiceOptions defaults;
  if (options.speech != defaults.speech || options.fast || options.language != defaults.language ||
      !options.posture.empty())
    return "--speech, --fast, --language and --posture belong to the robot's process with "
           "--connect (zefoko serve --listen)";
  if (dryRun)
    return "--dry-run needs the service in this process (without --connect)";
  if (wav)
    return "--wav needs the robot in this process (without --connect)";
  return {};
}

std::unique_ptr<ServiceHandle> openService(const EmbeddedServiceOptions& options) {
  const ConnectOptions& c = connectOptions();
  if (c.endpoint.empty())
    return std::make_unique<EmbeddedService>(options);
  ko::RemoteOptions remote;
  remote.processName = "mokuto (pid " + std::to_string(::getpid()) + ")";
  try {
    if (!c.secretKey.empty())
      remote.curve.secretKey = ko::remote::readKeyFile(c.secretKey);
    if (!c.serverKey.empty())
      remote.curve.serverKey = ko::remote::readKeyFile(c.serverKey);
  } catch (const ko::Error& e) {
    throw ServiceError(e.what());
  }
  return std::make_unique<RemoteService>(c.endpoint, std::move(remote));
}

// The observers, shared with the subscribers (which may run after the handle is gone).
struct RemoteService::Relay {
  std::mutex mutex;
  std::condition_variable changed;
  StageObserver stage;
  std::shared_ptr<ZU::DirectorObserver> director;
  int synced = 0;
  std::vector<ZU::MKID> ended;
};

RemoteService::RemoteService(const std::string& endpoint, ko::RemoteOptions options)
    : fSession(std::make_shared<ko::Session>()), fRelay(std::make_shared<Relay>()) {
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
          "entryRecorded",
          [timeline = fTimeline, relay = fRelay](std::int64_t us, std::string service,
                                                 std::string operation, ko::AnyValue arguments,
                                                 ko::AnyValue result) {
            const bool end = service == "ZUMemory" && operation == "raiseEvent" &&
                             arguments.kind() == ko::Kind::List &&
                             arguments.asList().size() == 2 &&
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
    fService->connect("textAccepted", [relay = fRelay](int id) {
      StageObserver observer;
      {
        std::lock_guard lock(relay->mutex);
        observer = relay->stage;
      }
      if (observer)
        observer(ZU::ZUMokutoStage::Compiler, id);
    });
    fService->connect("actionReported", [relay = fRelay](ko::AnyValue value) {
      std::shared_ptr<ZU::DirectorObserver> observer;
      {
        std::lock_guard lock(relay->mutex);
        observer = relay->director;
      }
      if (!observer || value.kind() != ko::Kind::Map)
        return;
      ZU::DirectorActionReport r;
      r.textId = field(value, "textId").to<int>();
      r.bookmark = field(value, "bookmark").to<std::uint32_t>();
      r.type = static_cast<ZU::MKTaskActionType>(field(value, "type").to<int>());
      r.outcome = outcomeOf(field(value, "outcome").to<std::string>());
      r.bookmarkUs = field(value, "bookmarkUs").to<std::int64_t>();
      r.beginUs = field(value, "beginUs").to<std::int64_t>();
      r.endUs = field(value, "endUs").to<std::int64_t>();
      const int actionType = field(value, "actionType").to<int>();
      if (actionType >= 0) {
        auto action =
            std::make_shared<ZU::MKTaskAction>(static_cast<ZU::MKTaskActionType>(actionType));
        action->text = field(value, "actionText").to<std::string>();
        r.action = std::move(action);
      }
      observer->onAction(r);
    });
    fService->connect("reportsSynced", [relay = fRelay](int token) {
      std::lock_guard lock(relay->mutex);
      relay->synced = std::max(relay->synced, token);
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

void RemoteService::setDirectorObserver(std::shared_ptr<ZU::DirectorObserver> observer) {
  std::lock_guard lock(fRelay->mutex);
  fRelay->director = std::move(observer);
}

void RemoteService::settle(ZU::MKID id) {
  // The reports sent before say returned come before the answer to this call, and the
  // robot recorded the end event before say returned: both are here or on their way.
  static int token = 0;
  const int mine = ++token;
  try {
    fService->call<void>("_syncReports", mine);
  } catch (const std::exception& e) {
    KO_LOG_WARNING("mokuto.cli") << "Cannot wait for the last reports: " << e.what();
    return;
  }
  std::unique_lock lock(fRelay->mutex);
  fRelay->changed.wait_for(lock, kRemoteBound, [&] {
    return fRelay->synced >= mine &&
           (!fRobotTimeline || std::find(fRelay->ended.begin(), fRelay->ended.end(), id) !=
                                   fRelay->ended.end());
  });
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
  fService->call<void>("say", text);
}
void RemoteService::say(const std::string& text, const ZU::ZUValue& configuration) {
  fService->call<void>("say", text, ZU::toAnyReference(configuration));
}
void RemoteService::_stopAll(bool blocking) {
  fService->call<void>("_stopAll", blocking);
}
void RemoteService::saveRecording(const std::string&) {
  throw ServiceError("the audio stays in the robot's process");
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
  throw ServiceError("the tag page needs the service in this process (without --connect)");
}

}  // namespace mokuto::cli
