#pragma once
// The linguistic database of one language, its process-wide cache, and the table that
// binds the speech engine's language names to the database files.
//
// A database file holds a compressed trie over the bytes of words: each stored word
// has records (a word class, feature bytes and maybe a base form). The file is read
// in one piece into a 4-byte aligned block and queried in place through its offsets.
// The file is untrusted: load() checks the header, the sizes and the root node, and
// every lookup checks each offset, length and count against the body before using it,
// so that a damaged file is refused or answers "not found", never reads outside the
// body or past the end of the key.
//
// Threads: a database is filled once by load() before it is shared; afterwards it is
// only read, from any thread. The cache, setLanguage and the lookups that the analysis
// makes through a ZULingDatabaseUser run under the single process-wide mutex
// ZULingDatabaseCache::mutex(), so that a selection never changes while it is read.

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "mokuto/zulingwordclass.h"

namespace ZU {

// One record of a word: its class and its feature bytes.
struct ZULingClassFeatures {
  ZULingWordClass wordClass = WORD_CLASS_UNKNOWN;
  std::string features;

  bool operator==(const ZULingClassFeatures&) const = default;
};

class ZULingSyntacticAnalyzerBinaryDatabase {
 public:
  // The header: version (must be 2), 4 bytes that the reader ignores, rootOffset,
  // tailSize, then the flag byte; the body follows.
  static constexpr std::uint32_t kVersion = 2;
  static constexpr std::size_t kHeaderSize = 16;
  static constexpr std::size_t kBodyStart = 17;

  // Fills the database from the file; true on success. On failure the database is
  // empty (every lookup ends "not found") and a warning in the category
  // "syntacticanalyzer.bindatabase" names the file and the reason.
  bool load(const std::string& path);

  // Trie lookup of key[start..]: the position in `body` of the node of an exact match
  // that carries records, or nothing. longestPrefix receives the length (from start)
  // of the longest prefix of the key that is a stored word, 0 when there is none.
  std::optional<std::uint32_t> find(std::string_view key, std::size_t start,
                                    std::size_t& longestPrefix) const;

  // Like find, but the result is the node of the longest stored prefix (its length in
  // `length`), or nothing when no prefix is stored.
  std::optional<std::uint32_t> findLongest(std::string_view key, std::size_t start,
                                           std::size_t& length) const;

  // One (class, features) pair per record of the word, in record order; a word that is
  // not found gives the single pair ("unkonwn", no features).
  std::vector<ZULingClassFeatures> wordClasses(std::string_view word) const;
  // The same for a node that find or findLongest gave.
  std::vector<ZULingClassFeatures> wordClassesAt(std::uint32_t node) const;

  // False when the class is below 2 or the word is not found; otherwise true. baseForm
  // is cleared, then receives the base form of the first record of that class when
  // that record has one.
  bool lemma(std::string_view word, ZULingWordClass wordClass, std::string& baseForm) const;
  // The same for a node that find or findLongest gave.
  bool lemmaAt(std::uint32_t node, ZULingWordClass wordClass, std::string& baseForm) const;

  // Frees a body: the file is read whole in one piece into a block whose first 20 bytes
  // hold 3 bytes of padding and the header, so that the body after it is 4-byte aligned
  // and the read starts at the file's first byte (a read that starts inside a page of
  // the file copies markedly slower).
  struct BodyDeleter {
    static constexpr std::size_t kLeadWords = 5;
    void operator()(std::uint32_t* start) const noexcept { delete[](start - kLeadWords); }
  };

  // Body size in bytes.
  std::uint32_t size = 0;
  // The body, 4-byte aligned; null when nothing is loaded.
  std::unique_ptr<std::uint32_t[], BodyDeleter> body;
  // Position of the root node in the body.
  std::uint32_t root = 0;
  // The language-wide switch of the analysis: tokenising mode and gesture anticipation.
  std::uint8_t flag = 1;

 private:
  struct Node;
  struct Record;

  const std::uint8_t* xBytes() const noexcept {
    return reinterpret_cast<const std::uint8_t*>(body.get());
  }
  std::uint32_t xWord(std::uint64_t pos) const noexcept;
  // The node at pos, when its header, label and offset arrays lie inside the body.
  bool xNode(std::uint32_t pos, Node& node) const noexcept;
  // Whether the node's feature lists, records and base forms lie inside the body.
  bool xRecordsValid(const Node& node) const noexcept;
  Record xRecord(const Node& node, std::size_t index) const noexcept;
  std::string_view xFeatures(const Node& node, std::size_t index) const noexcept;
  bool xFail(const std::string& path, const std::string& problem);
  // The trie walk of find, which also gives the node of the longest stored prefix.
  std::optional<std::uint32_t> xWalk(std::string_view key, std::size_t start,
                                     std::size_t& longestPrefix,
                                     std::optional<std::uint32_t>* longestNode) const;
};

using ZULingDatabasePtr = std::shared_ptr<const ZULingSyntacticAnalyzerBinaryDatabase>;

// Language key ("French", "en_US", "JapaneseEmotions", ...) -> full path of its file.
using ZULingLanguageMap = std::map<std::string, std::string>;

struct ZULingLanguageFile {
  const char* key;
  const char* file;
};
// The keys and their files; the files live under "mokuto/syntacticanalysis/" of the
// data directory "zefoko".
extern const ZULingLanguageFile kLingLanguageFiles[12];

// The map of every key to the file found by ko::path::findData; a file that is not
// found keeps its relative data path, so that loading it names it in its warning.
ZULingLanguageMap makeLingLanguageMap();

// The process-wide cache of loaded databases, by full path. A database is loaded at
// most once per path and stays loaded for the life of the process.
class ZULingDatabaseCache {
 public:
  // The one mutex of the cache, of every selection and of the analysis' lookups.
  static std::mutex& mutex();
  // The database of the path, loaded now if it is not cached; null when loading fails
  // (nothing is then kept, and the next call tries again). The caller holds mutex().
  static ZULingDatabasePtr acquire(const std::string& path);
};

// The selection of a database by language key, as every analyser that reads one
// holds it. setLanguage takes the cache's mutex itself; the caller reads database()
// and makes its lookups under that mutex.
class ZULingDatabaseUser {
 public:
  explicit ZULingDatabaseUser(std::shared_ptr<const ZULingLanguageMap> languages);

  // Selects the database of the key, loading it if needed. An unknown key, or a file
  // that cannot be loaded, leaves no database selected.
  void setLanguage(const std::string& key);

  const ZULingDatabasePtr& database() const noexcept { return fDatabase; }
  const std::string& databasePath() const noexcept { return fPath; }

 private:
  std::shared_ptr<const ZULingLanguageMap> fLanguages;
  ZULingDatabasePtr fDatabase;
  std::string fPath;
};

}  // namespace ZU
