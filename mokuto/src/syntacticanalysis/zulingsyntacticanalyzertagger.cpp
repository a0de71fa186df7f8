#include "mokuto/zulingsyntacticanalyzertagger.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <unordered_map>
#include <utility>

#include "ko/log.hpp"

namespace ZU {

namespace {

using Chunk = ZULingSyntacticAnalyzerChunk;
using Structure = ZULingSyntacticAnalyzerStructure;

constexpr const char* kCategory = "mokuto.compiler";
constexpr std::size_t kNone = static_cast<std::size_t>(-1);
constexpr const char* kItemCountTags[6] = {"", "", "two", "three", "four", "five"};

std::string lowercase(std::string_view text) {
  std::string lower(text);
  for (char& c : lower) {
    if (c >= 'A' && c <= 'Z')
      c = static_cast<char>(c - 'A' + 'a');
  }
  return lower;
}

Chunk tagChunk(std::string_view name, std::int64_t value) {
  // " \name=value\ "
  char buffer[48];
  char* end = buffer;
  *end++ = ' ';
  *end++ = '\\';
  end = std::copy(name.begin(), name.begin() + std::min<std::size_t>(name.size(), 16), end);
  *end++ = '=';
  end = std::to_chars(end, buffer + sizeof buffer - 2, value).ptr;
  *end++ = '\\';
  *end++ = ' ';
  Chunk chunk;
  chunk.text.assign(buffer, end);
  chunk.classes.push_back({WORD_CLASS_BOOKMARK, {}});
  return chunk;
}

// The caller's gestures and blocking sounds, which keep automatic gestures away.
bool keepsGesturesAway(MKTaskActionType type) noexcept {
  return (type >= START_TAG && type <= WAIT_TAG) || type == WAIT_SOUND || type == RUN_SOUND;
}

// The bookmark of an action as a key: its number and whether it is a "mrkpause".
std::uint64_t bookmarkKey(std::uint64_t id, std::string_view kind) noexcept {
  return id << 1 | (kind == "mrkpause" ? 1u : 0u);
}

// The chunks of one job as a list that grows while the tags are inserted: new chunks
// are appended to the vector and linked in, so every index stays valid.
class ChunkList {
 public:
  explicit ChunkList(std::vector<Chunk> chunks) : fChunks(std::move(chunks)) {
    const std::size_t n = fChunks.size();
    fPrevious.resize(n);
    fNext.resize(n);
    for (std::size_t k = 0; k < n; ++k) {
      fPrevious[k] = k == 0 ? kNone : k - 1;
      fNext[k] = k + 1 == n ? kNone : k + 1;
    }
    fHead = n == 0 ? kNone : 0;
    fTail = n == 0 ? kNone : n - 1;
  }

  std::size_t head() const noexcept { return fHead; }
  std::size_t previous(std::size_t k) const noexcept { return fPrevious[k]; }
  std::size_t next(std::size_t k) const noexcept { return fNext[k]; }
  // Room for `more` chunks without moving the others.
  void reserve(std::size_t more) {
    fChunks.reserve(fChunks.size() + more);
    fPrevious.reserve(fPrevious.size() + more);
    fNext.reserve(fNext.size() + more);
  }
  Chunk& operator[](std::size_t k) noexcept { return fChunks[k]; }
  const Chunk& operator[](std::size_t k) const noexcept { return fChunks[k]; }

  // Inserts before `at`, or at the end when `at` is kNone; returns the new index.
  std::size_t insertBefore(std::size_t at, Chunk chunk) {
    const std::size_t k = xAppend(std::move(chunk));
    if (at == kNone) {
      fPrevious[k] = fTail;
      if (fTail != kNone)
        fNext[fTail] = k;
      else
        fHead = k;
      fTail = k;
      return k;
    }
    fPrevious[k] = fPrevious[at];
    fNext[k] = at;
    if (fPrevious[at] != kNone)
      fNext[fPrevious[at]] = k;
    else
      fHead = k;
    fPrevious[at] = k;
    return k;
  }

  std::size_t insertAfter(std::size_t at, Chunk chunk) {
    return fNext[at] == kNone ? insertBefore(kNone, std::move(chunk))
                              : insertBefore(fNext[at], std::move(chunk));
  }

 private:
  std::size_t xAppend(Chunk chunk) {
    fChunks.push_back(std::move(chunk));
    fPrevious.push_back(kNone);
    fNext.push_back(kNone);
    return fChunks.size() - 1;
  }

