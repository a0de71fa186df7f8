#include "robotsim/timeline.h"

#include <exception>

#include "ko/json.hpp"
#include "ko/log.hpp"

namespace robotsim {

namespace {
nlohmann::ordered_json toJson(const TimelineEntry& e) {
  nlohmann::ordered_json j;
  j["us"] = e.us;
  j["service"] = e.service;
  j["operation"] = e.operation;
  j["arguments"] = ko::toJson(e.arguments);
  if (!e.result.isVoid())
    j["result"] = ko::toJson(e.result);
  return j;
}
}  // namespace

Timeline::Timeline() : start_(std::chrono::steady_clock::now()) {}

std::int64_t Timeline::now() const {
  std::lock_guard lock(mutex_);
  return std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() -
                                                               start_)
      .count();
}

std::int64_t Timeline::usAt(std::chrono::steady_clock::time_point moment) const {
  std::lock_guard lock(mutex_);
  return std::chrono::duration_cast<std::chrono::microseconds>(moment - start_).count();
}

std::int64_t Timeline::originUs() const {
  std::lock_guard lock(mutex_);
  return std::chrono::duration_cast<std::chrono::microseconds>(start_.time_since_epoch()).count();
}

void Timeline::record(std::string service, std::string operation, ko::AnyValue arguments,
                      ko::AnyValue result) {
  xRecord(std::nullopt, std::move(service), std::move(operation), std::move(arguments),
          std::move(result));
}

void Timeline::recordAt(std::int64_t us, std::string service, std::string operation,
                        ko::AnyValue arguments, ko::AnyValue result) {
  xRecord(us, std::move(service), std::move(operation), std::move(arguments), std::move(result));
}

void Timeline::xRecord(std::optional<std::int64_t> us, std::string service, std::string operation,
                       ko::AnyValue arguments, ko::AnyValue result) {
  TimelineEntry entry;
  std::vector<Listener> listeners;
  {
    std::lock_guard lock(mutex_);
    entry = TimelineEntry{us ? *us
                             : std::chrono::duration_cast<std::chrono::microseconds>(
                                   std::chrono::steady_clock::now() - start_)
                                   .count(),
                          std::move(service), std::move(operation), std::move(arguments),
                          std::move(result)};
    entries_.push_back(entry);
    if (capacity_ > 0 && entries_.size() > capacity_)
      entries_.pop_front();
    listeners = listeners_;
  }
  for (const auto& listener : listeners) {
    try {
      listener(entry);
    } catch (const std::exception& e) {
      KO_LOG_ERROR("robotsim.timeline") << "A listener of the timeline threw on " << entry.service
                                        << "." << entry.operation << ": " << e.what();
    } catch (...) {
      KO_LOG_ERROR("robotsim.timeline")
          << "A listener of the timeline threw on " << entry.service << "." << entry.operation;
    }
  }
}

std::vector<TimelineEntry> Timeline::entries() const {
  std::lock_guard lock(mutex_);
  return {entries_.begin(), entries_.end()};
}

std::vector<TimelineEntry> Timeline::entries(const std::string& service,
                                             const std::string& operation) const {
  std::vector<TimelineEntry> out;
  std::lock_guard lock(mutex_);
  for (const auto& e : entries_) {
    if (e.service == service && e.operation == operation)
      out.push_back(e);
  }
  return out;
}

void Timeline::clear() {
  std::lock_guard lock(mutex_);
  entries_.clear();
  start_ = std::chrono::steady_clock::now();
}

void Timeline::setCapacity(std::size_t entries) {
  std::lock_guard lock(mutex_);
  capacity_ = entries;
  while (capacity_ > 0 && entries_.size() > capacity_)
    entries_.pop_front();
}

void Timeline::writeJsonLines(std::ostream& os,
                              const std::function<bool(const TimelineEntry&)>& keep) const {
  for (const auto& e : entries()) {
    if (!keep || keep(e))
      os << toJson(e).dump(-1, ' ', false, nlohmann::json::error_handler_t::replace) << '\n';
  }
}

void Timeline::addListener(Listener listener) {
  std::lock_guard lock(mutex_);
  listeners_.push_back(std::move(listener));
}

std::ostream& operator<<(std::ostream& os, const TimelineEntry& e) {
  const auto ms = static_cast<double>(e.us) / 1000.0;
  os << std::fixed;
  os.precision(1);
  os << ms << " ms  " << e.service << "." << e.operation << " " << e.arguments.toString();
  if (!e.result.isVoid())
    os << " -> " << e.result.toString();
  return os;
}

}  // namespace robotsim
