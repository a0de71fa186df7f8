// The links between processes.
//   BM_RemoteCallRoundTrip/<bytes>: a call of a service of another session (linked over TCP on
//     the loopback, both in this process), a string of that size there and back; beside it
//   BM_RawZmqRoundTrip/<bytes>: a ZeroMQ REQ/REP round trip of the same payload on the same
//     transport, the floor of any call over ZeroMQ (target: the call at most twice it).
//   BM_PostedCallThroughput: calls started without waiting for their answers (1000 in
//     flight), answers awaited by batch: calls per second.
//   BM_SyncAcrossProcesses: the robot (zefoko serve --listen, espeak-ng in real time) in a
//     child process, the service in this one: from a bookmark's audio time (the speech
//     engine's event) to the startBehavior of its gesture at the behaviour manager, both on
//     the robot's timeline; p50, p99 and max as counters (target: p99 at most 1 ms on a
//     quiet machine). 14 texts of 39 gestures, one after each word, spoken at 400 words a
//     minute (about 45 s). Per hop, p50 and p99: deliver (the raise -> the director in this
//     process has the bookmark: the robot's memory delivery, both links' threads, the
//     callback), takeUp (-> the director's thread takes the action up), call (-> the
//     startBehavior entry on the robot: the call over the link and the manager's start).
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>
#include <zmq.hpp>

#include "ko/dynamicobject.hpp"
#include "ko/genericobject.hpp"
#include "ko/log.hpp"
#include "ko/session.hpp"
#include "ko_test_helpers.hpp"
#include "ko_test_process.hpp"
#include "zefoko/host.h"

