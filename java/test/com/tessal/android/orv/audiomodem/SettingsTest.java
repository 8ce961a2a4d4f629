package com.tessal.android.orv.audiomodem;

import static org.junit.Assert.assertThrows;
import static org.junit.Assert.assertTrue;

import java.util.List;
import java.util.function.Supplier;
import org.junit.Test;

public class SettingsTest {
  private static DsssSettings.Builder dsss() {
    return DsssSettings.builder();
  }

  private static DtmfSettings.Builder dtmf() {
    return DtmfSettings.builder();
  }

  /** Expected words of the message, and what throws it. */
  private static final class Refused {
    final String names;
    final Runnable build;

    Refused(String names, Runnable build) {
      this.names = names;
      this.build = build;
    }
  }

  private static Refused refused(String names, Runnable build) {
    return new Refused(names, build);
  }

  private static float[] tones(int n) {
    float[] t = new float[n];
    for (int i = 0; i < n; i++) t[i] = 500f + 100f * i;
    return t;
  }

  // Each of these would end the process in a native check (or leave the
  // API's ranges); the JVM surviving the table is part of the test. The
  // messages are the library's, as the CLI and the Python module give them.
  // Every setter reaches the check of its own setting; the bounds the C++
  // tests already refuse (modem_config_test.cc) are not repeated here.
  @Test
  public void refusedSettingsThrowWithTheLibrarysMessage() {
    List<Refused> table = List.of(
        refused("leave no message bytes", () -> dsss().tokenLengthBytes(0).build()),
        refused("number_of_taps", () -> dsss().numberOfTaps(12).build()),
        refused("code_number", () -> dsss().numberOfTaps(6).codeNumber(3).build()),
        refused("bits_per_symbol", () -> dsss().bitsPerSymbol(16).build()),
        refused("frame sample rate", () -> dsss().sampleRate(7999f).build()),
        refused("frame sample rate", () -> dsss().sampleRate(192001f).build()),
        refused("upsampling_factor", () -> dsss().upsamplingFactor(0).build()),
        refused("baseband_decimation_factor", () -> dsss().basebandDecimationFactor(0).build()),
        refused("carrier frequency",
            () -> dsss().desiredCarrierFrequency(Math.nextUp(22050f)).build()),
        refused("carrier frequency", () -> dsss().desiredCarrierFrequency(-1f).build()),
        refused("carrier frequency",
            () -> dsss().desiredCarrierFrequency(Float.NaN).build()),
        refused("min_cycles_per_frame", () -> dsss().minCyclesPerFrame(-1).build()),
        refused("max_candidates", () -> dsss().maxCandidatesToReturn(0).build()),
        refused("broadcast sample rate", () -> dsss().broadcastSampleRate(0).build()),
        refused("start_transition_duration", () -> dsss().startTransitionDuration(-0.001f).build()),

        refused("frame sample rate", () -> dtmf().sampleRate(0f).build()),
        refused("leave no message bytes", () -> dtmf().bytesInToken(0).build()),
        refused("baseband_decimation_factor", () -> dtmf().basebandDecimationFactor(0).build()),
        refused("window_duration", () -> dtmf().windowDuration(Float.NaN).build()),
        refused("tone frequency", () -> dtmf().toneFrequencies(1000f, 2000f, 22050f).build()),
        refused("tone frequency", () -> dtmf().toneFrequencies(-1f, 1000f, 2000f).build()),
        refused("tone frequency",
            () -> dtmf().toneFrequencies(Float.NaN, 1000f, 2000f).build()),
        refused("at most 32 tone frequencies", () -> dtmf().tonesPerSymbol(1).toneFrequencies(tones(33))
            .build()),
        refused("tones_per_symbol", () -> dtmf().tonesPerSymbol(11).build()),
        // 2 tones give 2 single-tone symbols; 6 tones in threes give 20 > 15.
        refused("give 2 symbols", () -> dtmf().toneFrequencies(tones(2)).tonesPerSymbol(1)
            .build()),
        refused("give 20 symbols", () -> dtmf().toneFrequencies(tones(6)).tonesPerSymbol(3)
            .build()),
        refused("Time parameters must be nonnegative", () -> dtmf().adsr(-0.001f, 0f, 0f, 0f, 1f).build()),
        refused("Time parameters must be nonnegative", () -> dtmf().adsr(0f, Float.NaN, 0f, 0f, 1f).build()),
        refused("adsr: Nonzero duration", () -> dtmf().adsr(0f, 0f, 0f, Float.POSITIVE_INFINITY, 1f)
            .build()),
        refused("Sustain amplitude", () -> dtmf().adsr(0f, 0f, 0f, 0f, 1.5f).build()),
        refused("adsr: Nonzero duration", () -> dtmf().adsr(0.01f, 0.01f, 0.03f, 0.0101f, 1f).build()),
        // The default window scales with the frame, so shorter frames keep working.
        refused("max_candidates",
            () -> dtmf().windowDuration(0.02f).maxCandidatesPerDecodeTokenCall(0).build()),

        refused("leave no message bytes", () -> new TokenEncoder(dsss().tokenLengthBytes(2).build(), true)),
        refused("leave no message bytes", () -> new TokenEncoder(dtmf().bytesInToken(1).build(), true)),
        refused("input rate",
            () -> TokenDecoder.builder(DsssSettings.defaults()).inputSampleRate(7999f).build()),
        refused("1 to 8 channels",
            () -> TokenDecoder.builder(DtmfSettings.defaults()).channels(9).build()),
        refused("leave no message bytes", () -> TokenDecoder.builder(dsss().tokenLengthBytes(2).build()).crc(true)
            .build()),
        refused("hotsound needs a sample rate", () -> TokenDecoder.builder(DsssSettings.defaults())
            .inputSampleRate(40992.99f).hotsound(true).build()),
        refused("hotsound works with DsssSettings",
            () -> TokenDecoder.builder(DtmfSettings.defaults()).hotsound(true).build()));

    for (int i = 0; i < table.size(); i++) {
      Refused r = table.get(i);
      IllegalArgumentException e = assertThrows("case " + i, IllegalArgumentException.class,
          r.build::run);
      assertTrue("case " + i + ": " + e.getMessage(), e.getMessage().contains(r.names));
    }
  }

