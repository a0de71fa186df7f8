#include "mokuto/zumokutoparser.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <limits>
#include <memory>
#include <new>
#include <stdexcept>
#include <string_view>
#include <utility>
#include <vector>

#include "ko/log.hpp"

namespace ZU {

namespace {

constexpr std::size_t npos = std::string_view::npos;

using ByteSet = std::array<bool, 256>;

constexpr ByteSet byteSet(std::string_view bytes, bool complement = false) {
  ByteSet set{};
  for (auto& member : set) {
    member = complement;
  }
  for (const char c : bytes) {
    set[static_cast<unsigned char>(c)] = !complement;
  }
  return set;
}

constexpr ByteSet kScanStops = byteSet("^$\\");
constexpr ByteSet kSoundStops = byteSet("(),");
constexpr ByteSet kSpace = byteSet(" ");
constexpr ByteSet kDot = byteSet(".");
constexpr ByteSet kMethodEnd = byteSet(" (");
constexpr ByteSet kNonSpace = byteSet(" ", true);
constexpr ByteSet kWalkStops = byteSet("()\"\\");

inline unsigned char byteAt(std::string_view text, std::size_t k) {
  return static_cast<unsigned char>(text[k]);
}

// The first "^", "$" or backslash at or after `from`, or the text's length. Reads eight
// bytes at a time: a byte of the word equals one of the three exactly where the
// classic "has a zero byte" test on the word xor that byte repeated finds a zero; the
// lowest flagged byte is exact.
std::size_t findScanStop(std::string_view text, std::size_t from) {
  const std::size_t size = text.size();
  std::size_t k = from;
  if constexpr (std::endian::native == std::endian::little) {
    constexpr std::uint64_t kOnes = 0x0101010101010101ULL;
    constexpr std::uint64_t kHighs = 0x8080808080808080ULL;
    constexpr std::uint64_t kCaret = kOnes * static_cast<unsigned char>('^');
    constexpr std::uint64_t kDollar = kOnes * static_cast<unsigned char>('$');
    constexpr std::uint64_t kBackslash = kOnes * static_cast<unsigned char>('\\');
    const auto zeroBytes = [](std::uint64_t word) { return (word - kOnes) & ~word & kHighs; };
    while (k + 8 <= size) {
      std::uint64_t word = 0;
      std::memcpy(&word, text.data() + k, sizeof word);
      const std::uint64_t found =
          zeroBytes(word ^ kCaret) | zeroBytes(word ^ kDollar) | zeroBytes(word ^ kBackslash);
      if (found != 0) {
        return k + static_cast<std::size_t>(std::countr_zero(found)) / 8;
      }
      k += 8;
    }
  }
  while (k < size && !kScanStops[byteAt(text, k)]) {
    ++k;
  }
  return k;
}

inline bool isNameByte(unsigned char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9');
}

// A decimal integer, optionally signed ("+" or "-"), and nothing else.
bool parseDecimal(std::string_view digits, std::int32_t& out) noexcept {
  if (!digits.empty() && digits.front() == '+') {
    digits.remove_prefix(1);
    if (!digits.empty() && digits.front() == '-') {
      return false;
    }
  }
  if (digits.empty()) {
    return false;
  }
  std::int32_t value = 0;
  const char* last = digits.data() + digits.size();
  const auto [end, ec] = std::from_chars(digits.data(), last, value);
  if (ec != std::errc() || end != last) {
    return false;
  }
  out = value;
  return true;
}

// Finds the first stop byte at or after a position, and the last "mark" byte before
// it. The answer of the last search is kept: any later search that starts inside the
// same stop-free stretch is answered without reading the text again, so searches
// that start at rising positions read each byte once in all.
class ForwardScan {
 public:
  ForwardScan(std::string_view text, const ByteSet& stops, int mark = -1)
      : text_(text), stops_(stops), mark_(mark) {}

