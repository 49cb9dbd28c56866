#!/bin/bash
# Run inside: tools/sandbox tests/e2e/doctor_test.sh. Everything that "lfhelper doctor" looks at is
# broken in turn: it says so in the one line, and all is well again when it is mended.
set -u
. "$(dirname "$0")/../support/lfhelper.sh"
library=/private/var/mobile/Library
entitlements=/etc/linefold/entitlements
granting=$entitlements/linefold-telephony.plist
configuration=/etc/linefold/platform.plist

# The line of a check begins so, and ends in a remedy where one is due.
line() { # LEVEL CHECK PART
    grep -E "^$1 +$2: " /tmp/out | grep -qF -e "$3" || {
        fail "$what: no line '$1 $2: ... $3'"
        grep " $2: " /tmp/out | sed 's/^/    it says: /'
    }
    [ "$1" != problem ] || grep -E "^$1 +$2: .+ -> .+" /tmp/out >/dev/null ||
        fail "$what: says nothing about how to mend $2"
}

count() { grep -c "^$1 " /tmp/out; }

# After a breakage: its one line is there, it is the only problem, and the exit status says so.
problem() { # CHECK PART
    exits 1 doctor
    line problem "$1" "$2"
    expect "problems beside $1" 1 "$(count problem)"
}

noted() { # CHECK PART
    exits 0 doctor
    line note "$1" "$2"
}

well() {
    exits 0 doctor
    expect 'problems when all is well' 0 "$(count problem)"
}

plist() { printf '<plist><dict>%s</dict></plist>\n' "$1"; }

all_is_well() {
    well
    line ok service-socket "$socket is a socket of root's"
    line ok entitled-group linefold-telephony
    line ok entitlement-file 'grants com.vendra.Halvane.LinefoldHelper.allow'
    line ok mobile-user 501
    line ok voicemail-folder 'the service makes it when it needs it'
    line ok databases-folder 'the service makes it when it needs it'
    line ok service-answer 'takes this caller'
    grep -qE '^0 problems, [0-9]+ notes?$' /tmp/out || fail "$what: no last line"
    silent err
    exits 2 doctor now
}

programs_get_json() {
    exits 0 --json doctor
    json '.command == "doctor" and .exitStatus == 0 and .problems == 0'
    json '.checks | map(.check) | length == (unique | length)'
    json '.checks[] | select(.check == "service-answer") | .level == "ok" and .remedy == null'
    rm "$granting.kept" 2>/dev/null
    mv "$granting" "$granting.kept"
    exits 1 --json doctor
    json '.exitStatus == 1 and .problems == 2'
    json '.checks[] | select(.check == "entitlement-file") | .level == "problem" and .remedy != null'
    mv "$granting.kept" "$granting"
    well
}

the_socket_is_looked_at() {
    chmod 600 "$socket"
    problem service-socket 'is not open to all callers'
    chmod 666 "$socket"
    chown mobile "$socket"
    problem service-socket 'belongs to user 501'
    chown root "$socket"
    chmod 777 /run/linefold
    problem service-folder 'can be written by others than root'
    chmod 755 /run/linefold
    mv "$socket" "$socket.kept"
    problem service-socket 'is not there'
    : >"$socket"
    problem service-socket 'is a file and not a socket'
    rm "$socket"
    mv "$socket.kept" "$socket"
    well
}

somebody_must_answer() {
    # A listening socket whose program does nothing.
    perl -MSocket -e 'socket(my $s, AF_UNIX, SOCK_SEQPACKET, 0); bind($s, sockaddr_un($ARGV[0]));
        listen($s, 5); chmod 0666, $ARGV[0]; sleep 60' /run/linefold/mute &
    local mute=$!
    while [ ! -S /run/linefold/mute ]; do sleep 0.05; done
    exits 1 doctor --service /run/linefold/mute
    line problem service-answer 'does not answer within 5 seconds'
    kill "$mute"
    exits 1 doctor --service /run/linefold/mute
    line problem service-answer 'the service cannot be used'
    rm /run/linefold/mute
}

