#!/bin/sh
# The library exports exactly the names of its version script: plain names,
# without symbol versions or C++ mangling, and nothing else.
# usage: check_exports.sh LIBRARY EXPECTED_LIST
set -eu
lib=$1 expected=$2
actual=$(nm -D --defined-only "$lib" | awk '{print $NF}' | sort)
fail=0
if printf '%s\n' "$actual" | grep -q '@'; then
	echo "symbols carry versions:"; printf '%s\n' "$actual" | grep '@'; fail=1
fi
if printf '%s\n' "$actual" | grep -q '^_Z'; then
	echo "mangled C++ symbols exported:"; printf '%s\n' "$actual" | grep '^_Z'; fail=1
fi
missing=$(printf '%s\n' "$actual" | sort | comm -13 - "$expected" | grep -v '^$' || true)
extra=$(printf '%s\n' "$actual" | sort | comm -23 - "$expected" | grep -v '^$' || true)
[ -z "$missing" ] || { echo "listed but not exported:"; echo "$missing"; fail=1; }
[ -z "$extra" ] || { echo "exported but not listed:"; echo "$extra"; fail=1; }
soname=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
[ "$soname" = libvyr.so.2 ] || { echo "soname is '$soname'"; fail=1; }
if readelf -V "$lib" | grep -q 'Version definition'; then
	echo "library defines symbol versions"; fail=1
fi
n=$(printf '%s\n' "$actual" | grep -c . || true)
[ $fail -eq 0 ] && echo "exports: $n names, all listed, none versioned"
exit $fail
