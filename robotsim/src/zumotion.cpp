#include "robotsim/zumotion.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <sstream>
#include <utility>

#include "ko/eventloop.hpp"
#include "ko/log.hpp"
#include "robotsim/jointmodel.h"
#include "zu/zuerror.h"

namespace robotsim {

namespace {

constexpr const char* kCategory = "robotsim.motion";
constexpr const char* kClass = "ZUMotion";
constexpr std::size_t kLoopThreads = 4;

const std::vector<std::string> kBreathChains = {"Head", "LArm", "RArm"};

ko::AnyValue jointNameList(const std::vector<std::size_t>& joints) {
  ko::AnyValue::List names;
  for (const auto j : joints)
    names.emplace_back(bodyJoints()[j].name);
  return ko::AnyValue::list(std::move(names));
}

std::vector<std::size_t> jointsOfTracks(const std::vector<JointTrack>& tracks) {
  std::vector<std::size_t> joints;
  for (const auto& t : tracks)
    joints.push_back(t.joint);
  return joints;
}

double durationOf(const std::vector<JointTrack>& tracks) {
  double d = 0;
  for (const auto& t : tracks)
    d = std::max(d, t.keys.back().time);
  return d;
}

// The angles of setAngles: one number for every joint, or one per joint.
std::vector<double> targetAngles(const ko::AnyValue& value, std::size_t jointCount) {
  const ko::AnyValue* v = &value;
  while (v->kind() == ko::Kind::Dynamic)
    v = &v->asDynamic();
  std::vector<double> angles;
  try {
    if (v->kind() == ko::Kind::Int || v->kind() == ko::Kind::Float)
      angles.push_back(v->to<double>());
    else
      angles = v->to<std::vector<double>>();
  } catch (const ko::ConversionError&) {
    throw KeyframeError("The angles must be a number or a list of numbers, not " + v->toString());
  }
  if (angles.size() == 1 && jointCount > 1)
    angles.resize(jointCount, angles.front());
  if (angles.size() != jointCount) {
    throw KeyframeError(std::to_string(jointCount) + " joints but " +
                        std::to_string(angles.size()) + " angles");
  }
  for (const double a : angles) {
    if (!std::isfinite(a))
      throw KeyframeError("The angles must be finite");
  }
  return angles;
}

}  // namespace

ZUMotion::ZUMotion(const std::shared_ptr<ZU::ZUBroker>& broker, const std::string& name,
                   std::shared_ptr<Timeline> timeline)
    : ZU::ZUModule(broker, name), fTimeline(std::move(timeline)) {
  setModuleDescription("The simulated robot's upper body: joints, moves and breathing.");
  // Posted moves last as long as the move; they get threads of their own.
  setEventLoop(std::make_shared<ko::EventLoop>(name, kLoopThreads));
  for (const auto& chain : kBreathChains)
    fBreath[chain] = true;
  advertiseSignal<int, bool>("moveEnded");
  fMoveEnded = signal<int, bool>("moveEnded");
  fBody.setMoveEndListener(
      [this](int moveId, bool interrupted) { xOnMoveEnded(moveId, interrupted); });
  xBindMethods();
}

ZUMotion::~ZUMotion() {
  fBody.setMoveEndListener(nullptr);
  fBody.setAngleSampler({}, nullptr);
}

void ZUMotion::xBindMethods() {
  const ZU::ZUMethodParameter move{"moveId", "The id answered by _startBezierMove."};
  const std::vector<ZU::ZUMethodDeclaration> methods = {
      {"getAngles",
       &ZUMotion::getAngles,
       "Gets the angles of the joints.",
       {{"names", "A joint or chain name, or a list of them."},
        {"useSensors", "Whether to read the sensors (the commanded angles here)."}},
       {"angles", "The angles in radians, one per joint."}},
      {"setAngles",
       &ZUMotion::setAngles,
       "Moves joints towards angles and returns at once.",
       {{"names", "A joint or chain name, or a list of them."},
        {"angles", "One angle for all the joints, or one per joint, in radians."},
        {"fractionMaxSpeed", "The fraction of the maximum speed, up to 1."}}},
      {"angleInterpolationBezier",
       &ZUMotion::angleInterpolationBezier,
       "Moves joints through Bezier keys and returns when the move ends.",
       {{"jointNames", "A joint or chain name, or a list of them."},
        {"times", "The key times in seconds, one list per joint."},
        {"controlPoints",
         "The keys, one list per joint: [angle, [3, dTime, dAngle], [3, dTime, "
         "dAngle]]."}}},
      {"areResourcesAvailable",
       &ZUMotion::areResourcesAvailable,
       "Whether no move holds a joint of the named joints or chains.",
       {{"resourceNames", "Joint or chain names."}},
       {"available", "True when all of them are free."}},
      {"getBreathEnabled",
       &ZUMotion::getBreathEnabled,
       "Whether a chain breathes.",
       {{"chainName", "\"Head\", \"LArm\", \"RArm\", \"Arms\" or \"Body\"."}},
       {"enabled", "True when every joint chain named breathes."}},
      {"setBreathEnabled",
       &ZUMotion::setBreathEnabled,
       "Starts or stops the breathing of a chain.",
       {{"chainName", "\"Head\", \"LArm\", \"RArm\", \"Arms\" or \"Body\"."},
        {"isEnabled", "True to breathe."}}},
      {"_startBezierMove",
       &ZUMotion::_startBezierMove,
       "Starts a Bezier move and answers its id at once (for the behaviour manager).",
       {{"jointNames", "A joint or chain name, or a list of them."},
        {"times", "The key times in seconds, one list per joint."},
        {"controlPoints", "The keys, one list per joint."},
        {"minDuration", "The move holds its joints at least this long (seconds)."}},
       {"moveId", "The id of the move."}},
      {"_stopMove",
       &ZUMotion::_stopMove,
       "Ends a move at once.",
       {move},
       {"wasRunning", "False when the move had already ended."}},
      {"_isMoveRunning",
       &ZUMotion::_isMoveRunning,
       "Whether a move is running.",
       {move},
       {"running", "True while the move runs."}},
  };
  bindMethods(kClass, methods);
}

void ZUMotion::xRecord(const std::string& operation, ko::AnyValue arguments, ko::AnyValue result) {
  if (fTimeline)
    fTimeline->record(getName(), operation, std::move(arguments), std::move(result));
}

void ZUMotion::xWarnBeyondLimits(const std::string& method, const std::vector<JointTrack>& tracks) {
  for (const auto& track : tracks) {
    const auto& joint = bodyJoints()[track.joint];
    const auto beyond = std::find_if(track.keys.begin(), track.keys.end(), [&](const BezierKey& k) {
      return k.angle < joint.minAngle || k.angle > joint.maxAngle;
    });
    if (beyond != track.keys.end()) {
      KO_LOG_WARNING(kCategory) << method << ": " << joint.name << " asked for " << beyond->angle
                                << " beyond its limits [" << joint.minAngle << ", "
                                << joint.maxAngle << "]; clamped";
    }
  }
}

void ZUMotion::xOnMoveEnded(int moveId, bool interrupted) {
  xRecord("moveEnded", ko::AnyValue::list({moveId, interrupted}));
  (*fMoveEnded)(moveId, interrupted);
}

std::vector<float> ZUMotion::getAngles(const ko::AnyValue& names, bool useSensors) {
  (void)useSensors;
  std::vector<std::size_t> joints;
  try {
    joints = parseJointNames(names);
  } catch (const KeyframeError& e) {
    ZU_THROW_ERROR(getName(), "getAngles", e.what());
  }
  std::vector<float> out;
  for (const double a : fBody.angles(joints))
    out.push_back(static_cast<float>(a));
  return out;
}

void ZUMotion::setAngles(const ko::AnyValue& names, const ko::AnyValue& angles,
                         float fractionMaxSpeed) {
  std::vector<std::size_t> joints;
  std::vector<double> targets;
  try {
    joints = parseJointNames(names);
    targets = targetAngles(angles, joints.size());
  } catch (const KeyframeError& e) {
    ZU_THROW_ERROR(getName(), "setAngles", e.what());
  }
  if (!std::isfinite(fractionMaxSpeed) || fractionMaxSpeed <= 0) {
    ZU_THROW_ERROR(getName(), "setAngles",
                   "fractionMaxSpeed must be above 0 (and at most 1), not " +
                       std::to_string(fractionMaxSpeed));
  }
  for (std::size_t i = 0; i < joints.size(); ++i) {
    const auto& joint = bodyJoints()[joints[i]];
    if (targets[i] < joint.minAngle || targets[i] > joint.maxAngle) {
      KO_LOG_WARNING(kCategory) << "setAngles: " << joint.name << " asked for " << targets[i]
                                << " beyond its limits [" << joint.minAngle << ", "
                                << joint.maxAngle << "]; clamped";
    }
  }
  const int moveId = fBody.startSpeedMove(joints, targets, std::min(1.0f, fractionMaxSpeed));
  xRecord("setAngles",
          ko::AnyValue::list({jointNameList(joints), ko::AnyValue::from(targets),
                              static_cast<double>(fractionMaxSpeed)}),
          moveId);
}

void ZUMotion::angleInterpolationBezier(const ko::AnyValue& jointNames, const ko::AnyValue& times,
                                        const ko::AnyValue& controlPoints) {
  std::vector<JointTrack> tracks;
  try {
    tracks = parseBezierTracks(jointNames, times, controlPoints);
  } catch (const KeyframeError& e) {
    ZU_THROW_ERROR(getName(), "angleInterpolationBezier", e.what());
  }
  xWarnBeyondLimits("angleInterpolationBezier", tracks);
  const auto joints = jointsOfTracks(tracks);
  const std::vector<double> startAngles = fBody.angles(joints);
  const int moveId = fBody.startBezierMove(tracks);
  // What was asked, for the readers of the timeline: the keys are absolute, the start angles
  // those the joints had when the move began.
  xRecord("angleInterpolationBezier",
          ko::AnyValue::list({jointNameList(joints), durationOf(tracks), times, controlPoints,
                              ko::AnyValue::from(startAngles)}),
          moveId);

  // stop(id) looks the move up after setting the task's flag; the flag is read after the
  // move is registered, so one of the two sees the other.
  const auto task = currentTask();
  if (task) {
    {
      std::lock_guard lock(fMutex);
      fTaskMoves[task->id()] = moveId;
    }
    if (task->isStopRequested())
      fBody.stopMove(moveId);
  }
  fBody.waitMove(moveId, -1);
  if (task) {
    std::lock_guard lock(fMutex);
    fTaskMoves.erase(task->id());
  }
}

bool ZUMotion::areResourcesAvailable(const ko::AnyValue& resourceNames) {
  std::vector<std::size_t> joints;
  try {
    joints = parseJointNames(resourceNames);
  } catch (const KeyframeError& e) {
    ZU_THROW_ERROR(getName(), "areResourcesAvailable", e.what());
  }
  return !fBody.isAnyJointHeld(joints);
}

std::vector<std::string> ZUMotion::xBreathChains(const std::string& method,
                                                 const std::string& chain) {
  if (chain == "Body")
    return kBreathChains;
  if (chain == "Arms")
    return {"LArm", "RArm"};
  if (std::find(kBreathChains.begin(), kBreathChains.end(), chain) != kBreathChains.end())
    return {chain};
  ZU_THROW_ERROR(getName(), method, "Unknown chain name '" + chain + "'");
}

bool ZUMotion::getBreathEnabled(const std::string& chainName) {
  const auto chains = xBreathChains("getBreathEnabled", chainName);
  std::lock_guard lock(fMutex);
  return std::all_of(chains.begin(), chains.end(), [this](const auto& c) { return fBreath[c]; });
}

void ZUMotion::setBreathEnabled(const std::string& chainName, bool isEnabled) {
  const auto chains = xBreathChains("setBreathEnabled", chainName);
  {
    std::lock_guard lock(fMutex);
    for (const auto& c : chains)
      fBreath[c] = isEnabled;
  }
  xRecord("setBreathEnabled", ko::AnyValue::list({chainName, isEnabled}));
}

void ZUMotion::stop(int id) {
  ZU::ZUModule::stop(id);
  int moveId = 0;
  {
    std::lock_guard lock(fMutex);
    const auto it = fTaskMoves.find(id);
    if (it != fTaskMoves.end())
      moveId = it->second;
  }
  xRecord("stop", ko::AnyValue::list({id}));
  if (moveId != 0)
    fBody.stopMove(moveId);
}

void ZUMotion::exit() {
  fBody.stopAllMoves();
  ZU::ZUModule::exit();
}

int ZUMotion::_startBezierMove(const ko::AnyValue& jointNames, const ko::AnyValue& times,
                               const ko::AnyValue& controlPoints, float minDuration) {
  std::vector<JointTrack> tracks;
  try {
    tracks = parseBezierTracks(jointNames, times, controlPoints);
  } catch (const KeyframeError& e) {
    ZU_THROW_ERROR(getName(), "_startBezierMove", e.what());
  }
  xWarnBeyondLimits("_startBezierMove", tracks);
  const int moveId = fBody.startBezierMove(tracks, minDuration);
  xRecord("startBezierMove",
          ko::AnyValue::list({jointNameList(jointsOfTracks(tracks)),
                              std::max(durationOf(tracks), static_cast<double>(minDuration))}),
          moveId);
  return moveId;
}

void ZUMotion::sampleAngles(double perSecond) {
  if (!(perSecond > 0) || !std::isfinite(perSecond)) {
    fBody.setAngleSampler({}, nullptr);
    return;
  }
  const auto period = std::chrono::microseconds(static_cast<std::int64_t>(1e6 / perSecond));
  fBody.setAngleSampler(period, [this](const auto& angles) { xRecordAngles(angles); });
}

void ZUMotion::recordPose() {
  std::vector<std::size_t> joints(bodyJoints().size());
  for (std::size_t j = 0; j < joints.size(); ++j)
    joints[j] = j;
  const std::vector<double> angles = fBody.angles(joints);
  std::vector<std::pair<std::size_t, double>> pose;
  for (std::size_t j = 0; j < joints.size(); ++j)
    pose.emplace_back(j, angles[j]);
  xRecordAngles(pose);
}

void ZUMotion::xRecordAngles(const std::vector<std::pair<std::size_t, double>>& angles) {
  ko::AnyValue::Map map;
  for (const auto& [joint, angle] : angles) {
    // A hundred-thousandth of a radian is finer than any drawing.
    map.emplace_back(bodyJoints()[joint].name, std::round(angle * 1e5) / 1e5);
  }
  xRecord("angles", ko::AnyValue::map(std::move(map)));
}

bool ZUMotion::_stopMove(int moveId) {
  return fBody.stopMove(moveId);
}

bool ZUMotion::_isMoveRunning(int moveId) {
  return fBody.isMoveRunning(moveId);
}

}  // namespace robotsim
