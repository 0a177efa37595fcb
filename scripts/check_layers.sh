#!/usr/bin/env bash
# Checks that every layer includes only its own headers and those of the
# layers below it. Prints each offending include and exits 1 if there is one.
#
#   base <- dispatch, text <- net <- the SDK areas, tools, tests, bench, fuzz
#   base <- system, security <- the SDK areas
#   net <- process <- desktop <- the SDK areas
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

# What each layer may include besides itself.
declare -A allowed=(
  [base]=""
  [dispatch]="base"
  [text]="base"
  [net]="base dispatch text"
  [system]="base"
  [security]="base"
  [process]="base dispatch text net system"
  [desktop]="base dispatch text net system process"
)

status=0
for layer in "${!allowed[@]}"; do
  for dir in "include/kivi/$layer" "src/$layer"; do
    [[ -d $dir ]] || continue
    while IFS= read -r hit; do
      file=${hit%%:*}
      rest=${hit#*:}
      line=${rest%%:*}
      target=$(sed -nE 's/.*#include "kivi\/([a-z_]+)\/.*/\1/p' <<<"${rest#*:}")
      [[ -z $target || $target == "$layer" ]] && continue
      if [[ " ${allowed[$layer]} " != *" $target "* ]]; then
        echo "$file:$line: the $layer layer includes from $target" >&2
        status=1
      fi
    done < <(grep -rn '#include "kivi/' "$dir" || true)
  done
done
exit $status
