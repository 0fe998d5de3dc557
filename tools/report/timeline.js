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
/** What a sheet of paper shows: pixels that fill its width, and rows. */
const PAPER_WIDTH = 1000, PAPER_ROWS = 36;
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
        this.paper = null; // while the page is printed
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
        this.size = this.paper ?? { width: this.box.clientWidth, height: this.box.clientHeight, ratio: window.devicePixelRatio || 1 };
        this.scroll = this.paper?.scroll ?? this.box.scrollTop;
        this.labels = this.size.width < 600 ? 116 : 268;
        this.width = Math.max(50, this.size.width - this.labels);
    }
    /** For paper, which has another size than the window, and as many rows as go on a sheet. Tells which. */
    print(isOn) {
        if (!isOn) {
            const scroll = this.paper?.screen ?? this.scroll;
            this.paper = null;
            this.box.scrollTop = scroll;
            this.readColours();
            this.paint();
            return '';
        }
        const rows = Math.min(this.rows.length, PAPER_ROWS), screen = this.box.scrollTop;
        const first = Math.min(Math.floor(screen / ROW), this.rows.length - rows);
        this.paper = { width: PAPER_WIDTH, height: this.top + rows * ROW + 4, ratio: 2, scroll: first * ROW, screen };
        this.readColours();
        this.paint();
        return rows < this.rows.length ? `Sessions ${first + 1} to ${first + rows} of ${this.rows.length} are printed.` : '';
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
        const { context, canvas } = this;
        this.measure();
        this.chooseRows();
        const { width, height, ratio } = this.size, { scroll } = this;
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
        const first = Math.max(0, Math.floor(scroll / ROW));
        const last = Math.min(this.rows.length, Math.ceil((scroll + height - this.top) / ROW));
        context.save();
        context.beginPath();
        context.rect(0, this.top, width, height - this.top);
        context.clip();
        for (let i = first; i < last; ++i) { this.paintStripe(this.rows[i], i, this.top + i * ROW - scroll); }
        this.paintGrid(height);
        for (let i = first; i < last; ++i) { this.paintRow(this.rows[i], this.top + i * ROW - scroll); }
        for (let i = first; i < last; ++i) { this.paintLabel(this.rows[i], this.top + i * ROW - scroll); }
        if (this.mark !== null) { this.paintChosenMark(); }
        context.restore();
        this.paintAxis(width, height);
        if (this.lane > 0) { this.paintLane(width); }
        if (++this.frames === 1) { performance.mark('timeline-painted'); }
    }

    paintStripe(session, i, y) {
        const isSelected = session === this.selected;
        if (!isSelected && i % 2 === 0) { return; }
        this.context.fillStyle = isSelected ? this.colours.selected : this.colours.row;
        this.context.fillRect(0, y, this.size.width, ROW);
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
            if (event.kind === DRAFT) {
                context.fillRect(x - 4, AXIS + 7, 8, 10);
            } else {
                context.beginPath();
                context.arc(x, AXIS + LANE / 2, 5, 0, 2 * Math.PI);
                context.fill();
            }
        }
    }
}
