package com.tessal.android.orv.audiomodem;

import java.nio.ByteBuffer;

/**
 * Java peer of the native decoders in libSorvel.so.
 *
 * <p>Any number of decoders live side by side under integer ids (0, 1, 2, ...;
 * -1 is a separate default slot). Initialising an id replaces its decoder,
 * {@link #nativeRelease} drops it. Calls for one decoder must come from one
 * thread at a time, and initialise/release must not overlap any other call.
 *
 * <p>Audio is 16-bit native-order PCM in a direct {@link ByteBuffer}, channels
 * interleaved. Note the sample count: {@code lengthBytes / 2 - offsetBytes / 2}
 * samples are taken from sample {@code offsetBytes / 2} on, so pass offset 0
 * and the block's byte length. Tokens arrive through {@code
 * results.addToken(byte[])}, message bytes only (CRC bytes checked and
 * removed).
 */
public final class NativeDecoder {
  static {
    System.loadLibrary("Sorvel");
  }

  private NativeDecoder() {}

  /**
   * A DSSS decoder, optionally behind the hotsound wake-up detector.
   *
   * <p>With {@code withHotsound}, {@code inputSampleRate} must leave room for the
   * detector's band, the 18496 Hz carrier plus 2 kHz below half the rate: at
   * least 40993 Hz (44100 and 48000 Hz work; 32000 and 16000 Hz do not). A
   * rate that does not fit is a programming error that ends the process, so
   * check the rate before asking for hotsound.
   */
  public static native boolean nativeInitializeDsss(
      int decoderId,
      int tokenLengthBytes,
      boolean appendCheckSymbol,
      boolean saveReceivedSamples,
      int numberOfTaps,
      int codeNumber,
      int upsamplingFactor,
      int bitsPerSymbol,
      int minCyclesPerFrame,
      int basebandDecimationFactor,
      boolean useQuadrature,
      int maxCandidatesToReturn,
      int numChannels,
      boolean withHotsound,
      float sampleRate,
      float desiredCarrierFrequency,
      float detectionDuration,
      float detectionThreshold,
      float inputSampleRate,
      float bufferDurationFactor);

  /** A multi-tone decoder; false, registry unchanged, when the ADSR window is refused. */
  public static native boolean nativeInitializeDtmf(
      int decoderId,
      int bytesInToken,
      boolean useChecksumSymbol,
      int basebandDecimationFactor,
      int tonesPerSymbol,
      int maxCandidatesPerDecodeTokenCall,
      int numChannels,
      float sampleRate,
      float windowDuration,
      float ignoredFloat,
      float inputSampleRate,
      float adsr1,
      float adsr2,
      float adsr3,
      float adsr4,
      float adsr5,
      float bufferDurationFactor,
      float[] toneFrequencies);

  public static native void nativeProcessSamples(
      int decoderId, ByteBuffer buffer, int offsetBytes, int lengthBytes);

  /**
   * Raw samples for a hotsound decoder; other decoders ignore them. Such a
   * decoder exists only at input rates of 40993 Hz and above (see {@link
   * #nativeInitializeDsss}).
   */
  public static native void nativeProcessSamplesWithHotsound(
      int decoderId, ByteBuffer buffer, int offsetBytes, int lengthBytes);

  public static native void nativeGetTokens(
      int decoderId, Object results, int numMessageBytes, int numCrcCheckBytes);

  public static native boolean nativeDetectBroadcaster(int decoderId);

  public static native void nativeWipeInternalData(int decoderId);

  /** Bytes one process call can take without cutting into a buffered token. */
  public static native int nativeGetMaxSafeInputSize(int decoderId);

  public static native void nativeRelease(int decoderId);
}
