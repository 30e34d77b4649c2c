#!/bin/bash
# Started with the path of tavisched. The manual page and the completions of the three shells have the
# commands and options that the program shows, and no others; and bash completes what is due.
# shellcheck disable=SC1091,SC2086,SC2317 # a sourced file, lists of words, functions called by made-up names
set -uo pipefail
program=$(realpath "$1") || exit 2
cd "$(dirname "$0")/../packaging" || exit 2
. completion/tavisched.bash
tavisched() { [ "$*" = complete-ids ] && printf '1\tNightly backup\n12\tMail\n2\tReport\n'; }
completed() { COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _tavisched; printf '%s\n' "${COMPREPLY[@]}"; }
status=0

# Each source as lines "COMMAND" and "COMMAND OPTION"; options before a command have none.
of_program() {
    for command in '' $("$program" --help | sed -n '/^Subcommands:/,/^$/s/^  \([a-z-]*\)  .*/\1/p'); do
        echo "$command"
        "$program" $command --help | sed -nE "s/^  (-.,)?(--[a-z-]+).*/$command \2/p"
    done
}
of_bash() { for command in '' $(completed tavisched ''); do
    echo "$command"; completed tavisched $command -- | sed "s/^/$command /"; done; }
# A line "!COMMAND" names a command, a line "@COMMAND COMMAND" those that have the options below it.
spread() { awk '/^!/ { print substr($0, 2); next } /^@/ { n = split(substr($0, 2), of, "[ |]"); next }
    !n { print "", $0 } { for (i = 1; i <= n; i++) print of[i], $0 }'; }
of_zsh() { sed -nE "s/^ +'([a-z-]+):.*/!\1/p; s/^ +([a-z|]+)\)$/@\1/p; s/.*(--[a-z-]+)(=?\[|\}).*/\1/p" \
    completion/_tavisched | spread; }
of_fish() { sed -nE "s/.*use_subcommand -a ([a-z-]+) .*/!\1/p; s/.*use_subcommand .*-l ([a-z-]+).*/@\n--\1/p
    s/.*subcommand_from ([a-z ]+)'.* -l ([a-z-]+).*/@\1\n--\2/p" completion/tavisched.fish | spread; }
of_manual() { grep -E '^\.(It|Sh)' man/tavisched.8 | sed 's/ Fl Fl /\n--/g' | sed -nE 's/^\.It Cm ([a-z-]+).*/!\1\n@\1/p
    s/^\.Sh OPTIONS OF ADD AND EDIT/@add edit/p; s/^(--[a-z-]+).*/\1/p' | spread; }
sorted() { grep -v -e '--help$' -e '^$' | sort -u; }
for source in manual bash zsh fish; do
    diff <(of_program | sorted) <("of_$source" | sorted) |
        sed -n "s/^</$source lacks:/p; s/^>/$source has what the program has not:/p" || status=1
done
while IFS=: read -r line words; do # what is typed, and what the last word may become
    completion=$(completed tavisched $line | xargs)
    [ "$completion" = "$words" ] || { echo "bash completes $line to: $completion"; status=1; }
done << 'END'
s:show stop sync
add --name list --d:--daily --disabled --dry-run
add --weekly Mon,T:Mon,Tue Mon,Thu
--verbose remove 2 1:1 12
ls --f:--failed
rm --yes 1:1 12
END
exit $status
