#!/bin/bash
# The options of the build that make faults of the library and the programs harder to exploit.
# usage: hardening.sh LIBRARY PROGRAM...
set -euo pipefail
status=0

# shows TEXT PATTERN
shows()
{
    grep -qE -- "$2" <<<"$1"
}

fault()
{
    echo "$program: $1"
    status=1
}

for program in "$@"; do
    headers=$(readelf --wide --dynamic --segments "$program")
    shows "$headers" GNU_RELRO || fault "its tables of addresses stay writable"
    shows "$headers" BIND_NOW || fault "it is bound late, so its table of functions stays writable"
    # An empty element of that path is the current directory.
    ! shows "$headers" 'RUNPATH.*(\[:|::|:\])' || fault "it looks for libraries in the current directory"

    calls=$(nm -D --undefined-only "$program" | sed 's/@.*//')
    shows "$calls" ' __stack_chk_fail$' || fault "it does not protect the stack"
    shows "$calls" ' __[a-z_]+_chk$' || fault "it does not check the sizes of buffers"

    if [ "$(uname -m)" = x86_64 ]; then
        code=$(objdump --disassemble --no-show-raw-insn "$program")
        # The stack grows in steps of a page, so that it cannot jump over the guard page.
        ! shows "$(grep -v 'sub *.0x1000,%rsp' <<<"$code")" 'sub +.0x[0-9a-f]{4,7},%rsp' ||
            fault "it takes more than a page of the stack at once"
        shows "$(grep -A 1 -E '<(main|VemoAccessTokenGrant)>:$' <<<"$code")" endbr64 ||
            fault "indirect calls and jumps may lead anywhere"
    fi
done
exit $status