the_entitlement_is_looked_at() {
    exits 1 doctor --group no-such-group
    line problem entitled-group 'there is no group no-such-group'
    exits 1 doctor --group mobile
    line problem entitlement-file "$entitlements/mobile.plist is not there"
    line problem service-answer 'the group mobile is not entitled'
    chmod 777 "$entitlements"
    exits 1 doctor
    line problem entitlement-folder 'can be written by others than root'
    chmod 755 "$entitlements"
    cp "$granting" /tmp/granting
    refused_entitlement 'can be written by others than root' chmod 666
    refused_entitlement 'belongs to user 501' chown mobile
    refused_entitlement 'is a symbolic link' ln -sf /tmp/granting
    for content in '' '<key>com.vendra.Halvane.LinefoldHelper.allow</key><false/>' \
        '<key>com.vendra.Halvane.LinefoldHelper.allow</key><string>true</string>'; do
        plist "$content" >"$granting"
        exits 1 doctor
        line problem entitlement-file 'does not grant'
    done
    echo nonsense >"$granting"
    exits 1 doctor
    line problem entitlement-file 'is not a property list'
    truncate -s 65537 "$granting"
    exits 1 doctor
    line problem entitlement-file 'is larger than 64 KiB'
    cat /tmp/granting >"$granting"
    mv "$entitlements" "$entitlements.kept"
    exits 1 doctor
    line problem entitlement-folder 'nobody is entitled'
    mv "$entitlements.kept" "$entitlements"
    well
}

refused_entitlement() { # PART COMMAND...: the command spoils the file
    local part=$1
    shift
    "$@" "$granting"
    exits 1 doctor
    line problem entitlement-file "$part"
    rm "$granting"
    cp /tmp/granting "$granting"
}

the_mobile_user_is_looked_at() {
    cp /etc/passwd /tmp/passwd
    sed -i '/^mobile:/d' /etc/passwd
    problem mobile-user 'there is no user mobile'
    sed 's|^mobile:.*|mobile:x:501:501:::/bin/sh|' /tmp/passwd >/etc/passwd
    problem mobile-user 'has no home'
    sed 's|/var/mobile|/nowhere|' /tmp/passwd >/etc/passwd
    problem mobile-home '/nowhere is not there'
    mkdir /run/elsewhere && chown mobile /run/elsewhere
    sed 's|/var/mobile|/run/elsewhere|' /tmp/passwd >/etc/passwd
    problem mobile-home 'is not /private/var/mobile'
    cat /tmp/passwd >/etc/passwd
    chown root /private/var/mobile
    problem mobile-home 'belongs to user 0'
    chown mobile /private/var/mobile
    well
}

the_folders_are_looked_at() {
    mv "$library/Preferences" "$library/kept"
    problem preferences-folder 'no preference can be stored'
    : >"$library/Preferences"
    problem preferences-folder 'is a file and not a folder'
    rm "$library/Preferences"
    mv "$library/kept" "$library/Preferences"
    chown root "$library/Preferences"
    problem preferences-folder 'belongs to user 0'
    chown mobile "$library/Preferences"
    mkdir "$library/LASD"
    exits 0 doctor
    line ok databases-folder "is root's"
    chown 777 "$library/LASD"
    problem databases-folder 'belongs to user 777'
    rmdir "$library/LASD"
    noted crash-reports-folder 'is not there'
    mkdir -p -m 700 /private/var/db/linefold
    exits 0 doctor
    line ok voicemail-folder "is root's"
    chmod 777 /private/var/db/linefold
    problem voicemail-folder 'can be written by others than root'
    rmdir /private/var/db/linefold
    mv "$library" "$library.kept"
    exits 1 doctor
    line problem library-folder 'is not there'
    mv "$library.kept" "$library"
    well
}

what_the_heartbeat_needs_is_looked_at() {
    local range
    range=$(cat /proc/sys/net/ipv4/ping_group_range)
    for groups in '1 0' '1 5'; do
        echo "$groups" >/proc/sys/net/ipv4/ping_group_range
        problem echo-socket "root's group may not open echo sockets"
    done
    echo "$range" >/proc/sys/net/ipv4/ping_group_range
    mv /etc/protocols /etc/protocols.kept
    problem echo-protocol 'the protocol icmp is not known'
    mv /etc/protocols.kept /etc/protocols
    ip link set pdp_ip0 down
    ip link set pdp_ip0 name away
    noted cellular-interface 'there is no interface pdp_ip0'
    ip link set away name pdp_ip0
    well
}

