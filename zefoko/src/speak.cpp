// zefoko speak: speaks an already bookmarked text ("Hello \mrk=1\ world") on the simulated
// robot, prints the timeline of what happened, and can write the speech to a WAV file.
#include <iostream>
#include <iterator>
#include <string>

#include "commands.h"
#include "robotsim/robot.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace zefoko {

namespace {

struct SpeakOptions {
  std::string text;
  std::string wav;
  std::string language = "English";
  bool timing = false;
  bool fast = false;
  bool json = false;
};

int speak(const SpeakOptions& o) {
  robotsim::RobotOptions options;
  options.speech.language = o.language;
  options.speech.notifications = true;
  if (o.timing)
    options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (o.fast)
    options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  try {
    robotsim::Robot robot(options);
    ZU::ZUTextToSpeechProxy tts(robot.broker());
    robot.timeline()->clear();
    const int id = tts.post_say(o.text);
    tts.wait(id, 0);
    if (o.json) {
      robot.timeline()->writeJsonLines(std::cout);
    } else {
      for (const auto& entry : robot.timeline()->entries())
        std::cout << entry << '\n';
    }
    if (!o.wav.empty()) {
      robot.speech()->saveRecording(o.wav);
      std::cerr << "zefoko speak: wrote " << o.wav << std::endl;
    }
  } catch (const ZU::ZUError& e) {
    std::cerr << "zefoko speak: " << e.description() << std::endl;
    return 1;
  } catch (const std::exception& e) {
    std::cerr << "zefoko speak: " << e.what() << std::endl;
    return 1;
  }
  return 0;
}

}  // namespace

void addSpeakCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<SpeakOptions>();
  CLI::App* command = app.add_subcommand(
      "speak",
      "Speak a bookmarked text on the simulated robot and print the timeline of its events");
  command->add_option("text", options->text,
                      "The text, with \\mrk=N\\, \\mrkpause=N\\ and \\pau=N\\ tags; read from "
                      "standard input when absent");
  command->add_option("--wav", options->wav, "Write the speech to this WAV file");
  command->add_option("--language", options->language, "The speech language")
      ->capture_default_str();
  command->add_flag("--timing", options->timing,
                    "Estimate durations from the text instead of synthesising speech");
  command->add_flag("--fast", options->fast, "Play as fast as possible instead of in real time");
  command->add_flag("--json", options->json, "Print the timeline as JSON lines");
  command->callback([options, &status] {
    if (options->text.empty()) {
      options->text.assign(std::istreambuf_iterator<char>(std::cin),
                           std::istreambuf_iterator<char>());
    }
    status = speak(*options);
  });
}

}  // namespace zefoko
