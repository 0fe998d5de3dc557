"""Sinks' files as the service writes them, of sessions that are made up."""

import json
import os
import random

BEGIN = 1795266488.0
APPLICATIONS = ["com.example.music", "com.example.phone", "com.example.game", "com.example.podcasts",
                "<img src=x onerror=alert(1)>", "</script><script>document.title='run'</script>"]
ROUTES = ["Speaker", "Receiver, Built-in Microphone", "Wireless Headphones", "Wireless Headset",
          "Display <b>Audio</b>"]
SERVICES = ["longformaudio", "telephony", "haptics", "alarms"]


def dump(value):
    return json.dumps(value, separators=(",", ":"), ensure_ascii=False)


def write_sample(directory, count, seed=1, call_quality=True, events_bytes=None):
    """`count` sessions, or as many as make an analytics file of so many bytes."""
    numbers = random.Random(seed)
    os.makedirs(directory, exist_ok=True)
    quality = open(os.path.join(directory, "call-quality.jsonl"), "w", encoding="utf-8") if call_quality else None
    with open(os.path.join(directory, "analytics-events.jsonl"), "w", encoding="utf-8") as events:
        start, i = BEGIN, 0
        while i < count if events_bytes is None else events.tell() < events_bytes:
            start = round(start + numbers.uniform(1, 60), 6)
            write_session(numbers, quality, events, start, i)
            i += 1
    if quality:
        quality.close()


def write_session(numbers, quality, events, start, number):
    application, service = numbers.choice(APPLICATIONS), numbers.choice(SERVICES)
    name, at = f"0123456789abcdef.{number}", start

    def record(op, **rest):
        if quality:
            quality.write(dump({"time": at, "op": op, "session": name, **rest}) + "\n")

    def send(category, kind, **payload):
        """One message: two event lines and a call-quality line of the same time."""
        nonlocal at
        at = round(at + 0.001, 6)
        payload = {"HostApplicationDisplayID": application, "audiotag": category + kind,
                   "invalid_timestamp": "nil", **payload}
        whole = dump({**payload, "zrreporting_timestamp": at})
        for of in ("tamblo", service):
            events.write(f'{{"time":{at},"event":"com.vandra.{of}.{category}.{kind}","payload":{whole}}}\n')
        record("message", category=4, type=1, payload=payload)

    record("open", userInfo={"HostApplicationDisplayID": application, "ServiceName": service + "_session",
                             "ZRReportingSessionID": number})
    stretches, volume, route = [], numbers.randint(0, 16) / 16, numbers.choice(ROUTES)
    has_input = service == "telephony"
    send("Session_Playback", "Start", session_output_running=True, session_input_running=has_input,
         active_devices=route, QVSessionVolume=volume, mFormatID="lpcm", mChannelsPerFrame=2)
    for _ in range(numbers.randint(0, 6)):
        length = round(numbers.uniform(0.6, 240), 3)
        at = round(at + length, 6)
        stretches.append((length, volume, route))
        chance = numbers.random()
        if chance < 0.4:
            volume = numbers.randint(0, 16) / 16
            send("Volume", "Generic", QVSessionVolume=volume)
        elif chance < 0.7:
            route = numbers.choice(ROUTES)
            send("Routing_RouteChange", "Generic", active_devices=route)
        elif chance < 0.85:
            send("IO", "Error", issue_type="overload", io_cycle=numbers.randint(1, 9999))
        else:
            send("Input", "IssueDetector", issue_type=numbers.choice(["silence", "<script>alert(1)</script>"]),
                 node="echo_canceller")
    send("Session_Playback", "Stop", session_output_running=False, session_input_running=False)
    for i, (length, level, way) in enumerate(stretches, 1):
        send("Volume", "Summary", play_seconds=length, QVSessionVolume=level, QVSessionVolumeBucketed=str(level),
             active_devices=way, session_selected_format="LPCM", mFormatID="lpcm", msgidx=i, msgcnt=len(stretches))
    send("Session_Generic", "Summary", summaryServiceName=service, clientProcessName="player", overload_count=0,
         num_messages=9, num_unique_messages=9, num_redundant_messages=0, total_active_time=1.5)
    if has_input:
        for i, (length, _, way) in enumerate(stretches, 1):
            send("Input", "Summary", inputrunning_seconds=length, active_devices=way, msgidx=i,
                 vp_config_operation_mode="telephony", msgcnt=len(stretches))
    record("flush")


def figures_of(directory):
    """What a page has to show, by the analytics file alone: seconds by name, of output and input, seconds by
    volume class, and the number of overloads."""
    figures = {"application": {}, "device": {}, "route": {}, "service": {}}
    volumes, overloads = {}, 0

    def add(figure, name, which, seconds):
        figures[figure].setdefault(name, {"output": 0, "input": 0})[which] += seconds

    with open(os.path.join(directory, "analytics-events.jsonl"), encoding="utf-8") as lines:
        for line in lines:
            record = json.loads(line)
            _, _, service, category, kind = record["event"].split(".")
            payload = record["payload"]
            if service == "tamblo":
                overloads += payload.get("issue_type") == "overload"
            elif kind == "Summary" and category in ("Volume", "Input"):
                which = "output" if category == "Volume" else "input"
                seconds = payload["play_seconds" if which == "output" else "inputrunning_seconds"]
                add("application", payload["HostApplicationDisplayID"], which, seconds)
                add("service", service, which, seconds)
                add("route", payload["active_devices"], which, seconds)
                for device in payload["active_devices"].split(", "):
                    add("device", device, which, seconds)
                if which == "output":
                    level = payload["QVSessionVolumeBucketed"]
                    volumes[float(level)] = volumes.get(float(level), 0) + seconds
    return figures, volumes, overloads
