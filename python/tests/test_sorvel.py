"""Tests of the sorvel module: round trips through the channel simulator,
input forms, and refused settings (each raised in this interpreter: an
abort in the library would end the whole run)."""

import numpy as np
import pytest

import sorvel

RATE = 48000  # the hotsound detector needs at least 40993 Hz

# scheme, hotsound, crc, message
LINKS = [
    ("dsss", False, False, bytes.fromhex("536f7276656c2101")),
    ("dsss", False, True, bytes.fromhex("48656c6c6f21")),
    ("dsss", True, False, bytes.fromhex("0123456789abcdef")),
    ("dsss", True, True, bytes.fromhex("536f7276656c")),
    ("dtmf", False, False, bytes.fromhex("0102030405")),
    ("dtmf", False, True, bytes.fromhex("a1b2c3")),
]
LINK_IDS = [f"{s}{'-hotsound' if h else ''}{'-crc' if c else ''}" for s, h, c, _ in LINKS]


def broadcast(scheme, crc, message, seconds=3.0, **channel):
    enc = sorvel.Encoder(scheme, crc=crc)
    pcm = enc.encode(message, loop_seconds=seconds)
    channel.setdefault("snr_db", 10)
    return sorvel.simulate(pcm, sample_rate=enc.sample_rate, output_rate=RATE,
                           leading_silence=0.5, trailing_silence=0.5, **channel)


def decode(scheme, hotsound, crc, audio, blocks=None, **settings):
    dec = sorvel.Decoder(scheme, crc=crc, hotsound=hotsound, sample_rate=RATE, **settings)
    if blocks is None:
        dec.process(audio)
    else:
        for start in range(0, len(audio), blocks):
            dec.process(audio[start:start + blocks])
    return dec.tokens()


@pytest.mark.parametrize("scheme,hotsound,crc,message", LINKS, ids=LINK_IDS)
def test_round_trip(scheme, hotsound, crc, message):
    heard = broadcast(scheme, crc, message)
    assert heard.dtype == np.int16
    if crc:
        assert decode(scheme, hotsound, crc, heard) == [message]
    else:
        # Requests made while the first token is still arriving give
        # candidates nothing vouches for; one request at the end, with the
        # whole loop held, ranks the message first.
        tokens = decode(scheme, hotsound, crc, heard, interval_ms=60000)
        assert tokens and tokens[0] == message


@pytest.mark.parametrize("scheme,hotsound", [("dsss", False), ("dsss", True), ("dtmf", False)])
def test_finish_hears_a_broadcast_that_ends_the_recording(scheme, hotsound):
    message = bytes.fromhex("536f7276656c" if scheme == "dsss" else "c0ffee")
    enc = sorvel.Encoder(scheme, crc=True)
    dec = sorvel.Decoder(scheme, crc=True, hotsound=hotsound, sample_rate=enc.sample_rate)
    dec.process(enc.encode(message))
    assert dec.finish() == [message]


@pytest.mark.parametrize("scheme,channel", [
    ("dsss", dict(snr_db=0, noise="pink", rt60=0.3, seed=3)),
    ("dsss", dict(snr_db=5, room=(6, 5, 2.7), rt60=0.6, distance=2, source="phone", seed=4)),
    ("dtmf", dict(snr_db=0, rt60=0.3, seed=5)),
    ("dtmf", dict(snr_db=10, room=(4, 3, 2.5), rt60=0.4, distance=1, seed=6)),
])
def test_round_trip_through_noise_and_rooms(scheme, channel):
    message = bytes.fromhex("536f7276656c" if scheme == "dsss" else "c0ffee")
    heard = broadcast(scheme, True, message, seconds=5, **channel)
    assert decode(scheme, False, True, heard) == [message]


def test_simulate_is_deterministic_for_a_seed():
    pcm = sorvel.Encoder().encode(bytes(8))
    a, b, c = (sorvel.simulate(pcm, snr_db=0, rt60=0.2, seed=s) for s in (7, 7, 8))
    assert np.array_equal(a, b) and not np.array_equal(a, c)


@pytest.mark.parametrize("scheme,hotsound", [("dsss", False), ("dsss", True), ("dtmf", False)])
def test_tokens_do_not_depend_on_the_block_split(scheme, hotsound):
    message = bytes.fromhex("536f7276656c" if scheme == "dsss" else "c0ffee")
    heard = broadcast(scheme, True, message, snr_db=0)
    whole = decode(scheme, hotsound, True, heard)
    assert whole == [message]
    for blocks in (1000, 4801, 12000, 77777):
        assert decode(scheme, hotsound, True, heard, blocks=blocks) == whole, blocks


