#!/usr/bin/env bash
# Builds the library and runs its tests, stage by stage:
#   1. normal build (build/, RelWithDebInfo, shared library), every suite;
#   2. the installed package (scripts/check_install.sh): every header alone,
#      every public symbol exported, the examples built against the installed
#      package through CMake and pkg-config and run, a static build, the API
#      documentation without a Doxygen warning, the Debian packages installed
#      on a clean Debian 12 (as root);
#   3. AddressSanitizer + UBSan build (build-asan/), every suite;
#   4. ThreadSanitizer build (build-tsan/), the suites labelled "concurrency";
#   5. libFuzzer build (build-fuzz/, clang), each fuzz target for 20 s.
# Ends with "N passed, 0 failed" (N: ctest tests over all stages; ", K skipped"
# follows when some were skipped), or exits non-zero at the first failure.
#
#   scripts/test.sh [--quick] [--no-tsan] [--no-fuzz]
#     --quick    stages 1 and 2 only
#     --no-tsan  skip stage 4
#     --no-fuzz  skip stage 5
set -euo pipefail

usage() { sed -n '2,18s/^# \{0,1\}//p' "${BASH_SOURCE[0]}"; }

run_sanitizers=1
run_tsan=1
run_fuzz=1
for arg in "$@"; do
  case "$arg" in
    --quick) run_sanitizers=0 run_tsan=0 run_fuzz=0 ;;
    --no-tsan) run_tsan=0 ;;
    --no-fuzz) run_fuzz=0 ;;
    -h | --help) usage; exit 0 ;;
    *) echo "test.sh: unknown option '$arg'" >&2; usage >&2; exit 2 ;;
  esac
done

cd "$(dirname "${BASH_SOURCE[0]}")/.."
root=$PWD

bash scripts/deps.sh

# Later settings win, so anything already in the environment overrides these.
export ASAN_OPTIONS="halt_on_error=1:print_stacktrace=1:detect_leaks=1${ASAN_OPTIONS:+:$ASAN_OPTIONS}"
export UBSAN_OPTIONS="halt_on_error=1:print_stacktrace=1${UBSAN_OPTIONS:+:$UBSAN_OPTIONS}"
export TSAN_OPTIONS="halt_on_error=1:second_deadlock_stack=1:suppressions=$root/tests/tsan.supp${TSAN_OPTIONS:+:$TSAN_OPTIONS}"

total_passed=0
total_skipped=0
stage_times=()
stage_name=""
stage_start=0

begin_stage() {
  stage_name=$1
  stage_start=$SECONDS
  printf '\n==== %s ====\n' "$stage_name"
}

end_stage() {
  local took=$((SECONDS - stage_start))
  stage_times+=("$stage_name: ${took}s")
  printf '==== %s: done in %ds ====\n' "$stage_name" "$took"
}

fail() {
  printf '\n==== FAILED in stage "%s": %s ====\n' "$stage_name" "$*" >&2
  exit 1
}

# configure DIR [cmake args...]
configure() {
  local dir=$1
  shift
  cmake -S "$root" -B "$dir" -G Ninja "$@" || fail "cmake configure of $dir"
}

