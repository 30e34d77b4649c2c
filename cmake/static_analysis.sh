#!/bin/bash
# Runs clang-tidy on one source; nothing is printed but what it finds. The target "tidy" starts it. Leaves NAME.ok,
# and the files that count in NAME.d.
#
#   cmake/static_analysis.sh CLANG_TIDY BUILD_FOLDER SOURCE NAME
set -euo pipefail
cd "$2"
mkdir -p "${4%/*}"
"$1" --quiet -p . --extra-arg=-Wp,-MMD,"$4.d" "$3" 2> "$4.err" || { cat "$4.err" >&2; exit 1; }
sed -i "1s#^[^:]*:#$4.ok:#" "$4.d"
touch "$4.ok"
