#!/bin/sh
# What lfhelper says and how it exits, as far as no service is needed: lfhelper_test.sh LFHELPER
set -u

folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
# Where everybody may read and run it, also when the build folder is somebody's own.
chmod 755 "$folder"
lfhelper=$folder/lfhelper
cp "$1" "$lfhelper" && chmod 755 "$lfhelper" || exit 1
own_group=$(id -gn)
failures=0

fail() {
    failures=$((failures + 1))
    echo "FAILED: $1"
    sed 's/^/    stdout: /' "$folder/out"
    sed 's/^/    stderr: /' "$folder/err"
}

# expect STATUS ARGUMENTS...: runs lfhelper and compares its exit status.
expect() {
    wanted=$1
    shift
    what="lfhelper $*"
    timeout 30 "$lfhelper" "$@" >"$folder/out" 2>"$folder/err" </dev/null
    status=$?
    [ "$status" -eq "$wanted" ] || fail "$what: exit status $status, not $wanted"
}

# In the output of the last run: says FILE TEXT, silent FILE.
says() { grep -qF -e "$2" "$folder/$1" || fail "$what: std$1 does not say: $2"; }
silent() { [ ! -s "$folder/$1" ] || fail "$what: std$1 is not empty"; }

# json FILTER: the output is one JSON object, of which the filter is true.
json() {
    [ "$(wc -l <"$folder/out")" -eq 1 ] || fail "$what: not one line of JSON"
    jq -e "$1" "$folder/out" >"$folder/jq" 2>&1 || fail "$what: not so in its JSON: $1"
}

# ---- Help and version
expect 0 --help
says out 'Usage: lfhelper'
says out 'Examples:'
silent err
for command in check-in doctor 'voicemail set-token' 'voicemail get-token' 'voicemail clear-token' \
    'voicemail remove-all' 'voicemail is-subscribed' link-carrier-bundle create-symlink \
    remove-preference-domain 'preferences get' 'preferences set' 'preferences remove' copy-file \
    copy-log-directory move-directory copy-archive load-plist heartbeat radio-logging \
    country-code civic-address wan-ip update-databases raw; do
    expect 0 --help
    says out "  $command "
    # shellcheck disable=SC2086 # a command of two words is two arguments
    expect 0 $command --help
    says out "Usage: lfhelper [OPTIONS] $command"
    says out 'Examples:'
    silent err
done
expect 0 preferences --help
says out '  preferences get '
silent err
expect 0 --version
says out 'lfhelper '
silent err

# ---- Wrong usage: a message and a hint, and nothing on the standard output
usage() {
    message=$1
    shift
    expect 2 "$@"
    says err "lfhelper: $message"
    says err '--help'
    silent out
}
usage 'a command is missing'
usage 'there is no command nonsense' nonsense
usage 'there is no option --nonsense' --nonsense check-in
usage 'there is no option -x' check-in -x
usage 'the option --group needs a value' check-in --group
usage 'the option --json takes no value' --json=1.0e check-in
usage 'too many arguments for check-in' check-in extra
usage 'too few arguments for link-carrier-bundle' link-carrier-bundle target
usage 'too many arguments for link-carrier-bundle' link-carrier-bundle a b c d
usage 'too few arguments for create-symlink' create-symlink target
usage 'too many arguments for create-symlink' create-symlink a b c
usage 'too few arguments for remove-preference-domain' remove-preference-domain
usage 'too many arguments for remove-preference-domain' remove-preference-domain a b c
usage 'too few arguments for raw' raw
usage 'ID must be a number of 32 bits' raw twelve
usage 'ID must be a number of 32 bits' raw 4294967296
usage 'ID must be a number of 32 bits' raw 12x
usage 'ID must be a number of 32 bits' raw 0x-1
usage 'ID must be a number of 32 bits' raw ''
usage 'HEX must be pairs of hexadecimal digits' raw 1 0
usage 'HEX must be pairs of hexadecimal digits' raw 1 0g
usage 'the value of --claim-size must be' raw --claim-size=-1 1
usage 'the option --complex belongs to the command raw' --complex check-in
usage 'the option --wait belongs to the command update-databases, civic-address or wan-ip' --wait country-code
usage 'too few arguments for civic-address' civic-address 51.5
usage 'too many arguments for wan-ip' wan-ip 1
for degrees in north '' 51.5x 0x10 1,5; do
    usage 'LATITUDE and LONGITUDE must be decimal numbers of degrees' civic-address "$degrees" 0
    usage 'LATITUDE and LONGITUDE must be decimal numbers of degrees' civic-address 0 "$degrees"
done
usage 'preferences is not the whole command' preferences
says err 'Try: lfhelper preferences --help'
usage 'there is no command preferences nonsense' preferences nonsense
usage 'STATE must be on or off, not "maybe"' heartbeat maybe
usage 'too few arguments for heartbeat' heartbeat
usage 'too few arguments for preferences get' preferences get domain
usage 'too many arguments for preferences get' preferences get domain key value
usage 'too few arguments for preferences set' preferences set domain key
usage 'too many arguments for preferences set' preferences set domain key two words
usage 'too few arguments for preferences remove' preferences remove domain
usage 'too many arguments for preferences remove' preferences remove domain key value
usage 'the option --type belongs to the command preferences set' preferences get --type plist d k
usage 'the option --plist belongs to the command preferences get' preferences set --plist d k v
usage 'the value of --type must be one of string, integer, real,' preferences set --type text d k v

