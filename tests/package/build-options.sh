#!/bin/bash
# The options of the build. A part that needs something missing is left out, or is an error if it was asked for. Where a
# prefix has the platform's libraries (here built from the stand-ins), the library uses all three from there.
# usage: build-options.sh SOURCE-DIRECTORY COMPILER
set -euo pipefail
source=$1
compiler=$2
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

# configure NAME OPTION...: configures the build of that name
configure()
{
    cmake -S "$source" -B "$dir/$1" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" --no-warn-unused-cli "${@:2}"
}

echo "Left out:"
configure parts -DCMAKE_DISABLE_FIND_PACKAGE_{PkgConfig,GTest,benchmark}=ON >"$dir/log"
sed -n 's/^-- Left out: //p' "$dir/log" | tee "$dir/left-out"
diff "$dir/left-out" - <<END
the tool. Missing packages: pkg-config, libbsd-dev, libmd-dev
the gate. Missing packages: pkg-config, libevent-dev, libseccomp-dev
the tests. Missing packages: libgtest-dev
END

echo "Asked for:"
for part in VEMO_ATOKEN_TOOL VEMO_ATOKEN_GATE BUILD_TESTING VEMO_ATOKEN_BENCH; do
    if configure parts -D$part=ON >"$dir/log" 2>&1; then
        echo "$part: no error"
        exit 1
    fi
    sed -n 's/^ *\(Missing packages for \)/\1/p' "$dir/log"
    configure parts -D$part=OFF >"$dir/log"
done | tee "$dir/errors"
diff "$dir/errors" - <<END
Missing packages for the tool: pkg-config, libbsd-dev, libmd-dev
Missing packages for the gate: pkg-config, libevent-dev, libseccomp-dev
Missing packages for the tests: libgtest-dev
Missing packages for the benchmarks: libbenchmark-dev
END

echo "With the platform's libraries:"
mkdir "$dir/include" "$dir/lib"
for name in plibc vemouser vemorandom; do
    cp "$source/platform/$name.h" "$dir/include"
    "$compiler" -std=c++17 -shared -fPIC "$source/platform/$name.cpp" -o "$dir/lib/lib$name.so"
done
configure platform -DBUILD_TESTING=OFF -DCMAKE_BUILD_TYPE=None -DVEMO_ATOKEN_TOOL=OFF -DVEMO_ATOKEN_PLATFORM="$dir" \
    >"$dir/log"
cmake --build "$dir/platform" --target token-life-redirected -- --quiet
undefined=$(nm -D --undefined-only -C "$dir/platform/src/libvemoaccesstoken.so")
for name in PLIBCFileTouch VEMOUserGetByUID VEMOUserFree 'VEMO::RANDOM::VEMORandomBase::random'; do
    grep "U $name(" <<<"$undefined"
done
mkdir "$dir/database"
VEMO_REDIRECT_DIR=$dir/database "$dir/platform/examples/token-life-redirected" | tail -n 2

# A platform may also report an unknown user by leaving the pointer unchanged.
"$compiler" -shared -fPIC -include "$dir/include/vemouser.h" -x c++ - -o "$dir/silent.so" \
    <<<'int VEMOUserGetByUID(uid_t, VEMOUser**) { return 0; }'
VEMO_REDIRECT_DIR=$dir/database LD_PRELOAD=$dir/silent.so \
    "$dir/platform/examples/token-life-redirected" >"$dir/life" || true # not what its step shows
grep -A2 -F 'VemoAccessTokenGrant(' "$dir/life" | grep -F 'Failed [!pUser]'
