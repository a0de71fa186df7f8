// zefoko serve: a host process of the simulated robot that loads module libraries and
// serves until it is asked to stop (SIGINT or SIGTERM). With --listen, the robot and the
// modules are reachable by other processes; with --connect, the host has no robot of its
// own and its modules use the robot of the process listening there.
#include <pthread.h>

#include <condition_variable>
#include <csignal>
#include <iostream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "commands.h"
#include "httpserver.h"
#include "ko/log.hpp"
#include "ko/remote.hpp"
#include "zefoko/host.h"
#include "zu/zuerror.h"

namespace zefoko {

namespace {

struct ServeOptions {
  std::string speech = "espeak";
  bool fast = false;
  std::string posture;
  // The robot's timeline keeps its last entries alone: hours of angle samples would not fit.
  std::size_t timelineEntries = 50'000;
  std::string listen;
  std::string connect;
  int heartbeatMs = 500;
  std::size_t maxMessageBytes = std::size_t{16} << 20;
  std::string secretKey;
  std::vector<std::string> clientKeys;
  std::string serverKey;
  std::vector<std::string> libraries;
  HttpCommandOptions http;
};

// What the main thread waits for: a stop signal, or the robot's process coming back.
class Events {
 public:
  void stop(int signal) {
    std::lock_guard lock(fMutex);
    fSignal = signal;
    fChanged.notify_all();
  }
  void link(bool up) {
    std::lock_guard lock(fMutex);
    if (!up)
      fLost = true;
    else if (fLost)
      fBack = true;
    fUp = up;
    fChanged.notify_all();
  }
  // 0 when the robot came back, else the signal.
  int wait() {
    std::unique_lock lock(fMutex);
    fChanged.wait(lock, [this] { return fSignal != 0 || fBack; });
    if (fSignal != 0)
      return fSignal;
    fBack = false;
    return 0;
  }
  // Waits for the first link; false when stopped first.
  bool waitForLink() {
    std::unique_lock lock(fMutex);
    fChanged.wait(lock, [this] { return fSignal != 0 || fUp; });
    fLost = false;
    fBack = false;
    return fSignal == 0;
  }
  int signal() {
    std::lock_guard lock(fMutex);
    return fSignal;
  }