  // {first stop at or after q (or the text's length), last mark in [q, stop) or npos}
  std::pair<std::size_t, std::size_t> from(std::size_t q) {
    q = std::min(q, text_.size());
    if (!(scannedFrom_ <= q && q <= stop_)) {
      std::size_t k = q;
      std::size_t lastMark = npos;
      while (k < text_.size() && !stops_[byteAt(text_, k)]) {
        if (byteAt(text_, k) == mark_) {
          lastMark = k;
        }
        ++k;
      }
      scannedFrom_ = q;
      stop_ = k;
      lastMark_ = lastMark;
    }
    return {stop_, (lastMark_ != npos && lastMark_ >= q) ? lastMark_ : npos};
  }

 private:
  std::string_view text_;
  const ByteSet& stops_;
  int mark_;
  std::size_t scannedFrom_ = npos;
  std::size_t stop_ = 0;
  std::size_t lastMark_ = npos;
};

// The count of a walk to a closing parenthesis, fed the bytes that no backslash hides
// (backslashes are the walk's own business).
struct WalkCount {
  // True when `c` is the closing parenthesis. Forced inline: left to itself the compiler
  // keeps the count in memory, and the walk slows by a tenth.
  [[gnu::always_inline]] bool closes(unsigned char c) {
    if (quoted) {
      quoted = c != '"';
    } else if (c == ')') {
      if (depth == 0) {
        return true;
      }
      --depth;
    } else if (c == '(') {
      ++depth;
    } else if (c == '"') {
      quoted = true;
    }
    return false;
  }

  std::size_t depth = 0;
  bool quoted = false;
};

// Finds the parenthesis that closes a walk started at a position: outside double
// quotes "(" opens and ")" closes, inside them only a double quote counts, and a
// backslash hides the byte after it.
//
// Walking from every unclosed "(" to the end of the text would make a parse quadratic,
// so, past a budget of walked bytes, one reference walk over the whole text is
// indexed: for each position, whether the reference walk skips it (backslash) and on
// which side of the quotes it is, and for each of the two quote sides, a counter of
// parentheses with, at each position, the next position where that counter drops by
// one. A walk from p that agrees with the reference walk on skipping meets the same
// quotes, so it counts the parentheses of one side only; its closing parenthesis is
// where that side's counter first falls below its value at p.
class ParenMatcher {
 public:
  ParenMatcher(std::string_view text, ZUMokutoParser::Matching matching)
      : text_(text), matching_(matching), budget_(4 * text.size() + 1024) {}

  // The position of the closing parenthesis, or npos.
  std::size_t match(std::size_t p) {
    if (p >= text_.size()) {
      return npos;
    }
    if (!indexed_) {
      const bool indexable = text_.size() < kNone / 4;
      if (matching_ == ZUMokutoParser::Matching::Walk || !indexable) {
        std::size_t unlimited = std::numeric_limits<std::size_t>::max();
        return walk(p, unlimited);
      }
      if (matching_ == ZUMokutoParser::Matching::Adaptive) {
        const std::size_t found = walk(p, budget_);
        if (budget_ > 0) {
          return found;
        }
      }
      buildIndex();
    }
    return lookUp(p);
  }

 private:
  static constexpr std::uint32_t kNone = std::numeric_limits<std::uint32_t>::max();
  static constexpr std::uint8_t kSkipped = 1;
  static constexpr std::uint8_t kQuoted = 2;

  // The walk itself; stops early, with budget 0 and npos, when the budget runs out.
  std::size_t walk(std::size_t p, std::size_t& budget) const {
    const std::size_t size = text_.size();
    WalkCount count;
    for (std::size_t x = p; x < size; ++x) {
      std::size_t stop = x;
      while (stop < size && !kWalkStops[byteAt(text_, stop)]) {
        ++stop;
      }
      const std::size_t steps = stop - x + 1;
      if (steps > budget) {
        budget = 0;
        return npos;
      }
      budget -= steps;
      x = stop;
      if (x >= size) {
        break;
      }
      const unsigned char c = byteAt(text_, x);
      if (c == '\\') {
        ++x;
      } else if (count.closes(c)) {
        return x;
      }
    }
    return npos;
  }

