#pragma once
// StopSignals: what SIGINT (Ctrl-C) and SIGTERM do to a command that speaks. While a stop
// callback is set (from the text's start to the command's end), the first signal runs it,
// and the command ends as usual (its summary and its files come, with the status 130); a
// second ends the process at once, with the status 130 as well. Without one (reading the
// text, starting the robot) there is nothing to lose: the first signal ends the process at
// once, with the status 130.
//
// Made first thing, before any other thread starts: it blocks both signals in the calling
// thread, every thread started afterwards inherits the mask, and they stay blocked for the
// rest of the process, so that neither ever ends it by its default action (which would lose
// the summary, and give 143 for SIGTERM). A thread of its own takes them from a signalfd;
// the destructor ends that thread. The stop callback runs in that thread, under a mutex that
// onStop also takes.
#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

namespace mokuto::cli {

class StopSignals {
 public:
  // `command` names the command in the lines written to standard error ("mokuto say").
  explicit StopSignals(std::string command);
  ~StopSignals();
  StopSignals(const StopSignals&) = delete;
  StopSignals& operator=(const StopSignals&) = delete;

  // What the first signal does besides being remembered (null: end the process at once).
  // Once it returns, a callback that was replaced runs no more.
  void onStop(std::function<void()> stop);
  // Whether a signal came.
  bool received() const { return fCount.load() > 0; }

 private:
  void xRun();

  const std::string fCommand;
  int fSignalFd = -1;
  int fWakeFd = -1;
  std::atomic<int> fCount{0};
  std::mutex fMutex;
  std::function<void()> fStop;
  std::thread fThread;  // last: it uses the members above
};

}  // namespace mokuto::cli
