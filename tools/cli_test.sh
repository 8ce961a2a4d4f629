#!/usr/bin/env bash
# Command-line behaviour of `sorvel encode`, `decode`, `simulate` and
# `eval`: refusals exit with 2 and one line naming the problem; good tokens
# become WAV files of the right length and decode back.
set -u
sorvel=$1
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT
failures=0
fail() { echo "FAIL: $*"; failures=$((failures + 1)); }

expect_refusal() {  # expect_refusal <text in message> <sorvel arguments...>
  local text=$1; shift
  local err
  err=$("$sorvel" "$@" 2>&1 >/dev/null)
  local rc=$?
  [ $rc -eq 2 ] && [[ "$err" == *"$text"* ]] || fail "$* -> rc $rc, '$err' (wanted rc 2 and '$text')"
}

expect_refusal "odd number of hex digits" encode --token 123 -o "$dir/x.wav"
expect_refusal "not a hex digit" encode --token 12zz -o "$dir/x.wav"
expect_refusal "8-byte tokens" encode --token 0102 -o "$dir/x.wav"
expect_refusal "not in {dsss,dtmf}" encode --scheme fsk --token 01 -o "$dir/x.wav"
expect_refusal "cannot write" encode --token 010203040506 --crc -o "$dir/missing/x.wav"
expect_refusal "number_of_taps" encode --token 010203040506 --crc --number-of-taps 4 -o "$dir/x.wav"
expect_refusal "Nonzero duration 0.1 exceeds" encode --scheme dtmf --token 0102030405 \
  --adsr 0.1,0,0,0,1 -o "$dir/x.wav"

# 17 frames of 1905 samples (start + 16 symbols), 16-bit mono + 44-byte header.
"$sorvel" encode --token 010203040506 --crc -o "$dir/dsss.wav" >/dev/null
size=$(stat -c %s "$dir/dsss.wav" 2>/dev/null || echo 0)
[ "$size" -eq $((44 + 2 * 17 * 1905)) ] || fail "dsss.wav has $size bytes"
# 9 frames of 2208 samples (spacer + 8 symbols).
"$sorvel" encode --scheme dtmf --token 0102030405 -o "$dir/dtmf.wav" >/dev/null
size=$(stat -c %s "$dir/dtmf.wav" 2>/dev/null || echo 0)
[ "$size" -eq $((44 + 2 * 9 * 2208)) ] || fail "dtmf.wav has $size bytes"

# Round trips through files and through a raw PCM pipe, both schemes, with
# and without CRC: each prints the message it was given, from a file that
# holds one broadcast and ends with it.
round_trip() {  # round_trip <hex> <encode and decode options...>
  local hex=$1; shift
  "$sorvel" encode --token "$hex" "$@" -o "$dir/rt.wav" >/dev/null || return 1
  "$sorvel" decode "$dir/rt.wav" "$@" | grep -q "$hex" || return 1
}
for args in "--crc|536f7276656c" "|0102030405060708" "--scheme dtmf --crc|123456" \
            "--scheme dtmf|0a0b0c0d0e" "--scheme dtmf --use-checksum-symbol|0a0b0c0d0e"; do
  options=${args%%|*}
  hex=${args##*|}
  # shellcheck disable=SC2086
  round_trip "$hex" $options || fail "round trip $options $hex"
done
"$sorvel" encode --token 536f7276656c --crc --loop 3 -o "$dir/pipe.wav" >/dev/null
tail -c +45 "$dir/pipe.wav" | "$sorvel" decode - --rate 44100 --crc --json |
  grep -q '"token": "536f7276656c", "scheme": "dsss", "rank": 1}' || fail "raw pipe"
"$sorvel" decode "$dir/missing.wav" 2>/dev/null
[ $? -eq 2 ] || fail "unreadable input should exit 2"
"$sorvel" decode "$dir/dtmf.wav" --scheme dsss >/dev/null
[ $? -eq 1 ] || fail "no token should exit 1"

# Simulation: a token through a noisy, reverberant room decodes; -o writes
# what the microphone heard; eval prints its table and writes its plot.
"$sorvel" simulate --token 536f7276656c --crc --snr 0 --rt60 0.3 --speed 0.5 --rate 48000 |
  grep -q 536f7276656c || fail "simulate"
"$sorvel" simulate --token 536f7276656c --crc --seconds 1 -o "$dir/heard.wav" >/dev/null &&
  [ -s "$dir/heard.wav" ] || fail "simulate -o"
"$sorvel" eval --scheme dsss,dtmf --seeds 1 --snr-max 0 --snr-min 0 --plot "$dir/plot.svg" \
  2>/dev/null | grep -q "dtmf: lowest SNR with >= 95% success 0 dB" &&
  grep -q "<polyline" "$dir/plot.svg" || fail "eval"

# A physical room: malformed or impossible rooms are refused with exit 2
# and one line; a token gets through a small office.
sim=(simulate --token 536f7276656c --crc)
expect_refusal "takes WxDxH" "${sim[@]}" --room 4x3
expect_refusal "takes WxDxH" "${sim[@]}" --room 4x0x2.5:0.4
expect_refusal "takes WxDxH" "${sim[@]}" --room 4x3x2.5:fast
expect_refusal "needs an RT60" "${sim[@]}" --room 4x3x2.5
expect_refusal "does not fit" "${sim[@]}" --room 4x3x2.5:0.4 --distance 6
expect_refusal "requires --room" "${sim[@]}" --distance 2
# The wake-up detector needs room for the carrier's band: 32 and 16 kHz
# inputs are refused up front, for simulate, eval and decode alike.
expect_refusal "--hotsound needs a sample rate" "${sim[@]}" --hotsound --rate 32000
expect_refusal "--hotsound needs a sample rate" "${sim[@]}" --hotsound --rate 16000
expect_refusal "" eval --scheme hotsound --rate 32000 --seeds 1
"$sorvel" "${sim[@]}" --seconds 1 --rate 32000 -o "$dir/r32.wav" >/dev/null
expect_refusal "--hotsound needs a sample rate of at least" decode --hotsound --crc "$dir/r32.wav"
"$sorvel" "${sim[@]}" --hotsound --snr -6 --rate 48000 | grep -q 536f7276656c ||
  fail "simulate --hotsound at 48 kHz"
"$sorvel" "${sim[@]}" --seconds 2 --snr 10 --room 4x3x2.5:0.4 --distance 1.5 --source phone |
  grep -q 536f7276656c || fail "simulate --room"
"$sorvel" eval --scheme dsss --seeds 1 --room 4x3x2.5:0.4 --distances 1 --plot "$dir/rooms.svg" \
  2>/dev/null | grep -q "1.00 m *1/1 (100%)" &&
  grep -q "<polyline" "$dir/rooms.svg" || fail "eval --distances"

exit $((failures > 0))
