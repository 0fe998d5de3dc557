// What brings the parts of the page together.

const byId = (id) => document.getElementById(id);
const number = (count) => count.toLocaleString('en');

function showAbout() {
    const { files, lines, bytes } = report.read;
    const selection = report.selection === '' ? '' : ` (${report.selection})`;
    byId('about').textContent = `${number(sessions.length)} sessions${selection}, from ${number(lines)} lines, ` +
        `${number(Math.round(bytes / 1024))} KiB, of ${files} files. Made ${momentText((report.made - report.base) * 1000)} UTC.`;
    const box = byId('left-out');
    box.hidden = report.leftOut.length === 0;
    box.querySelector('summary').textContent = 'What was left out';
    box.querySelector('ul').replaceChildren(...report.leftOut.map((line) => element('li', '', line)));
}

const MOST_CHOICES = 1000;
function fillSelect(id, counts) {
    const all = element('option', '', 'all');
    all.value = '';
    const options = counts.slice(0, MOST_CHOICES).map(([name, count]) => {
        const option = element('option', '', `${name} (${count})`);
        option.value = name;
        return option;
    });
    if (counts.length > MOST_CHOICES) {
        options.push(element('option', '', `and ${number(counts.length - MOST_CHOICES)} more: search for them`));
        options[MOST_CHOICES].disabled = true;
    }
    byId(id).replaceChildren(all, ...options);
}

function showLegend() {
    const kinds = [['output', 'output'], ['input', 'input'], ...MARKS.map(({ name }) => [name, name])];
    if (deviceEvents.some(({ kind }) => kind !== DRAFT)) { kinds.push(['capture', 'capture']); }
    if (deviceEvents.some(({ kind }) => kind === DRAFT)) { kinds.push(['draft', 'draft']); }
    byId('legend').replaceChildren(...kinds.map(([name, title]) => element('li', name, title)));
}

const timeline = new Timeline((session, mark) => {
    showDetails(session, mark, (chosen) => timeline.select(session, chosen));
    byId('said').textContent = session === null ? '' : mark !== null ? markLines(mark).join(', ')
        : `${session.app}, ${session.service}, ${lengthText(session.ended - session.began)}, ${session.marks.length} marks`;
});

const ORDERS = {
    start: (a, b) => a.number - b.number,
    length: (a, b) => (b.ended - b.began) - (a.ended - a.began) || a.number - b.number,
    application: (a, b) => (a.app < b.app ? -1 : a.app > b.app ? 1 : a.number - b.number),
    overloads: (a, b) => b.overloads - a.overloads || a.number - b.number,
};

function applyFilters() {
    const words = byId('search').value.toLowerCase().split(/\s+/).filter((word) => word !== '');
    const [app, service, device, key] = ['by-app', 'by-service', 'by-device', 'by-key'].map((id) => byId(id).value);
    const keyNumber = key === '' ? -1 : report.keys.indexOf(key);
    const shown = sessions.filter((session) => (app === '' || session.app === app) &&
        (service === '' || session.service === service) && (device === '' || session.devices.has(device)) &&
        (keyNumber < 0 || session.keys.includes(keyNumber)) && session.contains(words));
    shown.sort(ORDERS[byId('order').value]);
    timeline.setRows(shown);
    byId('shown').textContent = shown.length === sessions.length ? '' : `${number(shown.length)} of ${number(sessions.length)}`;
    return shown;
}

/** Filters once a typist pauses: figures over many sessions take longer than a keystroke. */
let pause = 0;
function filterSoon() {
    clearTimeout(pause);
    pause = setTimeout(() => showFigures(applyFilters()), 120);
}

byId('filters').addEventListener('input', filterSoon);
byId('filters').addEventListener('reset', filterSoon);
byId('filters').addEventListener('submit', (event) => event.preventDefault());
byId('only-in-view').addEventListener('change', (event) => {
    timeline.isOnlyInView = event.target.checked;
    timeline.draw();
});
document.querySelector('.buttons').addEventListener('click', (event) => {
    const acts = { in: () => timeline.zoom(0.6), out: () => timeline.zoom(1 / 0.6), fit: () => timeline.fit(true),
        session: () => timeline.showSession() };
    acts[event.target.dataset.act]?.();
});
document.addEventListener('keydown', (event) => {
    const isTyping = event.target.matches('input, select, textarea');
    if (event.key === '/' && !isTyping) {
        event.preventDefault();
        byId('search').focus();
    } else if (event.key === 'Escape' && isTyping) {
        timeline.box.focus();
    }
});
for (const when of ['beforeprint', 'afterprint']) {
    window.addEventListener(when, () => {
        const isOn = when === 'beforeprint';
        document.documentElement.classList.toggle('printing', isOn);
        byId('left-out').open = isOn;
        byId('printed').textContent = timeline.print(isOn);
    });
}

showAbout();
showLegend();
showDetails(null, null);
const shownFirst = applyFilters();
timeline.fit(false);
// The timeline is drawn before what takes longer and stands further down.
requestAnimationFrame(() => setTimeout(() => {
    fillSelect('by-app', countNames((session) => [session.app]));
    fillSelect('by-service', countNames((session) => [session.service]));
    fillSelect('by-device', countNames((session) => session.devices));
    fillSelect('by-key', countNames((session) => session.keys.map((key) => report.keys[key])));
    showFigures(shownFirst);
    showCaptures();
    document.documentElement.dataset.state = 'whole';
}));
