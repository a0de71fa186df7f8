#!/usr/bin/env python3
"""Turns the lexicon packages into the plain lexicons that mkbdb reads.

Each subcommand writes a lexicon (WORD<TAB>CLASS[/FEATURES][=BASEFORM]...) and, for the
main databases, a frequency file (BASEFORM<TAB>COUNT) that orders the base forms that
mkbdb keeps. Words are lowercased in ASCII only, byte for byte, as the analysis
lowercases a text before looking its words up; a word whose first letter is an accented
lowercase letter is also stored with that letter in capitals ("était" and "Était"),
since the analysis leaves non-ASCII letters as they are written.

Feature bytes (see README.md): s/p number, m/f gender, 1/2/3 person, tenses and
moods W infinitive, P present, I imperfect, J simple past, F future, C conditional,
S subjunctive present, T subjunctive imperfect, Y imperative, G present participle,
K past participle; c/u comparative/superlative; n negation; e elided form. Several
letters of one kind are alternatives ("PS13s": present or subjunctive, first or third
person, singular).
"""

import argparse
import glob
import json
import os
import re
import sys

from mecabcut import mecab_analyses

# Emotion labels, stored as the base form of a class-4 ("unkonwn") record.
VERY_POSITIVE = "very positive"
POSITIVE = "positive"
NEGATIVE = "negative"
VERY_NEGATIVE = "very negative"
STRONG_ADVERB = "strong adverb"
NEGATION = "negation"

# Frequency given to the base forms of closed classes: kept right after the gesture tags.
CLOSED_CLASS_FREQUENCY = 1e9


def ascii_lower(text):
    return "".join(c.lower() if "A" <= c <= "Z" else c for c in text)


def keys_of(word):
    """The keys under which a word is stored."""
    key = ascii_lower(word)
    keys = [key]
    first = key[:1]
    if first and ord(first) > 127 and first.islower() and first.upper() != first:
        upper = first.upper()
        if len(upper) == 1:
            keys.append(upper + key[1:])
    return keys


def has_letter(text):
    return any(c.isalpha() for c in text)


def clean(text):
    return text.replace("\t", " ").replace("\n", " ").replace("\r", " ")


class LexiconWriter:
    """Collects records by word, in the order given, without duplicates."""

    def __init__(self):
        self.words = {}

    def add(self, word, word_class, features="", base_form=None):
        for key in keys_of(word):
            if not key or "\t" in key or len(key.encode("utf-8")) > 1000:
                continue
            record = word_class
            if features:
                record += "/" + features
            if base_form is not None:
                form = clean(base_form)
                if len(form.encode("utf-8")) <= 255:
                    record += "=" + form
            records = self.words.setdefault(key, [])
            if record not in records:
                records.append(record)

    def write(self, path):
        with open(path, "w", encoding="utf-8", newline="\n") as out:
            for word in sorted(self.words, key=lambda w: w.encode("utf-8")):
                out.write(word + "\t" + "\t".join(self.words[word]) + "\n")
        return len(self.words)


def write_frequencies(path, frequencies):
    with open(path, "w", encoding="utf-8", newline="\n") as out:
        for form, count in sorted(frequencies.items(), key=lambda kv: (-kv[1], kv[0])):
            if "\t" not in form and "\n" not in form:
                out.write("%s\t%g\n" % (form, count))


def read_closed_lexicon(path):
    """Our own lexicon files: mkbdb's format, with '#' comments."""
    entries = []
    with open(path, encoding="utf-8") as source:
        for line in source:
            line = line.rstrip("\n")
            if not line or line.startswith("#"):
                continue
            word, *records = line.split("\t")
            parsed = []
            for record in records:
                head, _, base = record.partition("=")
                word_class, _, features = head.partition("/")
                parsed.append((word_class, features, base if "=" in record else None))
            entries.append((word, parsed))
    return entries


# --- English: WordNet and our closed classes -------------------------------------------

WORDNET_CLASSES = {"noun": "noun", "verb": "verb", "adj": "adjective", "adv": "adverb"}
SENSE_TYPES = {"1": "noun", "2": "verb", "3": "adj", "4": "adv", "5": "adj"}


def english_plural(word):
    if re.search(r"(s|x|z|ch|sh)$", word):
        return word + "es"
    if re.search(r"[^aeiou]y$", word):
        return word[:-1] + "ies"
    return word + "s"


