#include "cli_signals.h"

#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <system_error>
#include <utility>

#include "cli_common.h"

namespace mokuto::cli {

namespace {

sigset_t stopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  return signals;
}

// Straight to the file descriptor: no stream is shared with the threads that print.
void writeError(const std::string& line) {
  const char* data = line.data();
  std::size_t left = line.size();
  while (left > 0) {
    const ssize_t written = ::write(STDERR_FILENO, data, left);
    if (written <= 0)
      return;
    data += written;
    left -= static_cast<std::size_t>(written);
  }
}

}  // namespace

StopSignals::StopSignals(std::string command) : fCommand(std::move(command)) {
  const sigset_t signals = stopSignals();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  fSignalFd = ::signalfd(-1, &signals, SFD_CLOEXEC);
  fWakeFd = ::eventfd(0, EFD_CLOEXEC);
  if (fSignalFd < 0 || fWakeFd < 0)
    throw std::system_error(errno, std::generic_category(), "cannot watch SIGINT and SIGTERM");
  fThread = std::thread([this] { xRun(); });
}

StopSignals::~StopSignals() {
  const std::uint64_t one = 1;
  if (::write(fWakeFd, &one, sizeof one) == sizeof one)
    fThread.join();
  else
    fThread.detach();
  ::close(fSignalFd);
  ::close(fWakeFd);
}

void StopSignals::onStop(std::function<void()> stop) {
  std::lock_guard lock(fMutex);
  fStop = std::move(stop);
}

void StopSignals::xRun() {
  pollfd fds[2] = {{fSignalFd, POLLIN, 0}, {fWakeFd, POLLIN, 0}};
  for (;;) {
    if (::poll(fds, 2, -1) < 0) {
      if (errno == EINTR)
        continue;
      return;
    }
    if (fds[1].revents != 0)
      return;
    signalfd_siginfo info{};
    if (::read(fSignalFd, &info, sizeof info) != static_cast<ssize_t>(sizeof info))
      continue;
    const std::string name = info.ssi_signo == SIGINT ? "SIGINT" : "SIGTERM";
    if (fCount.fetch_add(1) > 0) {
      writeError(fCommand + ": " + name + " again, ending at once\n");
      ::_exit(kStopped);
    }
    std::lock_guard lock(fMutex);
    if (!fStop) {
      writeError(fCommand + ": " + name + ", ending\n");
      ::_exit(kStopped);
    }
    writeError(fCommand + ": " + name + ", stopping (a second signal ends the command at once)\n");
    fStop();
  }
}

}  // namespace mokuto::cli
