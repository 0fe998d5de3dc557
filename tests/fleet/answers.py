"""The answers to examples/fleet/questions, worked out from the lines of the sinks alone."""

import collections
import datetime
import json
import math
import os

PREFIX = "com.vandra.tamblo."
EARS = ("Headphones", "Wireless Earbuds")


class Record:
    """A line of a sink, with what its device was on that day."""

    def __init__(self, device, line):
        self.device = device
        self.fields = json.loads(line)
        self.payload = self.fields.get("payload", {})
        self.event = self.fields.get("event", "")
        self.time = datetime.datetime.fromtimestamp(self.fields["time"], datetime.timezone.utc)
        self.day = self.time.date()
        self.application = self.payload.get("HostApplicationDisplayID", self.payload.get("ApplicationName", ""))
        self.kind = self.release = self.driver = self.version = ""

    def is_called(self, name):
        return self.event == PREFIX + name


def read(made):
    """All records of a made fleet."""
    records = []
    for device in sorted(os.listdir(made)):
        logs = os.path.join(made, device, "logs")
        if not os.path.isdir(logs):
            continue
        own = []
        for name in os.listdir(logs):
            with open(os.path.join(logs, name), encoding="utf-8") as file:
                own += [Record(device, line) for line in file]
        said = {record.day: record.payload for record in own if record.is_called("HAL_Generic.Start")}
        for record in own:
            facts = said[record.day]
            record.kind, record.release = facts["device_kind"], facts["software_release"]
            record.driver, record.version = facts["audio_driver"], facts["audio_driver_version"]
        records += own
    return records


def grouped(records, key):
    groups = collections.defaultdict(list)
    for record in records:
        groups[key(record)].append(record)
    return sorted(groups.items())


def total(records, key):
    return sum(record.payload.get(key, 0) for record in records)


def weighted_quantile(share, pairs):
    """The value at which that share of the weight is reached."""
    pairs = sorted((value, round(weight - 0.5)) for value, weight in pairs)
    reach, reached = share * sum(weight for _, weight in pairs), 0
    for value, weight in pairs:
        reached += weight
        if reached >= reach:
            return value
    return pairs[-1][0]


def quantile(share, values):
    return sorted(values)[min(int(share * len(values)), len(values) - 1)]


def wilson(hits, count):
    z, share = 1.96, hits / count
    middle = share + z * z / (2 * count)
    spread = z * math.sqrt((share * (1 - share) + z * z / (4 * count)) / count)
    return [share, max(middle - spread, 0) / (1 + z * z / count), (middle + spread) / (1 + z * z / count)]


def byar(count):
    """The 95 % bounds of a count: the cube of what is nearly normal."""
    low, high = (at * (1 - 1 / (9 * at) + z / (3 * math.sqrt(at))) ** 3 if at else 0
                 for at, z in ((count, -1.96), (count + 1, 1.96)))
    return max(low, 0), high


