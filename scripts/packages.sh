# shellcheck shell=bash
# Sourced by the other scripts: installs the Debian packages that they need and that are missing. A script says with
# need() what it needs and for what.

missing=()  # packages
purposes=() # lines "PURPOSE: PACKAGE..." of the missing packages

# need PURPOSE PACKAGE...
need()
{
    local purpose=$1 package new=()
    shift
    for package in "$@"; do
        # A package can be installed for several architectures; each has a line.
        if [[ " ${missing[*]} " != *" $package "* ]] &&
            ! dpkg-query -W -f '${db:Status-Status}\n' "$package" 2>/dev/null | grep -qx installed; then
            new+=("$package")
        fi
    done
    [ ${#new[@]} -eq 0 ] || purposes+=("$purpose: ${new[*]}")
    missing+=("${new[@]}")
}

# size_of PACKAGE...: prints how much apt would fetch and write, with all dependencies
size_of()
{
    apt-get install --simulate --no-install-recommends "$@" | awk '/^Inst / { print $2 }' |
        xargs apt-cache show --no-all-versions |
        awk '/^Size:/ { bytes += $2 } /^Installed-Size:/ { kilobytes += $2 }
            END { printf "%.1f MB to fetch, %.1f MB on the disk\n", bytes / 1e6, kilobytes / 1e3 }'
}

# install_needed TIME: says how long the script takes on two cores if all packages are there, and which are missing,
# and installs those. On a terminal it asks first.
install_needed()
{
    echo "This takes $1."
    [ ${#missing[@]} -gt 0 ] || return 0
    local purpose answer=y sudo=()
    if [ "$(id -u)" -ne 0 ]; then
        if ! command -v sudo >/dev/null; then
            echo "$0: packages are missing and there is no sudo. As root, run:" >&2
            echo "    apt-get install --no-install-recommends ${missing[*]}" >&2
            exit 1
        fi
        sudo=(sudo)
    fi
    "${sudo[@]}" apt-get update -q=2 # or apt knows no packages
    echo "Packages are missing:"
    for purpose in "${purposes[@]}"; do
        # shellcheck disable=SC2086 # several packages
        echo "  $purpose ($(size_of ${purpose#*: }))"
    done
    echo "Together: $(size_of "${missing[@]}")."
    if [ -t 0 ]; then
        read -r -p "Install them? [Y/n] " answer
        if [[ ${answer:-y} != [Yy]* ]]; then
            echo "$0: nothing was installed." >&2
            exit 1
        fi
    fi
    "${sudo[@]}" env DEBIAN_FRONTEND=noninteractive \
        apt-get install -q=2 --no-install-recommends -o Dpkg::Use-Pty=0 "${missing[@]}" >/dev/null
}

# shellcheck disable=SC2034 # for the scripts that source this
{
    BUILD_PACKAGES=(g++ cmake ninja-build pkg-config libjsoncpp-dev libsqlite3-dev libbsd-dev
        libmd-dev libevent-dev libseccomp-dev)
    UNIT_TEST_PACKAGES=(libgtest-dev)
    TEST_PACKAGES=(valgrind bats sqlite3 tzdata python3 python3-pexpect mandoc bash-completion zsh fish curl
        nginx-light caddy openssl)
    CLANG_PACKAGES=(clang libclang-rt-dev lld)
    BENCH_PACKAGES=(libbenchmark-dev)
    PEER_PACKAGES=(libhiredis-dev libpq-dev) # to build what measures Redis and PostgreSQL
}
