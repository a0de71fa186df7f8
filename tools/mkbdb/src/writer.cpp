#include "mkbdb/writer.h"

#include <algorithm>
#include <charconv>
#include <deque>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <nlohmann/json.hpp>
#include <set>
#include <stdexcept>
#include <string_view>
#include <tuple>
#include <unordered_set>

namespace mkbdb {

namespace {

constexpr std::size_t kBaseFormArea = 65536;
constexpr std::size_t kMaxLabel = 255;
constexpr std::size_t kMaxRecords = 255;
// The skip byte covers itself, the feature lists and up to 3 bytes of padding.
constexpr std::size_t kMaxFeatureBytes = 255 - 1 - 3;

[[noreturn]] void fail(const std::string& source, std::size_t line, const std::string& what) {
  throw std::runtime_error(source + ":" + std::to_string(line) + ": " + what);
}

Record parseRecord(std::string_view text, const std::string& source, std::size_t line) {
  Record record;
  const std::size_t equals = text.find('=');
  const std::string_view head = text.substr(0, equals);
  if (equals != std::string_view::npos) {
    record.hasBaseForm = true;
    record.baseForm = text.substr(equals + 1);
    if (record.baseForm.size() > 255)
      fail(source, line, "a base form longer than 255 bytes");
  }
  const std::size_t slash = head.find('/');
  const std::string_view className = head.substr(0, slash);
  if (slash != std::string_view::npos) {
    record.features = head.substr(slash + 1);
    if (record.features.size() > 255)
      fail(source, line, "more than 255 feature bytes");
  }
  ZU::ZULingWordClass wordClass = ZU::lingWordClassFromStr(className);
  if (wordClass == ZU::WORD_CLASS_END_OF_ENUM) {
    int number = -1;
    const auto [end, ec] =
        std::from_chars(className.data(), className.data() + className.size(), number);
    if (ec == std::errc() && end == className.data() + className.size())
      wordClass = number;
  }
  if (wordClass < ZU::WORD_CLASS_UNKNOWN || wordClass >= ZU::WORD_CLASS_END_OF_ENUM)
    fail(source, line, "\"" + std::string(className) + "\" is not a word class of a database");
  record.wordClass = wordClass;
  return record;
}

struct TrieNode {
  std::string label;
  const std::vector<Record>* records = nullptr;
  std::vector<std::size_t> children;
};

class TrieBuilder {
 public:
  explicit TrieBuilder(const Lexicon& lexicon) {
    fWords.reserve(lexicon.words.size());
    for (const auto& [word, records] : lexicon.words)
      fWords.push_back({&word, &records});
    fNodes.emplace_back();
    fNodes[0].children = xChildren(0, fWords.size(), 0);
  }

  std::vector<TrieNode>& nodes() { return fNodes; }

 private:
  struct Word {
    const std::string* text;
    const std::vector<Record>* records;
  };

  // The child nodes for words[lo, hi), which all share their first `depth` bytes and are
  // all longer than that; sorted by their first label byte as a signed char.
  std::vector<std::size_t> xChildren(std::size_t lo, std::size_t hi, std::size_t depth) {
    std::vector<std::size_t> kids;
    std::size_t i = lo;
    while (i < hi) {
      const std::string& first = *fWords[i].text;
      const char byte = first[depth];
      std::size_t j = i + 1;
      while (j < hi && (*fWords[j].text)[depth] == byte)
        ++j;
      const std::string& last = *fWords[j - 1].text;
      std::size_t common = depth + 1;
      while (common < first.size() && common < last.size() && first[common] == last[common])
        ++common;
      std::size_t rest = i;
      const std::vector<Record>* records = nullptr;
      if (first.size() == common) {
        records = fWords[i].records;
        ++rest;
      }
      std::vector<std::size_t> grandChildren = xChildren(rest, j, common);
      kids.push_back(
          xChain(first.substr(depth, common - depth), records, std::move(grandChildren)));
      i = j;
    }
    std::stable_partition(kids.begin(), kids.end(), [this](std::size_t k) {
      return static_cast<signed char>(fNodes[k].label[0]) < 0;
    });
    return kids;
  }

  // A node with that label, split into a chain of nodes when the label is too long for
  // one; the first node of the chain.
  std::size_t xChain(std::string label, const std::vector<Record>* records,
                     std::vector<std::size_t> children) {
    std::string tail;
    if (label.size() > kMaxLabel) {
      tail = label.substr(kMaxLabel);
      label.resize(kMaxLabel);
      children = {xChain(std::move(tail), records, std::move(children))};
      records = nullptr;
    }
    fNodes.push_back({std::move(label), records, std::move(children)});
    return fNodes.size() - 1;
  }

