#!/usr/bin/env python3
"""Measures the contextual analysis on real text, as a new user would meet it.

For each language, on the development texts (texts/dev.*.txt) or the held-out ones
(texts/heldout.*.txt, which nothing is tuned on), and the labelled emotion sentences
(emotions/*.tsv), through the `mokuto` command of a build:

- Japanese word cuts against MeCab (IPADIC): boundary F1 over all sentences, the share
  of sentences with a cut inside a MeCab word, and the share of automatic bookmarks that
  stand inside a MeCab word (cuts inside a run of marks that MeCab takes as one symbol,
  such as "/", are not counted);
- base-form agreement: on the words that both cut alike, the base form of the word's
  first record against an independent lemmatiser: MeCab for Japanese, Apertium's
  tagger (the analysers and taggers of the apertium-fr-es and apertium-en-es pairs) for
  French and English; a word without a base form counts as its own base form;
- emotion accuracy: the sign of `mokuto emotion` against the sentence's label (0 is
  wrong);
- gestures per 100 words and the share of each tag, from `mokuto analyse` per sentence
  (no pause before speech); an automatic tag counts as a gesture when the starter
  library has an animation for it.

Usage: scripts/quality [--held-out] [--languages en,fr,ja] [--coordinations FILE]
"""

import argparse
import concurrent.futures
import json
import os
import re
import subprocess
import sys
from collections import Counter

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, os.path.join(HERE, "..", "lexicons"))
from mecabcut import mecab_analyses  # noqa: E402  (the lexicon build's own)
LANGUAGES = {"en": "English", "fr": "French", "ja": "Japanese"}
APERTIUM = {
    "fr": ("/usr/share/apertium/apertium-fr-es/fr-es.automorf.bin",
           "/usr/share/apertium/apertium-fr-es/fr-es.prob"),
    "en": ("/usr/share/apertium/apertium-eng-spa/eng-spa.automorf.bin",
           "/usr/share/apertium/apertium-eng-spa/eng-spa.prob"),
}
MECAB_DICTIONARY = "/var/lib/mecab/dic/ipadic-utf8"
# (word, our base form, the reference's) of the words whose base forms differ.
DISAGREEMENTS = Counter()
# The MeCab words that the cut splits, with their pieces.
SPLITS = Counter()
STRUCTURE_TAGS = {"two", "three", "four", "five", "pick"}
LIBRARY = os.path.join(HERE, "..", "..", "share", "zefoko", "behaviors")


def library_tags(library):
    """The tags of the starter library: an automatic tag without an animation is no gesture."""
    tags = set()
    for folder, _, files in os.walk(os.path.join(library, "animations", "Stand")):
        if "behavior.json" in files:
            with open(os.path.join(folder, "behavior.json"), encoding="utf-8") as source:
                tags.update(json.load(source).get("tags", []))
    return tags


class Mokuto:
    def __init__(self, executable):
        self.executable = executable

    def run(self, *arguments):
        result = subprocess.run([self.executable, *arguments], capture_output=True,
                                text=True, check=False)
        if result.returncode != 0:
            raise RuntimeError("mokuto %s: %s" % (arguments[0], result.stderr.strip()))
        return result.stdout

    def analyse(self, language, text):
        return json.loads(self.run("analyse", "--structures", "--pause", "0",
                                   "--language", language, "--", text))

    def emotion(self, language, text):
        return json.loads(self.run("emotion", "--json", "--language", language, "--", text))["emotion"]

    def base_forms(self, language, words):
        """The base form of each word's first record, None where there is none."""
        forms = {}
        words = sorted(set(words))
        for k in range(0, len(words), 400):
            batch = words[k:k + 400]
            for entry in json.loads(self.run("lookup", "--json", "--language", language,
                                             "--", *batch)):
                records = entry["records"]
                forms[entry["word"]] = records[0]["lemma"] if records else None
        return forms


def read_lines(path):
    with open(path, encoding="utf-8") as source:
        return [line.rstrip("\n") for line in source if line.strip()]


def spans(text, pieces, start=0):
    """(start, end) of each piece found in order in text; None where one is not found."""
    out = []
    lower = text.lower()
    for piece in pieces:
        at = lower.find(piece.lower(), start)
        if at < 0:
            out.append(None)
            continue
        out.append((at, at + len(piece)))
        start = at + len(piece)
    return out


def chunk_spans(analysis):
    """(start, end, text, class) of the chunks, by their offsets in the analysed text."""
    out = []
    at = 0
    for text, word_class in analysis["chunks"]:
        out.append((at, at + len(text), text, word_class))
        at += len(text)
    return out


def is_word(word_class):
    return word_class not in ("bookmark", "interspace", "linkbetweenwords", "punctuation")