  std::vector<Chunk> fChunks;
  std::vector<std::size_t> fPrevious;
  std::vector<std::size_t> fNext;
  std::size_t fHead = kNone;
  std::size_t fTail = kNone;
};

struct Candidate {
  std::string tag;
  std::size_t chunk;
};

// Where a bookmark goes: before a chunk, or, when pauseSplit is above 0, inside the
// pause chunk, before its last pauseSplit milliseconds.
struct InsertionPoint {
  std::size_t chunk;
  std::int64_t pauseSplit;
};

class TagInsertion {
 public:
  TagInsertion(ZULingSyntacticAnalysis& analysis, MKTaskInstruction& job)
      : fChunks(std::move(analysis.chunks)), fDatabase(analysis.database), fJob(job) {
    for (const auto& action : job.actions) {
      if (action)
        fActions.emplace(bookmarkKey(action->id, MKTaskActionType_bookmarkKind(action->type)),
                         action.get());
    }
  }

  void pauseBeforeSpeech(std::int32_t milliseconds) {
    fChunks.insertBefore(fChunks.head(), tagChunk("pau", milliseconds));
  }

  void chooseCandidates(const std::vector<Structure>& structures) {
    for (const Structure& structure : structures) {
      if (structure.kind == STRUCTURE_AND) {
        // Outside two to five items, nothing is proposed.
        if (structure.itemCount >= 2 && structure.itemCount <= 5)
          xPropose(kItemCountTags[structure.itemCount], structure.first);
      } else if (structure.kind == STRUCTURE_OR) {
        xPropose("pick", structure.first);
      } else if (structure.notNegated) {
        for (std::size_t c = structure.first; c <= structure.last; ++c) {
          if (fChunks[c].isWord())
            xWordTag(c);
        }
        chooseCandidates(structure.children);
      } else {
        xPropose("oppose", structure.first);
      }
    }
  }

  // Inserts a bookmark per candidate. Where the bookmarks go ahead of their words, a
  // bookmark that the move back would bring within the window of speech after a
  // caller's gesture or blocking sound stays before its word instead, where the
  // look-back accepted it.
  void insertCandidates() {
    const bool ahead = fDatabase && fDatabase->flag != 0;
    // A bookmark per candidate, and a split pause at most.
    fChunks.reserve(2 * fCandidates.size());
    for (Candidate& candidate : fCandidates) {
      InsertionPoint at{candidate.chunk, 0};
      if (ahead) {
        at = xMoveBack(candidate.chunk, ZULingSyntacticAnalyzerTagger::kWindowMs);
        if (!xLookBackAccepts(at))
          at = {candidate.chunk, 0};
      }
      auto action = std::make_shared<MKAnimationAction>(AUTO_START_TAG);
      action->text = "AUTO_START_TAG(" + candidate.tag + ")";
      action->tag = std::move(candidate.tag);
      fJob.addAction(action);
      std::size_t before = at.chunk;
      if (at.pauseSplit > 0) {
        // The pause ends with the part that is left before the word.
        const ZULingSpeechTag pause = lingSpeechTag(fChunks[at.chunk]);
        if (pause.value > at.pauseSplit) {
          fChunks[at.chunk] = tagChunk("pau", pause.value - at.pauseSplit);
          before = fChunks.insertAfter(at.chunk, tagChunk("pau", at.pauseSplit));
        }
      }
      fChunks.insertBefore(before, tagChunk("mrk", action->id));
    }
  }

  // The text from the chunks; the actions in the order of their bookmarks.
  void writeBack() {
    const bool reorder = fJob.actions.size() >= 2;
    std::unordered_map<std::uint64_t, std::size_t> positions;
    std::vector<bool> placed;
    std::vector<std::shared_ptr<MKTaskAction>> ordered;
    if (reorder) {
      placed.assign(fJob.actions.size(), false);
      ordered.reserve(fJob.actions.size());
      for (std::size_t k = 0; k < fJob.actions.size(); ++k) {
        if (const MKTaskAction* action = fJob.actions[k].get())
          positions.emplace(bookmarkKey(action->id, MKTaskActionType_bookmarkKind(action->type)),
                            k);
      }
    }
    std::size_t length = 0;
    for (std::size_t k = fChunks.head(); k != kNone; k = fChunks.next(k))
      length += fChunks[k].text.size();
    std::string text;
    text.reserve(length);
    for (std::size_t k = fChunks.head(); k != kNone; k = fChunks.next(k))
      text += fChunks[k].text;
    if (reorder) {
      for (std::size_t k = fChunks.head(); k != kNone; k = fChunks.next(k)) {
        if (fChunks[k].wordClass() != WORD_CLASS_BOOKMARK)
          continue;
        const ZULingSpeechTag tag = lingSpeechTag(fChunks[k]);
        if (tag.kind != ZULingSpeechTag::Bookmark)
          continue;
        const auto found =
            positions.find(bookmarkKey(static_cast<std::uint64_t>(tag.value), tag.name));
        if (found != positions.end() && !placed[found->second]) {
          placed[found->second] = true;
          ordered.push_back(fJob.actions[found->second]);
        }
      }
      for (std::size_t k = 0; k < fJob.actions.size(); ++k) {
        if (!placed[k])
          ordered.push_back(fJob.actions[k]);
      }
      fJob.actions = std::move(ordered);
      fJob.currentAction = 0;
    }
    fJob.text = std::move(text);
  }

