// Figures over the sessions that are shown: rows of bars, which are tables, and columns in SVG.

const MOST_BARS = 12;
const MOST_COLUMNS = 96;
const VOLUMES = Array.from({ length: 17 }, (_, i) => i / 16);

function addTo(sums, name, which, seconds) {
    const sum = sums.get(name) ?? { output: 0, input: 0 };
    sum[which] += seconds;
    sums.set(name, sum);
}

/** Seconds of output and input by several names, of volumes, and overloads. Lengths are those of summaries. */
function figuresOf(shown) {
    const figures = { application: new Map(), device: new Map(), route: new Map(), service: new Map(),
        volume: VOLUMES.map(() => 0), overloads: [] };
    for (const session of shown) {
        for (const { kind, values } of session.summaries) {
            if (kind !== 'output' && kind !== 'input') { continue; }
            const seconds = Number(kind === 'output' ? values.play_seconds : values.inputrunning_seconds) || 0;
            const route = String(values.active_devices ?? UNKNOWN);
            addTo(figures.application, session.app, kind, seconds);
            addTo(figures.service, session.service, kind, seconds);
            addTo(figures.route, route, kind, seconds);
            for (const device of new Set(devicesIn(route))) { addTo(figures.device, device, kind, seconds); }
            const volume = VOLUMES.indexOf(Number(values.QVSessionVolumeBucketed ?? NaN));
            if (kind === 'output' && volume >= 0) { figures.volume[volume] += seconds; }
        }
        for (const mark of session.marks) {
            if (mark.kind === OVERLOAD) { figures.overloads.push(mark.at); }
        }
    }
    return figures;
}

const minutesText = (seconds) => (seconds / 60).toLocaleString('en',
    { minimumFractionDigits: seconds < 600 ? 2 : 1, maximumFractionDigits: seconds < 600 ? 2 : 1 });

function bar(sum, most) {
    const cell = element('td', 'bars');
    for (const which of ['output', 'input']) {
        const piece = element('div', `piece ${which}`);
        piece.style.width = `${Math.max(0, sum[which]) / most * 100}%`;
        cell.append(piece);
    }
    return cell;
}

/** Minutes by name, the longest first; what is beyond the first ones stands together. */
function barFigure(id, title, sums, note = '') {
    const rows = [...sums].sort((a, b) => (b[1].output + b[1].input) - (a[1].output + a[1].input));
    const rest = rows.splice(MOST_BARS);
    if (rest.length > 0) {
        rows.push([`${rest.length} others`, rest.reduce((all, [, sum]) =>
            ({ output: all.output + sum.output, input: all.input + sum.input }), { output: 0, input: 0 })]);
    }
    const most = Math.max(1e-9, ...rows.map(([, sum]) => Math.max(sum.output, sum.input)));
    const made = table('figure-bars', '', [title.split(' by ')[1], '', 'output', 'input'], []);
    for (const [name, sum] of rows) {
        const head = element('th', '', name);
        head.scope = 'row';
        head.title = name;
        const cells = ['output', 'input'].map((which) => {
            const cell = element('td', 'number', sum[which] === 0 ? '–' : minutesText(sum[which]));
            cell.dataset.seconds = sum[which];
            return cell;
        });
        made.tBodies[0].append(element('tr', '', head, bar(sum, most), ...cells));
    }
    return figure(id, title, rows.length > 0 ? [made, ...(note === '' ? [] : [element('p', 'hint', note)])] : []);
}

function overloadFigure(overloads, shown, outputSeconds) {
    const title = 'Overloads per hour';
    if (overloads.length === 0) { return figure('figure-overloads', title, []); }
    let low = Infinity, high = -Infinity;
    for (const session of shown) {
        low = Math.min(low, session.low);
        high = Math.max(high, session.high);
    }
    const shift = (report.base * 1000) % DAY;
    const step = [1, 2, 3, 6, 12, 24, 168, 720, 8760].map((hours) => hours * HOUR)
        .find((candidate) => (high - low) / candidate < MOST_COLUMNS) ?? (high - low) / MOST_COLUMNS;
    const start = Math.floor((low + shift) / step) * step - shift;
    const counts = Array.from({ length: Math.floor((high - start) / step) + 1 }, () => 0);
    for (const at of overloads) { ++counts[Math.floor((at - start) / step)]; }
    const columns = counts.map((count, i) => {
        const text = momentText(start + i * step);
        const label = step >= DAY ? text.slice(0, 10) : high - low >= DAY ? text.slice(5, 16) : text.slice(11, 16);
        return [label, count / (step / HOUR), text.slice(0, 16)];
    });
    const rate = overloads.length / (outputSeconds / 3600);
    const note = `${overloads.length} in all` + (outputSeconds > 0
        ? `, with ${minutesText(outputSeconds)} minutes of output: ${Number(rate.toPrecision(3))} per hour of output.` : '.');
    return columnFigure('figure-overloads', { title, unit: 'overloads per hour', axis: 'time (UTC)', columns,
        headings: ['From (UTC)', 'Overloads per hour'], className: 'overload', note });
}

function showFigures(shown) {
    const figures = figuresOf(shown);
    const outputSeconds = [...figures.service.values()].reduce((all, { output }) => all + output, 0);
    const volumes = figures.volume.some((seconds) => seconds > 0)
        ? columnFigure('figure-volume', { title: 'Minutes of output by volume', unit: 'minutes', axis: 'volume (1 is full)',
            columns: figures.volume.map((seconds, i) =>
                [i % 4 === 0 ? String(VOLUMES[i]) : '', seconds / 60, `volume ${VOLUMES[i]}`]),
            headings: ['Volume class', 'Minutes'], className: 'output' })
        : figure('figure-volume', 'Minutes of output by volume', []);
    document.querySelector('#figures .plots').replaceChildren(
        barFigure('figure-application', 'Minutes by application', figures.application),
        barFigure('figure-device', 'Minutes by device', figures.device,
            'A device counts for the whole time of each route that it is in.'),
        barFigure('figure-route', 'Minutes by route', figures.route),
        barFigure('figure-service', 'Minutes by service type', figures.service),
        overloadFigure(figures.overloads, shown, outputSeconds), volumes);
    document.getElementById('figures-of').textContent = shown.length === sessions.length
        ? `of all ${sessions.length} sessions` : `of the ${shown.length} sessions shown`;
}
