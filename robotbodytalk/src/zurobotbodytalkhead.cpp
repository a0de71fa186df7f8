#include "zurobotbodytalkhead.h"

#include <cstdlib>
#include <exception>
#include <utility>

#include "ko/log.hpp"
#include "robotbodytalk/zurobotbodytalkposture.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"
#include "zurobotbodytalkshuffle.h"

namespace ZU {

namespace {

constexpr const char* kCategory = "robotbodytalk";
// The Bezier handle type of the motion service.
constexpr int kBezierHandle = 3;

ZUValue handle(const ZUValue& dTime, const ZUValue& dAngle) {
  return ZUValue::makeArray({kBezierHandle, dTime, dAngle});
}

ZURobotBodyTalkHeadMove move(const char* joint, const ZUValue& times, const ZUValue& keys) {
  return {ZUValue::makeArray({joint}), ZUValue::makeArray({times}), ZUValue::makeArray({keys})};
}

// The speaking table is all 32-bit floats but for the handle type.
ZUValue speakingKey(float angle, float before, float after) {
  return ZUValue::makeArray({angle, handle(before, 0.0f), handle(after, 0.0f)});
}

// The listening table keeps its zeros (angles, offsets) as integers.
ZUValue listeningKey(const ZUValue& angle, const ZUValue& before, const ZUValue& after) {
  return ZUValue::makeArray({angle, handle(before, 0), handle(after, 0)});
}

}  // namespace

ZURobotBodyTalkHead::ZURobotBodyTalkHead(const std::shared_ptr<ZUBroker>& broker,
                                         std::shared_ptr<ZURobotBodyTalkPosture> posture,
                                         ZURobotBodyTalkTime time,
                                         std::vector<ZURobotBodyTalkHeadMove> moves)
    : ZURobotBodyTalkBodyPart(std::move(posture)),
      fTime(time),
      fMotion(std::make_shared<ZUMotionProxy>(broker)),
      fMoves(std::move(moves)) {}

ZURobotBodyTalkHead::~ZURobotBodyTalkHead() = default;

void ZURobotBodyTalkHead::onBehaviorStopped(const std::string& name) {
  (void)name;
}

std::string ZURobotBodyTalkHead::getName() const {
  return "Head";
}

void ZURobotBodyTalkHead::doOneIteration() {
  if (fMoves.empty())
    return;
  try {
    if (!fMotion->areResourcesAvailable(fResources))
      return;
    if (fPosture->getActivePostureFamily() == Unknown) {
      KO_LOG_WARNING(kCategory) << "Cannot move the head in that posture";
      return;
    }
    const ZURobotBodyTalkHeadMove& current = fMoves[fCurrentMove];
    ZUValue keys = current.keys;
    const int jointCount = current.names.arraySize();
    std::vector<float> startAngles;
    for (int i = 0; i < jointCount; ++i) {
      const std::vector<float> angles = fMotion->getAngles(current.names[i], false);
      if (angles.empty()) {
        ZU_THROW_ERROR("ZUMotion", "getAngles",
                       "No angle for the joint " + current.names[i].toString());
      }
      const float start = angles.front();
      startAngles.push_back(start);
      ZUValue& jointKeys = keys[i];
      for (int k = 0; k < jointKeys.arraySize(); ++k) {
        ZUValue& angle = jointKeys[k][0];
        angle = static_cast<float>(angle.asFloat()) + start;
      }
    }

    if (isRunning()) {
      const int id = fMotion->post_angleInterpolationBezier(current.names, current.times, keys);
      fMotionTask.store(id);
      // A stop that came between the check and the post found no move to stop.
      if (!isRunning())
        xStopMove();
      if (id != -1 && fMotion->wait(id, fTime.msOf(kMoveLimitMs))) {
        KO_LOG_WARNING(kCategory) << "Aborting head move in body language which did not stop "
                                     "after 10s";
        fMotion->stop(id);
      }
    }
    if (isRunning()) {
      for (int i = 0; i < jointCount; ++i)
        fMotion->setAngles(current.names[i], startAngles[static_cast<std::size_t>(i)], 1.0f);
    }
    fMotionTask.store(-1);
    afterIteration();
  } catch (const std::exception& e) {
    fMotionTask.store(-1);
    KO_LOG_WARNING(kCategory) << "ZUMotion exception: " << e.what();
  }
}

void ZURobotBodyTalkHead::afterIteration() {
  if (fCurrentMove + 1 < fMoves.size()) {
    ++fCurrentMove;
    return;
  }
  fCurrentMove = 0;
  bodyTalkShuffle(fMoves);
  fShuffleCount.fetch_add(1);
}

int ZURobotBodyTalkHead::getPause() {
  return 1 + std::rand() % 5;
}

void ZURobotBodyTalkHead::stop() {
  xStopMove();
}

void ZURobotBodyTalkHead::xStopMove() {
  const int id = fMotionTask.exchange(-1);
  if (id == -1)
    return;
  try {
    fMotion->stop(id);
  } catch (const std::exception& e) {
    KO_LOG_WARNING(kCategory) << "Error while stopping a head move (by ZUMotion proxy) "
                              << "exception: " << e.what();
  }
}

// ---- speaking ---------------------------------------------------------------------------

ZURobotBodyTalkHeadSpeaking::ZURobotBodyTalkHeadSpeaking(
    const std::shared_ptr<ZUBroker>& broker, std::shared_ptr<ZURobotBodyTalkPosture> posture,
    ZURobotBodyTalkTime time)
    : ZURobotBodyTalkHead(broker, std::move(posture), time, makeMoves()) {}

int ZURobotBodyTalkHeadSpeaking::getStartDelay() {
  return 0;
}

std::vector<ZURobotBodyTalkHeadMove> ZURobotBodyTalkHeadSpeaking::makeMoves() {
  const auto times = [](std::initializer_list<ZUValue> t) { return ZUValue::makeArray(t); };
  const auto keys = [](std::initializer_list<ZUValue> k) { return ZUValue::makeArray(k); };
  return {
      move("HeadPitch", times({0.45833f, 1.0f}),
           keys({speakingKey(0.16127f, -0.15278f, 0.18056f), speakingKey(0.0f, -0.18056f, 0.0f)})),
      move("HeadYaw", times({0.45833f, 0.875f, 1.29167f}),
           keys({speakingKey(-0.15708f, -0.15278f, 0.13889f),
                 speakingKey(0.10472f, -0.13889f, 0.13889f), speakingKey(0.0f, -0.13889f, 0.0f)})),
      move("HeadPitch", times({0.5f, 0.875f, 1.41667f}),
           keys({speakingKey(-0.06736f, -0.16667f, 0.125f),
                 speakingKey(-0.08133f, -0.125f, 0.18056f), speakingKey(0.0f, -0.18056f, 0.0f)})),
      move("HeadPitch", times({0.5f, 1.33333f, 2.04167f}),
           keys({speakingKey(0.1316f, -0.16667f, 0.27778f),
                 speakingKey(0.16651f, -0.27778f, 0.23611f), speakingKey(0.0f, -0.23611f, 0.0f)})),
      move("HeadPitch", times({0.41667f, 1.25f}),
           keys({speakingKey(0.06877f, -0.13889f, 0.27778f), speakingKey(0.0f, -0.27778f, 0.0f)})),
      move("HeadYaw", times({0.41667f, 0.95833f}),
           keys({speakingKey(-0.17453f, -0.13889f, 0.18056f), speakingKey(0.0f, -0.18056f, 0.0f)})),
      move("HeadYaw", times({0.41667f, 0.79167f, 1.29167f}),
           keys({speakingKey(-0.15708f, -0.13889f, 0.125f),
                 speakingKey(0.05236f, -0.125f, 0.16667f), speakingKey(0.0f, -0.16667f, 0.0f)})),
      move("HeadPitch", times({0.54167f, 1.25f}),
           keys({speakingKey(-0.1494f, -0.18056f, 0.23611f), speakingKey(0.0f, -0.23611f, 0.0f)})),
  };
}

// ---- listening --------------------------------------------------------------------------

ZURobotBodyTalkHeadListening::ZURobotBodyTalkHeadListening(
    const std::shared_ptr<ZUBroker>& broker, std::shared_ptr<ZURobotBodyTalkPosture> posture,
    ZURobotBodyTalkTime time, int robotType)
    : ZURobotBodyTalkHead(broker, std::move(posture), time, makeMoves(robotType)) {}

int ZURobotBodyTalkHeadListening::getStartDelay() {
  return 1 + std::rand() % 5;
}

std::vector<ZURobotBodyTalkHeadMove> ZURobotBodyTalkHeadListening::makeMoves(int robotType) {
  const auto times = [](std::initializer_list<ZUValue> t) { return ZUValue::makeArray(t); };
  const auto keys = [](std::initializer_list<ZUValue> k) { return ZUValue::makeArray(k); };
  if (robotType != 0) {
    return {
        move("HeadPitch", times({0.2, 0.48, 1}),
             keys({listeningKey(-0.0401426, -0.0666667, 0.0933333),
                   listeningKey(0.150098, -0.0933333, 0.173333), listeningKey(0, -0.173333, 0)})),
        move("HeadPitch", times({0.16, 0.28, 0.4, 0.68}),
             keys({listeningKey(0.067026847, -0.0533333, 0.04),
                   listeningKey(0.025830647, -0.04, 0.04),
                   listeningKey(0.083170947, -0.04, 0.0933333), listeningKey(0, -0.0933333, 0)})),
        move("HeadPitch", times({0.24, 0.56, 1.04}),
             keys({listeningKey(-0.0827408, -0.08, 0.106667),
                   listeningKey(0.0859654, -0.106667, 0.16), listeningKey(0, -0.16, 0)})),
    };
  }
  return {
      move("HeadPitch", times({0.2, 0.48}),
           keys({listeningKey(0.190308, -0.0666667, 0.0933333), listeningKey(0, -0.0933333, 0)})),
      move("HeadPitch", times({0.36, 0.6, 1.04}),
           keys({listeningKey(-0.144863, -0.12, 0.08), listeningKey(0.18675, -0.08, 0.146667),
                 listeningKey(0, -0.146667, 0)})),
  };
}

}  // namespace ZU
