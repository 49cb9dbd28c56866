#!/bin/bash
# Run inside: tools/sandbox tests/e2e/lfhelper_test.sh. What lfhelper makes of the real daemon's
# answers, and the daemon of lfhelper's requests.
set -u
# What is read from a pipe is run and counted here, too.
shopt -s lastpipe

. "$(dirname "$0")/../support/lfhelper.sh"
library=/private/var/mobile/Library
domain=com.vendra.test
file=$library/Preferences/$domain.plist

plist() {
    printf '<?xml version="1.0" encoding="UTF-8"?>\n<plist version="1.0">\n%s\n</plist>\n' "$1"
}

is_in_the_file() { grep -qF -e "$1" "$file" || fail "$what: the file of the domain lacks $1"; }

nobody_listens() {
    exits 3 check-in
    says ERROR_NO_SERVICE
    exits 3 --json preferences get "$domain" key
    json '.exitStatus == 3 and .name == "ERROR_NO_SERVICE" and .domain == "com.vendra.test"'
}

# These are values that stand alone: what was set is what is shown.
plain_values_come_back_as_they_were_set() {
    local type value
    while read -r type value; do
        exits 0 preferences set --type "$type" "$domain" "$type" -- "$value"
        prints 'preferences set: success'
        exits 0 preferences get "$domain" "$type"
        prints "$value"
        silent err
    done <<'END'
string Grüße "&<>'\ 📱
integer -9223372036854775808
real -0.1
boolean true
boolean false
END
    is_in_the_file '<integer>-9223372036854775808</integer>'
    exits 0 preferences set "$domain" empty ''
    exits 0 preferences get "$domain" empty
    prints ''
}

other_values_come_back_as_property_lists() {
    exits 0 preferences set --type date "$domain" date 2024-02-29T23:59:59Z
    exits 0 preferences get "$domain" date
    prints "$(plist '<date>2024-02-29T23:59:59Z</date>')"
    exits 0 preferences set --type data "$domain" data AP8=
    exits 0 preferences get "$domain" data
    prints "$(plist '<data>AP8=</data>')"
    exits 0 preferences get --plist "$domain" boolean
    prints "$(plist '<false/>')"
}

standard_input_is_a_value() {
    echo 'one line' | exits 0 preferences set "$domain" line -
    exits 0 preferences get "$domain" line
    prints 'one line'
    plist '<array><dict><key>a</key><real>inf</real></dict></array>' >/tmp/list
    exits 0 preferences set --type plist "$domain" list - </tmp/list
    exits 0 preferences get "$domain" list
    tr -d '\n\t' </tmp/out | grep -qF '<array><dict><key>a</key><real>+infinity</real></dict></array>' ||
        fail "$what: not the list that was set"
    printf 'bplist00\x09\x08\0\0\0\0\0\0\x01\x01\0\0\0\0\0\0\0\x01\0\0\0\0\0\0\0\0\0\0\0\0\0\0\0\x09' |
        exits 0 preferences set --type plist "$domain" binary -
    exits 0 preferences get "$domain" binary
    prints true
}

large_values_travel() {
    head -c 12000000 /dev/urandom | base64 >/tmp/large
    exits 0 preferences set --type data com.vendra.large data - </tmp/large
    exits 0 preferences get com.vendra.large data
    sed -n 's/<[^>]*>//g;s/^[[:space:]]*//;/^[A-Za-z0-9+\/=]\{1,\}$/p' /tmp/out | tr -d '\n' >/tmp/came
    tr -d '\n' </tmp/large | cmp - /tmp/came || fail "$what: not what was set"
    exits 2 preferences set --type plist com.vendra.large data - </dev/zero
    says 'standard input holds more than 16777216 bytes'
    head -c 16777216 /dev/zero | tr '\0' x | exits 2 preferences set com.vendra.large text -
    says 'VALUE is too large'
}

