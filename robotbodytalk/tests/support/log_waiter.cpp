#include "support/log_waiter.h"

#include <algorithm>

namespace bodytalktest {

namespace {
bool matches(const ko::log::Record& r, std::string_view category, ko::log::Level level,
             std::string_view part) {
  return r.category == category && r.level == level && r.message.find(part) != std::string::npos;
}
}  // namespace

void LogWaiter::consume(const ko::log::Record& record) {
  {
    std::lock_guard lock(fMutex);
    fLines.push_back({record, std::chrono::steady_clock::now()});
  }
  fAdded.notify_all();
}

std::vector<LogLine> LogWaiter::lines(std::string_view category, ko::log::Level level,
                                      std::string_view part) const {
  std::lock_guard lock(fMutex);
  std::vector<LogLine> out;
  std::copy_if(fLines.begin(), fLines.end(), std::back_inserter(out),
               [&](const LogLine& l) { return matches(l.record, category, level, part); });
  return out;
}

bool LogWaiter::has(std::string_view category, ko::log::Level level,
                    std::string_view message) const {
  std::lock_guard lock(fMutex);
  return std::any_of(fLines.begin(), fLines.end(), [&](const LogLine& l) {
    return l.record.category == category && l.record.level == level && l.record.message == message;
  });
}

bool LogWaiter::waitFor(std::string_view category, ko::log::Level level, std::string_view part,
                        std::size_t count, std::chrono::milliseconds bound) const {
  std::unique_lock lock(fMutex);
  return fAdded.wait_for(lock, bound, [&] {
    return static_cast<std::size_t>(
               std::count_if(fLines.begin(), fLines.end(), [&](const LogLine& l) {
                 return matches(l.record, category, level, part);
               })) >= count;
  });
}

LogCapture::LogCapture() : fWaiter(std::make_shared<LogWaiter>()) {
  ko::log::addSink(fWaiter);
}

LogCapture::~LogCapture() {
  ko::log::removeSink(fWaiter);
}

}  // namespace bodytalktest
