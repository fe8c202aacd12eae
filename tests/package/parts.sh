#!/bin/bash
# A part of the build that needs something missing is left out, or is an error if it was asked for.
# usage: parts.sh SOURCE-DIRECTORY COMPILER
set -euo pipefail
source=$1
compiler=$2
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

configure()
{
    cmake -S "$source" -B "$dir/build" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" --no-warn-unused-cli "$@"
}

echo "Left out:"
configure -DCMAKE_DISABLE_FIND_PACKAGE_{PkgConfig,GTest,benchmark}=ON >"$dir/log"
sed -n 's/^-- Left out: //p' "$dir/log" | tee "$dir/left-out"
diff "$dir/left-out" - <<END
the tool. Missing packages: pkg-config, libbsd-dev, libmd-dev
the gate. Missing packages: pkg-config, libevent-dev, libseccomp-dev
the tests. Missing packages: libgtest-dev
END

echo "Asked for:"
for part in VEMO_ATOKEN_TOOL VEMO_ATOKEN_GATE BUILD_TESTING VEMO_ATOKEN_BENCH; do
    if configure -D$part=ON >"$dir/log" 2>&1; then
        echo "$part: no error"
        exit 1
    fi
    sed -n 's/^ *\(Missing packages for \)/\1/p' "$dir/log"
    configure -D$part=OFF >"$dir/log"
done | tee "$dir/errors"
diff "$dir/errors" - <<END
Missing packages for the tool: pkg-config, libbsd-dev, libmd-dev
Missing packages for the gate: pkg-config, libevent-dev, libseccomp-dev
Missing packages for the tests: libgtest-dev
Missing packages for the benchmarks: libbenchmark-dev
END
