package com.tessal.android.orv.audiomodem;

import java.util.Objects;

/**
 * Turns a message into the 16-bit PCM of one token, to be played in a loop:
 * DSSS or multi-tone according to the settings it is built from, with two
 * CRC-16 check bytes after the message when asked for.
 *
 * <p>Thread safe. The library keeps one process-wide encoder, so each {@link
 * #encode} sets it up from this object's settings, encodes and drops it while
 * holding the lock on {@link NativeEncoder}; code that drives {@code
 * NativeEncoder} directly must hold that lock too. The settings were checked
 * when built; a message of the wrong length throws {@link
 * IllegalArgumentException} before anything reaches the library.
 */
public final class TokenEncoder {
  private final DsssSettings dsss;
  private final DtmfSettings dtmf;
  private final boolean crc;
  private final int messageBytes;

  /**
   * A DSSS encoder. With {@code crc}, messages are two bytes shorter than the
   * token, which must then be at least 3 bytes long.
   */
  public TokenEncoder(DsssSettings settings, boolean crc) {
    this(Objects.requireNonNull(settings, "settings"), null, crc, settings.tokenLengthBytes());
  }

  /** A multi-tone encoder; {@code crc} as for DSSS. */
  public TokenEncoder(DtmfSettings settings, boolean crc) {
    this(null, Objects.requireNonNull(settings, "settings"), crc, settings.bytesInToken());
  }

  private TokenEncoder(DsssSettings dsss, DtmfSettings dtmf, boolean crc, int tokenBytes) {
    this.dsss = dsss;
    this.dtmf = dtmf;
    this.crc = crc;
    // The settings passed on their own; the CRC may still leave no message bytes.
    NativeSettings.require(dsss != null ? dsss.objection(crc, dsss.sampleRate(), 1, false)
        : dtmf.objection(crc, dtmf.sampleRate(), 1));
    this.messageBytes = messageBytes(tokenBytes, crc);
  }

  /** Message bytes per token of settings the library took. */
  static int messageBytes(int tokenBytes, boolean crc) {
    return crc ? tokenBytes - 2 : tokenBytes;
  }

  /** Bytes {@link #encode} takes. */
  public int messageBytes() {
    return messageBytes;
  }

  /** Rate of the PCM {@link #encode} returns, Hz. */
  public float sampleRate() {
    return dsss != null ? dsss.broadcastSampleRate() : dtmf.sampleRate();
  }

  /**
   * One token of mono 16-bit PCM at {@link #sampleRate()}, opening with its
   * start symbol; a sender plays it in a loop.
   *
   * @throws IllegalArgumentException when {@code message} is not {@link
   *     #messageBytes()} long
   */
  public short[] encode(byte[] message) {
    Objects.requireNonNull(message, "message");
    if (message.length != messageBytes) {
      throw new IllegalArgumentException("message must be " + messageBytes + " bytes long, got "
          + message.length);
    }
    EncodeResults results = new EncodeResults();
    synchronized (NativeEncoder.class) {
      // Set up every time: another encoder may have replaced the process-wide one.
      boolean ready;
      if (dsss != null) {
        ready = NativeEncoder.nativeInitializeDsss(dsss.tokenLengthBytes(),
            dsss.appendCheckSymbol(), dsss.highPassAtCarrier(), dsss.numberOfTaps(),
            dsss.codeNumber(), dsss.upsamplingFactor(), dsss.bitsPerSymbol(),
            dsss.minCyclesPerFrame(), dsss.basebandDecimationFactor(), dsss.useQuadrature(),
            dsss.broadcastSampleRate(), dsss.sampleRate(), dsss.desiredCarrierFrequency(),
            dsss.startTransitionDuration());
      } else {
        float[] a = dtmf.adsr();
        ready = NativeEncoder.nativeInitializeDtmf(dtmf.bytesInToken(),
            dtmf.useChecksumSymbol(), dtmf.basebandDecimationFactor(), dtmf.tonesPerSymbol(),
            dtmf.toneFrequencies(), dtmf.sampleRate(), dtmf.windowDuration(), a[0], a[1], a[2],
            a[3], a[4]);
      }
      // The library took these settings when they were checked, so a refusal is a bug.
      if (!ready) throw new IllegalStateException("the library refused checked settings");
      try {
        NativeEncoder.nativeEncode(message, results, crc ? 2 : 0);
      } finally {
        NativeEncoder.nativeRelease();
      }
    }
    if (results.audio == null || results.audio.length == 0) {
      throw new IllegalStateException("the library encoded no audio (see its log)");
    }
    short[] pcm = new short[results.audio.length / 2];
    for (int i = 0; i < pcm.length; i++) {
      pcm[i] = EncodeResults.sampleAt(results.audio, i);
    }
    return pcm;
  }
}
