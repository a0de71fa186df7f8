// zefoko speak: speaks an already bookmarked text ("Hello \mrk=1\ world") on the simulated
// robot, prints the timeline of what happened, and can write the speech to a WAV file.
#include <iostream>
#include <iterator>
#include <optional>
#include <string>

#include "commands.h"
#include "robotsim/robot.h"
#include "zu/zuerror.h"
#include "zu/zuserviceproxies.h"

namespace zefoko {

namespace {

struct SpeakOptions {
  std::optional<std::string> text;
  std::string wav;
  std::string language = "English";
  std::string speech = "espeak";
  bool fast = false;
  bool json = false;
};

int speak(const SpeakOptions& o, const std::string& text) {
  robotsim::RobotOptions options;
  options.speech.language = o.language;
  options.speech.notifications = true;
  if (o.speech == "timing")
    options.speech.backend = robotsim::ZUTextToSpeechOptions::Backend::Timing;
  if (o.fast)
    options.speech.playbackRate = robotsim::kSpeechAsFastAsPossible;
  try {
    robotsim::Robot robot(options);
    ZU::ZUTextToSpeechProxy tts(robot.broker());
    robot.timeline()->clear();
    const int id = tts.post_say(text);
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
                      "standard input when absent or \"-\"");
  command->add_option("--wav", options->wav, "Write the speech to this WAV file")
      ->type_name("FILE");
  command->add_option("--language", options->language, "The speech engine's language")
      ->check(CLI::IsMember({"English", "French", "Japanese"}))
      ->capture_default_str();
  command
      ->add_option("--speech", options->speech,
                   "The speech engine: espeak (real speech) or timing (durations estimated "
                   "from the text, no audio)")
      ->check(CLI::IsMember({"espeak", "timing"}))
      ->capture_default_str();
  command->add_flag("--fast", options->fast,
                    "Play as fast as possible instead of in real time (default: real time)");
  command->add_flag("--json", options->json, "Print the timeline as JSON lines");
  command->callback([options, &status] {
    std::string text;
    if (options->text && *options->text != "-")
      text = *options->text;
    else
      text.assign(std::istreambuf_iterator<char>(std::cin), std::istreambuf_iterator<char>());
    status = speak(*options, text);
  });
}

}  // namespace zefoko
