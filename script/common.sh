# Shared by the scripts in this folder, which source it. Leaves the shell in the project's folder.
# shellcheck shell=bash
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

jobs=${JOBS:-$(nproc)}

# step LABEL COMMAND...: runs the command with its output kept back. A line with the label and the
# time is all that shows of a success; a failure shows the output too, and its status is returned.
# Runs the command as a process of its own, so that `set -e` holds in it whatever surrounds the step.
step() {
    local label=$1 log began=$SECONDS status=0 follower
    shift
    log=$(mktemp)
    printf '%-34s' "$label"
    _follow "$label" "$log" &
    follower=$!
    "$@" >"$log" 2>&1 </dev/null || status=$?
    kill "$follower" 2>/dev/null || true
    wait "$follower" 2>/dev/null || true
    if [[ -t 1 ]]; then printf '\r\033[K%-34s' "$label"; fi
    if [[ $status -eq 0 ]]; then
        printf ' ok      %4d s\n' $((SECONDS - began))
    else
        printf ' FAILED  %4d s\n' $((SECONDS - began))
        sed 's/^/    /' "$log"
    fi
    rm -f "$log"
    return "$status"
}

# Shows that a step is alive: the last line of its output on a terminal, dots elsewhere.
# The sleep does not keep our output open, or a reader of a pipe would wait for it.
_follow() {
    local label=$1 log=$2 line
    while true; do
        if [[ -t 1 ]]; then
            sleep 1 >/dev/null 2>&1
            line=$(tail -n 1 "$log" | tr -d '\r' | cut -c 1-40)
            printf '\r\033[K%-34s %s' "$label" "$line"
        else
            sleep 10 >/dev/null 2>&1
            printf '.'
        fi
    done
}

# The project's own files that match the given patterns of git's, NUL-separated: what git knows and
# what could be added to it. The setting is for a checkout that belongs to another user.
files() {
    git -c safe.directory="$PWD" ls-files -z --cached --others --exclude-standard -- "$@" | _existing
}

# Of NUL-separated names, those that exist: git also lists what was deleted but not yet committed.
_existing() {
    local name
    while IFS= read -r -d '' name; do
        if [[ -f $name ]]; then printf '%s\0' "$name"; fi
    done
}

fail() {
    echo "$(basename "$0"): $*" >&2
    exit 1
}

# Builds a preset into its own folder, build/NAME.
buildPreset() {
    cmake --preset "$1"
    cmake --build --preset "$1" --parallel "$jobs"
}
