"""The servers of a fleet of examples/fleet, as the programs beside this one use them."""

import contextlib
import json
import os
import re
import shutil
import socket
import subprocess
import tempfile
import time
import zlib

HERE = os.path.dirname(os.path.realpath(__file__))
SINKS = ["analytics-events", "power-events", "diagnostics-metrics", "call-quality", "bug-captures",
         "bug-report-drafts", "stack-captures", "memory-log"]
COLUMNS = "id, device, version, sink, time, event, session, application, service, fields"
# Of the tables of sinks, but for the identifier.
KEPT = ("device, version, day, time, event, session, application, service, fields, "
        "kind, release, driver, driver_version")
SECONDS_TO_START = 60
PART_BYTES = 300 << 20

CONFIG = """<yandex>
<logger><level>warning</level><console>1</console></logger>
<listen_host>{host}</listen_host><tcp_port>{port}</tcp_port><interserver_http_host>{host}</interserver_http_host>
<path>{place}/</path><tmp_path>{place}/tmp/</tmp_path><user_files_path>{place}/user_files/</user_files_path>
<users_config>{place}/users.xml</users_config><default_profile>default</default_profile>
<default_database>default</default_database><mark_cache_size>268435456</mark_cache_size>
<uncompressed_cache_size>0</uncompressed_cache_size>
<query_log><database>system</database><table>query_log</table></query_log>
<remote_servers><fleet>{shards}</fleet></remote_servers>
</yandex>
"""
SHARD = "<shard><replica><host>{host}</host><port>{port}</port></replica></shard>"
USERS = """<yandex><profiles><default><max_memory_usage>6000000000</max_memory_usage>
<distributed_product_mode>local</distributed_product_mode>
<connect_timeout_with_failover_ms>500</connect_timeout_with_failover_ms></default></profiles><quotas><default/></quotas>
<users><default><password/><networks><ip>127.0.0.0/8</ip></networks><profile>default</profile><quota>default</quota>
</default></users></yandex>
"""


class Failed(Exception):
    """A server could not be asked, or refused; or a device's records could not be had."""


def server_program():
    return shutil.which("clickhouse-server", path=os.environ.get("PATH", "") + ":/usr/sbin")


def free_port(host):
    with contextlib.closing(socket.socket()) as probe:
        probe.bind((host, 0))
        return probe.getsockname()[1]


def statements(*parts, **words):
    """The statements of a file, with these words in place of those in it."""
    with open(os.path.join(HERE, *parts), encoding="utf-8") as file:
        text = re.sub(r"^\s*--.*\n", "", file.read(), flags=re.MULTILINE)
    for word, replacement in words.items():
        text = text.replace(word, replacement)
    return text.strip()


def export(device, options, stdout, **environment):
    """Writes what a made device has as columns. Failed, with the reason, where that cannot be read."""
    places = {"LOGS_DIRECTORY": "logs", "CONFIGURATION_DIRECTORY": "config", "RUNTIME_DIRECTORY": "run"}
    environment = {**os.environ, **environment, **{name: os.path.join(device, part) for name, part in places.items()}}
    ran = subprocess.run([environment.get("TAMBLOCTL", "tambloctl"), "export", "--format", "columns", *options],
                         env=environment, check=False, stdout=stdout, stderr=subprocess.PIPE)
    if ran.returncode != 0:
        raise Failed(f"{device} cannot be exported: {ran.stderr.decode(errors='replace').strip()}")
    return ran


