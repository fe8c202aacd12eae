#!/usr/bin/env bats
# grant

load common

ROW="'session-1', 0, 9999999999, 5, 1000000000, 'VPN',
     '{\"Api\":{\"method\":[\"get\",\"list\"]},\"Bare\":{\"method\":[]}}', '{\"n\":[0.5,\"ü\"]}'"

# all_tokens: all fields of all tokens
all_tokens() {
    sql "SELECT * FROM token ORDER BY tid"
}

# uses: the uses that each token has left
uses() {
    sql "SELECT substr(tid, 1, 8), count FROM token ORDER BY tid" | xargs
}

@test "a grant spends one use and changes nothing else; the last one deletes the token, and 0 is a last use like 1" {
    rows <<'END'
token---
most----|count = 9223372036854775807
last----|count = 1
none----|count = 0
endless-|count = -1
lowest--|count = -9223372036854775808
another-
END
    all_tokens >"$DIR/before"
    gives granted grant "token---$ZEROS" Api get
    gives granted grant "most----$ZEROS" Api list
    gives granted grant "endless-$ZEROS" Api get
    gives granted grant "lowest--$ZEROS" Api get
    sql "UPDATE token SET count = count + 1 WHERE tid LIKE 'token%' OR tid LIKE 'most%'"
    all_tokens | diff "$DIR/before" -
    for name in last---- none----; do
        gives granted grant "$name$ZEROS" Api get
        fails 1 "refused: unknown token" grant "$name$ZEROS" Api get
    done
    # Without a method, too.
    for arguments in Bare Api "Api ''" "Api get"; do
        eval "gives granted grant 'token---$ZEROS' $arguments"
    done
    [ "$(uses)" = "another-|5 endless-|-1 lowest--|-9223372036854775808 most----|9223372036854775807 token---|1" ]
}

@test "a grant needs the whole id, which may come from standard input" {
    row token---
    refusal="refused: unknown token; a grant needs the whole id"
    for tid in token--- "token---${ZEROS%0}" t; do
        fails 1 "$refusal" grant "$tid" Api get
        fails 1 "$refusal" grant - Api get <<<"$tid"
    done
    [ "$(uses)" = "token---|5" ]
    gives granted grant - Api get <<<"token---$ZEROS"
    gives root grant - Api get --print-user < <(printf '\n%s' "token---$ZEROS")
    [ "$(uses)" = "token---|3" ]
    fails 1 "refused: unknown token" grant - Api get < <(printf '%0100000d' 0)
}

@test "a grant purges expired tokens, also when it refuses, and says when the token has expired" {
    rows <<'END'
token---
past----|deadline = strftime('%s') - 5, count = -1
never---|deadline = -1
soon----|deadline = strftime('%s') + 600
END
    gives granted grant "token---$ZEROS" Api get
    [ "$(uses)" = "soon----|5 token---|4" ]
    row zero---- "deadline = 0"
    fails 1 "refused: method not listed" grant "token---$ZEROS" Api put
    [ "$(uses)" = "soon----|5 token---|4" ]
    row expired- "deadline = strftime('%s') - 5"
    fails 1 "refused: expired" grant "expired-$ZEROS" Api get
    [ "$(uses)" = "soon----|5 token---|4" ]
    fails 1 "refused: unknown token" grant "expired-$ZEROS" Api get
}

@test "--print-user prints the owner's name; an owner without a name is a failure after the use was spent" {
    rows <<'END'
root----
nobody--|uid = 65534, count = 1
unnamed-|uid = 4294967294
END
    gives root grant "root----$ZEROS" Api get --print-user
    gives nobody grant --print-user "nobody--$ZEROS" Api
    fails 4 "granted, but there is no user of the number 4294967294" grant "unnamed-$ZEROS" Api get --print-user
    gives granted grant "unnamed-$ZEROS" Api get
    [ "$(uses)" = "root----|4 unnamed-|3" ]
}

@test "a grant gives JSON, with the token as it was, but for its id" {
    row token---
    for form in json jsonl; do
        record=$(tool show token--- -o jsonl | sed "s/\"tid\":\"[^\"]*\",//")
        gives "{\"granted\":true,\"reason\":\"\",\"token\":$record}" grant "token---$ZEROS" Api get -o $form
    done
    record=${record/:4,/:3,}
    gives "{\"granted\":true,\"reason\":\"\",\"token\":$record,\"user\":\"root\"}" \
        grant "token---$ZEROS" Api get -o json --print-user
    ends 1 '{"granted":false,"reason":"method not listed"}' grant "token---$ZEROS" Api put -o json --print-user
    ends 1 '{"granted":false,"reason":"unknown token"}' grant token--- Api get -o json
    [ "$(uses)" = "token---|2" ]
    VEMO_TEST_LOOKUP=5 fails 4 "granted, but the user of the number 0 could not be looked up: Input/output error" \
        grant "token---$ZEROS" Api -o json --print-user
    # The last use shows the token, too.
    gives "{\"granted\":true,\"reason\":\"\",\"token\":${record/:3,/:1,}}" grant "token---$ZEROS" Api get -o json
    [ "$(uses)" = "" ]
}
