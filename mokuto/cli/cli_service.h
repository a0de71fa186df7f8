#pragma once
// The service embedded in the `mokuto` command: a host of the simulated robot with the
// module "ZUMokuto" made in the process, as its library's `_createModule` makes it, and
// ready once the animation index of its packages is built (as on a robot whose service
// has been up for a while).
//
// Built, used and destroyed by the command's main thread; the robot's services and the
// module serve their own threads.
#include <functional>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>

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
  // How often the joint angles go on the timeline while they move; 0 for never.
  double angleSamplesPerSecond = 0;
};

// The robot or the module cannot start, or the index is not built in time.
class ServiceError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

class EmbeddedService {
 public:
  explicit EmbeddedService(const EmbeddedServiceOptions& options);
  // Has the module exit, then the robot's services.
  ~EmbeddedService();
  EmbeddedService(const EmbeddedService&) = delete;
  EmbeddedService& operator=(const EmbeddedService&) = delete;

  robotsim::Robot& robot() { return fHost->robot(); }
  ZU::ZUMokuto& service() { return *fService; }

  // Hears each text enter each stage of the pipeline, in the say caller's thread (null:
  // nothing).
  using StageObserver = std::function<void(ZU::ZUMokutoStage stage, ZU::MKID id)>;
  void setStageObserver(StageObserver observer);

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

}  // namespace mokuto::cli
