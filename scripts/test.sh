#!/usr/bin/env bash
# The whole test suite: installs what is missing, builds and tests the host build
# (with the JVM tests), the controller ABI under qemu-arm, the sanitizer builds,
# and a packager's plain Release build.
#   scripts/test.sh            everything
#   scripts/test.sh host       one stage: host | armhf | asan | tsan | fuzz | release
set -euo pipefail
cd "$(dirname "$0")/.."

packages=(cmake ninja-build g++ clang libclang-rt-14-dev googletest libgtest-dev libgmock-dev
          libbenchmark-dev openjdk-17-jdk-headless bison python3 g++-arm-linux-gnueabihf qemu-user
          cups cups-client)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if ((${#missing[@]})); then
  echo "== installing: ${missing[*]}"
  sudo=""; [ "$(id -u)" -eq 0 ] || sudo="sudo"
  $sudo env DEBIAN_FRONTEND=noninteractive apt-get update -qq
  $sudo env DEBIAN_FRONTEND=noninteractive apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi

stages=("$@")
((${#stages[@]})) || stages=(host armhf asan tsan fuzz release)

run_preset() {
  local preset=$1
  echo "== $preset: configure and build"
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset"
  echo "== $preset: tests"
  if [ "$preset" = tsan ]; then
    # OpenJDK does not support ThreadSanitizer. One JVM test that starts no
    # thread of the library hung there once, after it had started, and not
    # again in some 300 reruns; so a JVM test that times out under TSan gets
    # a second run. A real deadlock hangs that one too.
    ctest --preset tsan --timeout 300 -LE '^jvm$'
    ctest --preset tsan --timeout 300 -L '^jvm$' --repeat after-timeout:2
  else
    ctest --preset "$preset" --timeout 300
  fi
}

for stage in "${stages[@]}"; do
  case "$stage" in
    host) run_preset default ;;
    armhf|asan|tsan) run_preset "$stage" ;;
    fuzz)
      echo "== fuzz: bounded libFuzzer runs"
      cmake --preset fuzz >/dev/null
      targets=()
      for src in tests/fuzz/*.cpp; do targets+=("$(basename "$src" .cpp)"); done
      cmake --build --preset fuzz --target "${targets[@]}"
      for t in "${targets[@]}"; do
        # Scratch corpus first, so the checked-in seeds are never rewritten.
        scratch="build/fuzz/corpus/$t"; mkdir -p "$scratch"
        # Six targets in about three minutes; a unit slower than 30 s is a hang.
        # A failing or slow input is written under build/fuzz, not into the tree.
        args=(-max_total_time="${FUZZ_SECONDS:-25}" -timeout=30 -rss_limit_mb=2048 -max_len=1100
              -artifact_prefix="build/fuzz/$t-" "$scratch")
        [ -f "tests/fuzz/$t.dict" ] && args=(-dict="tests/fuzz/$t.dict" "${args[@]}")
        [ -d "tests/fuzz/corpus/$t" ] && args+=("tests/fuzz/corpus/$t")
        echo "-- $t"
        rc=0; "build/fuzz/tests/fuzz/$t" "${args[@]}" >"build/fuzz/$t.log" 2>&1 || rc=$?
        grep -E '^(#[0-9]+ +DONE|Done [0-9]+ runs|==[0-9]+==|SUMMARY)' "build/fuzz/$t.log" || true
        if [ "$rc" -ne 0 ]; then tail -n 40 "build/fuzz/$t.log"; exit "$rc"; fi
      done
      ;;
    release)
      # No preset, as a packager configures: warnings do not stop that build, so
      # the stage fails on any, from a clean tree (else unchanged files stay silent).
      echo "== release: plain Release configure and build"
      rm -rf build/release
      cmake -S . -B build/release -G Ninja -DCMAKE_BUILD_TYPE=Release >/dev/null
      cmake --build build/release -j2 2>&1 | tee build/release/build.log
      if grep -q 'warning:' build/release/build.log; then
        echo "release: the build printed warnings (build/release/build.log)" >&2
        exit 1
      fi
      ;;
    *) echo "unknown stage: $stage" >&2; exit 2 ;;
  esac
done
echo "== all stages passed: ${stages[*]}"