  /** Encodes a token and runs a decoder over a tenth of a second of it. */
  private static void runNatively(String name, Supplier<TokenEncoder> encoder,
      Supplier<TokenDecoder.Builder> decoder) {
    TokenEncoder e = encoder.get();
    short[] pcm = e.encode(new byte[e.messageBytes()]);
    assertTrue(name, pcm.length > 0);
    try (TokenDecoder d = decoder.get().build()) {
      // Whole frames for every channel count used below.
      d.process(new short[8 * 4410]);
      d.tokens();
    }
  }

  // The extreme values each setting allows are ones the library accepts: a
  // native check failing here ends the JVM and the test with it.
  @Test
  public void extremeAllowedSettingsRunNatively() {
    List<DsssSettings> dsssCases = List.of(
        dsss().numberOfTaps(5).codeNumber(2).bitsPerSymbol(1).tokenLengthBytes(1).build(),
        dsss().numberOfTaps(11).codeNumber(3).bitsPerSymbol(8).build(),
        dsss().sampleRate(8000f).desiredCarrierFrequency(4000f).broadcastSampleRate(8000).build(),
        dsss().sampleRate(192000f).broadcastSampleRate(192000).startTransitionDuration(1f)
            .build(),
        dsss().upsamplingFactor(1).basebandDecimationFactor(1).desiredCarrierFrequency(0f)
            .minCyclesPerFrame(0).startTransitionDuration(0f).build(),
        dsss().upsamplingFactor(32).basebandDecimationFactor(32).maxCandidatesToReturn(1)
            .build(),
        dsss().tokenLengthBytes(64).maxCandidatesToReturn(6).useQuadrature(true)
            .appendCheckSymbol(true).highPassAtCarrier(true).build());
    for (int i = 0; i < dsssCases.size(); i++) {
      DsssSettings s = dsssCases.get(i);
      runNatively("dsss " + i, () -> new TokenEncoder(s, false), () -> TokenDecoder.builder(s));
    }
    DsssSettings defaults = DsssSettings.defaults();
    runNatively("crc", () -> new TokenEncoder(dsss().tokenLengthBytes(3).build(), true),
        () -> TokenDecoder.builder(dsss().tokenLengthBytes(3).build()).crc(true));
    // The lowest input rate that can carry the default carrier, and the highest.
    for (float rate : new float[] {37000f, 192000f}) {
      runNatively("input " + rate, () -> new TokenEncoder(defaults, false),
          () -> TokenDecoder.builder(defaults).inputSampleRate(rate).channels(8));
    }
    for (float rate : new float[] {40993f, 192000f}) {
      runNatively("hotsound " + rate, () -> new TokenEncoder(defaults, false),
          () -> TokenDecoder.builder(defaults).inputSampleRate(rate).hotsound(true).channels(2));
    }

    float nyquist = 4000f;
    List<DtmfSettings> dtmfCases = List.of(
        dtmf().sampleRate(8000f).tonesPerSymbol(1)
            .toneFrequencies(0f, 1000f, Math.nextDown(nyquist)).bytesInToken(1).build(),
        dtmf().sampleRate(192000f).bytesInToken(64).maxCandidatesPerDecodeTokenCall(6).build(),
        dtmf().tonesPerSymbol(1).toneFrequencies(tones(32)).maxCandidatesPerDecodeTokenCall(1)
            .build(),
        // 3 tones in pairs: exactly 3 symbols.
        dtmf().tonesPerSymbol(2).toneFrequencies(1000f, 1500f, 2000f).useChecksumSymbol(true)
            .build(),
        dtmf().windowDuration(1f).adsr(0.25f, 0.25f, 0.25f, 0.25f, 0f).build(),
        // One sample per frame, at decimation 1.
        dtmf().basebandDecimationFactor(1).windowDuration(1f / 44100f)
            .adsr(0f, 0f, 0f, 0f, 1f).build(),
        dtmf().adsr(0.01f, 0.01f, 0.02f, 0.01f, 1f).build(),
        // An unset window keeps scaling with the frame through toBuilder.
        DtmfSettings.defaults().toBuilder().windowDuration(0.02f).build());
    for (int i = 0; i < dtmfCases.size(); i++) {
      DtmfSettings s = dtmfCases.get(i);
      runNatively("dtmf " + i, () -> new TokenEncoder(s, false), () -> TokenDecoder.builder(s));
    }
    DtmfSettings tones = dtmfCases.get(0);
    runNatively("dtmf input rates", () -> new TokenEncoder(tones, false),
        () -> TokenDecoder.builder(tones).inputSampleRate(192000f).channels(8));
  }
}
