package com.tessal.android.orv.audiomodem;

/**
 * Asks the library whether it would take a set of settings. The settings
 * builders, {@link TokenEncoder} and {@link TokenDecoder} call it before any
 * settings reach {@link NativeEncoder} or {@link NativeDecoder}, whose native
 * side ends the process on settings it cannot use. Stateless; any thread.
 */
final class NativeSettings {
  static {
    System.loadLibrary("Sorvel");
  }

  private NativeSettings() {}

  /**
   * The library's objection to a DSSS sender of these settings and a
   * receiver of them at {@code inputSampleRate} with {@code channels}
   * interleaved channels, or null when it has none.
   */
  static native String nativeCheckDsss(int tokenLengthBytes, boolean crc,
      boolean appendCheckSymbol, int numberOfTaps, int codeNumber, int upsamplingFactor,
      int bitsPerSymbol, int minCyclesPerFrame, int basebandDecimationFactor,
      boolean useQuadrature, float sampleRate, float desiredCarrierFrequency,
      int broadcastSampleRate, float startTransitionDuration, int maxCandidates,
      float inputSampleRate, int channels, boolean hotsound);

  /** As {@link #nativeCheckDsss} for the multi-tone scheme; {@code adsr} holds five values. */
  static native String nativeCheckDtmf(int bytesInToken, boolean crc, boolean useChecksumSymbol,
      int basebandDecimationFactor, int tonesPerSymbol, float[] toneFrequencies,
      float sampleRate, float windowDuration, float[] adsr, int maxCandidates,
      float inputSampleRate, int channels);

  /** Throws {@link IllegalArgumentException} with the library's message, if it has one. */
  static void require(String objection) {
    if (objection != null) throw new IllegalArgumentException(objection);
  }
}
