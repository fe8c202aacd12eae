# shellcheck shell=bash disable=SC2034
# Sourced by other scripts: the releases of Debian that the project supports, and what differs between them. The
# scripts name packages as all releases do.

RELEASE=$(. /etc/os-release && echo "${VERSION_ID-none}") # this machine's
declare -A CODENAME=([12]=bookworm [13]=trixie)
declare -A JSONCPP=([12]=libjsoncpp.so.25 [13]=libjsoncpp.so.26)
# Versions of clang-format differ: this release decides. The expected instruction counts are also of this release.
REFERENCE_RELEASE=12