@pytest.mark.parametrize("dtype", [np.int16, np.float32, np.float64])
@pytest.mark.parametrize("layout", ["mono", "interleaved", "frames-by-channels"])
def test_input_forms(dtype, layout):
    message = bytes.fromhex("48656c6c6f21")
    channels = 1 if layout == "mono" else 2
    heard = broadcast("dsss", True, message, channels=channels).astype(dtype)
    if layout == "interleaved":
        heard = heard.reshape(-1)
    if layout == "frames-by-channels":
        assert heard.shape[1] == 2
    assert decode("dsss", False, True, heard, channels=channels) == [message]


def test_refused_input_leaves_the_decoder_usable_and_reset_forgets():
    message = bytes.fromhex("48656c6c6f21")
    heard = broadcast("dsss", True, message)
    dec = sorvel.Decoder(crc=True, sample_rate=RATE)
    half = len(heard) // 2
    dec.process(heard[:half])
    for bad in (np.zeros(4, np.int32), np.array([np.nan], np.float32),
                np.zeros((4, 2), np.int16)):
        with pytest.raises((ValueError, TypeError)):
            dec.process(bad)
    dec.process(heard[half:])
    assert dec.tokens() == [message]
    assert dec.tokens() == []  # each token once
    dec.reset()
    assert dec.tokens() == []
    dec.process(heard)
    assert dec.tokens() == [message]


@pytest.mark.parametrize("scheme,message", [("dsss", bytes(8)), ("dtmf", bytes(5))])
def test_loop_length(scheme, message):
    enc = sorvel.Encoder(scheme)
    token = len(enc.encode(message))
    overheads = set()
    for seconds in (0.5, 1, 4.2):
        looped = enc.encode(message, loop_seconds=seconds)
        repeats = int(np.ceil(seconds * enc.sample_rate / token))
        overheads.add(len(looped) - repeats * token)
    # Start and stop transitions only, the same whatever the length.
    assert len(overheads) == 1
    assert 0 <= overheads.pop() < 0.05 * enc.sample_rate


def test_encoder_output():
    enc = sorvel.Encoder("dsss", broadcast_sample_rate=48000, crc=True)
    pcm = enc.encode(bytearray(b"Hello!"))
    assert enc.sample_rate == 48000 and enc.message_bytes == 6
    assert pcm.dtype == np.int16 and pcm.ndim == 1
    assert 16000 < np.abs(pcm.astype(np.int32)).max() <= 32767


PCM = np.zeros(4410, np.int16)
PCM[::7] = 1000