  void buildIndex() {
    const std::size_t size = text_.size();
    flags_.assign(size + 1, 0);
    bool skip = false;
    std::uint8_t side = 0;
    std::array<std::int64_t, 2> count{0, 0};
    std::int64_t lowest = 0;
    std::int64_t highest = 0;
    for (std::size_t k = 0; k < size; ++k) {
      flags_[k] = static_cast<std::uint8_t>((skip ? kSkipped : 0) | (side != 0 ? kQuoted : 0));
      const unsigned char c = byteAt(text_, k);
      if (skip) {
        skip = false;
      } else if (c == '\\') {
        skip = true;
      } else if (c == '"') {
        side ^= 1;
      } else if (c == '(') {
        highest = std::max(highest, ++count[side]);
      } else if (c == ')') {
        lowest = std::min(lowest, --count[side]);
      }
    }
    flags_[size] = static_cast<std::uint8_t>((skip ? kSkipped : 0) | (side != 0 ? kQuoted : 0));

    // Backwards, undoing each byte's count: lastAt[value - lowest + 1] is the first
    // position after k where that side's counter has that value.
    std::array<std::vector<std::uint32_t>, 2> lastAt;
    for (std::size_t s = 0; s < 2; ++s) {
      down_[s].assign(size + 1, kNone);
      lastAt[s].assign(static_cast<std::size_t>(highest - lowest) + 2, kNone);
    }
    for (std::size_t k = size + 1; k-- > 0;) {
      if (k < size && (flags_[k] & kSkipped) == 0) {
        const unsigned char c = byteAt(text_, k);
        const std::size_t s = (flags_[k] & kQuoted) != 0 ? 1 : 0;
        if (c == '(') {
          --count[s];
        } else if (c == ')') {
          ++count[s];
        }
      }
      for (std::size_t s = 0; s < 2; ++s) {
        const auto slot = static_cast<std::size_t>(count[s] - lowest + 1);
        down_[s][k] = lastAt[s][slot - 1];
        lastAt[s][slot] = static_cast<std::uint32_t>(k);
      }
    }
    indexed_ = true;
  }

  std::size_t lookUp(std::size_t p) const {
    const std::size_t size = text_.size();
    WalkCount count;
    bool skip = false;
    std::size_t x = p;
    // Walk by hand while this walk and the reference walk skip different bytes (the
    // reference walk skips p when a backslash precedes it).
    while (x < size && skip != ((flags_[x] & kSkipped) != 0)) {
      const unsigned char c = byteAt(text_, x);
      if (skip) {
        skip = false;
      } else if (c == '\\') {
        skip = true;
      } else if (count.closes(c)) {
        return x;
      }
      ++x;
    }
    if (x >= size) {
      return npos;
    }
    const bool referenceQuoted = (flags_[x] & kQuoted) != 0;
    const std::size_t side = (referenceQuoted != count.quoted) ? 1 : 0;
    std::size_t k = x;
    for (std::size_t drop = 0; drop <= count.depth; ++drop) {
      const std::uint32_t next = down_[side][k];
      if (next == kNone) {
        return npos;
      }
      k = next;
    }
    return k - 1;
  }

