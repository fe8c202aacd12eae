# shellcheck shell=bash
# Sourced by the other scripts: installs what is missing of the Debian packages named to it.

install_packages()
{
    local package missing=() sudo=()
    for package in "$@"; do
        # A package can be installed for several architectures: one line for each.
        if ! dpkg-query -W -f '${db:Status-Status}\n' "$package" 2>/dev/null | grep -qx installed; then
            missing+=("$package")
        fi
    done
    [ ${#missing[@]} -eq 0 ] && return
    if [ "$(id -u)" -ne 0 ]; then
        if ! command -v sudo >/dev/null; then
            echo "$0: packages are missing and there is no sudo. As root, run:" >&2
            echo "    apt-get install --no-install-recommends ${missing[*]}" >&2
            exit 1
        fi
        sudo=(sudo)
    fi
    echo "Installing ${missing[*]}"
    "${sudo[@]}" apt-get update -q=2
    "${sudo[@]}" env DEBIAN_FRONTEND=noninteractive \
        apt-get install -q=2 --no-install-recommends -o Dpkg::Use-Pty=0 "${missing[@]}" >/dev/null
}

# shellcheck disable=SC2034 # for those who source this
{
    BUILD_PACKAGES=(g++ cmake ninja-build pkg-config libjsoncpp-dev libsqlite3-dev libsmartcols-dev
        libbsd-dev)
    TEST_PACKAGES=(libgtest-dev valgrind bats sqlite3 tzdata python3-pexpect mandoc bash-completion zsh fish doxygen)
    CLANG_PACKAGES=(clang libclang-rt-14-dev)
    BENCH_PACKAGES=(libbenchmark-dev)
    PEER_PACKAGES=(libhiredis-dev libpq-dev) # to build what measures Redis and PostgreSQL
}
