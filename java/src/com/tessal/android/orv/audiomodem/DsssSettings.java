package com.tessal.android.orv.audiomodem;

/**
 * Settings of the DSSS scheme: 18.5 kHz carrier, a 127-chip spreading code,
 * 4 bits per symbol and 8-byte tokens by default (the library's and the
 * {@code sorvel} tool's defaults). Sender and receiver must use the same
 * settings, except those marked as one side's only.
 *
 * <p>Immutable and thread safe. {@link Builder#build()} asks the library
 * whether it takes the settings and throws {@link IllegalArgumentException}
 * with its message naming the setting and its range, so settings that reach
 * the native peers never end the process.
 */
public final class DsssSettings {
  private final int tokenLengthBytes;
  private final boolean appendCheckSymbol;
  private final int numberOfTaps;
  private final int codeNumber;
  private final int upsamplingFactor;
  private final int bitsPerSymbol;
  private final int minCyclesPerFrame;
  private final int basebandDecimationFactor;
  private final boolean useQuadrature;
  private final float sampleRate;
  private final float desiredCarrierFrequency;
  private final int maxCandidatesToReturn;
  private final boolean highPassAtCarrier;
  private final int broadcastSampleRate;
  private final float startTransitionDuration;

  private DsssSettings(Builder b) {
    tokenLengthBytes = b.tokenLengthBytes;
    appendCheckSymbol = b.appendCheckSymbol;
    numberOfTaps = b.numberOfTaps;
    codeNumber = b.codeNumber;
    upsamplingFactor = b.upsamplingFactor;
    bitsPerSymbol = b.bitsPerSymbol;
    minCyclesPerFrame = b.minCyclesPerFrame;
    basebandDecimationFactor = b.basebandDecimationFactor;
    useQuadrature = b.useQuadrature;
    sampleRate = b.sampleRate;
    desiredCarrierFrequency = b.desiredCarrierFrequency;
    maxCandidatesToReturn = b.maxCandidatesToReturn;
    highPassAtCarrier = b.highPassAtCarrier;
    broadcastSampleRate = b.broadcastSampleRate;
    startTransitionDuration = b.startTransitionDuration;
  }

  /** The defaults. */
  public static DsssSettings defaults() {
    return new Builder().build();
  }

  public static Builder builder() {
    return new Builder();
  }

  /** A builder holding these settings. */
  public Builder toBuilder() {
    Builder b = new Builder();
    b.tokenLengthBytes = tokenLengthBytes;
    b.appendCheckSymbol = appendCheckSymbol;
    b.numberOfTaps = numberOfTaps;
    b.codeNumber = codeNumber;
    b.upsamplingFactor = upsamplingFactor;
    b.bitsPerSymbol = bitsPerSymbol;
    b.minCyclesPerFrame = minCyclesPerFrame;
    b.basebandDecimationFactor = basebandDecimationFactor;
    b.useQuadrature = useQuadrature;
    b.sampleRate = sampleRate;
    b.desiredCarrierFrequency = desiredCarrierFrequency;
    b.maxCandidatesToReturn = maxCandidatesToReturn;
    b.highPassAtCarrier = highPassAtCarrier;
    b.broadcastSampleRate = broadcastSampleRate;
    b.startTransitionDuration = startTransitionDuration;
    return b;
  }

  public int tokenLengthBytes() { return tokenLengthBytes; }
  public boolean appendCheckSymbol() { return appendCheckSymbol; }
  public int numberOfTaps() { return numberOfTaps; }
  public int codeNumber() { return codeNumber; }
  public int upsamplingFactor() { return upsamplingFactor; }
  public int bitsPerSymbol() { return bitsPerSymbol; }
  public int minCyclesPerFrame() { return minCyclesPerFrame; }
  public int basebandDecimationFactor() { return basebandDecimationFactor; }
  public boolean useQuadrature() { return useQuadrature; }
  public float sampleRate() { return sampleRate; }
  public float desiredCarrierFrequency() { return desiredCarrierFrequency; }
  public int maxCandidatesToReturn() { return maxCandidatesToReturn; }
  public boolean highPassAtCarrier() { return highPassAtCarrier; }
  public int broadcastSampleRate() { return broadcastSampleRate; }
  public float startTransitionDuration() { return startTransitionDuration; }

