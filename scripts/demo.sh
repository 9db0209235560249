#!/usr/bin/env bash
# Sets up a fresh Debian 12 machine, builds Skarn, writes a demo card, reads it
# back through the plug-in the way an editing application would, and ingests
# every clip into a folder of movies.
#   demo.sh [CARD [MOVIES]]
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/install-deps.sh

build=${SKARN_BUILD_DIR:-build/release}
cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Release -DSKARN_BUILD_TESTS=OFF -DSKARN_BUILD_BENCH=OFF >/dev/null
cmake --build "$build" -j"$(nproc)"

card=${1:-$build/demo-card}
rm -rf "$card"
echo "== writing a demo card with one clip of every family: $card"
"$build/src/cardwriter/skarn-mkcard" "$card" --demo
echo
echo "== is it a Skarn card?"
"$build/src/host/skarn" cards "$card"
echo
echo "== its clips, as the plug-in describes them to a host"
"$build/src/host/skarn" clips "$card"
echo
echo "== one clip in full"
"$build/src/host/skarn" info "$card:A008"
echo
echo "== its tracks, as the clip's format reader presents them"
"$build/src/host/skarn" tracks "$card:A008"
echo
echo "== where its first video frames lie"
"$build/src/host/skarn" samples "$card:A008" --count 5
echo
movies=${2:-$build/demo-movies}
rm -rf "$movies"
echo "== every clip as a QuickTime movie: $movies"
"$build/src/host/skarn" ingest "$card" -o "$movies"
