#pragma once
// DirectorHost: the module "ZUMokuto" as far as the director needs it, for the director's
// tests and benchmark. It owns a text register, the body talk handle and a director,
// forwards the speech engine's callbacks to the director, stops texts as the service does
// (under the register's mutex), and runs the director's part of the say pipeline.
//
// Callbacks arrive on the memory service's delivery threads and on the speech engine's
// blocking-call threads; say and stop on any test thread.

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "ko_test_helpers.hpp"
#include "mokuto/directortask.h"
#include "mokuto/mkidregister.h"
#include "mokuto/mktaskinstruction.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "zu/zumodule.h"
#include "zu/zuvalue.h"

namespace mokutotest {

// A sync observer that keeps every report; the test waits for them with a bound.
class SyncRecorder : public ZU::DirectorObserver,
                     public ko::test::Recorded<ZU::DirectorActionReport> {
 public:
  void onAction(const ZU::DirectorActionReport& report) override { add(report); }
  std::vector<ZU::DirectorActionReport> reports() const { return all(); }
};

class DirectorHost : public ZU::ZUModule {
 public:
  DirectorHost(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
               ZU::ZURobotBodyTalkOptions bodyTalkOptions = {});
  ~DirectorHost() override;

  // Subscribes the director to its events.
  void init() override;
  // Stops whatever is spoken, unsubscribes the director, then the module's own exit.
  void exit() override;
  // As the service's stop: a running text is marked to stop and the director told.
  void stop(int id) override;

  // ---- bound callbacks ----
  void _speechBookMarkCallback(const std::string& memoryKey, const ZU::ZUValue& value,
                               const std::string& message);
  void _speechStatusCallback(const std::string& memoryKey, const ZU::ZUValue& value,
                             const std::string& message);
  void _mrkpauseCallback(int bookmark);

  // The director's part of a say: a new identifier, the posture family, the timing
  // checker's marks around the director stage, which runs under the director lock unless
  // the text was stopped, and the release. Answers the id.
  ZU::MKID say(const std::shared_ptr<ZU::MKTaskInstruction>& instruction);

  ZU::ZURobotBodyTalk* bodyTalk() const noexcept { return fBodyTalk->bodyTalk; }
  ZU::DirectorTask& director() const noexcept { return *fDirector; }

  ZU::MKIDRegister textRegister;

 private:
  std::unique_ptr<ZU::ZURobotBodyTalkInstance> fBodyTalk;
  std::shared_ptr<ZU::DirectorTask> fDirector;
  std::mutex fDirectorMutex;
  std::mutex fExitMutex;
  bool fExited = false;  // under fExitMutex
};

}  // namespace mokutotest