def mecab(sentences):
    """Per sentence, MeCab's tokens: (surface, part of speech, base form)."""
    return [[(surface, pos, base or surface) for surface, pos, _, base in tokens]
            for tokens in mecab_analyses(MECAB_DICTIONARY, sentences)]


def apertium(lang, sentences):
    """Per sentence, Apertium's units: (surface, first lemma) after disambiguation."""
    analyser, probabilities = APERTIUM[lang]
    command = ("apertium-destxt | lt-proc '%s' | apertium-tagger -g -p '%s' | apertium-retxt"
               % (analyser, probabilities))
    out = []
    for sentence in sentences:
        result = subprocess.run(["sh", "-c", command], input=sentence + "\n",
                                capture_output=True, text=True, check=True)
        units = []
        for unit in re.findall(r"\^(.*?)\$", result.stdout):
            surface, _, analysis = unit.partition("/")
            lemma = re.split(r"[<+]", analysis, maxsplit=1)[0]
            units.append((surface, lemma))
        out.append(units)
    return out


def percent(part, whole):
    return 100.0 * part / whole if whole else 0.0


def measure(mokuto, lang, kind, coordinations, library):
    language = LANGUAGES[lang]
    sentences = read_lines(os.path.join(HERE, "texts", "%s.%s.txt" % (kind, lang)))
    with concurrent.futures.ThreadPoolExecutor(max_workers=os.cpu_count() or 2) as pool:
        analyses = list(pool.map(lambda s: mokuto.analyse(language, s), sentences))
    figures = {}
    words = sum(len(re.findall(r"\w+", s)) for s in sentences)

    chunks = [chunk_spans(a["analysis"]) for a in analyses]
    forms = mokuto.base_forms(language, [c[2].lower() for cs in chunks for c in cs
                                         if is_word(c[3])])

    def our_base(chunk):
        form = forms.get(chunk[2].lower())
        return (form or chunk[2]).lower()

    agree = compared = 0
    if lang == "ja":
        tokens = mecab(sentences)
        words = sum(1 for ts in tokens for t in ts if t[1] != "記号")
        true_positive = ours_total = theirs_total = 0
        split_sentences = 0
        bookmarks = bookmarks_inside = 0
        for sentence, cs, ts, analysed in zip(sentences, chunks, tokens, analyses):
            theirs_spans = spans(sentence, [t[0] for t in ts])
            their_tokens = [(s, t) for s, t in zip(theirs_spans, ts) if s is not None]
            length = len(sentence)
            # MeCab makes one symbol of a run of marks ("/", ".."), which are no words:
            # the cuts inside them are not counted.
            symbols = [s for s, t in their_tokens if not re.search(r"\w", t[0])]
            ours = {p for c in cs if c[3] != "interspace" for p in c[:2]
                    if not any(s[0] < p < s[1] for s in symbols)} - {0, length}
            theirs = {p for s, _ in their_tokens for p in s} - {0, length}
            true_positive += len(ours & theirs)
            ours_total += len(ours)
            theirs_total += len(theirs)
            inside = lambda p: any(s[0] < p < s[1] for s, _ in their_tokens)
            if any(inside(p) for p in ours):
                split_sentences += 1
                for (start, end), _ in their_tokens:
                    if any(start < p < end for p in ours):
                        SPLITS["%s <- %s" % (sentence[start:end], "|".join(
                            c[2] for c in cs if c[0] < end and c[1] > start))] += 1
            # Automatic bookmarks: their offsets in the text without them.
            text = analysed["text"]
            offset = 0
            for match in re.finditer(r" \\mrk=\d+\\ ", text):
                position = match.start() - offset
                offset += len(match.group(0))
                bookmarks += 1
                bookmarks_inside += inside(position)
            by_span = {s: t for s, t in their_tokens}
            for c in cs:
                token = by_span.get((c[0], c[1]))
                if token is None or not is_word(c[3]) or token[1] == "記号":
                    continue
                compared += 1
                agree += our_base(c) == token[2].lower()
                if our_base(c) != token[2].lower():
                    DISAGREEMENTS[(c[2].lower(), our_base(c), token[2].lower())] += 1
        precision = percent(true_positive, ours_total)
        recall = percent(true_positive, theirs_total)
        figures["boundary F1 (MeCab)"] = "%.1f %% (precision %.1f, recall %.1f)" % (
            2 * precision * recall / (precision + recall) if precision + recall else 0,
            precision, recall)
        figures["sentences cut inside a MeCab word"] = "%d of %d (%.1f %%)" % (
            split_sentences, len(sentences), percent(split_sentences, len(sentences)))
        figures["automatic bookmarks inside a MeCab word"] = "%d of %d (%.1f %%)" % (
            bookmarks_inside, bookmarks, percent(bookmarks_inside, bookmarks))
        reference = "MeCab"
    else:
        reference = "Apertium"
        for sentence, cs, units in zip(sentences, chunks, apertium(lang, sentences)):
            unit_spans = spans(sentence, [u[0] for u in units])
            by_span = {}
            for span, (surface, lemma) in zip(unit_spans, units):
                if span is None or not re.search(r"\w", surface) or not lemma:
                    continue
                if lemma[0] in "*#@" or lemma == "prpers" or "#" in surface:
                    continue
                end = span[1] - 1 if surface[-1] in "'’" else span[1]
                by_span[(span[0], end)] = lemma
            for c in cs:
                lemma = by_span.get((c[0], c[1]))
                if lemma is None or not is_word(c[3]):
                    continue
                compared += 1
                agree += our_base(c) == lemma.lower()
                if our_base(c) != lemma.lower():
                    DISAGREEMENTS[(c[2].lower(), our_base(c), lemma.lower())] += 1
    figures["base-form agreement (%s)" % reference] = "%.1f %% of %d words" % (
        percent(agree, compared), compared)

    labelled = [line.split("\t", 1) for line in
                read_lines(os.path.join(HERE, "emotions", "%s.%s.tsv" % (kind, lang)))]
    with concurrent.futures.ThreadPoolExecutor(max_workers=os.cpu_count() or 2) as pool:
        estimates = list(pool.map(lambda l: mokuto.emotion(language, l[1]), labelled))
    right = sum(1 for (label, _), e in zip(labelled, estimates)
                if (label == "+" and e > 0) or (label == "-" and e < 0))
    figures["emotion accuracy"] = "%.1f %% (%d of %d)" % (percent(right, len(labelled)), right,
                                                           len(labelled))

    tags = Counter()
    gestures = library_tags(library)
    for analysed in analyses:
        for action in analysed["actions"]:
            if action["keyword"] == "AUTO_START_TAG" and action["tag"] in gestures:
                tags[action["tag"]] += 1
    total = sum(tags.values())
    figures["gestures per 100 words"] = "%.2f (%d gestures, %d words)" % (
        percent(total, words), total, words)
    structure = sum(n for t, n in tags.items() if t in STRUCTURE_TAGS)
    figures["structure tags (two to five, pick)"] = "%.1f %% of gestures" % percent(structure,
                                                                                 total)
    figures["tags"] = ", ".join("%s %.0f%%" % (t, percent(n, total))
                                for t, n in tags.most_common(15))

    if coordinations is not None:
        for sentence, analysed in zip(sentences, analyses):
            for s in analysed["analysis"]["structures"]:
                if s["kind"] in ("and", "or") and 2 <= s.get("itemCount", 0) <= 5:
                    items = " | ".join("%s[%s]" % (c["kind"], " ".join(c["words"]))
                                       for c in s.get("children", []))
                    coordinations.write("%s\t%s %d\t%s\t%s\n" % (
                        lang, s["kind"], s["itemCount"], items, sentence))
    return figures


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("--build", default=os.path.join(HERE, "..", "..", "build", "default"))
    parser.add_argument("--library", default=LIBRARY,
                        help="the behaviour library whose tags count as gestures")
    parser.add_argument("--held-out", action="store_true",
                        help="measure the held-out texts instead of the development ones")
    parser.add_argument("--languages", default="en,fr,ja")
    parser.add_argument("--disagreements", type=int, default=0, metavar="N",
                        help="print the N most frequent base-form disagreements")
    parser.add_argument("--splits", type=int, default=0, metavar="N",
                        help="print the N MeCab words most often cut inside")
    parser.add_argument("--coordinations",
                        help="write every coordination of two to five items to this file")
    args = parser.parse_args()
    mokuto = Mokuto(os.path.join(args.build, "mokuto", "mokuto"))
    kind = "heldout" if args.held_out else "dev"
    coordinations = open(args.coordinations, "w", encoding="utf-8") if args.coordinations else None
    for lang in args.languages.split(","):
        print("%s (%s text)" % (LANGUAGES[lang], "held-out" if args.held_out else "development"))
        DISAGREEMENTS.clear()
        SPLITS.clear()
        for name, value in measure(mokuto, lang, kind, coordinations, args.library).items():
            print("  %-42s %s" % (name, value))
        for (word, ours, theirs), count in DISAGREEMENTS.most_common(args.disagreements):
            print("    %4d  %s: %s, not %s" % (count, word, ours, theirs))
        for split, count in SPLITS.most_common(args.splits):
            print("    %4d  %s" % (count, split))
        sys.stdout.flush()
    if coordinations:
        coordinations.close()


if __name__ == "__main__":
    main()