# build DIR [targets...]
build() {
  local dir=$1
  shift
  local targets=()
  if (($# > 0)); then targets=(--target "$@"); fi
  cmake --build "$dir" "${targets[@]}" || fail "build in $dir"
}

# run_ctest DIR [ctest args...]: runs the tests and adds to total_passed and
# total_skipped.
run_ctest() {
  local dir=$1
  shift
  local log="$dir/ctest.log"
  if ! ctest --test-dir "$dir" --output-on-failure --no-tests=error -j2 "$@" 2>&1 | tee "$log"; then
    fail "ctest in $dir"
  fi
  # "100% tests passed, 0 tests failed out of 57"
  local counts failed total
  counts=$(sed -nE 's/^[0-9]+% tests passed, ([0-9]+) tests? failed out of ([0-9]+).*/\1 \2/p' "$log" |
    tail -n 1)
  [[ -n $counts ]] || fail "no ctest summary line in $log"
  read -r failed total <<<"$counts"
  ((failed == 0)) || fail "$failed of $total tests failed in $dir"
  # ctest counts skipped tests as passed and lists them as "  12 - Name (Skipped)".
  local skipped
  skipped=$(grep -cE '^[[:space:]]+[0-9]+ - .* \(Skipped\)$' "$log" || true)
  total_passed=$((total_passed + total - skipped))
  total_skipped=$((total_skipped + skipped))
}

# The test executables of the suites labelled "concurrency" that exist in
# the build tree DIR, read from tests/CMakeLists.txt.
concurrency_targets() {
  local dir=$1 area
  sed -nE 's/^kivi_add_test_suite\(([A-Za-z0-9_]+)[[:space:]].*LABELS[^)]*concurrency.*/\1/p' \
    "$root/tests/CMakeLists.txt" |
    while read -r area; do
      if ninja -C "$dir" -t query "kivi_tests_$area" >/dev/null 2>&1; then
        echo "kivi_tests_$area"
      fi
    done
}

# --- 1. Normal build ---------------------------------------------------------
begin_stage "1/5 normal build (build/, RelWithDebInfo)"
bash scripts/check_layers.sh || fail "a layer includes from a layer above it"
# /usr: the Debian packages stage 2 makes from this tree install there.
configure build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DBUILD_SHARED_LIBS=ON -DCMAKE_INSTALL_PREFIX=/usr
build build
run_ctest build
end_stage

# --- 2. The installed package ------------------------------------------------
begin_stage "2/5 installed package, examples, documentation"
bash scripts/check_install.sh build || fail "the installed package"
end_stage

# --- 2. AddressSanitizer + UBSan -----------------------------------------------
if ((run_sanitizers)); then
  # Debug: the quickest to compile, and the sanitizers report exact lines.
  # The sanitizer builds make only the static library: the suites link it.
  begin_stage "3/5 AddressSanitizer + UBSan (build-asan/, Debug)"
  configure build-asan -DCMAKE_BUILD_TYPE=Debug -DKIVI_SANITIZER=address -DKIVI_BUILD_BENCH=OFF \
    -DBUILD_SHARED_LIBS=OFF
  build build-asan
  run_ctest build-asan
  end_stage
fi

# --- 3. ThreadSanitizer, concurrency suites ------------------------------------
if ((run_tsan)); then
  begin_stage "4/5 ThreadSanitizer, concurrency suites (build-tsan/, RelWithDebInfo)"
  configure build-tsan -DCMAKE_BUILD_TYPE=RelWithDebInfo -DKIVI_SANITIZER=thread \
    -DKIVI_BUILD_BENCH=OFF -DKIVI_BUILD_TOOLS=OFF -DBUILD_SHARED_LIBS=OFF
  # Only the suites that run here; everything when they cannot be told apart.
  mapfile -t tsan_targets < <(concurrency_targets build-tsan)
  build build-tsan "${tsan_targets[@]}"
  run_ctest build-tsan -L concurrency
  end_stage
fi

# --- 4. Fuzzing ------------------------------------------------------------------
shopt -s nullglob
fuzz_sources=(fuzz/*.cpp)
shopt -u nullglob
if ((run_fuzz && ${#fuzz_sources[@]} > 0)); then
  begin_stage "5/5 libFuzzer, 20 s per target (build-fuzz/, clang, ASan + UBSan)"
  # fuzzer-no-link gives the library the coverage instrumentation the
  # fuzzers steer by.
  configure build-fuzz -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_CXX_COMPILER=clang++ \
    -DKIVI_BUILD_FUZZ=ON -DKIVI_BUILD_TESTS=OFF -DKIVI_BUILD_BENCH=OFF -DKIVI_BUILD_TOOLS=OFF \
    -DKIVI_SANITIZER=address -DCMAKE_CXX_FLAGS=-fsanitize=fuzzer-no-link -DBUILD_SHARED_LIBS=OFF
  build build-fuzz
  for source in "${fuzz_sources[@]}"; do
    name=$(basename "$source" .cpp)
    binary=build-fuzz/fuzz/$name
    [[ -x $binary ]] || fail "fuzz target $binary was not built"
    # New inputs go to the scratch corpus in build-fuzz/; the checked-in seed
    # corpus, if any, is only read.
    work_corpus=build-fuzz/corpus/$name
    artifacts=build-fuzz/artifacts/$name
    mkdir -p "$work_corpus" "$artifacts"
    corpora=("$work_corpus")
    if [[ -d fuzz/corpus/$name ]]; then corpora+=("fuzz/corpus/$name"); fi
    log=build-fuzz/$name.log
    printf -- '-- %s (log: %s)\n' "$name" "$log"
    if ! "$binary" -max_total_time=20 -print_final_stats=1 -artifact_prefix="$artifacts/" \
      "${corpora[@]}" >"$log" 2>&1; then
      tail -n 60 "$log" >&2
      fail "fuzz target $name (inputs that fail are in $artifacts/)"
    fi
    grep -E '^(Done [0-9]+ runs|stat::number_of_executed_units)' "$log" | head -n 1 || true
  done
  end_stage
elif ((run_fuzz)); then
  printf '\n==== 5/5 libFuzzer: no fuzz targets in fuzz/, skipped ====\n'
fi

printf '\n==== Summary ====\n'
for line in "${stage_times[@]}"; do
  echo "  $line"
done
if ((total_skipped > 0)); then
  echo "$total_passed passed, 0 failed, $total_skipped skipped"
else
  echo "$total_passed passed, 0 failed"
fi