  std::vector<Word> fWords;
  std::vector<TrieNode> fNodes;
};

void put32(std::string& out, std::size_t at, std::uint32_t value) {
  for (int i = 0; i < 4; ++i)
    out[at + static_cast<std::size_t>(i)] = static_cast<char>((value >> (8 * i)) & 0xFF);
}

std::size_t align4(std::size_t position) {
  return (position + 3) & ~std::size_t{3};
}

}  // namespace

void Lexicon::add(const std::string& word, Record record) {
  std::vector<Record>& records = words[word];
  if (std::find(records.begin(), records.end(), record) == records.end())
    records.push_back(std::move(record));
}

void readLexicon(std::istream& in, const std::string& source, Lexicon& lexicon) {
  std::string line;
  std::size_t number = 0;
  while (std::getline(in, line)) {
    ++number;
    if (!line.empty() && line.back() == '\r')
      line.pop_back();
    if (line.empty() || line[0] == '#')
      continue;
    const std::size_t tab = line.find('\t');
    if (tab == 0)
      fail(source, number, "an empty word");
    if (tab == std::string::npos)
      fail(source, number, "a word without records");
    const std::string word = line.substr(0, tab);
    std::size_t start = tab + 1;
    while (start <= line.size()) {
      const std::size_t end = std::min(line.find('\t', start), line.size());
      if (end > start)
        lexicon.add(word,
                    parseRecord(std::string_view(line).substr(start, end - start), source, number));
      start = end + 1;
    }
  }
}

std::string build(const Lexicon& lexicon, const Options& options, Report& report) {
  report = Report{};
  report.words = lexicon.words.size();

  // Base forms: the tags first, then by decreasing frequency, the shorter first, each
  // while it fits in the first 64 KiB of the body.
  std::set<std::string> baseForms;
  for (const auto& [word, records] : lexicon.words) {
    if (word.empty())
      throw std::runtime_error("an empty word cannot be stored");
    for (const Record& record : records) {
      if (record.hasBaseForm)
        baseForms.insert(record.baseForm);
    }
  }
  const std::unordered_set<std::string> tags(options.tags.begin(), options.tags.end());
  std::vector<const std::string*> order;
  order.reserve(baseForms.size());
  for (const std::string& form : baseForms)
    order.push_back(&form);
  auto rank = [&](const std::string* form) {
    const auto frequency = options.frequencies.find(*form);
    return std::make_tuple(tags.count(*form) == 0,
                           frequency == options.frequencies.end() ? 0.0 : -frequency->second,
                           form->size(), std::string_view(*form));
  };
  std::stable_sort(order.begin(), order.end(),
                   [&](const std::string* a, const std::string* b) { return rank(a) < rank(b); });

  std::string body;
  std::unordered_map<std::string, std::uint16_t> baseFormOffsets;
  for (const std::string* form : order) {
    if (body.size() + 1 + form->size() > kBaseFormArea)
      continue;
    baseFormOffsets.emplace(*form, static_cast<std::uint16_t>(body.size()));
    body += static_cast<char>(form->size());
    body += *form;
    report.tagsKept += tags.count(*form);
  }
  report.baseForms = baseForms.size();
  report.baseFormsKept = baseFormOffsets.size();
  report.baseFormBytes = body.size();

  // Records, shared by every word that has the same one.
  std::map<std::tuple<ZU::ZULingWordClass, bool, std::uint16_t>, std::uint32_t> recordOffsets;
  auto recordKey = [&](const Record& record) {
    const auto kept =
        record.hasBaseForm ? baseFormOffsets.find(record.baseForm) : baseFormOffsets.end();
    return kept == baseFormOffsets.end()
               ? std::make_tuple(record.wordClass, false, std::uint16_t{0})
               : std::make_tuple(record.wordClass, true, kept->second);
  };
  for (const auto& [word, records] : lexicon.words) {
    for (const Record& record : records) {
      const auto key = recordKey(record);
      if (recordOffsets.count(key) != 0)
        continue;
      recordOffsets.emplace(key, static_cast<std::uint32_t>(body.size()));
      body += static_cast<char>(static_cast<std::int8_t>(std::get<0>(key)));
      body += static_cast<char>(std::get<1>(key) ? 1 : 0);
      body += static_cast<char>(std::get<2>(key) & 0xFF);
      body += static_cast<char>(std::get<2>(key) >> 8);
    }
  }
  report.distinctRecords = recordOffsets.size();

  TrieBuilder trie(lexicon);
  std::vector<TrieNode>& nodes = trie.nodes();
  report.nodes = nodes.size();

  // How many records of each word its node can hold.
  auto keptRecords = [&](const TrieNode& node) {
    if (node.records == nullptr)
      return std::size_t{0};
    std::size_t count = 0;
    std::size_t featureBytes = 0;
    for (const Record& record : *node.records) {
      if (count == kMaxRecords || featureBytes + 1 + record.features.size() > kMaxFeatureBytes)
        break;
      featureBytes += 1 + record.features.size();
      ++count;
    }
    return count;
  };

  // Nodes breadth first from the root, which starts the second area of the body.
  const std::size_t rootOffset = body.size();
  std::vector<std::size_t> order2{0};
  for (std::size_t i = 0; i < order2.size(); ++i) {
    for (const std::size_t child : nodes[order2[i]].children)
      order2.push_back(child);
  }
  std::vector<std::size_t> positions(nodes.size());
  std::size_t position = rootOffset;
  for (const std::size_t n : order2) {
    const TrieNode& node = nodes[n];
    positions[n] = position;
    const std::size_t records = keptRecords(node);
    report.droppedRecords += node.records ? node.records->size() - records : 0;
    std::size_t offsets = position + 1 + node.label.size() + 2;
    if (records > 0) {
      offsets += 1;
      for (std::size_t r = 0; r < records; ++r)
        offsets += 1 + (*node.records)[r].features.size();
    }
    position = align4(offsets) + 4 * (records + node.children.size());
  }
  if (position > UINT32_MAX)
    throw std::runtime_error("the body would pass 4 GiB");

  body.resize(position, '\0');
  for (const std::size_t n : order2) {
    const TrieNode& node = nodes[n];
    const std::size_t records = keptRecords(node);
    std::size_t p = positions[n];
    body[p++] = static_cast<char>(node.label.size());
    body.replace(p, node.label.size(), node.label);
    p += node.label.size();
    body[p++] = static_cast<char>(records);
    body[p++] = static_cast<char>(node.children.size());
    if (records > 0) {
      const std::size_t skip = p++;
      for (std::size_t r = 0; r < records; ++r) {
        const std::string& features = (*node.records)[r].features;
        body[p++] = static_cast<char>(features.size());
        body.replace(p, features.size(), features);
        p += features.size();
      }
      body[skip] = static_cast<char>(align4(p) - skip);
    }
    p = align4(p);
    for (std::size_t r = 0; r < records; ++r, p += 4)
      put32(body, p, recordOffsets.at(recordKey((*node.records)[r])));
    for (const std::size_t child : node.children) {
      put32(body, p, static_cast<std::uint32_t>(positions[child]));
      p += 4;
    }
  }

  std::string file(17, '\0');
  put32(file, 0, 2);
  put32(file, 4, static_cast<std::uint32_t>(std::min<std::size_t>(report.words, UINT32_MAX)));
  put32(file, 8, static_cast<std::uint32_t>(rootOffset));
  put32(file, 12, static_cast<std::uint32_t>(body.size() - rootOffset));
  file[16] = static_cast<char>(options.flag);
  file += body;
  report.fileSize = file.size();
  return file;
}

std::vector<std::string> readBehaviorTags(const std::string& directory) {
  namespace fs = std::filesystem;
  std::set<std::string> tags;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(directory, ec), end; !ec && it != end;
       it.increment(ec)) {
    if (it->path().filename() != "behavior.json")
      continue;
    try {
      std::ifstream in(it->path());
      const nlohmann::json behavior = nlohmann::json::parse(in);
      for (const auto& tag : behavior.value("tags", nlohmann::json::array())) {
        if (tag.is_string())
          tags.insert(tag.get<std::string>());
      }
    } catch (const std::exception& e) {
      std::cerr << "mkbdb: skipping " << it->path().string() << ": " << e.what() << '\n';
    }
  }
  if (ec)
    std::cerr << "mkbdb: cannot read " << directory << ": " << ec.message() << '\n';
  return {tags.begin(), tags.end()};
}

}  // namespace mkbdb
