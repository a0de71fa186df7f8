#include "cli_sayperformance.h"

#include <fstream>
#include <sstream>
#include <stdexcept>
#include <vector>

#include "ko/log.hpp"
#include "robotsim/performanceaudio.h"
#include "zefoko/viewer.h"

namespace mokuto::cli {

void writePerformanceFiles(const PerformanceFiles& files, robotsim::Robot& robot,
                           const SayTimeline& timeline, const std::string& text,
                           const std::string& summary, std::int64_t originUs, std::int64_t endUs,
                           std::ostream& out) {
  if (files.wav.empty() && files.html.empty())
    return;
  std::vector<std::string> skipped;
  const robotsim::PerformanceAudio audio =
      robotsim::mixPerformanceAudio(robot, originUs, endUs, &skipped);
  for (const auto& reason : skipped)
    KO_LOG_WARNING("mokuto.cli") << "A sound is left out of the audio: " << reason;
  if (!files.wav.empty()) {
    robotsim::writeWav(audio, files.wav);
    out << "Audio written to " << files.wav << std::endl;
  }
  if (files.html.empty())
    return;
  zefoko::viewer::RecordedPerformance page;
  page.title = "mokuto say";
  page.text = text;
  page.summary = summary;
  page.originUs = originUs;
  page.endUs = endUs;
  page.sampleUs = static_cast<std::int64_t>(1e6 / kAngleSamplesPerSecond);
  std::stringstream lines;
  timeline.writeJsonLines(lines);
  for (std::string line; std::getline(lines, line);)
    page.entries.push_back(nlohmann::json::parse(line));
  page.wav = robotsim::wavBytes(audio);
  std::ofstream html(files.html, std::ios::binary);
  html << zefoko::viewer::performancePage(page);
  if (!html.flush())
    throw std::runtime_error("cannot write " + files.html);
  out << "Viewer written to " << files.html << std::endl;
}

}  // namespace mokuto::cli
