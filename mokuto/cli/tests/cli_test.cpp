// The `mokuto` and `zefoko` commands, run as a user runs them: the executable with its
// arguments, its status, its output and the files it writes.
#include <gtest/gtest.h>
#include <sndfile.h>

#include <algorithm>
#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "ko_test_helpers.hpp"
#include "ko_test_process.hpp"

namespace {

using namespace std::chrono_literals;
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

// "mokuto ..." and "zefoko ..." with the executables of the build.
std::string commandLine(const std::string& arguments) {
  for (const auto& [name, path] :
       {std::pair{"mokuto ", MOKUTO_EXECUTABLE}, std::pair{"zefoko ", ZEFOKO_EXECUTABLE}}) {
    if (arguments.rfind(name, 0) == 0)
      return std::string(path) + arguments.substr(std::string(name).size() - 1);
  }
  return std::string(MOKUTO_EXECUTABLE) + " " + arguments;
}

class MokutoCommand : public ::testing::Test {
 protected:
  Ran run(const std::string& arguments, const std::string& input = {}) const {
    std::string command = commandLine(arguments);
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

  ko::test::ScratchFolder scratch;
  const std::filesystem::path& folder = scratch.path();
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

enum class Stream { Out, Err };

struct Case {
  std::string arguments;
  int status;
  Stream stream;
  std::string fragment;
  // What the stream must not hold; empty: nothing.
  std::string absent = {};
  std::string input = {};
};

TEST_F(MokutoCommand, AnswersEachCaseWithItsStatusAndMessage) {
  const std::string fast = "mokuto say --speech timing --fast --mode random ";
  const std::string deep = std::string(5000, '[') + std::string(5000, ']');
  std::vector<Case> cases = {
      // What became of each action.
      {fast + "'Hi ^runSound(bells/dingg) there'", 0, Stream::Out,
       "^runSound(bells/dingg)  failed: No sound \"dingg\" in the sound set \"bells\""},
      {fast + "'Hi ^call(ZUMemory.nosuch(1)) there'", 0, Stream::Out,
       "^call(ZUMemory.nosuch(1))  failed: Cannot find method 'nosuch' on ZUMemory"},
      {fast + "'Hi ^call(ZUMemory.raiseEvent(abc)) there'", 0, Stream::Out,
       "failed: the arguments are not JSON"},
      {fast + "'Hi ^call(ZUMemory.raiseEvent(abc)) ^runSound(bells/ding) there'", 0, Stream::Out,
       "actions: 1 executed, 1 failed, 0 skipped", "sync, from"},
      {fast + "'Hi ^wait(animations/Stand/Gestures/Hey_1) there'", 0, Stream::Out,
       "(the animation was not running)"},
      {"mokuto say --speech timing --fast --tags-to-words '[[\"nosuchtag\", [\"hello\"]]]' hello",
       0, Stream::Out, "AUTO_START_TAG(nosuchtag)  no animation"},
      {fast + "'Hi ^foo(x) and ^start(no/such/animation) there $x=1'", 0, Stream::Out,
       "instruction errors: 2"},
      {fast + "Hi", 0, Stream::Out, "sync figures are meaningless with --fast"},
      {fast + "-", 0, Stream::Out, "say 1 (300 characters): " + std::string(200, 'a') + "\u2026",
       "", std::string(300, 'a')},
      {fast + "-", 0, Stream::Out, "say 1 (9 characters): Hi\uFFFDthere ", "", "Hi\x01there\n"},
      // The robot's faults, logged where they strike; the text goes on.
      {fast + "--faults 'ZUBehaviorManager.startBehavior:throw' "
              "'Hi ^start(animations/Stand/Gestures/Hey_1) there'",
       0, Stream::Err, "ZUBehaviorManager.startBehavior: fails (injected fault)"},
      {"mokuto say --faults 'ZUMemory.raiseEvent:explode' Hi", 2, Stream::Err,
       "--faults: fault \"ZUMemory.raiseEvent:explode\": "},
      // Instructions that did not parse, with their column; the status stays.
      {fast + "'Hello ^start(animations/Stand/Gestures/Hey_1 my friend'", 0, Stream::Err,
       "column 7: \"^start(\" has no closing parenthesis"},
      {"mokuto say --speech timing --dry-run 'x ^wait y $x= ^Start(a)'", 0, Stream::Err,
       "column 3: \"^wait\" is not followed by \"(\""},
      {fast + "'x ^Start(a)'", 0, Stream::Err,
       "column 3: \"^Start\" is not an instruction: skipped (did you mean \"^start\"?)"},
      // Configuration values that the service would log and skip.
      {fast + "--config '[[\"bodyLanguageMode\", \"randm\"]]' Hi", 2, Stream::Err,
       "--config: Invalid body language mode: \"randm\"", "say 1"},
      {fast + "--config '[[\"msPauseBeforeSpeech\", \"abc\"]]' Hi", 2, Stream::Err,
       "--config: uknown key \"msPauseBeforeSpeech\""},
      {fast + "--tags-to-animations '[[\"a\", [\"animations/Stand/x\"]], \"bad\"]' Hi", 2,
       Stream::Err, "--tags-to-animations: The new tags to animations should be an array"},
      {fast + "--package nonexistent/ hello", 2, Stream::Err,
       "no installed animation begins with \"nonexistent//\""},
      {fast + "--package animations --package animations hello", 0, Stream::Out, "say 1"},
      {"mokuto config --apply '[[\"bodyLanguageMode\", 1]]'", 2, Stream::Err,
       "uknown key \"bodyLanguageMode\""},
      {"mokuto config --apply '[[\"bodyLanguageMode\", \"random\"], [\"msPauseBeforeSpeech\", 0]]'",
       0, Stream::Out, "config: bodyLanguageMode: random\n        msPauseBeforeSpeech: 0"},
      {"mokuto config --apply '[[\"msPauseBeforeSpeech\", '", 2, Stream::Err, "invalid JSON"},
      {"mokuto config --apply '" + deep + "'", 2, Stream::Err,
       "invalid JSON: JSON nested deeper than 128 levels"},
      // Unusable arguments and options.
      {"mokuto say --config '[[\"msPauseBeforeSpeech\", ' Hi", 2, Stream::Err,
       "--config: invalid JSON"},
      {"mokuto say --tags-to-words '{\"a\": 1}' Hi", 2, Stream::Err,
       "--tags-to-words takes a JSON array"},
      {"mokuto say --wav /no/such/folder/x.wav Hi", 2, Stream::Err,
       "--wav: no folder /no/such/folder"},
      {"mokuto say --speech timing --fast '  '", 2, Stream::Err, "the text is empty"},
      {"zefoko bodytalk --seconds 0", 2, Stream::Err, "0 is not a number of seconds above 0"},
      // --connect: the robot's options belong to its process, what needs the service here
      // and what does not use the service refuse it; the network needs keys.
      {"mokuto --connect ipc:///nonexistent say --speech timing Hi", 2, Stream::Err,
       "--speech belongs to the robot's process with --connect"},
      {"mokuto --connect ipc:///nonexistent say --wav x.wav Hi", 2, Stream::Err,
       "--wav needs the robot in this process"},
      {"mokuto --connect ipc:///nonexistent say --dry-run Hi", 2, Stream::Err,
       "--dry-run needs the service in this process"},
      {"mokuto --connect ipc:///nonexistent sounds", 2, Stream::Err,
       "mokuto sounds does not use the running service"},
      {"mokuto --connect tcp://192.0.2.1:5555 methods", 2, Stream::Err,
       "goes through the network: it needs CURVE keys"},
      {"zefoko serve --listen tcp://0.0.0.0:0 --speech timing", 2, Stream::Err,
       "opens the service to the network: it needs CURVE keys"},
      {"zefoko serve --connect ipc:///nonexistent", 2, Stream::Err,
       "--connect needs module libraries to serve"},
      {"zefoko serve", 2, Stream::Err, "nothing to serve"},
      // One language option: an unknown language is a usage error everywhere.
      {"mokuto say --language fr_FR Hi", 2, Stream::Err, "--language: fr_FR not in"},
      {"mokuto lookup --database /nonexistent x", 1, Stream::Err, "no linguistic database"},
      // "-" reads standard input wherever a text is read.
      {"mokuto parse --language Japanese -", 0, Stream::Out,
       "\"text\": \"\\\\mrk=1\\\\ ,\\\\pau=300\\\\ hi\"", "", "\\mrk=1\\ \\pau=300\\ hi"},
      {"mokuto parse 'Hi ^run(wave) there $x=1 ^runSound(bells/ding, 50)'", 0, Stream::Out,
       "\"text\": \"Hi \\\\mrkpause=1\\\\ there \\\\mrk=2\\\\ \\\\mrkpause=3\\\\\""},
      {"mokuto analyse --tags-to-words '[[\"greet\", [\"hello\"]]]' -", 0, Stream::Out,
       "\"tag\": \"greet\"", "", "Hello world"},
      {"zefoko speak --speech timing --fast -", 0, Stream::Out,
       "ZUMemory.raiseEvent [\"ZUTextToSpeech/CurrentBookMark\", 2]", "",
       "One \\mrk=1\\ two \\mrk=2\\ three"},
      {"zefoko speak --wav " + quoted((folder / "speak.wav").string()) + " 'Hi \\mrk=1\\ there.'",
       0, Stream::Err, "wrote " + (folder / "speak.wav").string()},
      // What the robot and the service offer.
      {"mokuto animations hello --posture Sitting", 0, Stream::Out, "animations/Sit/Gestures/Hey_1",
       "animations/Stand/"},
      {"mokuto animations", 0, Stream::Out, "animations/Stand/BodyTalk/Speaking_1"},
      {"mokuto animations nosuchtag", 1, Stream::Err, "no animation for the tag \"nosuchtag\""},
      {"mokuto tags --posture SittingOnChair", 0, Stream::Out, "hello\n"},
      {"mokuto sounds", 0, Stream::Out, "bells/ding\n"},
      {"mokuto methods", 0, Stream::Out, "\"name\": \"_dialogMatchedInputCallback\""},
      {"mokuto syntax", 0, Stream::Out, "^pCall(SERVICE.METHOD(ARGUMENTS))"},
      {"mokuto --version", 0, Stream::Out, std::string("mokuto ") + MOKUTO_VERSION},
      {"zefoko --version", 0, Stream::Out, std::string("zefoko ") + MOKUTO_VERSION},
  };
  // The linguistic databases of the build.
  const std::vector<Case> databases = {
      {"mokuto lookup thinking", 0, Stream::Out, "verb (14)  features \"G\"  lemma \"think\""},
      {"mokuto lookup --language fr_FR était", 0, Stream::Out,
       "auxiliary (15)  features \"I3s\"  lemma \"être\""},
      {"mokuto lookup --language Japanese 思っ", 0, Stream::Out,
       "verb (14)  features \"\"  lemma \"思う\""},
      {"mokuto lookup --language ja_JPEmotions なかっ", 0, Stream::Out,
       "unkonwn (4)  features \"\"  lemma \"negation\""},
      {"mokuto analyse --pause 0 'I like apples, pears and plums.'", 0, Stream::Out,
       "AUTO_START_TAG(three)"},
      {"mokuto analyse --language Japanese 紅茶かコーヒー", 0, Stream::Out, "AUTO_START_TAG(pick)"},
      {"mokuto emotion -", 0, Stream::Out, "emotion: -1\n  \"not\": negation", "",
       "I am not happy"},
      {"mokuto emotion --language Japanese とても嬉しい", 0, Stream::Out, "emotion: 2"},
  };
  if (MOKUTO_HAVE_LINGDATA)
    cases.insert(cases.end(), databases.begin(), databases.end());
  for (const std::string command :
       {"say", "syntax", "parse", "analyse", "emotion", "lookup", "config", "methods", "tags",
        "animations", "sounds", "diagnosis", "page"})
    cases.push_back({"mokuto " + command + " --help", 0, Stream::Out, "Usage"});
  for (const std::string command : {"speak", "bodytalk", "serve", "keys"})
    cases.push_back({"zefoko " + command + " --help", 0, Stream::Out, "Usage"});
  for (const std::string command : {"mokuto say", "mokuto parse", "mokuto analyse",
                                    "mokuto emotion", "mokuto lookup", "zefoko speak"})
    cases.push_back(
        {command + " --language Klingon Hi", 2, Stream::Err, "--language: Klingon not in"});
  for (const auto& c : cases) {
    SCOPED_TRACE(c.arguments);
    const Ran r = run(c.arguments, c.input);
    EXPECT_EQ(r.status, c.status) << r.out << r.err;
    const std::string& text = c.stream == Stream::Out ? r.out : r.err;
    EXPECT_NE(text.find(c.fragment), std::string::npos) << r.out << r.err;
    if (!c.absent.empty()) {
      EXPECT_EQ(text.find(c.absent), std::string::npos) << r.out << r.err;
    }
  }
}

TEST_F(MokutoCommand, SaysAnAnnotatedTextOnTheTimingEngine) {
  const Ran r = run("say --mode random --speech timing --fast --timeline " +
                    quoted((folder / "timeline.jsonl").string()) + " " + quoted(kText));
  ASSERT_EQ(r.status, 0) << r.err;
  const auto lines = timeline();
  ASSERT_FALSE(lines.empty());

  const long say = find(lines, entryWith("ZUMokuto", "say", 0, 1));
  ASSERT_EQ(say, 0);
  // Each action at its bookmark, after it was reached (the director's own tests check the
  // order on a scripted speech engine).
  const auto actions = actionsOf(lines);
  ASSERT_EQ(actions.size(), 4u);
  const std::vector<std::string> types = {"START", "WAIT", "RUN_SOUND", "AFFECTATION"};
  for (std::size_t k = 0; k < actions.size(); ++k) {
    SCOPED_TRACE(actions[k].dump());
    EXPECT_EQ(actions[k]["bookmark"], k + 1);
    EXPECT_EQ(actions[k]["type"], types[k]);
    EXPECT_EQ(actions[k]["outcome"], "executed");
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
  EXPECT_LE(lines[static_cast<std::size_t>(stopped)]["us"].get<std::int64_t>(),
            actions[1]["endUs"].get<std::int64_t>());
  EXPECT_GE(find(lines, entryWith("ZUAudioPlayer", "playSoundSetFile", 0, "bells")), 0);
  const long done = find(lines, entryWith("ZUMemory", "raiseEvent", 0, "done"));
  ASSERT_GT(done, started);

  // The end event is the last thing the robot did for the text (the body talk may still
  // be settling); the service's "end" gives the summary's figures.
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
  // Joint samples of the settling body may still follow it.
  const auto closing = std::find_if(lines.rbegin(), lines.rend(), entry("ZUMokuto", "end"));
  ASSERT_NE(closing, lines.rend());
  const Json& last = *closing;
  EXPECT_EQ(last["result"]["outcome"], "done");
  EXPECT_EQ(last["result"]["executed"], 4);
  // --fast: no sync figures.
  EXPECT_TRUE(last["result"]["syncMedianUs"].is_null());
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
  struct WavCase {
    const char* name;
    std::string options;
    std::string text;
    const char* sound;  // of the set "bells"
    double volume;
    bool stopped;
  };
  const std::vector<WavCase> cases = {
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
    const Ran r =
        run("say " + c.options + " --wav " + quoted((folder / "out.wav").string()) +
            " --timeline " + quoted((folder / "timeline.jsonl").string()) + " " + quoted(c.text));
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
      const auto last = std::find_if(lines.rbegin(), lines.rend(), entry("ZUMokuto", "end"));
      ASSERT_NE(last, lines.rend());
      EXPECT_TRUE((*last)["result"]["syncMedianUs"].is_number());
    }
  }
}

TEST_F(MokutoCommand, DryRunShowsWhatTheLoaderResolvedWithoutSpeaking) {
  const Ran r = run("say --mode random --speech timing --dry-run --timeline " +
                    quoted((folder / "timeline.jsonl").string()) +
                    " 'Hi ^start(animations/Stand/Gestures/Hey_1) and ^run(no/such) "
                    "^runSound(bells/ding) $x=2 ^startSound(bells/dingg) "
                    "^call(ZUMemory.nosuch(1)) ^pCall(ZUMemory.raiseEvent(x))'");
  ASSERT_EQ(r.status, 0) << r.err;
  const Json job = Json::parse(r.out);
  ASSERT_EQ(job["actions"].size(), 7u);
  const Json& actions = job["actions"];
  EXPECT_EQ(actions[0]["resolved"]["animation"], "animations/Stand/Gestures/Hey_1");
  EXPECT_TRUE(actions[0]["error"].is_null());
  EXPECT_EQ(actions[1]["error"], "ANIMATION_NOT_FOUND");
  EXPECT_EQ(actions[1]["typeName"], "UNKNOWN");
  EXPECT_EQ(actions[2]["resolved"]["soundSet"], "bells");
  EXPECT_EQ(actions[3]["name"], "x");
  for (const std::size_t k : {0u, 1u, 2u, 3u})
    EXPECT_TRUE(actions[k]["failure"].is_null()) << k;
  // What the director's calls would meet.
  EXPECT_EQ(actions[4]["failure"], "No sound \"dingg\" in the sound set \"bells\"");
  EXPECT_EQ(actions[5]["failure"], "Cannot find method 'nosuch' on ZUMemory");
  EXPECT_EQ(actions[6]["failure"].get<std::string>().rfind("the arguments are not JSON", 0), 0u);

  const auto lines = timeline();
  EXPECT_GE(find(lines, entryWith("ZUBehaviorManager", "preloadBehavior", 0,
                                  "animations/Stand/Gestures/Hey_1")),
            0);
  EXPECT_GE(find(lines, entryWith("ZUAudioPlayer", "loadSoundSet", 0, "bells")), 0);
  EXPECT_EQ(find(lines, entry("ZUTextToSpeech", "say")), -1);
}

// The command starts in a process group of its own (setsid), as `timeout` starts one, its
// output in a file: a signal goes to it alone or to its whole group.
TEST_F(MokutoCommand, SignalsStopTheTextAndTheSummaryStillComes) {
  struct SignalCase {
    int signal;
    bool group;
    bool quiet;
    bool second;
  };
  const SignalCase cases[] = {
      {SIGINT, false, false, false},
      {SIGTERM, true, true, false},
      {SIGINT, false, true, true},
      {SIGTERM, true, false, true},
  };
  // The director's info line says the text goes on stage; after a stop, the behaviour at
  // the end of the text (blocking, over 3 s) keeps the command busy for a second signal.
  const std::string say = "env ZEFOKO_LOG='mokuto.main=info,*=warning' " +
                          std::string(MOKUTO_EXECUTABLE) + " say --speech timing --mode random " +
                          "--timeline " + quoted((folder / "timeline.jsonl").string()) + " ";
  const std::string endBehavior =
      "--config " +
      quoted(
          "[[\"behaviorAtEndOfMokuto\", \"animations/Stand/BodyTalk/Thinking_2\"], "
          "[\"ifBehaviorAtEndOfMokutoIsBlocking\", true]]") +
      " ";
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.signal == SIGINT ? "SIGINT" : "SIGTERM") +
                 (c.group ? " to the group" : "") + (c.quiet ? ", --quiet" : "") +
                 (c.second ? ", twice" : ""));
    ko::test::ChildProcess command({"/usr/bin/setsid", "/bin/sh", "-c",
                                    "exec " + say + (c.second ? endBehavior : "") +
                                        (c.quiet ? "--quiet " : "") + quoted(kText) +
                                        " </dev/null >" + quoted((folder / "out.txt").string())});
    const auto sendSignal = [&] { ::kill(c.group ? -command.pid() : command.pid(), c.signal); };
    ASSERT_TRUE(command.waitForLine("Animated saying", 60s)) << command.output();
    sendSignal();
    if (c.second) {
      ASSERT_TRUE(command.waitForLine("a second signal ends the command at once", 60s))
          << command.output();
      sendSignal();
    }
    EXPECT_EQ(command.wait(60s), 130) << command.output();
    const std::string out = readFile(folder / "out.txt");
    if (c.second) {
      EXPECT_NE(command.output().find(" again, ending at once"), std::string::npos)
          << command.output();
      EXPECT_EQ(out.find("Text 1"), std::string::npos) << out;
      continue;
    }
    EXPECT_NE(out.find("Text 1 stopped after"), std::string::npos) << out;
    EXPECT_NE(out.find(" stopped\n"), std::string::npos) << out;
    // The stopped actions are listed live, unless --quiet.
    EXPECT_EQ(out.find("  stopped\n") == std::string::npos, c.quiet) << out;
    const Json end = timeline().back();
    EXPECT_EQ(end["result"]["outcome"], "stopped") << end.dump();
    EXPECT_GT(end["result"]["stopped"].get<int>(), 0) << end.dump();
  }
}

}  // namespace
