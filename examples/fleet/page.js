// The answers of a fleet: a figure for each question, with a plot where its rows are a series, and the rows as a table.

/** What is drawn of a question: bars by these columns, of which the bounds are known for some, or columns in time. */
const PLOTS = {
    '01': { by: ['application'], value: 'hours' },
    '02': { along: 'day', value: 'hours', unit: 'hours' },
    '03': { by: ['application', 'kind'], value: 'hours' },
    '04': { by: ['kind'], value: 'median', low: 'low', high: 'high' },
    '05': { by: ['kind', 'release'], value: 'loud_share' },
    '06': { by: ['driver', 'driver_version'], value: 'share', low: 'low', high: 'high' },
    '07': { by: ['kind', 'release'], value: 'rate', low: 'low', high: 'high' },
    '08': { by: ['kind', 'release'], value: 'rate' },
    '09': { by: ['device'], value: 'now_rate' },
    '11': { by: ['model', 'after'], value: 'retained' },
    '12': { by: ['application'], value: 'repeated_share' },
    '14': { by: ['application', 'kind'], value: 'hours' },
    '15': { by: ['route'], value: 'hours' },
    '16': { by: ['kind'], value: 'share', low: 'low', high: 'high' },
    '17': { by: ['release'], value: 'engine_share' },
    '18': { along: 'hour', value: 'minutes', unit: 'minutes' },
    '19': { by: ['application'], value: 'median', low: 'lower', high: 'upper' },
};
const MOST_BARS = 24;

const rounded = (cell) => (typeof cell === 'number' ? Number(cell.toPrecision(4)) : cell ?? '–');

function barsOf(answer, plot) {
    const place = (name) => answer.columns.indexOf(name);
    const rows = answer.rows.slice(0, MOST_BARS);
    const most = Math.max(1e-9, ...rows.map((row) => row[place(plot.high ?? plot.value)]));
    const made = table('figure-bars', '', [plot.by.join(', '), '', plot.value.replaceAll('_', ' ')], []);
    for (const row of rows) {
        const name = plot.by.map((column) => row[place(column)]).join(' ');
        const head = element('th', '', name);
        head.scope = 'row';
        head.title = name;
        const bar = element('div', 'bounds', element('div', 'piece output'));
        bar.firstChild.style.width = `${row[place(plot.value)] / most * 100}%`;
        if (plot.low) {
            const range = element('div', 'range');
            range.style.left = `${row[place(plot.low)] / most * 100}%`;
            range.style.width = `${(row[place(plot.high)] - row[place(plot.low)]) / most * 100}%`;
            bar.append(range);
        }
        made.tBodies[0].append(element('tr', '', head, element('td', 'bars', bar),
            element('td', 'number', rounded(row[place(plot.value)]))));
    }
    return made;
}

/** The rows' sums along a column, such as days. */
function columnsOf(answer, plot) {
    const sums = new Map();
    const [along, value] = [answer.columns.indexOf(plot.along), answer.columns.indexOf(plot.value)];
    for (const row of answer.rows) { sums.set(row[along], (sums.get(row[along]) ?? 0) + row[value]); }
    return [...sums].map(([label, sum]) => [String(label).replace(/^\d{4}-/, ''), sum, String(label)]);
}

const asTable = (listed) => element('details', '', element('summary', '', 'As a table'), listed);

function figureOf(answer) {
    const number = answer.question.slice(0, 2);
    const plot = PLOTS[number];
    const rows = answer.rows.map((row) => row.map(rounded));
    const listed = element('div', 'scroll', table('', '', answer.columns.map((name) => name.replaceAll('_', ' ')), rows));
    if (rows.length === 0) { return figure(`question-${number}`, answer.tells, [element('p', 'hint', 'None.')]); }
    if (plot?.along) {
        const made = columnFigure(`question-${number}`, { title: answer.tells, unit: plot.unit, axis: plot.along,
            columns: columnsOf(answer, plot), headings: [plot.along, plot.unit], className: 'output' });
        made.querySelector('details').replaceWith(asTable(listed));
        return made;
    }
    const content = plot ? [barsOf(answer, plot), asTable(listed)] : [listed];
    return figure(`question-${number}`, answer.tells, content);
}

const page = JSON.parse(document.getElementById('data').textContent);
document.getElementById('about').textContent = `Asked ${page.asked} (UTC), of ${page.of} shards.`;
const partial = page.answers.filter((answer) => answer.shards < answer.of);
if (partial.length > 0) {
    const note = document.getElementById('partial');
    note.hidden = false;
    note.textContent = `Partial: ${partial.length} of ${page.answers.length} answers are of `
        + `${Math.min(...partial.map((answer) => answer.shards))} of ${page.of} shards, as the others were away.`;
}
document.querySelector('#figures .plots').replaceChildren(...page.answers.map(figureOf));
document.documentElement.dataset.state = 'whole';
