#!/bin/sh
# heartbeat_test.sh SOURCES BUILD: the heartbeat's tests, which wait most of their time, in five
# private phone roots side by side.
set -eu

sources=$1
build=$2
logs=$(mktemp -d)
trap 'rm -rf "$logs"' EXIT

for root in 0 1 2 3 4; do
    LINEFOLD_BUILD=$build GTEST_TOTAL_SHARDS=5 GTEST_SHARD_INDEX=$root \
        "$sources/tools/sandbox" "$build/bin/heartbeat_e2e" </dev/null >"$logs/$root" 2>&1 &
    eval "pid$root=\$!"
done
failures=0
for root in 0 1 2 3 4; do
    eval "wait \$pid$root" || {
        failures=$((failures + 1))
        cat "$logs/$root"
    }
done
echo "heartbeat: the tests of $((5 - failures)) of 5 private roots passed"
[ "$failures" = 0 ]