INVALID = [
    # What is refused, the exception and a piece of its message: every
    # keyword's value reaches the library's checks (whose bounds the C++
    # tests cover), and what the module itself checks.
    (lambda: sorvel.Encoder("fsk"), ValueError, "scheme must be dsss or dtmf"),
    (lambda: sorvel.Encoder(number_of_taps=4), ValueError, "number_of_taps must be in [5, 11]"),
    (lambda: sorvel.Encoder(number_of_taps=5, code_number=3), ValueError, "code_number"),
    (lambda: sorvel.Encoder(bits_per_symbol=3), ValueError, "bits_per_symbol must be 1, 2, 4"),
    (lambda: sorvel.Encoder(upsampling_factor=16), ValueError, "must divide upsampling_factor"),
    (lambda: sorvel.Encoder(carrier_frequency=30000), ValueError, "carrier frequency"),
    (lambda: sorvel.Encoder(token_bytes=2, crc=True), ValueError, "leave no message bytes"),
    (lambda: sorvel.Encoder(broadcast_sample_rate=0), ValueError, "broadcast sample rate"),
    (lambda: sorvel.Encoder(start_transition_duration=float("nan")), ValueError,
     "start_transition_duration"),
    (lambda: sorvel.Encoder("dtmf", tones_per_symbol=3), ValueError, "used in pairs"),
    (lambda: sorvel.Encoder("dtmf", tone_frequencies=[500, 30000, 900]), ValueError,
     "tone frequency 30000"),
    (lambda: sorvel.Encoder("dtmf", window_duration=0), ValueError, "window_duration must be positive"),
    (lambda: sorvel.Encoder("dtmf", adsr=[0.01, 0.01]), ValueError, "adsr takes 5 values"),
    (lambda: sorvel.Encoder().encode(b"abc"), ValueError, "token has 3 bytes"),
    (lambda: sorvel.Encoder(crc=True).encode(bytes(8)), ValueError, "give 6 message bytes"),
    (lambda: sorvel.Encoder().encode(bytes(8), loop_seconds=-1), ValueError, "loop_seconds"),
    (lambda: sorvel.Decoder("dtmf", hotsound=True, sample_rate=48000), ValueError,
     "hotsound works with the dsss scheme"),
    (lambda: sorvel.Decoder(max_candidates=7), ValueError, "max_candidates must be in [1, 6]"),
    (lambda: sorvel.Decoder(channels=0), ValueError, "1 to 8 channels, got 0"),
    (lambda: sorvel.Decoder(sample_rate=float("nan")), ValueError, "input rate must be between"),
    (lambda: sorvel.Decoder("dtmf", sample_rate=1e9), ValueError,
     "input rate must be between 8000 and 192000 Hz"),
    (lambda: sorvel.Decoder("dtmf", buffer_duration_factor=0), ValueError,
     "buffer_duration_factor"),
    (lambda: sorvel.Decoder(detection_duration=-1), ValueError, "detection_duration"),
    (lambda: sorvel.Decoder(interval_ms=0), ValueError, "interval_ms must be positive"),
    (lambda: sorvel.Decoder(channels=2).process(np.zeros(3, np.int16)), ValueError,
     "whole number of 2-channel frames"),
    (lambda: sorvel.Decoder(channels=2).process(np.zeros((4, 3), np.int16)), ValueError,
     "3 channels"),
    (lambda: sorvel.Decoder().process(np.zeros((2, 2, 2), np.int16)), ValueError, "1-D"),
    (lambda: sorvel.Decoder().process(np.array([1.0, np.inf])), ValueError, "finite"),
    (lambda: sorvel.simulate(PCM, noise="brown"), ValueError, "noise must be white or pink"),
    (lambda: sorvel.simulate(PCM, room=(4, 3, 2.5)), ValueError, "needs its rt60"),
    (lambda: sorvel.simulate(PCM, room=(4, 3, 2.5), rt60=0.4, distance=6), ValueError,
     "does not fit"),
    (lambda: sorvel.simulate(PCM, room=(4, 0, 2.5), rt60=0.4), ValueError, "room sizes"),
    (lambda: sorvel.simulate(PCM, output_rate=0), ValueError, "sample rates must be positive"),
    (lambda: sorvel.simulate(PCM, speed=400), ValueError, "speed of sound"),
    (lambda: sorvel.simulate(PCM, band_limit=-1), ValueError, "must not be negative"),
    (lambda: sorvel.simulate(PCM[:0]), ValueError, "pcm is empty"),
    (lambda: sorvel.simulate(np.zeros((10, 2), np.int16)), ValueError, "mono"),
    # Wrong types.
    (lambda: sorvel.Encoder(crc=1), TypeError, "crc must be True or False"),
    (lambda: sorvel.Encoder(number_of_taps=7.0), TypeError, "number_of_taps must be an int"),
    (lambda: sorvel.Encoder(carrier_frequency="high"), TypeError, "must be a number"),
    (lambda: sorvel.Encoder(bogus=1), TypeError, "unexpected keyword argument 'bogus'"),
    (lambda: sorvel.Decoder(high_pass_at_carrier=True), TypeError, "unexpected keyword"),
    (lambda: sorvel.Encoder().encode("Hello!!!"), TypeError, "message must be bytes"),
    (lambda: sorvel.Decoder().process([1, 2, 3]), TypeError, "numpy array"),
    (lambda: sorvel.Decoder().process(np.zeros(4, np.int32)), TypeError, "got int32"),
]


@pytest.mark.parametrize("call,error,text", INVALID,
                         ids=[f"{i}-{t[:30]}" for i, (_, _, t) in enumerate(INVALID)])
def test_refused_settings(call, error, text):
    with pytest.raises(error) as info:
        call()
    assert text in str(info.value)


VALID = {
    "dsss": (bytes(4), dict(crc=True, token_bytes=6, baseband_decimation_factor=5,
                            number_of_taps=6, code_number=1, upsampling_factor=10,
                            bits_per_symbol=2, min_cycles_per_frame=3, use_quadrature=True,
                            carrier_frequency=18000, append_check_symbol=True),
             dict(sample_rate=48000, high_pass_at_carrier=True, broadcast_sample_rate=48000,
                  start_transition_duration=0.01),
             dict(coder_sample_rate=48000, detection_duration=0.2, detection_threshold=3.0)),
    "dtmf": (bytes(4), dict(crc=True, token_bytes=6, baseband_decimation_factor=8,
                            use_checksum_symbol=True, tones_per_symbol=2,
                            tone_frequencies=[740, 831, 932, 1109, 1245, 1480],
                            window_duration=0.06, adsr=[0.01, 0.01, 0.03, 0.01, 0.7]),
             dict(sample_rate=48000), dict(coder_sample_rate=48000)),
}


@pytest.mark.parametrize("scheme", VALID)
def test_every_setting_is_taken(scheme):
    # Every keyword away from its default: nothing refused by mistake, and
    # both ends still agree.
    message, common, sender, receiver = VALID[scheme]
    enc = sorvel.Encoder(scheme, **common, **sender)
    assert enc.sample_rate == 48000
    heard = sorvel.simulate(enc.encode(message, loop_seconds=3), sample_rate=48000,
                            output_rate=RATE, leading_silence=0.5)
    dec = sorvel.Decoder(scheme, sample_rate=RATE, interval_ms=100, max_candidates=3,
                         buffer_duration_factor=5, **common, **receiver)
    dec.process(heard)
    assert dec.tokens() == [message]
