#!/bin/bash
# Run outside the private phone root: what a caller of tools/sandbox can rely on. That all inside
# ends is told by the end of a pipe that everything inside holds open, so a survivor hangs the test.
set -u

tools=$(cd "$(dirname "$0")/../../tools" && pwd)
folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT
. "$(dirname "$0")/../support/expect.sh"

sandbox() {
    "$tools/sandbox" "$@"
}

without_arguments_it_prints_its_usage() {
    local said
    said=$(sandbox 2>&1 >/dev/null)
    expect 'status without arguments' 2 $?
    [[ $said == usage:* ]] || fail "no usage but: $said"
}

the_exit_status_passes_through() {
    sandbox true
    expect 'status of true' 0 $?
    sandbox sh -c 'exit 37'
    expect 'status of exit 37' 37 $?
    sandbox sh -c 'kill -KILL $$' 2>/dev/null
    expect 'status after a signal' 137 $?
    sandbox no-such-command 2>/dev/null
    expect 'status of an unknown command' 127 $?
    sandbox /etc/passwd 2>/dev/null
    expect 'status of what is no program' 126 $?
}

input_output_and_arguments_pass_through() {
    expect 'output' "a  b|c*|" "$(sandbox printf '%s|' 'a  b' 'c*')"
    expect 'input' 'some text' "$(echo 'some text' | sandbox cat)"
    expect 'descriptors' "$(ls /proc/self/fd)" "$(sandbox ls /proc/self/fd)"
    expect 'the folder' "$tools" "$(cd "$tools" && sandbox pwd)"
    expect 'interrupts' 'not ignored' "$(sandbox sh -c 'grep -q "^SigIgn:.*[2367abef]$" /proc/self/status || echo not ignored')"
}

# SIGKILL cannot be handled, so there the kernel has to clean up.
a_signal_ends_everything() { # SIGNAL STATUS
    local pid word
    mkfifo "$folder/$1"
    env --default-signal=INT "$tools/sandbox" sh -c 'trap "" TERM INT HUP; (setsid sleep 1000 &) ; echo started; while :; do sleep 1; done' \
        >"$folder/$1" &
    pid=$!
    exec 9<"$folder/$1"
    read -r word <&9
    expect "first word before $1" started "$word"
    kill -s "$1" "$pid"
    cat <&9 >/dev/null
    exec 9<&-
    wait "$pid" 2>/dev/null
    expect "status after $1" "$2" $?
}

nothing_is_left_in_tmp() {
    local before
    before=$(ls -A /tmp)
    sandbox sh -c 'touch /tmp/inside /tmp/linefold-inside'
    [ ! -e /tmp/linefold-inside ] || fail 'a file from inside is outside'
    expect 'what is new in /tmp' '' "$(comm -13 <(echo "$before") <(ls -A /tmp) | grep -i -e sandbox -e linefold)"
}

only_shared_folders_of_tmp_are_seen() {
    mkdir -p "$folder/a b" "$folder/other"
    echo shared >"$folder/a b/file"
    expect 'a shared file' shared "$(SHARE="$folder/a b" sandbox cat "$folder/a b/file")"
    SHARE="$folder/a b" sandbox test -e "$folder/other" && fail 'what was not shared is seen'
    SHARE="$folder/a b" sandbox touch "$folder/a b/new" 2>/dev/null && fail 'a shared folder can be written'
    SHARE=relative sandbox true 2>/dev/null && fail 'a relative path can be shared'
    return 0
}

many_run_side_by_side() {
    local -a running=()
    local i
    for i in {1..20}; do
        sandbox sh -c "echo $i >/run/mine && sleep 0.2 && grep -qx $i /run/mine && ip route get 192.0.2.1" \
            >/dev/null 2>"$folder/said$i" &
        running+=($!)
    done
    for i in {1..20}; do
        wait "${running[i - 1]}" || fail "number $i of 20 ended with $?: $(cat "$folder/said$i")"
    done
}

without_arguments_it_prints_its_usage
the_exit_status_passes_through
input_output_and_arguments_pass_through
a_signal_ends_everything TERM 143
a_signal_ends_everything INT 130
a_signal_ends_everything HUP 129
a_signal_ends_everything KILL 137 2>/dev/null  # The shell reports its dead.
nothing_is_left_in_tmp
only_shared_folders_of_tmp_are_seen
many_run_side_by_side
[ "$failures" = 0 ] && echo "tools/sandbox keeps its word"
exit "$failures"
