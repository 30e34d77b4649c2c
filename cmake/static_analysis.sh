#!/bin/bash
# Runs clang-tidy on one source; nothing is printed but what it finds. The target "tidy" starts it. Leaves NAME.ok,
# and the files that count in NAME.d.
#
#   cmake/static_analysis.sh BUILD_FOLDER NAME CLANG_TIDY [OPTION...] SOURCE
set -euo pipefail
cd "$1"
name=$2
shift 2
mkdir -p "${name%/*}"
"$@" --quiet -p . --extra-arg=-Wp,-MMD,"$name.d" 2> "$name.err" || { cat "$name.err" >&2; exit 1; }
sed -i "1s#^[^:]*:#$name.ok:#" "$name.d"
touch "$name.ok"
