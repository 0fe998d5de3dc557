// The timeline: a canvas that shows the rows in view of however many there are, drawn once a frame at most.

const ROW = 26;
const AXIS = 40;
const LANE = 24;
const LEAST_HEIGHT = 240;
const DENSE = 200;
const HIT = 7;
const SECOND = 1000, MINUTE = 60 * SECOND, HOUR = 60 * MINUTE, DAY = 24 * HOUR;
const STEPS = [1, 2, 5, 10, 20, 50, 100, 200, 500, SECOND, 2 * SECOND, 5 * SECOND, 10 * SECOND, 15 * SECOND,
    30 * SECOND, MINUTE, 2 * MINUTE, 5 * MINUTE, 10 * MINUTE, 15 * MINUTE, 30 * MINUTE, HOUR, 2 * HOUR, 3 * HOUR,
    6 * HOUR, 12 * HOUR, DAY, 2 * DAY, 7 * DAY, 14 * DAY, 30 * DAY, 91 * DAY, 365 * DAY, 3650 * DAY, 36500 * DAY];
const LEAST_SPAN = 20;
/** What a timeline begins with, at most, of sessions that reach over more. */
const FIRST_SPAN = 2 * DAY;

class Timeline {
    constructor(told) {
        this.told = told; // what is called when a session or a mark is chosen
        this.box = document.getElementById('timeline');
        this.canvas = document.getElementById('canvas');
        this.context = this.canvas.getContext('2d');
        this.heightOfAll = document.getElementById('rows-height');
        this.tip = document.getElementById('tip');
        this.rows = [];
        this.all = [];
        this.isOnlyInView = false;
        this.start = 0;
        this.span = HOUR;
        this.selected = null;
        this.mark = null;
        this.isDue = false;
        this.isPrinting = false;
        this.frames = 0;
        this.lane = deviceEvents.length > 0 ? LANE : 0;
        this.measure();
        this.readColours();
        new ResizeObserver(() => this.draw()).observe(this.box);
        this.box.addEventListener('scroll', () => this.draw());
        window.matchMedia('(prefers-color-scheme: dark)').addEventListener('change', () => this.readColours());
        this.listen();
    }

    readColours() {
        const style = getComputedStyle(document.documentElement);
        this.colours = {};
        for (const name of ['text', 'muted', 'faint', 'grid', 'panel', 'row', 'selected', 'session', 'output', 'input',
            'volume', 'route', 'overload', 'issue', 'capture', 'accent']) {
            this.colours[name] = style.getPropertyValue(`--${name}`).trim();
        }
        this.draw();
    }

    get top() { return AXIS + this.lane; }
    /** Asking the browser for each mark anew would take longer than drawing it. */
    measure() {
        this.labels = this.box.clientWidth < 600 ? 116 : 230;
        this.width = Math.max(50, this.box.clientWidth - this.labels);
    }
    x(at) { return this.labels + (at - this.start) / this.span * this.width; }
    at(x) { return this.start + (x - this.labels) / this.width * this.span; }

    setRows(all) {
        this.all = all;
        this.placeRows(all);
        if (this.selected !== null && !all.includes(this.selected)) { this.select(null); }
        this.draw();
    }
    placeRows(rows) {
        this.rows = rows;
        const height = this.top + rows.length * ROW + 4;
        this.heightOfAll.style.height = `${height}px`;
        this.box.style.height = `min(60vh, 620px, ${Math.max(height, LEAST_HEIGHT) + 2}px)`;
    }
    /** Leaves out what the time that is shown does not reach, where that is asked for. */
    chooseRows() {
        const isInView = (session) => session.high >= this.start && session.low <= this.start + this.span;
        const rows = this.isOnlyInView ? this.all.filter(isInView) : this.all;
        if (rows.length !== this.rows.length || rows[0] !== this.rows[0]) { this.placeRows(rows); }
        this.rows = rows;
    }

