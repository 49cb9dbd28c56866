#!/bin/bash
# Run inside: tools/sandbox tests/location/lfhelper_location_test.sh. The commands for locations, and
# the parts of the phone that linefold-sim plays for them.
set -u

programs=$LINEFOLD_BUILD/bin
socket=/run/linefold/com.vendra.linefold.server
waits='lfhelper: waiting for the result at com.vendra.linefold.server, at most 10 seconds'
failures=0

fail() {
    failures=$((failures + 1))
    echo "FAILED: $1"
    head -c 500 /tmp/out | sed 's/^/    stdout: /'
    head -c 500 /tmp/err | sed 's/^/    stderr: /'
}

# exits STATUS ARGUMENT...: runs lfhelper.
exits() {
    local wanted=$1
    shift
    what="lfhelper $*"
    timeout 30 "$programs/lfhelper" "$@" >/tmp/out 2>/tmp/err </dev/null
    local status=$?
    [ "$status" -eq "$wanted" ] || fail "$what: exit status $status, not $wanted"
}

prints() { printf '%s\n' "$1" | cmp -s - /tmp/out || fail "$what: does not print: $1"; }
says() { grep -qF -e "$1" /tmp/err || fail "$what: does not say: $1"; }
json() {
    [ "$(wc -l </tmp/out)" -eq 1 ] || fail "$what: not one line of JSON"
    jq -e "$1" /tmp/out >/tmp/jq 2>&1 || fail "$what: not so in its JSON: $1"
}

# line FILE TEXT: waits until the file has it, at most 10 s.
line() {
    for _ in {1..1000}; do
        grep -qxF -e "$2" "$1" && return
        sleep 0.01
    done
    fail "$1 lacks: $2 (it has: $(tr '\n' ';' <"$1"))"
}

configure() { # ENTRY...: key and text, by turns
    {
        echo '<plist version="1.0"><dict>'
        while [ $# -gt 0 ]; do
            echo "<key>$1</key><string>$2</string>"
            shift 2
        done
        echo '</dict></plist>'
    } >/etc/linefold/platform.plist
}

# plays NAME ROLE ARGUMENT...: starts a role, whose output goes to /tmp/NAME, and waits for it.
plays() {
    local name=$1
    shift
    : >"/tmp/$name"
    case $1 in
        telephony) "$programs/linefold-sim" "$@" >"/tmp/$name" 2>&1 & ;;
        *) nsenter --net=/run/netns/gateway "$programs/linefold-sim" "$@" >"/tmp/$name" 2>&1 & ;;
    esac
    player=$!
    line "/tmp/$name" ready
}

ends() { # PROCESS: a role ends by SIGTERM, with status 0
    kill "$1"
    wait "$1" || fail "linefold-sim: exit status $? after SIGTERM"
}

"$programs/LinefoldMobileHelper" &
daemon=$!
for _ in {1..1000}; do
    [ -S /run/linefold/com.vendra.linefold.mobile-helper ] && break
    sleep 0.01
done

# ---- The country
exits 4 country-code
says 'country-code: the service has no country code'
exits 4 --json country-code
json '.exitStatus == 4 and .code == 0 and .countryCode == ""'
configure CountryCode US ReverseGeocodeURL http://198.51.100.1:8080/reverse \
    StunServer 198.51.100.1:3478
exits 0 country-code
prints US
exits 0 --json country-code
json '.countryCode == "US" and .exitStatus == 0'

# ---- Waiting in the telephony daemon's place
plays geocoder geocoder --country gb --state England --city 'Stoke "upon" Trent'
geocoder=$player
plays stun stun
stun=$player
exits 0 civic-address --wait 53.0 -2.18
says "$waits"
prints "country code: GB
state: England
city: Stoke \"upon\" Trent
postal code: "
exits 0 --json civic-address --wait 53.0 -2.18
json '.countryCode == "GB" and .postalCode == "" and .state == "England" and .city == "Stoke \"upon\" Trent"'
line /tmp/geocoder 'GET /reverse?format=jsonv2&lat=53.0000000&lon=-2.1800000&zoom=18&addressdetails=1&accept-language=en HTTP/1.1'
exits 0 civic-address --wait 0 0
prints "country code: US
state: 
city: 
postal code: "
exits 0 wan-ip --wait
prints 'address: 198.51.100.2'
exits 0 --json wan-ip --wait
json '.address == "198.51.100.2" and .code == 0'
[ ! -e "$socket" ] || fail "lfhelper leaves its port behind"

