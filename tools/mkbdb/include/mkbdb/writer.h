#pragma once
// The writer of linguistic database files: reads plain lexicons and lays their words
// out as the compressed trie that ZULingSyntacticAnalyzerBinaryDatabase reads.
//
// Lexicon format (UTF-8 or any bytes; one word per line):
//
//   # a comment; blank lines are skipped
//   WORD<TAB>RECORD[<TAB>RECORD...]
//   RECORD = CLASS[/FEATURES][=BASEFORM]
//
// CLASS is a word class name ("noun", "verb", "unkonwn", ...) or its number, 4 to 17.
// FEATURES are feature bytes (any bytes but tab, "=" and line ends, at most 255).
// BASEFORM is the rest of the record (at most 255 bytes; it may hold "=" and "/").
// A word met again gets the new records after its earlier ones; a record equal to an
// earlier one of the same word is dropped. Words are stored byte for byte.
//
// Used by the mkbdb tool and by tests, from one thread at a time.

#include <cstddef>
#include <cstdint>
#include <istream>
#include <map>
#include <string>
#include <unordered_map>
#include <vector>

#include "mokuto/zulingwordclass.h"

namespace mkbdb {

struct Record {
  ZU::ZULingWordClass wordClass = ZU::WORD_CLASS_UNKNOWN;
  std::string features;
  bool hasBaseForm = false;
  std::string baseForm;

  bool operator==(const Record&) const = default;
};

struct Lexicon {
  // Sorted bytewise (unsigned), as the trie is built.
  std::map<std::string, std::vector<Record>> words;

  // Appends the record to the word's records unless the word already has it.
  void add(const std::string& word, Record record);
};

// Reads lexicon lines into the lexicon; throws std::runtime_error naming
// "source:line" on a malformed line.
void readLexicon(std::istream& in, const std::string& source, Lexicon& lexicon);

struct Options {
  // The language-wide flag byte of the file.
  std::uint8_t flag = 1;
  // Base forms stored before all others (gesture tags).
  std::vector<std::string> tags;
  // Base form -> how often its words occur; the base forms after the tags are stored
  // by decreasing frequency, then the shorter first.
  std::unordered_map<std::string, double> frequencies;
};

struct Report {
  std::size_t words = 0;
  std::size_t nodes = 0;
  // Distinct records written (records are shared between words).
  std::size_t distinctRecords = 0;
  // Records left out because a word had more than its node can hold.
  std::size_t droppedRecords = 0;
  std::size_t baseForms = 0;
  std::size_t baseFormsKept = 0;
  std::size_t baseFormBytes = 0;
  std::size_t tagsKept = 0;
  std::size_t fileSize = 0;
};

// The bytes of the database file; throws std::runtime_error when the lexicon cannot be
// laid out (a body past 4 GiB, an empty word).
std::string build(const Lexicon& lexicon, const Options& options, Report& report);

// The tags of every "behavior.json" under the directory (its "tags" arrays), sorted and
// unique; a file that cannot be read is skipped with a line on standard error.
std::vector<std::string> readBehaviorTags(const std::string& directory);

}  // namespace mkbdb
