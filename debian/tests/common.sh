# Shared by the tests in this folder, which source it. They are run in the source tree.
# shellcheck shell=bash
set -euo pipefail

work=${AUTOPKGTEST_TMP:-$(mktemp -d)}

fail() {
    echo "$(basename "$0"): $*" >&2
    exit 1
}

# The application of tests/consumer works, with the library that is installed.
runConsumer() { # PROGRAM
    [[ $("$1" "$work/app.ini") == name=K*ru ]] || fail "the program does not read what it wrote"
    grep -q '^\[library\]$' "$work/app.ini" || fail "the program wrote no file"
    local found
    found=$(ldd "$1")
    grep -qE 'libkoru\.so\.1 => /(usr/)?lib/[^/]*-linux-gnu/' <<<"$found" ||
        fail "the program finds another library: $found"
    rm "$work/app.ini"
}