removed_and_absent_values_are_told_apart_from_failures() {
    exits 0 preferences remove "$domain" line
    prints 'preferences remove: success'
    ! grep -q '<key>line</key>' "$file" || fail "$what: it is still in the file"
    exits 4 preferences get "$domain" line
    says 'there is no value of "line" in com.vendra.test'
    silent out
    exits 4 --json preferences get "$domain" line
    json '.exitStatus == 4 and .code == 0 and .type == null and .value == null and has("value")'
    exits 0 preferences remove "$domain" line
}

refused_values_change_nothing() {
    local before
    before=$(sha256sum "$file")
    for value in '' xx '<plist/>' bplist00; do
        exits 1 preferences set --type plist "$domain" string "$value"
        says '5 FAILURE'
        silent out
    done
    exits 2 preferences set --type plist "$domain" string x
    exits 2 preferences set --type integer "$domain" string abc
    exits 1 preferences set "$domain" "$(printf '\377')" value
    exits 2 preferences set "$domain" "$(printf '%0257d' 0)" value
    says ERROR_ARGUMENT_TOO_LONG
    expect 'the file after refusals' "$before" "$(sha256sum "$file")"
}

# The later ones of the four places are asked only by --application.
application_values_are_searched_in_order() {
    mkdir -p /Library/Preferences
    local place number=0
    for place in /Library/Preferences/.GlobalPreferences "/Library/Preferences/$domain" \
        "$library/Preferences/.GlobalPreferences"; do
        number=$((number + 1))
        plist "<dict><key>wanted</key><integer>$number</integer></dict>" >"$place.plist"
        exits 0 preferences get --application "$domain" wanted
        prints "$number"
        exits 4 preferences get "$domain" wanted
    done
    exits 0 preferences set "$domain" wanted mine
    exits 0 preferences get --application "$domain" wanted
    prints mine
}

programs_get_json() {
    exits 0 --json preferences get "$domain" string
    json '.value == "Grüße \"&<>'\''\\ 📱" and .type == "string" and .key == "string" and .code == 0'
    exits 0 --json preferences get "$domain" real
    json '.value == -0.1 and .type == "real"'
    exits 0 --json preferences get "$domain" boolean
    json '.value == false and .type == "boolean"'
    exits 0 --json preferences set --type integer "$domain" integer 7
    json '.command == "preferences set" and .name == "SUCCESS"'
    exits 0 --json preferences get "$domain" integer
    json '.value == 7 and .type == "integer"'
    exits 0 --json preferences get "$domain" list
    json '.type == "array" and (.plist | startswith("<?xml")) and (has("value") | not)'
    exits 1 --json preferences set --type plist "$domain" list xx
    json '.exitStatus == 1 and .code == 5'
    exits 2 --json preferences set --type integer "$domain" list abc
    json '.exitStatus == 2 and .name == "USAGE"'
    exits 0 --json preferences remove "$domain" list
    json '.exitStatus == 0 and .key == "list"'
}

carrier_bundles_are_linked() {
    local link="$library/Carrier2Bundle.bundle"
    exits 0 link-carrier-bundle /somewhere/new.bundle "$link" com.vendra.carrier_2
    prints 'link-carrier-bundle: success'
    expect 'the bundle link' /somewhere/new.bundle "$(readlink "$link")"
    exits 1 --json link-carrier-bundle /somewhere /etc/passwd
    json '.code == 8 and .name == "NO_ACCESS" and .link == "/etc/passwd"'
    expect 'what was to be a link' 'regular file' "$(stat -c %F /etc/passwd)"
}

symbolic_links_are_made() {
    exits 0 create-symlink target "$library/link"
    expect 'the link' target "$(readlink "$library/link")"
    exits 1 create-symlink target "$library/no/such/folder"
    says '5 FAILURE'
}