  std::string_view text_;
  ZUMokutoParser::Matching matching_;
  std::size_t budget_;
  bool indexed_ = false;
  std::vector<std::uint8_t> flags_;
  std::array<std::vector<std::uint32_t>, 2> down_;
};

// Makes the records of one text and their condition variables a block at a time,
// instead of two allocations per record. A record is handed out through an aliasing
// pointer that keeps its block alive, so a block is freed with the last of its records
// (the records of a job live and die together). The record made last stays pending
// until it is kept: the parse drops it when the instruction turns out not to be one
// (its parentheses never close), and the next record takes its place.
//
// Used by one parse, in the parse's thread; the kept records may be released in any.
class RecordStore {
 public:
  // `expected`: how many records the text may hold, which sizes the first block.
  explicit RecordStore(std::size_t expected)
      : nextCapacity_(std::clamp<std::size_t>(expected, kMinFirstCapacity, kMaxFirstCapacity)) {}

  RecordStore(const RecordStore&) = delete;
  RecordStore& operator=(const RecordStore&) = delete;

  ~RecordStore() { drop(); }

  template <class Record>
  Record& make(MKTaskActionType type) {
    drop();
    if (!block_ || block_->count == block_->capacity) {
      grow();
    }
    const std::size_t k = block_->count;
    auto* record = ::new (static_cast<void*>(block_->slots[k].bytes))
        Record(type, std::shared_ptr<std::condition_variable>(conditions_, conditions_.get() + k));
    block_->slots[k].record = record;
    block_->count = k + 1;
    pending_ = true;
    return *record;
  }

  // The pending record, shared from now on.
  std::shared_ptr<MKTaskAction> keep() {
    pending_ = false;
    return {block_, block_->slots[block_->count - 1].record};
  }

  // Destroys the pending record, if any; its place goes to the next one.
  void drop() noexcept {
    if (pending_) {
      pending_ = false;
      --block_->count;
      block_->slots[block_->count].record->~MKTaskAction();
    }
  }

 private:
  static constexpr std::size_t kMinFirstCapacity = 4;
  static constexpr std::size_t kMaxFirstCapacity = 32;
  static constexpr std::size_t kMaxCapacity = 256;
  static constexpr std::size_t kSlotSize =
      std::max({sizeof(MKTaskAction), sizeof(MKAnimationAction), sizeof(MKSoundAction),
                sizeof(MKCallAction), sizeof(MKModeAction), sizeof(MKAffectationAction)});
  static constexpr std::size_t kSlotAlign =
      std::max({alignof(MKTaskAction), alignof(MKAnimationAction), alignof(MKSoundAction),
                alignof(MKCallAction), alignof(MKModeAction), alignof(MKAffectationAction)});

  struct Slot {
    alignas(kSlotAlign) std::byte bytes[kSlotSize];
    MKTaskAction* record;
  };

  struct Block {
    explicit Block(std::size_t slotCount)
        : slots(std::make_unique_for_overwrite<Slot[]>(slotCount)), capacity(slotCount) {}
    Block(const Block&) = delete;
    Block& operator=(const Block&) = delete;
    ~Block() {
      for (std::size_t k = count; k-- > 0;) {
        slots[k].record->~MKTaskAction();
      }
    }

    std::unique_ptr<Slot[]> slots;
    std::size_t capacity;
    std::size_t count = 0;
  };

  void grow() {
    const std::size_t capacity = nextCapacity_;
    block_ = std::make_shared<Block>(capacity);
    // (The standard library at hand cannot make_shared an array of a type that has no
    // copy constructor.)
    conditions_ = std::shared_ptr<std::condition_variable[]>(new std::condition_variable[capacity]);
    nextCapacity_ = std::min(2 * capacity, kMaxCapacity);
  }

  std::size_t nextCapacity_;
  std::shared_ptr<Block> block_;
  std::shared_ptr<std::condition_variable[]> conditions_;
  bool pending_ = false;
};

}  // namespace

struct ZUMokutoParser::ParseState {
  ParseState(std::string_view callerText, MKTaskInstruction& parsedJob, bool japanese,
             Matching matching)
      : text(callerText),
        job(parsedJob),
        speech(parsedJob.text),
        isJapanese(japanese),
        matcher(callerText, matching),
        soundScan(callerText, kSoundStops, '/'),
        affectationScan(callerText, kSpace, '='),
        dotScan(callerText, kDot),
        methodEndScan(callerText, kMethodEnd),
        nonSpaceScan(callerText, kNonSpace),
        records(expectedActions(callerText.size())) {}

