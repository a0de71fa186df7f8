// The syntactic analysis and the automatic tags: the analysis of a speech text plus the
// insertion of its tags (as the compiler stage runs them in contextual mode), on
// English, French and Japanese texts of 1 KB, 10 KB and 100 KB (the texts under
// bench/data/ repeated), in MB/s of speech text. For Japanese, the analysis alone
// beside MeCab's parse of the same text (its words and their parts of speech) in the
// same run, when MeCab is installed. The databases are the ones the build made.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>

#include "mokuto/zulingsyntacticanalyzer.h"
#include "mokuto/zulingsyntacticanalyzertagger.h"

#ifdef MOKUTO_BENCH_MECAB
#include <mecab.h>
#endif

namespace {

struct Language {
  const char* key;
  const char* text;
};
constexpr Language kLanguages[] = {
    {"English", "text_en.txt"}, {"French", "text_fr.txt"}, {"Japanese", "text_ja.txt"}};
constexpr std::size_t kSizes[] = {1 << 10, 10 << 10, 100 << 10};

// The text repeated up to `size` bytes, cut at a character boundary.
std::string textOfSize(const std::string& text, std::size_t size) {
  std::string out;
  while (out.size() < size)
    out += text + "\n";
  std::size_t end = size;
  while (end > 0 && (static_cast<unsigned char>(out[end]) & 0xC0) == 0x80)
    --end;
  out.resize(end);
  return out;
}

std::string sizeName(std::size_t size) {
  return std::to_string(size >> 10) + "KB";
}

#ifdef MOKUTO_BENCH_MECAB
struct MeCabDeleter {
  void operator()(mecab_t* mecab) const { mecab_destroy(mecab); }
};
#endif

}  // namespace

int main(int argc, char** argv) {
  const auto languages = std::make_shared<const ZU::ZULingLanguageMap>(ZU::makeLingLanguageMap());
  for (const Language& language : kLanguages) {
    std::ifstream in(std::string(MOKUTO_BENCH_DATA_DIR) + "/" + language.text);
    const std::string paragraph((std::istreambuf_iterator<char>(in)),
                                std::istreambuf_iterator<char>());
    auto analyzer = std::make_shared<ZU::ZULingSyntacticAnalyzer>(languages);
    analyzer->setLanguage(language.key);
    if (!analyzer->database()) {
      std::fprintf(stderr, "bench_analysis: no %s database; build the data first\n", language.key);
      continue;
    }
    for (const std::size_t size : kSizes) {
      const auto text = std::make_shared<const std::string>(textOfSize(paragraph, size));
      const std::string suffix = std::string(language.key) + "/" + sizeName(size);
      const std::string key = language.key;
      benchmark::RegisterBenchmark(
          ("AnalyseAndTag/" + suffix).c_str(), [languages, key, text](benchmark::State& state) {
            ZU::ZULingAutomaticTagging tagging(languages);
            ZU::MokutoConfig config;
            ZU::MKID id = 0;
            std::size_t tags = 0;
            for (auto _ : state) {
              ZU::MKTaskInstruction job(++id, *text, config, ZU::Standing);
              tagging.process(job, key);
              tags = job.actions.size();
            }
            state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text->size()));
            state.counters["tags"] = static_cast<double>(tags);
          });
      if (std::string(language.key) != "Japanese")
        continue;
      benchmark::RegisterBenchmark(
          ("Analyse/" + suffix).c_str(), [analyzer, text](benchmark::State& state) {
            std::size_t chunks = 0;
            for (auto _ : state)
              chunks = analyzer->analyse(*text).chunks.size();
            state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text->size()));
            state.counters["chunks"] = static_cast<double>(chunks);
          });
#ifdef MOKUTO_BENCH_MECAB
      std::shared_ptr<mecab_t> mecab(mecab_new2(""), MeCabDeleter());
      if (!mecab) {
        std::fprintf(stderr, "bench_analysis: MeCab has no dictionary: %s\n",
                     mecab_strerror(nullptr));
        continue;
      }
      benchmark::RegisterBenchmark(
          ("MeCabParse/" + suffix).c_str(), [mecab, text](benchmark::State& state) {
            std::size_t words = 0;
            for (auto _ : state) {
              words = 0;
              for (const mecab_node_t* node =
                       mecab_sparse_tonode2(mecab.get(), text->data(), text->size());
                   node != nullptr; node = node->next) {
                benchmark::DoNotOptimize(node->feature);
                ++words;
              }
            }
            state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text->size()));
            state.counters["words"] = static_cast<double>(words);
          });
#endif
    }
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv))
    return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
