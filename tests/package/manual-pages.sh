#!/bin/bash
# The manual pages: mandoc finds nothing wrong, they describe the whole interface and every log line and no others, and
# their examples compile and print what the pages say.
# The command in CONTRIBUTING makes HTML of them.
# usage: manual-pages.sh SOURCE-DIRECTORY BUILD-DIRECTORY JSONCPP-INCLUDE-DIRECTORY COMPILER
# Exit status 77: skipped, for the reason printed.
set -euo pipefail
source=$1
build=$2
json=$3
compiler=$4
if ! command -v mandoc >/dev/null; then
    echo "skipped: mandoc is not installed"
    exit 77
fi
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT
status=0
export LC_ALL=C

cd "$source/man"
# The second name of a page is a symbolic link.
mapfile -t pages < <(find . -name '*.[1-9]' -type f -printf '%P\n' | sort)
mapfile -t functions < <(printf '%s\n' "${pages[@]}" | grep '\.3$')
[ ${#functions[@]} -gt 10 ]

# section PAGE TITLE: the source between this section's title and the next
section()
{
    sed -n "/^\.Sh $2\$/,/^\.Sh /p" "$1" | sed '/^\.Sh /d'
}

# plain: standard input without the escapes of mdoc; an escape that is unknown here stays, and fails later
plain()
{
    sed 's/\\e/\x01/g; s/\\-/-/g; s/\\&//g; s/\\(aq/'"'"'/g; s/\\(dq/"/g; s/\\(ha/^/g; s/\\(ti/~/g; s/\\(ga/`/g
         s/\x01/\\/g'
}

echo "What mandoc says:"
mandoc -T lint -W warning "${pages[@]}" || status=1

echo "Lines that are too long for a terminal of 80 columns:"
for page in "${pages[@]}"; do
    if mandoc -T ascii -O width=78 "$page" | sed 's/.\x08//g' | grep -E '.{81}'; then
        echo "$page"
        status=1
    fi
done

echo "References to pages of ours that there are not:"
while read -r name number; do
    if [ ! -e "$name.$number" ]; then
        echo "$name($number)"
        status=1
    fi
done < <(grep -hoE '\bXr [^ ]+ [1-9]' "${pages[@]}" | cut -d ' ' -f 2- | grep -i '^vemo\|^AccessToken' | sort -u)

echo "Pages that make no HTML by the command in CONTRIBUTING, and links between pages of ours that leave it:"
(mkdir "$dir/clone" && cd "$dir/clone" && cp -a "$source/man" . &&
    eval "$(sed -n '/^    mkdir -p build\/html/,/^    done/p' "$source/CONTRIBUTING.md")")
for page in *.[1-9]; do
    grep -q '</html>' "$dir/clone/build/html/$page.html" || { echo "$page"; status=1; }
done
grep -lE 'manpages\.debian\.org/(vemo|Vemo|VEMO|AccessToken)' "$dir"/clone/build/html/*.html && status=1

echo "Functions (< exported, or of the class that programs compile themselves; > in a SYNOPSIS):"
{
    sed -nE 's/^ (\(c\+\+\)")?([^(@]*).*@Base.*/\2/p' "$source/debian/libvemoaccesstoken6.symbols"
    sed -n '/^public:/,/^private:/p' "$source/include/AccessTokens.h" |
        sed -nE 's/^    [A-Za-z].* ([A-Za-z]+)\(.*/AccessTokens::\1/p'
} | sort >"$dir/exported"
for page in "${functions[@]}"; do
    class=${page%.3}
    grep -q "^\.Vt class $class" "$page" || class=
    section "$page" SYNOPSIS | sed -nE "s/^\.F[no] ([^ ]+).*/${class:+$class::}\1/p"
    # Each function can be looked up by its name.
    section "$page" NAME | sed -n 's/^\.Nm \([^ ]*\).*/\1/p' | while read -r name; do
        [ -e "$name.3" ] || echo "there is no page $name(3)"
    done
done | sort >"$dir/described"
diff "$dir/exported" "$dir/described" || status=1

echo "Constants and members that no page tells of:"
{
    sed -n 's/^#define \([A-Z_]*\)\b.*/Dv \1/p' "$source"/include/*.h | grep -v '_H$'
    sed -nE 's/^ +[a-z].* (m_[A-Za-z]+);.*/V[at] \1/p' "$source/include/internal/AccessTokenDbApi.h"
} | sort -u >"$dir/names"
[ "$(wc -l <"$dir/names")" -ge 7 ]
while read -r name; do
    if ! grep -qE "\b$name\b" "${functions[@]}" vemo-access-token.7; then
        echo "${name#* }"
        status=1
    fi
done <"$dir/names"

# The messages as the compiler sees them: the arguments of the functions that write lines.
"$compiler" -std=c++17 -E -P "-I$source/include" "-I$source/platform" -isystem "$json" "$source"/src/*.cpp |
    tr '\n' ' ' | grep -oE '(logFailed\(|logPrintf\() *("([^"\\]|\\.)*" *)+|"NULL == \(szSql([^"\\]|\\.)*"' |
    sed -E 's/" +"//g; s/ +$//; s/^logPrintf\( *"%s:%d (\(%s:%d\)\(%m\))?(.*[^n\\])(\\n)+"$/\2/
            s/^(logFailed\( *)?"(.*)"$/Failed [\2]/; s/\\"/"/g
            s/jParam\.isMember\("[a-z_]+"\)/jParam.isMember("FIELD")/; /^Failed \[%s\]/d' | sort -u >"$dir/messages"
[ "$(wc -l <"$dir/messages")" -gt 100 ]

# Any text may be in the place of an argument.
sed 's/[][(){}.*+?^$|\\]/\\&/g; /^Failed/!s/%[ds]/.*/g' "$dir/messages" >"$dir/patterns"
for page in "${functions[@]}" vemo-access-token.7; do
    section "$page" DIAGNOSTICS | sed -n '/^\.Bl -diag/,/^\.El/s/^\.It "\(.*\)"$/\1/p'
done | plain | sed -E 's/^[A-Za-z]+\.cpp: //; s/, err=ERROR$//' | sort -u >"$dir/lines"

echo "Log lines of the pages that the library does not write:"
grep -vxEf "$dir/patterns" "$dir/lines" && status=1
echo "Log lines that no page tells of:"
while IFS= read -r pattern; do
    grep -qxE -- "$pattern" "$dir/lines" || printf '%s\n' "$pattern"
done <"$dir/patterns" | tee "$dir/untold"
[ ! -s "$dir/untold" ] || status=1

# Each program of the examples, as PAGE-NUMBER.cpp, and what the page says that it prints, as PAGE-NUMBER.out.
for page in "${functions[@]}" vemo-access-token.7; do
    section "$page" EXAMPLES | awk -v base="$dir/${page//:/_}" '
        /^\.(Bd|Dl)/ && !told { file = "" }
        /^\.Dl/ && told { print substr($0, 5) >out; next }
        /^\.Bd/ { inside = 1; first = 1; next }
        /^\.Ed/ { inside = 0; told = 0; next }
        inside && first && /^#include/ { program = base "-" ++n; file = program ".cpp"; out = program ".out" }
        inside && first && told { file = out }
        inside { first = 0; if (file) print >file; next }
        !/^\.Pp/ { told = /[Ii]t prints/ && program }'
done
cd "$dir"
mapfile -t programs < <(find . -name '*.cpp' -printf '%P\n' | sort)
[ ${#programs[@]} -gt 10 ]
for file in "${programs[@]}" *.out; do
    plain <"$file" >text
    mv text "$file"
done

# Nothing is written to the system log.
echo 'extern "C" void syslog(int, const char*, ...) {}' >log.cc
"$compiler" -c log.cc -o log.o

# The headers that most programs begin with, parsed once.
cp -r "$source/include" headers
echo "-std=c++17 -Wall -Wextra -Werror -Iheaders -isystem '$json'" >flags
echo "-Wl,--no-as-needed '$build/examples/libredirect.so' '-Wl,-rpath,$build/examples'
    '-L$build/src' '-Wl,-rpath,$build/src' -lvemoaccesstoken -ljsoncpp" >libraries
for header in vemo-access-token.h AccessTokenUtil.h; do
    "$compiler" @flags -x c++-header "headers/$header" -o "headers/$header.gch"
done

# shellcheck disable=SC2317 # xargs calls it
# try PROGRAM: builds it, and runs it if the page says what it prints
try()
{
    "$compiler" @flags "$1.cpp" log.o -o "$1" @libraries || return
    [ -e "$1.out" ] || return 0
    mkdir "$1.database"
    VEMO_REDIRECT_DIR=$PWD/$1.database "./$1" >"$1.printed" || return
    diff "$1.out" "$1.printed"
}

echo "Examples that do not compile, or print something else (>) than the page says:"
export -f try
export compiler
printf '%s\n' "${programs[@]%.cpp}" | xargs -P "$(nproc)" -I '{}' bash -c '
    try "{}" >"{}.log" 2>&1 || { echo "{}:"; cat "{}.log"; exit 1; }' || status=1
echo "${#programs[@]} programs, of which $(find . -name '*.printed' | wc -l) were run"
exit $status