# The prefixes of the verbs made of "go" and "do": "undergo", "forgo", "redo", "outdo".
GO_DO_PREFIXES = {"", "under", "for", "fore", "out", "un", "re", "over", "mis"}


def english_third_person(word, plurals):
    """The present of the third person singular: "goes", "undoes", "echoes", "vetoes" (the
    noun's plural, where WordNet lists it with "es"), but "demos", "tangos"."""
    if re.search(r"[^aeiou]o$", word):
        if (word[-2:] in ("go", "do") and word[:-2] in GO_DO_PREFIXES) or word + "es" in plurals:
            return word + "es"
        return word + "s"
    return english_plural(word)


def english_ing(word):
    if word.endswith("ie"):
        return word[:-2] + "ying"
    if word.endswith("e") and not re.search(r"(ee|ye|oe)$", word) and len(word) > 2:
        return word[:-1] + "ing"
    return word + "ing"


def english_ed(word):
    if word.endswith("e"):
        return word + "d"
    if re.search(r"[^aeiou]y$", word):
        return word[:-1] + "ied"
    return word + "ed"


def english_degree(word, suffix):
    if word.endswith("e"):
        return word + suffix[1:]
    if re.search(r"[^aeiou]y$", word):
        return word[:-1] + "i" + suffix
    return word + suffix


def syllables(word):
    return len(re.findall(r"[aeiouy]+", word))


def english(args):
    wordnet = args.wordnet
    counts = {}
    with open(os.path.join(wordnet, "cntlist.rev"), encoding="latin-1") as source:
        for line in source:
            parts = line.split()
            if len(parts) != 3 or "%" not in parts[0]:
                continue
            lemma, _, rest = parts[0].partition("%")
            pos = SENSE_TYPES.get(rest[:1])
            if pos:
                counts[(lemma, pos)] = counts.get((lemma, pos), 0) + int(parts[2])

    exceptions = {}  # (base, pos) -> inflected forms
    for pos in WORDNET_CLASSES:
        with open(os.path.join(wordnet, pos + ".exc"), encoding="latin-1") as source:
            for line in source:
                parts = line.split()
                if len(parts) >= 2:
                    for base in parts[1:]:
                        exceptions.setdefault((base, pos), []).append(parts[0])

    # word -> [(closed, -frequency, order, class, features, base)]
    analyses = {}
    order = [0]

    def analysis(word, word_class, features, base, frequency, closed=False):
        if "_" in word or not has_letter(word):
            return
        order[0] += 1
        analyses.setdefault(word, []).append(
            (0 if closed else 1, -frequency, order[0], word_class, features, base))

    lemmas = set()
    for pos in WORDNET_CLASSES:
        with open(os.path.join(wordnet, "index." + pos), encoding="latin-1") as source:
            lemmas.update(line.split(" ", 1)[0] for line in source if not line.startswith(" "))
    dropped = []
    frequencies = {}
    for pos, word_class in WORDNET_CLASSES.items():
        with open(os.path.join(wordnet, "index." + pos), encoding="latin-1") as source:
            for line in source:
                if line.startswith(" "):
                    continue
                lemma = line.split(" ", 1)[0]
                if "_" in lemma or not has_letter(lemma):
                    continue
                frequency = counts.get((lemma, pos), 0)
                frequencies[lemma] = frequencies.get(lemma, 0) + frequency
                irregular = exceptions.get((lemma, pos), [])
                if pos == "noun":
                    analysis(lemma, word_class, "s", lemma, frequency)
                    plurals = irregular or ([english_plural(lemma)] if len(lemma) > 1 else [])
                    for form in plurals:
                        analysis(form, word_class, "p", lemma, frequency)
                elif pos == "verb":
                    analysis(lemma, word_class, "WP", lemma, frequency)
                    plurals = exceptions.get((lemma, "noun"), [])
                    analysis(english_third_person(lemma, plurals), word_class, "P3s", lemma,
                             frequency)
                    irregular_ing = [f for f in irregular if f.endswith("ing")]
                    irregular_past = [f for f in irregular if not f.endswith("ing")]
                    for form in irregular_ing or [english_ing(lemma)]:
                        analysis(form, word_class, "G", lemma, frequency)
                    for form in irregular_past or [english_ed(lemma)]:
                        analysis(form, word_class, "JK", lemma, frequency)
                elif pos == "adj":
                    analysis(lemma, word_class, "", lemma, frequency)
                    if irregular:
                        for form in irregular:
                            analysis(form, word_class, "u" if form.endswith("st") else "c",
                                     lemma, frequency)
                    elif frequency > 0 and "-" not in lemma and (
                            syllables(lemma) == 1 or (syllables(lemma) == 2 and lemma.endswith("y"))):
                        for suffix, features in (("er", "c"), ("est", "u")):
                            form = english_degree(lemma, suffix)
                            # A word of its own ("owner" is no degree of "own").
                            if form in lemmas:
                                dropped.append((form, lemma))
                            else:
                                analysis(form, word_class, features, lemma, frequency)
                else:
                    analysis(lemma, word_class, "", lemma, frequency)
                    for form in irregular:
                        analysis(form, word_class, "", lemma, frequency)

    for word, records in read_closed_lexicon(args.closed):
        for word_class, features, base in records:
            analysis(word, word_class, features, base, 0, closed=True)
            if base is not None:
                frequencies[base] = CLOSED_CLASS_FREQUENCY

    lexicon = LexiconWriter()
    for word in analyses:
        for _, _, _, word_class, features, base in sorted(analyses[word]):
            lexicon.add(word, word_class, features, base)
    print("english: %d words, %d regular degrees that are words of their own left out"
          % (lexicon.write(args.lexicon), len(dropped)), file=sys.stderr)
    with open(args.lexicon + ".fixes", "w", encoding="utf-8") as out:
        out.write("# Comparatives and superlatives made by the rule that are words of their own\n"
                  "# in WordNet, left out: FORM<TAB>ADJECTIVE\n")
        for form, lemma in sorted(dropped):
            out.write("%s\t%s\n" % (form, lemma))
    write_frequencies(args.frequencies, frequencies)


