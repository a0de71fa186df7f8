// mkbdb: builds a linguistic database file from plain lexicons (see mkbdb/writer.h for
// their format).
#include <CLI/CLI.hpp>
#include <algorithm>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include "mkbdb/writer.h"

namespace {

std::vector<std::string> readLines(const std::string& path) {
  std::ifstream in(path);
  if (!in)
    throw std::runtime_error("cannot open " + path);
  std::vector<std::string> lines;
  std::string line;
  while (std::getline(in, line)) {
    if (!line.empty() && line.back() == '\r')
      line.pop_back();
    if (!line.empty() && line[0] != '#')
      lines.push_back(line);
  }
  return lines;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{"mkbdb: build a linguistic database file from plain lexicons"};
  std::string output;
  int flag = 1;
  std::vector<std::string> lexicons;
  std::vector<std::string> tagFiles;
  std::vector<std::string> behaviorDirectories;
  std::string frequencyFile;
  bool quiet = false;
  app.add_option("-o,--output", output, "The database file to write")->required();
  app.add_option("--flag", flag,
                 "The language flag byte: 1 for languages written with spaces "
                 "between words, 0 for the others")
      ->check(CLI::Range(0, 255));
  app.add_option("--tags", tagFiles, "A file of gesture tags, one per line: base forms kept first");
  app.add_option("--behaviors", behaviorDirectories,
                 "A behaviour library: the tags of its behavior.json files are kept first");
  app.add_option("--frequencies", frequencyFile,
                 "A file of BASEFORM<TAB>COUNT lines: base forms kept by decreasing count");
  app.add_flag("-q,--quiet", quiet, "Print no report");
  app.add_option("lexicons", lexicons, "Lexicon files")->required()->check(CLI::ExistingFile);
  CLI11_PARSE(app, argc, argv);

  try {
    mkbdb::Lexicon lexicon;
    for (const std::string& path : lexicons) {
      std::ifstream in(path, std::ios::binary);
      mkbdb::readLexicon(in, path, lexicon);
    }
    mkbdb::Options options;
    options.flag = static_cast<std::uint8_t>(flag);
    for (const std::string& path : tagFiles) {
      for (std::string& tag : readLines(path))
        options.tags.push_back(std::move(tag));
    }
    for (const std::string& directory : behaviorDirectories) {
      for (std::string& tag : mkbdb::readBehaviorTags(directory))
        options.tags.push_back(std::move(tag));
    }
    std::sort(options.tags.begin(), options.tags.end());
    options.tags.erase(std::unique(options.tags.begin(), options.tags.end()), options.tags.end());
    if (!frequencyFile.empty()) {
      for (const std::string& line : readLines(frequencyFile)) {
        const std::size_t tab = line.rfind('\t');
        if (tab != std::string::npos && tab > 0)
          options.frequencies[line.substr(0, tab)] += std::stod(line.substr(tab + 1));
      }
    }

    mkbdb::Report report;
    const std::string bytes = mkbdb::build(lexicon, options, report);
    const std::string temporary = output + ".tmp";
    {
      std::ofstream out(temporary, std::ios::binary | std::ios::trunc);
      out.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
      if (!out.flush())
        throw std::runtime_error("cannot write " + temporary);
    }
    std::filesystem::rename(temporary, output);
    if (!quiet) {
      std::cout << std::filesystem::path(output).filename().string() << ": " << report.fileSize
                << " bytes, " << report.words << " words, " << report.nodes << " nodes, "
                << report.distinctRecords << " distinct records";
      if (report.droppedRecords > 0)
        std::cout << " (" << report.droppedRecords << " records left out)";
      std::cout << ", " << report.baseFormsKept << " of " << report.baseForms
                << " base forms kept (" << report.baseFormBytes << " bytes; " << report.tagsKept
                << " of " << options.tags.size() << " gesture tags)\n";
    }
  } catch (const std::exception& e) {
    std::cerr << "mkbdb: " << e.what() << '\n';
    return 1;
  }
  return 0;
}
