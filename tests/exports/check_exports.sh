#!/usr/bin/env bash
# Compares the shared library's dynamic exports with the documented list and
# checks its SONAME. The generated message classes (namespace pkcs11) are
# exported as a whole and not listed one by one.
set -euo pipefail
lib=$1
expected=$2

soname=$(readelf -d "$lib" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
if [ "$soname" != "libQuorvelPkcs11Wrapper.so" ]; then
  echo "SONAME is '$soname', expected 'libQuorvelPkcs11Wrapper.so'"
  exit 1
fi
readelf -d "$lib" | grep -q 'FLAGS.*SYMBOLIC' || { echo "library not linked with -Bsymbolic"; exit 1; }

# The address sanitizer adds its own __odr_asan.* markers.
actual=$(nm -D --defined-only "$lib" | awk '{print $3}' | c++filt \
  | { grep -v -e 'pkcs11::' -e '^__odr_asan' || true; } | sed 's/(.*$//' | sort -u)
wanted=$({ grep -v '^\s*#' "$expected" || true; } | sed '/^\s*$/d' | sort -u)

if [ "$actual" != "$wanted" ]; then
  echo "exported symbols differ from $expected (< exported but not listed, > listed but missing):"
  diff <(printf '%s\n' "$actual") <(printf '%s\n' "$wanted") || true
  exit 1
fi
echo "exports match: $(printf '%s\n' "$wanted" | grep -c . || true) documented names"
