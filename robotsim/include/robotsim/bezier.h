#pragma once
// Cubic Bezier trajectories of one joint through timed keys, and the reading of the keys
// from the ko values in which the motion service receives them.
//
// A key is [angle, before-handle, after-handle]; a handle is [3, dTime, dAngle], an offset
// from the key (3 is the Bezier handle type). Between two keys the joint follows the cubic
// Bezier curve whose inner control points are the first key's after-handle and the second
// key's before-handle; before the first key it leaves its start angle (at time 0) with zero
// speed; after the last key it stays there. Pure values and functions: any thread.

#include <cstddef>
#include <stdexcept>
#include <string>
#include <vector>

#include "ko/anyvalue.hpp"

namespace robotsim {

struct BezierHandle {
  double dTime = 0;
  double dAngle = 0;
};

struct BezierKey {
  double time = 0;  // seconds from the start of the move
  double angle = 0;
  BezierHandle before;
  BezierHandle after;
};

// The value at `t` of the curve (t0, a0) (t1, a1) (t2, a2) (t3, a3) with t0 <= t1, t2 <= t3,
// read as an angle over time: the curve parameter is found where its time equals t.
// Times outside [t0, t3] give the end values.
double bezierSegmentValue(double t0, double a0, double t1, double a1, double t2, double a2,
                          double t3, double a3, double t);

// One joint's trajectory. Handles reaching beyond the neighbouring key are shortened to it,
// which keeps the curve a function of time.
class BezierCurve {
 public:
  BezierCurve() = default;
  // `keys` have strictly increasing positive times (parseBezierTracks checks them).
  BezierCurve(double startAngle, std::vector<BezierKey> keys);

  double valueAt(double t) const;
  // The time of the last key; 0 without keys.
  double duration() const;
  const std::vector<BezierKey>& keys() const noexcept { return fKeys; }

 private:
  double fStartAngle = 0;
  std::vector<BezierKey> fKeys;
};

// The keys of one joint, as given to a Bezier move.
struct JointTrack {
  std::size_t joint = 0;  // index in bodyJoints()
  std::vector<BezierKey> keys;
};

// Raised for names, times or keys of the wrong shape; what() says what is wrong.
class KeyframeError : public std::invalid_argument {
 public:
  using std::invalid_argument::invalid_argument;
};

// Reads the arguments of a Bezier move: `names` a joint name, a chain name or a list of
// them; `times` one list of key times per joint (or a single list for a single joint);
// `keys` one list of keys per joint. A key is [angle, [3, dTime, dAngle], [3, dTime,
// dAngle]] or a bare angle (handles a third of the way to the neighbouring keys, flat).
// Times must be positive and strictly increasing; every number finite.
std::vector<JointTrack> parseBezierTracks(const ko::AnyValue& names, const ko::AnyValue& times,
                                          const ko::AnyValue& keys);

// The joints named by a joint name, a chain name or a list of them, in the order given
// (a chain in table order); raises KeyframeError for an unknown name or a value of another
// kind.
std::vector<std::size_t> parseJointNames(const ko::AnyValue& names);

}  // namespace robotsim
