# Sourced by the tests that are shell scripts: they count what fails and go on.
failures=0

fail() {
    echo "FAILED: $1"
    failures=$((failures + 1))
}

expect() { # WHAT EXPECTED FOUND
    [ "$2" = "$3" ] || fail "$1: expected '$2', found '$3'"
}
