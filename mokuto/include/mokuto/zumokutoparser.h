#pragma once
// The parser of annotated texts: turns "Hello ^start(animations/Stand/Gestures/Hey_1)
// world" into the speech text "Hello \mrk=1\ world" and the actions of the job.
//
// The parser holds no state between calls; the compiler stage calls `parse` in its own
// thread, once per job, before any other stage sees the job's actions. Concurrent
// calls on different jobs are safe.

#include <cstddef>
#include <memory>
#include <string>

#include "mokuto/mktaskaction.h"
#include "mokuto/mktaskinstruction.h"

namespace ZU {

class ZUMokutoParser {
 public:
  // How closing parentheses are found. Every strategy gives the same results; Walk
  // and Index exist so that tests can check that. Adaptive walks the text from the
  // opening parenthesis and, once the walks of a parse have covered a few times the
  // length of the text (unclosed parentheses), indexes the text so that every further
  // search is immediate: a parse stays linear in the length of its text.
  enum class Matching { Adaptive, Walk, Index };

  explicit ZUMokutoParser(Matching matching = Matching::Adaptive) : matching_(matching) {}

  // Writes the speech text, the used bookmarks, the actions and the inputMode2 flag of
  // the job. A rejected instruction becomes an UNKNOWN action with an error code in
  // front of its text, or, when its parentheses do not close, stays as spoken words.
  // Precondition: the job has no actions yet.
  void parse(std::shared_ptr<MKTaskInstruction> job, std::string text, bool isJapanese) const;

 private:
  struct ParseState;
  struct Cursor;

  // The argument readers. Each returns true when the instruction was consumed (pos is
  // then on its closing parenthesis and the record is finished, possibly as an error),
  // false when it was not (pos is then where the scan goes on).
  bool xActionContent(Cursor& cursor, std::size_t& pos, MKAnimationAction& action) const;
  bool xActionContent(Cursor& cursor, std::size_t& pos, MKModeAction& action) const;
  bool xActionContent(Cursor& cursor, std::size_t& pos, MKSoundAction& action) const;
  bool xActionContent(Cursor& cursor, std::size_t& pos, MKCallAction& action) const;
  bool xActionContent(Cursor& cursor, std::size_t& pos, MKTaskAction& action) const;

  // Matches the instruction's closing parenthesis from pos and sets argEnd, content and
  // the record's normalised text.
  bool xReadArguments(Cursor& cursor, std::size_t& pos, MKTaskAction& action) const;
  void xPrintSoundParsingError(Cursor& cursor, MKSoundAction& action) const;
  // Reads the instruction whose "^" is at pos; see xActionContent for pos afterwards.
  bool xReadInstruction(ParseState& state, std::size_t& pos) const;
  bool xReadAffectation(ParseState& state, std::size_t& pos) const;

  Matching matching_;
};

}  // namespace ZU
