#pragma once
// The service as the `mokuto` command uses it: embedded in the process (EmbeddedService: a
// host of the simulated robot with the module "ZUMokuto" made in the process, as its
// library's `_createModule` makes it, ready once the animation index of its packages is
// built, as on a robot whose service has been up for a while), or a running service of
// another process (RemoteService, with `mokuto --connect ENDPOINT`), both behind
// ServiceHandle.
//
// Built, used and destroyed by the command's main thread; the robot's services and the
// module serve their own threads, and the observers are called in those (or, remotely, in
// the session's serving threads).
#include <CLI/CLI.hpp>
#include <functional>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>
#include <vector>

#include "ko/session.hpp"
#include "mokuto/zumokuto.h"
#include "zefoko/host.h"

namespace mokuto::cli {

struct EmbeddedServiceOptions {
  // "espeak" or "timing".
  std::string speech = "espeak";
  // The speech plays without waiting in real time.
  bool fast = false;
  std::string language = "English";
  // "Standing", "Sitting" or "SittingOnChair"; empty keeps the robot's own.
  std::string posture;
  // Whether the speech engine keeps the audio for a WAV file.
  bool recordAudio = false;
  // The robot's faults (robotsim/faults.h); empty for none.
  std::string faults;
  // How often the joint angles go on the timeline while they move; 0 for never.
  double angleSamplesPerSecond = 0;
};

// The robot or the module cannot start, or the index is not built in time.
class ServiceError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Hears each text enter each stage of the pipeline, in the say caller's thread (null:
// nothing); remotely, the compiler and director stages alone, in the session's threads.
using StageObserver = std::function<void(ZU::ZUMokutoStage stage, ZU::MKID id)>;

// A line that the director logged, at warning or error level, as it ran an action.
struct DirectorLine {
  std::string function;
  std::string message;
};

// Hears the director's reports. In the process, they come as onAction, in the say caller's
// thread, where the director's lines can be heard as they are logged; from a service of
// another process, as onRemoteAction, with the lines that its director logged about that
// action there.
class ActionObserver : public ZU::DirectorObserver {
 public:
  virtual void onRemoteAction(const ZU::DirectorActionReport& report,
                              const std::vector<DirectorLine>& lines) = 0;
};

// What the commands use of the service; the methods of the module keep their names.
class ServiceHandle {
 public:
  virtual ~ServiceHandle() = default;
  // The robot's timeline: remotely, a mirror of the robot process's that its entries reach
  // as they are recorded there.
  virtual std::shared_ptr<robotsim::Timeline> timeline() = 0;
  virtual void setStageObserver(StageObserver observer) = 0;
  virtual void setDirectorObserver(std::shared_ptr<ActionObserver> observer) = 0;
  // Once say has returned: waits (with a bound) until the observers and the timeline have
  // everything of the text `id`.
  virtual void settle(ZU::MKID /*id*/) {}
  // What a signal stops of the command's text `id` (0: not taken up yet): in the process,
  // everything the service runs, since the command is its only caller; remotely, that text
  // alone, since other callers share the service.
  virtual void stopText(ZU::MKID id) = 0;
  // The behaviours installed on the robot, as its behaviour manager lists them.
  virtual std::vector<std::string> installedBehaviors() = 0;
  virtual void setBodyLanguageModeFromStr(const std::string& mode) = 0;
  virtual void addTagsToWords(const ZU::ZUValue& tagsToWords) = 0;
  virtual void declareTagForAnimations(const ZU::ZUValue& tagsToAnimations) = 0;
  virtual void declareAnimationsPackage(const std::string& package) = 0;
  virtual void _setCheckExecutionTimes(bool enable) = 0;
  virtual std::shared_ptr<ZU::MKTaskInstruction> prepare(const std::string& text,
                                                         const ZU::ZUValue& configuration) = 0;
  virtual void say(const std::string& text) = 0;
  virtual void say(const std::string& text, const ZU::ZUValue& configuration) = 0;
  virtual void stop(ZU::MKID id) = 0;
  // The robot when it runs in this process, else null: the audio of a performance and the
  // sampled pose stay in the robot's process.
  virtual robotsim::Robot* localRobot() { return nullptr; }
  virtual std::vector<ZU::ZUMethodInfo> getMethodInfos() = 0;
  virtual std::vector<std::string> _getTagList() = 0;
  virtual std::vector<std::string> _getAnimationsByTag(const std::string& tag) = 0;
  virtual std::vector<std::string> diagnosisLines() = 0;
  virtual std::string tagPage() = 0;
};

// The global options of `mokuto --connect ENDPOINT [--server-key F --secret-key F]`, for
// the subcommands named in `services` (the others, which do not use the service, refuse
// them). Call it once the subcommands are added.
void addConnectOptions(CLI::App& app, const std::vector<std::string>& services);
// Whether --connect was given.
bool connected();
// The service: in the process, or the running one at the endpoint given with --connect.
std::unique_ptr<ServiceHandle> openService(const EmbeddedServiceOptions& options);

class EmbeddedService : public ServiceHandle {
 public:
  explicit EmbeddedService(const EmbeddedServiceOptions& options);
  // Has the module exit, then the robot's services.
  ~EmbeddedService() override;
  EmbeddedService(const EmbeddedService&) = delete;
  EmbeddedService& operator=(const EmbeddedService&) = delete;

