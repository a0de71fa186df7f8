#pragma once
// Log lines for the body talk tests: a capture that raises every category to debug, mutes
// standard error, keeps the lines with the time they were written, and lets a test wait
// (with a bound) for a line. Lines arrive on the threads that log.

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "ko/log.hpp"
#include "support/fake_robot.h"

namespace bodytalktest {

struct LogLine {
  ko::log::Record record;
  std::chrono::steady_clock::time_point time;
};

class LogWaiter : public ko::log::Sink {
 public:
  void consume(const ko::log::Record& record) override;
  // The lines of that category and level whose message contains `part`.
  std::vector<LogLine> lines(std::string_view category, ko::log::Level level,
                             std::string_view part) const;
  std::size_t count(std::string_view category, ko::log::Level level, std::string_view part) const {
    return lines(category, level, part).size();
  }
  // Whether a line has exactly this message.
  bool has(std::string_view category, ko::log::Level level, std::string_view message) const;
  bool waitFor(std::string_view category, ko::log::Level level, std::string_view part,
               std::size_t count = 1, std::chrono::milliseconds bound = kBound) const;

 private:
  mutable std::mutex fMutex;
  mutable std::condition_variable fAdded;
  std::vector<LogLine> fLines;
};

class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;
  LogWaiter* operator->() const { return fWaiter.get(); }

 private:
  ko::log::ScopedCapture fScope;
  std::shared_ptr<LogWaiter> fWaiter;
};

}  // namespace bodytalktest
