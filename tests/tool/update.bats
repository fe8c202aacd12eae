#!/usr/bin/env bats
# update

load common

ROW="'session-1', 0, 9999999999, 5, 1000000000, 'VPN', '{\"Api\":{\"method\":[\"get\"]}}', '{\"n\":[1,\"ü\"]}'"

@test "each option changes its field, and no other" {
    columns="bind_sid, uid, deadline, count, create_time, function, webapi_allow, extra"
    echo '{"file":1}' >"$DIR/extra"
    while IFS='|' read -r arguments set; do
        rm -rf "$VEMO_REDIRECT_DIR"
        rows <<<"token---
likewise|$set
another-
unchanged"
        eval "gives '1 token updated' update token--- $arguments"
        [ "$(sql "SELECT count(*) FROM (SELECT $columns FROM token WHERE substr(tid, 1, 1) IN ('t', 'l') GROUP BY $columns)
                  UNION ALL SELECT count(*) FROM (SELECT $columns FROM token WHERE substr(tid, 1, 1) IN ('a', 'u')
                  GROUP BY $columns)" | xargs)" = "1 1" ]
    done <<'END'
--uses 9223372036854775807|count = 9223372036854775807
--unlimited|count = -1
--deadline @9000000000|deadline = 9000000000
--bind-sid session-2|bind_sid = 'session-2'
--bind-sid ''|bind_sid = ''
--allow Other:put|webapi_allow = '{"Other":{"method":["put"]}}'
--add-allow Api:put|webapi_allow = '{"Api":{"method":["get","put"]}}'
--remove-allow Api|webapi_allow = '{}'
--extra '{"b": 1, "a": 2}'|extra = '{"a":2,"b":1}'
--extra '{}'|extra = '{}'
--extra @"$DIR/extra"|extra = '{"file":1}'
--note ''|
--note 'of mine'|extra = '{"n":[1,"ü"],"note":"of mine"}'
--extra '{"b":1,"note":2}' --note 'it''s'|extra = '{"b":1,"note":"its"}'
--extra '{"b":1,"note":2}' --note ''|extra = '{"b":1}'
--uses 5|
--uses 2 --bind-sid s --deadline 2060-01-01Z --add-allow B --extra '{}'|count = 2, bind_sid = 's', deadline = 2840140800, webapi_allow = '{"Api":{"method":["get"]},"B":{"method":[]}}', extra = '{}'
END
}

@test "a name with a wildcard or a blank is taken, with a warning" {
    row token---
    says "1 token updated" '--allow: "*" stands for this name alone: "*" is no wildcard' update token--- --allow 'Api:*'
    says "1 token updated" '--add-allow: "B c" holds a blank, which is part of the name' update token--- --add-allow 'B c'
    [ "$(sql "SELECT webapi_allow FROM token")" = '{"Api":{"method":["*"]},"B c":{"method":[]}}' ]
}

# A malformed value stays as it is, and cannot be changed in part.
@test "what a token opens can be replaced, extended and reduced" {
    malformed="what the token opens is malformed and cannot be changed in part; replace it with --allow"
    row token---
    while IFS='|' read -r stored arguments result; do
        sql "UPDATE token SET webapi_allow = '$stored'"
        run_tool update token--- $arguments
        if [ "$result" ]; then
            expect 0 "1 token updated"
        else
            expect 2 "" "vemo-access-token: $malformed"
        fi
        [ "$(sql "SELECT webapi_allow FROM token")" = "${result:-$stored}" ]
    done <<'END'
{"A":{"method":["m"]}}|--allow B --allow C:x,y --allow C:z,x|{"B":{"method":[]},"C":{"method":["x","y","z"]}}
{"A":{"method":["m"]}}|--add-allow B|{"A":{"method":["m"]},"B":{"method":[]}}
{"A":{"method":["m"]}}|--add-allow B:x --add-allow B:y|{"A":{"method":["m"]},"B":{"method":["x","y"]}}
{"A":{"method":["m"]}}|--add-allow A:n,m,l|{"A":{"method":["m","n","l"]}}
{"A":{"method":["m"]}}|--add-allow A|{"A":{"method":["m"]}}
{"A":{"method":["m"],"note":1}}|--add-allow A:n|{"A":{"method":["m","n"],"note":1}}
{"A":{"method":["m","n"]},"B":{"method":[]}}|--remove-allow A|{"B":{"method":[]}}
{"A":{"method":["m","n"]},"B":{"method":[]}}|--remove-allow A --remove-allow B|{}
{"A":{"method":["m","n","o"]}}|--remove-allow A:o,m|{"A":{"method":["n"]}}
{"A":{"method":["m","n","m"]}}|--remove-allow A:m|{"A":{"method":["n"]}}
{"A":{"method":["m"],"note":1}}|--remove-allow A:m|{"A":{"method":[],"note":1}}
{"A":{"method":["m"]}}|--remove-allow A:m --add-allow A:n|{"A":{"method":["n"]}}
{"A":1,"B":{"method":["m"]}}|--add-allow B:n --add-allow C|{"A":1,"B":{"method":["m","n"]},"C":{"method":[]}}
{"A":1,"B":{"method":["m"]}}|--remove-allow B:m|{"A":1,"B":{"method":[]}}
{"A":1,"B":{"method":["m"]}}|--remove-allow A|{"B":{"method":["m"]}}
{"A":1}|--add-allow A:m|
{"A":1}|--remove-allow A:m|
{"A":{"method":"m"}}|--add-allow A:n|
["A"]|--add-allow B|
no JSON|--allow A|{"A":{"method":[]}}
END
}

