// mokuto_soak_say [MINUTES]: the service on the simulated robot (timing speech engine,
// played as fast as possible; the robot's own animation library and sounds) speaks random
// annotated texts in a loop from two caller threads, while a third stops them at random
// (stop by id, _stopAll with and without waiting) and changes the configuration. Every
// minute it prints the process's resident memory, threads and open descriptors; at the
// end, whether every text ended exactly once. Exit status 0 when they all did, 1 if not,
// 2 for a bad argument. scripts/soak-say builds and runs it.
#include <dirent.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <mutex>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "ko/log.hpp"
#include "ko/os.hpp"
#include "ko/reaper.hpp"
#include "mokuto/zumokuto.h"
#include "random_texts.h"
#include "robotsim/robot.h"
#include "zu/zuserviceproxies.h"

namespace {

using namespace std::chrono_literals;

// A field of /proc/self/status, in its unit ("kB" for VmRSS).
long statusField(const std::string& name) {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind(name + ":", 0) == 0)
      return std::strtol(line.c_str() + name.size() + 1, nullptr, 10);
  }
  return -1;
}

int openDescriptors() {
  int count = 0;
  if (DIR* fds = ::opendir("/proc/self/fd")) {
    while (const dirent* entry = ::readdir(fds))
      count += entry->d_name[0] != '.';
    ::closedir(fds);
    --count;  // the directory's own
  }
  return count;
}

// How often each text id was ended; grown as ids come.
class Ends {
 public:
  void ended(int id) {
    std::lock_guard lock(fMutex);
    if (id < 1)
      return;
    if (static_cast<std::size_t>(id) >= fCounts.size())
      fCounts.resize(static_cast<std::size_t>(id) * 2, 0);
    ++fCounts[static_cast<std::size_t>(id)];
    ++fTotal;
  }
  // The ids ended more than once, and the count of ends.
  std::pair<std::size_t, std::size_t> summary() const {
    std::lock_guard lock(fMutex);
    std::size_t twice = 0;
    for (const auto count : fCounts)
      twice += count > 1;
    return {twice, fTotal};
  }

 private:
  mutable std::mutex fMutex;
  std::vector<std::uint8_t> fCounts;
  std::size_t fTotal = 0;
};

}  // namespace

int main(int argc, char** argv) {
  int minutes = 60;
  if (argc > 2 || (argc == 2 && (minutes = std::atoi(argv[1])) <= 0)) {
    std::cerr << "usage: mokuto_soak_say [MINUTES]" << std::endl;
    return 2;
  }
  ko::log::setLevels("*=fatal");
  ko::os::keepFreedMemory();  // as the service's host

  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  options.speech.recordAudio = false;
  auto robot = std::make_unique<robotsim::Robot>(options);
  Ends ends;
  std::atomic<std::size_t> said{0};
  std::atomic<std::size_t> failed{0};
  std::atomic<std::size_t> stops{0};
  robot->timeline()->addListener([&ends](const robotsim::TimelineEntry& entry) {
    if (entry.service != "ZUMemory" || entry.operation != "raiseEvent")
      return;
    const auto arguments = entry.arguments.to<std::vector<ko::AnyValue>>();
    if (arguments.at(0).to<std::string>() == ZU::ZUMokuto::kEndEvent)
      ends.ended(arguments.at(1).to<int>());
  });
  const auto broker = robot->broker();
  ZU::ZUAudioPlayerProxy(broker).loadSoundSet("bells");
  auto mokuto = ZU::ZUModule::createModule<ZU::ZUMokuto>(broker, ZU::ZUMokuto::kModuleName);
  mokuto->waitForIndex(60s);
  std::vector<std::string> animations;
  for (const auto& path : ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors()) {
    if (path.find("/Gestures/") != std::string::npos)
      animations.push_back(path);
  }

  const auto deadline = std::chrono::steady_clock::now() + std::chrono::minutes(minutes);
  std::atomic<bool> done{false};
  std::vector<std::thread> threads;
  for (std::uint32_t caller = 0; caller < 2; ++caller) {
    threads.emplace_back([&, caller] {
      mokutosoak::RandomTexts texts(animations, mokuto->_getTagList(),
                                    {"bells/ding", "bells/dong", "bells/chime"}, 7 + caller);
      while (!done.load()) {
        try {
          mokuto->say(texts.next());
        } catch (const std::exception&) {
          ++failed;
        }
        ++said;
      }
    });
  }
  threads.emplace_back([&] {
    std::mt19937 random(11);
    while (!done.load()) {
      std::this_thread::sleep_for(
          std::chrono::milliseconds(std::uniform_int_distribution<int>(20, 1500)(random)));
      switch (std::uniform_int_distribution<int>(0, 9)(random)) {
        case 0:
          mokuto->_stopAll(true);
          break;
        case 1:
        case 2:
          mokuto->_stopAll(false);
          break;
        case 3:
          mokuto->setBodyLanguageModeFromStr(random() % 2 ? "random" : "contextual");
          break;
        case 4:
          mokuto->_setMSPauseBeforeSpeech(static_cast<int>(random() % 300));
          break;
        default:
          // The latest texts, by id: most are gone by now.
          mokuto->stop(static_cast<int>(said.load() + random() % 3));
          break;
      }
      ++stops;
    }
  });

  std::printf("%6s %10s %8s %12s %8s %8s\n", "minute", "RSS (MiB)", "threads", "descriptors",
              "texts", "stops");
  for (int minute = 1; minute <= minutes; ++minute) {
    std::this_thread::sleep_until(deadline - std::chrono::minutes(minutes - minute));
    robot->timeline()->clear();
    std::printf("%6d %10.1f %8ld %12d %8zu %8zu\n", minute,
                static_cast<double>(statusField("VmRSS")) / 1024.0, statusField("Threads"),
                openDescriptors(), said.load(), stops.load());
    std::fflush(stdout);
  }
  done = true;
  mokuto->_stopAll(false);
  for (auto& thread : threads)
    thread.join();
  mokuto->exit();
  mokuto.reset();
  const auto [twice, total] = ends.summary();
  const std::size_t expected = said.load() - failed.load();
  std::printf("texts %zu, failed %zu, end events %zu, ended twice %zu\n", said.load(),
              failed.load(), total, twice);
  robot.reset();
  ko::waitForReaper();
  return twice == 0 && total == expected ? 0 : 1;
}
