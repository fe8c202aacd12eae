#!/usr/bin/env node
// Asks the gate: grant.js API METHOD, with the token's id on standard input. Prints the token's user and ends with 0.
// Ends with 1 if the call is refused, and with 2 if there is no answer.
const socketPath = process.env.GATE_SOCKET || '/run/vemo-access-token-gate/calls.sock';
const id = require('fs').readFileSync(0, 'utf8').trim();
const path = '/grant/' + process.argv.slice(2, 4).map(encodeURIComponent).join('/');

function end(status, text) {
    (status ? console.error : console.log)(text);
    process.exitCode = status;
}

require('http').get({ socketPath, path, timeout: 3000, headers: { Authorization: `Bearer ${id}` } }, (answer) => {
    answer.resume();
    if (answer.statusCode === 200) end(0, decodeURIComponent(answer.headers['x-token-user']));
    else if ([401, 403].includes(answer.statusCode)) end(1, 'refused');
    else end(2, 'no answer');
}).on('timeout', function () { this.destroy(); }).on('error', () => end(2, 'no answer'));