 private:
  std::mutex fMutex;
  std::condition_variable fChanged;
  int fSignal = 0;
  bool fUp = false;
  bool fLost = false;
  bool fBack = false;
};

ko::RemoteOptions remoteOptions(const ServeOptions& o) {
  ko::RemoteOptions remote;
  remote.heartbeatInterval = std::chrono::milliseconds(o.heartbeatMs);
  remote.heartbeatTimeout = std::chrono::milliseconds(5 * o.heartbeatMs);
  remote.maxMessageBytes = o.maxMessageBytes;
  if (!o.secretKey.empty())
    remote.curve.secretKey = ko::remote::readKeyFile(o.secretKey);
  if (!o.serverKey.empty())
    remote.curve.serverKey = ko::remote::readKeyFile(o.serverKey);
  for (const auto& path : o.clientKeys)
    remote.curve.clientKeys.push_back(ko::remote::readKeyFile(path));
  return remote;
}

int serve(const ServeOptions& o) {
  if (!o.connect.empty() && o.libraries.empty()) {
    std::cerr << "zefoko serve: --connect needs module libraries to serve" << std::endl;
    return 2;
  }
  if (o.libraries.empty() && o.listen.empty() && o.http.address.empty()) {
    std::cerr << "zefoko serve: nothing to serve: give module libraries, --listen or --http"
              << std::endl;
    return 2;
  }
  // The keys and the endpoint, before anything starts.
  ko::RemoteOptions remote;
  try {
    remote = remoteOptions(o);
  } catch (const ko::Error& e) {
    std::cerr << "zefoko serve: " << e.what() << std::endl;
    return 2;
  }
  const std::string& endpoint = o.listen.empty() ? o.connect : o.listen;
  if (const std::string missing =
          endpoint.empty() ? std::string()
                           : ko::remote::missingKeys(endpoint, !o.listen.empty(), remote.curve);
      !missing.empty()) {
    std::cerr << "zefoko serve: " << missing << std::endl;
    return 2;
  }
  // The signals are taken by one thread alone: blocked before any thread starts, so that
  // every thread of the process inherits the mask.
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  Events events;
  std::thread watcher([&signals, &events] {
    int received = 0;
    sigwait(&signals, &received);
    events.stop(received);
  });
  const auto stopWatcher = [&] {
    if (events.signal() == 0)
      pthread_kill(watcher.native_handle(), SIGTERM);
    watcher.join();
  };

  HostOptions options;
  options.robot.speech.notifications = false;
  if (o.speech == "timing")
    options.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (o.fast)
    options.robot.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  options.postureFamily = o.posture;
  options.listen = o.listen;
  options.connect = o.connect;
  int status = 0;
  try {
    options.remote = remote;
    Host host(options);
    if (host.hasRobot())
      host.robot().timeline()->setCapacity(o.timelineEntries);
    if (!o.listen.empty())
      std::cout << "zefoko serve: listening on " << host.endpoint() << std::endl;
    if (!o.connect.empty()) {
      host.session()->setLinkListener([&events](bool up) { events.link(up); });
      std::cout << "zefoko serve: waiting for the robot at " << o.connect << std::endl;
      if (!host.session()->isLinked() && !events.waitForLink()) {
        host.shutdown();
        stopWatcher();
        return 0;
      }
    }
    for (const auto& path : o.libraries) {
      const auto modules = host.loadModuleLibrary(path);
      std::cout << "zefoko serve: loaded " << path;
      for (const auto& name : modules)
        std::cout << ' ' << name;
      std::cout << std::endl;
    }
    auto http = startHttpServer(host, o.http, std::cout);
    std::cout << "zefoko serve: serving; stop with Ctrl-C (SIGINT) or SIGTERM" << std::endl;
    int received = 0;
    while ((received = events.wait()) == 0) {
      std::cout << "zefoko serve: the robot's process is back at " << o.connect
                << ": making the modules again" << std::endl;
      if (host.reloadModules())
        std::cout << "zefoko serve: serving again" << std::endl;
    }
    std::cout << "zefoko serve: " << (received == SIGINT ? "SIGINT" : "SIGTERM") << ", stopping"
              << std::endl;
    http.reset();
    host.shutdown();
  } catch (const HostError& e) {
    std::cerr << "zefoko serve: " << e.what() << std::endl;
    status = 1;
  } catch (const ZU::ZUError& e) {
    std::cerr << "zefoko serve: " << e.description() << std::endl;
    status = 1;
  } catch (const std::exception& e) {
    std::cerr << "zefoko serve: " << e.what() << std::endl;
    status = 1;
  }
  stopWatcher();
  if (status == 0)
    std::cout << "zefoko serve: stopped" << std::endl;
  return status;
}

}  // namespace

void addServeCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<ServeOptions>();
  CLI::App* command = app.add_subcommand(
      "serve",
      "Start the simulated robot, load module libraries into it and serve until SIGINT or "
      "SIGTERM; with --listen, other processes reach them; with --connect, the modules use the "
      "robot of another process");
  auto* speech =
      command
          ->add_option("--speech", options->speech,
                       "The speech engine: espeak (real speech) or timing (durations estimated "
                       "from the text, no audio)")
          ->check(CLI::IsMember({"espeak", "timing"}))
          ->capture_default_str();
  auto* fast = command->add_flag("--fast", options->fast,
                                 "Play the speech without waiting in real time (default: real "
                                 "time)");
  auto* posture =
      command
          ->add_option("--posture", options->posture,
                       "The robot's posture family at start (default: Standing, the robot's own)")
          ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
  auto* timelineEntries =
      command
          ->add_option("--timeline-entries", options->timelineEntries,
                       "How many of its last entries the robot's timeline keeps (what --http "
                       "serves at /timeline), 1000 to 10^7")
          ->check(CLI::Range(std::size_t{1000}, std::size_t{10'000'000}))
          ->type_name("N")
          ->capture_default_str();
  auto* listen =
      command
          ->add_option("--listen", options->listen,
                       "Serve the robot and the modules to other processes at this endpoint: "
                       "tcp://HOST:PORT (tcp://127.0.0.1:* for a free port) or ipc://PATH; an "
                       "address reached through the network needs --secret-key and --client-key "
                       "(default: none, this process alone)")
          ->type_name("ENDPOINT");
  auto* connect =
      command
          ->add_option("--connect", options->connect,
                       "Use the robot of the process listening at this endpoint, which has the "
                       "robot's options (--speech, --fast, --posture); this one has no robot "
                       "(default: none, the robot in this process)")
          ->type_name("ENDPOINT");
  // The pages follow the robot of this process.
  CLI::Option* http = addHttpOptions(*command, options->http);
  listen->excludes(connect);
  for (auto* robotOption : {speech, fast, posture, timelineEntries, http})
    robotOption->excludes(connect);
  command
      ->add_option("--heartbeat", options->heartbeatMs,
                   "Milliseconds between two signs of life, 10 to 60000; a linked process "
                   "silent for five of them is taken for dead")
      ->check(CLI::Range(10, 60000))
      ->type_name("MS")
      ->capture_default_str();
  command
      ->add_option("--max-message", options->maxMessageBytes,
                   "The largest message accepted, in bytes, 1024 to 2^30")
      ->check(CLI::Range(std::size_t{1024}, std::size_t{1} << 30))
      ->type_name("BYTES")
      ->capture_default_str();
  command
      ->add_option("--secret-key", options->secretKey,
                   "This process's CURVE secret key file, made by zefoko keys (default: none)")
      ->check(CLI::ExistingFile)
      ->type_name("PATH");
  command
      ->add_option("--client-key", options->clientKeys,
                   "With --listen: a public key file of a process allowed to connect "
                   "(repeatable; default: none)")
      ->check(CLI::ExistingFile)
      ->type_name("PATH")
      ->needs(listen);
  command
      ->add_option("--server-key", options->serverKey,
                   "With --connect: the public key file of the listening process (default: none)")
      ->check(CLI::ExistingFile)
      ->type_name("PATH")
      ->needs(connect);
  command
      ->add_option("libraries", options->libraries,
                   "The module libraries (.so) to load (default: none, the robot alone, which "
                   "needs --listen or --http)")
      ->check(CLI::ExistingFile)
      ->type_name("LIBRARY");
  command->callback([options, &status] { status = serve(*options); });
}

}  // namespace zefoko
