#!/usr/bin/env bats
# revoke

load common

NO_TABLE_END='has no table of tokens; "vemo-access-token doctor --repair" makes it'
WAYS="say which tokens: by TID, by options that select, or --all"

# [uid=N] [sid=SID] [function=TAG] a_row TID: a token, written behind the tool's back
a_row()
{
    [ -e "$DB" ] || tool init >/dev/null
    sql "INSERT INTO token VALUES ('$1', '${sid-}', ${uid-0}, 9999999999, 1, 0, '${function-VPN}', '{}', '{}')"
}

# expect_left TID...: the tokens that are there still, in order
expect_left()
{
    [ "$(sql "SELECT tid FROM token ORDER BY tid" | xargs)" = "$*" ]
}

# Tokens of two users, purposes and sessions.
six_tokens()
{
    tool init >/dev/null
    sql "INSERT INTO token VALUES
         ('aaaaaaaa', 's1', 0,    9999999999, 1, 0, 'VPN',  '{}', '{}'),
         ('bbbbbbbb', 's2', 0,    9999999999, 1, 0, 'VPN',  '{}', '{}'),
         ('cccccccc', 's1', 1000, 9999999999, 1, 0, 'VPN',  '{}', '{}'),
         ('dddddddd', 's2', 1000, 9999999999, 1, 0, 'Mail', '{}', '{}'),
         ('eeeeeeee', 's1', 1000, 9999999999, 1, 0, 'Mail', '{}', '{}'),
         ('ffffffff', '',   1000, 9999999999, 1, 0, 'it''s', '{}', '{}')"
}

# on_terminal PROMPT KEYS COMMAND...: runs it on a terminal, where KEYS are typed when PROMPT shows
on_terminal()
{
    run /usr/bin/python3 -c '
import pexpect, sys
prompt, keys = sys.argv[1:3]
child = pexpect.spawn(sys.argv[3], sys.argv[4:], timeout=30, dimensions=(24, 200))
child.delaybeforesend = None
child.delayafterclose = child.ptyproc.delayafterclose = 0.001
shown = b""
if prompt:
    child.expect_exact(prompt)
    shown = child.before + child.after
    child.send(keys)
child.expect(pexpect.EOF)
child.wait()
sys.stdout.buffer.write((shown + child.before).replace(b"\r\n", b"\n"))
sys.exit(128 + child.signalstatus if child.signalstatus else child.exitstatus)' "$@"
}

@test "revoke deletes the tokens of ids, each once, and says how many" {
    six_tokens
    run_tool revoke aaaaaaaa
    expect 0 "1 token revoked"
    expect_left bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
    run_tool revoke bbbbbbbb dddddddd bbbbbbbb
    expect 0 "2 tokens revoked"
    expect_left cccccccc eeeeeeee ffffffff
}

@test "revoke is idempotent" {
    local tid other
    tid=$(a_token)
    other=$(a_token)
    run_tool revoke "$tid"
    expect 0 "1 token revoked"
    run_tool revoke "$tid"
    expect 0 "0 tokens revoked" "vemo-access-token: 1 id is unknown"
    expect_left "$other"
    run_tool revoke "$tid" "$other" "$tid"
    expect 0 "1 token revoked" "vemo-access-token: 2 ids are unknown"
    run_tool revoke --all --yes
    expect 0 "0 tokens revoked"
    run_tool revoke --function VPN --yes
    expect 0 "0 tokens revoked"
}

@test "revoke takes prefixes of 8 characters or more, and whole ids whatever their length" {
    a_row Abcdefgh1
    a_row Abcdefgh2
    a_row abcdefgh1
    a_row Xbcdefgh
    a_row Xbcdefghi
    a_row short
    a_row "-begins-with-a-dash"
    run_tool revoke abcdefgh
    expect 0 "1 token revoked"
    run_tool revoke Abcdefgh2 Abcdefgh2
    expect 0 "1 token revoked"
    run_tool revoke Xbcdefgh # which is an id as well as a prefix
    expect 0 "1 token revoked"
    run_tool revoke short
    expect 0 "1 token revoked"
    run_tool revoke -- -begins-
    expect 0 "1 token revoked"
    expect_left Abcdefgh1 Xbcdefghi
    # A prefix matches as it is written.
    local prefix
    for prefix in Abcdefg% Abcdefg_ "Abcdefg'" 'Abcdefg*' ABCDEFGH bcdefgh1 Abcdefgh11; do
        run_tool revoke "$prefix"
        expect 0 "0 tokens revoked" "vemo-access-token: 1 id is unknown"
    done
    expect_left Abcdefgh1 Xbcdefghi
}

@test "an ambiguous or too short prefix revokes nothing, not even the others" {
    a_row Abcdefgh1
    a_row Abcdefgh2
    a_row Other789
    run_tool revoke Other789 Abcdefgh
    expect 2 "" 'vemo-access-token: TID: several tokens begin with "Abcdefgh"; give more of the id'
    run_tool revoke Other789 Abcdefg
    expect 2 "" 'vemo-access-token: TID: "Abcdefg" is too short: give the id or its first 8 characters, or more'
    run_tool revoke Other789 ""
    expect 2 "" "vemo-access-token: TID: the id is empty"
    run_tool revoke --dry-run Other789 Abcdefgh
    expect 2 "" 'vemo-access-token: TID: several tokens begin with "Abcdefgh"; give more of the id'
    expect_left Abcdefgh1 Abcdefgh2 Other789
}

