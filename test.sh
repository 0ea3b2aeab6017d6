#!/usr/bin/env bash
# Installs what is missing, builds everything and runs the whole test suite. Non-zero on any failure.
set -euo pipefail
cd "$(dirname "$0")"

./scripts/install_deps.sh

build=${TESSIK_TEST_BUILD_DIR:-build/test}
jobs=$(nproc)

sources=$(git ls-files -- '*.h' '*.cpp' 2>/dev/null || true)
if [ -n "$sources" ]; then
  echo "== clang-format check"
  # shellcheck disable=SC2086
  clang-format --dry-run --Werror $sources
fi

echo "== configure ($build)"
cmake -S . -B "$build" -DCMAKE_BUILD_TYPE=Release -DTESSIK_BUILD_TESTS=ON -DTESSIK_BUILD_BENCH=ON \
  -DTESSIK_BUILD_TOOLS=ON >/dev/null
echo "== build"
cmake --build "$build" -j"$jobs"
echo "== test"
ctest --test-dir "$build" --output-on-failure -j"$jobs"