# --- French: Lefff ---------------------------------------------------------------------

# Lefff category -> (word class, rank of the class among the records of a word). Closed
# classes come first: a word that is both ("la": determiner, clitic, noun) is most
# often the closed one.
LEFFF_CLASSES = {
    "auxAvoir": ("auxiliary", 0), "auxEtre": ("auxiliary", 0),
    "det": ("determinant", 1),
    "cln": ("pronoun", 2), "pro": ("pronoun", 2), "prel": ("pronoun", 2),
    "pri": ("pronoun", 2), "ce": ("pronoun", 2), "ilimp": ("pronoun", 2),
    "caimp": ("pronoun", 2),
    "cla": ("pronoun_comp", 3), "cld": ("pronoun_comp", 3), "clr": ("pronoun_comp", 3),
    "cll": ("pronoun_comp", 3), "clar": ("pronoun_comp", 3), "cldr": ("pronoun_comp", 3),
    "clg": ("pronoun_comp", 3),
    "prep": ("preposition", 4),
    "coo": ("conjunctive", 5),
    "csu": ("sub_conj", 6), "que": ("sub_conj", 6),
    "clneg": ("adverb", 7), "advneg": ("adverb", 7), "que_restr": ("adverb", 7),
    "pres": ("interjection", 8),
    "v": ("verb", 9),
    "nc": ("noun", 10),
    "adj": ("adjective", 11),
    "adv": ("adverb", 12),
    "np": ("proper_noun", 13),
}
LEFFF_CLOSED_RANK = 8
LEFFF_NEGATIONS = {"clneg", "advneg"}
COORDINATIONS = {"et", "ou", "and", "or"}
# The negation words of the analysis' negated groups.
NEGATIONS = {"ne", "pas", "not"}


def lefff_clean(text):
    return re.sub(r"__\w+$", "", text)


# Invariable categories: a base form other than the word is one of Lefff's spelling
# normalisations ("vi" -> "oui", "bcp" -> "beaucoup"), not the word's base form.
LEFFF_INVARIABLE = {"adv", "prep", "coo", "csu", "pres", "advneg"}
# The possessor of a possessive determiner (Lefff gives them all the base form "son").
POSSESSIVES = {"P1s": "mon", "P2s": "ton", "P3s": "son", "P1p": "notre", "P2p": "votre",
               "P3p": "leur"}
# Words after which a word is read as a noun, or as a verb, when counting how a corpus
# uses the words that can be both.
NOUN_CONTEXT = {"le", "la", "les", "l", "un", "une", "des", "du", "de", "d", "ce", "cet",
                "cette", "ces", "mon", "ma", "mes", "ton", "ta", "tes", "son", "sa", "ses",
                "notre", "nos", "votre", "vos", "leur", "leurs", "au", "aux", "chaque"}
