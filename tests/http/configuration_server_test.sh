#!/bin/bash
# How linefold-sim configuration-server refuses, outside of the private phone root and inside; run
# outside: configuration_server_test.sh LINEFOLD-SIM
set -u

simulator=$1
sandbox=$(dirname "$0")/../../tools/sandbox
folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
. "$(dirname "$0")/../support/expect.sh"

refuses() { # STATUS TEXT WORD...
    local status=$1 text=$2
    shift 2
    timeout 20 "$simulator" configuration-server "$@" >"$folder/out" 2>"$folder/err" </dev/null
    expect "status of: $*" "$status" $?
    grep -q -e "$text" "$folder/err" || fail "'$*' said: $(cat "$folder/err")"
    expect "output of: $*" '' "$(cat "$folder/out")"
}

bundle=/etc/ssl/certs/ca-certificates.crt
before=$(sha256sum "$bundle" 2>&1)
refuses 1 'inside of tools/sandbox only' "$folder"
expect 'the bundle of this machine' "$before" "$(sha256sum "$bundle" 2>&1)"

refuses 2 'one folder is needed'
refuses 2 'one folder is needed' "$folder" "$folder"
refuses 2 'must be a folder' /nowhere
refuses 2 'must be a folder' "$simulator"
refuses 2 'cannot use --certificate false' --certificate false "$folder"
refuses 2 'cannot use --certificate$' --certificate
refuses 2 'cannot use --port 0' --port 0 "$folder"
refuses 2 'cannot use --port 65536' --port 65536 "$folder"
refuses 2 'cannot use --redirect' --redirect nowhere "$folder"
refuses 2 'cannot use --redirect' --redirect '/a="; }' "$folder"
refuses 2 'cannot use --wrong x' --wrong x "$folder"
expect 'help' 0 "$("$simulator" configuration-server --help >"$folder/out"; echo $?)"
grep -q -e '--certificate KIND' "$folder/out" || fail 'the help names no options'

# Inside it ends with the signal that it gets, and by itself when nginx cannot serve.
# shellcheck disable=SC2016
inside='
    mkdir /tmp/www
    serve() { exec "$LINEFOLD_BUILD/bin/linefold-sim" configuration-server "$@" /tmp/www; }
    serve >/tmp/out &
    for _ in {1..200}; do grep -q ^serving /tmp/out && break; sleep 0.05; done
    (serve >/tmp/second 2>&1)
    echo "second $?"
    kill %1; wait %1; echo "first $?"
    ls -d /run/configuration-server.* 2>/dev/null
    serve >/dev/null & sleep 0.3; kill -KILL $!; wait $! 2>/dev/null
    for _ in {1..200}; do grep -qs ^nginx /proc/[0-9]*/comm || break; sleep 0.05; done
    grep -s ^nginx /proc/[0-9]*/comm
    echo end'
expect 'inside' $'second 1\nfirst 0\nend' "$(timeout 60 "$sandbox" bash -c "$inside" 2>/dev/null </dev/null)"

[ "$failures" = 0 ] && echo 'the configuration server refuses as it should'
exit "$failures"
