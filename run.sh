#!/usr/bin/env bash
# Builds tessik-bind in Release and runs it. With no arguments it binds the built-in character and writes
# out/character.glb and out/character.png; any arguments go to tessik-bind as they are.
set -euo pipefail

root="$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)"
cd "$root"

if [[ -f scripts/install_deps.sh ]]; then
  if [[ -x scripts/install_deps.sh ]]; then ./scripts/install_deps.sh; else bash scripts/install_deps.sh; fi
fi

# May be overridden, e.g. to keep a second build apart from the default one.
build_dir="${TESSIK_RUN_BUILD_DIR:-build/release}"
mkdir -p "$build_dir"

# Full logs stay on disk; they are printed only when a step fails, so a good run reads as a few lines.
run_logged() {
  local log="$1"
  shift
  if ! "$@" >"$log" 2>&1; then
    cat "$log" >&2
    echo "run.sh: failed: $* (log: $log)" >&2
    exit 1
  fi
}

echo "== configure ($build_dir, Release)" >&2
run_logged "$build_dir/configure.log" cmake -S . -B "$build_dir" -DCMAKE_BUILD_TYPE=Release \
  -DTESSIK_BUILD_TESTS=OFF -DTESSIK_BUILD_BENCH=OFF -DTESSIK_BUILD_PYTHON=OFF -DTESSIK_BUILD_TOOLS=ON

echo "== build tessik-bind" >&2
run_logged "$build_dir/build.log" cmake --build "$build_dir" --target tessik-bind -j "$(nproc)"
# Compiler warnings would otherwise vanish with the log of a successful build.
grep -E 'warning:' "$build_dir/build.log" >&2 || true

echo "== tessik-bind $*" >&2
exec "$build_dir/tools/bind/tessik-bind" "$@"
