#!/usr/bin/env bash
# The fake vendor module may export only C_GetFunctionList and its fake_vendor_
# controls (another module: what the optional pattern allows), and must be
# linked with -Bsymbolic: a test process that also holds the proxy has the
# proxy's C_ names in its global scope.
set -euo pipefail
lib=$1
allowed=${2:-'^(C_GetFunctionList|fake_vendor_[a-z_]+)$'}

readelf -d "$lib" | grep -q 'FLAGS.*SYMBOLIC' || { echo "module not linked with -Bsymbolic"; exit 1; }
names=$(nm -D --defined-only "$lib" | awk '{print $3}')
extra=$(printf '%s\n' "$names" | grep -v -E "$allowed" || true)
if [ -n "$extra" ]; then
  echo "exported beyond $allowed:"
  printf '%s\n' "$extra"
  exit 1
fi
printf '%s\n' "$names" | grep -qx C_GetFunctionList || { echo "C_GetFunctionList not exported"; exit 1; }
echo "exports: $(printf '%s\n' "$names" | tr '\n' ' ')"
