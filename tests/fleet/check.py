#!/usr/bin/env python3
"""Holds examples/fleet against a small made fleet: the answers against those that its sinks' lines give, what the
questions find against what was planted, and what comes of faults.

    check.py DIRECTORY OF tambloctl AND tamblo_fleet
"""

import datetime
import json
import math
import os
import random
import shutil
import signal
import subprocess
import sys
import tempfile

HERE = os.path.dirname(os.path.realpath(__file__))
EXAMPLE = os.path.join(HERE, "..", "..", "examples", "fleet")
sys.path[:0] = [EXAMPLE, os.path.join(HERE, "..", "report")]

from answers import Answers  # noqa: E402
from asking import answer, questions  # noqa: E402
from current import CurrentEngine  # noqa: E402
from fleet import KEPT, Failed, Fleet, export  # noqa: E402

DEVICES, DAYS = 120, 14
CLOSE = 1e-5  # sums of single-precision lengths, in another order


def expect(holds, what):
    if not holds:
        raise SystemExit(f"check: not so: {what}")
    print(f"  {what}", flush=True)


def is_same(left, right):
    if isinstance(left, (int, float)) and isinstance(right, (int, float)):
        return abs(left - right) <= CLOSE * max(1, abs(left))
    return left == right


def in_order(rows):
    return sorted(rows, key=lambda row: [str(cell) for cell in row if not isinstance(cell, float)])


def at_most(count, mean):
    """How probable it is that something happens no more often than that, when it happens so often on average."""
    return sum(math.exp(i * math.log(mean) - mean - math.lgamma(i + 1)) for i in range(count + 1))