@test "damaged fields that are not named stay as they are" {
    row token--- "extra = 'no JSON', webapi_allow = '{\"Api\":{\"method\":[\"get\"'"
    gives "1 token updated" update token--- --uses 7 --ttl 1h --bind-sid s
    [ "$(sql "SELECT count, bind_sid, extra, webapi_allow FROM token")" = '7|s|no JSON|{"Api":{"method":["get"' ]
}

@test "update takes an id as show does, and where there is no such token, says so and changes nothing" {
    row token---
    before=$(state)
    fails 3 "there is no such token" update unknown- --unlimited --ttl 1h
    fails 3 "there is no such token" update - --unlimited <<<"token---${ZEROS}0"
    [ "$(state)" = "$before" ]
    gives "1 token updated" update - --uses 7 <<<token---
    gives 7 show token--- --field count
}

@test "an update that a trigger undoes each time fails" {
    row token---
    sql "CREATE TRIGGER t UPDATE ON token BEGIN SELECT RAISE(IGNORE); END"
    fails 4 "$REAL_DB itself undoes each change: a trigger does that; \"vemo-access-token doctor\" tells what helps" \
        update token--- --bind-sid x
}

@test "what a token does not list cannot be removed, and no deadline lies in the past" {
    row token---
    refuses update token--- <<'END'
--remove-allow Other|--remove-allow: the token does not list "Other"
--remove-allow Other:get|--remove-allow: the token does not list "Other"
--remove-allow Api:get,put|--remove-allow: the token does not list "Api:put"
--remove-allow Api --remove-allow Api|--remove-allow: the token does not list "Api"
--uses 9 --add-allow More --remove-allow Other|--remove-allow: the token does not list "Other"
END
    for time in @0 @1000000000 2020-01-01 2020-01-01Z "2020-01-01 12:00" 1969-12-31 0060-01-01; do
        refuses update token--- <<<"--deadline '$time'|--deadline: \"$time\" has passed; to take the token back, revoke it"
    done
}

@test "update purges nothing, and says that the token has expired unless it is given time" {
    row expired- "deadline = 5"
    row another- "deadline = -1"
    says "1 token updated" "the token has expired; the next call of a program purges it,\
 unless --ttl or --deadline give it time" update expired- --uses 7
    [ "$(sql "SELECT substr(tid, 1, 8), deadline, count FROM token ORDER BY tid")" = "another-|-1|5
expired-|5|7" ]
    now=$(date +%s)
    gives "1 token updated" update expired- --ttl 1w2d
    [ "$(sql "SELECT deadline - 777600 BETWEEN $now AND $(date +%s) FROM token WHERE tid LIKE 'expired%'")" = 1 ]
    gives "1 token updated" update another- --deadline 2060-01-01
    gives allowed check expired- Api get
}

@test "--note changes the note alone, and malformed data stay as they are" {
    row token--- "extra = '{\"a\":[1.5,\"ü\"],\"note\":{}}'"
    gives "1 token updated" update token--- --note $'"new"\n'
    [ "$(sql "SELECT extra FROM token")" = '{"a":[1.5,"ü"],"note":"\"new\"\n"}' ]
    [ "$(tool list --columns note -o csv --no-header)" = $'"""new""\n"' ]
    gives "1 token updated" update token--- --note ""
    [ "$(sql "SELECT extra FROM token")" = '{"a":[1.5,"ü"]}' ]
    for stored in '' '[]' null '{"a":1'; do
        sql "UPDATE token SET extra = '$stored'"
        fails 2 "the data of the token are malformed and cannot hold a note; replace them with --extra" \
            update token--- --note x
        [ "$(sql "SELECT extra FROM token")" = "$stored" ]
        tool update token--- --note x --extra '{}'
        [ "$(sql "SELECT extra FROM token")" = '{"note":"x"}' ]
    done
}
