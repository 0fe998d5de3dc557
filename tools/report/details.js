// What stands beside the timeline about the selected session, and the captures below it.

const SUMMARY_TITLES = { output: 'Output', group: 'Group playback', input: 'Input', session: 'Session' };
const COLUMN_TITLES = {
    play_seconds: 'Seconds', inputrunning_seconds: 'Seconds', QVSessionVolume: 'Volume',
    QVSessionVolumeBucketed: 'Volume class', active_devices: 'Route', session_selected_format: 'Format',
    mFormatID: 'Format ID', mChannelsPerFrame: 'Channels', spatializationEnabled: 'Spatial',
    'spatial-audio-accessory-feature': 'Accessory', ringerstate: 'Ringer',
    vp_config_operation_mode: 'Mode', vp_config_input_port: 'Port', vocoders: 'Vocoders',
    total_active_time: 'active, seconds', active_count: 'periods of activity',
    average_active_time: 'average period, seconds', overload_count: 'overloads', num_messages: 'messages in all',
    num_unique_messages: 'unique messages', num_redundant_messages: 'redundant messages', thermal_state: 'thermal state',
    low_power_enabled: 'low power', load_avg_1_min: 'load, 1 min', load_avg_5_min: 'load, 5 min',
    load_avg_15_min: 'load, 15 min', vmInfo_phys_footprint_MiB: 'service memory, MiB',
};
const MOST_MARKS_LISTED = 300;
const MOST_CAPTURES_LISTED = 500;

function cellText(value) {
    if (value === null || value === undefined) { return '–'; }
    if (typeof value === 'boolean') { return value ? 'yes' : 'no'; }
    return typeof value === 'number' && !Number.isInteger(value) ? Number(value.toFixed(3)) : value;
}

function definitions(pairs) {
    const list = element('dl');
    for (const [term, text] of pairs) {
        list.append(element('dt', '', term), element('dd', '', text));
    }
    return list;
}

/** What a reader has to know of a session that is not like others. */
function remarksOn(session) {
    const remarks = [];
    if (session.isNegative) {
        remarks.push(`It ended ${lengthText(session.began - session.ended)} before it began: the clock was set back meanwhile.`);
    } else if (session.has(FLAG.isClockSetBack)) {
        remarks.push('The clock was set back while it ran.');
    }
    if (session.has(FLAG.isOfEvents)) {
        remarks.push('Put together from analytics events of its application and service type: sessions that ran at the same time may stand here as one.');
    } else {
        if (!session.has(FLAG.hasStart)) { remarks.push('Its start is no longer in the files.'); }
    }
    if (!session.has(FLAG.hasStop)) { remarks.push('No stop is in the files: it may still run.'); }
    if (session.stretches.some((stretch) => (stretch.how & STRETCH.isEstimated) !== 0)) {
        remarks.push('Only summaries tell of its stretches: their lengths are right, and their places are not known.');
    }
    return remarks;
}

/** A key's title, which tells the key to who points at it. */
function headingOf(key) {
    const heading = element('abbr', '', COLUMN_TITLES[key] ?? key);
    heading.title = key;
    return heading;
}

function summaryTables(session) {
    const parts = [];
    for (const kind of ['output', 'input', 'group']) {
        const rows = session.summaries.filter((summary) => summary.kind === kind);
        if (rows.length > 0) {
            const columns = report.columns[kind];
            parts.push(element('div', 'scroll', table('summary', SUMMARY_TITLES[kind],
                columns.map(headingOf),
                rows.map(({ values }) => columns.map((key) => cellText(values[key]))))));
        }
    }
    for (const { values } of session.summaries.filter((summary) => summary.kind === 'session')) {
        parts.push(element('h3', '', SUMMARY_TITLES.session), definitions(report.columns.session
            .filter((key) => values[key] !== null).map((key) => [headingOf(key), cellText(values[key])])));
    }
    return parts;
}

