#!/bin/bash
# Runs clang-tidy on one source; nothing is printed but what it finds. The target "tidy" starts it.
#
#   cmake/static_analysis.sh CLANG_TIDY BUILD_FOLDER SOURCE STAMP
set -euo pipefail
commands=$2/tidy/compile_commands.json
mkdir -p "${4%/*}"
# The build's commands without precompiled headers, which are another compiler's.
if [[ ! "$commands" -nt "$2/compile_commands.json" ]]; then
    sed -E 's/ -include (\\"[^"]*cmake_pch\.hxx\\"|[^ "]*cmake_pch\.hxx)//' "$2/compile_commands.json" > "$commands.$$"
    mv "$commands.$$" "$commands"
fi
"$1" --quiet -p "$2/tidy" "$3" 2> "$4.err" || { cat "$4.err" >&2; exit 1; }
touch "$4"