VERB_CONTEXT = {"je", "j", "tu", "il", "elle", "on", "nous", "vous", "ils", "elles", "se",
                "s", "ne", "n", "qui", "me", "m", "te", "t"}


def french_corpus(paths):
    """How often each word form occurs, and how often after a determiner or a subject."""
    counts, as_noun, as_verb = {}, {}, {}
    for path in paths:
        with open(path, encoding="utf-8") as source:
            for line in source:
                previous = None
                for word in re.findall(r"[^\W\d_]+", line.lower()):
                    counts[word] = counts.get(word, 0) + 1
                    if previous in NOUN_CONTEXT:
                        as_noun[word] = as_noun.get(word, 0) + 1
                    elif previous in VERB_CONTEXT:
                        as_verb[word] = as_verb.get(word, 0) + 1
                    previous = word
    return counts, as_noun, as_verb


def french_base_form(form, category, lemma, features, fixes):
    """Lefff's base form, repaired where it is not the word's; the repairs go to fixes."""
    fixed = lemma
    if category in LEFFF_INVARIABLE and lemma != form and " " not in form:
        fixed = form
    elif category in ("caimp", "ilimp") and lemma.endswith("imp"):
        fixed = form
    elif category == "det" and lemma == "son":
        possessor = re.search(r"P[123][sp]", features)
        if possessor:
            fixed = POSSESSIVES[possessor.group(0)]
    if fixed != lemma:
        fixes.add((form, category, lemma, fixed))
    return fixed


def french(args):
    analyses = {}
    frequencies = {}
    counts, as_noun, as_verb = french_corpus(args.corpus or [])
    fixes = set()
    order = 0
    replaced = {ascii_lower(word) for word, _ in read_closed_lexicon(args.fixes)}
    with open(args.lefff, encoding="utf-8") as source:
        for line in source:
            parts = line.rstrip("\n").split("\t")
            if len(parts) < 3 or parts[1] not in LEFFF_CLASSES:
                continue
            form = lefff_clean(parts[0])
            category = parts[1]
            if form.startswith("_") or not has_letter(form) or ascii_lower(form) in replaced:
                continue
            words = form.split(" ")
            # A fixed phrase around a coordination or a negation ("pas de") would hide
            # it from the analysis.
            if len(words) > 1 and (COORDINATIONS | NEGATIONS) & set(w.lower() for w in words):
                continue
            word_class, rank = LEFFF_CLASSES[category]
            lemma = lefff_clean(parts[2]).rstrip("?")
            # Lefff names some base forms after their category ("cln"); "ce" and "que"
            # are words too.
            if (lemma in LEFFF_CLASSES and lemma not in ("ce", "que")) or \
                    lemma.startswith("_") or not lemma:
                lemma = form
            features = parts[3] if len(parts) > 3 else ""
            lemma = french_base_form(form, category, lemma, features, fixes)
            if category in LEFFF_NEGATIONS:
                features = "n" + features
            key = ascii_lower(form)
            order += 1
            analyses.setdefault(key, []).append((rank, order, word_class, features, lemma))
            if rank < LEFFF_CLOSED_RANK:
                frequencies[lemma] = CLOSED_CLASS_FREQUENCY
            else:
                frequencies[lemma] = frequencies.get(lemma, 0) + counts.get(key, 0)

    lexicon = LexiconWriter()
    for path in (args.fixes, args.extra):
        for word, records in read_closed_lexicon(path):
            for word_class, features, base in records:
                lexicon.add(word, word_class, features, base)
                if base is not None:
                    frequencies[base] = CLOSED_CLASS_FREQUENCY
    for word, records in analyses.items():
        # A noun that is also a verb is read as the noun first unless a corpus uses it
        # more after a subject than after a determiner ("la base", "une commande", but
        # "il parle"); a participle only when the corpus uses it more as a noun ("les
        # données").
        classes = {r[2] for r in records}
        participle = any(r[2] == "verb" and re.search("[KG]", r[3]) for r in records)
        nouns, verbs = as_noun.get(word, 0), as_verb.get(word, 0)
        if "noun" in classes and "verb" in classes and (
                nouns > verbs or (nouns == verbs and not participle)):
            records = [(LEFFF_CLASSES["v"][1] - 0.5,) + r[1:] if r[2] == "noun" else r
                       for r in records]
        for _, _, word_class, features, lemma in sorted(records):
            lexicon.add(word, word_class, features, lemma)
            # Lefff writes the ligature as two letters ("coeur", "oeuvrer"); texts write it
            # "cœur", "œuvrer". Both are stored, with Lefff's base form.
            if "oe" in word:
                lexicon.add(word.replace("oe", "œ"), word_class, features, lemma)
    print("french: %d words, %d base forms of Lefff repaired" % (lexicon.write(args.lexicon),
                                                                 len(fixes)), file=sys.stderr)
    with open(args.lexicon + ".fixes", "w", encoding="utf-8") as out:
        out.write("# Base forms of Lefff repaired: WORD<TAB>CATEGORY<TAB>LEFFF'S<TAB>OURS\n")
        for fix in sorted(fixes):
            out.write("\t".join(fix) + "\n")
    write_frequencies(args.frequencies, frequencies)


