#!/bin/bash
# Run inside: tools/sandbox tests/updates/lfhelper_update_test.sh. What "lfhelper update-databases" asks
# for, waits for and says.
set -u

programs=$LINEFOLD_BUILD/bin
socket=/run/linefold/com.vendra.linefold.mobile-helper
web=/run/web
origin=https://configuration.vendra.example
. "$(dirname "$0")/../support/expect.sh"

# exits STATUS ARGUMENT...
exits() {
    local wanted=$1 status=0
    shift
    what="lfhelper update-databases $*"
    timeout 60 "$programs/lfhelper" update-databases "$@" >/tmp/out 2>/tmp/err || status=$?
    [ "$status" = "$wanted" ] || fail "$what: exit status $status, not $wanted: $(cat /tmp/err)"
}

prints() { [ "$1" = "$(cat /tmp/out)" ] || fail "$what: prints $(cat /tmp/out), not $1"; }
says() { grep -qF -e "$1" /tmp/err || fail "$what: does not say: $1"; }
requests() { grep -c 'Trying to see if update available' /run/log/journal; }

entry() { # TYPE VERSION
    echo "$1 $2" | gzip >"$web/databases/$1.gz"
    echo "<key>$1</key><dict><key>Version</key><string>$2</string>"
    echo "<key>ContentURL</key><string>$origin/databases/$1.gz</string></dict>"
}

index() { # ENTRIES
    echo "<plist version=\"1.0\"><dict>$1</dict></plist>" >"$web/1/v3/lasd.plist"
}

mkdir -p "$web/1/v3" "$web/databases"
"$programs/activator" "$socket" com.vendra.linefold.mobile-helper "$programs/LinefoldMobileHelper" &
while [ ! -S "$socket" ]; do sleep 0.01; done
"$programs/linefold-sim" configuration-server "$web" >/tmp/web.log &
while ! grep -qs serving /tmp/web.log; do sleep 0.01; done

# What is wrong with the words is told before anything is asked.
for types in '' gsm, ,gsm gsm,,lte GSM foo 0x -1 4294967296 'gsm lte'; do
    exits 2 --types "$types"
    says 'the value of --types must be'
done
for seconds in '' 0 -5 x 1.5 86401; do
    exits 2 --timeout "$seconds"
    says 'the value of --timeout must be'
done
exits 2 gsm
expect "requests so far" 0 "$(requests)"

# Without waiting one request goes out, whose mask is that of the types.
exits 0 --types gsm,lte
prints 'update-databases: success'
exits 0 --types 0x40
exits 0
exits 0 --types 12 --json
grep -q '"code":0' /tmp/out || fail "$what: $(cat /tmp/out)"
expect "the masks" '1f 40 c c' "$(sed -n 's/.*for mask //p' /run/log/journal | sort | xargs)"

# Their outcomes must not be taken for those of the requests to come.
while [ "$(grep -c 'Could not fetch data' /run/log/journal)" -lt 4 ]; do sleep 0.01; done

# The index is not there.
exits 1 --types gsm,umts --wait
prints 'gsm: the update failed
umts: the update failed'
says 'failed: gsm, umts'
says 'waiting for the result at com.vendra.Linefold.lasd, at most 300 seconds'

# One type after the other, in the service's order.
index "$(entry lte 1)$(entry gsm 2)"
exits 0 --types lte,gsm,umts --wait --timeout 30
prints 'gsm: updated
umts: no update required
lte: updated'
says 'at most 30 seconds'
expect "the gsm database" "gsm 2" "$(cat /var/mobile/Library/LASD/gsm)"
exits 0 --types all --wait --json
grep -qF '"outcomes":{"gsm":"NoUpdateRequired","umts":"NoUpdateRequired","cdma":"NoUpdateRequired","lte":"NoUpdateRequired","scdma":"NoUpdateRequired"}' /tmp/out ||
    fail "$what: $(cat /tmp/out)"
exits 0 --types 0x20 --wait
prints 'none of the types: no update required'

# Some of them fail.
index "$(entry lte 2)$(entry gsm 3)"
rm "$web/databases/gsm.gz"
exits 1 --types gsm,lte --wait --json
grep -qF '"name":"UPDATE_FAILED"' /tmp/out || fail "$what: $(cat /tmp/out)"
grep -qF '"outcomes":{"gsm":"UpdateFailed","lte":"UpdateAvailable"}' /tmp/out ||
    fail "$what: $(cat /tmp/out)"

# A type whose entry has no URL has no outcome.
index "<key>gsm</key><dict><key>Version</key><string>4</string></dict>"
exits 1 --types umts,gsm --wait --timeout 1
says 'no result came within 1 seconds'

# The telephony daemon has its port: nothing is asked.
before=$(requests)
"$programs/linefold-sim" telephony --only lasd >/tmp/heard &
while ! grep -qs ready /tmp/heard; do sleep 0.01; done
exits 3 --types gsm --wait
says 'somebody owns the port com.vendra.Linefold.lasd'
expect "requests meanwhile" "$before" "$(requests)"

exit "$((failures > 0))"
