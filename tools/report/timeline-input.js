// How the timeline is moved, and what it says of what is pointed at.

/** Marks that fall together and are told of at once. */
const MOST_TOLD = 4;

Object.assign(Timeline.prototype, {
    listen() {
        this.pointers = null;
        this.box.addEventListener('pointerdown', (event) => this.press(event));
        this.box.addEventListener('pointermove', (event) => this.move(event));
        this.box.addEventListener('pointerup', (event) => this.release(event));
        this.box.addEventListener('pointercancel', () => { this.pointers = null; });
        this.box.addEventListener('pointerleave', () => { this.tip.hidden = true; });
        this.box.addEventListener('wheel', (event) => this.wheel(event), { passive: false });
        this.box.addEventListener('keydown', (event) => this.key(event));
        this.box.addEventListener('dblclick', (event) => {
            const { x } = this.place(event);
            if (x > this.labels) { this.zoom(0.4, x); } else { this.showSession(); }
        });
    },

    place(event) {
        const bounds = this.box.getBoundingClientRect();
        return { x: event.clientX - bounds.left - this.box.clientLeft, y: event.clientY - bounds.top - this.box.clientTop };
    },
    rowAt(y) {
        return y < this.top ? null : this.rows[Math.floor((y - this.top + this.box.scrollTop) / ROW)] ?? null;
    },
    nearest(things, x) {
        let best = null, least = HIT;
        for (const thing of things) {
            const distance = Math.abs(this.x(thing.at) - x);
            if (distance < least) { [best, least] = [thing, distance]; }
        }
        return best;
    },

    press(event) {
        if (event.button !== 0 || event.target !== this.canvas) { return; }
        this.pointers = { x: event.clientX, y: event.clientY, isDrag: false };
        if (event.pointerType !== 'touch') { this.box.setPointerCapture(event.pointerId); }
    },
    move(event) {
        if (this.pointers === null || event.buttons === 0) {
            this.hover(event);
            return;
        }
        const dx = event.clientX - this.pointers.x, dy = event.clientY - this.pointers.y;
        if (!this.pointers.isDrag && Math.hypot(dx, dy) < 4) { return; }
        this.pointers = { x: event.clientX, y: event.clientY, isDrag: true };
        this.tip.hidden = true;
        if (event.pointerType !== 'touch') { this.box.scrollTop -= dy; }
        this.pan(-dx);
    },
    release(event) {
        const isClick = this.pointers !== null && !this.pointers.isDrag;
        this.pointers = null;
        if (!isClick) { return; }
        const { x, y } = this.place(event);
        const session = this.rowAt(y);
        if (session !== null) {
            this.select(session, this.nearest(session.marks, x));
        } else if (this.lane > 0 && y > AXIS) {
            const found = this.nearest(deviceEvents, x);
            if (found !== null) { this.goToCapture(found); }
        }
    },
    goToCapture(found) {
        const row = rowOfCapture(found);
        const link = row.querySelector('a');
        row.scrollIntoView({ block: 'center' });
        (link ?? row).focus();
    },
    wheel(event) {
        if (event.ctrlKey || event.metaKey || event.altKey) {
            event.preventDefault();
            this.zoom(Math.exp(Math.max(-50, Math.min(50, event.deltaY)) * 0.01), this.place(event).x);
        } else if (event.shiftKey || Math.abs(event.deltaX) > Math.abs(event.deltaY)) {
            event.preventDefault();
            this.pan(event.deltaX || event.deltaY);
        }
    },

    hover(event) {
        const { x, y } = this.place(event);
        const lines = x < 0 || y < 0 ? [] : this.linesAt(x, y);
        this.tip.hidden = lines.length === 0;
        if (lines.length === 0) { return; }
        this.tip.replaceChildren(...lines.map((line, i) => element('div', i === 0 ? 'first' : '', line)));
        const left = Math.min(event.clientX + 14, window.innerWidth - this.tip.offsetWidth - 8);
        const isLow = event.clientY + 20 + this.tip.offsetHeight > window.innerHeight;
        this.tip.style.left = `${Math.max(4, left)}px`;
        this.tip.style.top = `${isLow ? event.clientY - this.tip.offsetHeight - 10 : event.clientY + 18}px`;
    },
    linesAt(x, y) {
        const session = this.rowAt(y);
        if (session === null) {
            const found = this.lane > 0 && y > AXIS && y < this.top ? this.nearest(deviceEvents, x) : null;
            return found === null ? [] : [`${DEVICE_EVENTS[found.kind]}: ${found.text}`, momentText(found.at, 3),
                ...(folderOf(found) === null ? [] : ['Click for the link to its folder'])];
        }
        const mark = x > this.labels ? this.nearest(session.marks, x) : null;
        if (mark !== null) {
            // A session's first route and volume, for one, lie on each other.
            const together = session.marks.filter((other) => Math.abs(this.x(other.at) - this.x(mark.at)) < 2);
            const more = together.length - MOST_TOLD;
            return [...together.slice(0, MOST_TOLD).flatMap(markLines), ...(more > 0 ? [`and ${more} more: zoom in`] : []), session.app];
        }
        const at = this.at(x);
        const stretches = x <= this.labels ? [] : session.stretches.filter(({ begin, end }) =>
            Math.min(begin, end) <= at && at <= Math.max(begin, end));
        return [session.app, `${session.service}, ${lengthText(session.ended - session.began)}`,
            `from ${momentText(session.began)}`,
            ...stretches.map((stretch) => `${stretch.isOutput ? 'Output' : 'Input'}: ${lengthText(stretch.end - stretch.begin)}`)];
    },

    key(event) {
        if (event.ctrlKey || event.metaKey || event.altKey) { return; }
        const page = Math.max(1, Math.floor((this.box.clientHeight - this.top) / ROW) - 1);
        const acts = {
            ArrowLeft: () => this.pan(-this.width / 10),
            ArrowRight: () => this.pan(this.width / 10),
            ArrowUp: () => this.step(-1),
            ArrowDown: () => this.step(1),
            PageUp: () => this.step(-page),
            PageDown: () => this.step(page),
            Home: () => this.step(-this.rows.length),
            End: () => this.step(this.rows.length),
            Enter: () => this.showSession(),
            Escape: () => this.select(null),
            '+': () => this.zoom(0.7),
            '=': () => this.zoom(0.7),
            '-': () => this.zoom(1 / 0.7),
            0: () => this.fit(true),
            n: () => this.stepMark(1),
            p: () => this.stepMark(-1),
        };
        const act = acts[event.key] ?? acts[event.key.toLowerCase()];
        if (act !== undefined) {
            event.preventDefault();
            act();
        }
    },
    step(by) {
        if (this.rows.length === 0) { return; }
        const from = this.selected === null ? (by > 0 ? -1 : this.rows.length) : this.rows.indexOf(this.selected);
        this.select(this.rows[Math.min(Math.max(from + by, 0), this.rows.length - 1)]);
    },
    stepMark(by) {
        if (this.selected === null) { this.step(1); }
        if (this.selected === null || this.selected.marks.length === 0) { return; }
        const { marks } = this.selected;
        const from = this.mark === null ? (by > 0 ? -1 : marks.length) : marks.indexOf(this.mark);
        this.select(this.selected, marks[Math.min(Math.max(from + by, 0), marks.length - 1)]);
    },
    showSession() {
        if (this.selected !== null) { this.show(this.selected.low, this.selected.high); }
    },
});

function markLines(mark) {
    return [`${MARKS[mark.kind].title}: ${mark.text}`, momentText(mark.at, 3)];
}