class Answers:
    """`answers.question(6)` has the rows of question 6, in no order."""

    def __init__(self, made):
        self.records = read(made)
        self.newest = max(record.day for record in self.records)
        self.plays = [record for record in self.records if record.is_called("Volume.Summary")]
        self.sessions = [record for record in self.records if record.is_called("Session_Generic.Summary")]
        self.used = [record for record in self.sessions if record.payload["summaryServiceName"] != "audiodeviceusage"]
        self.haptics = [record for record in self.records if record.event == "Korvell_Haptics_EngineOnDuration"]
        self.week = [record for record in self.plays if (self.newest - record.day).days < 7]
        self.by_device = grouped(self.records, lambda record: record.device)

    def question(self, number):
        return [list(row) for row in getattr(self, f"answer{number:02}")()]

    def answer01(self):
        for application, plays in grouped(self.week, lambda play: play.application):
            yield application, total(plays, "play_seconds") / 3600, len(plays)

    def answer02(self):
        key = lambda play: (str(play.day), play.application, play.payload["active_devices"])
        for group, plays in grouped(self.plays, key):
            yield *group, total(plays, "play_seconds") / 3600

    def answer03(self):
        on_ears = [play for play in self.week if play.payload["active_devices"] in EARS]
        for group, plays in grouped(on_ears, lambda play: (play.application, play.kind)):
            yield *group, total(plays, "play_seconds") / 3600

    @staticmethod
    def volumes(plays):
        heard = collections.Counter()
        for play in plays:
            heard[float(play.payload["QVSessionVolumeBucketed"])] += play.payload["play_seconds"]
        return heard

    def answer04(self):
        for kind, plays in grouped(self.plays, lambda play: play.kind):
            heard = self.volumes(plays)
            yield (kind, *(weighted_quantile(share, heard.items()) for share in (0.1, 0.5, 0.9)),
                   sum(volume * time for volume, time in heard.items()) / sum(heard.values()))

    def answer05(self):
        on_ears = [play for play in self.plays if play.payload["active_devices"] == "Headphones"]
        for group, plays in grouped(on_ears, lambda play: (play.kind, play.release)):
            heard = self.volumes(plays)
            all_of_it = sum(heard.values())
            yield (*group, sum(time for volume, time in heard.items() if volume > 0.75) / all_of_it,
                   sum(volume * time for volume, time in heard.items()) / all_of_it)

    def answer06(self):
        for group, sessions in grouped(self.used, lambda session: (session.driver, session.version)):
            hits = sum(session.payload["overload_count"] > 0 for session in sessions)
            yield *group, len(sessions), hits, *wilson(hits, len(sessions))

    def answer07(self):
        by = lambda record: (record.kind, record.release)
        issues = [record for record in self.records
                  if record.event.startswith(PREFIX) and record.event.endswith(".IssueDetector")]
        counts = {group: len(found) for group, found in grouped(issues, by)}
        for group, sessions in grouped(self.sessions, by):
            count, hours = counts.get(group, 0), total(sessions, "total_active_time") / 3600
            yield *group, count, hours, count / hours, *(bound / hours for bound in byar(count))

    def answer08(self):
        shares = collections.defaultdict(dict)
        for (kind, release), sessions in grouped(self.sessions, lambda session: (session.kind, session.release)):
            devices = [(total(own, "overload_count"), total(own, "total_active_time") / 3600)
                       for _, own in grouped(sessions, lambda session: session.device)]
            devices = [(count, hours) for count, hours in devices if hours >= 1]
            if devices:
                rate = sum(count for count, _ in devices) / sum(hours for _, hours in devices)
                shares[kind][release] = (rate, sum(count > hours for count, hours in devices), len(devices))
        for kind, releases in shares.items():
            ordered = sorted(releases, key=lambda release: [int(part) for part in release.split(".")])
            for before, release in zip(ordered, ordered[1:]):
                (rate, hits, count), (old_rate, old_hits, old_count) = releases[release], releases[before]
                both = (hits + old_hits) / (count + old_count)
                deviations = (hits / count - old_hits / old_count) / math.sqrt(
                    max(both * (1 - both), 0.001) * (1 / count + 1 / old_count))
                if deviations > 3:
                    yield (kind, release, before, rate, old_rate, hits / count, old_hits / old_count, both, deviations)

    def answer09(self):
        for device, sessions in grouped(self.sessions, lambda session: session.device):
            parts = [[one for one in sessions if ((self.newest - one.day).days < 5) == is_now] for is_now in (True, False)]
            (now, now_hours), (old, hours) = ((total(part, "overload_count"), total(part, "total_active_time") / 3600)
                                              for part in parts)
            if 0 in (hours, now_hours):
                continue
            rate = (old + 0.5) / (hours + 1)
            expected = rate * now_hours
            if now >= 5 and (now - expected) / math.sqrt(expected) > 5:
                yield (device, sessions[0].kind, rate, now / now_hours, expected, (now - expected) / math.sqrt(expected))

    def answer10(self):
        for device, records in self.by_device:
            days = {record.day for record in records}
            if (self.newest - max(days)).days >= 3 and len(days) >= ((max(days) - min(days)).days + 1) / 2:
                yield device, records[0].kind, str(max(days)), len(days)

    def answer11(self):
        seen = [record for record in self.records if record.is_called("accessoryregistration")]
        lives = collections.defaultdict(list)
        heard = {device: max(record.day for record in records) for device, records in self.by_device}
        oldest = min(record.day for record in self.records)
        for (model, device), found in grouped(seen, lambda record: (record.payload["model"], record.device)):
            first = min(datetime.date.fromisoformat(record.payload["first_seen_day"]) for record in found)
            if first >= oldest:
                lives[model].append((first, max(record.day for record in found), heard[device]))
        for model, found in lives.items():
            for after in (1, 3, 7, 14):
                old = [(last - first).days >= after for first, last, end in found if (end - first).days >= after]
                if old:
                    yield model, after, len(old), sum(old) / len(old)

    def answer12(self):
        for application, sessions in grouped(self.sessions, lambda session: session.application):
            said = total(sessions, "num_messages")
            yield application, said, total(sessions, "num_redundant_messages") / said

    def answer13(self):
        for day, records in grouped(self.records, lambda record: record.day):
            heard = len({record.device for record in records})
            for release, own in grouped(records, lambda record: record.release):
                devices = len({record.device for record in own})
                yield str(day), release, devices, devices / heard

    def answer14(self):
        groups = [record for record in self.records if record.is_called("Kaleen.Summary")]
        for group, plays in grouped(groups, lambda play: (play.application, play.kind)):
            yield *group, total(plays, "play_seconds") / 3600, len({play.device for play in plays})

    def answer15(self):
        calls = [record for record in self.records
                 if record.is_called("Input.Summary") and record.payload["vp_config_operation_mode"] == "telephony"]
        for route, stretches in grouped(calls, lambda record: record.payload["active_devices"]):
            yield (route, total(stretches, "inputrunning_seconds") / 3600, len(stretches),
                   len({stretch.device for stretch in stretches}))

    def answer16(self):
        for kind, sessions in grouped(self.used, lambda session: session.kind):
            hot = sum(session.payload["thermal_state"] in ("Serious", "Critical") for session in sessions)
            yield kind, len(sessions), hot, *wilson(hot, len(sessions))

    def answer17(self):
        applications = {record.application for record in self.haptics}
        for release, uses in grouped(self.haptics, lambda record: record.release):
            engine = total(uses, "EngineOnDuration")
            sound = total((session for session in self.sessions
                           if session.release == release and session.application in applications), "total_active_time")
            yield release, engine, sound, engine / sound

    def answer18(self):
        for group, plays in grouped(self.week, lambda play: (play.time.hour, play.kind)):
            yield *group, total(plays, "play_seconds") / 60 / 7

    def answer19(self):
        active = [session for session in self.sessions if session.payload["total_active_time"] > 0]
        for application, sessions in grouped(active, lambda session: session.application):
            minutes = [session.payload["total_active_time"] / 60 for session in sessions]
            yield application, len(sessions), *(quantile(share, minutes) for share in (0.25, 0.5, 0.75, 0.99))

    def answer20(self):
        return []
