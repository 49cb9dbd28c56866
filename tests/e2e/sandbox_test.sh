#!/bin/bash
# Run inside: tools/sandbox tests/e2e/sandbox_test.sh. Holds the private phone root to its promise:
# nothing of the machine can be written, and all that the phone has is there.
set -u

. "$(dirname "$0")/../support/expect.sh"

# An entry is sent when its sender returns, and kept a little later.
eventually() {
    for _ in {1..200}; do
        "$@" && return
        sleep 0.05
    done
    return 1
}

owner_and_mode() {
    expect "owner, mode and kind of $1" "$2" "$(stat -c '%u:%g %a %F' "$1" 2>&1)"
}

# The kernel has to say "read-only": that permissions refuse it would mean nothing to another root.
refuses_writing() {
    local answer
    answer=$(touch --no-create "$1" 2>&1)
    [[ $answer == *'Read-only file system' ]] || fail "$1 can be written: ${answer:-no refusal}"
}

is_private() {
    case $1 in
        / | /dev | /run | /tmp | /etc | /Library | /private | /usr/lib/linefold) [ "$2" = tmpfs ] ;;
        /proc | /proc/sys/net) [ "$2" = proc ] ;;
        /run/netns/gateway) [ "$2" = nsfs ] ;;
        *) false ;;
    esac
}

