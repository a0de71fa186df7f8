// The linguistic databases: the load time of each file beside a raw read of the same
// file (open, allocate, read whole), the lookups per second on the words of a text in
// each language, and the resident memory taken by the three main databases once loaded
// beside the sizes of their files. The files are the ones the build made (found as the
// service finds them); texts are under bench/data/.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

namespace {

using Database = ZU::ZULingSyntacticAnalyzerBinaryDatabase;

struct Language {
  const char* key;
  const char* text;  // under bench/data/, or nullptr
};
const Language kLanguages[] = {
    {"English", "text_en.txt"},   {"French", "text_fr.txt"},   {"Japanese", "text_ja.txt"},
    {"EnglishEmotions", nullptr}, {"FrenchEmotions", nullptr}, {"JapaneseEmotions", nullptr},
};

std::size_t rawRead(const std::string& path) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  struct stat status {};
  if (fd < 0 || ::fstat(fd, &status) != 0) {
    if (fd >= 0)
      ::close(fd);
    return 0;
  }
  const auto size = static_cast<std::size_t>(status.st_size);
  std::unique_ptr<char[]> buffer(new char[size]);
  std::size_t done = 0;
  while (done < size) {
    const ssize_t n = ::read(fd, buffer.get() + done, size - done);
    if (n <= 0)
      break;
    done += static_cast<std::size_t>(n);
  }
  ::close(fd);
  benchmark::DoNotOptimize(buffer.get());
  return done;
}

// The words of the text as the analysis cuts them: the text lowercased in ASCII; at
// each position the longest stored word, else one character is skipped.
std::vector<std::string> words(const Database& db, const std::string& text) {
  std::string lower = text;
  for (char& c : lower)
    c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  std::vector<std::string> out;
  std::size_t pos = 0;
  while (pos < lower.size()) {
    std::size_t longest = 0;
    db.find(lower, pos, longest);
    if (longest > 0) {
      out.push_back(lower.substr(pos, longest));
      pos += longest;
    } else {
      ++pos;
      while (pos < lower.size() && (static_cast<unsigned char>(lower[pos]) & 0xC0) == 0x80)
        ++pos;
    }
  }
  return out;
}

long residentBytes() {
  long pages = 0;
  long resident = 0;
  if (std::FILE* statm = std::fopen("/proc/self/statm", "r")) {
    if (std::fscanf(statm, "%ld %ld", &pages, &resident) != 2)
      resident = 0;
    std::fclose(statm);
  }
  return resident * ::sysconf(_SC_PAGESIZE);
}

}  // namespace

int main(int argc, char** argv) {
  const ZU::ZULingLanguageMap languages = ZU::makeLingLanguageMap();

  // The main databases first, before any other allocation of that size, so that the
  // resident memory they add is their own.
  std::vector<std::shared_ptr<Database>> loaded;
  double fileBytes = 0;
  const long residentBefore = residentBytes();
  for (const Language& language : kLanguages) {
    auto db = std::make_shared<Database>();
    if (language.text != nullptr && db->load(languages.at(language.key))) {
      fileBytes += db->size + static_cast<double>(Database::kBodyStart);
      loaded.push_back(std::move(db));
    } else {
      loaded.push_back(nullptr);
    }
  }
  const double residentGrowth = static_cast<double>(residentBytes() - residentBefore);
  benchmark::RegisterBenchmark("ResidentMemory/MainDatabases", [residentGrowth, fileBytes](
                                                                   benchmark::State& state) {
    for (auto _ : state)
      benchmark::DoNotOptimize(residentGrowth);
    state.counters["resident_MiB"] = residentGrowth / (1 << 20);
    state.counters["files_MiB"] = fileBytes / (1 << 20);
  })->Iterations(1);

  for (std::size_t l = 0; l < std::size(kLanguages); ++l) {
    const Language& language = kLanguages[l];
    const std::string path = languages.at(language.key);
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
      std::fprintf(stderr, "bench_lingdatabase: no %s database (%s); build the data first\n",
                   language.key, path.c_str());
      continue;
    }
    const auto size = static_cast<double>(status.st_size);
    benchmark::RegisterBenchmark(
        (std::string("RawRead/") + language.key).c_str(), [path, size](benchmark::State& state) {
          for (auto _ : state)
            benchmark::DoNotOptimize(rawRead(path));
          state.SetBytesProcessed(
              static_cast<std::int64_t>(size * static_cast<double>(state.iterations())));
        });
    benchmark::RegisterBenchmark(
        (std::string("Load/") + language.key).c_str(), [path, size](benchmark::State& state) {
          for (auto _ : state) {
            Database db;
            benchmark::DoNotOptimize(db.load(path));
          }
          state.SetBytesProcessed(
              static_cast<std::int64_t>(size * static_cast<double>(state.iterations())));
        });
    const std::shared_ptr<Database> db = loaded[l];
    if (language.text == nullptr || !db)
      continue;
    std::ifstream in(std::string(MOKUTO_BENCH_DATA_DIR) + "/" + language.text);
    const std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    const auto textWords = std::make_shared<std::vector<std::string>>(words(*db, text));
    benchmark::RegisterBenchmark(
        (std::string("Lookup/") + language.key).c_str(), [db, textWords](benchmark::State& state) {
          std::string lemma;
          for (auto _ : state) {
            for (const std::string& word : *textWords) {
              const auto classes = db->wordClasses(word);
              benchmark::DoNotOptimize(db->lemma(word, classes[0].wordClass, lemma));
            }
          }
          state.SetItemsProcessed(state.iterations() *
                                  static_cast<std::int64_t>(textWords->size()));
          state.counters["words"] = static_cast<double>(textWords->size());
        });
    benchmark::RegisterBenchmark(
        (std::string("LongestPrefixScan/") + language.key).c_str(),
        [db, text](benchmark::State& state) {
          std::size_t found = 0;
          for (auto _ : state)
            found = words(*db, text).size();
          state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text.size()));
          state.counters["words"] = static_cast<double>(found);
        });
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv))
    return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
