#!/bin/bash
# Run inside: tools/sandbox tests/e2e/lfhelper_voicemail_test.sh. The commands for voicemail tokens
# and radio logging, before the real daemon.
set -u
# What is read from a pipe is run and counted here, too.
shopt -s lastpipe
. "$(dirname "$0")/../support/lfhelper.sh"
store=/private/var/db/linefold/voicemail.plist

tokens_come_back_as_they_were_set() {
    exits 0 voicemail set-token 'Tökén <&>'
    prints 'voicemail set-token: success'
    exits 0 voicemail get-token
    prints 'Tökén <&>'
    silent err
    exits 0 voicemail set-token --key +15550100 other
    exits 0 voicemail get-token --key +15550100
    prints other
    exits 0 voicemail get-token
    prints 'Tökén <&>'
}

standard_input_is_a_token() {
    echo secret | exits 0 voicemail set-token --key input -
    exits 0 voicemail get-token --key input
    prints secret
    printf 'two\nlines\n\n' | exits 0 voicemail set-token --key input -
    exits 0 voicemail get-token --key input
    printf 'two\nlines\n\n' | cmp -s - /tmp/out || fail "$what: not the token that was set"
    printf 'a\0b' | exits 2 voicemail set-token -
    says 'without NUL'
    exits 2 voicemail set-token - </dev/zero
    says 'standard input holds more than'
    exits 0 voicemail get-token
    prints 'Tökén <&>'
}

no_output_but_the_answer_holds_a_token() {
    exits 0 --json voicemail set-token --key quiet top-secret
    json '.key == "quiet" and (has("token") | not)'
    exits 2 voicemail set-token --key "$(printf '%0257d' 0)" top-secret
    ! grep -q top-secret /tmp/out /tmp/err || fail "$what: the token is in the output"
    ! grep -q -e top-secret -e Tökén /run/log/journal /run/log/syslog || fail 'a token is in a log'
    expect 'the mode of the store' '600 root' "$(stat -c '%a %U' "$store")"
    expect 'the mode of its folder' '700 root' "$(stat -c '%a %U' "$(dirname "$store")")"
}

tokens_that_are_absent_or_too_long_are_told_apart_from_failures() {
    exits 4 voicemail get-token --key absent
    says 'there is no token under the key "absent"'
    silent out
    exits 4 --json voicemail get-token --key absent
    json '.exitStatus == 4 and .code == 0 and .token == null and has("token")'
    exits 0 voicemail set-token --key long "$(printf '%0255d' 0)"
    exits 0 voicemail get-token --key long
    prints "$(printf '%0255d' 0)"
    exits 0 voicemail set-token --key long "$(printf '%0256d' 0)"
    exits 4 voicemail get-token --key long
    exits 2 voicemail set-token "$(printf '%0257d' 0)"
    says ERROR_ARGUMENT_TOO_LONG
}

what_is_not_utf8_is_refused() {
    exits 1 voicemail set-token "$(printf '\377')"
    says '5 FAILURE'
    exits 1 voicemail set-token --key "$(printf '\377')" token
    exits 1 voicemail get-token --key "$(printf '\377')"
    silent out
}

tokens_are_cleared_and_removed() {
    exits 0 voicemail clear-token
    prints 'voicemail clear-token: success'
    exits 4 voicemail get-token
    says 'there is no token,'
    exits 0 voicemail get-token --key +15550100
    prints other
    exits 0 voicemail set-token again
    exits 0 voicemail remove-all
    exits 4 voicemail get-token
    exits 4 voicemail get-token --key +15550100
    ! grep -q -e other -e again "$store" || fail 'a token that was removed is in the store'
    exits 0 voicemail clear-token
    exits 0 voicemail remove-all
}

the_subscription_is_told() {
    exits 0 voicemail is-subscribed
    prints 'not subscribed'
    exits 0 --json voicemail is-subscribed
    json '.subscribed == false and .command == "voicemail is-subscribed"'
}

radio_logging_is_switched() {
    local word
    for word in on off 7 -2147483648 0x10; do
        exits 0 radio-logging "$word"
        prints 'radio-logging: success'
    done
    exits 0 --json radio-logging on
    json '.enable == 1 and .code == 0'
    for word in maybe '' 2147483648 1.5; do
        exits 2 radio-logging "$word"
        says 'on, off or a number'
    done
    exits 2 radio-logging
    expect 'the lines of the system log' '1 0 7 -2147483648 16 1' \
        "$(sed -n 's/^3 .*Enabling wireless radio manager logs: //p' /run/log/syslog | xargs)"
}

options_belong_to_their_commands() {
    exits 2 voicemail clear-token --key key
    says 'the option --key belongs to the command voicemail get-token or voicemail set-token'
    exits 2 voicemail set-token
    exits 2 voicemail get-token key
    exits 2 voicemail
    exits 0 voicemail --help
    [ "$(grep -c '^  voicemail ' /tmp/out)" = 5 ] || fail "$what: not five commands"
}

exits 3 voicemail get-token
says ERROR_NO_SERVICE
serve
tokens_come_back_as_they_were_set
standard_input_is_a_token
no_output_but_the_answer_holds_a_token
tokens_that_are_absent_or_too_long_are_told_apart_from_failures
what_is_not_utf8_is_refused
tokens_are_cleared_and_removed
the_subscription_is_told
radio_logging_is_switched
options_belong_to_their_commands
finish "lfhelper keeps tokens and switches the radio's logging"