no_mount_of_the_machine_can_be_written() {
    local fields point type seen=0
    while read -ra fields; do
        point=${fields[4]//\\040/ }
        type=${fields[*]}
        type=${type#* - }
        type=${type%% *}
        is_private "$point" "$type" && continue
        refuses_writing "$point"
        seen=$((seen + 1))
    done </proc/self/mountinfo
    [ "$seen" -gt 5 ] || fail "only $seen mounts of the machine found"
    for point in /usr /usr/lib /usr/bin /home /root /opt /srv /var/lib /var/log "$PWD" "$LINEFOLD_BUILD"; do
        [ ! -d "$point" ] || refuses_writing "$point"
    done
}

no_setting_of_the_whole_kernel_can_be_written() {
    local file
    for file in /proc/sys/kernel/core_pattern /proc/sys/vm/swappiness /proc/sys/fs/file-max; do
        [ -e "$file" ] || continue
        [ ! -w "$file" ] || fail "$file can be written"
    done
    [ ! -w /proc/sysrq-trigger ] || fail "/proc/sysrq-trigger can be written"
}

the_phones_folders_are_there() {
    local folder
    for folder in /private /Library /run /dev /etc /usr/lib/linefold /run/linefold; do
        owner_and_mode "$folder" '0:0 755 directory'
        mkdir "$folder/test" || fail "$folder cannot be written"
        rmdir "$folder/test"
    done
    owner_and_mode /tmp '0:0 1777 directory'
    owner_and_mode /private/var/mobile '501:501 755 directory'
    owner_and_mode /private/var/mobile/Library/Preferences '501:501 755 directory'
    owner_and_mode /var/mobile '0:0 777 symbolic link'
    expect 'the link /var/mobile' ../private/var/mobile "$(readlink /var/mobile)"
    expect 'the place of /var/mobile' /private/var/mobile "$(realpath /var/mobile)"
    [ "$(stat -c %d /private)" != "$(stat -c %d /tmp)" ] || fail "/private and /tmp are one file system"
}

the_phones_users_are_there() {
    expect 'user mobile' 'mobile:x:501:501:Mobile:/var/mobile:/bin/sh' "$(getent passwd mobile)"
    expect 'user 501' "$(getent passwd mobile)" "$(getent passwd 501)"
    expect 'group mobile' 'mobile:x:501:' "$(getent group mobile)"
    expect 'group linefold-telephony' 'linefold-telephony:x:5010:' "$(getent group linefold-telephony)"
}

the_entitlement_is_roots() {
    local file=/etc/linefold/entitlements/linefold-telephony.plist
    owner_and_mode /etc/linefold '0:0 755 directory'
    owner_and_mode /etc/linefold/entitlements '0:0 755 directory'
    owner_and_mode "$file" '0:0 644 regular file'
    expect 'the entitlement' '<key>com.vendra.Halvane.LinefoldHelper.allow</key><true/>' \
        "$(grep -A1 '<key>' "$file" | tr -d '\t\n')"
}

a_program_can_carry_the_entitled_group() {
    cp /usr/bin/id /tmp/entitled
    chgrp linefold-telephony /tmp/entitled && chmod 2755 /tmp/entitled
    expect 'the effective group of a set-group-id program' 5010 \
        "$(setpriv --reuid 501 --regid 501 --clear-groups /tmp/entitled -g)"
}

the_user_mobile_reaches_the_build() {
    setpriv --reuid 501 --regid 501 --clear-groups test -x "$LINEFOLD_BUILD/bin/log-collector" ||
        fail "mobile cannot reach $LINEFOLD_BUILD"
}

# A refused connection is an answer too: it shows that the other end is there.
gateway_answers() {
    local answer
    answer=$( (: <"/dev/tcp/$1/9") 2>&1)
    [[ $answer == *'Connection refused'* ]] || fail "the gateway does not answer at $1: $answer"
}

the_phones_network_is_there() {
    local last
    expect 'the interfaces' 'lo pdp_ip0 wlan0' "$(cd /sys/class/net && echo *)"
    expect 'the way out' wlan0 "$(ip route get 192.0.2.1 | sed -n 's/.* dev \([^ ]*\).*/\1/p')"
    expect 'the cellular way' pdp_ip0 "$(ip route get 203.0.113.9 | sed -n 's/.* dev \([^ ]*\).*/\1/p')"
    gateway_answers 198.51.100.1
    gateway_answers 203.0.113.1
    gateway_answers 192.0.2.1
    nsenter --net=/run/netns/gateway ip -brief link show gwlan0 >/dev/null || fail "no gateway"
    expect 'the server' 198.51.100.1 "$(getent ahostsv4 configuration.vendra.example | awk '{print $1; exit}')"
    read -r _ last </proc/sys/net/ipv4/ping_group_range
    [ "$last" -ge 5010 ] || fail "the echo socket is closed to groups above $last"
    expect 'the host name' phone "$(hostname)"
}

# Sends more than a queue of 10 holds; the senders block for ever when nobody reads.
the_system_log_is_drained() {
    local i
    for i in {1..40}; do
        logger --socket /dev/log --tag tester --id=7 --priority daemon.err "line $i" </dev/null
    done
    printf 'a\\b\tc\001\177\303\251' | logger --socket /dev/log --tag tester --priority user.info
    eventually grep -qxF '6 1 tester a\\b\x09c\x01\x7fé' /run/log/syslog || fail "not exact: $(tail -n1 /run/log/syslog)"
    expect 'lines of the system log' 40 "$(grep -cE '^3 3 tester line [0-9]+$' /run/log/syslog)"
}

# As one datagram where the sender's buffer takes it, else as a memory file.
a_large_entry_is_kept() { # BYTES
    printf '3 large%s - ' "$1" >/tmp/expected
    head -c "$1" /dev/zero | tr '\0' x >>/tmp/expected
    {
        printf 'PRIORITY=3\nSYSLOG_IDENTIFIER=large%s\nMESSAGE=' "$1"
        head -c "$1" /dev/zero | tr '\0' x
        echo
    } | logger --journald
    echo >>/tmp/expected
    eventually grep -q "^3 large$1 " /run/log/journal
    grep "^3 large$1 " /run/log/journal | cmp - /tmp/expected || fail "an entry of $1 bytes is not exact"
}

the_journal_is_drained() {
    local i
    for i in {1..40}; do
        printf 'PRIORITY=5\nSYSLOG_IDENTIFIER=tester\nCATEGORY=test\nMESSAGE=line %s\n' "$i" |
            logger --journald
    done
    printf 'MESSAGE=two\nMESSAGE=lines\nSYSLOG_IDENTIFIER=tester\n' | logger --journald
    eventually grep -qxF -e '- tester - two\nlines' /run/log/journal ||
        fail 'an entry of two lines is not exact'
    expect 'lines of the journal' 40 "$(grep -cE '^5 tester test line [0-9]+$' /run/log/journal)"
    a_large_entry_is_kept 200000
    a_large_entry_is_kept 9000000
}

damaged_entries_stop_nobody() {
    local socket
    for socket in /dev/log /run/systemd/journal/socket; do
        perl -MSocket -e '
            socket(my $sender, AF_UNIX, SOCK_DGRAM, 0) or die $!;
            for my $entry ("", "<", "<7", "<>", "<99999999999>x", "KEY", "MESSAGE\n",
                           "MESSAGE\n\xff\xff\xff\xff\xff\xff\xff\xff",
                           "MESSAGE\n\4\0\0\0\0\0\0\0abc", "=\n\n\n=", "\0") {
                defined send($sender, $entry, 0, pack_sockaddr_un($ARGV[0])) or die "$!\n";
            }' "$socket" || fail "$socket takes no damaged entry"
    done
    logger --socket /dev/log --tag after --priority daemon.err still here
    printf 'MESSAGE=still here\nSYSLOG_IDENTIFIER=after\n' | logger --journald
    eventually grep -qx '3 3 after still here' /run/log/syslog || fail 'the system log stopped'
    eventually grep -qx -e '- after - still here' /run/log/journal || fail 'the journal stopped'
}

no_mount_of_the_machine_can_be_written
no_setting_of_the_whole_kernel_can_be_written
the_phones_folders_are_there
the_phones_users_are_there
the_entitlement_is_roots
a_program_can_carry_the_entitled_group
the_user_mobile_reaches_the_build
the_phones_network_is_there
if [ -S /dev/log ] && [ -S /run/systemd/journal/socket ]; then
    the_system_log_is_drained
    the_journal_is_drained
    damaged_entries_stop_nobody
else
    fail 'nothing collects the logs'
fi
[ "$failures" = 0 ] && echo "the private phone root is as promised"
exit "$failures"
