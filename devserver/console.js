// Fills the console with what GET /dev/clients and GET /dev/log answer, and keeps it current.
//
// Names and messages come from whoever talks to the server. They reach the page as text nodes only.
'use strict';

const kRefresh_ms = 3000;
const kTimeLimit_ms = 10000;
const kEnglish = 'enu';

// What shows nothing itself, or turns the text around it. Lines and columns may be.
const kUnseen = /((?![\n\t])[\p{Cc}\p{Cf}\p{Cs}\p{Zl}\p{Zp}])/u;

// What a description's members are called, in the order in which they are shown; the name is the
// heading.
const kLabels = new Map([
    ['host', 'Address'],
    ['sn', 'Serial number'],
    ['model', 'Model'],
    ['nvo_version', 'Version'],
    ['build_number', 'Build'],
    ['http_port', 'HTTP port'],
    ['https_port', 'HTTPS port'],
    ['id', 'Earlier id'],
]);

const byId = (id) => document.getElementById(id);
const picker = byId('language');
const state = byId('state');

// What the page shows: the answers as they came, and what they say.
let answers = [];
let clients = [];
let log = [];
let asking = false;

function element(name, attributes, ...children) {
    const made = document.createElement(name);
    for (const [key, value] of Object.entries(attributes)) {
        made.setAttribute(key, value);
    }
    made.append(...children);
    return made;
}

// A foreign value as nodes; an unseen character is shown by its number.
function foreign(value) {
    const text = typeof value === 'string' ? value : JSON.stringify(value);
    return text.split(kUnseen).map((part, i) => {
        const number = i % 2 ? part.codePointAt(0).toString(16).toUpperCase() : '';
        return number ? element('span', { class: 'unseen' }, 'U+' + number.padStart(4, '0')) : part;
    });
}

// Text of an unknown direction does not change the order of what stands beside it.
function foreignElement(name, attributes, value) {
    return element(name, { dir: 'auto', ...attributes }, ...foreign(value));
}

function counted(count, singular, plural) {
    return count + ' ' + (count === 1 ? singular : plural);
}

function appliance({ id, description }) {
    const known = [...kLabels.keys()].filter((key) => Object.hasOwn(description, key));
    const others = Object.keys(description).filter((key) => key !== 'name' && !kLabels.has(key));
    const facts = element('dl', {}, element('dt', {}, 'Number'), element('dd', {}, String(id)));
    for (const key of [...known, ...others]) {
        const label = kLabels.has(key) ? [kLabels.get(key)] : foreign(key);
        facts.append(element('dt', {}, ...label), foreignElement('dd', {}, description[key]));
    }
    return element('li', {}, foreignElement('h3', {}, description.name || description.sn), facts);
}

function optionOf(language) {
    return [...picker.options].find((option) => option.value === language);
}

function timeOf(seconds) {
    const date = new Date(seconds * 1000);
    if (Number.isNaN(date.getTime())) {
        return element('span', {}, String(seconds));
    }
    const text = date.toLocaleString('en-GB', { dateStyle: 'medium', timeStyle: 'medium' });
    return element('time', { datetime: date.toISOString() }, text);
}

// In the picked language, else in English, else in the first that there is.
function entry({ happen_time, level, username, log, extra_info }) {
    const wanted = [picker.value, kEnglish, ...Object.keys(log)];
    const language = wanted.find((code) => Object.hasOwn(log, code));
    const made = element(
        'li',
        {},
        element(
            'div',
            { class: 'facts' },
            element('span', { class: 'level ' + level }, level),
            timeOf(happen_time),
            foreignElement('span', {}, username),
        ),
        foreignElement('p', { class: 'message', lang: optionOf(language)?.lang ?? '' }, log[language]),
    );
    if (language !== picker.value) {
        const missing = optionOf(picker.value);
        const name = element('span', { lang: missing.lang }, missing.text);
        made.append(element('p', { class: 'quiet' }, 'The entry has no text in ', name, '.'));
    }
    if (extra_info) {
        made.append(foreignElement('p', { class: 'extra quiet', lang: '' }, extra_info));
    }
    return made;
}

// Text that stays the same is not set again: a screen reader would say it each time.
function say(text, failed) {
    state.classList.toggle('failed', failed);
    if (state.textContent !== text) {
        state.textContent = text;
    }
}

// The newest entry stands first.
function draw() {
    byId('appliances').replaceChildren(...clients.map(appliance));
    byId('entries').replaceChildren(...log.map(entry).reverse());
}

async function ask(path) {
    const answer = await fetch(path, { signal: AbortSignal.timeout(kTimeLimit_ms) });
    if (!answer.ok) {
        throw new Error('status ' + answer.status);
    }
    return answer.text();
}

// Draws only what is new: a text that somebody reads or has marked stays as it is.
function show(newest) {
    if (newest.some((answer, i) => answer !== answers[i])) {
        answers = newest;
        [clients, log] = answers.map((answer) => JSON.parse(answer));
        draw();
    }
    byId('no-appliances').hidden = clients.length > 0;
    byId('no-entries').hidden = log.length > 0;
    const joined = counted(clients.length, 'appliance', 'appliances');
    say(joined + ', ' + counted(log.length, 'log entry', 'log entries'), false);
}

async function refresh() {
    if (asking || document.hidden) {
        return;
    }
    asking = true;
    try {
        show(await Promise.all(['/dev/clients', '/dev/log'].map(ask)));
    } catch {
        say('The server does not answer. What is shown may be old.', true);
    } finally {
        asking = false;
    }
}

picker.value = new URLSearchParams(location.search).get('language') ?? kEnglish;
if (picker.selectedIndex < 0) {
    picker.value = kEnglish;
}
picker.addEventListener('change', () => {
    history.replaceState(null, '', '?language=' + picker.value);
    draw();
});
document.addEventListener('visibilitychange', refresh);
setInterval(refresh, kRefresh_ms);
refresh();
