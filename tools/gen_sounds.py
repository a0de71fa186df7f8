#!/usr/bin/env python3
"""Generates the starter sound set of the simulated robot.

Writes share/zefoko/sounds/bells/{ding,dong,chime}.wav: short bell-like tones (sums of
decaying partials), 16 kHz mono 16-bit. Deterministic.

Usage: tools/gen_sounds.py [--output DIR]
"""

import argparse
import math
import pathlib
import struct
import wave

RATE = 16000
AMPLITUDE = 0.6 * 32767

# name: (seconds, [(frequency in Hz, relative level, decay per second)])
SOUNDS = {
    "ding": (0.3, [(1318.5, 1.0, 9.0), (2637.0, 0.35, 14.0), (3955.5, 0.12, 20.0)]),
    "dong": (0.45, [(659.3, 1.0, 6.0), (1318.5, 0.3, 10.0), (1977.8, 0.1, 14.0)]),
    "chime": (0.6, [(1046.5, 0.7, 5.0), (1318.5, 0.6, 5.5), (1568.0, 0.5, 6.0),
                    (2093.0, 0.2, 9.0)]),
}
# A short fade-in avoids a click at the start.
ATTACK = 0.004


def samples(seconds, partials):
    total = sum(level for _, level, _ in partials)
    for n in range(int(seconds * RATE)):
        t = n / RATE
        value = sum(level * math.exp(-decay * t) * math.sin(2 * math.pi * freq * t)
                    for freq, level, decay in partials) / total
        value *= min(1.0, t / ATTACK)
        # Fade the tail to zero over the last 20 ms.
        value *= min(1.0, (seconds - t) / 0.02)
        yield int(round(value * AMPLITUDE))


def write(path, seconds, partials):
    frames = b"".join(struct.pack("<h", s) for s in samples(seconds, partials))
    path.parent.mkdir(parents=True, exist_ok=True)
    with wave.open(str(path), "wb") as out:
        out.setnchannels(1)
        out.setsampwidth(2)
        out.setframerate(RATE)
        out.writeframes(frames)


def main():
    root = pathlib.Path(__file__).resolve().parent.parent
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--output", type=pathlib.Path, default=root / "share" / "zefoko" / "sounds")
    args = parser.parse_args()
    for name, (seconds, partials) in SOUNDS.items():
        path = args.output / "bells" / (name + ".wav")
        write(path, seconds, partials)
        print("%s: %.2f s" % (path, seconds))


if __name__ == "__main__":
    main()
