// The entry points of the service's module library: a host loads it and makes the module
// "ZUMokuto" on its broker.
//
// The module made here also publishes what a command in another process needs to show a
// text as the command in the process shows it: the method "_sayTraced"(trace, text,
// configuration), which says the text as say does (say(text) when the configuration is
// none) and marks the signals of that text with `trace`; the signals "textAccepted"(id,
// trace) and "textSpoken"(id, trace), as the text enters the compiler and the director
// stages; the signal "actionReported" (each action of a text as the director dealt with
// it, with the director's warning and error lines about it); the methods "_diagnosisLines"
// and "_tagPage"; and the method "_syncReports"(token), which triggers the signal
// "reportsSynced"(token) after the reports already sent (so that a client knows it has them
// all). A text said otherwise has the trace 0. They are not in the module's method table
// (getMethodList).
//
// Threads: the stage hook, the reports and the director's lines come in the say caller's
// thread; the trace of a traced say and its director's lines are that thread's own.
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "ko/log.hpp"
#include "ko/reaper.hpp"
#include "ko/signal.hpp"
#include "mokuto/zumokuto.h"
#include "zu/zumoduleentry.h"
#include "zu/zuvalueconverter.h"

namespace {

using ReportSignal = ko::Signal<ko::AnyValue>;
using StageSignal = ko::Signal<int, int>;

constexpr const char* kDirectorCategory = "mokuto.director";

// A traced say, in the thread that runs it: its trace, and the director's lines since the
// last report.
struct Trace {
  int id = 0;
  ko::AnyValue::List lines;
};
thread_local Trace* tTrace = nullptr;

// Keeps the director's warning and error lines of a traced say for its next report.
class DirectorLines : public ko::log::Sink {
 public:
  void consume(const ko::log::Record& record) override {
    if (tTrace && record.level <= ko::log::Warning && record.category == kDirectorCategory)
      tTrace->lines.push_back(ko::AnyValue::List{record.function, record.message});
  }
};

// Added while a module of this library lives.
std::mutex gLinesMutex;
std::shared_ptr<DirectorLines> gLines;

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

// What a command reads of an action beyond its type and text.
ko::AnyValue::Map actionDetails(const ZU::MKTaskAction* action) {
  if (const auto* a = dynamic_cast<const ZU::MKAnimationAction*>(action))
    return {{"kind", "animation"}, {"animation", a->animation}, {"tag", a->tag}};
  if (const auto* s = dynamic_cast<const ZU::MKSoundAction*>(action))
    return {{"kind", "sound"}, {"soundSet", s->soundSet}, {"soundName", s->soundName}};
  if (const auto* c = dynamic_cast<const ZU::MKCallAction*>(action))
    return {{"kind", "call"}, {"module", c->module}, {"method", c->method}};
  return {{"kind", ""}};
}

// The director's reports as signal values.
class ReportRelay : public ZU::DirectorObserver {
 public:
  explicit ReportRelay(std::shared_ptr<ReportSignal> signal) : fSignal(std::move(signal)) {}
  void onAction(const ZU::DirectorActionReport& r) override {
    ko::AnyValue::List lines;
    if (tTrace)
      lines = std::exchange(tTrace->lines, {});
    if (fSignal->subscriberCount() == 0)
      return;
    ko::AnyValue::Map report = actionDetails(r.action.get());
    for (auto& entry : ko::AnyValue::Map{
             {"trace", ko::AnyValue(tTrace ? tTrace->id : 0)},
             {"textId", ko::AnyValue(r.textId)},
             {"bookmark", ko::AnyValue(static_cast<std::int64_t>(r.bookmark))},
             {"type", ko::AnyValue(static_cast<int>(r.type))},
             {"outcome", ko::AnyValue(outcomeName(r.outcome))},
             {"bookmarkUs", ko::AnyValue(r.bookmarkUs)},
             {"beginUs", ko::AnyValue(r.beginUs)},
             {"endUs", ko::AnyValue(r.endUs)},
             {"actionType", ko::AnyValue(r.action ? static_cast<int>(r.action->type) : -1)},
             {"actionText", ko::AnyValue(r.action ? r.action->text : std::string())},
             {"directorLines", ko::AnyValue::list(std::move(lines))}})
      report.push_back(std::move(entry));
    (*fSignal)(ko::AnyValue::map(std::move(report)));
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
  {
    std::lock_guard lock(gLinesMutex);
    if (!gLines) {
      gLines = std::make_shared<DirectorLines>();
      ko::log::addSink(gLines);
    }
  }
  auto accepted = std::make_shared<StageSignal>();
  auto spoken = std::make_shared<StageSignal>();
  auto reports = std::make_shared<ReportSignal>();
  ZU::ZUMokutoOptions options;
  options.onStage = [accepted, spoken](ZU::ZUMokutoStage stage, ZU::MKID id) {
    const int trace = tTrace ? tTrace->id : 0;
    if (stage == ZU::ZUMokutoStage::Compiler) {
      if (tTrace)
        tTrace->lines.clear();
      if (accepted->subscriberCount() > 0)
        (*accepted)(id, trace);
    } else if (stage == ZU::ZUMokutoStage::Director && spoken->subscriberCount() > 0) {
      (*spoken)(id, trace);
    }
  };
  // As ZUModule::createModule, with the members above published before the registration,
  // which gives the directory of linked processes the module's member table.
  const auto module =
      ko::makeShared<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName, std::move(options));
  module->advertiseSignal("textAccepted", accepted);
  module->advertiseSignal("textSpoken", spoken);
  module->advertiseSignal("actionReported", reports);
  module->setDirectorObserver(std::make_shared<ReportRelay>(reports));
  const std::weak_ptr<ZU::ZUMokuto> weak = module;
  module->advertiseMethod(
      "_sayTraced",
      [weak](int trace, const std::string& text, const ko::AnyValue& configuration) {
        const auto held = weak.lock();
        if (!held)
          ZU_THROW_ERROR(ZU::ZUMokuto::kModuleName, "_sayTraced", "The module has exited");
        Trace mine{trace, {}};
        tTrace = &mine;
        const std::shared_ptr<void> reset(nullptr, [](void*) { tTrace = nullptr; });
        if (configuration.isNone() || configuration.isVoid())
          held->say(text);
        else
          held->say(text, ZU::fromAnyReference(configuration));
      },
      "Says the text as say does, its signals marked with the trace.");
  module->advertiseMethod(
      "_diagnosisLines",
      [weak]() {
        const auto held = weak.lock();
        return held ? held->diagnosisLines() : std::vector<std::string>();
      },
      "The diagnosis, one entry per line, as _diagnosis logs it.");
  module->advertiseMethod(
      "_tagPage",
      [weak]() {
        const auto held = weak.lock();
        return held ? held->tagPage() : std::string();
      },
      "The tag page, as httpGet answers it.");
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
  std::lock_guard lock(gLinesMutex);
  if (gLines) {
    ko::log::removeSink(gLines);
    gLines.reset();
  }
  return 0;
}
