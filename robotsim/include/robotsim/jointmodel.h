#pragma once
// The simulated robot's upper body: its joints with their limits, maximum speeds and rest
// angles, and the chains that group them. Shared by the motion service, which moves the
// joints, and the behaviour manager, which checks the joints that a behaviour names.
//
// The table is constant; every function may be called from any thread.

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace robotsim {

struct JointInfo {
  std::string name;
  double minAngle = 0;  // radians (for a hand: 0 closed, 1 open)
  double maxAngle = 0;
  double maxSpeed = 0;  // radians (or hand fraction) per second
  double restAngle = 0;
};

// The joints in their fixed order: head, left arm, right arm.
const std::vector<JointInfo>& bodyJoints();

// The position of a joint in bodyJoints(); nothing for an unknown name.
std::optional<std::size_t> jointIndex(std::string_view name);

// The chain names: "Head", "LArm", "RArm", "Arms" (both arms) and "Body" (every joint).
const std::vector<std::string>& chainNames();
bool isChainName(std::string_view name);

// The joints named by a joint or chain name, in table order; empty for an unknown name.
std::vector<std::size_t> jointsOf(std::string_view jointOrChain);

// The angle brought into the joint's limits.
double clampToLimits(std::size_t joint, double angle);

}  // namespace robotsim
