#!/bin/sh
# Builds the guide's example program against an installed prefix with
# nothing but pkg-config, as a user of the library would, and runs it on a
# small labelled tree.
# usage: guide_example.sh PREFIX SOURCE_DIR
set -eu
prefix=$1 src=$2
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

PKG_CONFIG_PATH=$(dirname "$(find "$prefix" -name vyr.pc | head -n 1)")
export PKG_CONFIG_PATH
flags=$(pkg-config --cflags --libs vyr)
# shellcheck disable=SC2086
cc -std=c11 -Wall -Wextra -Werror ${VYR_EXAMPLE_CFLAGS:-} -o "$work/show_label" \
	"$src/docs/example/show_label.c" $flags

mkdir "$work/db" "$work/state"
printf 'Unclassified:0\nConfidential:1\nSecret:2\n' >"$work/db/levels"
printf 'finance:1\n' >"$work/db/categories"
printf 'lev_backend = files\ncat_backend = files\nfiles_dir = %s\n' "$work/db" >"$work/conf"
VYR_DBROUTE_CONF=$work/conf VYR_TAVREL_XATTR_NS=user VYR_TAVREL_STATE_DIR=$work/state
export VYR_DBROUTE_CONF VYR_TAVREL_XATTR_NS VYR_TAVREL_STATE_DIR

echo open >"$work/open"
echo secret >"$work/secret"
if ! "$prefix/bin/vyr" set 0 "$work/secret" 2>"$work/err"; then
	if grep -q "not supported" "$work/err"; then
		echo "SKIP: no user.* extended attributes under $work (set TMPDIR)"
		exit 77
	fi
	cat "$work/err"; exit 1
fi
"$prefix/bin/vyr" set Secret:Low:finance "$work/secret"

tab=$(printf '\t')
expect="$work/open${tab}Unclassified:Low:0x0:0x0!No:No${tab}readable
$work/secret${tab}Secret:Low:finance:0x0!No:No${tab}not readable"
got=$("$work/show_label" "$work/open" "$work/secret")
[ "$got" = "$expect" ] || { printf 'expected:\n%s\ngot:\n%s\n' "$expect" "$got"; exit 1; }

expect="$work/secret${tab}Secret:Low:finance:0x0!No:No${tab}readable"
got=$("$work/show_label" -s Secret:Low:finance "$work/secret")
[ "$got" = "$expect" ] || { printf 'expected:\n%s\ngot:\n%s\n' "$expect" "$got"; exit 1; }

# A missing file is an error with the system's message and status 1.
if "$work/show_label" "$work/missing" 2>"$work/err"; then
	echo "a missing file did not fail"; exit 1
fi
grep -q "missing: No such file or directory" "$work/err"
echo "guide example: 3 passed, 0 failed"
