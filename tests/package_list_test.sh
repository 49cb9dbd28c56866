#!/bin/bash
# Holds packaging/debian-packages to what the tree needs: each third-party header it includes, each
# package its CMake files look for and each program its scripts call has to come from a package of
# the list, from what the listed compiler brings, or from a minimal Debian, which is what has the
# priority "required". Run it where the list is installed; whatever else is installed is no excuse.
set -eu

cd "$(dirname "$0")/.."
list=${1:-packaging/debian-packages}
failures=0

fail() {
    echo "FAILED: $1"
    failures=$((failures + 1))
}

# Called, but by the caller's choice: each script says itself what to do where it is missing.
by_choice=' sudo debootstrap '

listed() {
    sed 's/#.*//' "$list" | xargs -n 1
}

# Prints "required" packages and the given ones with all that they depend on.
with_dependencies() { # PACKAGE...
    dpkg-query --show --showformat='${Package}|${Priority}|${Pre-Depends},${Depends}\n' |
        awk -F'|' -v wanted="$*" '
            { package = $1; priority[package] = $2; sub(/^[^|]*\|[^|]*\|/, ""); needs[package] = $0 }
            function provide(package,    names, count, i) {
                if (!(package in needs) || package in provided) return
                provided[package]
                print package
                count = split(needs[package], names, /[,|]/)
                for (i = 1; i <= count; ++i) { gsub(/\([^)]*\)|:any| /, "", names[i]); provide(names[i]) }
            }
            END {
                for (package in priority)
                    if (priority[package] == "required" || package == "apt") provide(package)
                count = split(wanted, packages, " ")
                for (n = 1; n <= count; ++n) provide(packages[n])
            }'
}

