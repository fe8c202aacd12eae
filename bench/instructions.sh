#!/bin/bash
# Counts the instructions of each operation with callgrind and compares them with a baseline. So a change
# that makes a call more expensive is found on any machine, however busy it is.
# usage: instructions.sh PROGRAM BASELINE [--update]
#   --update   writes the counts to BASELINE
# Exit status 77: skipped, for the reason printed.
set -euo pipefail
program=$(realpath "$1")
baseline=$(realpath "$2")
mode=${3-}

# By how many per cent a count may differ from the baseline's: the count of all instructions of a call,
# and that of the library's own, outside of sqlite3_open, sqlite3_exec and sqlite3_close. The counts of
# one build differ by 0.02 % at most. The rest is for changes that move memory on the heap, and for
# other patch levels of compiler and libraries.
tolerance_total=2
tolerance_own=1

# Two things that the C library would choose by itself. It uses the functions on strings and memory
# that every x86-64 processor can run. And malloc does not join or divide the small pieces that it gets
# back: that work would depend on all earlier calls.
functions=-AVX2,-AVX_Fast_Unaligned_Load,-ERMS,-Fast_Unaligned_Load,-SSE4_2,-SSSE3
tunables=glibc.cpu.hwcaps=$functions:glibc.malloc.tcache_count=65535

skip()
{
    echo "skipped: $1"
    exit 77
}

# The environment without the last numbers of versions, which should make no difference. jsoncpp keeps
# them, because the library spends most of its own time there.
comparable()
{
    sed -E '/^jsoncpp/! s/([0-9]+\.[0-9]+)\.[0-9]+.*/\1/'
}

[ "$(uname -m)" = x86_64 ] || skip "the counts are those of x86-64 processors"
valgrind=$(command -v valgrind) || skip "valgrind is missing"
[ -w /dev/shm ] || skip "there is no /dev/shm"

# In memory, and with a name of the same length everywhere, since SQLite handles the path.
dir=$(mktemp -d /dev/shm/vemo-instructions-XXXXXX)
trap 'rm -rf "$dir"' EXIT

"$program" --environment >"$dir/environment"
if [ "$mode" != --update ]; then
    if [ ! -s "$baseline" ]; then
        echo "$baseline is missing"
        exit 1
    fi
    difference=$(diff <(sed -n 's/^#   //p' "$baseline" | comparable) <(comparable <"$dir/environment")) ||
        skip "the baseline is of another compiler or other libraries"$'\n'"< the baseline's, > these"$'\n'"$difference"
fi

env -i LD_BIND_NOW=1 GLIBC_TUNABLES=$tunables VEMO_BENCH_MEMORY="$dir" \
    "$valgrind" --command-line-only=yes -q --vgdb=no --tool=callgrind --combine-dumps=yes \
    --callgrind-out-file="$dir/parts" "$program"

# A part's summary is exact. Its "totals" are not: they include some earlier instructions.
awk '
    /^desc: Trigger: / { who = /Client Request/ ? $NF : "" }
    /^summary: / && who != "" {
        if (who == "sqlite") {
            sqlite += $2
        } else if (who != "stand-in") {
            own += $2
        }
        if (who !~ /^(own|sqlite|stand-in)$/) {
            print who, own + sqlite, own
            own = sqlite = 0
        }
    }' "$dir/parts" >"$dir/counts"

if [ "$mode" = --update ]; then
    {
        echo "# Instructions of one call of each operation: all, and the library's own."
        echo "# Written by instructions.sh --update, with"
        sed 's/^/#   /' "$dir/environment"
        awk '{ printf "%-18s %8d %8d\n", $1, $2, $3 }' "$dir/counts"
    } | tee "$baseline"
    exit
fi

# An operation that only one side has gets a 0 on the other side.
export LC_ALL=C
join -a 1 -a 2 -e 0 -o 0,1.2,2.2,1.3,2.3 <(sort "$dir/counts") <(grep -v '^#' "$baseline" | sort) | awk \
    -v tolerance_total=$tolerance_total -v tolerance_own=$tolerance_own '
    # The columns of one count; "!" marks it as out of tolerance.
    function compare(count, expected, tolerance,    difference, mark)
    {
        difference = expected ? 100 * (count - expected) / expected : 100
        mark = " "
        if (difference < -tolerance || difference > tolerance) {
            failed = 1
            mark = "!"
        }
        return sprintf("%9d %9d %+8.2f %%%s", count, expected, difference, mark)
    }
    BEGIN { print "operation              total  baseline difference        own  baseline difference" }
    { printf "%-18s%s%s\n", $1, compare($2, $3, tolerance_total), compare($4, $5, tolerance_own) }
    END {
        print "tolerance: " tolerance_total " % of the total, " tolerance_own " % of the own"
        if (failed) {
            print "FAILED: where the changes (!) are meant to be, make them the baseline with --update"
        }
        exit failed
    }'
