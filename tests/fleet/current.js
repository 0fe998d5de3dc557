// Carries statements out on the engine of the package chdb: each line of standard input is one, as JSON, and is answered
// by a line, the text of its result or of what was wrong.
const { createRequire } = require('node:module');
const readline = require('node:readline');

const [, , modules, place] = process.argv;
const { Session } = createRequire(`${modules}/`)('chdb');
const session = new Session(place);
readline.createInterface({ input: process.stdin }).on('line', (line) => {
    let answer;
    try {
        answer = { found: session.query(JSON.parse(line), 'JSONCompact') };
    } catch (problem) {
        answer = { problem: String(problem) };
    }
    process.stdout.write(`${JSON.stringify(answer)}\n`);
}).on('close', () => process.exit(0));
