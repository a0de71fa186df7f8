// mokuto syntax: the reference of the annotated-text language: every instruction with its
// form and an example, what is spoken as words, and the error codes with their causes.
#include <iostream>

#include "cli_commands.h"
#include "cli_common.h"

namespace mokuto::cli {

namespace {

constexpr const char* kSyntax = R"syntax(THE ANNOTATED-TEXT LANGUAGE

A text to say is a sentence with instructions written inside it. Each instruction
becomes a bookmark of the speech engine at its place; its action runs when the speech
reaches the bookmark. "Waits": the speech holds there until the action is done; the
other actions start and the speech goes on.

An instruction is "^", its name (letters and digits, case-sensitive), optional blanks,
"(", its argument, ")". Blanks inside the parentheses at both ends are dropped. Inside,
a backslash hides the byte after it and parentheses between double quotes do not count.

ANIMATIONS
An animation is an installed behaviour named by its path, "package/Posture/...": the
folder after the package (Stand, Sit, SitOnPod) is the posture it is made for (mokuto
animations lists them). A tag is a word bound to animations (mokuto tags); the service
draws one of the tag's animations for the robot's posture.
  ^start(ANIMATION)    starts the animation.
                       ^start(animations/Stand/Gestures/Hey_1)
  ^run(ANIMATION)      starts it and waits for its end. Waits.
                       ^run(animations/Stand/Gestures/Hey_1)
  ^wait(ANIMATION)     waits for the end of an animation that ^start or ^run of this text
                       started; at once when it is not running. Waits.
                       ^wait(animations/Stand/Gestures/Hey_1)
  ^stop(ANIMATION)     stops an animation that ^start or ^run of this text started.
                       ^stop(animations/Stand/Gestures/Hey_1)
  ^startTag(TAG)       starts an animation of the tag.  ^startTag(hello)
  ^runTag(TAG)         starts one and waits for its end. Waits.  ^runTag(hello)
  ^waitTag(TAG)        waits for the animations that ^startTag or ^runTag of this text
                       started with that tag. Waits.  ^waitTag(hello)
  ^stopTag(TAG)        stops the first of them.  ^stopTag(hello)
  ^tag(TAG)            the former name of ^startTag (deprecated).
An animation of ^start or ^run stops those of ^startTag and ^runTag and the automatic
gestures; one of ^startTag or ^runTag stops the automatic gestures.

SOUNDS
A sound is SET/NAME: the file NAME.wav of the sound set SET (mokuto sounds lists them).
VOLUME is 0 to 100; 100 when it is left out.
  ^startSound(SET/NAME[, VOLUME])   starts the sound.  ^startSound(bells/ding, 50)
  ^runSound(SET/NAME[, VOLUME])     plays it to its end. Waits.  ^runSound(bells/ding)
  ^waitSound(SET/NAME)              waits for the end of a sound that ^startSound
                                    started. Waits.  ^waitSound(bells/ding)
  ^stopSound(SET/NAME)              stops it.  ^stopSound(bells/ding)

CALLS
ARGUMENTS are a JSON list without its brackets (strings in double quotes); mokuto
methods lists what the service itself publishes.
  ^call(SERVICE.METHOD(ARGUMENTS))   calls the method and waits for its end. Waits.
                                     ^call(ZUMemory.raiseEvent("faceSeen", 1))
  ^pCall(SERVICE.METHOD(ARGUMENTS))  starts the method and goes on.
                                     ^pCall(ZUAudioPlayer.playSoundSetFile("bells", "ding"))

BODY LANGUAGE AND SPEECH
  ^mode(MODE)       the body language mode for the rest of the text: disabled (no
                    automatic gesture), random (the body talk) or contextual (the body
                    talk and gestures chosen from the words).  ^mode(disabled)
  ^inputMode2()     the speech engine's input mode 2 while the text is spoken; it takes
                    no bookmark.  ^inputMode2()
  $NAME=VALUE       raises the memory event NAME with the text VALUE. It runs to the next
                    blank; NAME ends at the last "=" before it.  $greeted=1

In the output, AUTO_START_TAG(TAG) is a gesture that contextual mode adds for a word
(mokuto analyse shows them); a text does not write it. The speech engine's own tags
(\pau=300\, \mrk=5\, ...) pass through; a number of the text's own \mrk=N\ is never
given to an action.

SPOKEN AS WORDS
These are no instruction: their characters are spoken as they stand (mokuto say warns,
with the column): a "(" without its closing parenthesis, ^start(animations/Stand/...;
a name not followed by "(", ^wait Hey_1; a name with other characters than letters and
digits; "$x=", "$=1" or "$x =1" (no value, no name, a blank before "=").

ERROR CODES
An instruction that cannot be carried out is skipped: its code is put in front of its
text, mokuto say shows it as "skipped: CODE" and counts it among the instruction errors,
and the rest of the text goes on.
Found as the text is read:
  UNKNOWN_INSTRUCTION               the name is not one of the above (names are
                                    case-sensitive): ^Start(x), ^foo(x).
  INSTRUCTION_BADLY_FORMATTED       a sound without "/" or with "(" in its argument,
                                    ^runSound(ding); a call not of the form
                                    SERVICE.METHOD(ARGUMENTS), ^call(ZUMemory).
  SECOND_PARAMETER_NOT_VALID        a sound volume that is not a number from 0 to 100,
                                    ^runSound(bells/ding, 101).
  BODY_LANGUAGE_MODE_UNKNOWN        ^mode with another word than disabled, random or
                                    contextual (case-sensitive), ^mode(Random).
Found before the speech begins:
  ANIMATION_NOT_FOUND               no installed behaviour has that name.
  NO_ANIMATION_FOR_CURRENT_POSTURE  the tag has no animation for the robot's posture, or
                                    the posture is not known.
  SOUND_SET_NOT_FOUND               the audio player has no sound set of that name.
  MODULE_NOT_FOUND                  no service of that name.

OUTCOMES
mokuto say shows what became of each action: executed; failed, with the reason (the
call failed: a sound that its set lacks, a method that the service lacks or that does
not take those arguments, arguments that are not JSON, an animation that would not
start); no animation (an automatic gesture for which the posture has none); skipped (an
error code above, or a bookmark that the speech engine reported too late); stopped (the
text was stopped first). mokuto say --dry-run shows each action's error code and the
failure that its call would meet, before anything is spoken.
)syntax";

}  // namespace

void addSyntaxCommand(CLI::App& app, int& status) {
  CLI::App* command = app.add_subcommand(
      "syntax",
      "Print the annotated-text language: every instruction with its form and an example, "
      "and the error codes with their causes");
  command->callback([&status] {
    std::cout << kSyntax;
    status = std::cout.flush().good() ? kSuccess : kFailure;
  });
}

}  // namespace mokuto::cli
