#!/usr/bin/env bash
# Byte order for real: builds the libraries for a big-endian machine (s390x) and for this one, and exchanges packed
# tables between the two, in both directions, each converting what the other has packed.
#
#   tests/foreign/run.sh [BUILD_DIRECTORY]    default: build/foreign
#   tests/foreign/run.sh --golden             also puts both machines' buffers into tests/protocol/golden
#
# Installs g++-s390x-linux-gnu and qemu-user-static if they are missing, as root or with sudo. 0: all is well.
set -euo pipefail
root=$(cd "$(dirname "$0")/../.." && pwd)
golden=0
if [ "${1:-}" = --golden ]; then
    golden=1
    shift
fi
build=${1:-$root/build/foreign}

missing=()
command -v s390x-linux-gnu-g++ >/dev/null || missing+=(g++-s390x-linux-gnu)
command -v qemu-s390x-static >/dev/null || missing+=(qemu-user-static)
if [ ${#missing[@]} -gt 0 ]; then
    as_root=()
    [ "$(id -u)" -eq 0 ] || as_root=(sudo)
    "${as_root[@]}" apt-get install -y --no-install-recommends "${missing[@]}"
fi

# build_for NAME [CMAKE OPTIONS]: the libraries as archives, and the program linked with them.
build_for() {
    local name=$1 compiler=$2
    shift 2
    cmake -S "$root" -B "$build/$name" -G Ninja -DCMAKE_BUILD_TYPE=Release -DKT_BUILD_TESTS=OFF -DKT_BUILD_TOOLS=OFF \
        -DCMAKE_CXX_COMPILER="$compiler" "$@" >/dev/null
    cmake --build "$build/$name" --target kt_rg_internal kt_pmsg_internal kt_ku_internal kt_tr_internal
    local lib=$build/$name/lib
    "$compiler" -std=gnu++20 -O1 -static -I"$root/include" -I"$root/src" -I"$root/tests" \
        "$root/tests/foreign/exchange.cpp" "$lib/libkt_rg_internal.a" "$lib/libkt_pmsg_internal.a" \
        "$lib/libkt_ku_internal.a" "$lib/libkt_tr_internal.a" -pthread -o "$build/$name/exchange"
}

build_for here g++
build_for big_endian s390x-linux-gnu-g++ -DCMAKE_C_COMPILER=s390x-linux-gnu-gcc -DCMAKE_SYSTEM_NAME=Linux \
    -DCMAKE_SYSTEM_PROCESSOR=s390x

here=("$build/here/exchange")
there=(qemu-s390x-static "$build/big_endian/exchange")
"${here[@]}" pack "$build/little_endian.packed"
"${there[@]}" pack "$build/big_endian.packed"
for buffer in little_endian big_endian; do
    "${here[@]}" check "$build/$buffer.packed"
    "${there[@]}" check "$build/$buffer.packed"
done
if cmp -s "$build/little_endian.packed" "$build/big_endian.packed"; then
    echo "foreign: both machines have the same byte order, so nothing was tested" >&2
    exit 1
fi
if [ $golden -eq 1 ]; then
    cp "$build/little_endian.packed" "$build/big_endian.packed" "$root/tests/protocol/golden/"
fi
echo "foreign: packed tables cross the byte orders both ways"
