#include "robotsim/simulatedbody.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

#include "ko/log.hpp"
#include "ko/reaper.hpp"
#include "robotsim/jointmodel.h"

namespace robotsim {

namespace {
double secondsBetween(SimulatedBody::Clock::time_point from, SimulatedBody::Clock::time_point to) {
  return std::chrono::duration<double>(to - from).count();
}
}  // namespace

SimulatedBody::SimulatedBody(std::chrono::microseconds tick)
    : fTick(tick.count() > 0 ? tick : std::chrono::milliseconds(10)) {
  for (const auto& joint : bodyJoints())
    fAngles.push_back(joint.restAngle);
  fOwner.assign(fAngles.size(), 0);
  fLastTick = Clock::now();
  fThread = std::thread([this] { xRun(); });
}

SimulatedBody::~SimulatedBody() {
  {
    std::lock_guard lock(fMutex);
    fQuit = true;
  }
  fWake.notify_all();
  fThread.join();
}

void SimulatedBody::setMoveEndListener(MoveEndListener listener) {
  std::lock_guard lock(fMutex);
  fListener = std::move(listener);
}

void SimulatedBody::setAngleSampler(std::chrono::microseconds period, AngleSampler sampler) {
  std::lock_guard lock(fMutex);
  fSampler = std::move(sampler);
  fSamplePeriod = std::max(period, fTick);
  fSampled = fAngles;
  fLastSample = Clock::now();
}

void SimulatedBody::xSample(std::unique_lock<std::mutex>& lock, bool now) {
  if (!fSampler)
    return;
  const auto at = Clock::now();
  // Half a tick early is on time: the ticks come every fTick, a little late at times.
  if (!now && at - fLastSample + fTick / 2 < fSamplePeriod)
    return;
  std::vector<std::pair<std::size_t, double>> moved;
  for (std::size_t j = 0; j < fAngles.size(); ++j) {
    if (fAngles[j] != fSampled[j]) {
      moved.emplace_back(j, fAngles[j]);
      fSampled[j] = fAngles[j];
    }
  }
  if (moved.empty())
    return;
  fLastSample = at;
  const AngleSampler sampler = fSampler;
  lock.unlock();
  try {
    sampler(moved);
  } catch (const std::exception& e) {
    KO_LOG_ERROR("robotsim.motion") << "The angle sampler threw: " << e.what();
  }
  lock.lock();
}

std::vector<double> SimulatedBody::angles(const std::vector<std::size_t>& joints) const {
  std::lock_guard lock(fMutex);
  std::vector<double> out;
  out.reserve(joints.size());
  for (const auto j : joints)
    out.push_back(fAngles.at(j));
  return out;
}

std::vector<int> SimulatedBody::xClaim(int id, const std::vector<std::size_t>& joints) {
  std::vector<int> orphans;
  for (const auto j : joints) {
    const int previous = fOwner[j];
    fOwner[j] = id;
    if (previous == 0 || previous == id)
      continue;
    auto it = fMoves.find(previous);
    if (it == fMoves.end())
      continue;
    auto& owned = it->second.joints;
    owned.erase(std::remove(owned.begin(), owned.end(), j), owned.end());
    if (owned.empty()) {
      fMoves.erase(it);
      orphans.push_back(previous);
    }
  }
  return orphans;
}

void SimulatedBody::xErase(int id) {
  auto it = fMoves.find(id);
  if (it == fMoves.end())
    return;
  for (const auto j : it->second.joints) {
    if (fOwner[j] == id)
      fOwner[j] = 0;
  }
  fMoves.erase(it);
}

void SimulatedBody::xNotifyEnded(const std::vector<int>& ids, bool interrupted) {
  if (ids.empty())
    return;
  fEnded.notify_all();
  MoveEndListener listener;
  {
    std::lock_guard lock(fMutex);
    listener = fListener;
  }
  if (!listener)
    return;
  for (const int id : ids) {
    try {
      listener(id, interrupted);
    } catch (const std::exception& e) {
      KO_LOG_ERROR("robotsim.motion")
          << "The end of move " << id << " could not be told: " << e.what();
    }
  }
}

int SimulatedBody::startBezierMove(const std::vector<JointTrack>& tracks, double minDuration) {
  Move move;
  move.bezier = true;
  move.duration = std::isfinite(minDuration) ? std::max(0.0, minDuration) : 0.0;
  for (const auto& track : tracks)
    move.joints.push_back(track.joint);

  int id = 0;
  std::vector<int> orphans;
  {
    std::lock_guard lock(fMutex);
    move.start = Clock::now();
    for (const auto& track : tracks) {
      BezierCurve curve(fAngles.at(track.joint), track.keys);
      move.duration = std::max(move.duration, curve.duration());
      move.curves.emplace(track.joint, std::move(curve));
    }
    id = fNextId;
    fNextId = fNextId == std::numeric_limits<int>::max() ? 1 : fNextId + 1;
    orphans = xClaim(id, move.joints);
    fMoves.emplace(id, std::move(move));
  }
  fWake.notify_all();
  xNotifyEnded(orphans, true);
  return id;
}

int SimulatedBody::startSpeedMove(const std::vector<std::size_t>& joints,
                                  const std::vector<double>& targets, double fractionMaxSpeed) {
  Move move;
  move.bezier = false;
  move.fraction = std::clamp(fractionMaxSpeed, 0.0, 1.0);
  move.joints = joints;
  for (std::size_t i = 0; i < joints.size() && i < targets.size(); ++i)
    move.targets[joints[i]] = clampToLimits(joints[i], targets[i]);

  int id = 0;
  std::vector<int> orphans;
  {
    std::lock_guard lock(fMutex);
    move.start = Clock::now();
    id = fNextId;
    fNextId = fNextId == std::numeric_limits<int>::max() ? 1 : fNextId + 1;
    orphans = xClaim(id, move.joints);
    fMoves.emplace(id, std::move(move));
  }
  fWake.notify_all();
  xNotifyEnded(orphans, true);
  return id;
}

bool SimulatedBody::waitMove(int id, int timeoutMs) const {
  std::unique_lock lock(fMutex);
  auto ended = [&] { return fMoves.count(id) == 0; };
  if (timeoutMs < 0) {
    fEnded.wait(lock, ended);
    return true;
  }
  return fEnded.wait_for(lock, std::chrono::milliseconds(timeoutMs), ended);
}

bool SimulatedBody::stopMove(int id) {
  {
    std::lock_guard lock(fMutex);
    if (fMoves.count(id) == 0)
      return false;
    xErase(id);
  }
  xNotifyEnded({id}, true);
  return true;
}

void SimulatedBody::stopAllMoves() {
  std::vector<int> ids;
  {
    std::lock_guard lock(fMutex);
    for (const auto& [id, move] : fMoves)
      ids.push_back(id);
    for (const int id : ids)
      xErase(id);
  }
  xNotifyEnded(ids, true);
}

bool SimulatedBody::isMoveRunning(int id) const {
  std::lock_guard lock(fMutex);
  return fMoves.count(id) != 0;
}

bool SimulatedBody::isAnyJointHeld(const std::vector<std::size_t>& joints) const {
  std::lock_guard lock(fMutex);
  return std::any_of(joints.begin(), joints.end(), [&](std::size_t j) { return fOwner[j] != 0; });
}

std::vector<int> SimulatedBody::xTick(Clock::time_point now) {
  const double dt = std::max(0.0, secondsBetween(fLastTick, now));
  fLastTick = now;
  std::vector<int> finished;
  for (auto& [id, move] : fMoves) {
    if (move.bezier) {
      const double t = secondsBetween(move.start, now);
      for (const auto j : move.joints)
        fAngles[j] = clampToLimits(j, move.curves.at(j).valueAt(t));
      if (t >= move.duration)
        finished.push_back(id);
      continue;
    }
    bool reached = true;
    for (const auto j : move.joints) {
      const double target = move.targets.at(j);
      const double step = bodyJoints()[j].maxSpeed * move.fraction * dt;
      const double gap = target - fAngles[j];
      if (std::abs(gap) <= step) {
        fAngles[j] = target;
      } else {
        fAngles[j] += gap > 0 ? step : -step;
        reached = false;
      }
    }
    if (reached)
      finished.push_back(id);
  }
  for (const int id : finished)
    xErase(id);
  return finished;
}

void SimulatedBody::xRun() {
  const ko::FrameworkThreadScope framework;
  std::unique_lock lock(fMutex);
  while (!fQuit) {
    if (fMoves.empty()) {
      // Where the moves left the joints.
      xSample(lock, true);
      fWake.wait(lock, [this] { return fQuit || !fMoves.empty(); });
      fLastTick = Clock::now();
      continue;
    }
    const auto next = fLastTick + fTick;
    if (fWake.wait_until(lock, next, [this] { return fQuit; }))
      break;
    const std::vector<int> finished = xTick(Clock::now());
    if (!finished.empty()) {
      lock.unlock();
      xNotifyEnded(finished, false);
      lock.lock();
    }
    xSample(lock, false);
  }
}

}  // namespace robotsim