@test "- reads ids from standard input, one on each line" {
    six_tokens
    run_tool revoke - <<<"aaaaaaaa"
    expect 0 "1 token revoked"
    run_tool revoke cccccccc - < <(printf '\nbbbbbbbb\n\n\ndddddddd')
    expect 0 "3 tokens revoked"
    expect_left eeeeeeee ffffffff
    # What was listed can be nothing.
    run_tool revoke - < <(tool list --show-ids --field tid --expired 2>/dev/null)
    expect 0 "0 tokens revoked" "vemo-access-token: no token matches"
    run_tool revoke --dry-run - </dev/null
    expect 0 "0 tokens would be revoked" "vemo-access-token: no token matches"
    run_tool revoke - - < <(printf 'ffffffff\nunknown1\nunknown2\n')
    expect 0 "1 token revoked" "vemo-access-token: 2 ids are unknown"
    run_tool revoke - < <(printf 'eeeeeeee\0x\n')
    expect 2 "" "vemo-access-token: TID: an id on standard input holds a NUL byte"
    expect_left eeeeeeee
}

@test "- asks for an id on a terminal and does not show it" {
    six_tokens
    on_terminal "Token id: " $'aaaaaaaa\n' "$TOOL" revoke -
    [ "$status" -eq 0 ]
    [ "$output" = $'Token id: \n1 token revoked' ]
    on_terminal "Token id: " $'\n' "$TOOL" revoke -
    [ "$status" -eq 0 ]
    [ "$output" = $'Token id: \n0 tokens revoked\nvemo-access-token: no token matches' ]
    expect_left bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "selectors choose the tokens, and those that fit all of several" {
    local selectors left
    six_tokens
    cp "$DB" "$DIR/six"
    while IFS='|' read -r selectors left; do
        cp "$DIR/six" "$DB"
        eval "run_tool revoke --yes $selectors"
        local expected="$(sqlite3 "$DIR/six" "SELECT count(*) FROM token") $(sql "SELECT count(*) FROM token")"
        local revoked=$((${expected% *} - ${expected#* }))
        expect 0 "$revoked token$([ $revoked = 1 ] || echo s) revoked"
        expect_left $left
    done <<'TABLE'
--uid 0|cccccccc dddddddd eeeeeeee ffffffff
--user root|cccccccc dddddddd eeeeeeee ffffffff
--function VPN|dddddddd eeeeeeee ffffffff
--function "it's"|aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee
--function vpn|aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
--bind-sid s1|bbbbbbbb dddddddd ffffffff
--bind-sid s2 --function VPN|aaaaaaaa cccccccc dddddddd eeeeeeee ffffffff
--uid 1000 --function Mail --bind-sid s1|aaaaaaaa bbbbbbbb cccccccc dddddddd ffffffff
--function VPN --created-before @1 --opens Api|aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
--function VPN --created-before @1|dddddddd eeeeeeee ffffffff
--uid 0 --function Mail|aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
--all|
TABLE
}

@test "a script's empty variable does not revoke what belongs to no session" {
    six_tokens
    run_tool revoke --yes --bind-sid ""
    expect 2 "" "vemo-access-token: --bind-sid: must not be empty"
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "--dry-run tells how many, asks nothing and changes nothing" {
    local arguments number
    six_tokens
    sql "UPDATE token SET uid = 4294967294 WHERE tid = 'aaaaaaaa'; UPDATE token SET count = -1 WHERE tid = 'bbbbbbbb';
         UPDATE token SET deadline = 5 WHERE tid = 'cccccccc';
         UPDATE token SET deadline = strftime('%s', 'now') + 1000 WHERE tid = 'dddddddd'"
    cp "$DB" "$DIR/six"
    while IFS='|' read -r arguments number; do
        run_tool revoke $arguments
        expect 0 "$number would be revoked" "$([[ $arguments != *unknown* ]] || echo "vemo-access-token: 1 id is unknown")"
    done <<'TABLE'
--dry-run aaaaaaaa|1 token
--dry-run aaaaaaaa bbbbbbbb unknown-|2 tokens
--dry-run unknown-|0 tokens
--dry-run --uid 1000|4 tokens
--dry-run --function Mail --bind-sid s1|1 token
--dry-run --opens Api|0 tokens
--dry-run --no-owner --uid 4294967294|1 token
--dry-run --no-owner --uid 0|0 tokens
--dry-run --unlimited|1 token
--dry-run --expired|1 token
--dry-run --expiring 1h|1 token
--dry-run --created-before @1|6 tokens
--dry-run --created-after @1|0 tokens
--dry-run --all|6 tokens
--dry-run --yes --all|6 tokens
TABLE
    cmp "$DB" "$DIR/six"
}

@test "where there is nobody to ask, revoking many needs --yes" {
    six_tokens
    local arguments
    for arguments in "--all" "--uid 0" "--user root" "--function VPN" "--bind-sid s1" "--bind-sid unknown"; do
        run_tool revoke $arguments
        expect 2 "" "vemo-access-token: repeat with --yes: there is nobody to ask"
    done
    # Both what is asked and what is answered need the terminal.
    on_terminal "" "" bash -c '"$0" revoke --all </dev/null' "$TOOL"
    [ "$status" -eq 2 ]
    on_terminal "" "" bash -c '"$0" revoke --all 2>/dev/null' "$TOOL"
    [ "$status" -eq 2 ]
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "on a terminal, revoking many asks first" {
    local answer
    six_tokens
    for answer in $'n\n' $'\n' $'yesterday\n'; do
        on_terminal "[y/N] " "$answer" "$TOOL" revoke --uid 0
        [ "$status" -eq 0 ]
        [ "$output" = "Revoke 2 tokens? [y/N] ${answer}0 tokens revoked" ]
    done
    on_terminal "[y/N] " $'\x04' "$TOOL" revoke --uid 0 # end of file
    [ "$status" -eq 0 ]
    [[ $output == *"0 tokens revoked" ]]
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff

    on_terminal "[y/N] " $'y\n' "$TOOL" revoke --uid 0
    [ "$status" -eq 0 ]
    [ "$output" = $'Revoke 2 tokens? [y/N] y\n2 tokens revoked' ]
    on_terminal "[y/N] " $'yes\n' "$TOOL" revoke --function "it's"
    [ "$status" -eq 0 ]
    [ "$output" = $'Revoke 1 token? [y/N] yes\n1 token revoked' ]
    expect_left cccccccc dddddddd eeeeeeee

    # Nothing is asked for nothing, with --yes, or for named tokens.
    on_terminal "" "" "$TOOL" revoke --uid 0
    [ "$output" = "0 tokens revoked" ]
    on_terminal "" "" "$TOOL" revoke cccccccc
    [ "$output" = "1 token revoked" ]
    on_terminal "" "" "$TOOL" revoke --all --yes
    [ "$output" = "2 tokens revoked" ]
    expect_left
}

@test "an interrupt at the question revokes nothing" {
    six_tokens
    on_terminal "[y/N] " $'\x03' "$TOOL" revoke --all
    [ "$status" -eq 130 ]
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "revoke purges nothing" {
    a_row aaaaaaaa
    sql "INSERT INTO token SELECT 'expired-', bind_sid, uid, 1, count, 0, function, '{}', '{}' FROM token"
    run_tool revoke aaaaaaaa
    expect 0 "1 token revoked"
    expect_left expired-
    run_tool revoke expired-
    expect 0 "1 token revoked"
}

@test "revoke needs one way of saying which tokens" {
    six_tokens
    local arguments
    for arguments in "" "--yes" "--dry-run" "aaaaaaaa --all" "aaaaaaaa --uid 0" "--all --function VPN --yes"; do
        run_tool revoke $arguments
        expect 2 "" "vemo-access-token: $WAYS"
    done
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "bad arguments of revoke end in a sentence that names them" {
    six_tokens
    local arguments sentence
    while IFS='|' read -r arguments sentence; do
        eval "run_tool revoke --yes $arguments"
        expect 2 "" "vemo-access-token: $sentence"
    done <<'TABLE'
--uid abc|--uid: "abc" is not a number from 0 to 4294967294
--uid ""|--uid: "" is not a number from 0 to 4294967294
--uid -1|--uid: "-1" is not a number from 0 to 4294967294
--uid 4294967295|--uid: "4294967295" is not a number from 0 to 4294967294
--uid "0 or 1=1"|--uid: "0 or 1=1" is not a number from 0 to 4294967294
--user no-such-user|--user: there is no user "no-such-user"
--user root --uid 0|--user excludes --uid
--nonsense|unknown option "--nonsense"
TABLE
    expect_left aaaaaaaa bbbbbbbb cccccccc dddddddd eeeeeeee ffffffff
}

@test "revoke never takes an unusable store for an empty one" {
    local arguments
    for arguments in "aaaaaaaa" "--all --yes" "--dry-run aaaaaaaa" "--dry-run --all"; do
        run_tool revoke $arguments
        expect 4 "" "vemo-access-token: there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        run_tool revoke $arguments
        expect 4 "" "vemo-access-token: there is no database $REAL_DB; \"vemo-access-token init\" makes it"
        [ ! -e "$DB" ]
        : >"$DB"
        run_tool revoke $arguments
        expect 4 "" "vemo-access-token: $REAL_DB $NO_TABLE_END"
        [ ! -s "$DB" ]
        echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
        cp "$DB" "$DIR/text"
        run_tool revoke $arguments
        expect 4 "" "vemo-access-token: $REAL_DB is not a token database, or is damaged (file is not a database)"
        cmp "$DB" "$DIR/text"
        rm -r "$VEMO_REDIRECT_DIR"
    done
}