  std::size_t candidateCount() const noexcept { return fCandidates.size(); }

 private:
  // The configuration's tags for the word, one at random; else its base form.
  void xWordTag(std::size_t c) {
    const Chunk& chunk = fChunks[c];
    const auto& wordsToTags = fJob.config.wordsToTags;
    if (!wordsToTags.empty()) {
      const auto bound = wordsToTags.find(lowercase(chunk.text));
      if (bound != wordsToTags.end() && !bound->second.empty()) {
        const auto pick = static_cast<std::size_t>(std::rand()) % bound->second.size();
        xPropose(bound->second[pick], c);
        return;
      }
    }
    // The chunk's node is the lowercased word's in the analysis' database.
    std::string baseForm;
    if (fDatabase && chunk.node && fDatabase->lemmaAt(*chunk.node, chunk.wordClass(), baseForm) &&
        !baseForm.empty())
      xPropose(baseForm, c);
  }

  void xPropose(std::string tag, std::size_t c) {
    if (xLookBackAccepts({c, 0}))
      fCandidates.push_back({std::move(tag), c});
  }

  // False when a gesture or blocking sound of the caller has its bookmark within the
  // window of speech before the insertion point.
  bool xLookBackAccepts(InsertionPoint at) const {
    std::int64_t budget = ZULingSyntacticAnalyzerTagger::kWindowMs;
    std::size_t k = at.chunk;
    if (at.pauseSplit > 0) {
      // The point stands inside the pause: the pause's first part comes before it.
      budget -= lingSpeechTag(fChunks[k]).value - at.pauseSplit;
    }
    while (budget >= 1 && fChunks.previous(k) != kNone) {
      k = fChunks.previous(k);
      const Chunk& chunk = fChunks[k];
      if (chunk.wordClass() > WORD_CLASS_BOOKMARK) {
        budget -= chunk.length * ZULingSyntacticAnalyzerTagger::kMsPerByte;
        continue;
      }
      const ZULingSpeechTag tag = lingSpeechTag(chunk);
      if (tag.kind == ZULingSpeechTag::Pause) {
        budget -= tag.value;
      } else if (tag.kind == ZULingSpeechTag::Bookmark) {
        const auto found =
            fActions.find(bookmarkKey(static_cast<std::uint64_t>(tag.value), tag.name));
        if (found != fActions.end() && keepsGesturesAway(found->second->type))
          return false;
      }
    }
    return true;
  }

  // Where a bookmark starts `duration` ms of speech ahead of chunk c: before the start
  // of a word (or a space) once the duration is spent, or inside a pause, whose last
  // `pauseSplit` ms are what remains.
  InsertionPoint xMoveBack(std::size_t c, std::int64_t duration) const {
    std::int64_t remaining = duration;
    std::size_t k = c;
    while (fChunks.previous(k) != kNone) {
      k = fChunks.previous(k);
      const Chunk& chunk = fChunks[k];
      if (chunk.wordClass() > WORD_CLASS_BOOKMARK) {
        remaining -= chunk.length * ZULingSyntacticAnalyzerTagger::kMsPerByte;
        if (remaining < 1)
          return {xWordStart(k), 0};
        continue;
      }
      const ZULingSpeechTag tag = lingSpeechTag(chunk);
      if (tag.kind != ZULingSpeechTag::Pause)
        continue;
      if (tag.value < remaining) {
        remaining -= tag.value;
        continue;
      }
      return {k, tag.value == remaining ? 0 : remaining};
    }
    return {k, 0};
  }