function markList(session, current, choose) {
    const list = element('ol', 'marks');
    for (const mark of session.marks.slice(0, MOST_MARKS_LISTED)) {
        const button = element('button', `mark ${MARKS[mark.kind].name}`,
            element('time', '', clockText(mark.at, 3)), ` ${MARKS[mark.kind].title} `, element('b', '', mark.text));
        button.type = 'button';
        if (mark === current) { button.setAttribute('aria-current', 'true'); }
        button.addEventListener('click', () => choose(mark));
        list.append(element('li', '', button));
    }
    const more = session.marks.length - MOST_MARKS_LISTED;
    if (more > 0) { list.append(element('li', '', `and ${more} more on the timeline`)); }
    return list;
}

/** Fills the panel; `choose` is called with a mark that is chosen from its list. */
function showDetails(session, mark, choose) {
    const panel = document.getElementById('details');
    if (session === null) {
        panel.replaceChildren(element('p', 'hint', 'Select a session to see its summaries and marks.'));
        panel.classList.add('empty');
        return;
    }
    const parts = [element('h2', '', session.app),
        ...remarksOn(session).map((remark) => element('p', 'note', remark)),
        definitions([
            ['service type', session.service],
            ['process', session.process || '–'],
            ['reporter', session.reporter ?? '–'],
            ['session', session.name || '–'],
            ['from', momentText(session.began, 3)],
            ['to', momentText(session.ended, 3)],
            ['length', lengthText(session.ended - session.began)],
            ['messages', `${session.messages}, and ${session.summaries.length} summaries`],
            ['devices', [...session.devices].join(', ') || '–'],
        ]),
        ...summaryTables(session)];
    if (session.marks.length > 0) {
        parts.push(element('h3', '', `Marks (${session.marks.length})`), markList(session, mark, choose));
    }
    const keys = element('details', '', element('summary', '', `Payload keys (${session.keys.length})`),
        element('p', 'keys', session.keys.map((key) => report.keys[key]).join(', ')));
    const { scrollTop } = panel, isSame = panel.dataset.session === String(session.number);
    panel.classList.remove('empty');
    panel.dataset.session = session.number;
    panel.replaceChildren(...parts, keys);
    panel.scrollTop = isSame ? scrollTop : 0;
    const chosen = panel.querySelector('[aria-current]');
    if (chosen !== null) {
        const list = chosen.closest('ol');
        list.scrollTop = chosen.offsetTop - list.offsetTop - list.clientHeight / 2;
    }
}

/** The address of a capture's folder; nothing for what is no name that a capture has. */
function folderOf(event) {
    const isName = /^[A-Za-z0-9][A-Za-z0-9.+_-]*$/.test(event.capture);
    if (!isName || !event.hasFolder) { return null; }
    return report.captureFolder.split('/').map(encodeURIComponent).join('/') + encodeURIComponent(event.capture) + '/';
}

function folderCell(event) {
    const folder = folderOf(event);
    if (folder === null) { return event.capture === '' ? '–' : `${event.capture} (no longer there)`; }
    const link = element('a', '', event.capture);
    link.href = folder;
    return link;
}

function captureRow(event) {
    const row = element('tr', '', ...[momentText(event.at, 3), DEVICE_EVENTS[event.kind], event.text, folderCell(event)]
        .map((cell) => element('td', '', cell)));
    row.id = `capture-${deviceEvents.indexOf(event)}`;
    row.tabIndex = -1;
    return row;
}

/** The row of one; of the earlier ones, which are not listed, it is made when one is asked for. */
function rowOfCapture(event) {
    const body = document.querySelector('#captures tbody');
    const row = document.getElementById(`capture-${deviceEvents.indexOf(event)}`) ?? captureRow(event);
    if (!row.isConnected) { body.prepend(row); }
    return row;
}

function showCaptures() {
    const section = document.getElementById('captures');
    section.hidden = deviceEvents.length === 0;
    const made = table('captures', '', ['Time (UTC)', 'What', 'Of', 'Folder'], []);
    made.tBodies[0].append(...deviceEvents.slice(-MOST_CAPTURES_LISTED).map(captureRow));
    const earlier = Math.max(0, deviceEvents.length - MOST_CAPTURES_LISTED);
    section.querySelector('.scroll').replaceChildren(made, ...(earlier === 0 ? []
        : [element('p', 'hint', `and ${earlier} earlier ones on the timeline`)]));
}
