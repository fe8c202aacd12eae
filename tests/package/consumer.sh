#!/bin/bash
# Installs the build below a prefix of its own, and builds and runs a program outside of the tree against
# that, found once by pkg-config and once by CMake; and installs it into a staging directory.
# A project that takes this one in installs nothing of it.
# usage: consumer.sh BUILD-DIRECTORY SOURCE-DIRECTORY COMPILER
set -euo pipefail
build=$1
source=$2
compiler=$3
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

cmake --install "$build" --prefix "$dir/usr" >"$dir/log"
libdir=$(dirname "$(find "$dir/usr" -name libvemoaccesstoken.so)")

run()
{
    local expected="the life of a token: ok"
    mkdir "$dir/database"
    # Preloaded, the redirection is found before the library's own calls.
    LD_LIBRARY_PATH=$libdir LD_PRELOAD=$build/examples/libredirect.so VEMO_REDIRECT_DIR=$dir/database \
        "$1" >"$dir/output"
    rm -r "$dir/database"
    diff - "$dir/output" <<<"$expected"
}

echo "Found by pkg-config:"
export PKG_CONFIG_PATH=$libdir/pkgconfig
pkg-config --print-errors --exists 'vemo-access-token >= 6'
[ "$(pkg-config --print-requires vemo-access-token)" = jsoncpp ]
flags=$(pkg-config --cflags --libs vemo-access-token)
echo "$flags"
# shellcheck disable=SC2086 # several flags
"$compiler" -std=c++17 "$source/tests/package/consumer/main.cpp" -o "$dir/by-pkg-config" $flags
run "$dir/by-pkg-config"

echo "Found by CMake:"
cmake -S "$source/tests/package/consumer" -B "$dir/consumer" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" \
    -DCMAKE_PREFIX_PATH="$dir/usr" >"$dir/log"
grep -q "VemoAccessToken_DIR:PATH=$dir/usr" "$dir/consumer/CMakeCache.txt"
cmake --build "$dir/consumer" -- --quiet
run "$dir/consumer/consumer"

echo "Another major version is refused:"
sed 's/VemoAccessToken 6/VemoAccessToken 7/' "$source/tests/package/consumer/CMakeLists.txt" >"$dir/CMakeLists.txt"
if cmake -S "$dir" -B "$dir/refused" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" -DCMAKE_PREFIX_PATH="$dir/usr" \
    >"$dir/log" 2>&1
then
    exit 1
fi
grep 'version: 6' "$dir/log"

echo "Installed into a staging directory, the same files:"
DESTDIR=$dir/stage cmake --install "$build" --prefix /usr >"$dir/log"
diff <(cd "$dir/usr" && find . | LC_ALL=C sort) <(cd "$dir/stage/usr" && find . | LC_ALL=C sort)
if grep -rl "$dir" "$dir/stage" --include='*.cmake' --include='*.pc'; then
    echo "These files name the directory that they were installed to."
    exit 1
fi

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
