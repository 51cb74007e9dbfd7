#!/usr/bin/env bash
# The bridge is a module: it exports C_GetFunctionList and nothing else, and is
# linked with -Bsymbolic so that its list points at its own getter even in a
# process whose global scope holds the proxy's C_ names.
set -euo pipefail
lib=$1
readelf -d "$lib" | grep -q 'FLAGS.*SYMBOLIC' || { echo "bridge not linked with -Bsymbolic"; exit 1; }
names=$(nm -D --defined-only "$lib" | awk '{print $3}')
if [ "$names" != "C_GetFunctionList" ]; then
  echo "bridge exports: $(printf '%s\n' "$names" | tr '\n' ' ')"
  exit 1
fi
echo "exports: $names"
