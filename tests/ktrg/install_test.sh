#!/usr/bin/env bash
# install_test.sh CMAKE BUILD SOURCE CC SANITIZERS: installs the build into a directory of its own, takes the example out of
# README.md, compiles it with the installed pkg-config file alone and compares what it prints with what README.md says.
# Then the same through the CMake package.
set -euo pipefail
cmake=$1 build=$2 source=$3 cc=$4 sanitizers=$5
fail() {
    printf 'install_test: %s\n' "$1" >&2
    exit 1
}

home=$(mktemp -d)
trap 'rm -rf "$home"' EXIT
"$cmake" --install "$build" --prefix "$home/prefix" >/dev/null
cd "$home"

# The C program between the fences, and the commands and outputs of the indented block that follows it.
awk '/^```c$/ { inside = 1; next } /^```$/ { inside = 0 } inside' "$source/README.md" >first_table.c
[ -s first_table.c ] || fail "README.md has no example"
cmp first_table.c "$source/examples/first_table.c" || fail "examples/first_table.c isn't the example of README.md"
said=$(sed -n '/^    \$ cc first_table.c/,/^## /p' "$source/README.md" | sed -n 's/^    //p')

flags=()
[ -z "$sanitizers" ] || flags=("-fsanitize=$sanitizers")
export PKG_CONFIG_PATH
PKG_CONFIG_PATH=$(dirname "$(find "$home/prefix" -name kt_rg.pc)")
libraries=$(dirname "$PKG_CONFIG_PATH")
# shellcheck disable=SC2046
"$cc" "${flags[@]}" -std=c11 -Wall -Werror first_table.c -o first_table $(pkg-config --cflags --libs kt_rg)
export LD_LIBRARY_PATH=$libraries
printed=$(printf '$ cc first_table.c -o first_table $(pkg-config --cflags --libs kt_rg) && ./first_table\n'
    ./first_table
    printf '$ ktrg select state/hosts\n'
    env -u LD_LIBRARY_PATH "$home/prefix/bin/ktrg" select state/hosts 2>/dev/null)
[ "$printed" = "$said" ] || fail "README.md shows
$said
and the program prints
$printed"

# It is refused the second time, with the library's words.
if ./first_table 2>refusal; then fail "a table was created twice"; fi
grep -q '^2605-201 ' refusal || fail "the example doesn't print why it failed: $(cat refusal)"

mkdir consumer
cp first_table.c consumer/
cat >consumer/CMakeLists.txt <<'END'
cmake_minimum_required(VERSION 3.25)
project(consumer LANGUAGES C)
find_package(kt_rg 1.0 REQUIRED)
add_executable(first_table first_table.c)
target_link_libraries(first_table PRIVATE kt_rg::kt_rg kt_rg::kt_ku)
END
"$cmake" -S consumer -B consumer/build -G Ninja -DCMAKE_PREFIX_PATH="$home/prefix" -DCMAKE_C_COMPILER="$cc" \
    -DCMAKE_C_FLAGS="${flags[*]}" >/dev/null
"$cmake" --build consumer/build >/dev/null
rm -rf state
[ "$(consumer/build/first_table)" = "alpha has a load of 0.25" ] || fail "the program built by the CMake package differs"