preference_domains_are_removed() {
    local path=$library/Preferences/com.vendra.carrier_2.plist
    exits 0 preferences set com.vendra.carrier_2 key value
    exits 0 remove-preference-domain "$path" com.vendra.carrier_2
    [ ! -e "$path" ] || fail "$what: the file is still there"
    exits 4 preferences get com.vendra.carrier_2 key
    exits 1 remove-preference-domain "$path"
    exits 1 remove-preference-domain "$file"
    says '8 NO_ACCESS'
    [ -e "$file" ] || fail "$what: the file is gone"
}

the_heartbeat_is_switched() {
    exits 0 heartbeat on
    prints 'heartbeat: success'
    exits 0 --json heartbeat off
    json '.state == "off" and .code == 0 and .command == "heartbeat"'
    exits 2 --json heartbeat maybe
    json '.exitStatus == 2 and .name == "USAGE"'
}

files_are_put_into_place() {
    local bundles="$library/Carrier Bundles"
    mkdir -p /tmp/sent "$library/Logs/CrashReporter"
    plist '<dict/>' >/tmp/sent/Info.plist
    exits 0 copy-file /tmp/sent "$bundles/a.bundle" Info.plist
    prints 'copy-file: success'
    expect 'the owner of the copy' mobile "$(stat -c %U "$bundles/a.bundle/Info.plist")"
    exits 0 copy-log-directory /tmp/sent
    [ -f "$library/Logs/CrashReporter/sent/Info.plist" ] || fail "$what: no copy"
    exits 0 --json copy-archive /tmp/sent /tmp/copied
    json '.done and .code == 0 and .destination == "/tmp/copied"'
    exits 0 move-directory /tmp/copied "$bundles" b.bundle
    cmp -s /tmp/sent/Info.plist "$bundles/b.bundle/Info.plist" || fail "$what: not moved"
}

files_that_cannot_be_put_into_place_are_told() {
    exits 1 copy-file /tmp/sent /tmp/elsewhere Info.plist
    says 'the service did not copy Info.plist from /tmp/sent to /tmp/elsewhere'
    silent out
    exits 1 --json move-directory /tmp/sent /tmp/elsewhere x
    json '.done == false and .name == "NOT_DONE" and .exitStatus == 1'
    printf 'PK\3\4' >/tmp/torn
    exits 1 copy-archive /tmp/torn /tmp/expanded
    says 'its log tells why'
    exits 1 copy-log-directory /nowhere
}

property_list_files_are_shown() {
    exits 0 load-plist /tmp/sent/Info.plist
    prints "$(plist '<dict/>')"
    exits 0 --json load-plist /tmp/sent/Info.plist
    json '(.plist | contains("<dict/>")) and .path == "/tmp/sent/Info.plist"'
    exits 1 load-plist /nowhere
    says '9 NO_DATA'
    silent out
}

raw_messages_are_answered() {
    exits 1 raw 12345
    grep -q 'return code: -303 BAD_ID' /tmp/out || fail "$what: no return code"
    exits 1 --json raw 8683556 00
    json '.code == -304 and .descriptors == 0 and .header.id == 8683656'
}

only_the_entitled_are_served() {
    exits 0 check-in
    exits 3 --group mobile preferences get "$domain" string
    says '35 NOT_ENTITLED'
    silent out
    exits 2 preferences
    exits 3 --group no-such-group check-in
}

nobody_listens
serve
plain_values_come_back_as_they_were_set
other_values_come_back_as_property_lists
standard_input_is_a_value
large_values_travel
removed_and_absent_values_are_told_apart_from_failures
refused_values_change_nothing
application_values_are_searched_in_order
programs_get_json
carrier_bundles_are_linked
symbolic_links_are_made
preference_domains_are_removed
the_heartbeat_is_switched
files_are_put_into_place
files_that_cannot_be_put_into_place_are_told
property_list_files_are_shown
raw_messages_are_answered
only_the_entitled_are_served
finish "lfhelper and the daemon agree"
