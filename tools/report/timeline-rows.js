// How the timeline draws its rows: a session's bar, its stretches and marks, and its name.

Object.assign(Timeline.prototype, {
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
        if (session.isNegative) { this.paintNegativeLength(session, y); }
    },

    /** The selected mark, with what it says beside it. */
    paintChosenMark() {
        const { context, colours, labels, mark } = this;
        const y = this.top + this.rows.indexOf(this.selected) * ROW - this.scroll + ROW / 2, x = this.x(mark.at);
        if (y < this.top || x < labels || x > labels + this.width) { return; }
        context.strokeStyle = colours.text;
        context.lineWidth = 2;
        context.beginPath();
        context.arc(x, y, 9, 0, 2 * Math.PI);
        context.stroke();
        context.font = '12px system-ui, sans-serif';
        const text = this.shorten(markLines(mark).join('  '), this.width - 40);
        const width = context.measureText(text).width + 12;
        const left = x + 14 + width <= labels + this.width ? x + 14 : Math.max(labels, x - 14 - width);
        context.fillStyle = colours.panel;
        context.fillRect(left, y - 11, width, 22);
        context.lineWidth = 1;
        context.strokeRect(left + 0.5, y - 10.5, width - 1, 21);
        context.fillStyle = colours.text;
        context.fillText(text, left + 6, y);
    },

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
    },

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
    },
    /** Behind the bar; in front of it or within where there is no room. */
    paintNegativeLength(session, y) {
        const { context, colours, labels } = this;
        const right = labels + this.width, from = this.x(session.ended), to = this.x(session.began);
        const text = `${lengthText(session.ended - session.began)}: clock set back`;
        context.font = '11px system-ui, sans-serif';
        const room = context.measureText(text).width + 12;
        const x = [to + 8, from - room].find((place) => place >= labels && place + room <= right) ?? Math.max(from, labels) + 6;
        context.fillStyle = session === this.selected ? colours.selected : colours.panel;
        context.fillRect(x, y + ROW / 2 - 8, room - 6, 16);
        context.fillStyle = colours.overload;
        context.fillText(text, x + 3, y + ROW / 2);
    },

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
    },

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
    },

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
    },
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
    },
});