  // How many actions a text of `size` bytes may hold at a typical density.
  static std::size_t expectedActions(std::size_t size) { return size / 48 + 1; }

  // Adds an action to the job; the first one makes room for as many as the rest of the
  // text may hold at a typical density, so that the lists rarely grow one by one.
  void addAction(std::shared_ptr<MKTaskAction> action, std::size_t at) {
    if (job.actions.empty()) {
      const std::size_t expected = std::min<std::size_t>(expectedActions(text.size() - at), 1024);
      job.actions.reserve(expected);
      job.usedBookmarks.reserve(job.usedBookmarks.size() + expected);
    }
    job.addAction(std::move(action));
  }

  // Appends the caller's text from copiedUpTo to `end` to the speech text.
  void copyUpTo(std::size_t end) {
    if (end > copiedUpTo) {
      speech.append(text.substr(copiedUpTo, end - copiedUpTo));
    }
  }

  std::string_view text;
  MKTaskInstruction& job;
  std::string& speech;
  bool isJapanese;
  std::size_t copiedUpTo = 0;
  bool afterBackslash = false;
  ParenMatcher matcher;
  ForwardScan soundScan;
  ForwardScan affectationScan;
  ForwardScan dotScan;
  ForwardScan methodEndScan;
  ForwardScan nonSpaceScan;
  RecordStore records;
};

struct ZUMokutoParser::Cursor {
  explicit Cursor(ParseState& parseState) : state(parseState) {}