class Check:
    def __init__(self, programs, place):
        self.programs = programs
        self.made = os.path.join(place, "made")
        self.place = os.path.join(place, "shards")
        self.environment = {**os.environ, "TAMBLOCTL": os.path.join(programs, "tambloctl")}
        self.fleet = None
        self.answers = None

    def run(self, *command, wanted=0, **more):
        ran = subprocess.run([os.path.join(EXAMPLE, command[0]), *command[1:]], capture_output=True, text=True,
                             env={**self.environment, **more.pop("env", {})}, check=False, **more)
        if ran.returncode != wanted:
            raise SystemExit(f"check: {' '.join(command)} ended with {ran.returncode}: {ran.stderr}{ran.stdout}")
        return ran.stdout

    def make_devices(self, *options):
        program = os.path.join(self.programs, "tamblo_fleet")
        subprocess.run([program, "--days", str(DAYS), *options, self.made], check=True)

    def ask(self, number):
        """Rows by the names of their columns."""
        statement = next(statement for name, _, statement in questions([number]))
        columns, rows, _ = answer(self.fleet, statement)
        return [dict(zip(columns, row)) for row in rows]

    def whole_answer(self, statement):
        _, rows, answered = answer(self.fleet, statement)
        if answered != len(self.fleet.shards):
            raise SystemExit(f"check: only {answered} shards have answered")
        return rows

    def differing(self, rows_of=None):
        """The questions whose answers are not those of the lines."""
        wrong = []
        for name, _, statement in questions([]):
            rows = in_order((rows_of or self.whole_answer)(statement))
            expected = in_order(self.answers.question(int(name[:2])))
            if len(rows) != len(expected) or not all(
                    len(row) == len(other) and all(map(is_same, row, other)) for row, other in zip(rows, expected)):
                wrong.append(name)
        if wrong:
            print(f"  other than the lines say: {', '.join(wrong)}", flush=True)
        return wrong

    def count(self):
        return self.fleet.query("SELECT count(), uniqExact(id) FROM fleet.records; "
                                "SELECT sum(records) FROM fleet.daily_devices")

    def compare(self):
        print("A fleet is made and gathered")
        self.make_devices("--devices", str(DEVICES))
        Fleet.make(self.place, 2).start(1)  # and then it was interrupted
        self.run("run", self.place, "start")
        self.fleet = Fleet(self.place)
        self.run("run", self.place, "gather", self.made)
        self.answers = Answers(self.made)
        lines = len(self.answers.records)
        expect(self.count().split() == [str(lines)] * 3, f"all {lines} lines have arrived, each once")
        expect(self.differing() == [], "the twenty answers are those of the lines")

    def current(self, place):
        print("The same on a current ClickHouse")
        if shutil.which("npm") is None:
            print("  not tried: there is no npm")
            return
        records = os.path.join(place, "records.tsv")
        with open(records, "wb") as file:
            for device, _ in self.answers.by_device:
                export(os.path.join(self.made, device), [], TAMBLOCTL=self.environment["TAMBLOCTL"], stdout=file)
        engine = CurrentEngine(os.path.join(place, "current"))
        try:
            engine.fill(records)
            expect(self.differing(engine.query) == [], f"the twenty answers of {engine.version} are those of the lines")
        finally:
            engine.close()

    def repeat(self):
        print("Records come again")
        before = self.count()
        self.run("run", self.place, "gather", self.made)
        expect(self.count() == before and self.differing() == [], "a load leaves out what has come before")
        day = str(self.answers.newest)
        self.fleet.query(f"INSERT INTO fleet.incoming (sink, id, {KEPT}) SELECT 'analytics-events', id, {KEPT} "
                         f"FROM fleet.sink_analytics_events_local WHERE day = '{day}'", 1)
        wrong = self.differing()
        expect({"14-group-hours", "15-calls", "18-hours-of-the-day", "19-length-of-sessions"}.isdisjoint(wrong),
               "what goes round the load is left out where records are asked")
        expect([row["day"] for row in self.ask(20)] == [day], "and daily figures that it spoils are told of")
        self.run("run", self.place, "rebuild", day)
        expect(self.count() == before and self.differing() == [], "until the day is rebuilt")

    def planted(self):
        print("What was planted")
        with open(os.path.join(self.made, "faults.json"), encoding="utf-8") as file:
            faults = json.load(file)
        with open(os.path.join(self.made, "devices-1.jsonl"), encoding="utf-8") as file:
            devices = [json.loads(line) for line in file]
        for key, number in (("degraded_from", 9), ("silent_from", 10)):
            truth = {device["device"] for device in devices if key in device}
            found = {row["device"]: row["kind"] for row in self.ask(number)}
            others = {device: kind for device, kind in found.items() if device not in truth}
            # One that took the release that raised issues in its last days has left its history, too.
            explained = number == 9 and set(others.values()) <= {faults["bad_kind"]}
            expect(truth and truth <= found.keys() and (not others or explained and len(others) < 3),
                   f"{key}: of {len(truth)} of {len(devices)} devices {len(truth & found.keys())} are found, "
                   f"and {len(others)} by another fault")
        worse = [(row["kind"], row["release"]) for row in self.ask(8)]
        expect(worse == [(faults["bad_kind"], faults["bad_release"])], f"the release that raised issues: {worse}")
        rates = {(row["kind"], row["release"]): row for row in self.ask(7)}
        tails = [at_most(count, bound * row["hours"]) for row in rates.values() for count, bound in
                 ((row["issues"], row["high"]), (row["issues"] - 1, row["low"])) if count >= 0]
        expect(all(0.02 < min(tail, 1 - tail) < 0.03 for tail in tails), "bounds of counts leave 2.5 % out on each side")
        bad = rates[faults["bad_kind"], faults["bad_release"]]
        self.near("its overloads in an hour", bad["rate"], faults["bad_overloads_of_hour"], 0.15)
        usual = [row for (_, release), row in rates.items() if release == "4.1"]
        self.near("overloads in an hour where nothing is wrong",
                  sum(row["issues"] for row in usual) / sum(row["hours"] for row in usual),
                  faults["overloads_of_hour"], 0.2)
        loud = {(row["kind"], row["release"]): row["mean_volume"] for row in self.ask(5)}
        self.near("how much louder a release made headphones", loud["phone", faults["loud_release"]] - loud["phone", "4.2"],
                  faults["louder_by"], 0.25)
        haptics = {row["release"]: row["engine_share"] for row in self.ask(17)}
        self.near("how much longer it ran the haptic engine", haptics[faults["haptics_release"]] / haptics["4.2"],
                  faults["haptics_factor"], 0.02)
        said = self.ask(12)
        expect(said[0]["application"] == faults["chatty_application"] and said[1]["repeated_share"] == 0,
               f"the application that repeats itself: {said[0]['repeated_share']:.2f} of its messages, no other any")
        kept = {row["model"]: row["retained"] for row in self.ask(11) if row["after"] == 7}
        for model, loss in zip(sorted(kept), faults["accessory_loss_of_day"]):
            self.near(f"accessories {model} in use after a week", kept[model], (1 - loss) ** 7, 0.25)

    @staticmethod
    def near(what, found, planted, most):
        error = found / planted - 1
        expect(abs(error) <= most, f"{what}: {found:.3f} for {planted:.3f}, {error:+.0%}")

    def faults(self):
        print("A shard is away while devices ship")
        other = next(name for name, _ in self.answers.by_device if self.fleet.shard_of(name) == 1)
        number = DEVICES + 1
        while self.fleet.shard_of(f"fleet-{number:06}") != 2:
            number += 1
        self.make_devices("--first", str(number), "--devices", "1")
        places, ship = self.shipping(f"fleet-{number:06}")
        before = int(self.count().split()[0])
        with open(self.fleet.pid_file(2), encoding="utf-8") as file:
            os.kill(int(file.read()), signal.SIGKILL)
        self.run(*self.shipping(f"fleet-{number:06}", patience=1)[1], env=places, wanted=1)
        its_places, its_ship = self.shipping(other)
        self.run(*its_ship, env=its_places)
        told = self.run("ask", self.place, "1", "6", wanted=3)
        expect(told.count("PARTIAL: 1 of 2 shards") == 2, "questions say that they are partial")
        page = os.path.join(os.path.dirname(self.place), "fleet.html")
        self.run("report", self.place, "-o", page)
        self.open_page(page, partial=True)
        self.run("run", self.place, "start")
        self.run(*ship, env=places)
        self.run(*ship, env=places)
        with_it = Answers(self.made)
        arrived = int(self.count().split()[0]) - before
        expect(arrived == len(with_it.records) - before, f"all {arrived} records of the device have arrived, each once")
        self.answers = with_it
        expect(self.differing() == [], "and the answers are those of the lines")
        self.kill(number + 1)
        self.tear(number + 2)
        self.run("report", self.place, "-o", page)
        self.open_page(page, partial=False)

    def shipping(self, name, patience=60):
        """How a device ships: its environment, and the command."""
        device = os.path.join(self.made, name)
        places = {"LOGS_DIRECTORY": f"{device}/logs", "CONFIGURATION_DIRECTORY": f"{device}/config",
                  "RUNTIME_DIRECTORY": f"{device}/run"}
        return places, ["run", self.place, "ship", "--batch", "300", "--patience", str(patience), "--cursor",
                        f"{device}/cursor"]

    def kill(self, number):
        """Ends a shipper again and again, wherever it is."""
        self.make_devices("--first", str(number), "--devices", "1")
        places, ship = self.shipping(f"fleet-{number:06}")
        command = [os.path.join(EXAMPLE, ship[0]), *ship[1:]]
        random.seed(1)
        for _ in range(8):
            shipper = subprocess.Popen(command, env={**self.environment, **places}, stderr=subprocess.DEVNULL)
            try:
                shipper.wait(random.uniform(0.3, 1.5))
            except subprocess.TimeoutExpired:
                shipper.kill()
                shipper.wait()
        self.run(*ship, env=places)
        self.answers = Answers(self.made)
        expect(self.count().split() == [str(len(self.answers.records))] * 3 and self.differing() == [],
               "a shipper that is killed again and again loses nothing and doubles nothing")

    def tear(self, number):
        """Ends a load between the tables that it writes."""
        name = f"fleet-{number:06}"
        self.make_devices("--first", str(number), "--devices", "1", "--days", "3")
        places, ship = self.shipping(name)
        shard = self.fleet.shard_of(name)
        self.fleet.query("CREATE MATERIALIZED VIEW fleet.to_so ENGINE = Log AS "
                         "SELECT throwIf(id != '') AS torn FROM fleet.incoming", shard)
        self.run(*self.shipping(name, patience=0)[1], env=places, wanted=1)
        self.fleet.query("DROP TABLE fleet.to_so", shard)
        self.run(*ship, env=places)
        self.answers = Answers(self.made)
        days = [row["day"] for row in self.ask(20)]
        expect(days != [], "a load that ends between its tables is told of")
        for day in days:
            self.run("run", self.place, "rebuild", day)
        expect(self.count().split() == [str(len(self.answers.records))] * 3 and self.differing() == [],
               "and has lost nothing when its days are rebuilt")

    def odd_records(self):
        print("Records that are odd")
        before, summed = int(self.count().split()[0]), self.count().split()[2]
        lines = "".join("\t".join(cells) + "\n" for cells in (
            # Times that cannot be, a text with every escape, what is no JSON or has other types, and no device.
            ["x/1", "odd", "9", "analytics-events", str(2**64 - 1), "com.vandra.tamblo.Volume.Summary", "", "", "", "{}"],
            ["x/2", "odd", "9", "power-events", "0", "Korvell_Haptics_EngineOnDuration", "", "\\t\\n\\\\'", "", "\\0["],
            ["x/3", "odd", "9", "analytics-events", "1", "com.vandra.tamblo.accessoryregistration", "", "", "",
             '{"model":7,"first_seen_day":"never"}'],
            ["x/4", "", "", "memory-log", "1", "", "", "", "", ""]))
        for _ in range(2):
            self.run("run", self.place, "load", "1", input=lines)
        arrived = self.fleet.query("SELECT count() FROM fleet.records WHERE day = toDate(0)")
        expect(int(arrived) == 4 and self.count().split() == [str(before + 4), str(before + 4), summed],
               "they are kept once, under the day of what cannot be, and counted nowhere")
        self.run("run", self.place, "load", "1", input="")
        self.run("run", self.place, "load", "1", input="one\ttwo\n", wanted=1)
        self.run("run", self.place, "load", "0", input=lines, wanted=1)
        left = self.fleet.query("SELECT name FROM system.tables WHERE database = 'fleet' AND name LIKE 'arrivals%'", 1)
        expect(left == "" and int(self.count().split()[0]) == before + 4,
               "what are no columns, or for no shard, is refused and leaves nothing")

    def facts(self):
        print("What devices say of themselves")
        newest = self.answers.newest
        accessories, releases = self.ask(11), [row["release"] for row in self.ask(17)]

        def line(name, device, days_ago, event, **payload):
            time = (newest - datetime.date(1970, 1, 1)).days - days_ago
            payload = json.dumps({"payload": payload}, separators=(",", ":"))
            return "\t".join((name, device, "9", "analytics-events", str(time * 86400 * 10**9 + len(name)),
                              event if event.startswith("Korvell") else f"com.vandra.tamblo.{event}", "", "odd.app", "",
                              payload.replace("\\", "\\\\"))) + "\n"

        start = "HAL_Generic.Start"
        lines = (line("a", "fact", 3, start, device_kind="one", software_release="4.9")
                 + line("ab", "fact", 1, start, device_kind="two", software_release="4.10")
                 + line("abc", "fact", 1, start, something="else")
                 + "".join(line(f"d{days}", "fact", days, "Session_Generic.Summary") for days in (0, 1, 2, 3, 4))
                 + line("e", "", 1, start, device_kind="three") + line("ef", "", 1, "Session_Generic.Summary")
                 + line("g", "fact", 0, "accessoryregistration", model="old", first_seen_day="2001-01-01")
                 + line("h", "fact", 0, "Korvell_Haptics_EngineOnDuration", EngineOnDuration=1))
        self.run("run", self.place, "load", "1", input=lines + lines)
        self.run("run", self.place, "load", "2", input=line("i", "facts", 0, start, device_kind="two", software_release="4.10")
                 + line("j", "facts", 0, "Session_Generic.Summary", total_active_time=5))
        found = self.fleet.query("SELECT day, kind, sum(records) FROM fleet.daily_devices WHERE device = 'fact' "
                                 "GROUP BY day, kind ORDER BY day")
        expect([row.split("\t")[1:] for row in found.splitlines()] ==
               [["one", "1"], ["one", "2"], ["one", "1"], ["two", "3"], ["two", "3"]],
               "each record counts once, as what its device had said last")
        expect(self.fleet.query("SELECT DISTINCT kind FROM fleet.records WHERE device = ''") == "\n",
               "devices without a name are not taken for one another")
        expect(self.ask(11) == accessories, "accessories from before the oldest day are left out")
        sound = {row["release"]: row["sound_seconds"] for row in self.ask(17)
                 if row["release"] not in releases}
        expect(sound == {"4.10": 5}, "an application counts on all shards if it is known to one")
        self.fleet.query("INSERT INTO fleet.daily_devices_local SELECT toDate('%s'), concat('odd', toString(number)), 'odd', "
                         "number %% 2 ? '4.9' : '4.10', 1, 1, number %% 2 ? 0 : 9, 7200 FROM numbers(40)" % newest, 1)
        expect([row["release"] for row in self.ask(8) if row["kind"] == "odd"] == ["4.10"], "4.10 comes after 4.9")

    def redacted(self):
        print("What must not leave a device")
        places, ship = self.shipping(self.answers.by_device[0][0])
        export_in = {**self.environment, **places, "TAMBLOCTL": os.path.join(self.place, "spy")}
        with open(export_in["TAMBLOCTL"], "w", encoding="utf-8") as file:
            file.write(f"#!/bin/sh\nexec {self.environment['TAMBLOCTL']} \"$@\" | tee -a {self.place}/left\n")
        os.chmod(export_in["TAMBLOCTL"], 0o755)
        self.run(*ship[:-1], os.path.join(self.place, "cursor"), "--drop", "device_kind", env=export_in)
        with open(os.path.join(self.place, "left"), encoding="utf-8") as file:
            left = file.read()
        expect("audio_driver" in left and "device_kind" not in left, "does not, in what a device says of itself either")
        os.remove(os.path.join(self.place, "left"))
        self.run("run", self.place, "ship", "-e", "com.vandra.tamblo.Volume.Summary", env=export_in)
        with open(os.path.join(self.place, "left"), encoding="utf-8") as file:
            left = file.read()
        expect("Volume.Summary" in left and "HAL_Generic.Start" not in left, "nor do events that nobody asked for")

    @staticmethod
    def open_page(path, partial):
        if shutil.which("chromium") is None:
            print("  the page was not opened: there is no chromium")
            return
        from browser import Browser  # pylint: disable=import-outside-toplevel
        with Browser() as browser:
            browser.open(path)
            figures = browser.run("document.querySelectorAll('figure').length")
            noted = browser.run("!document.getElementById('partial').hidden")
            expect(figures == 20 and noted == partial and browser.complaints() == [],
                   f"the page shows them{', and that they are partial' if partial else ''}")


def main(programs):
    place = tempfile.mkdtemp(prefix="tamblo-fleet-")
    check = Check(os.path.realpath(programs), place)
    try:
        check.compare()
        check.current(place)
        check.repeat()
        check.planted()
        check.faults()
        check.odd_records()
        check.redacted()
        check.facts()
    except (SystemExit, Failed):
        print(f"see {place}", file=sys.stderr)
        raise
    finally:
        if os.path.exists(os.path.join(check.place, "shards.json")):
            check.run("run", check.place, "stop")
    shutil.rmtree(place)


if __name__ == "__main__":
    main(sys.argv[1])
