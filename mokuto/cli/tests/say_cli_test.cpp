// `mokuto say` and the service's inspection commands, run as a user runs them: the
// executable with its arguments, its status, its output and the files it writes.
#include <gtest/gtest.h>
#include <sndfile.h>
#include <sys/wait.h>

#include <algorithm>
#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

namespace {

using Json = nlohmann::json;

// In random mode a text keeps only its own actions (no automatic tags), so that the
// tests below can name them one by one.
const std::string kText =
    "Hello ^start(animations/Stand/Gestures/Hey_1) my friend "
    "^wait(animations/Stand/Gestures/Hey_1) bye ^runSound(bells/ding, 50) $done=1";

struct Ran {
  int status = -1;
  std::string out;
  std::string err;
};

std::string quoted(const std::string& text) {
  std::string out = "'";
  for (const char c : text)
    out += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return out + "'";
}

std::string readFile(const std::filesystem::path& path) {
  std::ifstream in(path);
  std::stringstream text;
  text << in.rdbuf();
  return text.str();
}

class MokutoCommand : public ::testing::Test {
 protected:
  void SetUp() override {
    folder = std::filesystem::temp_directory_path() /
             ("mokuto_say_" + std::to_string(::getpid()) + "_" +
              ::testing::UnitTest::GetInstance()->current_test_info()->name());
    std::filesystem::create_directories(folder);
  }
  void TearDown() override { std::filesystem::remove_all(folder); }

  Ran run(const std::string& arguments, const std::string& input = {}) const {
    std::string command = std::string(MOKUTO_EXECUTABLE) + " " + arguments;
    command += input.empty() ? " </dev/null" : " <" + quoted((folder / "in.txt").string());
    if (!input.empty())
      std::ofstream(folder / "in.txt") << input;
    command += " >" + quoted((folder / "out.txt").string()) + " 2>" +
               quoted((folder / "err.txt").string());
    Ran result;
    const int raw = std::system(command.c_str());
    result.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
    result.out = readFile(folder / "out.txt");
    result.err = readFile(folder / "err.txt");
    return result;
  }

  std::vector<Json> timeline() const {
    std::vector<Json> lines;
    std::ifstream in(folder / "timeline.jsonl");
    for (std::string line; std::getline(in, line);)
      lines.push_back(Json::parse(line));
    return lines;
  }