the_configuration_is_looked_at() {
    noted configuration-file 'is not there'
    plist '' >"$configuration"
    noted country-code 'has no CountryCode'
    line note geocoding-server 'has no ReverseGeocodeURL'
    line note stun-server 'has no StunServer'
    plist '<key>CountryCode</key><string>CH</string>
        <key>ReverseGeocodeURL</key><string>https://[2001:db8::1]:8443/reverse</string>
        <key>StunServer</key><string>stun.vendra.example:3478</string>' >"$configuration"
    well
    line ok country-code '"CH"'
    line ok geocoding-server '8443/reverse'
    line ok stun-server ':3478'
    local good
    good=$(cat "$configuration")
    spoiled_configuration country-code '<string>CH</string>' '<integer>41</integer>'
    spoiled_configuration geocoding-server 'https:' 'ftp:'
    spoiled_configuration stun-server ':3478' ':99999'
    echo nonsense >"$configuration"
    problem configuration-file 'is not a property list'
    echo "$good" >"$configuration"
    chmod 666 "$configuration"
    problem configuration-file 'can be written by others than root'
    chmod 644 "$configuration"
    chmod 777 /etc/linefold
    problem configuration-folder 'can be written by others than root'
    chmod 755 /etc/linefold
    rm "$configuration"
    well
}

spoiled_configuration() { # CHECK OLD NEW
    echo "${good/"$2"/"$3"}" >"$configuration"
    problem "$1" ' is not '
}

the_libraries_are_looked_at() {
    local folder=/usr/lib/linefold
    cp "$folder/libLinefoldRadio.so" /tmp/radio
    rm "$folder/libLinefoldRadio.so"
    noted radio-module 'is not there'
    cp /tmp/radio "$folder/libLinefoldRadio.so"
    chmod 666 "$folder/libLinefoldRadio.so"
    problem radio-module 'it is not loaded'
    chmod 644 "$folder/libLinefoldRadio.so"
    chown mobile "$folder/libLinefoldRadio.so"
    problem radio-module 'belongs to user 501'
    rm "$folder/libLinefoldRadio.so"
    cp /tmp/radio "$folder/libLinefoldRadio.so"
    : >"$folder/libVisualVoicemail.so"
    chmod 646 "$folder/libVisualVoicemail.so"
    problem visual-voicemail 'can be written by others than root'
    rm "$folder/libVisualVoicemail.so"
    chmod 777 "$folder"
    problem library-directory 'nothing in it is loaded'
    chmod 755 "$folder"
    well
}

others_than_root_see_what_they_can() {
    lfhelper_as_mobile=(setpriv --reuid mobile --regid mobile --clear-groups "$lfhelper")
    what='lfhelper doctor as mobile'
    chmod 700 "$entitlements"
    "${lfhelper_as_mobile[@]}" doctor >/tmp/out 2>/tmp/err
    expect "$what" 0 $?
    line note caller 'cannot take the group linefold-telephony'
    line note entitlement-file 'run this as root'
    line note service-answer 'does not take this caller'
    chmod 755 "$entitlements"
    setpriv --reuid mobile --regid linefold-telephony --clear-groups "$lfhelper" doctor >/tmp/out
    expect 'lfhelper doctor in the entitled group' 0 $?
    line ok caller 'runs in the group linefold-telephony'
    line ok service-answer 'takes this caller'
}

exits 1 doctor
line problem service-socket 'is not there'
serve
all_is_well
programs_get_json
the_socket_is_looked_at
somebody_must_answer
the_entitlement_is_looked_at
the_mobile_user_is_looked_at
the_folders_are_looked_at
what_the_heartbeat_needs_is_looked_at
the_configuration_is_looked_at
the_libraries_are_looked_at
others_than_root_see_what_they_can
finish 'the doctor finds what is broken'
