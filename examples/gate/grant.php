#!/usr/bin/php
<?php
// Asks the gate: grant.php API METHOD, with the token's id on standard input. Prints the token's user and ends with 0.
// Ends with 1 if the call is refused, and with 2 if there is no answer. Needs the extension curl.
$user = '';
$gate = curl_init('http://gate/grant/' . rawurlencode($argv[1]) . '/' . rawurlencode($argv[2]));
curl_setopt_array($gate, [
    CURLOPT_UNIX_SOCKET_PATH => getenv('GATE_SOCKET') ?: '/run/vemo-access-token-gate/calls.sock',
    CURLOPT_HTTPHEADER => ['Authorization: Bearer ' . trim(fgets(STDIN))],
    CURLOPT_TIMEOUT => 3,
    CURLOPT_RETURNTRANSFER => true,
    CURLOPT_HEADERFUNCTION => function ($gate, $line) use (&$user) {
        if (stripos($line, 'X-Token-User:') === 0) {
            $user = rawurldecode(trim(substr($line, strlen('X-Token-User:'))));
        }
        return strlen($line);
    },
]);
curl_exec($gate);
$status = curl_getinfo($gate, CURLINFO_RESPONSE_CODE);
if ($status === 200) {
    echo "$user\n";
    exit(0);
}
$refused = in_array($status, [401, 403], true);
fwrite(STDERR, $refused ? "refused\n" : "no answer\n");
exit($refused ? 1 : 2);
