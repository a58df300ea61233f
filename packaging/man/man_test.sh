#!/usr/bin/env bash
# The man pages are read without a warning. Exits with 77 where the tools to tell are not there.
set -euo pipefail
here=$(dirname -- "$(readlink -f -- "$0")")
command -v groff >/dev/null || exit 77
status=0
for page in "$here"/*.[158]; do
    warnings=$(LC_ALL=C.UTF-8 MANROFFSEQ='' MANWIDTH=80 man --warnings -E UTF-8 -l -Tutf8 -Z "$page" 2>&1 >/dev/null)
    text=$(LC_ALL=C.UTF-8 MANWIDTH=80 man -l "$page" | col -bx)
    if [[ -n $warnings ]]; then
        printf '%s: %s\n' "$page" "$warnings"
        status=1
    fi
    if [[ $text != *NAME*"SEE ALSO"* ]]; then
        printf '%s: it does not read from NAME to SEE ALSO\n' "$page"
        status=1
    fi
done
exit "$status"
