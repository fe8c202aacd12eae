#!/usr/bin/env bats
# purge

load common

# purges NUMBER: so many tokens; before that, --dry-run prints how many, and changes nothing
purges() {
    cp "$DB" "$DIR/before"
    gives "$1 would be purged" purge --dry-run
    cmp "$DB" "$DIR/before"
    gives "$1 purged" purge
}

@test "purge deletes the tokens whose deadline has passed, whatever uses they have left, and says how many" {
    rows <<'END'
kept
kept-for-a-minute|deadline = strftime('%s', 'now') + 60
END
    purges "0 tokens"
    row minus-one "deadline = -1"
    purges "1 token"
    rows <<'END'
zero|deadline = 0
least|deadline = -9223372036854775808, count = 5
just-passed|deadline = strftime('%s', 'now') - 1, count = -1
END
    purges "3 tokens"
    expect_left kept kept-for-a-minute
}

# What a command prints about the store must be on the disk. If this is not certain, the command fails.
@test "what a command shows outlasts a power cut, also when others changed it" {
    ID=$(a_token --allow Api:get)
    while read -r arguments; do
        VEMO_TEST_SYNC=directory fails 4 \
            "$REAL_DIRECTORY: Input/output error; a power cut can undo what others changed last" $arguments
    done < <(calls | grep -E -- '^(list|show|check|stats|export|import .*none|purge)|--dry-run' &&
        printf '%s\n' "revoke unknown-" "update unknown- --uses 2")
}

@test "purge gives back the space of the tokens that it deletes" {
    tool init
    size=$(stat -c %s "$DB")
    many_rows 100 "deadline = 1, extra = hex(zeroblob(1000))"
    [ "$(stat -c %s "$DB")" -gt 200000 ]
    gives "100 tokens purged" purge
    [ "$(stat -c %s "$DB")" -eq "$size" ]
}