  std::size_t xWordStart(std::size_t k) const {
    for (;;) {
      const std::string& text = fChunks[k].text;
      if (!text.empty() && text.back() == ' ')
        return k;
      const std::size_t previous = fChunks.previous(k);
      if (previous == kNone)
        return k;
      const std::string& before = fChunks[previous].text;
      if (!before.empty() && before.front() == ' ')
        return k;
      k = previous;
    }
  }

  ChunkList fChunks;
  ZULingDatabasePtr fDatabase;
  MKTaskInstruction& fJob;
  std::unordered_map<std::uint64_t, const MKTaskAction*> fActions;
  std::vector<Candidate> fCandidates;
};

}  // namespace

std::int32_t lingEmotionOfLabels(const std::vector<std::string>& labels) noexcept {
  std::int32_t positive = 0;
  std::int32_t negative = 0;
  bool intensified = false;
  bool affirmative = true;
  for (const std::string& label : labels) {
    if (label == "very positive")
      positive = 2;
    else if (label == "positive" && positive == 0)
      positive = 1;
    else if (label == "negative" && negative == 0)
      negative = 1;
    else if (label == "very negative")
      negative = 2;
    else if (label == "strong adverb")
      intensified = true;
    else if (label == "negation")
      affirmative = !affirmative;
  }
  if (positive == negative)
    return 0;
  std::int32_t result = positive > negative ? positive : -negative;
  if (intensified && (result == 1 || result == -1))
    result *= 2;
  if (!affirmative)
    result = result < 0 ? 1 : -1;
  return result;
}

ZULingSyntacticAnalyzerTagger::ZULingSyntacticAnalyzerTagger(
    std::shared_ptr<const ZULingLanguageMap> languages)
    : fEmotions(std::move(languages)) {}

void ZULingSyntacticAnalyzerTagger::setLanguage(const std::string& key) {
  fEmotions.setLanguage(key);
}

void ZULingSyntacticAnalyzerTagger::insertTags(ZULingSyntacticAnalysis analysis,
                                               MKTaskInstruction& job) {
  TagInsertion insertion(analysis, job);
  if (fLastTextId != job.id && job.config.msPauseBeforeSpeech != 0) {
    insertion.pauseBeforeSpeech(job.config.msPauseBeforeSpeech);
    fLastTextId = job.id;
  }
  {
    const std::lock_guard<std::mutex> lock(ZULingDatabaseCache::mutex());
    insertion.chooseCandidates(analysis.structures);
  }
  insertion.insertCandidates();
  insertion.writeBack();
  KO_LOG_VERBOSE(kCategory) << insertion.candidateCount() << " automatic tags for the text "
                            << job.id;
}

std::int32_t ZULingSyntacticAnalyzerTagger::emotion(
    const ZULingSyntacticAnalysis& analysis, std::vector<ZULingEmotionWord>* labelled) const {
  std::vector<std::string> labels;
  {
    const std::lock_guard<std::mutex> lock(ZULingDatabaseCache::mutex());
    const ZULingDatabasePtr& database = fEmotions.database();
    if (!database)
      return 0;
    std::string label;
    for (const Chunk& chunk : analysis.chunks) {
      if (!chunk.isWord())
        continue;
      if (database->lemma(lowercase(chunk.text), WORD_CLASS_UNKNOWN, label) && !label.empty()) {
        if (labelled != nullptr)
          labelled->push_back({chunk.text, label});
        labels.push_back(std::move(label));
      }
    }
  }
  return lingEmotionOfLabels(labels);
}

ZULingAutomaticTagging::ZULingAutomaticTagging(std::shared_ptr<const ZULingLanguageMap> languages)
    : analyzer(languages), tagger(std::move(languages)) {}

void ZULingAutomaticTagging::process(MKTaskInstruction& job, const std::string& language) {
  if (job.config.bodyLanguageMode < BODY_LANGUAGE_MODE_CONTEXTUAL)
    return;
  analyzer.setLanguage(language);
  tagger.setLanguage(language + "Emotions");
  tagger.insertTags(analyzer.analyse(job.text), job);
}

ZULingEmotionEstimator::ZULingEmotionEstimator(std::shared_ptr<const ZULingLanguageMap> languages)
    : fAnalyzer(languages), fTagger(std::move(languages)) {}

std::int32_t ZULingEmotionEstimator::getEmotion(const std::string& language, std::string_view text,
                                                std::vector<ZULingEmotionWord>* labelled) {
  const std::lock_guard<std::mutex> lock(fMutex);
  fAnalyzer.setLanguage(language);
  fTagger.setLanguage(language + "Emotions");
  return fTagger.emotion(fAnalyzer.analyse(text), labelled);
}

}  // namespace ZU
