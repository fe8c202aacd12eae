# shellcheck shell=bash disable=SC2034
# Sourced: the releases of Debian that the project is for, and what differs between them. Packages are asked for by
# names that all of them have.

RELEASE=$(. /etc/os-release && echo "${VERSION_ID-none}") # this machine's
declare -A CODENAME=([12]=bookworm [13]=trixie)
declare -A JSONCPP=([12]=libjsoncpp.so.25 [13]=libjsoncpp.so.26)
# Versions of clang-format lay out differently: that of this release decides. The baseline of the instruction counts
# is of this release too.
REFERENCE_RELEASE=12