# --- Japanese: IPADIC ------------------------------------------------------------------

def ipadic_class(pos1, pos2):
    if pos1 == "名詞":
        if pos2 == "固有名詞":
            return "proper_noun"
        if pos2 == "代名詞":
            return "pronoun"
        if pos2 in ("形容動詞語幹", "ナイ形容詞語幹"):
            return "adjective"
        return "noun"
    if pos1 == "動詞":
        return "auxiliary" if pos2 == "非自立" else "verb"
    if pos1 == "形容詞":
        return "adjective"
    if pos1 == "副詞":
        return "adverb"
    if pos1 == "連体詞":
        return "determinant"
    if pos1 == "接続詞":
        return "conjunctive"
    if pos1 == "助詞":
        if pos2 == "接続助詞":
            return "sub_conj"
        if pos2 == "並立助詞":
            return "conjunctive"
        if pos2 == "終助詞":
            return "interjection"
        return "preposition"
    if pos1 == "助動詞":
        return "auxiliary"
    if pos1 in ("感動詞", "フィラー", "その他"):
        return "interjection"
    if pos1 == "接頭詞":
        return "determinant"
    return None  # 記号: punctuation is the tokeniser's


JAPANESE_NEGATIONS = {"ない", "ぬ", "ん", "まい"}


def read_ipadic(directory):
    """(surface, cost, pos1, pos2, base) of every entry."""
    for path in sorted(glob.glob(os.path.join(directory, "*.csv"))):
        with open(path, encoding="euc_jp", errors="replace") as source:
            for line in source:
                parts = line.rstrip("\n").split(",")
                if len(parts) < 13:
                    continue
                base = parts[10] if parts[10] != "*" else parts[0]
                yield parts[0], int(parts[3]), parts[4], parts[5], base


JAPANESE_CLOSED = {"助詞", "助動詞", "接続詞", "連体詞", "感動詞", "フィラー"}
# Forms stored as one word although MeCab cuts them: the polite negation, whose "ん"
# alone would also be the "ん" of "なんです", and the apologies that end with it.
JAPANESE_WORDS = [("ません", "auxiliary", "n", "ます"),
                  # Apologies, which would otherwise end with the negation "ません".
                  ("すみません", "interjection", "", "すみません"),
                  ("申し訳ありません", "interjection", "", "申し訳ありません"),
                  ("申し訳ございません", "interjection", "", "申し訳ございません")]


# The character kinds of the analysis' tokeniser where words are not spaced.
def is_space(c):
    o = ord(c)
    return (c == " " or "\t" <= c <= "\r" or o in (0xA0, 0x1680, 0x2028, 0x2029, 0x202F,
                                                     0x205F, 0x3000) or 0x2000 <= o <= 0x200B)


def is_link(c):
    return c in "'-\u2019\u2010\u2011"


def is_punctuation(c):
    o = ord(c)
    if o < 0x80:
        return ("!" <= c <= "/" or ":" <= c <= "@" or "[" <= c <= "`" or "{" <= c <= "~")
    return (o in (0xA1, 0xA7, 0xAB, 0xB6, 0xB7, 0xBB, 0xBF, 0x3030, 0x303D, 0x30FB)
            or 0x2010 <= o <= 0x2027 or 0x2030 <= o <= 0x205E or 0x3001 <= o <= 0x3004
            or 0x3008 <= o <= 0x3011 or 0x3014 <= o <= 0x301F or 0xFF01 <= o <= 0xFF0F
            or 0xFF1A <= o <= 0xFF20 or 0xFF3B <= o <= 0xFF40 or 0xFF5B <= o <= 0xFF65)


