#pragma once
// ZUMokuto: the speech-animation service. It publishes the bound methods of the module
// "ZUMokuto", keeps the current configuration, and runs each text through the say
// pipeline: compiler, loader and director stages, each under its own lock so that texts
// overlap like a pipeline but never share a stage.
//
// Threads. The module has no thread of its own for texts: a say runs end to end in the
// thread of its caller (a framework thread serving the call, or the task thread of a
// posted call). Stops come on any thread. Memory-event callbacks arrive on the memory
// service's delivery threads, "_mrkpauseCallback" on the thread serving the speech
// engine's blocking call, the "behaviorStopped" relay on the behaviour manager's delivery
// thread; the index build of init runs on the framework's event loop. Construction, init
// and exit run on the thread that loads or removes the module.
//
// Locks, in the order they may be taken: a stage lock (compilerMutex, loaderMutex,
// directorMutex; at most one at a time), then the register's textsMutex. configLock is
// taken alone, except by declareAnimationsPackage and _updateRepresentations, which
// refresh the loader's index under it.

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>
#include <utility>
#include <vector>

#include "ko/future.hpp"
#include "ko/log.hpp"
#include "mokuto/compilertask.h"
#include "mokuto/directortask.h"
#include "mokuto/mkidregister.h"
#include "mokuto/mktaskinstruction.h"
#include "mokuto/mokutoclock.h"
#include "mokuto/mokutoconfig.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace ZU {

class LoaderTask;
class ZUMemoryProxy;

// The stages of the say pipeline, in the order a text goes through them.
enum class ZUMokutoStage { Compiler, Loader, Director };

// What a host may change in the module's making; the defaults are those of the robot.
struct ZUMokutoOptions {
  // For the body talk instance, when this module is the first to make it.
  ZURobotBodyTalkOptions bodyTalk;
  // How long a blocking _stopAll waits for a text to be freed before it gives up.
  std::chrono::microseconds stopAllWait{3'000'000};
  // Waits out the service's time limits, _stopAll's included (null: real time).
  std::shared_ptr<MokutoClock> clock;
  // Called in the say caller's thread as a text enters a stage, under that stage's lock
  // once its stop check has passed, for hosts that trace the pipeline. What it throws
  // fails the text as the stage's own error would.
  std::function<void(ZUMokutoStage stage, MKID id)> onStage;
};

class ZUMokuto : public ZUModule {
 public:
  static constexpr const char* kModuleName = "ZUMokuto";
  static constexpr const char* kEndEvent = "ZUMokuto/EndOfMokuto";
  static constexpr const char* kEmotionEvent = "AsrEmotion";

  // Raises ZUError (ZUMokuto::Constructor) "Module ZUTextToSpeech not found" when the
  // broker finds no speech engine: such a module cannot be built.
  ZUMokuto(const std::shared_ptr<ZUBroker>& broker, const std::string& name,
           ZUMokutoOptions options = {});
  ~ZUMokuto() override;

  void exit() override;
  std::string httpGet() override;
  void init() override;
  // Asks the text `id` to stop; an identifier that is not running is ignored.
  void stop(int id) override;

  // ---- bound methods, in binding order ----
  void say(const std::string& text);
  void say(const std::string& text, const ZUValue& configuration);
  void _reset();
  void _stopAll(bool blocking);
  bool _isRunning();
  void setBodyTalkEnabled(bool enable);
  void setBodyLanguageEnabled(bool enable);
  void setBodyLanguageModeFromStr(const std::string& stringBodyLanguageMode);
  void setBodyLanguageMode(unsigned int bodyLanguageMode);
  std::string getBodyLanguageModeToStr();
  unsigned int getBodyLanguageMode();
  void declareAnimationsPackage(const std::string& animationsPackage);
  void _setMSPauseBeforeSpeech(int pause);
  int _getMSPauseBeforeSpeech();
  bool _isCheckExecutionTimesEnabled();
  void _setCheckExecutionTimes(bool pause);
  void addTagsToWords(const ZUValue& tagsToWords);
  void declareTagForAnimations(const ZUValue& tagsToAnimations);
  void _diagnosis();
  bool isBodyTalkEnabled();
  bool isBodyLanguageEnabled();
  std::vector<std::string> _getTagList();
  std::vector<std::string> _getAnimationsByTag(const std::string& tag);
  void _speechBookMarkCallback(const std::string& memoryKey, const ZUValue& value,
                               const std::string& message);
  void _mrkpauseCallback(int pBookmark);
  void _speechStatusCallback(const std::string& memoryKey, const ZUValue& value,
                             const std::string& message);
  void _postureFamilyChangedCallback(const std::string& memoryKey, const ZUValue& value,
                                     const std::string& message);
  void _updateRepresentations(const std::string& memoryKey, const ZUValue& value,
                              const std::string& message);
  void _dialogMatchedInputCallback(const std::string& memoryKey, const ZUValue& value,
                                   const std::string& message);

  // ---- for the command line (not published) ----
  // The compiler and loader stages only, under their locks, with an identifier of the
  // register that is freed afterwards: the job as the director would get it. Nothing is
  // spoken. The one-argument form uses the current configuration.
  std::shared_ptr<MKTaskInstruction> prepare(const std::string& text);
  std::shared_ptr<MKTaskInstruction> prepare(const std::string& text, const ZUValue& configuration);
  // The director's sync observer (null: none).
  void setDirectorObserver(std::shared_ptr<DirectorObserver> observer);
  // Waits at most `bound` for the index build that init started; true once it has ended
  // (or when none was started).
  bool waitForIndex(std::chrono::milliseconds bound);
  // The diagnosis as _diagnosis logs it, one entry per line.
  std::vector<std::string> diagnosisLines();
  // The tag page, as httpGet.
  std::string tagPage();

 private:
  struct DiagnosisLine {
    ko::log::Level level;
    std::string text;
  };

  // The pipeline of one text; an exception from a stage is logged and passed on after
  // the identifier is freed.
  void xSay(const std::shared_ptr<MKTaskInstruction>& instruction);
  MKID xNewMKID(const std::shared_ptr<MKTaskInstruction>& instruction);
  void xFreeMKID(MKID id);
  // A new job with a copy of the current configuration, overlaid with `configuration`
  // when it is given.
  std::shared_ptr<MKTaskInstruction> xNewInstruction(const std::string& text,
                                                     const ZUValue* configuration);
  std::vector<DiagnosisLine> xDiagnosis();
  void xEnterStage(ZUMokutoStage stage, MKID id) const;
  // The compiler and loader stages of a registered text, each under its stage lock and
  // skipped once the text is stopped.
  void xCompileAndLoad(const std::shared_ptr<MKTaskInstruction>& instruction, MKID id);

  const ZUMokutoOptions fOptions;

  // Members in construction order.
  std::shared_ptr<ZUMemoryProxy> memory;
  MKIDRegister textRegister;
  std::shared_ptr<ZURobotBodyTalkInstance> bodyTalk;
  std::shared_ptr<CompilerTask> compiler;
  std::mutex compilerMutex;
  std::shared_ptr<LoaderTask> loader;
  std::mutex loaderMutex;
  std::shared_ptr<DirectorTask> director;
  std::mutex directorMutex;
  std::shared_mutex configLock;
  MokutoConfig config;

  // The index build started by init, and whether exit has run (both under fLifeMutex).
  std::mutex fLifeMutex;
  std::optional<ko::Future<void>> fIndexBuilt;
  bool fExitDone = false;
};

}  // namespace ZU