  /**
   * The library's objection to a sender of these settings and a receiver of
   * them at {@code inputSampleRate} with {@code channels} channels, or null.
   */
  String objection(boolean crc, float inputSampleRate, int channels, boolean hotsound) {
    return NativeSettings.nativeCheckDsss(tokenLengthBytes, crc, appendCheckSymbol, numberOfTaps,
        codeNumber, upsamplingFactor, bitsPerSymbol, minCyclesPerFrame, basebandDecimationFactor,
        useQuadrature, sampleRate, desiredCarrierFrequency, broadcastSampleRate,
        startTransitionDuration, maxCandidatesToReturn, inputSampleRate, channels, hotsound);
  }

  /** Collects settings; not thread safe. Setters only store, build() checks. */
  public static final class Builder {
    private int tokenLengthBytes = 8;
    private boolean appendCheckSymbol = false;
    private int numberOfTaps = 7;
    private int codeNumber = 0;
    private int upsamplingFactor = 15;
    private int bitsPerSymbol = 4;
    private int minCyclesPerFrame = 4;
    private int basebandDecimationFactor = 3;
    private boolean useQuadrature = false;
    private float sampleRate = 44100f;
    private float desiredCarrierFrequency = 18500f;
    private int maxCandidatesToReturn = 2;
    private boolean highPassAtCarrier = false;
    private int broadcastSampleRate = 44100;
    private float startTransitionDuration = 0.005f;

    private Builder() {}

    /** Bytes per token, CRC bytes included: 1 to 64 (3 or more with CRC). */
    public Builder tokenLengthBytes(int v) { tokenLengthBytes = v; return this; }
    /** Tokens carry a check symbol after the data symbols. */
    public Builder appendCheckSymbol(boolean v) { appendCheckSymbol = v; return this; }
    /** Spreading code register length, 5 to 11 (code of 2^taps - 1 chips). */
    public Builder numberOfTaps(int v) { numberOfTaps = v; return this; }
    /** Code of that length: 0 to 2 for 5 and 6 taps, else 0 to 3. */
    public Builder codeNumber(int v) { codeNumber = v; return this; }
    /** Samples per chip, 1 to 32. */
    public Builder upsamplingFactor(int v) { upsamplingFactor = v; return this; }
    /** 1, 2, 4 or 8. */
    public Builder bitsPerSymbol(int v) { bitsPerSymbol = v; return this; }
    /** Tone cycles per frame of symbol 0, 0 or more. */
    public Builder minCyclesPerFrame(int v) { minCyclesPerFrame = v; return this; }
    /** Receiver's baseband decimation; must divide the upsampling factor. */
    public Builder basebandDecimationFactor(int v) { basebandDecimationFactor = v; return this; }
    /** The symbol tone rides on the cosine carrier. */
    public Builder useQuadrature(boolean v) { useQuadrature = v; return this; }
    /** Rate the frames are built at, 8000 to 192000 Hz. */
    public Builder sampleRate(float hz) { sampleRate = hz; return this; }
    /** Carrier asked for, 0 to sampleRate / 2 Hz (rounded down to whole cycles per frame). */
    public Builder desiredCarrierFrequency(float hz) { desiredCarrierFrequency = hz; return this; }
    /** Receiver only: tokens one request returns at most, 1 to 6. */
    public Builder maxCandidatesToReturn(int v) { maxCandidatesToReturn = v; return this; }
    /** Sender only: remove everything below the carrier. */
    public Builder highPassAtCarrier(boolean v) { highPassAtCarrier = v; return this; }
    /** Sender only: output rate, 8000 to 192000 Hz. */
    public Builder broadcastSampleRate(int hz) { broadcastSampleRate = hz; return this; }
    /** Sender only: fade-in before the loop, 0 to 1 s. */
    public Builder startTransitionDuration(float s) { startTransitionDuration = s; return this; }

    /** Asks the library whether it takes these settings, and builds them. */
    public DsssSettings build() {
      DsssSettings settings = new DsssSettings(this);
      // A receiver at the frame rate can carry any carrier the coder accepts.
      NativeSettings.require(settings.objection(false, sampleRate, 1, false));
      return settings;
    }
  }
}
