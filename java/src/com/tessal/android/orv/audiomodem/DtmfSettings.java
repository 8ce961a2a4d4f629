package com.tessal.android.orv.audiomodem;

import java.util.Arrays;

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
 * <p>Immutable and thread safe. {@link Builder#build()} checks every value
 * against the limits the native modem enforces (plus the sample-rate, token,
 * tone-count and frame-length ranges this API allows) and throws {@link
 * IllegalArgumentException} naming the setting and its range, so settings
 * that reach the library never end the process.
 */
public final class DtmfSettings {
  /** Tones a symbol table may draw from: the receiver keeps tone sets as 32-bit masks. */
  static final int MAX_TONES = 32;
  static final float MAX_WINDOW_DURATION = 1f;
  /** The default tones: two pentatonic octaves from 740 Hz, as the library builds them. */
  private static final float[] DEFAULT_TONES = pentatonicTones(2, 740f);

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

  /** Samples per frame: a multiple of the decimation factor nearest the window duration. */
  static long frameSize(float windowDuration, float sampleRate, int decimation) {
    // Float arithmetic and round-half-up, as the library computes it.
    return (long) decimation * Math.round(windowDuration * sampleRate / (float) decimation);
  }

  /** Number of k-element subsets of n tones, capped past n(n-1)/2 + 1. */
  static long symbolCount(int n, int k) {
    long cap = (long) n * (n - 1) / 2 + 1;
    long c = 1;
    for (int i = 1; i <= k; i++) {
      c = c * (n - k + i) / i;
      if (c > cap) return cap;
    }
    return c;
  }

  private static float[] pentatonicTones(int octaves, float base) {
    final int[] offsets = {0, 2, 4, 7, 9};
    float[] tones = new float[5 * octaves];
    for (int octave = 0; octave < octaves; octave++) {
      for (int i = 0; i < 5; i++) {
        tones[5 * octave + i] = (float) Math.pow(2.0, offsets[i] / 12.0) * base;
      }
      base *= 2f;
    }
    return tones;
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

    /** Checks every value and builds the settings. */
    public DtmfSettings build() {
      Checks.rate("sampleRate", sampleRate);
      Checks.intIn("bytesInToken", bytesInToken, 1, Checks.MAX_TOKEN_BYTES);
      if (basebandDecimationFactor <= 0) {
        throw Checks.fail(
            "basebandDecimationFactor must be at least 1, got " + basebandDecimationFactor);
      }
      if (!(windowDuration > 0f && windowDuration <= MAX_WINDOW_DURATION)) {
        throw Checks.fail("windowDuration must be in (0, " + MAX_WINDOW_DURATION + "] s, got "
            + windowDuration);
      }
      if (frameSize(windowDuration, sampleRate, basebandDecimationFactor) <= 0) {
        throw Checks.fail("windowDuration " + windowDuration + " s gives no samples per frame at "
            + sampleRate + " Hz with basebandDecimationFactor " + basebandDecimationFactor);
      }
      float[] tones = toneFrequencies.length == 0 ? DEFAULT_TONES : toneFrequencies;
      if (tones.length > MAX_TONES) {
        throw Checks.fail("toneFrequencies may hold at most " + MAX_TONES + " tones, got "
            + tones.length);
      }
      final float nyquist = sampleRate * 0.5f;
      for (float f : tones) {
        if (!(f >= 0f && f < nyquist)) {
          throw Checks.fail("toneFrequencies: " + f + " Hz must be in [0, " + nyquist + ")");
        }
      }
      final int n = tones.length;
      Checks.intIn("tonesPerSymbol", tonesPerSymbol, 1, n);
      if (toneFrequencies.length == 0) {
        if (tonesPerSymbol != 2) {
          throw Checks.fail("tonesPerSymbol must be 2 with the default tones (set "
              + "toneFrequencies to change it), got " + tonesPerSymbol);
        }
      } else {
        long symbols = symbolCount(n, tonesPerSymbol);
        long most = (long) n * (n - 1) / 2;
        if (symbols < 3 || symbols > most) {
          throw Checks.fail("toneFrequencies and tonesPerSymbol: " + n + " tones taken "
              + tonesPerSymbol + " at a time must give between 3 and " + most + " symbols");
        }
      }
      float[] window = adsr != null
          ? adsr.clone()
          : new float[] {0.1f * windowDuration, 0.1f * windowDuration, 0.6f * windowDuration,
              0.1f * windowDuration, 0.5f};
      checkAdsr(window, windowDuration);
      Checks.intIn("maxCandidatesPerDecodeTokenCall", maxCandidatesPerDecodeTokenCall, 1,
          Checks.MAX_CANDIDATES);
      return new DtmfSettings(this, window);
    }

    private static void checkAdsr(float[] a, float windowDuration) {
      final String[] names = {"attack", "decay", "sustain", "release"};
      for (int i = 0; i < 4; i++) {
        if (!(a[i] >= 0f && a[i] <= Float.MAX_VALUE)) {
          throw Checks.fail("adsr " + names[i] + " must be a duration of 0 s or more, got " + a[i]);
        }
      }
      Checks.floatIn("adsr sustainAmplitude", a[4], 0f, 1f);
      // Summed in this order with the library's few ulps of slack.
      float total = a[0] + a[1] + a[2] + a[3];
      if (total > windowDuration * 1.0000005f) {
        throw Checks.fail("adsr: attack + decay + sustain + release (" + total
            + " s) must be at most windowDuration (" + windowDuration + " s), got "
            + Arrays.toString(a));
      }
    }
  }
}
