// What pages are made of: elements, tables, and columns in SVG. Knows nothing of what they show.

/** An element with a class and what it contains: elements, or texts, which are never markup. */
function element(name, className, ...content) {
    const made = document.createElement(name);
    if (className) { made.className = className; }
    made.append(...content.map((part) => (part instanceof Node ? part : String(part))));
    return made;
}

/** A table: headings, then rows of cells. */
function table(className, caption, headings, rows) {
    const made = element('table', className);
    if (caption) { made.append(element('caption', '', caption)); }
    const head = element('tr');
    headings.forEach((heading, i) => {
        const cell = element('th', typeof rows[0]?.[i] === 'number' ? 'number' : '', heading);
        cell.scope = 'col';
        head.append(cell);
    });
    made.append(element('thead', '', head), element('tbody', '', ...rows.map((cells) =>
        element('tr', '', ...cells.map((cell) => element('td', typeof cell === 'number' ? 'number' : '', cell))))));
    return made;
}

function figure(id, title, content) {
    const made = element('figure', '', element('figcaption', '', title),
        ...(content.length > 0 ? content : [element('p', 'hint', 'Nothing of this kind was reported.')]));
    made.id = id;
    return made;
}

function svg(name, attributes, ...content) {
    const made = document.createElementNS('http://www.w3.org/2000/svg', name);
    for (const [key, value] of Object.entries(attributes)) { made.setAttribute(key, value); }
    made.append(...content);
    return made;
}

/** A round number that is no less. */
function roundUp(number) {
    const power = 10 ** Math.floor(Math.log10(number));
    return [1, 2, 4, 6, 8, 10].map((step) => step * power).find((step) => step >= number * 0.9999);
}

/** Columns `[label, value, title]`, of which a label may be empty, with axes that say what they count, and the
 * same as a table to open. */
function columnFigure(id, { title, unit, axis, columns, headings, className, note = '' }) {
    const width = 520, height = 224, left = 44, bottom = 42, top = 22;
    const most = roundUp(Math.max(1e-9, ...columns.map(([, value]) => value)));
    const plot = svg('svg', { viewBox: `0 0 ${width} ${height}`, role: 'img', 'aria-label': `${title}; the table below has the figures` });
    for (const part of [0, 0.5, 1]) {
        const y = top + (height - top - bottom) * (1 - part);
        plot.append(svg('line', { x1: left, x2: width, y1: y, y2: y, class: 'grid' }),
            svg('text', { x: left - 6, y: y + 4, class: 'end' }, `${Number((most * part).toPrecision(3))}`));
    }
    plot.append(svg('text', { x: left, y: 10, class: 'start' }, unit),
        svg('text', { x: width, y: height - 4, class: 'end' }, axis));
    const step = Math.min((width - left) / columns.length, 64);
    const every = Math.ceil((Math.max(...columns.map(([label]) => label.length)) * 6 + 16) / step);
    columns.forEach(([label, value, more], i) => {
        const tall = (height - top - bottom) * Math.max(0, value) / most;
        const x = left + i * step;
        plot.append(svg('rect', { x: x + step * 0.1, y: height - bottom - tall, width: step * 0.8, height: tall, class: className },
            svg('title', {}, `${more}: ${Number(value.toPrecision(4))} ${unit}`)));
        if (label !== '' && (i % every === 0 || columns.some(([other]) => other === ''))) {
            plot.append(svg('text', { x: x + step / 2, y: height - bottom + 16, class: i === 0 ? 'first' : 'middle' }, label));
        }
    });
    const numbers = table('', '', headings, columns.map(([, value, more]) => [more, Number(value.toPrecision(6))]));
    return figure(id, title, [plot, ...(note === '' ? [] : [element('p', 'hint', note)]), element('details', '', element('summary', '', 'As a table'), element('div', 'scroll', numbers))]);
}
