#!/bin/sh
# What linefold-sim says about its roles and about wrong words: linefold_sim_test.sh LINEFOLD_SIM
set -u

folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
simulator=$1
failures=0

fail() {
    failures=$((failures + 1))
    echo "FAILED: $1"
    sed 's/^/    stdout: /' "$folder/out"
    sed 's/^/    stderr: /' "$folder/err"
}

# expect STATUS ARGUMENTS...: runs the simulator and compares its exit status.
expect() {
    wanted=$1
    shift
    what="linefold-sim $*"
    timeout 10 "$simulator" "$@" >"$folder/out" 2>"$folder/err" </dev/null
    status=$?
    [ "$status" -eq "$wanted" ] || fail "$what: exit status $status, not $wanted"
}

says() { grep -qF -e "$2" "$folder/$1" || fail "$what: std$1 does not say: $2"; }
silent() { [ ! -s "$folder/$1" ] || fail "$what: std$1 is not empty"; }

# usage MESSAGE ARGUMENTS...: they are wrong, and this is what is said about them.
usage() {
    message=$1
    shift
    expect 2 "$@"
    says err "$message"
    says err '--help'
    silent out
}

for role in geocoder stun telephony; do
    expect 0 --help
    says out "  $role "
    expect 0 "$role" --help
    says out "Usage: linefold-sim $role"
    says out 'Example'
    silent err
    usage "linefold-sim $role: there is no option --nonsense" "$role" --nonsense
    usage "linefold-sim $role: there is no option word" "$role" word
    usage "linefold-sim $role: the option --delay needs a value" "$role" --delay
    for number in '' x 1s -1 nan inf; do
        usage "linefold-sim $role: cannot use --delay $number" "$role" --delay "$number"
    done
done

for role in geocoder stun; do
    for place in '' 198.51.100.1 :80 198.51.100.1: host:80 198.51.100.1:port 1.2.3.4:70000; do
        usage "$place is not ADDRESS:PORT" "$role" --listen "$place"
    done
    expect 1 "$role" --listen 203.0.113.99:9
    says err 'cannot be had'
done
usage 'the value of --only must be server or lasd' telephony --only both
usage 'cannot use --error 2147483648' telephony --error 2147483648
usage 'nowhere is no address' stun --claim nowhere
usage 'cannot use --error 200' stun --error 200
usage 'cannot use --status 99' geocoder --status 99

expect 0 modem-manager --help
says out 'Usage: linefold-sim modem-manager'
says out 'Example'
usage 'linefold-sim modem-manager: there is no option --nonsense' modem-manager --nonsense
usage 'linefold-sim modem-manager: the option --bus needs a value' modem-manager --bus
expect 1 modem-manager --bus "$folder/no-bus"
says err 'there is no bus at'
silent out

[ "$failures" -eq 0 ] || exit 1
