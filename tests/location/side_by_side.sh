#!/bin/sh
# Runs the tests of one program in several phone roots at a time, since they spend their time
# waiting: side_by_side.sh SANDBOX PROGRAM ROOTS
set -u

sandbox=$1
program=$2
roots=$3
folder=$(mktemp -d)
trap 'rm -rf "$folder"' EXIT

run() { # INDEX
    GTEST_TOTAL_SHARDS=$roots GTEST_SHARD_INDEX=$1 "$sandbox" "$program" >"$folder/$1" 2>&1 || {
        cat "$folder/$1"
        return 1
    }
    # A root without any test of its own proves nothing.
    grep -q '^\[  PASSED  \] [1-9]' "$folder/$1"
}

jobs=
index=0
while [ "$index" -lt "$roots" ]; do
    run "$index" &
    jobs="$jobs $!"
    index=$((index + 1))
done
status=0
for job in $jobs; do
    wait "$job" || status=1
done
[ "$status" -eq 0 ] && cat "$folder"/*
exit "$status"
