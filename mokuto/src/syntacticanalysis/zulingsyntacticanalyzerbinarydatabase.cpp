#include "mokuto/zulingsyntacticanalyzerbinarydatabase.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "ko/log.hpp"
#include "ko/path.hpp"

namespace ZU {

namespace {

constexpr const char* kCategory = "syntacticanalyzer.bindatabase";
constexpr const char* kDataDirectory = "mokuto/syntacticanalysis/";

// Reads `size` bytes from the start of the file unless it ends first; the count read.
std::size_t readFully(int fd, void* buffer, std::size_t size) {
  auto* out = static_cast<char*>(buffer);
  std::size_t done = 0;
  while (done < size) {
    const ssize_t n = ::pread(fd, out + done, size - done, static_cast<off_t>(done));
    if (n < 0 && errno == EINTR)
      continue;
    if (n <= 0)
      break;
    done += static_cast<std::size_t>(n);
  }
  return done;
}

std::uint32_t littleEndian32(const std::uint8_t* p) noexcept {
  return static_cast<std::uint32_t>(p[0]) | static_cast<std::uint32_t>(p[1]) << 8 |
         static_cast<std::uint32_t>(p[2]) << 16 | static_cast<std::uint32_t>(p[3]) << 24;
}

class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fFd(fd) {}
  ~FileDescriptor() {
    if (fFd >= 0)
      ::close(fFd);
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  int get() const noexcept { return fFd; }

 private:
  int fFd;
};

}  // namespace

// A node read in place: where its label, feature lists and offset arrays start.
struct ZULingSyntacticAnalyzerBinaryDatabase::Node {
  std::uint32_t label = 0;
  std::uint8_t labelLength = 0;
  std::uint8_t recordCount = 0;
  std::uint8_t childCount = 0;
  std::uint32_t features = 0;
  std::uint32_t offsets = 0;
};

struct ZULingSyntacticAnalyzerBinaryDatabase::Record {
  ZULingWordClass wordClass = WORD_CLASS_UNKNOWN;
  bool hasLemma = false;
  std::uint32_t lemma = 0;
};

inline std::uint32_t ZULingSyntacticAnalyzerBinaryDatabase::xWord(
    std::uint64_t pos) const noexcept {
  return littleEndian32(xBytes() + pos);
}

bool ZULingSyntacticAnalyzerBinaryDatabase::xNode(std::uint32_t pos, Node& node) const noexcept {
  const std::uint8_t* b = xBytes();
  // labelLength, label, recordCount and childCount.
  if (pos >= size || std::uint64_t{pos} + 3 + b[pos] > size)
    return false;
  node.labelLength = b[pos];
  node.label = pos + 1;
  const std::uint32_t counts = node.label + node.labelLength;
  node.recordCount = b[counts];
  node.childCount = b[counts + 1];
  const std::uint64_t afterCounts = std::uint64_t{counts} + 2;
  std::uint64_t offsets = 0;
  if (node.recordCount > 0) {
    if (afterCounts >= size || b[afterCounts] == 0)
      return false;
    node.features = static_cast<std::uint32_t>(afterCounts + 1);
    offsets = afterCounts + b[afterCounts];
  } else {
    node.features = static_cast<std::uint32_t>(afterCounts);
    offsets = (afterCounts + 3) & ~std::uint64_t{3};
  }
  const std::uint64_t arraysEnd = offsets + 4 * (std::uint64_t{node.recordCount} + node.childCount);
  if (offsets % 4 != 0 || arraysEnd > size)
    return false;
  node.offsets = static_cast<std::uint32_t>(offsets);
  return true;
}

ZULingSyntacticAnalyzerBinaryDatabase::Record ZULingSyntacticAnalyzerBinaryDatabase::xRecord(
    const Node& node, std::size_t index) const noexcept {
  const std::uint8_t* b = xBytes();
  const std::uint32_t at = xWord(node.offsets + 4 * std::uint64_t{index});
  Record record;
  record.wordClass = static_cast<std::int8_t>(b[at]);
  record.hasLemma = b[at + 1] == 1;
  record.lemma = static_cast<std::uint32_t>(b[at + 2]) | static_cast<std::uint32_t>(b[at + 3]) << 8;
  return record;
}

bool ZULingSyntacticAnalyzerBinaryDatabase::xRecordsValid(const Node& node) const noexcept {
  const std::uint8_t* b = xBytes();
  // The feature lists fill the gap between the skip byte and the record offsets.
  std::uint64_t p = node.features;
  for (std::size_t r = 0; r < node.recordCount; ++r) {
    if (p >= node.offsets)
      return false;
    p += 1 + std::uint64_t{b[p]};
    if (p > node.offsets)
      return false;
  }
  for (std::size_t r = 0; r < node.recordCount; ++r) {
    const std::uint32_t at = xWord(node.offsets + 4 * std::uint64_t{r});
    if (std::uint64_t{at} + 4 > size)
      return false;
    const Record record = xRecord(node, r);
    if (record.hasLemma &&
        (record.lemma >= size || std::uint64_t{record.lemma} + 1 + b[record.lemma] > size))
      return false;
  }
  return true;
}

std::string_view ZULingSyntacticAnalyzerBinaryDatabase::xFeatures(
    const Node& node, std::size_t index) const noexcept {
  const auto* b = reinterpret_cast<const char*>(xBytes());
  std::size_t p = node.features;
  for (std::size_t r = 0; r < index; ++r)
    p += 1 + static_cast<std::uint8_t>(b[p]);
  return {b + p + 1, static_cast<std::uint8_t>(b[p])};
}

bool ZULingSyntacticAnalyzerBinaryDatabase::xFail(const std::string& path,
                                                  const std::string& problem) {
  KO_LOG_WARNING(kCategory) << "Linguistic database \"" << path << "\" is damaged: " << problem
                            << ". So, the database is not loaded.";
  return false;
}

bool ZULingSyntacticAnalyzerBinaryDatabase::load(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  struct stat status {};
  if (file.get() < 0 || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    KO_LOG_WARNING(kCategory) << "Linguistic database \"" << path << "\" not found.";
    return false;
  }

  size = 0;
  body.reset();
  root = 0;
  flag = 1;

  std::uint8_t header[kBodyStart] = {};
  const std::size_t headerRead = readFully(file.get(), header, kBodyStart);
  if (headerRead >= 4 && littleEndian32(header) != kVersion) {
    KO_LOG_WARNING(kCategory) << "Linguistic database \"" << path
                              << "\" is out of date. So, the database is not loaded.";
    return false;
  }
  if (headerRead < kBodyStart)
    return xFail(path, "its header is cut short at " + std::to_string(headerRead) + " bytes");

  const std::uint32_t rootOffset = littleEndian32(header + 8);
  const std::uint32_t tailSize = littleEndian32(header + 12);
  const std::uint64_t bodySize = std::uint64_t{rootOffset} + tailSize;
  const auto fileSize = static_cast<std::uint64_t>(status.st_size);
  // Bytes after the body are not read.
  if (bodySize > UINT32_MAX || bodySize > fileSize - kBodyStart)
    return xFail(path, "its header announces a body of " + std::to_string(bodySize) +
                           " bytes, the file holds " + std::to_string(fileSize - kBodyStart));
  if (rootOffset >= bodySize)
    return xFail(path, "its root offset " + std::to_string(rootOffset) + " lies past its body");

  constexpr std::size_t kLead = BodyDeleter::kLeadWords;
  auto* block = new (std::nothrow) std::uint32_t[kLead + (bodySize + 3) / 4];
  if (block == nullptr) {
    KO_LOG_WARNING(kCategory) << "Not enough RAM to load the linguistic database \"" << path
                              << "\".";
    return false;
  }
  std::unique_ptr<std::uint32_t[], BodyDeleter> owned(block + kLead);
  auto* fileStart = reinterpret_cast<char*>(owned.get()) - kBodyStart;
  if (readFully(file.get(), fileStart, kBodyStart + bodySize) != kBodyStart + bodySize)
    return xFail(path, "its body could not be read whole");

  body = std::move(owned);
  size = static_cast<std::uint32_t>(bodySize);
  Node rootNode;
  if (!xNode(rootOffset, rootNode)) {
    body.reset();
    size = 0;
    return xFail(path, "its root node does not fit in its body");
  }
  root = rootOffset;
  flag = header[16];
  return true;
}

std::optional<std::uint32_t> ZULingSyntacticAnalyzerBinaryDatabase::xWalk(
    std::string_view key, std::size_t start, std::size_t& longestPrefix,
    std::optional<std::uint32_t>* longestNode) const {
  longestPrefix = 0;
  const std::uint8_t* b = xBytes();
  Node node;
  if (start >= key.size() || !xNode(root, node))
    return std::nullopt;
  // The nodes with records met on the way, checked from the deepest back only once the
  // walk ends: the longest prefix is the deepest one whose records are sound.
  constexpr std::size_t kDepth = 16;
  std::uint32_t passed[kDepth];
  std::size_t passedLength[kDepth];
  std::size_t passedCount = 0;
  const auto settle = [&]() {
    while (passedCount > 0) {
      --passedCount;
      Node candidate;
      if (xNode(passed[passedCount], candidate) && xRecordsValid(candidate)) {
        longestPrefix = passedLength[passedCount];
        if (longestNode != nullptr)
          *longestNode = passed[passedCount];
        return;
      }
    }
  };
  std::size_t k = start;
  while (node.childCount > 0 && k < key.size()) {
    // The children are sorted by their first label byte (signed): a binary search. A
    // child without a first label byte cannot be walked to.
    const auto wanted = static_cast<std::int8_t>(key[k]);
    const std::uint64_t children = node.offsets + 4 * std::uint64_t{node.recordCount};
    std::uint32_t taken = 0;
    bool found = false;
    std::size_t low = 0;
    std::size_t high = node.childCount;
    while (low < high) {
      const std::size_t middle = (low + high) / 2;
      const std::uint32_t child = xWord(children + 4 * std::uint64_t{middle});
      if (std::uint64_t{child} + 1 >= size || b[child] == 0)
        break;
      const auto first = static_cast<std::int8_t>(b[child + 1]);
      if (first == wanted) {
        taken = child;
        found = true;
        break;
      }
      if (first < wanted)
        low = middle + 1;
      else
        high = middle;
    }
    Node next;
    if (!found || !xNode(taken, next) || next.labelLength > key.size() - k)
      break;
    const std::uint8_t* label = b + next.label;
    const auto* wantedBytes = reinterpret_cast<const std::uint8_t*>(key.data()) + k;
    std::size_t same = 1;
    while (same < next.labelLength && label[same] == wantedBytes[same])
      ++same;
    if (same != next.labelLength)
      break;
    k += next.labelLength;
    if (next.recordCount > 0) {
      if (k == key.size() && xRecordsValid(next)) {
        longestPrefix = k - start;
        if (longestNode != nullptr)
          *longestNode = taken;
        return taken;
      }
      if (passedCount == kDepth) {
        // Deep paths: settle what was passed so far and start again from here.
        settle();
        passedCount = 0;
      }
      passed[passedCount] = taken;
      passedLength[passedCount] = k - start;
      ++passedCount;
    }
    node = next;
  }
  if (passedCount > 0) {
    const std::size_t before = longestPrefix;
    settle();
    if (longestPrefix == 0)
      longestPrefix = before;
  }
  return std::nullopt;
}

std::optional<std::uint32_t> ZULingSyntacticAnalyzerBinaryDatabase::find(
    std::string_view key, std::size_t start, std::size_t& longestPrefix) const {
  return xWalk(key, start, longestPrefix, nullptr);
}

std::optional<std::uint32_t> ZULingSyntacticAnalyzerBinaryDatabase::findLongest(
    std::string_view key, std::size_t start, std::size_t& length) const {
  std::optional<std::uint32_t> node;
  xWalk(key, start, length, &node);
  return length > 0 ? node : std::nullopt;
}

std::vector<ZULingClassFeatures> ZULingSyntacticAnalyzerBinaryDatabase::wordClassesAt(
    std::uint32_t position) const {
  Node node;
  if (!xNode(position, node) || node.recordCount == 0 || !xRecordsValid(node))
    return {ZULingClassFeatures{WORD_CLASS_UNKNOWN, {}}};
  std::vector<ZULingClassFeatures> classes;
  classes.reserve(node.recordCount);
  for (std::size_t r = 0; r < node.recordCount; ++r)
    classes.push_back({xRecord(node, r).wordClass, std::string(xFeatures(node, r))});
  return classes;
}

bool ZULingSyntacticAnalyzerBinaryDatabase::lemmaAt(std::uint32_t position,
                                                    ZULingWordClass wordClass,
                                                    std::string& baseForm) const {
  baseForm.clear();
  Node node;
  if (wordClass < 2 || !xNode(position, node) || node.recordCount == 0 || !xRecordsValid(node))
    return false;
  for (std::size_t r = 0; r < node.recordCount; ++r) {
    const Record record = xRecord(node, r);
    if (record.wordClass != wordClass)
      continue;
    if (record.hasLemma) {
      const auto* b = reinterpret_cast<const char*>(xBytes());
      baseForm.assign(b + record.lemma + 1, static_cast<std::uint8_t>(b[record.lemma]));
    }
    break;
  }
  return true;
}

std::vector<ZULingClassFeatures> ZULingSyntacticAnalyzerBinaryDatabase::wordClasses(
    std::string_view word) const {
  std::size_t longestPrefix = 0;
  const std::optional<std::uint32_t> at = find(word, 0, longestPrefix);
  if (!at)
    return {ZULingClassFeatures{WORD_CLASS_UNKNOWN, {}}};
  return wordClassesAt(*at);
}

bool ZULingSyntacticAnalyzerBinaryDatabase::lemma(std::string_view word, ZULingWordClass wordClass,
                                                  std::string& baseForm) const {
  baseForm.clear();
  if (wordClass < 2)
    return false;
  std::size_t longestPrefix = 0;
  const std::optional<std::uint32_t> at = find(word, 0, longestPrefix);
  return at && lemmaAt(*at, wordClass, baseForm);
}

const ZULingLanguageFile kLingLanguageFiles[12] = {
    {"French", "frenchdatabase.bdb"},
    {"fr_FR", "frenchdatabase.bdb"},
    {"fr_CA", "frenchdatabase.bdb"},
    {"English", "englishdatabase.bdb"},
    {"en_US", "englishdatabase.bdb"},
    {"en_UK", "englishdatabase.bdb"},
    {"Japanese", "japanesedatabase.bdb"},
    {"ja_JP", "japanesedatabase.bdb"},
    {"FrenchEmotions", "frenchemotionsdatabase.bdb"},
    {"EnglishEmotions", "englishemotionsdatabase.bdb"},
    {"JapaneseEmotions", "japaneseemotionsdatabase.bdb"},
    {"ja_JPEmotions", "japaneseemotionsdatabase.bdb"},
};

ZULingLanguageMap makeLingLanguageMap() {
  ZULingLanguageMap languages;
  for (const ZULingLanguageFile& entry : kLingLanguageFiles) {
    const std::string relative = std::string(kDataDirectory) + entry.file;
    std::string path = ko::path::findData("zefoko", relative);
    languages[entry.key] = path.empty() ? relative : std::move(path);
  }
  return languages;
}

std::mutex& ZULingDatabaseCache::mutex() {
  static std::mutex cacheMutex;
  return cacheMutex;
}

ZULingDatabasePtr ZULingDatabaseCache::acquire(const std::string& path) {
  static std::map<std::string, std::shared_ptr<ZULingSyntacticAnalyzerBinaryDatabase>> cache;
  auto it = cache.find(path);
  if (it == cache.end()) {
    it = cache.emplace(path, std::make_shared<ZULingSyntacticAnalyzerBinaryDatabase>()).first;
    if (!it->second->load(path)) {
      cache.erase(it);
      return nullptr;
    }
  }
  return it->second;
}

ZULingDatabaseUser::ZULingDatabaseUser(std::shared_ptr<const ZULingLanguageMap> languages)
    : fLanguages(std::move(languages)) {}

void ZULingDatabaseUser::setLanguage(const std::string& key) {
  const std::lock_guard<std::mutex> lock(ZULingDatabaseCache::mutex());
  const auto language = fLanguages ? fLanguages->find(key) : ZULingLanguageMap::const_iterator{};
  if (!fLanguages || language == fLanguages->end()) {
    fDatabase.reset();
    fPath.clear();
    return;
  }
  if (fDatabase && fPath == language->second)
    return;
  fDatabase.reset();
  fPath.clear();
  fDatabase = ZULingDatabaseCache::acquire(language->second);
  if (fDatabase)
    fPath = language->second;
}

}  // namespace ZU