  robotsim::Robot& robot() { return fHost->robot(); }
  ZU::ZUMokuto& service() { return *fService; }

  void setStageObserver(StageObserver observer) override;
  std::shared_ptr<robotsim::Timeline> timeline() override { return robot().timeline(); }
  void setDirectorObserver(std::shared_ptr<ActionObserver> observer) override {
    fService->setDirectorObserver(std::move(observer));
  }
  // Also lifts the robot's faults, so that the calls that hang answer again.
  void stopText(ZU::MKID id) override;
  std::vector<std::string> installedBehaviors() override;
  void setBodyLanguageModeFromStr(const std::string& mode) override {
    fService->setBodyLanguageModeFromStr(mode);
  }
  void addTagsToWords(const ZU::ZUValue& v) override { fService->addTagsToWords(v); }
  void declareTagForAnimations(const ZU::ZUValue& v) override {
    fService->declareTagForAnimations(v);
  }
  void declareAnimationsPackage(const std::string& p) override {
    fService->declareAnimationsPackage(p);
  }
  void _setCheckExecutionTimes(bool enable) override { fService->_setCheckExecutionTimes(enable); }
  std::shared_ptr<ZU::MKTaskInstruction> prepare(const std::string& text,
                                                 const ZU::ZUValue& configuration) override {
    return fService->prepare(text, configuration);
  }
  void say(const std::string& text) override { fService->say(text); }
  void say(const std::string& text, const ZU::ZUValue& configuration) override {
    fService->say(text, configuration);
  }
  void stop(ZU::MKID id) override { fService->stop(id); }
  robotsim::Robot* localRobot() override { return &robot(); }
  std::vector<ZU::ZUMethodInfo> getMethodInfos() override { return fService->getMethodInfos(); }
  std::vector<std::string> _getTagList() override { return fService->_getTagList(); }
  std::vector<std::string> _getAnimationsByTag(const std::string& tag) override {
    return fService->_getAnimationsByTag(tag);
  }
  std::vector<std::string> diagnosisLines() override { return fService->diagnosisLines(); }
  std::string tagPage() override { return fService->tagPage(); }

 private:
  // Shared with the module's stage hook, which may outlive this object.
  struct StageHook {
    std::mutex mutex;
    StageObserver observer;
  };

  const std::shared_ptr<StageHook> fStageHook = std::make_shared<StageHook>();
  std::unique_ptr<zefoko::Host> fHost;
  std::shared_ptr<ZU::ZUMokuto> fService;
};

// The running service "ZUMokuto" of the processes linked at an endpoint, the robot's
// timeline followed through the robot's service "ZUTimeline", the texts that this handle
// says through the module's "_sayTraced" with a trace of its own, so that of the signals
// "textAccepted", "textSpoken" and "actionReported" (which every subscriber hears) it
// keeps those of its own texts. Raises ServiceError when no process answers there within
// 10 s or the directory has no ZUMokuto.
class RemoteService : public ServiceHandle {
 public:
  RemoteService(const std::string& endpoint, ko::RemoteOptions options);
  ~RemoteService() override;

  std::shared_ptr<robotsim::Timeline> timeline() override { return fTimeline; }
  void setStageObserver(StageObserver observer) override;
  void setDirectorObserver(std::shared_ptr<ActionObserver> observer) override;
  void settle(ZU::MKID id) override;
  void stopText(ZU::MKID id) override;
  std::vector<std::string> installedBehaviors() override;
  void setBodyLanguageModeFromStr(const std::string& mode) override;
  void addTagsToWords(const ZU::ZUValue& v) override;
  void declareTagForAnimations(const ZU::ZUValue& v) override;
  void declareAnimationsPackage(const std::string& p) override;
  void _setCheckExecutionTimes(bool enable) override;
  std::shared_ptr<ZU::MKTaskInstruction> prepare(const std::string& text,
                                                 const ZU::ZUValue& configuration) override;
  void say(const std::string& text) override;
  void say(const std::string& text, const ZU::ZUValue& configuration) override;
  void stop(ZU::MKID id) override;
  std::vector<ZU::ZUMethodInfo> getMethodInfos() override;
  std::vector<std::string> _getTagList() override;
  std::vector<std::string> _getAnimationsByTag(const std::string& tag) override;
  std::vector<std::string> diagnosisLines() override;
  std::string tagPage() override;

 private:
  struct Relay;
  std::shared_ptr<ko::Session> fSession;
  ko::AnyObject fService;
  ko::AnyObject fRobotTimeline;
  std::shared_ptr<robotsim::Timeline> fTimeline = std::make_shared<robotsim::Timeline>();
  std::shared_ptr<Relay> fRelay;
  // Marks this handle's texts in the module's signals; not 0, which marks untraced texts.
  const int fTrace;
};

}  // namespace mokuto::cli