  ParseState& state;
  std::size_t start = 0;
  std::size_t nameEnd = 0;
  std::size_t argStart = 0;
  std::size_t argEnd = 0;
  std::string_view name;
  std::string_view content;
};

namespace {

// The written keywords (types 0 to 17) grouped by length, in type order.
struct KeywordsByLength {
  static constexpr std::size_t kMaxLength = 15;
  std::array<std::array<std::uint8_t, 4>, kMaxLength + 1> types{};
  std::array<std::uint8_t, kMaxLength + 1> count{};
};

constexpr KeywordsByLength kKeywordsByLength = [] {
  KeywordsByLength table;
  for (std::size_t type = 0; type <= static_cast<std::size_t>(AFFECTATION); ++type) {
    const std::size_t length = kMKTaskActionKeywords[type].size();
    table.types[length][table.count[length]++] = static_cast<std::uint8_t>(type);
  }
  return table;
}();

}  // namespace

MKTaskActionType MKTaskActionType_fromStr(std::string_view name) {
  if (name.size() <= KeywordsByLength::kMaxLength) {
    for (std::size_t k = 0; k < kKeywordsByLength.count[name.size()]; ++k) {
      const std::uint8_t type = kKeywordsByLength.types[name.size()][k];
      const std::string_view keyword = kMKTaskActionKeywords[type];
      if (std::equal(keyword.begin(), keyword.end(), name.begin())) {
        return type;
      }
    }
  }
  if (name == "^tag") {
    KO_LOG_WARNING("Mokuto") << "^tag is deprecated please use ^startTag instead.";
    return START_TAG;
  }
  return UNKNOWN;
}

void ZUMokutoParser::parse(std::shared_ptr<MKTaskInstruction> job, std::string text,
                           bool isJapanese) const {
  if (!job) {
    throw std::invalid_argument("ZUMokutoParser::parse: no job");
  }
  const std::string_view t = text;
  const std::size_t size = t.size();
  job->text.clear();
  job->text.reserve(size + 16);

  // The caller's own bookmarks: the actions' numbers must avoid them.
  for (std::size_t i = t.find('\\'); i != npos; i = t.find('\\', i)) {
    if (size - i >= 7 && t.compare(i, 5, "\\mrk=") == 0) {
      const std::size_t end = t.find('\\', i + 5);
      if (end == npos) {
        break;
      }
      std::int32_t number = 0;
      if (parseDecimal(t.substr(i + 5, end - i - 5), number)) {
        job->usedBookmarks.push_back(number);
      }
      i = end + 1;
    } else {
      ++i;
    }
  }

  ParseState state(t, *job, isJapanese, matching_);
  std::size_t i = 0;
  while (i < size) {
    unsigned char c = byteAt(t, i);
    if (c == '^') {
      xReadInstruction(state, i);
      c = byteAt(t, i);
    }
    if (c == '$') {
      xReadAffectation(state, i);
    } else if (c == '\\' && isJapanese && state.afterBackslash && size - i >= 7 &&
               t.compare(i, 5, "\\pau=") == 0) {
      // A pause right after a bookmark needs a comma before it to be heard.
      state.copyUpTo(i);
      state.copiedUpTo = i;
      state.speech += ',';
      i += 6;
    } else if (c == '\\') {
      state.afterBackslash = true;
    } else if (c != ' ') {
      state.afterBackslash = false;
    }
    i = std::min(i + 1, size);

    // The bytes up to the next "^", "$" or backslash are words: they only end an
    // "after a backslash" stretch unless they are spaces.
    const std::size_t next = findScanStop(t, i);
    if (isJapanese && state.afterBackslash) {
      for (std::size_t k = i; k < next; ++k) {
        if (t[k] != ' ') {
          state.afterBackslash = false;
          break;
        }
      }
    }
    i = next;
  }
  state.copyUpTo(size);
}

bool ZUMokutoParser::xReadInstruction(ParseState& state, std::size_t& pos) const {
  const std::string_view t = state.text;
  const std::size_t size = t.size();
  Cursor cursor(state);
  cursor.start = pos;

  std::size_t k = pos + 1;
  for (;;) {
    if (k >= size) {
      pos = size - 1;
      return false;
    }
    const unsigned char c = byteAt(t, k);
    if (c == ' ' || c == '(') {
      break;
    }
    if (!isNameByte(c)) {
      pos = k - 1;
      return false;
    }
    ++k;
  }
  cursor.nameEnd = k;
  while (k < size && t[k] == ' ') {
    ++k;
  }
  if (k >= size) {
    pos = size - 1;
    return false;
  }
  if (t[k] != '(') {
    pos = k - 1;
    return false;
  }
  cursor.name = t.substr(cursor.start, cursor.nameEnd - cursor.start);
  ++k;
  while (k < size && t[k] == ' ') {
    ++k;
  }
  cursor.argStart = k;
  pos = k;

  const MKTaskActionType type = MKTaskActionType_fromStr(cursor.name);
  RecordStore& records = state.records;
  bool consumed = false;
  if (type >= AUTO_START_TAG && type <= STOP_TAG) {
    consumed = xActionContent(cursor, pos, records.make<MKAnimationAction>(type));
  } else if (type == MODE) {
    consumed = xActionContent(cursor, pos, records.make<MKModeAction>(type));
  } else if (type >= START_SOUND && type <= RUN_SOUND) {
    consumed = xActionContent(cursor, pos, records.make<MKSoundAction>(type));
  } else if (type == CALL || type == PCALL) {
    consumed = xActionContent(cursor, pos, records.make<MKCallAction>(type));
  } else {
    consumed = xActionContent(cursor, pos, records.make<MKTaskAction>(type));
  }
  if (!consumed) {
    records.drop();
    return false;
  }

  state.copyUpTo(cursor.start);
  state.copiedUpTo = pos + 1;
  if (type == INPUT_MODE2) {
    records.drop();
    state.job.config.inputMode2 = true;
    return true;
  }
  std::shared_ptr<MKTaskAction> action = records.keep();
  MKTaskAction& added = *action;
  state.addAction(std::move(action), cursor.start);
  added.appendBookmark(state.speech);
  return true;
}

bool ZUMokutoParser::xReadAffectation(ParseState& state, std::size_t& pos) const {
  const std::string_view t = state.text;
  const std::size_t dollar = pos;
  const auto [end, lastEqual] = state.affectationScan.from(dollar + 1);
  // The name runs to the last "=" before the space; both name and value are needed.
  if (lastEqual == npos || lastEqual == dollar + 1 || lastEqual + 1 >= end) {
    return false;
  }
  MKAffectationAction& record = state.records.make<MKAffectationAction>(AFFECTATION);
  record.name.assign(t.substr(dollar + 1, lastEqual - dollar - 1));
  record.value.assign(t.substr(lastEqual + 1, end - lastEqual - 1));
  record.text.assign(t.substr(dollar, end - dollar));

  state.copyUpTo(dollar);
  state.copiedUpTo = end;
  state.addAction(state.records.keep(), dollar);
  record.appendBookmark(state.speech);
  state.afterBackslash = true;
  pos = end;
  return true;
}

bool ZUMokutoParser::xReadArguments(Cursor& cursor, std::size_t& pos, MKTaskAction& action) const {
  const std::string_view t = cursor.state.text;
  const std::size_t close = cursor.state.matcher.match(pos);
  if (close == npos) {
    pos = pos - 1;
    return false;
  }
  std::size_t end = std::max(close, cursor.argStart);
  while (end > cursor.argStart && t[end - 1] == ' ') {
    --end;
  }
  cursor.argEnd = end;
  cursor.content = t.substr(cursor.argStart, end - cursor.argStart);
  action.text.clear();
  action.text.reserve(cursor.name.size() + cursor.content.size() + 2);
  action.text += cursor.name;
  action.text += '(';
  action.text += cursor.content;
  action.text += ')';
  pos = close;
  return true;
}

bool ZUMokutoParser::xActionContent(Cursor& cursor, std::size_t& pos,
                                    MKAnimationAction& action) const {
  if (!xReadArguments(cursor, pos, action)) {
    return false;
  }
  switch (action.type) {
    case START:
    case RUN:
    case WAIT:
    case STOP:
      action.animation.assign(cursor.content);
      break;
    default:
      action.tag.assign(cursor.content);
      break;
  }
  return true;
}

bool ZUMokutoParser::xActionContent(Cursor& cursor, std::size_t& pos, MKModeAction& action) const {
  if (!xReadArguments(cursor, pos, action)) {
    return false;
  }
  action.mode = bodyLanguageModeFromStr(cursor.content);
  if (action.mode == BODY_LANGUAGE_MODE_END_OF_ENUM) {
    KO_LOG_ERROR("mokuto.parser") << '"' << cursor.content << '"'
                                  << " body language mode is unknown.";
    action.markAsError("BODY_LANGUAGE_MODE_UNKNOWN");
  }
  return true;
}

bool ZUMokutoParser::xActionContent(Cursor& cursor, std::size_t& pos, MKSoundAction& action) const {
  ParseState& state = cursor.state;
  const std::string_view t = state.text;
  const std::size_t size = t.size();
  const auto [stop, lastSlash] = state.soundScan.from(cursor.argStart);
  const bool hasSlash = lastSlash != npos;
  if (hasSlash) {
    action.soundSet.assign(t.substr(cursor.argStart, lastSlash - cursor.argStart));
  }
  if (stop >= size) {
    // The volume would be read from the end of the text, where no parenthesis closes.
    pos = size - 1;
    return false;
  }
  const unsigned char c = byteAt(t, stop);
  pos = stop;
  if (c == ')' || c == '(' || !hasSlash) {
    if (!xReadArguments(cursor, pos, action)) {
      return false;
    }
    if (c == ')' && hasSlash) {
      const std::size_t nameStart = lastSlash + 1;
      action.soundName.assign(t.substr(nameStart, std::max(cursor.argEnd, nameStart) - nameStart));
    } else {
      xPrintSoundParsingError(cursor, action);
    }
    return true;
  }

  // "set/name, volume"
  std::size_t nameEnd = stop;
  while (nameEnd > lastSlash + 1 && t[nameEnd - 1] == ' ') {
    --nameEnd;
  }
  action.soundName.assign(t.substr(lastSlash + 1, nameEnd - lastSlash - 1));
  std::size_t volumeStart = stop + 1;
  while (volumeStart < size && t[volumeStart] == ' ') {
    ++volumeStart;
  }
  pos = volumeStart;
  if (!xReadArguments(cursor, pos, action)) {
    return false;
  }
  const std::string_view volumeText = volumeStart < cursor.argEnd
                                          ? t.substr(volumeStart, cursor.argEnd - volumeStart)
                                          : std::string_view();
  std::int32_t volume = 0;
  if (!parseDecimal(volumeText, volume) || static_cast<std::uint32_t>(volume) > 100) {
    KO_LOG_ERROR("mokuto.parser") << "the second parameter of " << action.text
                                  << " has to be an integer between 0 and 100 (sound volume)";
    action.markAsError("SECOND_PARAMETER_NOT_VALID");
  } else {
    action.volume = volume;
  }
  return true;
}

void ZUMokutoParser::xPrintSoundParsingError(Cursor& cursor, MKSoundAction& action) const {
  KO_LOG_ERROR("mokuto.parser") << "Bad sound file name in " << '"' << cursor.content << '"'
                                << ". The sound files has to follow the pattern: " << '"'
                                << "soundSet/soundName" << '"';
  action.soundSet.clear();
  action.soundName.clear();
  action.markAsError("INSTRUCTION_BADLY_FORMATTED");
}

bool ZUMokutoParser::xActionContent(Cursor& cursor, std::size_t& pos, MKCallAction& action) const {
  ParseState& state = cursor.state;
  const std::string_view t = state.text;
  const std::size_t size = t.size();
  const std::size_t dot = state.dotScan.from(cursor.argStart).first;
  if (dot < size) {
    const std::size_t methodEnd = state.methodEndScan.from(dot + 1).first;
    const std::size_t open = state.nonSpaceScan.from(methodEnd).first;
    if (open < size && t[open] == '(' && dot > cursor.argStart && methodEnd > dot + 1) {
      const std::size_t close = state.matcher.match(open + 1);
      if (close == npos) {
        pos = open;
        return false;
      }
      action.module.assign(t.substr(cursor.argStart, dot - cursor.argStart));
      action.method.assign(t.substr(dot + 1, methodEnd - dot - 1));
      action.arguments.clear();
      action.arguments.reserve(close - open + 1);
      action.arguments += '[';
      action.arguments += t.substr(open + 1, close - open - 1);
      action.arguments += ']';
      pos = close + 1;
      return xReadArguments(cursor, pos, action);
    }
  }
  pos = cursor.argStart;
  if (!xReadArguments(cursor, pos, action)) {
    return false;
  }
  KO_LOG_ERROR("mokuto.parser")
      << "This instruction " << action.text
      << " is badly formated. Here is the pattern to follow: ZUModule.method(args)";
  action.markAsError("INSTRUCTION_BADLY_FORMATTED");
  return true;
}

bool ZUMokutoParser::xActionContent(Cursor& cursor, std::size_t& pos, MKTaskAction& action) const {
  if (!xReadArguments(cursor, pos, action)) {
    return false;
  }
  if (action.type == UNKNOWN) {
    KO_LOG_ERROR("mokuto.parser") << "Instruction " << '"' << action.text << '"'
                                  << " not recognized. Instruction skipped.";
    action.markAsError("UNKNOWN_INSTRUCTION");
  }
  return true;
}

}  // namespace ZU
