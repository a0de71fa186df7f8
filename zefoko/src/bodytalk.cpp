// zefoko bodytalk: runs the speaking body talk on the simulated robot for a while and
// prints what it did: each head move (joint, start angle, keys), each setAngles that puts
// the head back, each arm animation started and stopped.
#include <chrono>
#include <cstdio>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "commands.h"
#include "robotbodytalk/zurobotbodytalk.h"
#include "robotsim/robot.h"
#include "zu/enums.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace zefoko {

namespace {

struct BodyTalkOptions {
  double seconds = 10;
  std::string posture = "Standing";
  bool json = false;
};

bool isBodyTalkEntry(const robotsim::TimelineEntry& e) {
  if (e.service == "ZUMotion")
    return e.operation == "angleInterpolationBezier" || e.operation == "setAngles" ||
           e.operation == "stop";
  if (e.service == "ZUBehaviorManager")
    return e.operation == "startBehavior" || e.operation == "stopBehavior" ||
           e.operation == "behaviorStopped";
  return false;
}

const ko::AnyValue& plain(const ko::AnyValue& v) {
  return v.kind() == ko::Kind::Dynamic ? plain(v.asDynamic()) : v;
}
const ko::AnyValue& item(const ko::AnyValue& list, std::size_t i) {
  return plain(plain(list).asList().at(i));
}
std::size_t sizeOf(const ko::AnyValue& list) {
  return plain(list).asList().size();
}

std::string fixed(double value, int decimals) {
  char text[32];
  std::snprintf(text, sizeof text, "%.*f", decimals, value);
  return text;
}

// One line for an entry of isBodyTalkEntry.
std::string describe(const robotsim::TimelineEntry& e) {
  const ko::AnyValue& args = e.arguments;
  std::ostringstream out;
  if (e.operation == "angleInterpolationBezier") {
    // [names, duration, times, keys, start angles]
    for (std::size_t j = 0; j < sizeOf(item(args, 0)); ++j) {
      if (j > 0)
        out << "; ";
      const ko::AnyValue& times = item(item(args, 2), j);
      const ko::AnyValue& keys = item(item(args, 3), j);
      out << "head move " << item(item(args, 0), j).asString() << " from "
          << fixed(item(item(args, 4), j).to<double>(), 4) << ":";
      for (std::size_t k = 0; k < sizeOf(keys); ++k) {
        out << (k > 0 ? "," : "") << " " << fixed(item(times, k).to<double>(), 5) << " s -> "
            << fixed(item(item(keys, k), 0).to<double>(), 5);
      }
    }
  } else if (e.operation == "setAngles") {
    // [names, angles, fraction of the maximum speed]
    out << "head setAngles";
    for (std::size_t j = 0; j < sizeOf(item(args, 0)); ++j) {
      out << " " << item(item(args, 0), j).asString() << " "
          << fixed(item(item(args, 1), j).to<double>(), 4);
    }
    out << " at speed " << fixed(item(args, 2).to<double>(), 2);
  } else if (e.operation == "stop") {
    out << "head move stopped (task " << item(args, 0).to<int>() << ")";
  } else if (e.operation == "startBehavior") {
    out << "arms start " << item(args, 0).asString();
  } else if (e.operation == "stopBehavior") {
    out << "arms stop " << item(args, 0).asString();
  } else {
    out << "arms " << plain(e.result).asString() << " " << item(args, 0).asString();
  }
  return out.str();
}

int runBodyTalk(const BodyTalkOptions& o) {
  const ZU::PostureFamily family = ZU::postureFamilyFromStr(o.posture);
  robotsim::RobotOptions options;
  options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  try {
    robotsim::Robot robot(options);
    const auto& broker = robot.broker();
    broker->service("ZURobotPosture")->call<void>("setPostureFamily", o.posture);

    std::vector<std::string> speaking;
    const std::string prefix =
        std::string("animations/") + ZU::kPostureFamilyFolders[family] + "/BodyTalk/Speaking_";
    for (const auto& path : ZU::ZUBehaviorManagerProxy(broker).getInstalledBehaviors()) {
      if (path.rfind(prefix, 0) == 0)
        speaking.push_back(path);
    }

    ZU::ZURobotBodyTalkInstance handle(broker);
    ZU::ZURobotBodyTalk& bodyTalk = *handle.bodyTalk;
    const ko::AnyObject manager = broker->service("ZUBehaviorManager");
    const auto link = manager->connect(
        "behaviorStopped", [&bodyTalk](std::string path) { bodyTalk.onBehaviorStopped(path); });
    bodyTalk.getPosture()->init();
    bodyTalk.setSpeakingAnimations(family, speaking);

    robot.timeline()->clear();
    bodyTalk.start(ZU::ZURobotBodyTalk::kSpeaking, {}, true);
    std::this_thread::sleep_for(std::chrono::duration<double>(o.seconds));
    bodyTalk.stop();
    manager->disconnect(link);
    bodyTalk.getPosture()->exit();

    if (o.json) {
      robot.timeline()->writeJsonLines(std::cout, isBodyTalkEntry);
    } else {
      for (const auto& entry : robot.timeline()->entries()) {
        if (!isBodyTalkEntry(entry))
          continue;
        const std::string ms = fixed(static_cast<double>(entry.us) / 1000.0, 1);
        std::cout << std::string(ms.size() < 9 ? 9 - ms.size() : 0, ' ') << ms << " ms  "
                  << describe(entry) << '\n';
      }
    }
    std::cerr << "zefoko bodytalk: " << speaking.size() << " speaking animations for the "
              << o.posture << " posture, " << o.seconds << " s" << std::endl;
  } catch (const ZU::ZUError& e) {
    std::cerr << "zefoko bodytalk: " << e.description() << std::endl;
    return 1;
  } catch (const std::exception& e) {
    std::cerr << "zefoko bodytalk: " << e.what() << std::endl;
    return 1;
  }
  return 0;
}

}  // namespace

void addBodyTalkCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<BodyTalkOptions>();
  CLI::App* command = app.add_subcommand(
      "bodytalk",
      "Run the speaking body talk on the simulated robot and print its head moves and arm "
      "animations");
  command->add_option("--seconds", options->seconds, "How long it runs, above 0 and at most 3600")
      ->check(CLI::Validator(
          [](const std::string& value) {
            double seconds = 0;
            return CLI::detail::lexical_cast(value, seconds) && seconds > 0 && seconds <= 3600
                       ? std::string()
                       : value +
                             " is not a number of seconds above 0 and at "
                             "most 3600";
          },
          "SECONDS"))
      ->capture_default_str();
  command->add_option("--posture", options->posture, "The robot's posture family")
      ->check(CLI::IsMember({"Standing", "Sitting", "SittingOnChair"}))
      ->capture_default_str();
  command->add_flag("--json", options->json, "Print the timeline as JSON lines");
  command->callback([options, &status] { status = runBodyTalk(*options); });
}

}  // namespace zefoko