class Fleet:
    """The shards that were made at a place, whose numbers begin with 1: shard I listens at shards[I - 1]."""

    def __init__(self, place):
        self.place = os.path.realpath(place)
        try:
            with open(os.path.join(self.place, "shards.json"), encoding="utf-8") as file:
                self.shards = json.load(file)
        except FileNotFoundError:
            raise Failed(f"there is no fleet at {self.place}: \"run {place} start\" makes one") from None

    @classmethod
    def make(cls, place, count):
        """Configures the servers; they are neither started nor have tables."""
        place = os.path.realpath(place)
        shards = []
        for number in range(1, count + 1):
            host = f"127.0.0.{number}"
            shards.append({"host": host, "port": free_port(host)})
        for number, shard in enumerate(shards, 1):
            own = os.path.join(place, f"shard{number}")
            os.makedirs(own)
            with open(os.path.join(own, "config.xml"), "w", encoding="utf-8") as file:
                file.write(CONFIG.format(place=own, shards="".join(SHARD.format(**each) for each in shards), **shard))
            with open(os.path.join(own, "users.xml"), "w", encoding="utf-8") as file:
                file.write(USERS)
        with open(os.path.join(place, "shards.json"), "w", encoding="utf-8") as file:
            json.dump(shards, file)
        return cls(place)

    def numbers(self):
        return range(1, len(self.shards) + 1)

    def shard_named(self, text):
        """The number of a shard that somebody typed."""
        if not text.isdecimal() or int(text) not in self.numbers():
            raise Failed(f'there is no shard "{text}": they are 1 to {len(self.shards)}')
        return int(text)

    def shard_of(self, device):
        """Where all of a device's records are, so that what is asked of each device is asked in one place."""
        return zlib.crc32(device.encode()) % len(self.shards) + 1

    def pid_file(self, number):
        return os.path.join(self.place, f"shard{number}", "pid")

    def is_running(self, number):
        """Whether the process whose number was written down is still that server, and not another's after a crash."""
        try:
            with open(self.pid_file(number), encoding="utf-8") as file:
                pid = int(file.read())
            with open(f"/proc/{pid}/cmdline", "rb") as file:
                return f"--config-file={self.place}/shard{number}/config.xml".encode() in file.read().split(b"\0")
        except (FileNotFoundError, ProcessLookupError, ValueError):
            return False

    def start(self, number):
        own = os.path.join(self.place, f"shard{number}")
        with open(os.path.join(own, "log"), "a", encoding="utf-8") as log:
            server = subprocess.Popen([server_program(), f"--config-file={own}/config.xml"], cwd=own, stdout=log,
                                      stderr=log, stdin=subprocess.DEVNULL, start_new_session=True)
        with open(self.pid_file(number), "w", encoding="utf-8") as file:
            file.write(str(server.pid))
        end = time.monotonic() + SECONDS_TO_START
        while True:
            if server.poll() is not None or time.monotonic() > end:
                raise Failed(f"shard {number} does not start; see {own}/log")
            with contextlib.suppress(Failed):
                self.query("SELECT 1", number)
                return server
            time.sleep(0.1)

    def stop(self, number):
        if not self.is_running(number):
            return
        with open(self.pid_file(number), encoding="utf-8") as file:
            pid = int(file.read())
        os.kill(pid, 15)
        for _ in range(300):
            with contextlib.suppress(ChildProcessError):
                os.waitpid(pid, os.WNOHANG)
            if not self.is_running(number):
                return
            time.sleep(0.1)
        raise Failed(f"shard {number} does not end")

    def has_tables(self, number):
        return self.query("EXISTS TABLE fleet.shards_local", number).strip() == "1"

    def make_tables(self, number):
        self.query(statements("schema", "records.sql"), number)
        for sink in SINKS:
            self.query(statements("schema", "sink.sql", SINK_TABLE=sink.replace("-", "_"), SINK_NAME=sink), number)
        self.query(statements("schema", "summaries.sql"), number)
        self.query(statements("schema", "days.sql"), number)
        self.query(f"INSERT INTO fleet.shards_local VALUES ({number})", number)

    def client(self, number, *options):
        shard = self.shards[number - 1]
        return ["clickhouse-client", "--host", shard["host"], "--port", str(shard["port"]), *options]

    def query(self, text, number=1, given=None, settings=()):
        """Carries statements out on a shard; what it answers. `given` is a file that a statement reads."""
        command = self.client(number, "--multiquery", *settings, "--query", text)
        ran = subprocess.run(command, stdin=given or subprocess.DEVNULL, capture_output=True, text=True, check=False)
        if ran.returncode != 0:
            raise Failed(ran.stderr.strip() or "clickhouse-client failed")
        return ran.stdout

    def load(self, records, number, source):
        """Takes records, a file of columns, to a shard; those that it has already are left out. Many are taken in parts,
        each of whole devices, so that a part's memory is bounded and has what its devices said of themselves."""
        with tempfile.TemporaryFile() as part:
            last = None
            for line in records:
                device = line.split(b"\t", 2)[1:2]
                if part.tell() > PART_BYTES and device != last:
                    self.load_part(part, number, source)
                    part.truncate(0)
                last = device
                part.write(line)
            if part.tell() > 0:
                self.load_part(part, number, source)

    def load_part(self, records, number, source):
        """A shard takes one load of a source at a time: what is left of one whose shipper was killed ends before the next
        can look what there is."""
        records.seek(0)
        arrivals = f"arrivals_{os.getpid()}_{time.monotonic_ns()}"
        self.query(statements("schema", "arrivals.sql", ARRIVALS=arrivals), number)
        try:
            self.query(f"INSERT INTO fleet.{arrivals} ({COLUMNS}) FORMAT TabSeparated", number, records)
            self.query(statements("load.sql", ARRIVALS=arrivals), number, settings=(f"--query_id=load {source}",))
        finally:
            with contextlib.suppress(Failed):
                self.query(f"DROP TABLE IF EXISTS fleet.{arrivals}", number)
        records.seek(0)

    def rebuild(self, day, number):
        """Makes all that stands of a day from its records: after a server ended in the middle of a load. The records stay
        where they are, whatever happens meanwhile: their second copies go at the end."""
        tables = self.query("SELECT name FROM system.tables WHERE database = 'fleet' AND engine LIKE '%MergeTree'",
                            number).split()
        of_sinks = [f"sink_{sink.replace('-', '_')}_local" for sink in SINKS]
        for table in set(tables).difference(of_sinks):
            self.query(f"ALTER TABLE fleet.{table} DROP PARTITION '{day}'", number)
        self.query(f"""INSERT INTO fleet.incoming (id, sink, {KEPT})
            SELECT id, replaceAll(extract(_table, '^sink_(.*)_local$'), '_', '-') AS sink, {KEPT}
            FROM fleet.records_local WHERE day = '{day}' LIMIT 1 BY id""", number)
        for table in of_sinks:
            self.query(f"OPTIMIZE TABLE fleet.{table} PARTITION '{day}' FINAL", number)
