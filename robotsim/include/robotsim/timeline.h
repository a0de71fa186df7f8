#pragma once
// The simulated robot's timeline: one shared record of everything that happens to its
// services (speech started, bookmark reached, behaviour started, joint move posted,
// sound played, event raised), with the time in microseconds since the timeline began.
//
// Any thread may record; readers get a copy. Listeners are called in the recording
// thread, after the entry is stored and outside the timeline's lock; one that throws is
// logged, and the others and the recording thread go on.

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "ko/anyvalue.hpp"

namespace robotsim {

struct TimelineEntry {
  std::int64_t us = 0;  // since the timeline began
  std::string service;
  std::string operation;
  ko::AnyValue arguments;  // a list, usually
  ko::AnyValue result;     // void when there is none
};

class Timeline {
 public:
  Timeline();

  void record(std::string service, std::string operation, ko::AnyValue arguments = {},
              ko::AnyValue result = {});
  // Microseconds since the timeline began (or was last cleared).
  std::int64_t now() const;
  // The same of a moment of the steady clock (negative before the timeline began).
  std::int64_t usAt(std::chrono::steady_clock::time_point moment) const;
  // When it began, on ko::os::ustime()'s clock (the steady clock of the machine).
  std::int64_t originUs() const;
  // Records an entry that happened at `us` (on this timeline's clock), elsewhere: a mirror
  // of another process's timeline.
  void recordAt(std::int64_t us, std::string service, std::string operation,
                ko::AnyValue arguments = {}, ko::AnyValue result = {});

  std::vector<TimelineEntry> entries() const;
  // The entries of one service and operation, in order.
  std::vector<TimelineEntry> entries(const std::string& service,
                                     const std::string& operation) const;
  void clear();
  // Keeps the last `entries` entries, the older ones dropped as new ones come (0, the
  // default: every entry), for a robot that runs for hours. The listeners hear every entry.
  void setCapacity(std::size_t entries);

  // One JSON object per line: {"us":…,"service":…,"operation":…,"arguments":…,"result":…},
  // for every entry or those that `keep` accepts.
  void writeJsonLines(std::ostream& os,
                      const std::function<bool(const TimelineEntry&)>& keep = {}) const;

  using Listener = std::function<void(const TimelineEntry&)>;
  // Listeners cannot be removed; add them before the services run.
  void addListener(Listener listener);

 private:
  void xRecord(std::optional<std::int64_t> us, std::string service, std::string operation,
               ko::AnyValue arguments, ko::AnyValue result);

  mutable std::mutex mutex_;
  std::chrono::steady_clock::time_point start_;
  std::deque<TimelineEntry> entries_;
  std::size_t capacity_ = 0;
  std::vector<Listener> listeners_;
};

std::ostream& operator<<(std::ostream& os, const TimelineEntry& entry);

}  // namespace robotsim