def unknown_run_script(c):
    o = ord(c)
    if c.isascii() and c.isalnum():
        return 1
    if 0x30A1 <= o <= 0x30FA or 0x30FC <= o <= 0x30FE:
        return 2
    if 0xFF10 <= o <= 0xFF19 or 0xFF21 <= o <= 0xFF3A or 0xFF41 <= o <= 0xFF5A:
        return 3
    return 0


def covered(lower, p, q, stored, longest):
    """Whether the longest stored word at p ends at q or after it."""
    for length in range(min(longest, len(lower) - p), q - p - 1, -1):
        if lower[p:p + length] in stored:
            return True
    return False


def unspaced_cut(text, stored, longest):
    """The words of the analysis' cut of text where words are not spaced: (start, end,
    stored word or None), in characters."""
    lower = ascii_lower(text)
    words = []
    p = 0
    while p < len(text):
        c = text[p]
        if is_space(c) or is_punctuation(c) or is_link(c):
            p += 1
            continue
        script = unknown_run_script(c)
        if script == 2 and (p == 0 or unknown_run_script(text[p - 1]) != script):
            q = p + 1
            while q < len(text) and unknown_run_script(text[q]) == script:
                q += 1
            if not covered(lower, p, q, stored, longest):
                words.append((p, q, None))
                p = q
                continue
        for length in range(min(longest, len(text) - p), 0, -1):
            if lower[p:p + length] in stored:
                words.append((p, p + length, lower[p:p + length]))
                p += length
                break
        else:
            q = p + 1
            script = unknown_run_script(c)
            while script and q < len(text) and unknown_run_script(text[q]) == script:
                q += 1
            words.append((p, q, None))
            p = q
    return words


def token_spans(text, tokens):
    spans, at = [], 0
    for token in tokens:
        found = text.find(token[0], at)
        if found < 0:
            return None
        spans.append((found, found + len(token[0])))
        at = found + len(token[0])
    return spans


def behavior_tags(directory):
    tags = set()
    for path in glob.glob(os.path.join(directory, "**", "behavior.json"), recursive=True):
        with open(path, encoding="utf-8") as source:
            tags.update(json.load(source).get("tags", []))
    return tags


def choose_japanese_words(surfaces, corpus, report, keep):
    """The IPADIC surfaces that the longest-prefix cut may take: those that win where
    MeCab cuts a word as often as they win wrongly (ending inside a MeCab word or running
    over several), measured on the corpus and again after each removal. The words in
    keep (gesture tags: "はい", which a written text rarely says) are all kept."""
    stored = set(surfaces)
    longest = max(len(w) for w in stored)
    removed = {}
    for _ in range(10):
        good, bad = {}, {}
        for text, spans in corpus:
            starts = {s for s, _ in spans}
            ends = {e for _, e in spans}
            exact = set(spans)
            for start, end, word in unspaced_cut(text, stored, longest):
                if word is None:
                    continue
                if (start, end) in exact:
                    good[word] = good.get(word, 0) + 1
                elif start in starts:
                    bad[word] = bad.get(word, 0) + 1
        losers = {w for w, n in bad.items() if n > good.get(w, 0) and w not in keep}
        if not losers:
            break
        for word in losers:
            removed[word] = (bad[word], good.get(word, 0))
        stored -= losers
    with open(report, "w", encoding="utf-8") as out:
        out.write("# IPADIC words left out of the Japanese database: they won the longest-prefix\n"
                  "# cut more often where MeCab cuts otherwise than where it agrees.\n"
                  "# WORD<TAB>WRONG<TAB>RIGHT\n")
        for word in sorted(removed):
            out.write("%s\t%d\t%d\n" % (word, removed[word][0], removed[word][1]))
    return stored, len(removed)


