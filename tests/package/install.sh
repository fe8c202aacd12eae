#!/bin/bash
# Installs the library and the tool below a prefix of their own, and builds and runs README's example
# with them.
# usage: install.sh BUILD-DIRECTORY JSONCPP-INCLUDE-DIRECTORY README COMPILER...
set -euo pipefail
build=$1
json=$2
readme=$3
source=$(dirname "$readme")
shift 3
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

cmake --install "$build" --prefix "$dir/usr" >"$dir/log"
library=$(find "$dir/usr" -name libvemoaccesstoken.so.6.0.0)
libdir=$(dirname "$library")
include=$dir/usr/include/vemo-access-token
[ "$(readlink "$libdir/libvemoaccesstoken.so.6")" = libvemoaccesstoken.so.6.0.0 ]
[ "$(readlink "$libdir/libvemoaccesstoken.so")" = libvemoaccesstoken.so.6 ]

echo "The installed headers:"
(cd "$include" && find . -type f | LC_ALL=C sort) | tee "$dir/headers"
diff "$dir/headers" - <<END
./AccessTokenApi.h
./AccessTokenDefine.h
./AccessTokenUtil.h
./AccessTokens.h
./CallLock.h
./internal/AccessTokenDbApi.h
./vemo-access-token.h
END
compile=("$@" -std=c++17 -Wall -Wextra -Wpedantic -Werror "-I$include" -isystem "$json")
while read -r header; do
    echo "#include \"$header\"" >"$dir/alone.cpp"
    "${compile[@]}" -fsyntax-only "$dir/alone.cpp"
done <"$dir/headers"

echo "The installed tool, where root has it in the path and where others do:"
LD_LIBRARY_PATH=$libdir "$dir/usr/sbin/vemo-access-token" --version
[ "$(LD_LIBRARY_PATH=$libdir "$dir/usr/bin/vemo-access-token" generate | wc -c)" -gt 127 ]

echo "The installed manual pages and completions:"
(cd "$dir/usr/share" && find . ! -type d | LC_ALL=C sort) | tee "$dir/shared"
(cd "$source/man" && find . -name '*.[3578]' | sed -E 's,\./(.*)\.([3578])$,./man/man\2/\1.\2,'
    printf '%s\n' ./bash-completion/completions/vemo-access-token ./zsh/site-functions/_vemo-access-token \
        ./fish/vendor_completions.d/vemo-access-token.fish) | LC_ALL=C sort | diff "$dir/shared" -

echo "The example of README:"
sed -n '/^```cpp$/,/^```$/p' "$readme" | grep -v '^```' >"$dir/example.cpp"
# The redirection is linked ahead of the library rather than preloaded: where it cannot be found the
# program does not start, instead of working on the real database.
"${compile[@]}" "$dir/example.cpp" -o "$dir/example" -Wl,--no-as-needed "$build/examples/libredirect.so" \
    "-Wl,-rpath,$build/examples" "-L$libdir" "-Wl,-rpath,$libdir" -lvemoaccesstoken -ljsoncpp
mkdir "$dir/database"
VEMO_REDIRECT_DIR=$dir/database "$dir/example" | tee "$dir/output"
grep -xE '    (granted on behalf of user 0|the token is deleted)' "$readme" | sed 's/^ *//' | diff "$dir/output" -
