'use strict';
// The page's data, and what is asked of them. Times are milliseconds from `report.base`.

const report = JSON.parse(document.getElementById('data').textContent);

const FLAG = { hasStart: 1, hasStop: 2, isClockSetBack: 4, isOfEvents: 8 };
const STRETCH = { isOpen: 1, isEstimated: 2 };
const SUMMARY_KINDS = ['output', 'group', 'input', 'session'];
const MARKS = [
    { name: 'volume', title: 'Volume' },
    { name: 'route', title: 'Route' },
    { name: 'overload', title: 'Overload' },
    { name: 'issue', title: 'Issue' },
];
const OVERLOAD = 2;
const ROUTE = 1;
const DEVICE_EVENTS = ['Capture', 'Capture, cancelled', 'Stack capture', 'Bug report draft'];
const DRAFT = 3;
const UNKNOWN = '(unknown)';

const textOf = (number) => report.texts[number];

/** Devices stand in a route with commas between. */
function devicesIn(route) {
    return String(route).split(',').map((name) => name.trim()).filter((name) => name !== '');
}

/** A summary as an object by its keys. */
function summaryOf(row) {
    const kind = SUMMARY_KINDS[row[0]];
    const summary = { kind, values: {} };
    report.columns[kind].forEach((key, i) => { summary.values[key] = row[i + 1]; });
    return summary;
}

/** A session; what only some places ask for is made when it is first asked for, as a page may have thousands. */
class Session {
    #row;
    #stretches = null;
    #marks = null;
    #summaries = null;
    #devices = null;
    #lookedIn = null;

    constructor(row) {
        const [name, app, service, process, reporter, began, ended, flags, messages, stretches, marks, , keys] = row;
        this.#row = row;
        this.name = textOf(name);
        this.app = textOf(app) || UNKNOWN;
        this.service = textOf(service) || UNKNOWN;
        this.process = textOf(process);
        this.reporter = reporter;
        this.began = began;
        this.ended = ended;
        this.flags = flags;
        this.messages = messages;
        this.keys = keys;
        this.isNegative = ended < began;
        this.overloads = 0;
        this.low = Math.min(began, ended);
        this.high = Math.max(began, ended);
        for (const stretch of stretches) {
            this.low = Math.min(this.low, stretch[0], stretch[1]);
            this.high = Math.max(this.high, stretch[0], stretch[1]);
        }
        for (const mark of marks) {
            this.low = Math.min(this.low, mark[0]);
            this.high = Math.max(this.high, mark[0]);
            if (mark[1] === OVERLOAD) { ++this.overloads; }
        }
        // What a message tells of can have happened before the session's first line was written.
        if (!this.has(FLAG.isClockSetBack)) { [this.began, this.ended] = [this.low, this.high]; }
    }

    get stretches() {
        this.#stretches ??= this.#row[9].map(([begin, end, isOutput, how]) => ({ begin, end, isOutput: isOutput === 1, how }));
        return this.#stretches;
    }
    get marks() {
        this.#marks ??= this.#row[10].map(([at, kind, text]) => ({ at, kind, text: textOf(text) }))
            .sort((a, b) => a.at - b.at);
        return this.#marks;
    }
    get summaries() {
        this.#summaries ??= this.#row[11].map(summaryOf);
        return this.#summaries;
    }
    get devices() {
        this.#devices ??= this.#findDevices();
        return this.#devices;
    }

    has(flag) { return (this.flags & flag) !== 0; }

    #findDevices() {
        const routes = new Set();
        for (const mark of this.marks) {
            if (mark.kind === ROUTE) { routes.add(mark.text); }
        }
        for (const { values } of this.summaries) {
            if (values.active_devices !== undefined && values.active_devices !== null) {
                routes.add(values.active_devices);
            }
        }
        return new Set([...routes].flatMap(devicesIn));
    }

    /** Whether all words are in what the session's row says of it. */
    contains(words) {
        if (words.length === 0) { return true; }
        if (this.#lookedIn === null) {
            const issues = new Set(this.marks.filter((mark) => mark.kind >= OVERLOAD).map((mark) => mark.text));
            this.#lookedIn = [this.app, this.service, this.process, this.name, String(this.reporter ?? ''),
                ...this.devices, ...issues, ...this.keys.map((key) => report.keys[key])].join('\n').toLowerCase();
        }
        return words.every((word) => this.#lookedIn.includes(word));
    }
}

const sessions = report.sessions.map((row) => new Session(row)).sort((a, b) => a.began - b.began);
sessions.forEach((session, number) => { session.number = number; });
const deviceEvents = report.device.map(([at, kind, text, capture, hasFolder]) =>
    ({ at, kind, text: textOf(text), capture, hasFolder: hasFolder === 1 })).sort((a, b) => a.at - b.at);

/** How often each of some names is met, as pairs, the most frequent first. */
function countNames(namesOf) {
    const counts = new Map();
    for (const session of sessions) {
        for (const name of namesOf(session)) { counts.set(name, (counts.get(name) ?? 0) + 1); }
    }
    return [...counts].sort((a, b) => b[1] - a[1] || (a[0] < b[0] ? -1 : 1));
}

const dateOf = (at) => new Date(report.base * 1000 + at);

/** Date and time of a moment, in UTC; `digits` of the second's fraction. */
function momentText(at, digits = 0) {
    const date = dateOf(at);
    if (Number.isNaN(date.getTime())) { return UNKNOWN; }
    const text = date.toISOString().replace('T', ' ').replace('Z', '');
    return digits === 0 ? text.slice(0, text.lastIndexOf('.')) : text;
}
const clockText = (at, digits) => momentText(at, digits).split(' ').pop();

/** A length of time for people. */
function lengthText(milliseconds) {
    const sign = milliseconds < 0 ? '−' : '';
    const seconds = Math.abs(milliseconds) / 1000;
    if (seconds < 60) { return `${sign}${seconds < 10 ? seconds.toFixed(2) : seconds.toFixed(1)} s`; }
    const minutes = Math.floor(seconds / 60);
    if (minutes < 60) { return `${sign}${minutes} min ${Math.floor(seconds % 60)} s`; }
    const hours = Math.floor(minutes / 60);
    return hours < 48 ? `${sign}${hours} h ${minutes % 60} min` : `${sign}${Math.floor(hours / 24)} d ${hours % 24} h`;
}
