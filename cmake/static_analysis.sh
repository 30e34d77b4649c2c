#!/bin/bash
# Runs clang-tidy on one source; nothing is printed but what it finds. The target "tidy" starts it. Leaves NAME.ok,
# and the files that count in NAME.d.
#
#   cmake/static_analysis.sh BUILD_FOLDER NAME CLANG_TIDY [OPTION...] SOURCE
#
# For a source that includes others, as those do that the build puts together, it is shown the text of these in its
# place, as paths are followed in no included file. The last one comes first: what relies on an include of one before
# it, as the build has them, is found out.
set -euo pipefail
cd "$1"
name=$2
source=${*: -1}
shift 2
mkdir -p "${name%/*}"
parts=()
options=()
if [[ $source == */Unity/* ]]; then
    mapfile -t parts < <(sed -n 's/^#include "\(.*\)"$/\1/p' "$source" | tac)
    cat "${parts[@]}" > "$name.cpp"
    printf '{"version": 0, "roots": [{"type": "file", "name": "%s", "external-contents": "%s"}]}' \
        "$source" "$PWD/$name.cpp" > "$name.json"
    options=(--vfsoverlay "$name.json" "--extra-arg=-iquote${parts[0]%/*}")
fi

# The lines of the parts in place of those of the whole.
place() {
    awk -v whole="$PWD/$name.cpp" 'FILENAME != "-" { file[++lines] = FILENAME; line[lines] = FNR; next }
        index($0, whole ":") == 1 {
            split(substr($0, length(whole) + 2), at, ":")
            $0 = file[at[1]] ":" line[at[1]] substr($0, length(whole ":" at[1]) + 1)
        }
        { print }' "${parts[@]}" -
}

found=0
"$@" --quiet -p . "${options[@]}" --extra-arg=-Wp,-MMD,"$name.d" > "$name.out" 2> "$name.err" || found=$?
place < "$name.out"
if [ "$found" -ne 0 ]; then
    place < "$name.err" >&2
    exit 1
fi
{
    printf '%s:' "$name.ok"
    printf ' %s' "${parts[@]// /\\ }"
    sed '1s#^[^:]*:##' "$name.d"
} > "$name.d.all"
mv "$name.d.all" "$name.d"
touch "$name.ok"
