# Sourced by the tests of lfhelper in a private phone root: they run it, look at what it printed and
# how it ended, count what fails and go on.
lfhelper=$LINEFOLD_BUILD/bin/lfhelper
service=com.vendra.linefold.mobile-helper
socket=/run/linefold/$service
what=
. "$(dirname "${BASH_SOURCE[0]}")/expect.sh"

fail() {
    failures=$((failures + 1))
    echo "FAILED: $1"
    head -c 500 /tmp/out | sed 's/^/    stdout: /'
    head -c 500 /tmp/err | sed 's/^/    stderr: /'
}

# exits STATUS ARGUMENT...: runs lfhelper, whose input is this function's.
exits() {
    local wanted=$1
    shift
    what="lfhelper $*"
    timeout 30 "$lfhelper" "$@" >/tmp/out 2>/tmp/err
    local status=$?
    [ "$status" -eq "$wanted" ] || fail "$what: exit status $status, not $wanted"
}

# About the last run: the whole output, a part of the errors, no output or errors at all.
prints() { printf '%s\n' "$1" | cmp -s - /tmp/out || fail "$what: does not print: $1"; }
says() { grep -qF -e "$1" /tmp/err || fail "$what: does not say: $1"; }
silent() { [ ! -s "/tmp/$1" ] || fail "$what: std$1 is not empty"; }

# json FILTER: the output is one JSON object, of which the filter is true.
json() {
    [ "$(wc -l </tmp/out)" -eq 1 ] || fail "$what: not one line of JSON"
    jq -e "$1" /tmp/out >/tmp/jq 2>&1 || fail "$what: not so in its JSON: $1"
}

# The service manager's part, until the test ends.
serve() {
    "$LINEFOLD_BUILD/bin/activator" "$socket" "$service" "$LINEFOLD_BUILD/bin/LinefoldMobileHelper" &
    activator=$!
    trap 'kill "$activator"' EXIT
    for _ in {1..200}; do
        [ -S "$socket" ] && break
        sleep 0.05
    done
}

finish() { # PRAISE
    [ "$failures" = 0 ] && echo "$1"
    exit $((failures != 0))
}
