#!/usr/bin/env bats
# Every character there is: escaped where it cannot be seen, and kept where texts come through as they are

load common

@test "every character is shown or escaped as Unicode has it, and none is lost" {
    export LC_ALL=C.UTF-8
    visible=$BATS_TEST_DIRNAME/visible.py
    "$visible" all >"$DIR/all"
    row token---
    sql "UPDATE token SET function = CAST(readfile('$DIR/all') AS TEXT)"
    for arguments in "list --no-header" "list -o jsonl"; do
        tool $arguments 2>"$DIR/errors" >"$DIR/out"
        "$visible" compare <"$DIR/out"
    done
    # What goes to programs keeps a byte that is no UTF-8.
    sql "UPDATE token SET function = function || CAST(x'9b' AS TEXT)"
    printf '\x9b\n' >>"$DIR/all"
    tool list --field function | cmp - "$DIR/all"
    tool export "$DIR/lines" 2>"$DIR/errors"
    tool revoke --all --yes
    tool import "$DIR/lines"
    tool list --field function | cmp - "$DIR/all"
}
