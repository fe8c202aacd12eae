#!/usr/bin/env bats
# revoke, except for its questions on a terminal

load common

# Tokens of two users, purposes and sessions.
six_tokens() {
    rows <<'END'
aaaaaaaa|bind_sid = 's1', create_time = 0
bbbbbbbb|bind_sid = 's2', create_time = 0
cccccccc|bind_sid = 's1', create_time = 0, uid = 65534
dddddddd|bind_sid = 's2', create_time = 0, uid = 65534, function = 'Mail'
eeeeeeee|bind_sid = 's1', create_time = 0, uid = 65534, function = 'Mail'
ffffffff|create_time = 0, uid = 65534, function = 'it''s'
END
}

@test "revoke deletes the tokens of ids, each once, and says how many; expired ones stay" {
    six_tokens
    row expired- "deadline = 1"
    gives "1 token revoked" revoke aaaaaaaa
    gives "2 tokens revoked" revoke bbbbbbbb dddddddd bbbbbbbb
    expect_left cccccccc eeeeeeee expired- ffffffff
    says "0 tokens revoked" "1 id is unknown" revoke aaaaaaaa
    says "1 token revoked" "2 ids are unknown" revoke aaaaaaaa expired- bbbbbbbb
    gives "3 tokens revoked" revoke --all --yes
    gives "0 tokens revoked" revoke --all --yes
    gives "0 tokens revoked" revoke --function VPN --yes
}

@test "revoke takes ids as show does, also twice" {
    tool init
    for tid in Abcdefgh1 Abcdefgh2 Xbcdefgh Xbcdefghi -begins-with-a-dash; do
        row "$tid" "tid = '$tid'"
    done
    gives "1 token revoked" revoke Abcdefgh2 Abcdefgh2
    gives "1 token revoked" revoke Xbcdefgh # it is both an id and a prefix
    gives "1 token revoked" revoke -- -begins-
    says "0 tokens revoked" "1 id is unknown" revoke Abcdefgh11
    expect_left Abcdefgh1 Xbcdefghi
}

@test "- reads ids from standard input, one on each line" {
    six_tokens
    gives "1 token revoked" revoke - <<<"aaaaaaaa"
    gives "3 tokens revoked" revoke cccccccc - < <(printf '\nbbbbbbbb\n\n\ndddddddd')
    expect_left eeeeeeee ffffffff
    # A list can be empty.
    says "0 tokens revoked" "no token matches" revoke - < <(tool list --show-ids --field tid --expired 2>/dev/null)
    says "0 tokens would be revoked" "no token matches" revoke --dry-run - </dev/null
    says "1 token revoked" "2 ids are unknown" revoke - - < <(printf 'ffffffff\nunknown1\nunknown2\n')
    # Another program has the database open, but no token was revoked, so none can come back: the tool does not look
    # for such programs, which would fail here.
    export VEMO_TEST_CALLS="opendir /proc/|12"
    says "0 tokens revoked" "1 id is unknown" revoke unknown1 8<"$DB"
    gives "0 tokens revoked" revoke --function none --yes 8<"$DB"
    unset VEMO_TEST_CALLS
    expect_left eeeeeeee
}

@test "options select the tokens that fit all of them; --dry-run says how many, and changes nothing" {
    six_tokens
    sql "UPDATE token SET uid = 4294967294 WHERE tid LIKE 'a%'; UPDATE token SET count = -1 WHERE tid LIKE 'b%';
         UPDATE token SET deadline = 5 WHERE tid LIKE 'c%';
         UPDATE token SET deadline = strftime('%s', 'now') + 1000 WHERE tid LIKE 'd%'"
    cp "$DB" "$DIR/six"
    while IFS='|' read -r selectors revoked; do
        cp "$DIR/six" "$DB"
        number="${#revoked} token$([ ${#revoked} = 1 ] || echo s)"
        eval "gives '$number would be revoked' revoke --dry-run $selectors"
        cmp "$DB" "$DIR/six"
        eval "gives '$number revoked' revoke --yes $selectors"
        left=abcdef
        left=${left//["$revoked "]/}
        expect_left ${left//?/&&&&&&&& }
    done <<'TABLE'
--uid 0|b
--function "it's"|f
--bind-sid s2|bd
--opens Api|abcdef
--no-owner|a
--unlimited|b
--expired|c
--expiring 1h|d
--created-before @1|abcdef
--created-after @1|
--uid 65534 --function Mail --bind-sid s1|e
--user root --created-before @1 --opens Other|
--all|abcdef
TABLE
    cp "$DIR/six" "$DB"
    says "0 tokens would be revoked" "1 id is unknown" revoke --dry-run unknown-
    says "2 tokens would be revoked" "1 id is unknown" revoke --dry-run eeeeeeee ffffffff unknown-
}
