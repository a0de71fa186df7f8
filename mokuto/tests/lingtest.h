#pragma once
// Linguistic databases for the tests: small lexicons built by mkbdb into files of a folder
// of their own, which goes with the object. One thread.

#include <cstdint>
#include <sstream>
#include <string>

#include "ko_test_helpers.hpp"
#include "mkbdb/writer.h"

namespace lingtest {

// The file's bytes of a lexicon text.
inline std::string build(const std::string& lexiconText, const mkbdb::Options& options = {},
                         mkbdb::Report* report = nullptr) {
  mkbdb::Lexicon lexicon;
  std::istringstream in(lexiconText);
  mkbdb::readLexicon(in, "test", lexicon);
  mkbdb::Report local;
  return mkbdb::build(lexicon, options, report ? *report : local);
}

// A scratch folder that also writes databases.
class Folder : public ko::test::ScratchFolder {
 public:
  // Writes the database of a lexicon text with that flag; answers its path.
  std::string database(const std::string& name, const std::string& lexiconText,
                       std::uint8_t flag) const {
    mkbdb::Options options;
    options.flag = flag;
    return write(name, build(lexiconText, options));
  }
};

}  // namespace lingtest
