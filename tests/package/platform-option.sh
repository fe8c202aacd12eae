#!/bin/bash
# Builds against a prefix with the platform's libraries (here built from the stand-ins) and checks
# that the library then uses all three from there.
# usage: platform-option.sh SOURCE-DIRECTORY COMPILER
set -euo pipefail
source=$1
compiler=$2
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

mkdir "$dir/include" "$dir/lib"
for name in plibc vemouser vemorandom; do
    cp "$source/platform/$name.h" "$dir/include"
    "$compiler" -std=c++17 -shared -fPIC "$source/platform/$name.cpp" -o "$dir/lib/lib$name.so"
done
cmake -S "$source" -B "$dir/build" -G Ninja -DCMAKE_CXX_COMPILER="$compiler" -DBUILD_TESTING=OFF \
    -DCMAKE_BUILD_TYPE=None -DVEMO_ATOKEN_TOOL=OFF -DVEMO_ATOKEN_PLATFORM="$dir" >/dev/null
cmake --build "$dir/build" --target token-life-redirected -- --quiet

undefined=$(nm -D --undefined-only -C "$dir/build/src/libvemoaccesstoken.so")
for name in PLIBCFileTouch VEMOUserGetByUID VEMOUserFree 'VEMO::RANDOM::VEMORandomBase::random'; do
    grep "U $name(" <<<"$undefined"
done
mkdir "$dir/database"
VEMO_REDIRECT_DIR=$dir/database "$dir/build/examples/token-life-redirected" | tail -n 2

# A platform may also report an unknown user by leaving the pointer unchanged.
"$compiler" -shared -fPIC -include "$dir/include/vemouser.h" -x c++ - -o "$dir/silent.so" \
    <<<'int VEMOUserGetByUID(uid_t, VEMOUser**) { return 0; }'
VEMO_REDIRECT_DIR=$dir/database LD_PRELOAD=$dir/silent.so \
    "$dir/build/examples/token-life-redirected" >"$dir/life" || true # not what its step shows
grep -A2 -F 'VemoAccessTokenGrant(' "$dir/life" | grep -F 'Failed [!pUser]'
