#pragma once
// The performance viewer: HTML pages that draw the robot's timeline (the waveform, words,
// bookmarks, actions, behaviours, sounds, memory events, joint curves) and a front view of
// its upper body from the sampled joint angles. One page draws a recorded performance,
// self-contained (its timeline and audio inside it); the live page follows a running
// robot's timeline through server-sent events. The pages' sources are files of their own,
// built into the library.
//
// Pure functions: any thread.

#include <cstdint>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "robotsim/timeline.h"

namespace zefoko::viewer {

// A timeline entry as a JSON object: {"us", "service", "operation", "arguments", "result"}.
nlohmann::json entryJson(const robotsim::TimelineEntry& entry);

// The joints of the simulated body as the pages read them: [{"name", "min", "max",
// "rest"}], in the body's order.
nlohmann::json jointsJson();

struct RecordedPerformance {
  std::string title;
  std::string text;
  std::string summary;
  // The timeline's entries, as entryJson makes them, in order.
  nlohmann::json entries = nlohmann::json::array();
  // The timeline's time of the audio's first sample, and of the end of the performance.
  std::int64_t originUs = 0;
  std::int64_t endUs = 0;
  // The joint angles' sampling period.
  std::int64_t sampleUs = 20000;
  // The audio, a WAV file's bytes.
  std::string wav;
};

// One page, with no reference outside itself.
std::string performancePage(const RecordedPerformance& performance);

// The live page; it reads the events from "events" beside its own address.
std::string livePage(std::string_view title);

}  // namespace zefoko::viewer
