// The entry points of the service's module library: a host loads it and makes the module
// "ZUMokuto" on its broker.
//
// The module made here also publishes what a command in another process needs to show a
// text as the command in the process shows it: the signal "textAccepted" (the text's
// identifier, as it enters the compiler stage), the signal "actionReported" (each action of
// a text as the director dealt with it), the method "_diagnosisLines", and the method
// "_syncReports"(token), which triggers the signal "reportsSynced"(token) after the reports
// already sent (so that a client knows it has them all). They are not in the module's method
// table (getMethodList).
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "ko/reaper.hpp"
#include "ko/signal.hpp"
#include "mokuto/zumokuto.h"
#include "zu/zumoduleentry.h"

namespace {

using ReportSignal = ko::Signal<ko::AnyValue>;

const char* outcomeName(ZU::DirectorActionReport::Outcome outcome) {
  switch (outcome) {
    case ZU::DirectorActionReport::Outcome::Executed:
      return "executed";
    case ZU::DirectorActionReport::Outcome::Skipped:
      return "skipped";
    case ZU::DirectorActionReport::Outcome::Dropped:
      return "dropped";
  }
  return "executed";
}

// The director's reports as signal values.
class ReportRelay : public ZU::DirectorObserver {
 public:
  explicit ReportRelay(std::shared_ptr<ReportSignal> signal) : fSignal(std::move(signal)) {}
  void onAction(const ZU::DirectorActionReport& r) override {
    if (fSignal->subscriberCount() == 0)
      return;
    (*fSignal)(ko::AnyValue::map({
        {"textId", ko::AnyValue(r.textId)},
        {"bookmark", ko::AnyValue(static_cast<std::int64_t>(r.bookmark))},
        {"type", ko::AnyValue(static_cast<int>(r.type))},
        {"outcome", ko::AnyValue(outcomeName(r.outcome))},
        {"bookmarkUs", ko::AnyValue(r.bookmarkUs)},
        {"beginUs", ko::AnyValue(r.beginUs)},
        {"endUs", ko::AnyValue(r.endUs)},
        {"actionType", ko::AnyValue(r.action ? static_cast<int>(r.action->type) : -1)},
        {"actionText", ko::AnyValue(r.action ? r.action->text : std::string())},
    }));
  }

 private:
  std::shared_ptr<ReportSignal> fSignal;
};

}  // namespace

extern "C" int _createModule(const std::shared_ptr<ZU::ZUBroker>& broker) {
  if (!broker)
    ZU_THROW_ERROR(ZU::ZUMokuto::kModuleName, "_createModule", "Broker is invalid");
  ZU::ZUBrokerManager::setInstance(broker->getBrokerManager());
  broker->getBrokerManager()->addBroker(broker);
  auto accepted = std::make_shared<ko::Signal<int>>();
  auto reports = std::make_shared<ReportSignal>();
  ZU::ZUMokutoOptions options;
  options.onStage = [accepted](ZU::ZUMokutoStage stage, ZU::MKID id) {
    if (stage == ZU::ZUMokutoStage::Compiler && accepted->subscriberCount() > 0)
      (*accepted)(id);
  };
  // As ZUModule::createModule, with the members above published before the registration,
  // which gives the directory of linked processes the module's member table.
  const auto module = ko::makeShared<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName,
                                                   std::move(options));
  module->advertiseSignal("textAccepted", accepted);
  module->advertiseSignal("actionReported", reports);
  module->setDirectorObserver(std::make_shared<ReportRelay>(reports));
  module->advertiseMethod(
      "_diagnosisLines",
      [weak = std::weak_ptr<ZU::ZUMokuto>(module)]() {
        const auto held = weak.lock();
        return held ? held->diagnosisLines() : std::vector<std::string>();
      },
      "The diagnosis, one entry per line, as _diagnosis logs it.");
  auto synced = std::make_shared<ko::Signal<int>>();
  module->advertiseSignal("reportsSynced", synced);
  module->advertiseMethod(
      "_syncReports", [synced](int token) { (*synced)(token); },
      "Triggers reportsSynced with the token, after the reports already sent.");
  broker->registerModule(module);
  try {
    module->init();
  } catch (...) {
    broker->unregisterModule(ZU::ZUMokuto::kModuleName);
    throw;
  }
  return 0;
}

extern "C" int _closeModule(const std::shared_ptr<ZU::ZUBroker>& /*broker*/) {
  return 0;
}
