#!/usr/bin/env bats
# stats

load common

# some_tokens: tokens of several purposes and owners, two of them expired, three without limit. Sets $size to the bytes of
# the file, and $free to its free pages: six and two digits.
some_tokens() {
    ROW="'', 0, 9999999999, 1, 0, 'VPN',  '{}', hex(zeroblob(20000))"
    rows <<'END'
a|tid = 'a', count = -1
b|tid = 'b', uid = 4000000000, deadline = 1, count = -5, function = 'Mail'
c|tid = 'c', deadline = -1
d|tid = 'd', count = -2, function = 'Web'
END
    sql "PRAGMA auto_vacuum = NONE; VACUUM; UPDATE token SET extra = '{}'"
    size=$(stat -c %s "$DB")
    free=$(sql "PRAGMA freelist_count")
}

@test "stats counts tokens by purpose and by owner, and measures the file" {
    some_tokens
    gives "STORE                     NUMBER
tokens                         4
expired                        2
unlimited uses                 3
file size in bytes        $size
free pages of 4096 bytes      $free

FUNCTION  TOKENS
VPN            2
Mail           1
Web            1

       UID  USER  TOKENS
         0  root       3
4000000000             1" stats
    gives "$output" stats -o table
    with_titles=$output
    succeeds stats --no-header
    [ "$(tr -s ' ' <<<"$output")" = "$(sed '/NUMBER$/d; /TOKENS$/d' <<<"$with_titles" | tr -s ' ')" ]
    # Expired tokens are counted, not purged.
    [ "$(sql "SELECT count(*) FROM token")" -eq 4 ]
}

@test "stats -o json and jsonl give the same" {
    some_tokens
    line="{\"expired\":2,\"file_bytes\":$size,\"free_pages\":$free,"'"functions":[{"function":"VPN","tokens":2},{"function":"Mail","tokens":1},{"function":"Web","tokens":1}],"page_bytes":4096,"tokens":4,"unlimited":3,"users":[{"tokens":3,"uid":0,"user":"root"},{"tokens":1,"uid":4000000000,"user":""}]}'
    gives "$line" stats -o jsonl
    succeeds stats --output json
    [ "${lines[0]}" = "{" ]
    [ "${lines[1]}" = '  "expired" : 2,' ]
    [ "$(tr -d ' \n' <<<"$output")" = "$line" ]
}

@test "stats of a store without tokens" {
    tool init
    succeeds stats
    [[ $output == $'STORE                     NUMBER\ntokens                         0\n'* && ${#lines[@]} -eq 6 ]]
    gives '{"expired":0,"file_bytes":16384,"free_pages":0,"functions":[],"page_bytes":4096,"tokens":0,"unlimited":0,"users":[]}' \
        stats -o jsonl
}

# labels NAME: the metrics that have this label, without the beginning that all have
labels() {
    tool stats --prometheus | sed -n "s/^vemo_access_token_[a-z]*_tokens{$1=/{$1=/p"
}

@test "stats --prometheus gives metrics" {
    some_tokens
    metrics=$(while IFS='|' read -r name help samples; do
        echo "# HELP vemo_access_token_$name $help"
        echo "# TYPE vemo_access_token_$name gauge"
        tr ';' '\n' <<<"$samples" | sed "s/^/vemo_access_token_$name/"
    done <<TABLE
tokens|Tokens in the store.| 4
expired_tokens|Tokens whose deadline has passed.| 2
unlimited_tokens|Tokens with any number of uses.| 3
database_bytes|Size of the database file.| $size
database_free_pages|Unused pages of the database file.| $free
database_page_bytes|Size of a page of the database file.| 4096
function_tokens|Tokens by the purpose they were made for.|{function="Mail"} 1;{function="VPN"} 2;{function="Web"} 1
user_tokens|Tokens by the user who owns them.|{uid="0",user="root"} 3;{uid="4000000000",user=""} 1
expiring_tokens|Tokens that expire within this time.|{within="day"} 0;{within="week"} 0
no_owner_tokens|Tokens whose owner is not a user of this machine.| 1
no_api_tokens|Tokens that open nothing.| 4
old_unlimited_tokens|Tokens with any number of uses that are older than a year.| 3
TABLE
    )
    gives "$metrics" stats --prometheus
    gives "$metrics" stats -o metrics
    # Expired tokens do not count as expiring.
    sql "UPDATE token SET webapi_allow = '{\"Api\":{\"method\":[]}}', create_time = strftime('%s', 'now') WHERE tid < 'c';
         UPDATE token SET deadline = strftime('%s', 'now') + iif(tid = 'a', 86000, 7 * 86400 - 60) WHERE tid IN ('a', 'd');
         UPDATE token SET uid = 4000000001 WHERE tid = 'a'"
    run_tool stats -o metrics
    [ "$(grep -A 99 'TYPE vemo_access_token_expiring' <<<"$output" | grep -v '#')" = 'vemo_access_token_expiring_tokens{within="day"} 1
vemo_access_token_expiring_tokens{within="week"} 2
vemo_access_token_no_owner_tokens 2
vemo_access_token_no_api_tokens 2
vemo_access_token_old_unlimited_tokens 1' ]
}

@test "what a purpose may hold is escaped in each form" {
    some_tokens
    sql "UPDATE token SET uid = 0, function = 'a\"b\\c' || char(10) || 'd' || char(9) || 'é\\n'"
    [ "$(labels function)" = $'{function="a\\"b\\\\c\\nd\té\\\\n"} 4' ]
    run_tool stats -o jsonl
    [[ $output == *'"functions":[{"function":"a\"b\\c\nd\té\\n","tokens":4}]'* ]]
    LC_ALL=C.UTF-8 run_tool stats --no-header
    [ "${lines[5]}" = 'a"b\c\x0ad\x09é\n  4' ]
}

# The collector refuses the whole file for one metric that is not valid, or that comes twice.
@test "metrics stay valid where a purpose is not valid UTF-8, and an owner is not the number of a user" {
    some_tokens
    # Two bytes that begin no character, half a surrogate pair, and a number beyond the last character.
    sql "UPDATE token SET function = CAST(CASE tid WHEN 'a' THEN x'61ff62' WHEN 'b' THEN x'61fe62' WHEN 'c' THEN x'eda080'
         ELSE x'f4908080' END AS TEXT), uid = CASE tid WHEN 'b' THEN NULL WHEN 'c' THEN 'x' ELSE 4294967296 END"
    [ "$(labels function)" = '{function="\\xed\\xa0\\x80"} 1
{function="\\xf4\\x90\\x80\\x80"} 1
{function="a\\xfeb"} 1
{function="a\\xffb"} 1' ]
    [ "$(labels uid)" = '{uid="4294967296",user=""} 2
{uid="NULL",user=""} 1
{uid="0",user="root"} 1' ]
    # Purposes that differ and read the same are one metric.
    sql "UPDATE token SET function = iif(count < 0, 'a\xff', CAST(x'61ff' AS TEXT)), uid = iif(tid = 'a', 4294967296, -1)"
    [ "$(labels function)" = '{function="a\\xff"} 4' ]
    run_tool stats -o jsonl
    [[ $output == *'"users":[{"tokens":3,"uid":-1,"user":""},{"tokens":1,"uid":4294967296,"user":""}]}' ]]
}
