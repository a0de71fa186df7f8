// zefoko serve: a host process of the simulated robot that loads module libraries and
// serves until it is asked to stop (SIGINT or SIGTERM).
#include <csignal>
#include <iostream>
#include <string>
#include <vector>

#include "commands.h"
#include "httpserver.h"
#include "zefoko/host.h"
#include "zu/zuerror.h"

namespace zefoko {

namespace {

struct ServeOptions {
  std::string speech = "espeak";
  std::string posture;
  std::vector<std::string> libraries;
  HttpCommandOptions http;
};

int serve(const ServeOptions& o) {
  // The signals are taken by this thread alone: blocked before any thread starts, so that
  // every thread of the process inherits the mask, and waited for below.
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);

  HostOptions options;
  options.robot.speech.notifications = false;
  if (o.speech == "timing")
    options.robot.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.postureFamily = o.posture;
  try {
    Host host(options);
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
    sigwait(&signals, &received);
    std::cout << "zefoko serve: " << (received == SIGINT ? "SIGINT" : "SIGTERM") << ", stopping"
              << std::endl;
    http.reset();
    host.shutdown();
  } catch (const HostError& e) {
    std::cerr << "zefoko serve: " << e.what() << std::endl;
    return 1;
  } catch (const ZU::ZUError& e) {
    std::cerr << "zefoko serve: " << e.description() << std::endl;
    return 1;
  } catch (const std::exception& e) {
    std::cerr << "zefoko serve: " << e.what() << std::endl;
    return 1;
  }
  std::cout << "zefoko serve: stopped" << std::endl;
  return 0;
}

}  // namespace

void addServeCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<ServeOptions>();
  CLI::App* command =
      app.add_subcommand("serve",
                         "Start the simulated robot, load module libraries into it and serve until "
                         "SIGINT or SIGTERM");
  command->add_option("--speech", options->speech, "The speech engine: espeak or timing")
      ->check(CLI::IsMember({"espeak", "timing"}));
  command->add_option("--posture", options->posture, "The robot's posture family at start")
      ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}));
  addHttpOptions(*command, options->http);
  command->add_option("libraries", options->libraries, "The module libraries (.so) to load")
      ->required()
      ->check(CLI::ExistingFile);
  command->callback([options, &status] { status = serve(*options); });
}

}  // namespace zefoko
