"""A current ClickHouse, in the process of a program of its own, as the npm package chdb has it: one server without a
cluster, on which the statements of examples/fleet are the same but for what is distributed."""

import json
import os
import re
import subprocess

from fleet import COLUMNS, SINKS, Failed, statements

HERE = os.path.dirname(os.path.realpath(__file__))
PACKAGE = "chdb@3.4.0"


class CurrentEngine:
    def __init__(self, place):
        self.place = place
        subprocess.run(["npm", "install", "--silent", "--no-audit", "--no-fund", "--prefix", place, PACKAGE], check=True,
                       stdout=subprocess.DEVNULL)
        self.process = subprocess.Popen(["node", os.path.join(HERE, "current.js"), place, os.path.join(place, "data")],
                                        stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        self.version = self.query("SELECT version()")[0][0]

    def close(self):
        self.process.stdin.close()
        self.process.wait(30)

    def query(self, text):
        self.process.stdin.write(json.dumps(text) + "\n")
        self.process.stdin.flush()
        answer = json.loads(self.process.stdout.readline())
        if "problem" in answer:
            raise Failed(f"{answer['problem']} in {text}")
        return json.loads(answer["found"])["data"] if answer["found"].strip() else []

    def carry_out(self, text):
        text = re.sub(r"Distributed\(fleet, fleet, (\w+_local)(, cityHash64\(device\))?\)", r"Merge(fleet, '^\1$')", text)
        for statement in filter(None, map(str.strip, text.split(";"))):
            self.query(statement)

    def fill(self, records):
        """Makes the tables, and loads a file of columns into them."""
        self.carry_out(statements("schema", "records.sql"))
        for sink in SINKS:
            self.carry_out(statements("schema", "sink.sql", SINK_TABLE=sink.replace("-", "_"), SINK_NAME=sink))
        for part in ("summaries.sql", "days.sql"):
            self.carry_out(statements("schema", part))
        self.carry_out(statements("schema", "arrivals.sql", ARRIVALS="arrivals"))
        types = ", ".join(f"{name} {'UInt64' if name == 'time' else 'String'}" for name in COLUMNS.split(", "))
        self.query(f"INSERT INTO fleet.arrivals ({COLUMNS}) SELECT * FROM file('{records}', 'TabSeparated', '{types}')")
        self.carry_out(statements("load.sql", ARRIVALS="arrivals"))
