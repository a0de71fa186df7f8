// The costs of the module layer within one process: a call by name through a proxy, a
// posted call waited for, and the latency of a job on the ko event loop.

#include <benchmark/benchmark.h>

#include <memory>
#include <string>

#include "ko/eventloop.hpp"
#include "ko/session.hpp"
#include "zu/zubroker.h"
#include "zu/zumodule.h"
#include "zu/zuproxy.h"
#include "zu/zuserviceproxies.h"

namespace {

// A service with the cheapest methods worth calling.
class Adder : public ZU::ZUModule {
 public:
  Adder(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name)
      : ZUModule(broker, name) {
    bindMethods("Adder", {{"add", &Adder::add, "Adds two integers."},
                          {"noop", &Adder::noop, "Does nothing."},
                          {"getBreathEnabled", &Adder::getBreathEnabled,
                           "Answers whether a chain breathes."}});
  }
  int add(int a, int b) const { return a + b; }
  void noop() {}
  bool getBreathEnabled(const std::string& chain) const { return chain == "Arms"; }
};

struct Process {
  std::shared_ptr<ko::Session> session = std::make_shared<ko::Session>();
  std::shared_ptr<ZU::ZUBroker> broker = ZU::ZUBroker::create(session);
  std::shared_ptr<Adder> adder = ZU::ZUModule::createModule<Adder>(broker, "ZUMotion");
};

void BM_ProxyCallByName(benchmark::State& state) {
  Process process;
  const ZU::ZUProxy proxy("ZUMotion", process.broker);
  int i = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(proxy.call<int>("add", i, 1));
    ++i;
  }
}
BENCHMARK(BM_ProxyCallByName)->Repetitions(10)->ReportAggregatesOnly(true);

void BM_ServiceProxyCall(benchmark::State& state) {
  Process process;
  const ZU::ZUMotionProxy motion(process.broker);
  for (auto _ : state)
    benchmark::DoNotOptimize(motion.getBreathEnabled("Arms"));
}
BENCHMARK(BM_ServiceProxyCall)->Repetitions(10)->ReportAggregatesOnly(true);

void BM_PostAndWait(benchmark::State& state) {
  Process process;
  const ZU::ZUProxy proxy("ZUMotion", process.broker);
  for (auto _ : state) {
    const int id = proxy.post("noop");
    benchmark::DoNotOptimize(proxy.wait(id, 0));
  }
}
BENCHMARK(BM_PostAndWait)->Repetitions(10)->ReportAggregatesOnly(true)->UseRealTime();

void BM_EventLoopJobLatency(benchmark::State& state) {
  const auto loop = ko::getEventLoop();
  for (auto _ : state)
    benchmark::DoNotOptimize(loop->async([] { return 1; }).value());
}
BENCHMARK(BM_EventLoopJobLatency)->Repetitions(10)->ReportAggregatesOnly(true)->UseRealTime();

}  // namespace
