#!/bin/sh
# Installs a build into a folder of its own, and builds the example and every header over what was
# installed. The manual page has every name that the library has.
#
#   tests/install_test.sh BUILD_FOLDER
set -eu
build=$(cd "$1" && pwd)
cd "$(dirname "$0")/.."
prefix=$build/installed

rm -rf "$prefix" "$build/example"
cmake --install "$build" --prefix "$prefix" >/dev/null
PKG_CONFIG_PATH=$(dirname "$(find "$prefix" -name tavischeduler.pc)")
export PKG_CONFIG_PATH
cmake -S examples -B "$build/example" -G Ninja -DCMAKE_PREFIX_PATH="$prefix" >/dev/null
cmake --build "$build/example"
# pkg-config quotes its answers for a shell.
eval "cc examples/task.c -o \"\$build/example/task-cc\" $(pkg-config --cflags --libs tavischeduler sqlite3) \
    -Wl,-rpath,$(pkg-config --variable=libdir tavischeduler)"
for program in task task-cc; do
    status=0
    "$build/example/$program" 2>/dev/null || status=$?
    [ "$status" -eq 2 ] || { echo "$program: exit status $status" >&2; exit 1; }
done
for header in "$prefix"/include/*.h; do
    cc -std=c11 -Wall -Wextra -Werror -fsyntax-only -x c "$header"
    c++ -std=c++20 -Wall -Wextra -Werror -fsyntax-only -x c++ "$header"
done
missing=$(nm -D --defined-only "$build/lib/libtavischeduler.so" | while read -r _ _ name; do
    grep -qF "${name%%@*}" packaging/man/tavischeduler.3 || echo "$name"
done)
[ -z "$missing" ] || { echo "tavischeduler.3 lacks: $missing" >&2; exit 1; }
