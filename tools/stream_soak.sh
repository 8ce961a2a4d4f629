#!/usr/bin/env bash
# Streams hours of noise with a broadcast every few minutes, as raw 16-bit
# PCM at 44.1 kHz, into `sorvel decode - --rate 44100 --crc` as fast as it
# decodes, then counts the broadcasts it printed and reports its peak RSS
# (/usr/bin/time -v), and every 30 s of wall time its RSS against the stream
# time of the latest token (rss.txt). Exits 1 when a broadcast was missed or
# a process failed. `make soak-stream HOURS=42` runs it.
#
#   tools/stream_soak.sh [--hours H] [--every SECONDS] [--scheme dsss|hotsound|dtmf]
#                        [--build DIR] [--out DIR]
#   defaults: 42 hours (past 2^31 DSSS baseband samples), every 600 s, dsss,
#   build, out/stream-soak
set -u
hours=42 every=600 scheme=dsss build=build out=out/stream-soak

usage() {
  echo "usage: $0 [--hours H] [--every SECONDS] [--scheme dsss|hotsound|dtmf]" \
       "[--build DIR] [--out DIR]" >&2
  exit 2
}
refuse() { echo "stream_soak: $1" >&2; exit 2; }

while [ $# -gt 0 ]; do
  case $1 in
    --hours|--every|--scheme|--build|--out) [ $# -ge 2 ] || refuse "$1 needs a value" ;;&
    --hours) hours=$2 ;;
    --every) every=$2 ;;
    --scheme) scheme=$2 ;;
    --build) build=$2 ;;
    --out) out=$2 ;;
    -h|--help) usage ;;
    *) refuse "unknown option '$1'" ;;
  esac
  shift 2
done

positive='^([0-9]+\.?[0-9]*|\.[0-9]+)$'
[[ $hours =~ $positive ]] && awk "BEGIN { exit !($hours > 0) }" ||
  refuse "--hours must be a positive number, got '$hours'"
[[ $every =~ $positive ]] || refuse "--every must be a positive number, got '$every'"
awk "BEGIN { exit !($every >= 10) }" || refuse "--every must be at least 10 seconds"
case $scheme in
  dsss) pcm=dsss flags=() ;;
  hotsound) pcm=dsss flags=(--hotsound) ;;
  dtmf) pcm=dtmf flags=(--scheme dtmf) ;;
  *) refuse "--scheme takes dsss, hotsound or dtmf, got '$scheme'" ;;
esac
soak=$build/bench/sorvel_soak
sorvel=$build/tools/sorvel
for program in "$soak" "$sorvel"; do
  [ -x "$program" ] || refuse "$program is missing; build first (make build)"
done
[ -x /usr/bin/time ] || refuse "/usr/bin/time is missing (GNU time reports the peak RSS)"
mkdir -p "$out" || refuse "cannot create $out"

echo "stream soak: $hours h of $scheme audio, a broadcast every $every s, into $sorvel decode -"
start=$(date +%s)
rm -f "$out/pid" "$out/status"
: >"$out/heard.txt"
# The decoder writes its process id first (exec keeps it) so that its RSS
# can be read while it runs.
( "$soak" --pcm "$pcm" --sent "$out/sent.txt" --hours "$hours" --every "$every" |
    /usr/bin/time -v -o "$out/time.txt" bash -c 'echo $$ >"$0"; exec "$@"' "$out/pid" \
      "$sorvel" decode - --rate 44100 --crc "${flags[@]}" >"$out/heard.txt" 2>"$out/decode.log"
  echo "${PIPESTATUS[@]}" >"$out/status" ) &
pipeline=$!
echo "# stream seconds of the latest token, RSS kB of sorvel decode" >"$out/rss.txt"
for ((tick = 0; ; ++tick)); do
  [ ! -s "$out/status" ] && kill -0 "$pipeline" 2>/dev/null || break
  if ((tick % 30 == 29)) && [ -s "$out/pid" ] &&
     rss=$(awk '/^VmRSS/ { print $2 }' "/proc/$(cat "$out/pid")/status" 2>/dev/null) &&
     [ -n "$rss" ]; then
    echo "$(tail -n 1 "$out/heard.txt" | awk '{ print $1 }') $rss" >>"$out/rss.txt"
  fi
  sleep 1
done
wait "$pipeline"
read -r -a status <"$out/status"
seconds=$(( $(date +%s) - start ))

# Lines are "<seconds> s  <hex>" with "(alternative)" after lower-ranked ones.
awk '{ print $3 }' "$out/heard.txt" | sort -u >"$out/heard_tokens.txt"
sort -u "$out/sent.txt" >"$out/sent_tokens.txt"
sent=$(wc -l <"$out/sent.txt")
heard=$(comm -12 "$out/sent_tokens.txt" "$out/heard_tokens.txt" | wc -l)
unexpected=$(comm -13 "$out/sent_tokens.txt" "$out/heard_tokens.txt" | wc -l)
peak=$(awk -F': ' '/Maximum resident set size/ { print $2 }' "$out/time.txt")

echo "stream soak: $heard/$sent broadcasts heard, $unexpected tokens not sent," \
     "peak RSS of sorvel decode $peak kB, $seconds s wall"
# Broadcast k (from 0) starts 1 s into period k.
awk -v every="$every" 'NR == FNR { heard[$1] = 1; next }
  !($1 in heard) { printf "missed: %s, the broadcast at %.2f h\n", $1, ((FNR - 1) * every + 1) / 3600 }' \
  "$out/heard_tokens.txt" "$out/sent.txt"
if [ "${status[0]}" -ne 0 ] || [ "${status[1]}" -gt 1 ]; then
  echo "stream soak FAILED: generator exited ${status[0]}, sorvel decode ${status[1]}" \
       "(see $out/decode.log)"
  exit 1
fi
if [ "$sent" -eq 0 ] || [ "$heard" -ne "$sent" ]; then
  echo "stream soak FAILED"
  exit 1
fi
echo "stream soak passed"