    /** The time of all rows; of much, its last part alone, unless everything is asked for. */
    fit(isEverything) {
        let low = Infinity, high = -Infinity;
        for (const session of this.all) {
            low = Math.min(low, session.low);
            high = Math.max(high, session.high);
        }
        for (const event of deviceEvents) {
            low = Math.min(low, event.at);
            high = Math.max(high, event.at);
        }
        if (low > high) { low = 0; high = HOUR; }
        if (!isEverything && high - low > FIRST_SPAN) {
            low = high - FIRST_SPAN / 2;
            this.box.scrollTop = Math.max(0, this.rows.findIndex((session) => session.high >= low)) * ROW;
        }
        this.show(low, high);
    }
    show(low, high) {
        const margin = Math.max((high - low) * 0.04, LEAST_SPAN);
        this.start = low - margin;
        this.span = high - low + 2 * margin;
        this.draw();
    }
    pan(pixels) {
        this.start += pixels / this.width * this.span;
        this.draw();
    }
    zoom(factor, x = this.labels + this.width / 2) {
        const fixed = this.at(x);
        this.span = Math.min(Math.max(this.span * factor, LEAST_SPAN), 36500 * DAY);
        this.start = fixed - (x - this.labels) / this.width * this.span;
        this.draw();
    }

    select(session, mark = null) {
        this.selected = session;
        this.mark = mark;
        if (session !== null) { this.reveal(session, mark); }
        this.told(session, mark);
        this.draw();
    }
    reveal(session, mark) {
        const y = this.rows.indexOf(session) * ROW;
        const height = this.box.clientHeight - this.top;
        if (y < this.box.scrollTop) { this.box.scrollTop = y; }
        if (y + ROW > this.box.scrollTop + height) { this.box.scrollTop = y + ROW - height; }
        const [low, high] = mark !== null ? [mark.at, mark.at] : [session.low, session.high];
        if (high < this.start || low > this.start + this.span) { this.start = low - this.span / 4; }
    }

    draw() {
        if (this.isDue) { return; }
        this.isDue = true;
        requestAnimationFrame(() => {
            this.isDue = false;
            this.paint();
        });
    }

    paint() {
        const { context, box, canvas } = this;
        this.measure();
        this.chooseRows();
        const ratio = window.devicePixelRatio || 1;
        const width = box.clientWidth, height = box.clientHeight;
        if (canvas.width !== Math.round(width * ratio) || canvas.height !== Math.round(height * ratio)) {
            canvas.width = Math.round(width * ratio);
            canvas.height = Math.round(height * ratio);
            canvas.style.width = `${width}px`;
            canvas.style.height = `${height}px`;
            this.shortened = new Map();
        }
        context.setTransform(ratio, 0, 0, ratio, 0, 0);
        context.fillStyle = this.colours.panel;
        context.fillRect(0, 0, width, height);
        context.textBaseline = 'middle';
        const first = Math.max(0, Math.floor(box.scrollTop / ROW));
        const last = Math.min(this.rows.length, Math.ceil((box.scrollTop + height - this.top) / ROW));
        context.save();
        context.beginPath();
        context.rect(0, this.top, width, height - this.top);
        context.clip();
        for (let i = first; i < last; ++i) { this.paintStripe(this.rows[i], i, this.top + i * ROW - box.scrollTop); }
        this.paintGrid(height);
        for (let i = first; i < last; ++i) { this.paintRow(this.rows[i], this.top + i * ROW - box.scrollTop); }
        for (let i = first; i < last; ++i) { this.paintLabel(this.rows[i], this.top + i * ROW - box.scrollTop); }
        context.restore();
        this.paintAxis(width, height);
        if (this.lane > 0) { this.paintLane(width); }
        if (++this.frames === 1) { performance.mark('timeline-painted'); }
    }

    paintStripe(session, i, y) {
        const isSelected = session === this.selected;
        if (!isSelected && i % 2 === 0) { return; }
        this.context.fillStyle = isSelected ? this.colours.selected : this.colours.row;
        this.context.fillRect(0, y, this.box.clientWidth, ROW);
    }

