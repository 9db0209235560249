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

# Microseconds of wall time, peak resident kilobytes and microseconds of
# processor time (user and system) of one command.
measure() {
  local start end
  start=$(date +%s%N)
  /usr/bin/time -f "%M %U %S" -o "$work/usage" "$@" >/dev/null 2>"$work/err" || { cat "$work/err" >&2; return 1; }
  end=$(date +%s%N)
  awk -v wall=$(( (end - start) / 1000 )) '{ printf "%d %d %d\n", wall, $1, ($2 + $3) * 1e6 }' "$work/usage"
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

  # Per program: best wall time, best processor time, largest peak.
  local -A wall cpu rss
  local name t r c
  for name in skarn ffmpeg cat; do wall[$name]=0 cpu[$name]=0 rss[$name]=0; done
  keep() {
    ((wall[$1] == 0 || $2 < wall[$1])) && wall[$1]=$2
    ((cpu[$1] == 0 || $4 < cpu[$1])) && cpu[$1]=$4
    (($3 > rss[$1])) && rss[$1]=$3
    return 0
  }
  for ((round = 0; round < rounds; ++round)); do
    # Interleaved rounds share whatever else the machine is doing.
    rm -f "$work/out.mov" "$work/ff.mov" "$work/cat.bin"
    read -r t r c < <(measure "$skarn" ingest "$card:B001" -o "$work/out.mov" --force)
    keep skarn "$t" "$r" "$c"
    read -r t r c < <(measure ffmpeg -nostdin -v error -y "${ffinputs[@]}" "${ffmaps[@]}" -c copy "$work/ff.mov")
    keep ffmpeg "$t" "$r" "$c"
    read -r t r c < <(measure sh -c 'cat "$@" > "$0"' "$work/cat.bin" "$video" "${audio[@]}")
    keep cat "$t" "$r" "$c"
  done
  awk -v n="$n" -v bytes="$bytes" -v s="${wall[skarn]}" -v f="${wall[ffmpeg]}" -v c="${wall[cat]}" \
      -v cs="${cpu[skarn]}" -v cf="${cpu[ffmpeg]}" -v cc="${cpu[cat]}" \
      -v rs="${rss[skarn]}" -v rf="${rss[ffmpeg]}" -v rc="${rss[cat]}" 'BEGIN {
    printf "%d frames, %.0f MB of essence (best of %d rounds; processor time is user + system)\n", n, bytes / 1e6, '"$rounds"'
    printf "  %-15s %8s %9s %10s %9s\n", "", "wall", "MB/s", "processor", "peak"
    printf "  %-15s %7.3fs %9.0f %9.3fs %5.1f MiB\n", "skarn ingest", s / 1e6, bytes / s, cs / 1e6, rs / 1024
    printf "  %-15s %7.3fs %9.0f %9.3fs %5.1f MiB\n", "ffmpeg -c copy", f / 1e6, bytes / f, cf / 1e6, rf / 1024
    printf "  %-15s %7.3fs %9.0f %9.3fs %5.1f MiB\n", "cat", c / 1e6, bytes / c, cc / 1e6, rc / 1024
    printf "  speed vs ffmpeg copy %.2fx (goal 1.5x; processor time %.2fx), vs cat %.2fx (goal 0.8x; processor time %.2fx)\n",
           f / s, cf / cs, c / s, cc / cs
    printf "  peak resident size %.1f MiB: %s 64 MiB\n", rs / 1024, rs / 1024 < 64 ? "below" : "NOT below"
  }'
  rm -rf "$card" "$work/out.mov" "$work/ff.mov" "$work/cat.bin"
}

bench "$frames"
bench "$((frames * 4))"
