#!/bin/bash
# The API reference: the target docs makes it without a warning, it tells something of each exported
# function and of each member, and a name without a comment fails the target.
# usage: reference.sh SOURCE-DIRECTORY
set -euo pipefail
source=$1
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

configure()
{
    cmake -S "$source" -B "$dir/build" -G Ninja -DBUILD_TESTING=OFF -DVEMO_ATOKEN_TOOL=OFF "$@" >"$dir/configure.log"
}

echo "Without Doxygen:"
configure -DCMAKE_DISABLE_FIND_PACKAGE_Doxygen=ON
if cmake --build "$dir/build" --target docs >"$dir/log" 2>&1; then
    echo "the target docs succeeds"
    exit 1
fi
grep -F 'Doxygen is missing. Install the package doxygen and run cmake again.' "$dir/log"
if ! command -v doxygen >/dev/null; then
    echo "Doxygen is missing: the rest is skipped."
    exit 77
fi

echo "The target:"
configure -DCMAKE_DISABLE_FIND_PACKAGE_Doxygen=OFF
cmake --build "$dir/build" --target docs 2>&1 | tee "$dir/log"
if grep -qE '(^|: )(warning|error): ' "$dir/log"; then
    exit 1
fi
[ -s "$dir/build/docs/html/index.html" ]

# The same again with other settings: run_doxygen SETTING...
run_doxygen()
{
    (cd "$source" && printf '%s\n' "$@" | cat "$dir/build/doc/Doxyfile" - | doxygen -)
}

run_doxygen GENERATE_HTML=NO GENERATE_XML=YES
echo "Functions (< exported, > in the reference):"
python3 - "$dir/build/docs/xml" >"$dir/functions" <<'PYTHON'
import pathlib, sys
from xml.etree import ElementTree

undescribed = 0

def check(element, name):
    global undescribed
    words = [*element.find("briefdescription").itertext(), *element.find("detaileddescription").itertext()]
    if not "".join(words).strip():
        print(f"{name} has no description", file=sys.stderr)
        undescribed += 1

for path in sorted(pathlib.Path(sys.argv[1]).glob("*.xml")):
    for compound in ElementTree.parse(path).iter("compounddef"):
        name = compound.findtext("compoundname")
        scope = ""
        if compound.get("kind") in ("class", "namespace"):
            scope = name + "::"
        if scope or name.endswith(".h"):
            check(compound, name)
        for member in compound.iter("memberdef"):
            if member.get("prot") == "private":
                continue
            name = scope + member.findtext("name")
            check(member, name)
            exported = member.get("inline") == "no" and not member.findtext("argsstring").endswith("=delete")
            if member.get("kind") == "function" and exported:
                print(name)
sys.exit(undescribed != 0)
PYTHON
# Constructors and destructors are exported in two variants each, of which one counts.
awk '!/[CD]2Ev$/ { print $2 }' "$source/tests/exported-symbols.txt" | c++filt --no-params | LC_ALL=C sort |
    diff - <(LC_ALL=C sort "$dir/functions")

echo "A name without a comment:"
printf '// A header.\n\nint undocumented();\n' >"$dir/undocumented.h"
if run_doxygen GENERATE_HTML=NO GENERATE_XML=YES "INPUT += \"$dir/undocumented.h\"" 2>"$dir/log"; then
    echo "doxygen succeeds"
    exit 1
fi
cat "$dir/log"
grep -qE '/undocumented\.h:3: (warning|error): Member undocumented\(\) .* is not documented\.$' "$dir/log"
