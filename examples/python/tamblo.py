"""A client of tamblod in Python, with nothing beyond the standard library.

    import tamblo

    with tamblo.Client() as client, client.session(7, "longformaudio") as session:
        session.send("Session_Playback", "Start", {"active_devices": "Speaker", "QVSessionVolume": 0.5})

A client is one connection, used by one thread. Every request waits for its answer: when `send` returns, the
message has been recorded. What the service refuses is a `ServiceError`; a service that is not there, or does not
answer in time, is an `OSError` (`FileNotFoundError`, `ConnectionRefusedError`, `TimeoutError`, ...). What cannot be
sent is a `ValueError`, `TypeError` or `OverflowError`, and nothing has been.

What goes into a payload: str, int from -2**63 to 2**64-1, float, bool, bytes, datetime (without a time zone: local
time), lists and tuples, and dicts with str for keys; `Single` for a float in single precision. None has no place in it.
"""

import datetime
import os
import socket
import struct
import time

SUBSYSTEMS = {"MIDI": 0x04000000, "Session": 0x08000000, "DSP": 0x10000000, "HAL": 0x20000000,
              "Routing": 0x40000000, "Toolbox": 0x80000000}
KINDS = ["Undefined", "Generic", "Record", "Input", "Playback", "Output", "PlaybackAndRecord", "IO", "Setup",
         "ClientRequest", "RouteChange", "Error", "Chanlog", "Performance", "Volume", "Kaleen", "HearingHealth",
         "Wirrels"]
TYPES = ["Generic", "Start", "Stop", "Activate", "Deactivate", "Setup", "Error", "IssueDetector", "Joulery",
         "AudioUnitUsage", "MIDIDriver", "Summary", "HeadphoneAudioExposure", "AudioExposure",
         "Listeningenhancement", "Pulsedeck", "Simple", "Histogram", "State", "MemoryLog"]
SERVICE_TYPES = ["generic", "velka", "telephony", "haptics", "alarms", "standalone", "soundautoconfig",
                 "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test", "apiusage",
                 "systemsounds"]

SOCKET_NAME = "com.vandra.tamblo.reporting"


class ServiceError(Exception):
    """What the service answered instead of a result."""

    def __init__(self, domain, code, message):
        super().__init__(f"{message or 'refused'} ({domain} {code})")
        self.domain, self.code, self.message = domain, code, message


class Single(float):
    """A float that is sent, and stays, in single precision."""


# CBOR (RFC 8949), as far as the protocol has it.

def _head(major, number):
    if number < 24:
        return bytes([major << 5 | number])
    for size, letter, detail in ((8, "B", 24), (16, "H", 25), (32, "I", 26), (64, "Q", 27)):
        if number < 1 << size:
            return struct.pack(f">B{letter}", major << 5 | detail, number)
    raise OverflowError(f"{number} takes more than 64 bits")


def encode(value):
    """The bytes of a value."""
    if value is None:
        return b"\xf6"
    if isinstance(value, bool):
        return b"\xf5" if value else b"\xf4"
    if isinstance(value, int):
        if value < -2**63:
            raise OverflowError(f"{value} is below -2**63")
        return _head(0, value) if value >= 0 else _head(1, -1 - value)
    if isinstance(value, Single):
        return struct.pack(">Bf", 0xFA, value)
    if isinstance(value, float):
        return struct.pack(">Bd", 0xFB, value)
    if isinstance(value, str):
        text = value.encode()
        return _head(3, len(text)) + text
    if isinstance(value, (bytes, bytearray, memoryview)):
        return _head(2, len(bytes(value))) + bytes(value)
    if isinstance(value, datetime.datetime):
        return _head(6, 1) + encode(value.timestamp())
    if isinstance(value, (list, tuple)):
        return _head(4, len(value)) + b"".join(map(encode, value))
    if isinstance(value, dict):
        if not all(isinstance(key, str) for key in value):
            raise TypeError("the keys of a payload are texts")
        return _head(5, len(value)) + b"".join(encode(key) + encode(value[key]) for key in value)
    raise TypeError(f"no payload holds a {type(value).__name__}")


def decode(data):
    """The one value that these bytes are."""
    value, end = _decode_at(data, 0)
    if end != len(data):
        raise ValueError("more than one value")
    return value


def _decode_at(data, at):
    major, detail = data[at] >> 5, data[at] & 31
    at += 1
    if major == 7:
        if detail in (20, 21, 22):
            return {20: False, 21: True, 22: None}[detail], at
        form, size = {25: (">e", 2), 26: (">f", 4), 27: (">d", 8)}[detail]
        return struct.unpack_from(form, data, at)[0], at + size
    number = detail
    if detail >= 24:
        form, size = {24: (">B", 1), 25: (">H", 2), 26: (">I", 4), 27: (">Q", 8)}[detail]
        number, at = struct.unpack_from(form, data, at)[0], at + size
    if major in (0, 1):
        return (number if major == 0 else -1 - number), at
    if major in (2, 3):
        content = bytes(data[at:at + number])
        return (content if major == 2 else content.decode()), at + number
    if major == 6:
        seconds, at = _decode_at(data, at)
        return datetime.datetime.fromtimestamp(seconds, datetime.timezone.utc), at
    items = []
    for _ in range(number * (2 if major == 5 else 1)):
        item, at = _decode_at(data, at)
        items.append(item)
    return (items if major == 4 else dict(zip(items[::2], items[1::2]))), at