    ticks() {
        const least = this.span / this.width * 96;
        const step = STEPS.find((candidate) => candidate >= least) ?? STEPS[STEPS.length - 1];
        // Steps lie at whole ones of UTC, from which the base is a number of seconds away.
        const shift = (report.base * 1000) % step;
        const ticks = [];
        for (let at = Math.ceil((this.start + shift) / step) * step - shift; at < this.start + this.span; at += step) {
            ticks.push(at);
        }
        return { step, ticks };
    }
    paintGrid(height) {
        this.context.fillStyle = this.colours.grid;
        for (const at of this.ticks().ticks) { this.context.fillRect(Math.round(this.x(at)), this.top, 1, height); }
    }
    paintAxis(width, height) {
        const { context, colours, labels } = this;
        context.fillStyle = colours.panel;
        context.fillRect(0, 0, width, AXIS);
        const { step, ticks } = this.ticks();
        context.font = '12px system-ui, sans-serif';
        let lastDay = '', free = labels;
        context.textAlign = 'left';
        for (const at of ticks) {
            const x = Math.round(this.x(at));
            context.fillStyle = colours.grid;
            context.fillRect(x, AXIS - 8, 1, 8);
            const [day, clock] = momentText(at, 3).split(' ');
            context.fillStyle = colours.muted;
            if (step < DAY) { context.fillText(step < SECOND ? clock : clock.slice(0, step < MINUTE ? 8 : 5), x + 4, AXIS - 10); }
            if (day !== lastDay && x >= free) {
                context.fillStyle = colours.text;
                context.fillText(day, x + 4, step < DAY ? 12 : AXIS - 10);
                free = x + 84;
                lastDay = day;
            }
        }
        context.fillStyle = colours.muted;
        context.fillText('UTC', 10, AXIS - 10);
        context.fillStyle = colours.grid;
        context.fillRect(0, AXIS - 1, width, 1);
        context.fillRect(labels - 1, 0, 1, height);
    }

    /** What no session is named of: captures and drafts. */
    paintLane(width) {
        const { context, colours, labels } = this;
        context.fillStyle = colours.panel;
        context.fillRect(0, AXIS, width, LANE);
        context.fillStyle = colours.grid;
        context.fillRect(0, AXIS + LANE - 1, width, 1);
        context.fillStyle = colours.muted;
        context.fillText('Captures and drafts', 10, AXIS + LANE / 2);
        let last = -Infinity;
        for (const event of deviceEvents) {
            const x = this.x(event.at);
            if (x < labels || x > width || x - last < 2) { continue; }
            last = x;
            context.fillStyle = colours.capture;
            if (event.kind === 3) {
                context.fillRect(x - 4, AXIS + 7, 8, 10);
            } else {
                context.beginPath();
                context.arc(x, AXIS + LANE / 2, 5, 0, 2 * Math.PI);
                context.fill();
            }
        }
    }

    paintRow(session, y) {
        const { context, colours, labels } = this;
        const right = labels + this.width;
        const from = Math.max(this.x(session.low), labels), to = Math.min(this.x(session.high), right);
        if (to < labels || from > right) {
            context.fillStyle = colours.muted;
            context.font = '12px system-ui, sans-serif';
            context.fillText(to < labels ? '◂' : '▸', to < labels ? labels + 3 : right - 13, y + ROW / 2);
            return;
        }
        this.paintBar(session, y);
        for (const stretch of session.stretches) { this.paintStretch(stretch, y); }
        this.paintMarks(session, y, right);
        if (session === this.selected && this.mark !== null) {
            context.strokeStyle = colours.text;
            context.lineWidth = 2;
            context.beginPath();
            context.arc(this.x(this.mark.at), y + ROW / 2, 9, 0, 2 * Math.PI);
            context.stroke();
        }
    }

    /** Marks of one kind that fall together are drawn once; very many, as lines. */
    paintMarks({ marks }, y, right) {
        const isDense = marks.length > DENSE;
        const last = MARKS.map(() => -Infinity);
        for (const { at, kind } of marks) {
            const x = this.x(at);
            if (x < this.labels || x > right || x - last[kind] < (isDense ? 3 : 1.5)) { continue; }
            last[kind] = x;
            if (isDense) {
                this.context.fillStyle = this.colours[MARKS[kind].name];
                this.context.fillRect(x - 1, y + 3 + kind * 5, 2, 5);
            } else {
                this.paintMark(kind, x, y + ROW / 2);
            }
        }
    }