  std::filesystem::path folder;
};

// Index of the first entry that `match` accepts at or after `from`, or -1.
template <class Match>
long find(const std::vector<Json>& lines, Match match, std::size_t from = 0) {
  for (std::size_t k = from; k < lines.size(); ++k) {
    if (match(lines[k]))
      return static_cast<long>(k);
  }
  return -1;
}

auto entry(const std::string& service, const std::string& operation) {
  return [service, operation](const Json& line) {
    return line["service"] == service && line["operation"] == operation;
  };
}

auto entryWith(const std::string& service, const std::string& operation, std::size_t k,
               const Json& value) {
  return [=](const Json& line) {
    return line["service"] == service && line["operation"] == operation &&
           line["arguments"].size() > k && line["arguments"][k] == value;
  };
}

std::vector<Json> actionsOf(const std::vector<Json>& lines) {
  std::vector<Json> actions;
  for (const auto& line : lines) {
    if (entry("ZUMokuto", "action")(line))
      actions.push_back(line["arguments"]);
  }
  return actions;
}

TEST_F(MokutoCommand, SaysAnAnnotatedTextOnTheTimingEngine) {
  const Ran r = run("say --mode random --speech timing --fast --timeline " +
                    quoted((folder / "timeline.jsonl").string()) + " " + quoted(kText));
  ASSERT_EQ(r.status, 0) << r.err;
  EXPECT_NE(r.out.find("actions: 4 executed, 0 skipped"), std::string::npos) << r.out;
  EXPECT_NE(r.out.find("instruction errors: 0"), std::string::npos) << r.out;
  const auto lines = timeline();
  ASSERT_FALSE(lines.empty());

  const long say = find(lines, entryWith("ZUMokuto", "say", 0, 1));
  ASSERT_EQ(say, 0);
  const long speech = find(lines, entry("ZUTextToSpeech", "say"));
  ASSERT_GE(speech, 0);
  const int speechId = lines[static_cast<std::size_t>(speech)]["arguments"][0];
  std::vector<long> bookmarks;
  for (const int number : {1, 2, 3, 4}) {
    // The engine raises a bookmark's event, then records the bookmark; a blocking one
    // it records before the call that holds the speech.
    const long at = find(lines, [&](const Json& line) {
      return (line["service"] == "ZUTextToSpeech" &&
              (line["operation"] == "bookmark" || line["operation"] == "hold") &&
              line["arguments"] == Json::array({speechId, number})) ||
             (line["service"] == "ZUMemory" && line["operation"] == "raiseEvent" &&
              line["arguments"] == Json::array({"ZUTextToSpeech/CurrentBookMark", number}));
    });
    EXPECT_GE(at, 0) << "bookmark " << number;
    bookmarks.push_back(at);
  }
  const auto actions = actionsOf(lines);
  ASSERT_EQ(actions.size(), 4u);
  const std::vector<std::string> types = {"START", "WAIT", "RUN_SOUND", "AFFECTATION"};
  for (std::size_t k = 0; k < actions.size(); ++k) {
    SCOPED_TRACE(actions[k].dump());
    EXPECT_EQ(actions[k]["bookmark"], k + 1);
    EXPECT_EQ(actions[k]["type"], types[k]);
    EXPECT_EQ(actions[k]["outcome"], "executed");
    EXPECT_TRUE(actions[k]["error"].is_null());
    ASSERT_TRUE(actions[k]["bookmarkUs"].is_number());
    EXPECT_GE(actions[k]["startUs"].get<std::int64_t>(),
              actions[k]["bookmarkUs"].get<std::int64_t>());
    EXPECT_GE(actions[k]["endUs"].get<std::int64_t>(), actions[k]["startUs"].get<std::int64_t>());
  }

  const std::string hey = "animations/Stand/Gestures/Hey_1";
  const long started = find(lines, entryWith("ZUBehaviorManager", "startBehavior", 0, hey));
  const long stopped = find(lines, entryWith("ZUBehaviorManager", "behaviorStopped", 0, hey));
  ASSERT_GE(started, 0);
  ASSERT_GE(stopped, 0);
  EXPECT_GT(started, bookmarks[0]);
  EXPECT_LE(lines[static_cast<std::size_t>(stopped)]["us"].get<std::int64_t>(),
            actions[1]["endUs"].get<std::int64_t>());
  EXPECT_GE(find(lines, entryWith("ZUAudioPlayer", "playSoundSetFile", 0, "bells")), bookmarks[2]);
  const long done = find(lines, entryWith("ZUMemory", "raiseEvent", 0, "done"));
  EXPECT_GE(done, bookmarks[3]);

  // The end event is the last thing the robot did for the text (the body talk may still
  // be settling); the service's "end" closes the timeline with the summary's figures.
  const long end = find(lines, entryWith("ZUMemory", "raiseEvent", 0, "ZUMokuto/EndOfMokuto"));
  ASSERT_GT(end, done);
  EXPECT_EQ(lines[static_cast<std::size_t>(end)]["arguments"][1], 1);
  for (std::size_t k = static_cast<std::size_t>(end) + 1; k < lines.size(); ++k) {
    const Json& line = lines[k];
    EXPECT_FALSE(
        line["service"] == "ZUTextToSpeech" || line["service"] == "ZUAudioPlayer" ||
        line["operation"] == "raiseEvent" ||
        (line["arguments"].is_array() && !line["arguments"].empty() && line["arguments"][0] == hey))
        << line.dump();
  }
  const Json& last = lines.back();
  EXPECT_TRUE(entry("ZUMokuto", "end")(last)) << last.dump();
  EXPECT_EQ(last["result"]["executed"], 4);
  EXPECT_TRUE(last["result"]["syncMedianUs"].is_number());
}

struct Sound {
  std::vector<float> samples;
  int rate = 0;
};

Sound readSound(const std::filesystem::path& path) {
  SF_INFO info{};
  SNDFILE* file = sf_open(path.c_str(), SFM_READ, &info);
  EXPECT_NE(file, nullptr) << path << ": " << sf_strerror(nullptr);
  if (!file)
    return {};
  Sound sound{std::vector<float>(static_cast<std::size_t>(info.frames * info.channels)),
              info.samplerate};
  sf_readf_float(file, sound.samples.data(), info.frames);
  sf_close(file);
  return sound;
}

// The loudness of seconds [from, to) of a sound.
double rms(const Sound& sound, double from, double to) {
  const auto rate = static_cast<double>(sound.rate);
  const auto begin = static_cast<std::size_t>(std::max(0.0, from) * rate);
  const auto end = std::min(sound.samples.size(), static_cast<std::size_t>(to * rate));
  double sum = 0;
  for (std::size_t i = begin; i < end; ++i)
    sum += static_cast<double>(sound.samples[i]) * sound.samples[i];
  return end > begin ? std::sqrt(sum / static_cast<double>(end - begin)) : 0.0;
}

TEST_F(MokutoCommand, TheWavHoldsTheSpeechAndEverySoundAtItsTime) {
  struct Case {
    const char* name;
    std::string options;
    std::string text;
    const char* sound;  // of the set "bells"
    double volume;
    bool stopped;
  };
  const std::vector<Case> cases = {
      // The README's example: the speech waits while the sound plays.
      {"the README's example", "",
       "Hello ^start(animations/Stand/Gestures/Hey_1) my friend, "
       "^wait(animations/Stand/Gestures/Hey_1) how are you today? ^runSound(bells/ding, 50) "
       "$greeted=1 See you soon!",
       "ding", 0.5, false},
      // No speech audio from the timing engine: the sound alone, cut at its stop.
      {"a sound that the text stops", "--speech timing --mode disabled",
       "^startSound(bells/chime, 100) Hi ^stopSound(bells/chime) there", "chime", 1.0, true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const Ran r = run("say " + c.options + " --wav " + quoted((folder / "out.wav").string()) +
                      " --timeline " + quoted((folder / "timeline.jsonl").string()) + " " +
                      quoted(c.text));
    ASSERT_EQ(r.status, 0) << r.err;
    const auto lines = timeline();
    const long play = find(lines, entryWith("ZUAudioPlayer", "playSoundSetFile", 1, c.sound));
    const long end = find(lines, [&](const Json& line) {
      return line["service"] == "ZUAudioPlayer" && line["arguments"].size() == 2 &&
             (line["operation"] == "soundEnded" || line["operation"] == "soundStopped");
    });
    ASSERT_GE(play, 0);
    ASSERT_GT(end, play);
    EXPECT_EQ(lines[static_cast<std::size_t>(end)]["operation"],
              c.stopped ? "soundStopped" : "soundEnded");
    // The audio begins when the text is handed to the service, as the timeline does.
    const double start = lines[static_cast<std::size_t>(play)]["us"].get<double>() / 1e6;
    const double stop = lines[static_cast<std::size_t>(end)]["us"].get<double>() / 1e6;
    const Sound wav = readSound(folder / "out.wav");
    const Sound file = readSound(std::filesystem::path(MOKUTO_SOUNDS_DIR) / "bells" /
                                 (std::string(c.sound) + ".wav"));
    // 10 ms inside either end: the times of the timeline are those of the calls.
    const double heard = rms(wav, start + 0.01, stop - 0.01);
    const double expected = c.volume * rms(file, 0.01, stop - start - 0.01);
    EXPECT_NEAR(heard, expected, expected * 0.15) << "from " << start << " s to " << stop << " s";
    if (c.stopped) {
      EXPECT_EQ(rms(wav, stop + 0.005, static_cast<double>(wav.samples.size()) / wav.rate), 0.0);
      EXPECT_GT(rms(file, stop - start + 0.005, 1.0), 0.01) << "the file goes on after the stop";
    } else {
      // Speech, not silence, around it: a few tenths of a second of clearly non-zero samples.
      const auto loud = std::count_if(wav.samples.begin(), wav.samples.end(),
                                      [](float v) { return std::fabs(v) > 0.05F; });
      EXPECT_GT(loud, wav.rate / 10);
      for (const auto& action : actionsOf(lines)) {
        SCOPED_TRACE(action.dump());
        EXPECT_EQ(action["outcome"], "executed");
        ASSERT_TRUE(action["bookmarkUs"].is_number());
        EXPECT_GE(action["startUs"].get<std::int64_t>(), action["bookmarkUs"].get<std::int64_t>());
      }
    }
  }
}

TEST_F(MokutoCommand, ExitStatusTellsAnUnusableArgumentFromATextWithErrors) {
  struct Case {
    std::string arguments;
    int status;
    std::string message;  // on standard error (status 2) or output (status 0)
  };
  const std::vector<Case> cases = {
      {"say --mode wild 'Hi'", 2, "--mode: wild not in {disabled,random,contextual}"},
      {"say --speech festival 'Hi'", 2, "--speech"},
      {"say --config '[[\"msPauseBeforeSpeech\", ' 'Hi'", 2, "--config: invalid JSON"},
      {"say --tags-to-words '{\"a\": 1}' 'Hi'", 2, "--tags-to-words takes a JSON array"},
      {"say --wav /no/such/folder/x.wav 'Hi'", 2, "--wav: no folder /no/such/folder"},
      {"say --speech timing --fast '  '", 2, "the text is empty"},
      {"say --bogus 'Hi'", 2, "--bogus"},
      {"animations", 2, "tag is required"},
      {"say --speech timing --fast --quiet 'Hi ^foo(x) and ^start(no/such/animation) there'", 0,
       "instruction errors: 2"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.arguments);
    const Ran r = run(c.arguments);
    EXPECT_EQ(r.status, c.status) << r.out << r.err;
    EXPECT_NE((c.status == 0 ? r.out : r.err).find(c.message), std::string::npos) << r.out << r.err;
  }
}

TEST_F(MokutoCommand, CtrlCStopsTheTextAndStillGivesTheSummary) {
  // The shell prints the command's process id, then becomes the command, which reads the
  // text from its standard input.
  std::ofstream(folder / "in.txt") << kText;
  const std::string command = "sh -c 'echo $$; exec " + std::string(MOKUTO_EXECUTABLE) +
                              " say --speech timing' <" + quoted((folder / "in.txt").string()) +
                              " 2>/dev/null";
  FILE* pipe = ::popen(command.c_str(), "r");
  ASSERT_NE(pipe, nullptr);
  std::string out;
  char buffer[4096];
  ASSERT_NE(std::fgets(buffer, sizeof buffer, pipe), nullptr);
  const pid_t pid = static_cast<pid_t>(std::stol(buffer));
  bool sent = false;
  while (std::fgets(buffer, sizeof buffer, pipe)) {
    out += buffer;
    // The speech waits there for the gesture's end: the text is in full swing.
    if (!sent && out.find("bookmark 2 (the speech waits") != std::string::npos)
      sent = ::kill(pid, SIGINT) == 0;
  }
  const int raw = ::pclose(pipe);
  ASSERT_TRUE(sent) << out;
  EXPECT_EQ(WIFEXITED(raw) ? WEXITSTATUS(raw) : -1, 130) << out;
  EXPECT_NE(out.find("^runSound(bells/ding, 50)  stopped"), std::string::npos) << out;
  EXPECT_NE(out.find("Text 1 stopped after"), std::string::npos) << out;
  // The "^wait" is stopped too when the stop comes before the director has begun it.
  EXPECT_TRUE(out.find(", 2 stopped") != std::string::npos ||
              out.find(", 3 stopped") != std::string::npos)
      << out;
}

TEST_F(MokutoCommand, ReadsTheTextFromStandardInput) {
  const Ran r =
      run("say --speech timing --fast -", "One ^start(animations/Stand/Gestures/Hey_1) two");
  ASSERT_EQ(r.status, 0) << r.err;
  EXPECT_NE(r.out.find("^start(animations/Stand/Gestures/Hey_1)  executed"), std::string::npos)
      << r.out;
  EXPECT_NE(r.out.find("behaviour started animations/Stand/Gestures/Hey_1"), std::string::npos);
}

TEST_F(MokutoCommand, DryRunShowsWhatTheLoaderResolvedWithoutSpeaking) {
  const Ran r = run("say --mode random --speech timing --dry-run --timeline " +
                    quoted((folder / "timeline.jsonl").string()) +
                    " 'Hi ^start(animations/Stand/Gestures/Hey_1) and ^run(no/such) "
                    "^runSound(bells/ding) $x=2'");
  ASSERT_EQ(r.status, 0) << r.err;
  const Json job = Json::parse(r.out);
  ASSERT_EQ(job["actions"].size(), 4u);
  EXPECT_EQ(job["actions"][0]["resolved"]["animation"], "animations/Stand/Gestures/Hey_1");
  EXPECT_TRUE(job["actions"][0]["error"].is_null());
  EXPECT_EQ(job["actions"][1]["error"], "ANIMATION_NOT_FOUND");
  EXPECT_EQ(job["actions"][1]["typeName"], "UNKNOWN");
  EXPECT_EQ(job["actions"][2]["resolved"]["soundSet"], "bells");
  EXPECT_EQ(job["actions"][3]["name"], "x");

  const auto lines = timeline();
  EXPECT_GE(find(lines, entryWith("ZUBehaviorManager", "preloadBehavior", 0,
                                  "animations/Stand/Gestures/Hey_1")),
            0);
  EXPECT_GE(find(lines, entryWith("ZUAudioPlayer", "loadSoundSet", 0, "bells")), 0);
  EXPECT_EQ(find(lines, entry("ZUTextToSpeech", "say")), -1);
}

TEST_F(MokutoCommand, PublishesTheMethodTableInBindingOrder) {
  const Ran r = run("methods");
  ASSERT_EQ(r.status, 0) << r.err;
  const Json methods = Json::parse(r.out);
  std::vector<std::string> names;
  for (const auto& method : methods)
    names.push_back(method["name"]);
  ASSERT_FALSE(names.empty());
  EXPECT_EQ(std::count(names.begin(), names.end(), "say"), 2);
  EXPECT_EQ(names.back(), "_dialogMatchedInputCallback");
  EXPECT_NE(std::find(names.begin(), names.end(), "ping"), names.end());
  const auto say =
      static_cast<std::size_t>(std::find(names.begin(), names.end(), "say") - names.begin());
  EXPECT_EQ(methods[say]["parameters"][0]["name"], "text");
}

TEST_F(MokutoCommand, EveryCommandHasHelp) {
  for (const std::string command :
       {"say", "methods", "tags", "animations", "diagnosis", "page", "parse", "config"}) {
    SCOPED_TRACE(command);
    const Ran r = run(command + " --help");
    EXPECT_EQ(r.status, 0);
    EXPECT_NE(r.out.find("Usage"), std::string::npos) << r.out;
  }
}

}  // namespace
