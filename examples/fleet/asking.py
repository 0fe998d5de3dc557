"""The questions of questions/, and how they are asked."""

import json
import os
import re

from fleet import HERE, Failed

# So that the answer and how many shards gave one are of the same moment, as far as that goes.
SHARDS = "SELECT uniqExact(shard) AS answered FROM fleet.shards FORMAT JSONCompact;\n"
SETTINGS = ("--skip_unavailable_shards=1", "--output_format_json_quote_64bit_integers=0")
REFUSED = "Connection refused"  # by a shard that is away


def questions(numbers):
    """Name, what it tells, and the statement of each."""
    names = sorted(name[:-4] for name in os.listdir(os.path.join(HERE, "questions")) if name.endswith(".sql"))
    for name in names:
        if not numbers or int(name[:2]) in numbers:
            with open(os.path.join(HERE, "questions", name + ".sql"), encoding="utf-8") as file:
                text = file.read()
            tells = " ".join(re.findall(r"^-- ?(.*)$", text, flags=re.MULTILINE))
            yield name, tells, re.sub(r"^--.*\n", "", text, flags=re.MULTILINE).strip().rstrip(";")


def answer(fleet, statement, settings=()):
    """Columns, rows, and how many shards they are of. Any shard that is there can be asked."""
    for number in fleet.numbers():
        try:
            text = fleet.query(f"{SHARDS}{statement} FORMAT JSONCompact;\n{SHARDS}", number,
                               settings=(*SETTINGS, *settings))
        except Failed as problem:
            if REFUSED not in str(problem) or number == len(fleet.shards):
                raise
            continue
        before, found, after = read_documents(text)
        answered = min(int(shards["data"][0][0]) for shards in (before, after))
        return [column["name"] for column in found["meta"]], found["data"], answered
    raise Failed("there is no shard")


def read_documents(text):
    decoder, place, documents = json.JSONDecoder(), 0, []
    while place < len(text.rstrip()):
        document, place = decoder.raw_decode(text, place)
        documents.append(document)
        while place < len(text) and text[place].isspace():
            place += 1
    return documents