def japanese(args):
    lines = []
    for path in args.corpus:
        with open(path, encoding="utf-8") as source:
            lines += [line.strip() for line in source if line.strip()]
    analysed = mecab_analyses(args.mecab_dictionary, lines)
    corpus = []
    counts = {}  # (surface, class, base) -> occurrences in MeCab's cut of the corpus
    base_counts = {}
    for text, tokens in zip(lines, analysed):
        spans = token_spans(text, tokens)
        if spans is None:
            continue
        corpus.append((text, spans))
        for surface, pos1, pos2, base in tokens:
            word_class = ipadic_class(pos1, pos2)
            if word_class is None:
                continue
            if base is None:
                continue
            key = (ascii_lower(surface), word_class, base)
            counts[key] = counts.get(key, 0) + 1
            base_counts[base] = base_counts.get(base, 0) + 1

    analyses = {}
    # IPADIC's word costs (the lower, the likelier) are comparable within a part of
    # speech only: a base form ranks by the share of its part of speech that is likelier
    # than it. Closed classes come first, proper nouns last.
    best_cost = {}  # (base, pos1, pos2) -> lowest cost
    for surface, cost, pos1, pos2, base in read_ipadic(args.ipadic):
        word_class = ipadic_class(pos1, pos2)
        if word_class is None or not has_letter(surface):
            continue
        features = "n" if pos1 == "助動詞" and base in JAPANESE_NEGATIONS else ""
        key = ascii_lower(surface)
        seen = counts.get((key, word_class, base), 0)
        analyses.setdefault(key, []).append((-seen, cost, word_class, features, base))
        best = (base, pos1, pos2)
        best_cost[best] = min(best_cost.get(best, cost), cost)

    stored, removed = choose_japanese_words(analyses, corpus, args.lexicon + ".left-out",
                                            behavior_tags(args.behaviors))
    for surface, word_class, features, base in JAPANESE_WORDS:
        analyses.setdefault(surface, []).insert(0, (-1e9, 0, word_class, features, base))
        stored.add(surface)

    lexicon = LexiconWriter()
    for word in sorted(stored):
        for _, _, word_class, features, base in sorted(analyses[word]):
            lexicon.add(word, word_class, features, base)
    print("japanese: %d words (%d of IPADIC left out)" % (lexicon.write(args.lexicon), removed),
          file=sys.stderr)

    by_pos = {}
    for (base, pos1, pos2), cost in best_cost.items():
        by_pos.setdefault((pos1, pos2), []).append((cost, base))
    frequencies = {}
    for (pos1, pos2), entries in by_pos.items():
        entries.sort()
        for rank, (_, base) in enumerate(entries):
            if pos1 in JAPANESE_CLOSED or pos2 in ("代名詞", "非自立"):
                score = CLOSED_CLASS_FREQUENCY
            elif pos2 == "固有名詞":
                score = 0
            else:
                # Seen in the corpus first, by count; then by IPADIC's cost.
                score = base_counts.get(base, 0) + 1 - rank / len(entries)
            frequencies[base] = max(frequencies.get(base, 0), score)
    write_frequencies(args.frequencies, frequencies)


# --- Emotion databases -----------------------------------------------------------------

def add_labels(lexicon, labels):
    for word in sorted(labels):
        lexicon.add(word, "unkonwn", "", labels[word])


def english_emotions(args):
    labels = {}
    with open(args.vader_lexicon, encoding="utf-8") as source:
        for line in source:
            parts = line.split("\t")
            if len(parts) < 2 or " " in parts[0] or not has_letter(parts[0]):
                continue
            valence = float(parts[1])
            # VADER's ratings run from -4 to 4; "very" from the rating step 3 on.
            if valence >= 2.5:
                labels[parts[0]] = VERY_POSITIVE
            elif valence >= 0.5:
                labels[parts[0]] = POSITIVE
            elif valence <= -2.5:
                labels[parts[0]] = VERY_NEGATIVE
            elif valence <= -0.5:
                labels[parts[0]] = NEGATIVE
    with open(args.vader_source, encoding="utf-8") as source:
        code = source.read()
    boosters = re.search(r"BOOSTER_DICT\s*=\s*\{(.*?)\}", code, re.S)
    negations = re.search(r"NEGATE\s*=\s*\[(.*?)\]", code, re.S)
    if not boosters or not negations:
        sys.exit("mklexicon: no NEGATE or BOOSTER_DICT in " + args.vader_source)
    for word, weight in re.findall(r"""['"]?([^'",:\n]+?)['"]?\s*:\s*(B_INCR|B_DECR)""",
                                   boosters.group(1)):
        word = word.strip()
        if weight == "B_INCR" and " " not in word:
            labels[word] = STRONG_ADVERB
    for single, double in re.findall(r"'([^'\n]*)'|\"([^\"\n]*)\"", negations.group(1)):
        word = single or double
        if word and " " not in word:
            labels[word] = NEGATION
    for word, records in read_closed_lexicon(args.extra):
        for _, _, base in records:
            labels[word] = base
    lexicon = LexiconWriter()
    add_labels(lexicon, labels)
    print("english emotions: %d words" % lexicon.write(args.lexicon), file=sys.stderr)


