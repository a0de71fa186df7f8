#include "robotsim/bezier.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "robotsim/jointmodel.h"

namespace robotsim {

namespace {

constexpr int kHandleType = 3;
constexpr int kSolverSteps = 60;

double cubic(double p0, double p1, double p2, double p3, double u) {
  const double v = 1.0 - u;
  return v * v * v * p0 + 3.0 * v * v * u * p1 + 3.0 * v * u * u * p2 + u * u * u * p3;
}

const ko::AnyValue& unwrapped(const ko::AnyValue& value) {
  const ko::AnyValue* v = &value;
  while (v->kind() == ko::Kind::Dynamic)
    v = &v->asDynamic();
  return *v;
}

const ko::AnyValue::List* listOf(const ko::AnyValue& value) {
  const ko::AnyValue& v = unwrapped(value);
  switch (v.kind()) {
    case ko::Kind::List:
      return &v.asList();
    case ko::Kind::VarArgs:
      return &v.asVarArgs();
    case ko::Kind::Tuple:
      return &v.asTuple().members;
    default:
      return nullptr;
  }
}

bool isNumber(const ko::AnyValue& value) {
  const auto kind = unwrapped(value).kind();
  return kind == ko::Kind::Int || kind == ko::Kind::Float;
}

double numberOf(const ko::AnyValue& value, const std::string& what) {
  const ko::AnyValue& v = unwrapped(value);
  double d = 0;
  if (v.kind() == ko::Kind::Int)
    d = static_cast<double>(v.asInt().value);
  else if (v.kind() == ko::Kind::Float)
    d = v.asFloat().value;
  else
    throw KeyframeError(what + " must be a number, not " + v.toString());
  if (!std::isfinite(d))
    throw KeyframeError(what + " must be finite");
  return d;
}

BezierHandle readHandle(const ko::AnyValue& value, const std::string& what) {
  const auto* items = listOf(value);
  if (!items || items->size() != 3)
    throw KeyframeError(what + " must be [3, dTime, dAngle]");
  const double type = numberOf((*items)[0], what + " type");
  if (type != kHandleType)
    throw KeyframeError(what + " has the type " + unwrapped((*items)[0]).toString() +
                        "; only 3 (Bezier) is known");
  return {numberOf((*items)[1], what + " dTime"), numberOf((*items)[2], what + " dAngle")};
}

std::vector<BezierKey> readKeys(const std::string& joint, const ko::AnyValue& timesValue,
                                const ko::AnyValue& keysValue) {
  const auto* times = listOf(timesValue);
  const auto* keys = listOf(keysValue);
  if (!times)
    throw KeyframeError(joint + ": the times must be a list");
  if (!keys)
    throw KeyframeError(joint + ": the keys must be a list");
  if (times->empty())
    throw KeyframeError(joint + ": no keys");
  if (times->size() != keys->size()) {
    throw KeyframeError(joint + ": " + std::to_string(times->size()) + " times but " +
                        std::to_string(keys->size()) + " keys");
  }
  std::vector<BezierKey> out(times->size());
  std::vector<bool> handlesGiven(out.size(), false);
  for (std::size_t i = 0; i < out.size(); ++i) {
    const std::string what = joint + ": key " + std::to_string(i + 1);
    BezierKey& key = out[i];
    key.time = numberOf((*times)[i], what + " time");
    if (key.time <= 0)
      throw KeyframeError(what + ": times must be positive");
    if (i > 0 && key.time <= out[i - 1].time)
      throw KeyframeError(what + ": times must increase");
    const double previous = i > 0 ? out[i - 1].time : 0.0;
    const auto* parts = listOf((*keys)[i]);
    if (!parts) {
      key.angle = numberOf((*keys)[i], what + " angle");
      key.before.dTime = -(key.time - previous) / 3.0;
      continue;
    }
    if (parts->size() != 3 && parts->size() != 1)
      throw KeyframeError(what + " must be [angle, before-handle, after-handle]");
    key.angle = numberOf((*parts)[0], what + " angle");
    if (parts->size() == 3) {
      handlesGiven[i] = true;
      key.before = readHandle((*parts)[1], what + " before-handle");
      key.after = readHandle((*parts)[2], what + " after-handle");
    } else {
      key.before.dTime = -(key.time - previous) / 3.0;
    }
  }
  // Keys given without handles get a flat after-handle a third of the way to the next key.
  for (std::size_t i = 0; i + 1 < out.size(); ++i) {
    if (!handlesGiven[i])
      out[i].after.dTime = (out[i + 1].time - out[i].time) / 3.0;
  }
  return out;
}

}  // namespace

double bezierSegmentValue(double t0, double a0, double t1, double a1, double t2, double a2,
                          double t3, double a3, double t) {
  if (t3 <= t0 || t <= t0)
    return t <= t0 ? a0 : a3;
  if (t >= t3)
    return a3;
  // Inner points inside [t0, t3] keep the time of the curve non-decreasing, so the
  // parameter that gives `t` is found by bisection.
  t1 = std::clamp(t1, t0, t3);
  t2 = std::clamp(t2, t0, t3);
  double lo = 0.0;
  double hi = 1.0;
  for (int i = 0; i < kSolverSteps; ++i) {
    const double mid = 0.5 * (lo + hi);
    if (cubic(t0, t1, t2, t3, mid) < t)
      lo = mid;
    else
      hi = mid;
  }
  return cubic(a0, a1, a2, a3, 0.5 * (lo + hi));
}

BezierCurve::BezierCurve(double startAngle, std::vector<BezierKey> keys)
    : fStartAngle(startAngle), fKeys(std::move(keys)) {}

double BezierCurve::duration() const {
  return fKeys.empty() ? 0.0 : fKeys.back().time;
}

double BezierCurve::valueAt(double t) const {
  if (fKeys.empty() || t <= 0)
    return fStartAngle;
  if (t >= fKeys.back().time)
    return fKeys.back().angle;
  const auto next = std::upper_bound(fKeys.begin(), fKeys.end(), t,
                                     [](double time, const BezierKey& k) { return time < k.time; });
  const BezierKey& to = *next;
  const double toT2 = to.time + std::min(0.0, to.before.dTime);
  const double toA2 = to.angle + to.before.dAngle;
  if (next == fKeys.begin()) {
    // From the start angle at rest: a flat handle a third of the way.
    return bezierSegmentValue(0.0, fStartAngle, to.time / 3.0, fStartAngle, toT2, toA2, to.time,
                              to.angle, t);
  }
  const BezierKey& from = *(next - 1);
  return bezierSegmentValue(from.time, from.angle, from.time + std::max(0.0, from.after.dTime),
                            from.angle + from.after.dAngle, toT2, toA2, to.time, to.angle, t);
}

std::vector<std::size_t> parseJointNames(const ko::AnyValue& names) {
  std::vector<std::string> given;
  const ko::AnyValue& v = unwrapped(names);
  if (v.kind() == ko::Kind::String) {
    given.push_back(v.asString());
  } else if (const auto* items = listOf(v)) {
    for (const auto& item : *items) {
      if (unwrapped(item).kind() != ko::Kind::String)
        throw KeyframeError("A joint name must be a string, not " + unwrapped(item).toString());
      given.push_back(unwrapped(item).asString());
    }
  } else {
    throw KeyframeError("The names must be a joint or chain name or a list of them, not " +
                        v.toString());
  }
  std::vector<std::size_t> out;
  for (const auto& name : given) {
    const auto joints = jointsOf(name);
    if (joints.empty())
      throw KeyframeError("Unknown joint or chain name '" + name + "'");
    for (const auto j : joints) {
      if (std::find(out.begin(), out.end(), j) != out.end())
        throw KeyframeError("The joint '" + bodyJoints()[j].name + "' is named twice");
      out.push_back(j);
    }
  }
  return out;
}

std::vector<JointTrack> parseBezierTracks(const ko::AnyValue& names, const ko::AnyValue& times,
                                          const ko::AnyValue& keys) {
  const std::vector<std::size_t> joints = parseJointNames(names);
  const auto* timesList = listOf(times);
  const auto* keysList = listOf(keys);
  if (!timesList)
    throw KeyframeError("The times must be a list");
  if (!keysList)
    throw KeyframeError("The keys must be a list");

  std::vector<JointTrack> tracks;
  // A single joint may be given its times and keys directly rather than in a list of one.
  if (joints.size() == 1 && !timesList->empty() && isNumber(timesList->front())) {
    tracks.push_back({joints[0], readKeys(bodyJoints()[joints[0]].name, times, keys)});
    return tracks;
  }
  if (timesList->size() != joints.size() || keysList->size() != joints.size()) {
    throw KeyframeError(std::to_string(joints.size()) + " joints but " +
                        std::to_string(timesList->size()) + " time lists and " +
                        std::to_string(keysList->size()) + " key lists");
  }
  for (std::size_t i = 0; i < joints.size(); ++i) {
    tracks.push_back(
        {joints[i], readKeys(bodyJoints()[joints[i]].name, (*timesList)[i], (*keysList)[i])});
  }
  return tracks;
}

}  // namespace robotsim
