#!/usr/bin/env bash
# Builds the fuzz target (clang, libFuzzer, AddressSanitizer) in its own build folder, writes the
# seed corpus and fuzzes for a fixed time: fuzz/run.sh [seconds] (default 60).
# Crashing inputs land in build-fuzz/artifacts/; each one found becomes a regression test.
set -euo pipefail
seconds="${1:-60}"
here="$(cd "$(dirname "$0")" && pwd)"
root="$(dirname "$here")"
build="${VAULTORA_FUZZ_BUILD:-$root/build-fuzz}"

# The project's own dependencies first, then clang with its libFuzzer runtime (not needed by the
# main build, so only here).
"$root/scripts/install-deps.sh"
SUDO=""
[ "$(id -u)" -ne 0 ] && SUDO="sudo"
if ! command -v clang++ >/dev/null 2>&1; then
  echo "Installing: clang" >&2
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq --no-install-recommends clang
fi
major="$(clang++ -dumpversion | cut -d. -f1)"
probe="$(mktemp -d)"
echo 'extern "C" int LLVMFuzzerTestOneInput(const char*, unsigned long) { return 0; }' > "$probe/p.cpp"
if ! clang++ -fsanitize=fuzzer,address "$probe/p.cpp" -o "$probe/p" >/dev/null 2>&1; then
  echo "Installing: libclang-rt-$major-dev" >&2
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq --no-install-recommends "libclang-rt-$major-dev"
fi
rm -rf "$probe"

CC=clang CXX=clang++ cmake -S "$here" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
cmake --build "$build" -j"${VAULTORA_FUZZ_JOBS:-2}" --target vaultora_fuzz vaultora_fuzz_seeds

rm -rf "$build/seeds"
"$build/vaultora_fuzz_seeds" "$build/seeds"
mkdir -p "$build/corpus" "$build/artifacts"
cd "$build"
# Leaks are checked per input; the rss limit catches runaway allocations from hostile sizes.
./vaultora_fuzz -max_total_time="$seconds" -max_len=65536 -rss_limit_mb=2048 -timeout=20 \
  -print_final_stats=1 -artifact_prefix="$build/artifacts/" corpus seeds