def french_emotions(args):
    with open(args.pattern, encoding="utf-8") as source:
        pattern = json.load(source)
    labels = {}
    for word, entry in pattern.items():
        if " " in word or not has_letter(word):
            continue
        polarity = float(entry.get("polarity") or 0)
        intensity = float(entry.get("intensity") or 1)
        # Words of little subjectivity ("données", "autres", "physique") carry no
        # emotion, whatever their polarity.
        subjectivity = float(entry.get("subjectivity") or 0)
        if entry.get("pos") == "RB" and intensity >= 1.5:
            labels[word] = STRONG_ADVERB
        elif subjectivity < 0.4:
            continue
        elif polarity >= 0.75:
            labels[word] = VERY_POSITIVE
        elif polarity >= 0.1:
            labels[word] = POSITIVE
        elif polarity <= -0.75:
            labels[word] = VERY_NEGATIVE
        elif polarity <= -0.1:
            labels[word] = NEGATIVE
    wanted, exact = {}, {}
    for word, records in read_closed_lexicon(args.extra):
        for _, _, base in records:
            if word.startswith("="):
                exact[word[1:]] = base
            else:
                wanted[word] = base
    # The forms of the listed base forms, from Lefff.
    forms = {word: label for word, label in wanted.items()}
    with open(args.lefff, encoding="utf-8") as source:
        for line in source:
            parts = line.split("\t", 3)
            if len(parts) >= 3 and " " not in parts[0]:
                lemma = lefff_clean(parts[2])
                if lemma in wanted:
                    forms.setdefault(ascii_lower(lefff_clean(parts[0])), wanted[lemma])
    labels.update(forms)
    labels.update(exact)
    labels = {word: label for word, label in labels.items() if label != "none"}
    lexicon = LexiconWriter()
    add_labels(lexicon, labels)
    print("french emotions: %d words" % lexicon.write(args.lexicon), file=sys.stderr)


def japanese_emotions(args):
    wanted = {}
    exact = {}
    for word, records in read_closed_lexicon(args.list):
        for _, _, base in records:
            if word.startswith("="):
                exact[word[1:]] = base
            else:
                wanted[word] = base
    labels = dict(wanted)
    for surface, _, pos1, _, base in read_ipadic(args.ipadic):
        if base in wanted and pos1 != "記号":
            labels.setdefault(surface, wanted[base])
    labels.update(exact)
    lexicon = LexiconWriter()
    add_labels(lexicon, labels)
    print("japanese emotions: %d words" % lexicon.write(args.lexicon), file=sys.stderr)


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    commands = parser.add_subparsers(dest="command", required=True)

    command = commands.add_parser("english")
    command.add_argument("--wordnet", required=True)
    command.add_argument("--closed", required=True)
    command.set_defaults(run=english)
    command = commands.add_parser("french")
    command.add_argument("--lefff", required=True)
    command.add_argument("--extra", required=True)
    command.add_argument("--fixes", required=True,
                         help="words whose records replace Lefff's, with their reasons")
    command.add_argument("--corpus", action="append",
                         help="a French text: how often words occur orders the base forms")
    command.set_defaults(run=french)
    command = commands.add_parser("japanese")
    command.add_argument("--ipadic", required=True)
    command.add_argument("--mecab-dictionary", required=True,
                         help="MeCab's compiled IPADIC (UTF-8), whose cut is the reference")
    command.add_argument("--corpus", action="append", required=True,
                         help="a text, one sentence a line")
    command.add_argument("--behaviors", required=True,
                         help="the behaviour library, whose tags are all kept")
    command.set_defaults(run=japanese)
    for name in ("english", "french", "japanese"):
        commands.choices[name].add_argument("--frequencies", required=True)

    command = commands.add_parser("english-emotions")
    command.add_argument("--vader-lexicon", required=True)
    command.add_argument("--vader-source", required=True)
    command.add_argument("--extra", required=True)
    command.set_defaults(run=english_emotions)
    command = commands.add_parser("french-emotions")
    command.add_argument("--pattern", required=True)
    command.add_argument("--extra", required=True)
    command.add_argument("--lefff", required=True)
    command.set_defaults(run=french_emotions)
    command = commands.add_parser("japanese-emotions")
    command.add_argument("--list", required=True)
    command.add_argument("--ipadic", required=True)
    command.set_defaults(run=japanese_emotions)
    for name in commands.choices:
        commands.choices[name].add_argument("--lexicon", required=True)

    args = parser.parse_args()
    args.run(args)


if __name__ == "__main__":
    main()
