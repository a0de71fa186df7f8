#pragma once
// A child process of a test: started with its standard output and error on one pipe, read
// line by line with a bound, signalled by its pid. Never a sleep: a test waits for a line.

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace ko::test {

class ChildProcess {
 public:
  explicit ChildProcess(const std::vector<std::string>& argv) {
    int fds[2];
    if (::pipe2(fds, O_CLOEXEC) != 0)
      throw std::runtime_error("pipe failed");
    pid_ = ::fork();
    if (pid_ == 0) {
      ::dup2(fds[1], 1);
      ::dup2(fds[1], 2);
      std::vector<char*> args;
      for (const auto& a : argv)
        args.push_back(const_cast<char*>(a.c_str()));
      args.push_back(nullptr);
      ::execv(args[0], args.data());
      ::_exit(127);
    }
    ::close(fds[1]);
    fd_ = fds[0];
    ::fcntl(fd_, F_SETFL, O_NONBLOCK);
  }
  ~ChildProcess() {
    kill(SIGKILL);
    wait(std::chrono::seconds(10));
    if (fd_ >= 0)
      ::close(fd_);
  }
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return pid_; }

  // The first line read from now on that contains `text`, or nothing when the bound passes
  // or the child closes its output first.
  std::optional<std::string> waitForLine(
      const std::string& text, std::chrono::milliseconds bound = std::chrono::seconds(30)) {
    const auto end = std::chrono::steady_clock::now() + bound;
    for (;;) {
      const auto newline = pending_.find('\n');
      if (newline != std::string::npos) {
        std::string line = pending_.substr(0, newline);
        pending_.erase(0, newline + 1);
        if (line.find(text) != std::string::npos)
          return line;
        continue;
      }
      const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
          end - std::chrono::steady_clock::now());
      if (left.count() <= 0 || !readSome(static_cast<int>(left.count())))
        return std::nullopt;
    }
  }
  // Everything read so far.
  const std::string& output() const { return all_; }

  void kill(int signal) {
    if (pid_ > 0 && !status_)
      ::kill(pid_, signal);
  }
  // The exit status (or 128 + the signal), once the child has ended within the bound.
  std::optional<int> wait(std::chrono::milliseconds bound) {
    const auto end = std::chrono::steady_clock::now() + bound;
    while (!status_ && pid_ > 0) {
      int status = 0;
      const pid_t done = ::waitpid(pid_, &status, WNOHANG);
      if (done == pid_) {
        status_ = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        drain();
        break;
      }
      if (std::chrono::steady_clock::now() > end)
        break;
      // Output keeps coming while the child ends; reading it is the wait.
      readSome(50);
    }
    return status_;
  }

 private:
  // What the child wrote before it ended, still in the pipe.
  void drain() {
    char buffer[4096];
    for (pollfd p{fd_, POLLIN, 0}; ::poll(&p, 1, 0) > 0;) {
      const ssize_t n = ::read(fd_, buffer, sizeof buffer);
      if (n <= 0)
        return;
      pending_.append(buffer, static_cast<std::size_t>(n));
      all_.append(buffer, static_cast<std::size_t>(n));
    }
  }
  bool readSome(int timeoutMs) {
    pollfd p{fd_, POLLIN, 0};
    if (::poll(&p, 1, timeoutMs) <= 0)
      return true;  // nothing yet: the caller's bound decides
    char buffer[4096];
    const ssize_t n = ::read(fd_, buffer, sizeof buffer);
    if (n <= 0)
      return n < 0 && errno == EAGAIN;
    pending_.append(buffer, static_cast<std::size_t>(n));
    all_.append(buffer, static_cast<std::size_t>(n));
    return true;
  }

  pid_t pid_ = -1;
  int fd_ = -1;
  std::string pending_;
  std::string all_;
  std::optional<int> status_;
};

}  // namespace ko::test
