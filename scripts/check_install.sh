#!/usr/bin/env bash
# Installs the library the way a user does and builds programs against the
# installed package only:
#   1. `cmake --install` of BUILD_DIR (a shared build) into BUILD_DIR/install-check/prefix;
#   2. every installed header compiled on its own (twice, so include guards count);
#   3. every public symbol exported by the shared library (scripts/check_exports.py);
#   4. the examples built through find_package(KiviOSSDK) and run; a request for
#      version 2 refused;
#   5. the same examples built with plain g++ and pkg-config, and run;
#   6. a static build (BUILD_DIR-static) installed and a "hello" linked
#      statically through find_package and through pkg-config;
#   7. the API documentation generated with no Doxygen warning;
#   8. the Debian packages (cpack) installed and used on a clean Debian 12
#      (scripts/check_deb.sh; as root only, since it uses a chroot).
# Prints how long each step took and the sizes worth knowing; exits non-zero at
# the first failure.
#
#   scripts/check_install.sh [BUILD_DIR]     (default: build)
#   KIVI_SKIP_DOCS=1 skips step 7.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
root=$PWD
build=$(realpath -m "${1:-build}")
work=$build/install-check
prefix=$work/prefix
static_build=$build-static
static_prefix=$work/prefix-static
# A chroot of an earlier run that was killed may still have mounts.
if command -v findmnt >/dev/null; then
  findmnt -rn -o TARGET | grep "^$work/" | sort -r | xargs -r umount -l || true
fi
rm -rf --one-file-system "$work"
mkdir -p "$work"

step_start=$SECONDS
step() {
  printf -- '-- %s (%ds)\n' "$*" "$((SECONDS - step_start))"
  step_start=$SECONDS
}
die() {
  echo "check_install: $*" >&2
  exit 1
}
configure() { cmake -G Ninja -DCMAKE_BUILD_TYPE=Release "$@" >"$work/last-configure.log" 2>&1 ||
  { cat "$work/last-configure.log" >&2; return 1; }; }

# 1. Install.
cmake --install "$build" --prefix "$prefix" >"$work/install.log" || die "install failed"
libdir=$(dirname "$(find "$prefix" -name 'libkiviossdk.so' -print -quit)")
[[ -f $libdir/libkiviossdk.so ]] || die "no libkiviossdk.so installed"
soname=$(readelf -d "$libdir/libkiviossdk.so" | sed -nE 's/.*SONAME.*\[(.*)\]/\1/p')
[[ $soname == libkiviossdk.so.1 ]] || die "SONAME is '$soname', not libkiviossdk.so.1"
step "installed into $prefix (SONAME $soname)"

# 2. Each header alone.
header_check() {
  printf '#include "%s"\n#include "%s"\n' "$1" "$1" |
    g++ -std=c++20 -Wall -Wextra -Werror -fsyntax-only -I"$2" -x c++ - 2>&1 | sed "s|^|$1: |"
}
export -f header_check
(cd "$prefix/include" && find kivi -name '*.h' | sort |
  xargs -P2 -I{} bash -c 'header_check "$@"' _ {} "$prefix/include") >"$work/headers.log"
if [[ -s $work/headers.log ]]; then
  head -n 40 "$work/headers.log" >&2
  die "a public header does not compile on its own (all in $work/headers.log)"
fi
step "$(find "$prefix/include" -name '*.h' | wc -l) headers compile on their own"

# 3. Exports.
python3 scripts/check_exports.py "$build/libkiviossdk.so" "$build/libkivi_internal.a" include ||
  die "public symbols missing from the shared library"
dynamic_symbols=$(nm -D --defined-only "$libdir/libkiviossdk.so")
for symbol in KiviOSSDKVersionNumber KiviOSSDKVersionString; do
  grep -qw "$symbol" <<<"$dynamic_symbols" || die "$symbol not exported"
done
step "exports checked"

# A JSON server for the REST client, in its own process.
mkdir -p "$work/www"
printf '{"items": [{"id": 1, "name": "first"}, {"id": 2, "name": "second"}]}\n' >"$work/www/items.json"
python3 -u -m http.server 0 --bind 127.0.0.1 --directory "$work/www" >"$work/http.log" 2>&1 &
server=$!
trap 'kill $server 2>/dev/null || true' EXIT
port=""
for _ in $(seq 100); do
  port=$(sed -nE 's/.*port ([0-9]+).*/\1/p' "$work/http.log" | head -n 1)
  [[ -n $port ]] && break
  sleep 0.1
done
[[ -n $port ]] || die "the example's JSON server did not start"
url="http://127.0.0.1:$port/items.json?token=example-secret"

# run_examples DIR: runs the examples built in DIR (DIR/<example>/<example>).
run_examples() {
  local dir=$1 out
  "$dir/hello/hello" >/dev/null || die "hello failed"
  out=$("$dir/rest_client/rest_client" "$url" 2>&1) || { echo "$out" >&2; die "rest_client failed"; }
  if grep -q example-secret <<<"$out"; then
    echo "$out" >&2
    die "rest_client's log shows the token unredacted"
  fi
  "$dir/run_loop/run_loop" >"$work/run_loop.log" 2>&1 || { cat "$work/run_loop.log" >&2; die "run_loop failed"; }
  "$dir/host_unit_test/host_unit_test" >"$work/host_unit_test.log" 2>&1 ||
    { cat "$work/host_unit_test.log" >&2; die "host_unit_test failed"; }
}

# 4. find_package.
configure -S examples -B "$work/examples" -DCMAKE_PREFIX_PATH="$prefix" || die "examples: configure"
cmake --build "$work/examples" >"$work/examples-build.log" 2>&1 ||
  { tail -n 40 "$work/examples-build.log" >&2; die "examples: build"; }