# The words of the protocol, by name or by number.

def _number(names, word):
    if isinstance(word, int):
        return word
    if word not in names:
        raise ValueError(f"{word!r} is none of {', '.join(names)}")
    return names.index(word)


def category(word):
    """The number of a category: "Volume", "Session_Playback", or a number."""
    if isinstance(word, int):
        return word
    subsystem, _, kind = word.rpartition("_")
    if subsystem and subsystem not in SUBSYSTEMS:
        raise ValueError(f"{subsystem!r} is none of {', '.join(SUBSYSTEMS)}")
    return SUBSYSTEMS.get(subsystem, 0) | _number(KINDS, kind)


def socket_path():
    """The service's usual place, for this process."""
    runtime = os.environ.get("RUNTIME_DIRECTORY")
    if not runtime and os.getuid() == 0:
        runtime = "/run/tamblo"
    elif not runtime:
        runtime = os.path.join(os.environ.get("XDG_RUNTIME_DIR", ""), "tamblo")
    return os.path.join(runtime, SOCKET_NAME)


class Client:
    """A connection to the service; each answer is waited for as long as `timeout` says, in seconds."""

    def __init__(self, path=None, timeout=5.0):
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._socket.settimeout(timeout)
        self._timeout = timeout
        self._last_id = 0
        self._received = bytearray()
        try:
            self._socket.connect(path or socket_path())
        except OSError:
            self._socket.close()
            raise

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def close(self):
        self._socket.close()

    def session(self, reporter, service_type="generic", configuration=None):
        """A session that starts with the `with` statement and stops at its end."""
        return Session(self, reporter, service_type, configuration)

    def send(self, kind, event, payload, reporters=None):
        """A message to these reporters, or to every started session there is."""
        self.call("sendMessage", payload, category(kind), _number(TYPES, event), reporters)

    def reporters(self):
        """The reporter IDs of all clients."""
        return self.call("getAllReporters")

    def call(self, method, *parameters):
        """The result of a request by its name."""
        self._last_id += 1
        try:
            self._write([0, self._last_id, method, list(parameters)])
        except (BrokenPipeError, ConnectionResetError):
            # The service says why before it ends the connection: of a frame that is too long, say.
            pass
        deadline = None if self._timeout is None else time.monotonic() + self._timeout
        while True:
            answered, error, result = self._read(deadline)
            # An error under the number 0 is about a frame whose own number is not known: this one's.
            if answered in (0, self._last_id) and error is not None:
                raise ServiceError(error["domain"], error["code"], error.get("message", ""))
            # Any other answer is one that was given up after its time.
            if answered == self._last_id:
                return result

    def post(self, method, *parameters):
        """A request without an answer."""
        self._write([2, method, list(parameters)])

    def _write(self, item):
        frame = encode(item)
        self._socket.settimeout(self._timeout)
        try:
            self._socket.sendall(struct.pack("<I", len(frame)) + frame)
        except socket.timeout:
            self.close()  # some of the frame may have been sent, and the rest never will be
            raise

    def _read(self, deadline):
        """The next answer: its number, error and result. What has come of one stays for the next try."""
        self._receive(4, deadline)
        end = 4 + struct.unpack_from("<I", self._received)[0]
        self._receive(end, deadline)
        frame = bytes(self._received[4:end])
        del self._received[:end]
        try:
            _, answered, error, result = decode(frame)
            if error is not None:
                error["domain"], error["code"]
        except (ValueError, TypeError, LookupError, struct.error, RecursionError, OverflowError) as wrong:
            self.close()
            raise ConnectionError("the service's answer cannot be read") from wrong
        return answered, error, result

    def _receive(self, count, deadline):
        while len(self._received) < count:
            if deadline is not None:
                self._socket.settimeout(max(deadline - time.monotonic(), 0.001))
            part = self._socket.recv(65536)
            if not part:
                raise ConnectionError("the service ended the connection")
            self._received += part


class Session:
    """A reporter's session: a context manager, see `Client.session`."""

    def __init__(self, client, reporter, service_type, configuration):
        self._client = client
        self.reporter = reporter
        self._service_type = _number(SERVICE_TYPES, service_type)
        self._configuration = configuration

    def __enter__(self):
        self._client.call("createReportingSession", self.reporter)
        try:
            self._client.call("setServiceType", self._service_type, self.reporter)
            if self._configuration is not None:
                self._client.call("setConfiguration", self._configuration, self.reporter)
            self._client.post("startReportingSessionForID", self.reporter)
        except (ServiceError, TypeError, ValueError, OverflowError):
            self._client.post("destroyReportingSession", self.reporter)
            raise
        return self

    def __exit__(self, error, *_):
        try:
            self._client.call("stopReportingSessionForID", self.reporter)
            self._client.call("destroyReportingSession", self.reporter)
        except (OSError, ServiceError):
            # What went wrong within the session says more than that it could not be stopped.
            if error is None:
                raise

    def send(self, kind, event, payload):
        """A message of this session."""
        self._client.send(kind, event, payload, [self.reporter])
