#!/bin/sh
# packaging_test.sh BUILD: installs into a folder of its own and has systemd's tools look at it.
set -eu

build=$1
root=$(mktemp -d)
trap 'rm -rf "$root"' EXIT
. "$(dirname "$0")/../support/expect.sh"

DESTDIR=$root cmake --install "$build" >"$root/install.log" || { cat "$root/install.log"; exit 1; }
prefix=$root/usr/local

for file in libexec/LinefoldMobileHelper bin/lfhelper include/linefold_helper.h \
    lib/systemd/system/linefold-mobile-helper.socket lib/sysusers.d/linefold-mobile-helper.conf; do
    [ -e "$prefix/$file" ] || fail "$file is not installed"
done

grants=$root/etc/linefold/entitlements/linefold-telephony.plist
[ "$(stat -c %a "$grants")" = 644 ] || fail "the entitlement file is writable by others"

# verify ends with 0 for misspelt keys, so its output must be empty. The units name the daemon by
# its installed path, which stands below our folder here.
mkdir "$root/units"
sed "s|^ExecStart=.*|ExecStart=/bin/true|" \
    "$prefix/lib/systemd/system/linefold-mobile-helper.service" >"$root/units/linefold-mobile-helper.service"
cp "$prefix/lib/systemd/system/linefold-mobile-helper.socket" "$root/units/"
said=$(systemd-analyze verify --recursive-errors=no "$root/units/linefold-mobile-helper.service" \
    "$root/units/linefold-mobile-helper.socket" 2>&1) || fail "systemd-analyze verify: $said"
[ -z "$said" ] || fail "systemd-analyze verify says: $said"
grep -q '^ExecStart=/.*/libexec/LinefoldMobileHelper$' \
    "$prefix/lib/systemd/system/linefold-mobile-helper.service" || fail "the unit starts another program"

mkdir -p "$root/phone/etc"
systemd-sysusers --root="$root/phone" "$prefix/lib/sysusers.d/linefold-mobile-helper.conf"
grep -q '^mobile:x:501:' "$root/phone/etc/passwd" || fail "there is no user mobile 501"
grep -q '^linefold-telephony:' "$root/phone/etc/group" || fail "there is no telephony group"
if [ "$(id -u)" = 0 ]; then
    systemd-tmpfiles --root="$root/phone" --create "$prefix/lib/tmpfiles.d/linefold-mobile-helper.conf"
    [ "$(readlink "$root/phone/var/mobile")" = ../private/var/mobile ] || fail "/var/mobile is no link"
    [ "$(stat -c %u "$root/phone/private/var/mobile/Library/Carrier Bundles")" = 501 ] ||
        fail "the carrier bundles are not the mobile user's"
    [ "$(stat -c '%a %u' "$root/phone/private/var/db/linefold")" = '700 0' ] ||
        fail "the folder of the voicemail tokens is open to others"
fi

[ "$failures" = 0 ] || exit 1
echo "packaging: all as it should be"