run_examples "$work/examples"
mkdir -p "$work/v2"
printf 'cmake_minimum_required(VERSION 3.25)\nproject(v2 LANGUAGES CXX)\nfind_package(KiviOSSDK 2.0 REQUIRED)\n' \
  >"$work/v2/CMakeLists.txt"
if cmake -S "$work/v2" -B "$work/v2/build" -DCMAKE_PREFIX_PATH="$prefix" >/dev/null 2>&1; then
  die "find_package(KiviOSSDK 2.0) accepted version 1"
fi
step "examples built with find_package and run; version 2 refused"

# 5. pkg-config.
export PKG_CONFIG_PATH=$libdir/pkgconfig
pc_build() {
  local out=$1 extra=$2
  shift 2
  # shellcheck disable=SC2046,SC2086
  g++ -std=c++20 -O2 -Wall -Wextra $(pkg-config --cflags kiviossdk $extra) "$@" -o "$out" \
    $(pkg-config --libs kiviossdk $extra) || die "pkg-config build of $out"
}
mkdir -p "$work"/pc/{hello,rest_client,run_loop,host_unit_test}
pc_build "$work/pc/hello/hello" "" examples/hello/*.cpp
pc_build "$work/pc/rest_client/rest_client" "" examples/rest_client/*.cpp
pc_build "$work/pc/run_loop/run_loop" glib-2.0 examples/run_loop/*.cpp
pc_build "$work/pc/host_unit_test/host_unit_test" gtest_main examples/host_unit_test/*.cpp
LD_LIBRARY_PATH=$libdir${LD_LIBRARY_PATH:+:$LD_LIBRARY_PATH} run_examples "$work/pc"
step "examples built with pkg-config and run"

# 6. Static.
configure -S . -B "$static_build" -DBUILD_SHARED_LIBS=OFF -DKIVI_BUILD_TESTS=OFF \
  -DKIVI_BUILD_BENCH=OFF -DKIVI_BUILD_TOOLS=OFF || die "static: configure"
cmake --build "$static_build" >"$work/static-build.log" 2>&1 ||
  { tail -n 40 "$work/static-build.log" >&2; die "static: build"; }
cmake --install "$static_build" --prefix "$static_prefix" >/dev/null || die "static: install"
static_libdir=$(dirname "$(find "$static_prefix" -name 'libkiviossdk.a' -print -quit)")
configure -S examples/hello -B "$work/hello-static" -DCMAKE_PREFIX_PATH="$static_prefix" ||
  die "static hello: configure"
cmake --build "$work/hello-static" >/dev/null || die "static hello: build"
"$work/hello-static/hello" >/dev/null || die "static hello: run"
if [[ $(ldd "$work/hello-static/hello") == *kiviossdk* ]]; then die "static hello links the shared library"; fi
# shellcheck disable=SC2046
g++ -std=c++20 -O2 $(PKG_CONFIG_PATH=$static_libdir/pkgconfig pkg-config --cflags kiviossdk) \
  examples/hello/main.cpp -o "$work/hello-static-pc" \
  $(PKG_CONFIG_PATH=$static_libdir/pkgconfig pkg-config --libs kiviossdk) ||
  die "static hello: pkg-config build"
"$work/hello-static-pc" >/dev/null || die "static hello (pkg-config): run"
step "static library installed; hello linked statically through find_package and pkg-config"

# 7. API documentation.
if [[ -f docs/Doxyfile && -z ${KIVI_SKIP_DOCS:-} ]]; then
  bash scripts/docs.sh "$work/docs" || die "Doxygen warnings (see above)"
  step "API documentation generated with no warning"
fi

# 8. Debian packages.
(cd "$build" && cpack -G DEB -B "$work/deb" >"$work/cpack.log" 2>&1) ||
  { tail -n 30 "$work/cpack.log" >&2; die "cpack -G DEB"; }
runtime_deps=$(dpkg-deb -f "$work"/deb/libkiviossdk1_*.deb Depends)
[[ $runtime_deps == *libcurl4* && $runtime_deps == *libicu* ]] ||
  die "the runtime package's dependencies are incomplete: $runtime_deps"
if [[ $(id -u) == 0 ]]; then
  bash scripts/check_deb.sh "$work/deb" --root "$work/debian12" >"$work/check_deb.log" 2>&1 ||
    { tail -n 30 "$work/check_deb.log" >&2; die "the Debian packages on a clean Debian 12"; }
  step "Debian packages built, installed and used on a clean Debian 12"
else
  step "Debian packages built (not installed on a clean Debian 12: that needs root)"
fi

# Figures.
strip -o "$work/libkiviossdk.stripped.so" "$libdir/libkiviossdk.so"
strip -o "$work/hello.stripped" "$work/hello-static/hello"
start=$EPOCHREALTIME
configure -S examples/hello -B "$work/hello-timed" -DCMAKE_PREFIX_PATH="$prefix" >/dev/null
cmake --build "$work/hello-timed" >/dev/null
end=$EPOCHREALTIME
printf 'sizes: libkiviossdk.so %s bytes (%s stripped), static hello %s bytes (%s stripped)\n' \
  "$(stat -L -c %s "$libdir/libkiviossdk.so")" "$(stat -c %s "$work/libkiviossdk.stripped.so")" \
  "$(stat -c %s "$work/hello-static/hello")" "$(stat -c %s "$work/hello.stripped")"
printf 'configure + build of examples/hello against the installed package: %.1f s\n' \
  "$(awk -v a="$start" -v b="$end" 'BEGIN { print b - a }')"
