"""MeCab's cut of text, shared by the lexicon build (mklexicon.py) and the quality
figures (tools/quality/quality.py)."""

import subprocess


def mecab_analyses(dictionary, lines):
    """MeCab's cut of each line: (surface, pos1, pos2, base form), base form None for an
    unknown word."""
    result = subprocess.run(["mecab", "-d", dictionary], input="\n".join(lines) + "\n",
                            capture_output=True, text=True, check=True)
    out, current = [], []
    for line in result.stdout.split("\n"):
        if line == "EOS":
            out.append(current)
            current = []
        elif "\t" in line:
            surface, features = line.split("\t", 1)
            fields = features.split(",")
            base = fields[6] if len(fields) > 6 and fields[6] != "*" else None
            current.append((surface, fields[0], fields[1] if len(fields) > 1 else "*", base))
    return out
