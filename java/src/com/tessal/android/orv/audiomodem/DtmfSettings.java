package com.tessal.android.orv.audiomodem;

/**
 * Settings of the multi-tone scheme: ten pentatonic tones from 740 Hz sounded
 * in pairs, 50 ms frames at 44.1 kHz and 5-byte tokens by default (the
 * library's and the {@code sorvel} tool's defaults). Sender and receiver must
 * use the same settings, except the frame window and {@code
 * maxCandidatesPerDecodeTokenCall}.
 *
 * <p>The frame window is an attack-decay-sustain-release envelope. Unless set,
 * it scales with the frame: attack, decay and release a tenth of {@code
 * windowDuration} each, sustain six tenths, sustain amplitude 0.5 (at the
 * default 50 ms: 5, 5, 30 and 5 ms).
 *
 * <p>Immutable and thread safe. {@link Builder#build()} asks the library
 * whether it takes the settings and throws {@link IllegalArgumentException}
 * with its message naming the setting and its range, so settings that reach
 * the native peers never end the process.
 */
public final class DtmfSettings {
  private final int bytesInToken;
  private final boolean useChecksumSymbol;
  private final int basebandDecimationFactor;
  private final int tonesPerSymbol;
  private final float[] toneFrequencies;
  private final float sampleRate;
  private final float windowDuration;
  private final float[] adsr;
  private final boolean windowSet;  // adsr given, rather than scaled from the frame
  private final int maxCandidatesPerDecodeTokenCall;

  private DtmfSettings(Builder b, float[] adsr) {
    bytesInToken = b.bytesInToken;
    useChecksumSymbol = b.useChecksumSymbol;
    basebandDecimationFactor = b.basebandDecimationFactor;
    tonesPerSymbol = b.tonesPerSymbol;
    toneFrequencies = b.toneFrequencies.clone();
    sampleRate = b.sampleRate;
    windowDuration = b.windowDuration;
    this.adsr = adsr;
    windowSet = b.adsr != null;
    maxCandidatesPerDecodeTokenCall = b.maxCandidatesPerDecodeTokenCall;
  }

  /** The defaults. */
  public static DtmfSettings defaults() {
    return new Builder().build();
  }

  public static Builder builder() {
    return new Builder();
  }

  /** A builder holding these settings. */
  public Builder toBuilder() {
    Builder b = new Builder();
    b.bytesInToken = bytesInToken;
    b.useChecksumSymbol = useChecksumSymbol;
    b.basebandDecimationFactor = basebandDecimationFactor;
    b.tonesPerSymbol = tonesPerSymbol;
    b.toneFrequencies = toneFrequencies.clone();
    b.sampleRate = sampleRate;
    b.windowDuration = windowDuration;
    b.adsr = windowSet ? adsr.clone() : null;
    b.maxCandidatesPerDecodeTokenCall = maxCandidatesPerDecodeTokenCall;
    return b;
  }

  public int bytesInToken() { return bytesInToken; }
  public boolean useChecksumSymbol() { return useChecksumSymbol; }
  public int basebandDecimationFactor() { return basebandDecimationFactor; }
  public int tonesPerSymbol() { return tonesPerSymbol; }
  /** The tones set on the builder; empty means the default tones. */
  public float[] toneFrequencies() { return toneFrequencies.clone(); }
  public float sampleRate() { return sampleRate; }
  public float windowDuration() { return windowDuration; }
  /** Attack, decay, sustain, release (seconds) and sustain amplitude. */
  public float[] adsr() { return adsr.clone(); }
  public int maxCandidatesPerDecodeTokenCall() { return maxCandidatesPerDecodeTokenCall; }

  /**
   * The library's objection to a sender of these settings and a receiver of
   * them at {@code inputSampleRate} with {@code channels} channels, or null.
   */
  String objection(boolean crc, float inputSampleRate, int channels) {
    return NativeSettings.nativeCheckDtmf(bytesInToken, crc, useChecksumSymbol,
        basebandDecimationFactor, tonesPerSymbol, toneFrequencies, sampleRate, windowDuration,
        adsr, maxCandidatesPerDecodeTokenCall, inputSampleRate, channels);
  }

  /** Collects settings; not thread safe. Setters only store, build() checks. */
  public static final class Builder {
    private int bytesInToken = 5;
    private boolean useChecksumSymbol = false;
    private int basebandDecimationFactor = 16;
    private int tonesPerSymbol = 2;
    private float[] toneFrequencies = new float[0];
    private float sampleRate = 44100f;
    private float windowDuration = 0.05f;
    private float[] adsr;
    private int maxCandidatesPerDecodeTokenCall = 2;

    private Builder() {}

    /** Bytes per token, CRC bytes included: 1 to 64 (3 or more with CRC). */
    public Builder bytesInToken(int v) { bytesInToken = v; return this; }
    /** Tokens carry a checksum symbol. */
    public Builder useChecksumSymbol(boolean v) { useChecksumSymbol = v; return this; }
    /** Frames are multiples of this many samples; the receiver's decimation. 1 or more. */
    public Builder basebandDecimationFactor(int v) { basebandDecimationFactor = v; return this; }
    /** Tones sounding together: 2 with the default tones, else 1 to the tone count. */
    public Builder tonesPerSymbol(int v) { tonesPerSymbol = v; return this; }

    /**
     * Tones in Hz, each in [0, sampleRate / 2), at most 32; empty keeps the
     * default tones. The symbols are every tonesPerSymbol-tone subset, of
     * which there must be at least 3 and at most n(n-1)/2 for n tones.
     */
    public Builder toneFrequencies(float... hz) {
      toneFrequencies = hz.clone();
      return this;
    }

    /** Rate the frames are built at (the sender's output rate), 8000 to 192000 Hz. */
    public Builder sampleRate(float hz) { sampleRate = hz; return this; }
    /** Nominal frame length, (0, 1] s; must give at least one decimated sample. */
    public Builder windowDuration(float s) { windowDuration = s; return this; }

    /**
     * The frame window: attack, decay, sustain and release, each 0 or more
     * seconds and together at most {@code windowDuration}, and the sustain
     * amplitude in [0, 1].
     */
    public Builder adsr(float attack, float decay, float sustain, float release,
        float sustainAmplitude) {
      adsr = new float[] {attack, decay, sustain, release, sustainAmplitude};
      return this;
    }

    /** Receiver only: tokens one request returns at most, 1 to 6. */
    public Builder maxCandidatesPerDecodeTokenCall(int v) {
      maxCandidatesPerDecodeTokenCall = v;
      return this;
    }

    /** Asks the library whether it takes these settings, and builds them. */
    public DtmfSettings build() {
      // Unless set, the window scales with the frame.
      float[] window = adsr != null
          ? adsr.clone()
          : new float[] {0.1f * windowDuration, 0.1f * windowDuration, 0.6f * windowDuration,
              0.1f * windowDuration, 0.5f};
      DtmfSettings settings = new DtmfSettings(this, window);
      NativeSettings.require(settings.objection(false, sampleRate, 1));
      return settings;
    }
  }
}