# ---- Values that are not of their type
misfit() {
    type=$1
    shift
    for value; do
        usage 'VALUE is not ' preferences set --type "$type" d k -- "$value"
        says err 'Try: lfhelper preferences set --help'
    done
}
misfit string "$(printf 'a\001')" "$(printf '\377')"
misfit integer abc '' 12abc 1.5 9223372036854775808 --5 '<integer>5</integer>'
misfit real abc '' 1,5 1e999 -
misfit boolean '' yes TRUE 1
misfit date '' tomorrow 2023-02-29T00:00:00Z '2001-01-01 00:00:00'
misfit data 0g Y 'YQ=' '!' --
misfit plist x

# ---- Standard input: nothing to read, too much of it
what='lfhelper preferences set d k - <&-'
timeout 30 "$lfhelper" preferences set d k - >"$folder/out" 2>"$folder/err" <&-
[ $? -eq 2 ] || fail "$what: not wrong usage"
says err 'standard input cannot be read: '
what='lfhelper preferences set d k - </dev/zero'
timeout 30 "$lfhelper" preferences set d k - >"$folder/out" 2>"$folder/err" </dev/zero
[ $? -eq 2 ] || fail "$what: not wrong usage"
says err 'standard input holds more than 16777216 bytes'

# ---- Wrong usage, for programs
expect 2 --json nonsense
json '.exitStatus == 2 and .code == null and .name == "USAGE"'
says err 'there is no command nonsense'
expect 2 --nonsense --json check-in
json '.command == "check-in" and .meaning == "there is no option --nonsense"'

# ---- The group
expect 3 --group no-such-group-here check-in
says err 'there is no group "no-such-group-here"'
silent out
expect 3 --json --group no-such-group-here check-in
json '.exitStatus == 3 and .name == "NO_GROUP"'

# as_stranger STATUS ARGUMENTS...: the same as expect, without root and in no group of its own.
as_stranger() {
    if [ "$(id -u)" -ne 0 ]; then
        expect "$@"
        return
    fi
    wanted=$1
    shift
    what="lfhelper $* (as a stranger)"
    timeout 30 setpriv --reuid=65534 --regid=65534 --clear-groups "$lfhelper" "$@" \
        >"$folder/out" 2>"$folder/err" </dev/null
    status=$?
    [ "$status" -eq "$wanted" ] || fail "$what: exit status $status, not $wanted"
}
foreign_group=root
[ "$own_group" != root ] || [ "$(id -u)" -eq 0 ] || foreign_group=daemon
as_stranger 3 --group "$foreign_group" check-in
says err 'only root can take the group'
as_stranger 3 --json --group "$foreign_group" check-in
json '.exitStatus == 3 and .name == "NO_GROUP"'

# ---- No service
nowhere=$folder/nowhere
expect 3 --group "$own_group" --service "$nowhere" check-in
says err 'ERROR_NO_SERVICE'
silent out
expect 3 --group="$own_group" --service="$nowhere" --json check-in
json '.command == "check-in" and .exitStatus == 3 and .code == 268435459 and .name == "ERROR_NO_SERVICE"'
silent err
expect 3 --group "$own_group" --service "$lfhelper" check-in
says err 'ERROR_NOT_A_SERVICE'
expect 3 --group "$own_group" --service "$nowhere" raw -- -5 'ab cd:ef'
says err 'ERROR_NO_SERVICE'
expect 3 --group "$own_group" --service "$nowhere" raw -5 --complex --claim-size 0x10
says err 'ERROR_NO_SERVICE'
if [ "$(id -u)" -eq 0 ]; then
    # Root takes a group that it was not started with.
    expect 3 --group daemon --service "$nowhere" check-in
    says err 'ERROR_NO_SERVICE'
fi

# ---- Arguments that no message can hold are wrong usage, whether or not there is a service
long=$(printf '%01025d' 0)
expect 2 --group "$own_group" --service "$nowhere" create-symlink "$long" link
says err 'ERROR_ARGUMENT_TOO_LONG'
expect 2 --group "$own_group" --service "$long" check-in
says err 'ERROR_PATH_TOO_LONG'

# ---- JSON stays JSON, whatever the texts are
odd=$(printf 'a"b\\c\nd\001\177\377\355\240\200\303\244')
expect 3 --group "$own_group" --service "$nowhere" --json create-symlink "$odd" link
json '.link == "link" and .target == "a\"b\\c\nd\u0001\u007f\\xff\\xed\\xa0\\x80ä"'

# ---- Output that goes nowhere is not a success
"$lfhelper" --help >/dev/full 2>"$folder/err"
status=$?
: >"$folder/out"
what='lfhelper --help >/dev/full'
[ "$status" -eq 1 ] || fail "$what: exit status $status, not 1"
says err 'the output could not be written'

[ "$failures" -eq 0 ] && echo "all as expected"
exit $((failures != 0))
