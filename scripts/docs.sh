#!/usr/bin/env bash
# Generates the API documentation from the public headers with Doxygen and
# fails when Doxygen warns (an undocumented public member, a broken command).
#
#   scripts/docs.sh [OUTPUT_DIR]     (default: build/docs)
#
# The index is OUTPUT_DIR/html/index.html; the warnings, if any, are in
# OUTPUT_DIR/warnings.log.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
root=$PWD
out=$(realpath -m "${1:-build/docs}")
command -v doxygen >/dev/null || { echo "docs.sh: doxygen is not installed (scripts/deps.sh)" >&2; exit 1; }
mkdir -p "$out"
# The generated version header lives in a build tree; document the template's
# text through a copy with the current version.
version=$(sed -nE 's/^project\(KiviOSSDK VERSION ([0-9.]+).*/\1/p' CMakeLists.txt)
IFS=. read -r major minor patch <<<"$version"
mkdir -p "$out/generated/kivi"
sed -e "s/@PROJECT_VERSION_MAJOR@/$major/g" -e "s/@PROJECT_VERSION_MINOR@/$minor/g" \
  -e "s/@PROJECT_VERSION_PATCH@/$patch/g" -e "s/@PROJECT_VERSION@/$version/g" \
  cmake/version.h.in >"$out/generated/kivi/version.h"
export KIVI_DOCS_OUTPUT=$out
export KIVI_DOCS_INPUT="$root/include/kivi $out/generated/kivi $root/README.md"
export KIVI_DOCS_MAINPAGE=$root/README.md
export KIVI_DOCS_FILTER=$root/scripts/doxygen_filter.py
export KIVI_DOCS_STRIP="$root/include $out/generated"
export KIVI_DOCS_WARNINGS=$out/warnings.log
rm -f "$out/warnings.log"
doxygen docs/Doxyfile
if [[ -s $out/warnings.log ]]; then
  head -n 50 "$out/warnings.log" >&2
  echo "docs.sh: $(grep -c 'warning:' "$out/warnings.log") Doxygen warnings (all in $out/warnings.log)" >&2
  exit 1
fi
echo "docs.sh: $out/html/index.html"
