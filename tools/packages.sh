# shellcheck shell=bash
# need_packages PACKAGE...: installs what is missing of these Debian packages, as root or with sudo. Where neither is to
# be had it prints the one command that does it, and ends the script. Sourced by ./demo and ./check.

need_packages() {
    local missing=() package
    for package in "$@"; do
        if [ "$(dpkg-query -W -f '${db:Status-Status}' "$package" 2>/dev/null)" != installed ]; then
            missing+=("$package")
        fi
    done
    [ ${#missing[@]} -eq 0 ] && return 0

    local as_root=()
    if [ "$(id -u)" -ne 0 ]; then
        if sudo -n true 2>/dev/null || { [ -t 0 ] && command -v sudo >/dev/null; }; then
            as_root=(sudo)
        else
            printf 'These packages are missing. As root, run:\n\n  apt-get update && apt-get install -y --no-install-recommends %s\n\nand start %s again.\n' \
                "${missing[*]}" "$0" >&2
            exit 1
        fi
    fi
    printf 'Installing %s\n' "${missing[*]}" >&2
    if ! { "${as_root[@]}" apt-get update -qq &&
           "${as_root[@]}" env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends "${missing[@]}"; } \
           </dev/null >&2; then
        printf 'The packages could not be installed.\n' >&2
        exit 1
    fi
}

# What the libraries and the tool are built with.
BUILD_PACKAGES=(cmake ninja-build g++ libc6-dev pkg-config libcli11-dev nlohmann-json3-dev libfmt-dev libcsv-dev
    libutf8proc-dev)
