#pragma once
// Linguistic databases for the tests: small lexicons built by mkbdb into files of a folder
// of their own, which goes with the object. One thread.

#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

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

class Folder {
 public:
  Folder() {
    static std::atomic<int> counter{0};
    dir = std::filesystem::temp_directory_path() /
          ("lingtest-" + std::to_string(::getpid()) + "-" + std::to_string(counter++));
    std::filesystem::create_directories(dir);
  }
  ~Folder() { std::filesystem::remove_all(dir); }
  Folder(const Folder&) = delete;
  Folder& operator=(const Folder&) = delete;

  // Writes these bytes under that name; answers the file's path.
  std::string write(const std::string& name, const std::string& bytes) const {
    const std::string path = (dir / name).string();
    std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
    return path;
  }
  // Writes the database of a lexicon text with that flag; answers its path.
  std::string database(const std::string& name, const std::string& lexiconText,
                       std::uint8_t flag) const {
    mkbdb::Options options;
    options.flag = flag;
    return write(name, build(lexiconText, options));
  }

  std::filesystem::path dir;
};

}  // namespace lingtest
