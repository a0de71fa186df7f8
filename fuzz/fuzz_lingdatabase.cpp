// Fuzzes the loading of linguistic database files and the lookups in them. The input is
// a whole database file: it is written to a temporary file and loaded; when it loads,
// the words of the seed lexicons, their prefixes and pieces of the input itself are
// looked up from several starting positions. Besides the sanitizers' checks, every
// lookup must keep find's promises; a broken one aborts.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "ko/log.hpp"
#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

namespace {

std::string gPath;

[[noreturn]] void fail(const char* what, std::string_view key) {
  std::fprintf(stderr, "lookup invariant broken: %s (key of %zu bytes)\n", what, key.size());
  std::abort();
}

void lookUp(const ZU::ZULingSyntacticAnalyzerBinaryDatabase& db, std::string_view key) {
  for (std::size_t start = 0; start <= key.size() && start < 3; ++start) {
    std::size_t longestPrefix = 0;
    const bool found = db.find(key, start, longestPrefix).has_value();
    if (longestPrefix > key.size() - start)
      fail("longest prefix longer than the key", key);
    if (found && longestPrefix != key.size() - start)
      fail("an exact match whose longest prefix is not the key", key);
  }
  const std::vector<ZU::ZULingClassFeatures> classes = db.wordClasses(key);
  if (classes.empty())
    fail("a word without classes", key);
  std::string lemma;
  for (const ZU::ZULingClassFeatures& c : classes)
    db.lemma(key, c.wordClass, lemma);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
  ko::log::setLevel("*", ko::log::Silent);
  const std::filesystem::path dir =
      std::filesystem::exists("/dev/shm") ? "/dev/shm" : std::filesystem::temp_directory_path();
  gPath = (dir / ("fuzz_lingdatabase." + std::to_string(::getpid()) + ".bdb")).string();
  std::atexit([] { std::remove(gPath.c_str()); });
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::FILE* file = std::fopen(gPath.c_str(), "wb");
  if (file == nullptr)
    return 0;
  const bool written = std::fwrite(data, 1, size, file) == size;
  if (std::fclose(file) != 0 || !written)
    return 0;

  ZU::ZULingSyntacticAnalyzerBinaryDatabase db;
  if (!db.load(gPath))
    return 0;
  static const std::vector<std::string> kWords = {
      "chat",  "chats",    "chatons",  "château", "mange",  "été", "a",  "0",       "zut", "et",
      "hello", "think",    "thinking", "me",      "you",    "not", "no", "very",    "c",   "\xC3",
      "好き",  "嬉しかっ", "ない",     "ん",      "とても", "x",   "",   "abcdefgh"};
  for (const std::string& word : kWords) {
    lookUp(db, word);
    lookUp(db, word + "s");
  }
  // Pieces of the input, which often hold labels of the file's own nodes.
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  for (std::size_t at = ZU::ZULingSyntacticAnalyzerBinaryDatabase::kBodyStart; at < size;
       at += 1 + size / 16) {
    lookUp(db, input.substr(at, 1 + (data[at] & 15)));
  }
  return 0;
}
