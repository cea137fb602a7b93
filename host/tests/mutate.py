#!/usr/bin/env python3
"""Writes a reproducible mutant of a model file.

usage: mutate.py SEED INPUT OUTPUT
       mutate.py --cut LENGTH INPUT OUTPUT

The seed picks one to four edits: bytes overwritten with random or boundary
values (0, 0xff, 0x7f, 0x80), a range duplicated or removed, or the file cut
short. The same seed and input always give the same bytes.
"""
import random
import sys


def mutate(data: bytes, seed: int) -> bytes:
    rng = random.Random(seed)
    out = bytearray(data)
    for _ in range(rng.randint(1, 4)):
        if not out:
            break
        kind = rng.random()
        at = rng.randrange(len(out))
        if kind < 0.45:
            for i in range(rng.randint(1, 8)):
                if at + i < len(out):
                    out[at + i] = rng.choice((0, 0xFF, 0x7F, 0x80, rng.randrange(256)))
        elif kind < 0.6:
            span = out[at:at + rng.randint(1, 64)]
            out[at:at] = span * rng.randint(1, 16)
        elif kind < 0.8:
            del out[at:at + rng.randint(1, 256)]
        else:
            del out[max(at, 1):]
    return bytes(out)


def main() -> int:
    args = sys.argv[1:]
    if len(args) == 4 and args[0] == "--cut":
        with open(args[2], "rb") as f:
            data = f.read()[: int(args[1])]
    elif len(args) == 3:
        with open(args[1], "rb") as f:
            data = mutate(f.read(), int(args[0]))
    else:
        print(__doc__, file=sys.stderr)
        return 2
    with open(args[-1], "wb") as f:
        f.write(data)
    return 0


if __name__ == "__main__":
    sys.exit(main())
