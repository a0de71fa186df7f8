#pragma once
// A callback run again and again on an event loop, with a pause between two runs.
//
// The pause is counted from the end of one run to the start of the next, and it is read
// when a run ends, so a callback may change the period for the wait that follows it. Two
// runs of one task never overlap. Control calls (start, stop, setUsPeriod, ...) may come
// from any thread, the callback's own thread included; the callback runs on a thread of
// the task's event loop, as one of the loop's jobs (stopping the loop waits for it, and a
// stopped loop stops the task).
//
// Stops win: once stop() or the destructor has returned (called from outside the
// callback), the callback is not running and will not run again until the next start()
// from outside; a start() that the callback makes meanwhile is ignored. Only a stop that
// the callback asked for itself may be taken back by a start() from the same callback.
//
// A class deriving from PeriodicTask whose callback touches its own members must call
// stop() in its destructor, before those members go away.

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "ko/eventloop.hpp"

namespace ko {

class PeriodicTask {
 public:
  // On the process-wide event loop.
  PeriodicTask();
  explicit PeriodicTask(std::shared_ptr<EventLoop> loop);
  // Stops the task, waiting for a running callback unless called from that callback.
  virtual ~PeriodicTask();
  PeriodicTask(const PeriodicTask&) = delete;
  PeriodicTask& operator=(const PeriodicTask&) = delete;

  void setName(std::string name);
  std::string name() const;
  // Takes effect from the next run. An exception that escapes the callback is logged;
  // the task goes on.
  void setCallback(std::function<void()> callback);
  // The pause between two runs, in microseconds; a negative period raises ko::Error.
  void setUsPeriod(std::int64_t usPeriod);
  std::int64_t usPeriod() const;

  // Starts the task: the first run comes at once when `immediate`, otherwise after one
  // period. Does nothing when the task already runs; when it is stopping, waits for the
  // stop to end first, or, from inside the callback, takes back the callback's own stop
  // and leaves one asked from outside alone. Raises ko::Error when no callback was set or
  // the loop is stopped.
  void start(bool immediate = true);
  // Stops the task and waits for a running callback to end; called from inside the
  // callback it only asks for the stop, which happens when the callback returns.
  void stop();
  // Asks for the stop without waiting; from outside the callback, it wins as stop() does.
  void asyncStop();

  // From start() until the stop has completed.
  bool isRunning() const;
  // A stop was asked for but the callback has not returned yet.
  bool isStopping() const;

  struct Impl;

 private:
  std::shared_ptr<Impl> impl_;
};

}  // namespace ko
