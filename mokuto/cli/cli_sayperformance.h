#pragma once
// What `mokuto say` writes of a whole performance beside its live timeline: the audio
// (the speech and every sound mixed at the times they played) as a WAV file, and the
// viewer page, one self-contained HTML file that draws and plays it.
//
// Called by the command's main thread once the text is done.
#include <cstdint>
#include <ostream>
#include <string>

#include "cli_saytimeline.h"
#include "robotsim/robot.h"

namespace mokuto::cli {

// How often the joint angles are sampled for the page.
inline constexpr double kAngleSamplesPerSecond = 50;

struct PerformanceFiles {
  std::string wav;   // empty: none
  std::string html;  // empty: none
};

// Writes the files of the performance from `originUs` (the text handed to the service) to
// `endUs` on the robot's timeline, telling each on `out`; raises std::runtime_error when a
// file cannot be written.
void writePerformanceFiles(const PerformanceFiles& files, robotsim::Robot& robot,
                           const SayTimeline& timeline, const std::string& text,
                           const std::string& summary, std::int64_t originUs, std::int64_t endUs,
                           std::ostream& out);

}  // namespace mokuto::cli
