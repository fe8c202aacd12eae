#!/bin/bash
# Installs the build below a prefix of its own, and builds and runs programs outside of the tree against that: README's
# example, found by pkg-config, and the life of tokens, found by CMake. Installs it into a staging directory, too.
# A project that includes this one installs nothing of it.
# usage: install.sh BUILD-DIRECTORY SOURCE-DIRECTORY JSONCPP-INCLUDE-DIRECTORY COMPILER
set -euo pipefail
build=$1
source=$2
json=$3
compiler=$4
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

cmake --install "$build" --prefix "$dir/usr" >"$dir/log"
library=$(find "$dir/usr" -name libvemoaccesstoken.so.6.0.0)
libdir=$(dirname "$library")
export LD_LIBRARY_PATH=$libdir PKG_CONFIG_PATH=$libdir/pkgconfig
[ "$(readlink "$libdir/libvemoaccesstoken.so.6")" = libvemoaccesstoken.so.6.0.0 ]
[ "$(readlink "$libdir/libvemoaccesstoken.so")" = libvemoaccesstoken.so.6 ]

echo "The installed headers:"
include=$dir/usr/include/vemo-access-token
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
compile=("$compiler" -std=c++17 -Wall -Wextra -Wpedantic -Werror)
while read -r header; do
    echo "#include \"$header\"" >"$dir/alone.cpp"
    "${compile[@]}" "-I$include" -isystem "$json" -fsyntax-only "$dir/alone.cpp"
done <"$dir/headers"

echo "The installed tool, where root has it in the path and where others do:"
"$dir/usr/sbin/vemo-access-token" --version
[ "$("$dir/usr/bin/vemo-access-token" generate | wc -c)" -gt 127 ]

echo "The installed manual pages and completions:"
(cd "$dir/usr/share" && find . ! -type d | LC_ALL=C sort) | tee "$dir/shared"
(cd "$source/man" && find . -name '*.[3578]' | sed -E 's,\./(.*)\.([3578])$,./man/man\2/\1.\2,'
    printf '%s\n' ./bash-completion/completions/vemo-access-token ./zsh/site-functions/_vemo-access-token \
        ./fish/vendor_completions.d/vemo-access-token.fish) | LC_ALL=C sort | diff "$dir/shared" -

# Preloaded, the redirection is found before the library's own calls.
run()
{
    mkdir "$dir/database"
    LD_PRELOAD=$build/examples/libredirect.so VEMO_REDIRECT_DIR=$dir/database "$1" >"$dir/output"
    [ -e "$dir/database/vemo-access-token.db" ]
    rm -r "$dir/database"
}

echo "The example of README, found by pkg-config:"
pkg-config --print-errors --exists 'vemo-access-token >= 6'
[ "$(pkg-config --print-requires vemo-access-token)" = jsoncpp ]
read -ra flags < <(pkg-config --cflags --libs vemo-access-token)
echo "${flags[*]}"
# shellcheck disable=SC2016 # the marks of README
sed -n '/^```cpp$/,/^```$/p' "$source/README.md" | grep -v '^```' >"$dir/example.cpp"
"${compile[@]}" "$dir/example.cpp" -o "$dir/example" "${flags[@]}"
run "$dir/example"
grep -xE '    (granted on behalf of user 0|the token is deleted)' "$source/README.md" | sed 's/^ *//' |
    diff "$dir/output" -

echo "A program found by CMake:"
consumer=$source/tests/package/consumer
cmake -S "$consumer" -B "$dir/consumer" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" -DCMAKE_PREFIX_PATH="$dir/usr" \
    >"$dir/log"
grep -q "VemoAccessToken_DIR:PATH=$dir/usr" "$dir/consumer/CMakeCache.txt"
cmake --build "$dir/consumer" -- --quiet
run "$dir/consumer/consumer" || { cat "$dir/output"; exit 1; }

echo "Another major version is refused:"
sed 's/VemoAccessToken 6/VemoAccessToken 7/' "$consumer/CMakeLists.txt" >"$dir/CMakeLists.txt"
! cmake -S "$dir" -B "$dir/refused" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" -DCMAKE_PREFIX_PATH="$dir/usr" \
    >"$dir/log" 2>&1 || exit 1
grep 'version: 6' "$dir/log"

echo "Installed into a staging directory, the same files:"
DESTDIR=$dir/stage cmake --install "$build" --prefix /usr >"$dir/log"
diff <(cd "$dir/usr" && find . | LC_ALL=C sort) <(cd "$dir/stage/usr" && find . | LC_ALL=C sort)
echo "Files that name the directory that they were installed to:"
! grep -rl "$dir" "$dir/stage" --include='*.cmake' --include='*.pc' || exit 1

echo "A project that takes this one in, unless it asks:"
cat >"$dir/CMakeLists.txt" <<'END'
cmake_minimum_required(VERSION 3.25)
project(taker LANGUAGES CXX)
include(FetchContent)
FetchContent_Declare(vemoaccesstoken SOURCE_DIR ${SOURCE})
FetchContent_MakeAvailable(vemoaccesstoken)
install(FILES CMakeLists.txt DESTINATION own)
END
cmake -S "$dir" -B "$dir/taker" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" -DSOURCE="$source" >"$dir/log"
cmake --install "$dir/taker" --prefix "$dir/taken"
(cd "$dir/taken" && find . -type f) | diff - <(echo ./own/CMakeLists.txt)