# ---- Nothing is asked while the telephony daemon is there
plays telephony telephony
telephony=$player
exits 3 wan-ip --wait
says 'somebody owns the port com.vendra.linefold.server'
says 'nothing was asked'
exits 3 --json civic-address --wait 53.0 -2.18
json '.exitStatus == 3 and .code == null and .name == "PORT_NOT_FREE"'
grep -q . /tmp/telephony && [ "$(wc -l </tmp/telephony)" -eq 1 ] || fail "something was asked"

# ---- What the telephony daemon is told
exits 0 civic-address 53.0 -2.18
prints 'civic-address: success'
line /tmp/telephony 'civic info: country code "GB", state "England", city "Stoke \"upon\" Trent", postal code ""'
exits 0 wan-ip
line /tmp/telephony 'routable address: "198.51.100.2"'
ends "$telephony"

# ---- A telephony daemon that refuses, talks, is away
plays telephony telephony --error 7 --notify hello --delay 0.1
exits 0 wan-ip
line /tmp/telephony 'routable address: "198.51.100.2"'
line /run/log/journal '3 LinefoldMobileHelper - sendWanIPToHV failed WAN IP to Linefold due to error: 7'
line /run/log/syslog '5 3 LinefoldMobileHelper _ServerConnectionCallback for LinefoldMobileHelper'
ends "$player"
plays telephony telephony --only lasd
exits 0 wan-ip
line /run/log/journal '3 LinefoldMobileHelper - sendWanIPToHV to Linefold failed, could not open HVServerConnection'
ends "$player"

# ---- Servers that misbehave
ends "$geocoder"
ends "$stun"
plays geocoder geocoder --failure 'Unable to geocode'
exits 0 civic-address --wait 53.0 -2.18
prints "country code: US
state: 
city: 
postal code: "
line /run/log/syslog '3 3 LinefoldMobileHelper _RequestCivicInfoFromLatitudeLongitude error: (Unable to geocode)'
ends "$player"
plays stun stun --claim 2001:db8::7 --plain --skip 1
exits 0 wan-ip --wait
prints 'address: 2001:db8::7'
ends "$player"
plays stun stun --error 438
exits 0 wan-ip --wait
prints 'address: '
line /run/log/journal '3 LinefoldMobileHelper - _RequestWanIPFromLocation error: (the STUN server refused with error 438)'
ends "$player"

# ---- A geocoder behind HTTPS, trusted and not
mkdir /tmp/www
echo '{"address":{"town":"Ely","country_code":"gb"}}' >/tmp/www/reverse
configure CountryCode US ReverseGeocodeURL https://configuration.vendra.example/reverse
serves_https() { # CERTIFICATE
    "$programs/linefold-sim" configuration-server --certificate "$1" /tmp/www >/tmp/https 2>&1 &
    player=$!
    for _ in {1..1000}; do
        [ -s /tmp/https ] && return
        sleep 0.01
    done
    fail "no configuration server"
}
serves_https trusted
exits 0 --json civic-address --wait 52.4 0.26
json '.countryCode == "GB" and .city == "Ely" and .state == ""'
ends "$player"
serves_https self-signed
exits 0 --json civic-address --wait 52.4 0.26
json '.countryCode == "US" and .city == ""'
ends "$player"

# ---- The database updater's notifications, and what is none
plays telephony telephony --only lasd
perl -e '
    use Socket;
    for my $body (q(<plist><dict><key>Notification</key><string>com.vendra.lasd.UpdateAvailable</string>) .
                  q(<key>DBType</key><string>gsm</string></dict></plist>),
                  q(<plist><dict><key>Notification</key><string>com.vendra.lasd.UpdateFailed</string>) .
                  q(</dict></plist>), "nonsense") {
        socket(my $s, AF_UNIX, 5, 0);
        connect($s, sockaddr_un("/run/linefold/com.vendra.Linefold.lasd")) or die $!;
        send($s, pack("V6", 0, 24 + length $body, 0, 0, 0, 0) . $body, 0);
    }' || fail "no notification could be sent"
line /tmp/telephony 'database: "com.vendra.lasd.UpdateAvailable", type "gsm"'
line /tmp/telephony 'database: "com.vendra.lasd.UpdateFailed"'
line /tmp/telephony 'not understood: message 0 of 8 bytes at com.vendra.Linefold.lasd'
what='linefold-sim telephony'
"$programs/linefold-sim" telephony >/tmp/out 2>/tmp/err
[ $? -eq 1 ] || fail "$what: a second one plays"
says 'the port com.vendra.Linefold.lasd is taken'
ends "$player"

kill "$daemon"
wait "$daemon"
[ "$failures" -eq 0 ] || exit 1
echo "all as expected"
