#!/usr/bin/env bash
# Installs the Debian 12 packages the build needs, only those missing.
#   install-deps.sh          build dependencies
#   install-deps.sh --test   also what the tests use (ffmpeg for essence checks)
set -euo pipefail

packages=(build-essential cmake ninja-build pkg-config libgtest-dev libgmock-dev libbenchmark-dev
          libpugixml-dev nlohmann-json3-dev libcli11-dev libavformat-dev libavcodec-dev libavutil-dev)
if [[ "${1:-}" == "--test" ]]; then
  packages+=(ffmpeg)
fi

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed"; then
    missing+=("$p")
  fi
done
if ((${#missing[@]} == 0)); then
  exit 0
fi

sudo=""
if [[ $(id -u) -ne 0 ]]; then
  sudo="sudo"
fi
echo "installing: ${missing[*]}" >&2
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
