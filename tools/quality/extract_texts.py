#!/usr/bin/env python3
"""Extracts the development and held-out texts of scripts/quality from Debian's
documentation, one sentence per line.

Development text: Debian Reference, chapter 1 (packages debian-reference-en, -fr, -ja).
Held-out text: the Debian New Maintainers' Guide, chapters 1 and 2 (packages
maint-guide, maint-guide-fr, maint-guide-ja). Both are under the GNU GPL version 2 or
later; see texts/README.md. The texts are kept in the repository; this script only
shows how they were made.

The training corpora of the lexicon build (tools/lexicons/corpus/) are the rest of
Debian Reference: chapters 2 to 12 and the appendix, every sentence (--corpus).

Usage: tools/quality/extract_texts.py [--count N] OUTPUT_DIRECTORY
       tools/quality/extract_texts.py --corpus OUTPUT_DIRECTORY
"""

import argparse
import html
import os
import re

SOURCES = {
    "dev": {lang: ["/usr/share/debian-reference/ch01.%s.html" % lang]
            for lang in ("en", "fr", "ja")},
    "heldout": {
        "en": ["/usr/share/doc/maint-guide/html/start.en.html",
               "/usr/share/doc/maint-guide/html/first.en.html"],
        "fr": ["/usr/share/doc/maint-guide-fr/html/start.fr.html",
               "/usr/share/doc/maint-guide-fr/html/first.fr.html"],
        "ja": ["/usr/share/doc/maint-guide-ja/html/start.ja.html",
               "/usr/share/doc/maint-guide-ja/html/first.ja.html"],
    },
}


def paragraphs(path):
    with open(path, encoding="utf-8") as source:
        text = source.read()
    # Prose only: no program listings, screens or tables.
    text = re.sub(r"<(pre|table)\b.*?</\1>", "", text, flags=re.S)
    for paragraph in re.findall(r"<p>(.*?)</p>", text, flags=re.S):
        paragraph = html.unescape(re.sub(r"<[^>]+>", "", paragraph))
        yield re.sub(r"\s+", " ", paragraph).strip()


def sentences(paragraph, lang):
    if lang == "ja":
        parts = re.split(r"(?<=[。！？])", paragraph)
    else:
        parts = re.split(r"(?<=[.!?])\s+(?=[A-ZÀ-Ý«\"“])", paragraph)
    for part in parts:
        part = part.strip()
        # Instructions of the annotated text ("^start", "$name=value") and speech-engine
        # tags would be read as such.
        if not part or re.search(r"[$^\\]", part):
            continue
        words = set(part.lower().split())
        if lang == "ja":
            # Untranslated English is left out.
            if 10 <= len(part) <= 120 and re.search(r"[\u3040-\u309f]", part):
                yield part
        elif lang == "fr" and ("the" in words or "is" in words):
            continue
        elif 4 <= len(part.split()) <= 50:
            yield part


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--count", type=int, default=200)
    parser.add_argument("--corpus", action="store_true")
    parser.add_argument("output")
    args = parser.parse_args()
    if args.corpus:
        chapters = ["ch%02d" % n for n in range(2, 13)] + ["apa"]
        for lang in ("fr", "ja"):
            lines = [sentence for chapter in chapters
                     for paragraph in paragraphs("/usr/share/debian-reference/%s.%s.html"
                                                 % (chapter, lang))
                     for sentence in sentences(paragraph, lang)]
            with open(os.path.join(args.output, "debian-reference.%s.txt" % lang), "w",
                      encoding="utf-8") as out:
                out.write("\n".join(lines) + "\n")
            print("corpus", lang, len(lines))
        return
    for kind, languages in SOURCES.items():
        for lang, paths in languages.items():
            lines = []
            for path in paths:
                for paragraph in paragraphs(path):
                    for sentence in sentences(paragraph, lang):
                        if len(lines) < args.count and sentence not in lines:
                            lines.append(sentence)
            with open(os.path.join(args.output, "%s.%s.txt" % (kind, lang)), "w",
                      encoding="utf-8") as out:
                out.write("\n".join(lines) + "\n")
            print(kind, lang, len(lines))


if __name__ == "__main__":
    main()