namespace {

using namespace std::chrono_literals;

struct Link {
  Link() {
    ko::log::setLevels("ko.*=warning");
    builder.advertiseMethod("echo", [](const std::string& s) { return s; });
    const std::string at = hub->listen("tcp://127.0.0.1:*");
    hub->registerService("Echo", builder.object());
    peer->connect(at);
    peer->waitForLink(10s);
    echo = peer->service("Echo").value(10000);
  }
  ~Link() {
    echo.reset();
    peer->closeLink();
    hub->closeLink();
  }
  ko::DynamicObjectBuilder builder;
  std::shared_ptr<ko::Session> hub = std::make_shared<ko::Session>();
  std::shared_ptr<ko::Session> peer = std::make_shared<ko::Session>();
  ko::AnyObject echo;
};

void BM_RemoteCallRoundTrip(benchmark::State& state) {
  Link link;
  const std::string payload(static_cast<std::size_t>(state.range(0)), 'x');
  for (auto _ : state)
    benchmark::DoNotOptimize(link.echo->call<std::string>("echo", payload));
  state.SetBytesProcessed(2 * state.iterations() * state.range(0));
}
BENCHMARK(BM_RemoteCallRoundTrip)->Arg(16)->Arg(1024)->Arg(65536)->Unit(benchmark::kMicrosecond);

void BM_RawZmqRoundTrip(benchmark::State& state) {
  zmq::context_t context;
  zmq::socket_t rep(context, zmq::socket_type::rep);
  rep.bind("tcp://127.0.0.1:*");
  const std::string at = rep.get(zmq::sockopt::last_endpoint);
  std::thread server([&rep] {
    for (;;) {
      zmq::message_t m;
      if (!rep.recv(m) || m.size() == 0)
        break;
      rep.send(m, zmq::send_flags::none);
    }
    rep.send(zmq::message_t(), zmq::send_flags::none);
  });
  zmq::socket_t req(context, zmq::socket_type::req);
  req.connect(at);
  const std::string payload(static_cast<std::size_t>(state.range(0)), 'x');
  for (auto _ : state) {
    req.send(zmq::buffer(payload), zmq::send_flags::none);
    zmq::message_t back;
    benchmark::DoNotOptimize(req.recv(back));
  }
  req.send(zmq::message_t(), zmq::send_flags::none);
  zmq::message_t last;
  (void)req.recv(last);
  server.join();
  state.SetBytesProcessed(2 * state.iterations() * state.range(0));
}
BENCHMARK(BM_RawZmqRoundTrip)->Arg(16)->Arg(1024)->Arg(65536)->Unit(benchmark::kMicrosecond);

void BM_PostedCallThroughput(benchmark::State& state) {
  Link link;
  constexpr int kInFlight = 1000;
  std::vector<ko::Future<std::string>> answers;
  answers.reserve(kInFlight);
  for (auto _ : state) {
    answers.clear();
    for (int k = 0; k < kInFlight; ++k)
      answers.push_back(link.echo->async<std::string>("echo", std::string("ping")));
    for (auto& a : answers)
      benchmark::DoNotOptimize(a.value());
  }
  state.SetItemsProcessed(state.iterations() * kInFlight);
}
BENCHMARK(BM_PostedCallThroughput)->Unit(benchmark::kMillisecond)->MinTime(2.0);

std::int64_t percentile(std::vector<std::int64_t> v, double p) {
  std::sort(v.begin(), v.end());
  const auto k = static_cast<std::size_t>(p * static_cast<double>(v.size() - 1) + 0.5);
  return v[std::min(k, v.size() - 1)];
}

void BM_SyncAcrossProcesses(benchmark::State& state) {
  const std::string endpoint = "ipc:///tmp/bench-remote-" + std::to_string(::getpid());
  ko::test::ChildProcess robot({ZEFOKO_EXECUTABLE, "serve", "--listen", endpoint});
  if (!robot.waitForLine("zefoko serve: serving")) {
    state.SkipWithError("the robot's process did not start");
    return;
  }
  zefoko::HostOptions options;
  options.connect = endpoint;
  zefoko::Host host(options);
  host.session()->waitForLink(10s);
  host.loadModuleLibrary(MOKUTO_MODULE);
  const auto mokuto = host.session()->service("ZUMokuto", "local").value();
  mokuto->call<void>("setBodyLanguageModeFromStr", std::string("random"));
  host.session()
      ->service("ZUTextToSpeech")
      .value(10000)
      ->call<void>("setParameter", std::string("speed"), 400.0F);

  // A gesture of its own after each word: bookmark k + 1 starts kGestures[k].
  const char* const kGestures[] = {
      "All_1",   "Big_1",   "Bye_1",   "Come_1",   "Explain_1", "Far_1",   "Five_1",  "Four_1",
      "Great_1", "Happy_1", "Hello_1", "Here_1",   "Hey_1",     "Hey_2",   "Look_1",  "Love_1",
      "Many_1",  "Maybe_1", "Me_1",    "Me_2",     "No_1",      "No_2",    "Pick_1",  "Pick_2",
      "Small_1", "Sorry_1", "Stop_1",  "Thanks_1", "They_1",    "Think_1", "Three_1", "Together_1",
      "Two_1",   "We_1",    "Yeah_1",  "Yes_1",    "Yes_2",     "You_1",   "You_2"};
  constexpr std::size_t kPerText = std::size(kGestures);
  std::string text;
  std::map<std::string, int> bookmarkOf;
  for (std::size_t k = 0; k < kPerText; ++k) {
    const std::string gesture = std::string("animations/Stand/Gestures/") + kGestures[k];
    text += "go ^start(" + gesture + ") ";
    bookmarkOf[gesture] = static_cast<int>(k + 1);
  }

  // By bookmark, for the text being spoken: on the robot's timeline, the raise of the
  // bookmark and the start of its gesture; in this process, the director's times.
  struct Times {
    std::int64_t raised = -1, bookmark = -1, begin = -1, started = -1;
  };
  std::mutex mutex;
  std::map<int, Times> times;
  const auto timeline = host.session()->service("ZUTimeline").value(10000);
  timeline->connect("entryRecorded", [&](std::int64_t us, std::string service, std::string op,
                                         ko::AnyValue args, ko::AnyValue) {
    const auto& a = args.asList();
    std::lock_guard lock(mutex);
    if (service == "ZUMemory" && op == "raiseEvent" && a.size() == 2 &&
        a[0].asString() == "ZUTextToSpeech/CurrentBookMark") {
      times[a[1].to<int>()].raised = us;
    } else if (service == "ZUBehaviorManager" && op == "startBehavior" && !a.empty()) {
      if (const auto it = bookmarkOf.find(a[0].asString()); it != bookmarkOf.end())
        times[it->second].started = us;
    }
  });
  mokuto->connect("actionReported", [&](ko::AnyValue report) {
    std::int64_t bookmark = 0, bookmarkUs = -1, beginUs = -1;
    for (const auto& [k, v] : report.asMap()) {
      const std::string key = k.asString();
      if (key == "bookmark")
        bookmark = v.to<std::int64_t>();
      else if (key == "bookmarkUs")
        bookmarkUs = v.to<std::int64_t>();
      else if (key == "beginUs")
        beginUs = v.to<std::int64_t>();
    }
    std::lock_guard lock(mutex);
    Times& t = times[static_cast<int>(bookmark)];
    t.bookmark = bookmarkUs;
    t.begin = beginUs;
  });

  std::vector<std::int64_t> delays;
  std::vector<std::int64_t> hops[3];  // deliver, takeUp, call
  for (auto _ : state) {
    {
      std::lock_guard lock(mutex);
      times.clear();
    }
    mokuto->call<void>("say", text);
    mokuto->call<void>("_stopAll", true);
    std::lock_guard lock(mutex);
    for (const auto& [bookmark, t] : times) {
      if (t.raised < 0 || t.started < 0)
        continue;
      delays.push_back(t.started - t.raised);
      if (t.bookmark < 0 || t.begin < 0)
        continue;
      hops[0].push_back(t.bookmark - t.raised);
      hops[1].push_back(t.begin - t.bookmark);
      hops[2].push_back(t.started - t.begin);
    }
  }
  host.shutdown();
  if (delays.empty()) {
    state.SkipWithError("no bookmark and gesture were paired");
    return;
  }
  state.counters["p50_us"] = static_cast<double>(percentile(delays, 0.50));
  state.counters["p99_us"] = static_cast<double>(percentile(delays, 0.99));
  state.counters["max_us"] = static_cast<double>(*std::max_element(delays.begin(), delays.end()));
  state.counters["samples"] = static_cast<double>(delays.size());
  const char* const names[] = {"deliver", "takeUp", "call"};
  for (std::size_t h = 0; h < std::size(hops); ++h) {
    if (hops[h].empty())
      continue;
    state.counters[std::string(names[h]) + "_p50_us"] =
        static_cast<double>(percentile(hops[h], 0.50));
    state.counters[std::string(names[h]) + "_p99_us"] =
        static_cast<double>(percentile(hops[h], 0.99));
  }
}
BENCHMARK(BM_SyncAcrossProcesses)->Iterations(14)->Unit(benchmark::kSecond);

}  // namespace
