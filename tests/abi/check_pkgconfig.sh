#!/bin/sh
# Installs the project into a scratch prefix and builds a plain C program
# against it with nothing but pkg-config, as a user of the library would.
# usage: check_pkgconfig.sh BUILD_DIR SOURCE_DIR
set -eu
build=$1 src=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cmake --install "$build" --prefix "$work/prefix" >/dev/null
pcdir=$(dirname "$(find "$work/prefix" -name vyr.pc | head -n 1)")
export PKG_CONFIG_PATH="$pcdir"
cc -std=c11 -Wall -Wextra -Werror -o "$work/prog" "$src/tests/abi/pkgconfig_prog.c" \
	$(pkg-config --cflags --libs vyr)
"$work/prog"