# Says which of the files come from a package that is not provided, or from none.
judge() { # PROVIDED WHAT, and lines "name file [file...]" on standard input: any of the files will do
    local name files file found
    local -A owner=()
    local -a lines=()
    mapfile -t lines < <(grep . || true)
    [ ${#lines[@]} -gt 0 ] || return 0
    # The folders of / and /usr are one, but packages know their files under either name.
    while IFS= read -r file; do
        owner[${file#*: }]=${file%%:*}
    done < <(printf '%s\n' "${lines[@]}" | cut -d' ' -f2- | tr ' ' '\n' | sed 'p; s|^/usr/|/|' |
        sort -u | xargs dpkg-query --search 2>/dev/null | grep -v '^diversion ')
    for name in "${lines[@]}"; do
        files=${name#* }
        name=${name%% *}
        found=
        for file in $files; do
            found="$found ${owner[$file]:-${owner[${file#/usr}]:-}}"
        done
        # shellcheck disable=SC2086
        grep -qxF -e "$(printf '%s\n' $found none)" <<<"$1" ||
            fail "$2 $name comes from ${found:- no package}, which is not in $list"
    done
}

sources() { # PATTERN...: files of the tree, builds left out
    local -a names=()
    local pattern
    for pattern in "$@"; do names+=(-o -name "$pattern"); done
    find . -path ./build -prune -o -path ./.git -prune -o -type f \( "${names[@]:1}" \) -print
}

headers() {
    local header folder
    local -a folders
    mapfile -t folders < <(g++ -E -v -x c++ /dev/null 2>&1 >/dev/null |
        sed -n '/^#include </,/^End of/s/^ //p')
    sources '*.h' '*.cpp' '*.c' | xargs sed -nE 's/^ *# *include *<([^>]+)>.*/\1/p' | sort -u |
        while read -r header; do
            for folder in "${folders[@]}"; do
                [ -e "$folder/$header" ] || continue
                echo "<$header> $(realpath "$folder")/$header"
                continue 2
            done
            echo "<$header> /not/installed"
        done
}

# A module of pkg-config by its .pc file; a package of CMake by its configuration file. Where CMake
# brings a Find module of its own, the package's header decides.
modules() {
    local name file
    cmake_calls pkg_check_modules | while read -r _ name; do
        for name in $name; do
            case $name in REQUIRED | QUIET | IMPORTED_TARGET | GLOBAL | NO_*) continue ;; esac
            name=${name%%[<>=]*}
            file=$(pkg-config --variable=pcfiledir "$name") || true
            echo "$name ${file:-/not/installed}/$name.pc"
        done
    done
    cmake_calls find_package | while read -r name _; do
        file=$(find /usr/lib /usr/share -ipath "*/cmake/*/$name-config.cmake" -o \
            -ipath "*/cmake/*/${name}Config.cmake" | head -n 1)
        [ -n "$file" ] || compgen -G "/usr/share/cmake-*/Modules/Find$name.cmake" >/dev/null ||
            file=/not/installed
        [ -z "$file" ] || echo "$name $file"
    done
}

# The arguments of each call of a CMake function, one call a line.
cmake_calls() { # FUNCTION
    sources CMakeLists.txt '*.cmake' | xargs --no-run-if-empty cat | sed 's/#.*//' | tr '\n' ' ' |
        grep -oE "\b$1 *\([^)]*\)" | sed -E 's/^[a-z_]+ *\( *//; s/ *\)$//' || true
}

# Programs that CMake files and presets name, and each word of a script that stands where a command
# can, outside of texts in line (which end at TEXT). A word that no program has is a function's name,
# or somebody misses the program at once.
words_of_scripts() {
    local start='^|^[^()]*\)|[|&;(!]'
    local prefix='then|do|else|if|while|until|exec|eval|env|run|sandbox|eventually|xargs|type|command'
    prefix+='|[A-Za-z_]+=[^ ]*|-[^ ]+'
    sources '*' | xargs grep -lE '^#! ?/(usr/)?bin/(env )?(ba|da)?sh' | xargs cat |
        sed -E -e "/<<'?TEXT'?/,/^TEXT/d" -e 's/(^|[[:space:]])#.*//' |
        grep -oE "($start)[[:space:]]*(($prefix)[[:space:]]+)*[a-z][a-z0-9_.+-]*=?" |
        grep -oE '[a-z][a-z0-9_.+-]*$' | sort -u
    sed -nE -e 's/.*"CMAKE_CXX_COMPILER": *"([^"]+)".*/\1/p' -e 's/.*"generator": *"Ninja".*/ninja/p' \
        CMakePresets.json 2>/dev/null | sort -u || true
    cmake_calls find_program | awk '{ for (i = 2; i <= NF; ++i) print $i }' | grep -E '^[a-z]' || true
}

programs() {
    local word path
    words_of_scripts | while read -r word; do
        case $(type -t "$word" || true) in file) ;; *) continue ;; esac
        [[ $by_choice != *" $word "* ]] || continue
        path=$(type -P "$word")
        # Any of the programs that share a name by Debian's alternatives will do.
        echo "$word $path $(update-alternatives --list "$word" 2>/dev/null | tr '\n' ' ')"
    done
}

for package in $(listed); do
    dpkg-query --show "$package" >/dev/null 2>&1 || fail "$package is listed but not installed"
done
[ "$(listed | sort | uniq -d)" = '' ] || fail "listed twice: $(listed | sort | uniq -d)"

minimal=$(with_dependencies)
compiler=$(listed | grep -x 'g++' | xargs --no-run-if-empty dpkg-query --show --showformat='${Package} ')
provided=$(listed; with_dependencies ${compiler:+"$compiler"})
[ "$(wc -l <<<"$minimal")" -gt 40 ] || fail "a minimal Debian of $(wc -l <<<"$minimal") packages"
found=$(headers)
[ -n "$found" ] || fail 'no header found'
judge "$provided" header <<<"$found"
found=$(modules)
judge "$provided" module <<<"$found"
found=$(programs)
[ "$(wc -l <<<"$found")" -gt 20 ] || fail 'hardly a program found'
judge "$provided" program <<<"$found"

[ "$failures" = 0 ] && echo "the package list covers headers, modules and programs"
exit "$failures"