    paintBar(session, y) {
        const { context, colours } = this;
        const from = this.x(Math.min(session.began, session.ended)), to = this.x(Math.max(session.began, session.ended));
        const width = Math.max(to - from, 2);
        if (!session.isNegative) {
            context.fillStyle = colours.session;
            context.fillRect(from, y + ROW / 2 - 2, width, 4);
            return;
        }
        context.strokeStyle = colours.overload;
        context.lineWidth = 1.5;
        context.setLineDash([4, 3]);
        context.strokeRect(from, y + 5, width, ROW - 10);
        context.setLineDash([]);
        context.fillStyle = colours.overload;
        context.font = '11px system-ui, sans-serif';
        const text = `${lengthText(session.ended - session.began)}: clock set back`;
        context.fillText(text, Math.max(from, this.labels) + width + 6, y + ROW / 2);
    }

    paintStretch({ begin, end, isOutput, how }, y) {
        const { context, colours, labels } = this;
        const from = Math.max(this.x(Math.min(begin, end)), labels - 4);
        const to = Math.min(this.x(Math.max(begin, end)), labels + this.width + 4);
        if (to < labels || from > labels + this.width) { return; }
        const colour = isOutput ? colours.output : colours.input;
        const top = y + (isOutput ? 4 : 14), width = Math.max(to - from, 1.5);
        context.globalAlpha = (how & STRETCH.isEstimated) !== 0 ? 0.45 : 1;
        if (end < begin) {
            context.strokeStyle = colour;
            context.lineWidth = 1.5;
            context.strokeRect(from, top + 0.75, width, 6.5);
        } else {
            context.fillStyle = colour;
            context.fillRect(from, top, width, 8);
        }
        context.globalAlpha = 1;
        if ((how & STRETCH.isOpen) !== 0) {
            context.fillStyle = colours.panel;
            context.fillRect(to - 3, top, 1.5, 8);
        }
    }

    paintMark(kind, x, y) {
        const { context, colours } = this;
        context.fillStyle = colours[MARKS[kind].name];
        context.strokeStyle = colours.panel;
        context.lineWidth = 1;
        context.beginPath();
        if (kind === 0) {
            context.rect(x - 1.5, y - 7, 3, 14);
        } else if (kind === ROUTE) {
            context.moveTo(x, y - 6);
            context.lineTo(x + 6, y);
            context.lineTo(x, y + 6);
            context.lineTo(x - 6, y);
        } else if (kind === OVERLOAD) {
            context.arc(x, y, 5.5, 0, 2 * Math.PI);
        } else {
            context.moveTo(x, y - 7);
            context.lineTo(x + 7, y + 5);
            context.lineTo(x - 7, y + 5);
        }
        context.closePath();
        context.fill();
        context.stroke();
    }

    /** A text cut to a width; measured once for each. */
    shorten(text, width) {
        const key = `${width} ${text}`;
        let short = this.shortened.get(key);
        if (short === undefined) {
            short = text;
            while (short.length > 1 && this.context.measureText(short).width > width) {
                short = `${short.replace(/…$/, '').slice(0, -Math.max(1, Math.floor(short.length / 12)))}…`;
            }
            if (this.shortened.size > 5000) { this.shortened.clear(); }
            this.shortened.set(key, short);
        }
        return short;
    }
    paintLabel(session, y) {
        const { context, colours, labels } = this;
        const width = labels > 200 ? 140 : labels - 18;
        context.fillStyle = session === this.selected ? colours.selected : colours.panel;
        context.fillRect(0, y, labels - 1, ROW);
        context.fillStyle = colours.text;
        context.font = '13px system-ui, sans-serif';
        context.fillText(this.shorten(session.app, width), 10, y + ROW / 2);
        if (labels > 200) {
            context.fillStyle = colours.muted;
            context.font = '11px system-ui, sans-serif';
            context.fillText(this.shorten(session.service, labels - width - 26), width + 18, y + ROW / 2);
        }
    }
}
