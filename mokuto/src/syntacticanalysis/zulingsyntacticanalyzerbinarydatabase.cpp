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

std::uint32_t ZULingSyntacticAnalyzerBinaryDatabase::xWord(std::uint64_t pos) const noexcept {
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
  if (bodySize > UINT32_MAX || bodySize != fileSize - kBodyStart)
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
  if (readFully(file.get(), fileStart, fileSize) != fileSize)
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

std::optional<std::uint32_t> ZULingSyntacticAnalyzerBinaryDatabase::find(
    std::string_view key, std::size_t start, std::size_t& longestPrefix) const {
  longestPrefix = 0;
  const std::uint8_t* b = xBytes();
  Node node;
  if (start >= key.size() || !xNode(root, node))
    return std::nullopt;
  std::size_t k = start;
  while (node.childCount > 0 && k < key.size()) {
    const auto wanted = static_cast<std::int8_t>(key[k]);
    std::uint32_t taken = 0;
    bool found = false;
    for (std::size_t c = 0; c < node.childCount; ++c) {
      const std::uint32_t child = xWord(node.offsets + 4 * (std::uint64_t{node.recordCount} + c));
      // A child without a first label byte cannot be walked to.
      if (std::uint64_t{child} + 1 >= size || b[child] == 0)
        return std::nullopt;
      const auto first = static_cast<std::int8_t>(b[child + 1]);
      if (first > wanted)
        return std::nullopt;
      if (first == wanted) {
        taken = child;
        found = true;
        break;
      }
    }
    Node next;
    if (!found || !xNode(taken, next) || next.labelLength > key.size() - k ||
        std::memcmp(b + next.label + 1, key.data() + k + 1, next.labelLength - 1u) != 0)
      return std::nullopt;
    k += next.labelLength;
    if (next.recordCount > 0 && xRecordsValid(next)) {
      longestPrefix = k - start;
      if (k == key.size())
        return taken;
    }
    node = next;
  }
  return std::nullopt;
}

std::vector<ZULingClassFeatures> ZULingSyntacticAnalyzerBinaryDatabase::wordClasses(
    std::string_view word) const {
  std::size_t longestPrefix = 0;
  Node node;
  const std::optional<std::uint32_t> at = find(word, 0, longestPrefix);
  if (!at || !xNode(*at, node))
    return {ZULingClassFeatures{WORD_CLASS_UNKNOWN, {}}};
  std::vector<ZULingClassFeatures> classes;
  classes.reserve(node.recordCount);
  for (std::size_t r = 0; r < node.recordCount; ++r)
    classes.push_back({xRecord(node, r).wordClass, std::string(xFeatures(node, r))});
  return classes;
}

bool ZULingSyntacticAnalyzerBinaryDatabase::lemma(std::string_view word, ZULingWordClass wordClass,
                                                  std::string& baseForm) const {
  baseForm.clear();
  if (wordClass < 2)
    return false;
  std::size_t longestPrefix = 0;
  Node node;
  const std::optional<std::uint32_t> at = find(word, 0, longestPrefix);
  if (!at || !xNode(*at, node))
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
