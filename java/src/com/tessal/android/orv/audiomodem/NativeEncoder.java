package com.tessal.android.orv.audiomodem;

/**
 * Java peer of the native encoder in libSorvel.so.
 *
 * <p>The library keeps one process-wide encoder: each initialise call
 * replaces it, {@link #nativeRelease()} drops it. Calls must not overlap;
 * callers on several threads synchronise on this class.
 *
 * <p>{@link #nativeEncode} reports through {@code results.setEncodeResults(
 * byte[] audio, byte[] startTransition, float sampleRate)}: 16-bit
 * little-endian mono PCM. A token the encoder refuses (wrong message/CRC
 * split) arrives as two empty arrays; an empty token gives no callback.
 */
public final class NativeEncoder {
  static {
    System.loadLibrary("Sorvel");
  }

  private NativeEncoder() {}

  /** Sets up a DSSS encoder; always returns true (bad values abort). */
  public static native boolean nativeInitializeDsss(
      int tokenLengthBytes,
      boolean appendCheckSymbol,
      boolean highPassAtCarrier,
      int numberOfTaps,
      int codeNumber,
      int upsamplingFactor,
      int bitsPerSymbol,
      int minCyclesPerFrame,
      int basebandDecimationFactor,
      boolean useQuadrature,
      int broadcastSampleRate,
      float sampleRate,
      float desiredCarrierFrequency,
      float startTransitionDuration);

  /**
   * Sets up a multi-tone encoder. An empty {@code toneFrequencies} keeps the
   * default tones. Returns false, keeping the previous encoder, when the
   * ADSR window (attack, decay, sustain, release in seconds, then the sustain
   * amplitude) is refused.
   */
  public static native boolean nativeInitializeDtmf(
      int bytesInToken,
      boolean useChecksumSymbol,
      int basebandDecimationFactor,
      int tonesPerSymbol,
      float[] toneFrequencies,
      float sampleRate,
      float windowDuration,
      float adsr1,
      float adsr2,
      float adsr3,
      float adsr4,
      float adsr5);

  /** Encodes {@code token} (message bytes) plus 0 or 2 CRC-16 bytes. */
  public static native void nativeEncode(byte[] token, Object results, int numCrcCheckBytes);

  /** Drops the encoder. */
  public static native void nativeRelease();
}
