#!/usr/bin/env bash
# Makes sure the Debian packages the build needs are installed.
#
#   scripts/deps.sh           what the library, tests, benchmarks and fuzzers need
#   scripts/deps.sh --peers   also the libraries the peer benchmark compares
#                             against (scripts/peer_bench.py)
#
# Prints nothing and returns 0 when they all are. Otherwise, as root, installs
# the missing ones with apt-get; as any other user, prints the apt-get line to
# run and exits 1.
set -euo pipefail

peers=0
for argument; do
  case $argument in
    --peers) peers=1 ;;
    *)
      echo "usage: scripts/deps.sh [--peers]" >&2
      exit 2
      ;;
  esac
done

# Everything the build, the tests, the benchmarks and the fuzzers need.
#   libclang-rt-14-dev: libFuzzer and the sanitizer runtimes for clang.
#   nginx, openssl: a real HTTPS and HTTP/2 server for the network tests,
#   started by the tests themselves on 127.0.0.1 (never as a service).
#   libglib2.0-dev: the GLib main loop that the host-loop test drives the main
#   run loop from, as a GTK application would; GDBus for the fingerprint
#   service.
#   libsecret-1-dev: the user's Secret Service keyring.
#   gnome-keyring, dbus-daemon, python3-dbusmock: a real keyring and a
#   scripted fingerprint service on a private bus, started by the tests.
#   doxygen: the API documentation, checked for warnings by the test script.
#   dpkg-dev, file: cpack's Debian package (dpkg-shlibdeps names the
#   runtime package's dependencies).
PACKAGES=(
  cmake
  ninja-build
  g++
  clang
  libclang-rt-14-dev
  libgtest-dev
  libgmock-dev
  googletest
  libbenchmark-dev
  pkg-config
  libicu-dev
  libssl-dev
  libcurl4-openssl-dev
  libsimdjson-dev
  nlohmann-json3-dev
  libcpp-httplib-dev
  nginx
  openssl
  libglib2.0-dev
  libsecret-1-dev
  gnome-keyring
  dbus-daemon
  python3-dbusmock
  doxygen
  dpkg-dev
  file
)
# The peer benchmark's other clients and JSON readers (Qt 6 Core and Network,
# POCO Net and NetSSL, RapidJSON); never needed by the library or its tests.
if ((peers)); then
  PACKAGES+=(qt6-base-dev libpoco-dev rapidjson-dev)
fi

# Prints the packages among the arguments that are not installed.
missing_packages() {
  local -A ok=()
  local package status
  # One dpkg-query for all; it names the unknown packages on stderr.
  while read -r package status; do
    if [[ $status == "install ok installed" ]]; then ok[$package]=1; fi
  done < <(dpkg-query -W -f='${Package} ${Status}\n' "$@" 2>/dev/null || true)
  for package; do
    if [[ -z ${ok[$package]:-} ]]; then echo "$package"; fi
  done
}

mapfile -t missing < <(missing_packages "${PACKAGES[@]}")
((${#missing[@]} == 0)) && exit 0

if ((EUID != 0)); then
  echo "deps.sh: missing Debian packages: ${missing[*]}" >&2
  echo "Install them with:" >&2
  echo "sudo apt-get install -y --no-install-recommends ${missing[*]}" >&2
  exit 1
fi

echo "deps.sh: installing ${missing[*]}" >&2
apt-get update
# Packages that bring a service (nginx) must not start it: the tests start
# their own server when they need one.
policy=/usr/sbin/policy-rc.d
own_policy=0
if [[ ! -e $policy ]]; then
  printf '#!/bin/sh\nexit 101\n' >"$policy"
  chmod +x "$policy"
  own_policy=1
fi
status=0
DEBIAN_FRONTEND=noninteractive apt-get install -y --no-install-recommends "${missing[@]}" || status=$?
if ((own_policy)); then rm -f "$policy"; fi
((status == 0)) || exit "$status"

mapfile -t still_missing < <(missing_packages "${missing[@]}")
if ((${#still_missing[@]} > 0)); then
  echo "deps.sh: still not installed: ${still_missing[*]}" >&2
  exit 1
fi
