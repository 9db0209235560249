#!/usr/bin/env bash
# Times `skarn ingest` of a DVCPRO HD 1080i60 clip (four audio channels) into a
# movie against a stream copy of the same essence files by ffmpeg and against
# cat of them into one file, in the same run, with the page cache warm and the
# output in /dev/shm; then the same for a clip four times as long. Reports the
# best of several rounds, the speed ratios and each program's peak resident size.
#
#   scripts/ingest-bench.sh [BUILD_DIR] [FRAMES] [ROUNDS]
#
# Goals: at least 1.5x as fast as the ffmpeg copy, at least 0.8x as fast as
# cat, and a peak resident size below 64 MiB for both lengths.
set -euo pipefail
cd "$(dirname "$0")/.."

build=${1:-build/release}
frames=${2:-1200}
rounds=${3:-5}
skarn=$build/src/host/skarn
mkcard=$build/src/cardwriter/skarn-mkcard
for tool in "$skarn" "$mkcard"; do
  [[ -x $tool ]] || { echo "ingest-bench: $tool not built" >&2; exit 2; }
done
command -v ffmpeg >/dev/null || { echo "ingest-bench: ffmpeg not installed" >&2; exit 2; }

work=$(mktemp -d /dev/shm/skarn-bench.XXXXXX)
trap 'rm -rf "$work"' EXIT

# Seconds (with nanoseconds) and peak resident kilobytes of one command.
measure() {
  local start end
  start=$(date +%s%N)
  /usr/bin/time -f %M -o "$work/rss" "$@" >/dev/null 2>"$work/err" || { cat "$work/err" >&2; return 1; }
  end=$(date +%s%N)
  echo "$(( (end - start) / 1000 )) $(cat "$work/rss")"
}

bench() {
  local n=$1 card=$work/card$1
  "$mkcard" -q "$card" --clip "dvcprohd-1080i60,frames=$n,channels=4,name=B001"
  local video=$card/CONTENTS/VIDEO/B001.MXF
  local audio=("$card"/CONTENTS/AUDIO/B001*.MXF)
  local bytes
  bytes=$(cat "$video" "${audio[@]}" | wc -c)
  cat "$video" "${audio[@]}" >/dev/null  # warm the page cache

  local ffmaps=(-map 0:v)
  for i in "${!audio[@]}"; do ffmaps+=(-map "$((i + 1)):a"); done
  local ffinputs=(-i "$video")
  for a in "${audio[@]}"; do ffinputs+=(-i "$a"); done

  local best_skarn=0 best_ff=0 best_cat=0 rss_skarn=0 rss_ff=0 rss_cat=0 t r
  for ((round = 0; round < rounds; ++round)); do
    # Interleaved rounds share whatever else the machine is doing.
    rm -f "$work/out.mov" "$work/ff.mov" "$work/cat.bin"
    read -r t r < <(measure "$skarn" ingest "$card:B001" -o "$work/out.mov" --force)
    ((best_skarn == 0 || t < best_skarn)) && best_skarn=$t
    ((r > rss_skarn)) && rss_skarn=$r
    read -r t r < <(measure ffmpeg -nostdin -v error -y "${ffinputs[@]}" "${ffmaps[@]}" -c copy "$work/ff.mov")
    ((best_ff == 0 || t < best_ff)) && best_ff=$t
    ((r > rss_ff)) && rss_ff=$r
    read -r t r < <(measure sh -c 'cat "$@" > "$0"' "$work/cat.bin" "$video" "${audio[@]}")
    ((best_cat == 0 || t < best_cat)) && best_cat=$t
    ((r > rss_cat)) && rss_cat=$r
  done
  awk -v n="$n" -v bytes="$bytes" -v s="$best_skarn" -v f="$best_ff" -v c="$best_cat" \
      -v rs="$rss_skarn" -v rf="$rss_ff" -v rc="$rss_cat" 'BEGIN {
    printf "%d frames, %.0f MB of essence (best of rounds, peak resident size)\n", n, bytes / 1e6
    printf "  skarn ingest   %7.3f s  %7.0f MB/s  %6.1f MiB\n", s / 1e6, bytes / s, rs / 1024
    printf "  ffmpeg -c copy %7.3f s  %7.0f MB/s  %6.1f MiB\n", f / 1e6, bytes / f, rf / 1024
    printf "  cat            %7.3f s  %7.0f MB/s  %6.1f MiB\n", c / 1e6, bytes / c, rc / 1024
    printf "  speed vs ffmpeg copy %.2fx (goal 1.5x), vs cat %.2fx (goal 0.8x), peak %s 64 MiB\n",
           f / s, c / s, rs / 1024 < 64 ? "below" : "NOT below"
  }'
  rm -rf "$card" "$work/out.mov" "$work/ff.mov" "$work/cat.bin"
}

bench "$frames"
bench "$((frames * 4))"
