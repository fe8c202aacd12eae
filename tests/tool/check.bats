#!/usr/bin/env bats
# check, and grant where it must give the same answer

load common

@test "check says whether a call would be granted, and why not; it spends and purges nothing" {
    rows <<'END'
token---|webapi_allow = '{"Äpi":{"method":["list","-x","a b","\u001b\n"]},"Bare":{"method":[]},"create":{"method":[]}}'
expired-|deadline = strftime('%s') - 5
never---|deadline = -1
none----|count = 0
many----|count = 9223372036854775807
endless-|count = -1
END
    before=$(state)
    while IFS='|' read -r arguments result; do
        eval "run_tool check $arguments" </dev/null
        if [ "$result" = allowed ]; then
            expect 0 allowed
        else
            expect 1 "refused: $result"
        fi
    done <<END
token---$ZEROS Äpi list|allowed
token--- Äpi 'a b'|allowed
token--- Äpi \$'\e\n'|allowed
-- token--- Äpi -x|allowed
token--- Äpi|allowed
token--- Bare|allowed
- create <<<token---|allowed
token--- Äpi put|method not listed
token--- Äpi list,a|method not listed
token--- Bare get|method not listed
token--- create create|method not listed
token--- äpi list|API not listed
token--- Other|API not listed
expired- Api get|expired
expired- Other|expired
never--- Api get|expired
unknown- Api get|unknown token
none---- Api get|allowed
many---- Api get|allowed
endless- Api get|allowed
END
    [ "$(state)" = "$before" ]
}

# What a token opens counts for list --opens as it does for a grant, which reads the data as well.
@test "a refused grant says why, as check does, and spends nothing; malformed data are reported where the call reads them" {
    tool init
    while IFS='~' read -r columns arguments result; do
        sql "DELETE FROM token"
        row token--- "count = 5, $columns"
        before=$(sql "SELECT * FROM token")
        succeeds list --epoch
        succeeds show token---
        [[ $result == allowed ]] && opening=1 || opening=0
        [[ $columns == extra* ]] || gives $opening list --count --opens "${arguments/ /:}"
        if [ "$result" = allowed ]; then
            gives allowed check token--- $arguments
            gives granted grant "token---$ZEROS" $arguments
            [ "$(sql "SELECT count IN (-1, 4) FROM token")" != 0 ]
        else
            ends 1 "refused: $result" check token--- $arguments
            fails 1 "refused: $result" grant "token---$ZEROS" $arguments
            fails 1 "refused: $result" grant --print-user "token---$ZEROS" $arguments
            [ "$(sql "SELECT * FROM token")" = "$before" ]
        fi
    done <<TABLE
uid = 0~Api put~method not listed
uid = 0~Other~API not listed
webapi_allow = ''~Api get~malformed token
webapi_allow = '["Api"]'~Api get~malformed token
webapi_allow = '{"Api":1,"Bare":{"method":["get"]}}'~Api get~malformed token
webapi_allow = '{"Api":1,"Bare":{"method":["get"]}}'~Api~allowed
webapi_allow = '{"Api":1,"Bare":{"method":["get"]}}'~Bare get~allowed
webapi_allow = '{"Api": {"method": ["pu'~Api get~method not listed
webapi_allow = '{"Api": {"method": ["get",{},"list"]}}'~Api get~allowed
webapi_allow = '{"Api": {"method": ["get",{},"list"]}}'~Api list~malformed token
webapi_allow = '{"Api": $(printf '[%.0s' {1..2000})'~Api get~malformed token
extra = 'no JSON'~Api get~malformed token
extra = '[]'~Api get~malformed token
extra = '[]'~Other get~API not listed
extra = '[]', count = -1~Api get~allowed
extra = '[]', count = 1~Api get~allowed
TABLE
}

@test "-o json and jsonl give the answer as an object" {
    row token---
    for form in json jsonl; do
        gives '{"allowed":true,"reason":""}' check token--- Api get -o $form
        ends 1 '{"allowed":false,"reason":"method not listed"}' check token--- Api put --output=$form
        ends 1 '{"allowed":false,"reason":"unknown token"}' check unknown-token Api -o $form
    done
    gives allowed check token--- Api get -o table
}
