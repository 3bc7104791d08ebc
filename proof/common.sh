# Shared by the parts of script/proof, which source it: PART FILE-FOR-THE-ROWS. A part also runs
# without that script; its rows then go to the terminal.
# shellcheck shell=bash
source "$(dirname "${BASH_SOURCE[0]}")/../script/common.sh"

part=$(basename "$0")
rows=${1:-/dev/stdout}
# shellcheck disable=SC2034 # the parts use it
factor=${KORU_PROOF_FACTOR:-1}
# Where a part keeps what it has done, as PART.ANYTHING.
kept=${KORU_PROOF_KEPT:-$PWD/build/proof}
mkdir -p "$kept"
# Not where nothing is given: /dev/stdout may be a link to a file.
if [[ $# -gt 0 && -f $rows ]]; then rm "$rows"; fi

# figure WHAT RESULT: a row of the table.
figure() { echo "| $1 | $2 | \`script/proof $part\` |" >>"$rows"; }

# testPrograms ARGUMENT OF ctest...: the names of the test programs in build/i386-dev, one a line.
testPrograms() {
    ctest --test-dir build/i386-dev --show-only "$@" | sed -nE 's/^ +Test +#[0-9]+: +(\w+_test)$/\1/p'
}
