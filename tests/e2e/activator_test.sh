#!/bin/bash
# Run inside the private phone root: what tools/activator promises a daemon and its clients.
set -u

activator=$LINEFOLD_BUILD/bin/activator
socket=/run/linefold/test
. "$(dirname "$0")/../support/expect.sh"

eventually() {
    for _ in {1..200}; do
        "$@" && return
        sleep 0.05
    done
    fail "never came true: $*"
    return 1
}

# A connection that stays in the queue, as nobody here accepts one.
connect() {
    perl -MSocket -e '
        socket(my $client, AF_UNIX, SOCK_SEQPACKET, 0) or die $!;
        connect($client, pack_sockaddr_un($ARGV[0])) or die "$!\n";
    ' "$1"
}

start() { # PROGRAM ARGUMENT...
    rm -f /tmp/output /tmp/errors
    "$activator" --verbose "$socket" control "$@" >/tmp/output 2>/tmp/errors 7</etc/passwd &
    running=$!
    eventually test -S "$socket"
}

stop() { # SIGNAL
    kill -s "$1" "$running"
    wait "$running"
    expect "status after $1" 0 $?
}

starts() {
    [ "$(grep -c started /tmp/output)" -ge "$1" ]
}

# $$ of the program is its own process: the shell is executed in place.
the_program_gets_the_socket_and_nothing_else() {
    start /bin/sh -c 'echo "$LISTEN_FDS $LISTEN_FDNAMES $((LISTEN_PID == $$))" $(pwd) >/tmp/environment
        exec sleep 1000'
    expect 'mode of the socket' 'socket 666' "$(stat -c '%F %a' "$socket")"
    [ ! -s /tmp/output ] || fail 'started before anybody connected'
    connect "$socket"
    eventually sleeper >/dev/null
    expect 'environment' '1 control 1 /' "$(cat /tmp/environment)"
    expect 'descriptors' '0 1 2 3' "$(cd "$(sleeper)/fd" && echo *)"
    [[ $(readlink "$(sleeper)/fd/3") == socket:* ]] || fail 'descriptor 3 is no socket'
    stop TERM
    expect 'the program after the end' '' "$(sleeper)"
}

# The folder of the process that the program under test became.
sleeper() {
    grep -lsx sleep /proc/[0-9]*/comm | sed 's|/comm$||' | grep .
}

it_starts_again_after_each_exit() {
    start /bin/sh -c 'sleep 0.05'
    connect "$socket"
    eventually starts 3
    grep -qx 'exited with status 0' /tmp/output || fail 'no word of an exit'
    expect 'complaints' '' "$(cat /tmp/errors)"
    stop INT
}

a_failure_is_said_and_tried_again() {
    start /bin/sh -c 'exit 9'
    connect "$socket"
    eventually starts 2
    grep -qx 'activator: /bin/sh exited with status 9' /tmp/errors || fail "said: $(cat /tmp/errors)"
    stop TERM
    start /no/such/program
    connect "$socket"
    eventually grep -qx 'activator: /no/such/program cannot be executed (status 127)' /tmp/errors
    stop TERM
}

wrong_arguments_are_refused() {
    "$activator" "$socket" control 2>/tmp/errors
    expect 'status of too few arguments' 2 $?
    grep -q '^usage:' /tmp/errors || fail 'no usage'
    "$activator" --loud "$socket" control /bin/true 2>/dev/null
    expect 'status of an unknown option' 2 $?
    "$activator" /no/such/folder/socket control /bin/true 2>/tmp/errors
    expect 'status without a folder' 1 $?
    grep -q 'No such file' /tmp/errors || fail "said: $(cat /tmp/errors)"
    echo precious >/run/linefold/file
    "$activator" /run/linefold/file control /bin/true 2>/dev/null
    expect 'status over a file' 1 $?
    expect 'the file' precious "$(cat /run/linefold/file)"
}

the_program_gets_the_socket_and_nothing_else
it_starts_again_after_each_exit
a_failure_is_said_and_tried_again
wrong_arguments_are_refused
[ "$failures" = 0 ] && echo "tools/activator keeps its word"
exit "$failures"
