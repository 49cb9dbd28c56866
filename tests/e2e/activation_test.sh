#!/bin/sh
# activation_test.sh SOURCES BUILD: 200 rounds of arrivals around the idle exit, in eight private
# phone roots side by side.
set -eu

sources=$1
build=$2
logs=$(mktemp -d)
trap 'rm -rf "$logs"' EXIT

for root in 1 2 3 4 5 6 7 8; do
    LINEFOLD_BUILD=$build "$sources/tools/sandbox" "$build/bin/activation_rounds" \
        </dev/null >"$logs/$root" 2>&1 &
    eval "pid$root=\$!"
done
failures=0
for root in 1 2 3 4 5 6 7 8; do
    eval "wait \$pid$root" || {
        failures=$((failures + 1))
        cat "$logs/$root"
    }
done
echo "activation: $((8 - failures)) of 8 private roots served everybody in 25 rounds each"
[ "$failures" = 0 ]
