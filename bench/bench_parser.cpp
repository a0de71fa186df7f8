// Throughput of the annotated-text parser on plain words, on a typical annotated
// paragraph and on pathological text, beside a scan that only looks for the bytes that
// start something ("^", "$" and backslash): the floor that any parse pays.
//
// The parser runs in the service's host, which has the allocator keep the memory it
// frees (ko::os::keepFreedMemory), and is measured that way; with --default_allocator
// it is measured with the C library's defaults, under which every batch of parses
// takes page faults to grow the heap that the previous batch gave back.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "ko/os.hpp"

#include "mokuto/mktaskinstruction.h"
#include "mokuto/zumokutoparser.h"

namespace {

using Matching = ZU::ZUMokutoParser::Matching;

// Repeats the pieces in turn until the text has `size` bytes.
std::string cycle(const std::vector<std::string>& pieces, std::size_t size) {
  std::string text;
  text.reserve(size + 128);
  for (std::size_t k = 0; text.size() < size; ++k) {
    text += pieces[k % pieces.size()];
  }
  text.resize(size);
  return text;
}

std::string plainText(std::size_t size) {
  return cycle({"Hello my friend, it is such a lovely day to go for a walk in the park. ",
                "The robot waves its hand and says that it is happy to see you again! ",
                "Would you like to hear a story about the sea, the wind and the stars? "},
               size);
}

// About one instruction every 60 bytes, every kind in turn.
std::string annotatedText(std::size_t size) {
  return cycle({"Hello my friend, nice to meet you. ^start(animations/Stand/Gestures/Hey_1) ",
                "I am so happy to see you again today ^startTag(happy) ",
                "and I want to show you something ^run(animations/Stand/Gestures/Explain_2) ",
                "look at this: ^wait(animations/Stand/Gestures/Hey_1) well done. ",
                "Now listen to that music ^runSound(fun/laugh, 80) isn't it ",
                "funny? ^stop(animations/Stand/Gestures/Explain_2) Let me think a ",
                "little ^mode(random) about it ^startSound(bells/ding) before I ",
                "answer. ^call(ZUMemory.raiseEvent(\"faceSeen\", 1)) Here we go. ",
                "$Mokuto/lastTopic=walk Shall we go for a walk ^runTag(yes) in ",
                "the park? ^pCall(ZULeds.fadeRGB(\"FaceLeds\", 255, 0.5)) It's ",
                "sunny. ^waitSound(fun/laugh) ^stopTag(happy) ^waitTag(yes) And ",
                "then ^stopSound(bells/ding) we can rest for a while, my friend. "},
               size);
}

// Instructions that never close, nested parentheses and quotes: every closing
// parenthesis search runs to the end of the text.
std::string pathologicalText(std::size_t size) {
  return cycle({"^start(a ", "^runSound(b/c, ", "((((", "^call(X.y(\" z ", "\"^run( ",
                "^foo (\"(\" ", "word "},
               size);
}

// Times the parse calls only (with the copy of the text that the call takes): making the
// fresh jobs and destroying the parsed ones is the say pipeline's work and happens with
// the timer paused, a batch of jobs at a time so that pausing costs little.
void runParse(benchmark::State& state, const std::string& text, Matching matching) {
  const ZU::ZUMokutoParser parser(matching);
  const std::size_t batch =
      std::max<std::size_t>(1, (64u << 10) / std::max<std::size_t>(1, text.size()));
  std::vector<std::shared_ptr<ZU::MKTaskInstruction>> jobs(batch);
  for (auto _ : state) {
    state.PauseTiming();
    for (auto& job : jobs) {
      job = std::make_shared<ZU::MKTaskInstruction>();
    }
    state.ResumeTiming();
    for (auto& job : jobs) {
      parser.parse(job, text, false);
    }
    benchmark::DoNotOptimize(jobs.front()->text.data());
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations()) *
                          static_cast<std::int64_t>(batch * text.size()));
  state.counters["actions"] = static_cast<double>(jobs.front()->actions.size());
  state.counters["parses"] = static_cast<double>(batch);
}

std::size_t sizeArg(const benchmark::State& state) {
  return static_cast<std::size_t>(state.range(0));
}

// The baseline: only looks at each byte for the three that start an instruction or a tag.
void scanBaseline(benchmark::State& state, const std::string& text) {
  for (auto _ : state) {
    std::size_t found = 0;
    for (const char c : text) {
      found += (c == '^' || c == '$' || c == '\\') ? 1 : 0;
    }
    benchmark::DoNotOptimize(found);
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations()) *
                          static_cast<std::int64_t>(text.size()));
}

void BM_ScanBaseline_Plain(benchmark::State& state) {
  scanBaseline(state, plainText(sizeArg(state)));
}

void BM_ScanBaseline_Annotated(benchmark::State& state) {
  scanBaseline(state, annotatedText(sizeArg(state)));
}

void BM_Parse_Plain(benchmark::State& state) {
  runParse(state, plainText(sizeArg(state)), Matching::Adaptive);
}

void BM_Parse_Annotated(benchmark::State& state) {
  runParse(state, annotatedText(sizeArg(state)), Matching::Adaptive);
}

void BM_Parse_Pathological(benchmark::State& state) {
  runParse(state, pathologicalText(sizeArg(state)), Matching::Adaptive);
}

// The same text when every search walks the text: what the index saves.
void BM_Parse_Pathological_WalkOnly(benchmark::State& state) {
  runParse(state, pathologicalText(sizeArg(state)), Matching::Walk);
}

}  // namespace

BENCHMARK(BM_ScanBaseline_Plain)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);
BENCHMARK(BM_ScanBaseline_Annotated)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);
BENCHMARK(BM_Parse_Plain)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);
BENCHMARK(BM_Parse_Annotated)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);
BENCHMARK(BM_Parse_Pathological)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);
BENCHMARK(BM_Parse_Pathological_WalkOnly)->Arg(1 << 10)->Arg(10 << 10)->Arg(100 << 10);

int main(int argc, char** argv) {
  bool defaultAllocator = false;
  int kept = 1;
  for (int k = 1; k < argc; ++k) {
    if (std::string_view(argv[k]) == "--default_allocator") {
      defaultAllocator = true;
    } else {
      argv[kept++] = argv[k];
    }
  }
  argc = kept;
  const bool keeps = !defaultAllocator && ko::os::keepFreedMemory();
  benchmark::AddCustomContext(
      "allocator", keeps ? "keeps freed memory, as the service host does" : "C library defaults");
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
    return 1;
  }
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
