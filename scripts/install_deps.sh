#!/usr/bin/env bash
# Installs the Debian packages the project builds, tests and benchmarks with. Safe to run again:
# it only asks apt for what dpkg does not already report as installed.
set -euo pipefail

packages=(
  cmake g++ make clang-format
  libtbb-dev libglm-dev libglew-dev
  libegl-dev libgl-dev libegl-mesa0 libgl1-mesa-dri
  libgtest-dev libbenchmark-dev libeigen3-dev libsuitesparse-dev
  python3-dev pybind11-dev python3-numpy python3-pytest
  libassimp-dev assimp-testmodels nlohmann-json3-dev libcli11-dev libtinygltf-dev libstb-dev
)

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed"; then
    missing+=("$p")
  fi
done
[ ${#missing[@]} -eq 0 ] && exit 0

sudo=""
if [ "$(id -u)" -ne 0 ]; then
  command -v sudo >/dev/null || { echo "install_deps: need root (or sudo) to install: ${missing[*]}" >&2; exit 1; }
  sudo="sudo"
fi
echo "install_deps: installing ${missing[*]}"
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
