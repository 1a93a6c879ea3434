#!/usr/bin/env python3
"""Writes the inputs of the benchmark hosts, the same bytes on every machine.

usage: make-inputs.py FOLDER MEGABYTES

orders.xml and orders.jsonl hold the same kind of orders, words.txt lines of words of which a few
are frequent and most are rare. Each file has about MEGABYTES million bytes.
"""

import json
import pathlib
import random
import sys

SYLLABLES = [first + second for first in "bdfgklmnprst" for second in "aeiou"]


def word(number):
    """The word of that number: 2 syllables for the first 3,600, 3 for the next 216,000."""
    syllables = []
    while number > 0 or len(syllables) < 2:
        number, rest = divmod(number, len(SYLLABLES))
        syllables.append(SYLLABLES[rest])
    return "".join(syllables)


def order(chance, number):
    items = [{"sku": f"{chance.randrange(20000):05}", "name": word(chance.randrange(3600)),
              "count": chance.randrange(1, 10), "price": chance.randrange(100, 100000) / 100}
             for _ in range(chance.randrange(1, 8))]
    return {"id": number, "customer": word(chance.randrange(5000)),
            "note": " ".join(word(chance.randrange(3600)) for _ in range(chance.randrange(12))),
            "items": items}


def as_xml(made):
    items = "".join('    <item sku="{sku}"><name>{name}</name><count>{count}</count>'
                    "<price>{price}</price></item>\n".format(**item) for item in made["items"])
    return ('  <order id="{id}" customer="{customer}">\n    <note>{note}</note>\n'
            .format(**made) + items + "  </order>\n")


def as_words(chance):
    # Zipf's law, roughly: the logarithm of a word's rank is even.
    return " ".join(word(int(200000 ** chance.random())) for _ in range(12)) + "\n"


def write(path, size, lines, head="", tail=""):
    with path.open("w", encoding="ascii", newline="\n") as file:
        written = file.write(head)
        while written < size:
            written += file.write(next(lines))
        file.write(tail)


def main():
    folder, size = pathlib.Path(sys.argv[1]), float(sys.argv[2]) * 1000000
    folder.mkdir(parents=True, exist_ok=True)
    chance = random.Random(17)
    numbers = iter(range(1, sys.maxsize))
    orders = (order(chance, number) for number in numbers)
    write(folder / "orders.xml", size, (as_xml(made) for made in orders), "<orders>\n",
          "</orders>\n")
    write(folder / "orders.jsonl", size, (json.dumps(made) + "\n" for made in orders))
    write(folder / "words.txt", size, (as_words(chance) for _ in numbers))


main()
