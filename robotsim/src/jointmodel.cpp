#include "robotsim/jointmodel.h"

#include <algorithm>

namespace robotsim {

namespace {

constexpr double kHeadSpeed = 8.0;
constexpr double kArmSpeed = 7.0;
constexpr double kHandSpeed = 3.0;

// The right arm mirrors the left one: rolls and yaws change sign, pitches do not.
std::vector<JointInfo> makeJoints() {
  std::vector<JointInfo> joints = {
      {"HeadYaw", -2.0, 2.0, kHeadSpeed, 0.0},
      {"HeadPitch", -0.65, 0.5, kHeadSpeed, 0.0},
  };
  const std::vector<JointInfo> leftArm = {
      {"LShoulderPitch", -2.0, 2.0, kArmSpeed, 1.45},
      {"LShoulderRoll", -0.3, 1.3, kArmSpeed, 0.15},
      {"LElbowYaw", -2.0, 2.0, kArmSpeed, -1.2},
      {"LElbowRoll", -1.55, -0.03, kArmSpeed, -0.45},
      {"LWristYaw", -1.8, 1.8, kArmSpeed, 0.1},
      {"LHand", 0.0, 1.0, kHandSpeed, 0.3},
  };
  joints.insert(joints.end(), leftArm.begin(), leftArm.end());
  for (const auto& left : leftArm) {
    JointInfo right = left;
    right.name[0] = 'R';
    const bool mirrored =
        left.name.find("Roll") != std::string::npos || left.name.find("Yaw") != std::string::npos;
    if (mirrored) {
      right.minAngle = -left.maxAngle;
      right.maxAngle = -left.minAngle;
      right.restAngle = -left.restAngle;
    }
    joints.push_back(right);
  }
  return joints;
}

bool startsWith(std::string_view text, std::string_view prefix) {
  return text.substr(0, prefix.size()) == prefix;
}

}  // namespace

const std::vector<JointInfo>& bodyJoints() {
  static const std::vector<JointInfo> joints = makeJoints();
  return joints;
}

std::optional<std::size_t> jointIndex(std::string_view name) {
  const auto& joints = bodyJoints();
  for (std::size_t i = 0; i < joints.size(); ++i) {
    if (joints[i].name == name)
      return i;
  }
  return std::nullopt;
}

const std::vector<std::string>& chainNames() {
  static const std::vector<std::string> names = {"Head", "LArm", "RArm", "Arms", "Body"};
  return names;
}

bool isChainName(std::string_view name) {
  const auto& names = chainNames();
  return std::find(names.begin(), names.end(), name) != names.end();
}

std::vector<std::size_t> jointsOf(std::string_view jointOrChain) {
  std::vector<std::size_t> out;
  if (isChainName(jointOrChain)) {
    const auto& joints = bodyJoints();
    for (std::size_t i = 0; i < joints.size(); ++i) {
      const std::string_view joint = joints[i].name;
      const bool member = jointOrChain == "Body" ||
                          (jointOrChain == "Head" && startsWith(joint, "Head")) ||
                          (jointOrChain == "LArm" && startsWith(joint, "L")) ||
                          (jointOrChain == "RArm" && startsWith(joint, "R")) ||
                          (jointOrChain == "Arms" && !startsWith(joint, "Head"));
      if (member)
        out.push_back(i);
    }
  } else if (const auto index = jointIndex(jointOrChain)) {
    out.push_back(*index);
  }
  return out;
}

double clampToLimits(std::size_t joint, double angle) {
  const auto& info = bodyJoints().at(joint);
  return std::clamp(angle, info.minAngle, info.maxAngle);
}

}  // namespace robotsim
