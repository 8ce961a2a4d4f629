package com.tessal.android.orv.audiomodem;

/** Holds what the last {@link NativeEncoder#nativeEncode} call delivered. */
public final class EncodeResults {
  public byte[] audio;
  public byte[] startTransition;
  public float sampleRate;
  public int calls;

  /** Called by the native encoder. */
  public void setEncodeResults(byte[] audio, byte[] startTransition, float sampleRate) {
    this.audio = audio;
    this.startTransition = startTransition;
    this.sampleRate = sampleRate;
    calls++;
  }

  /** Sample {@code i} of 16-bit little-endian PCM. */
  public static short sampleAt(byte[] pcm, int i) {
    return (short) ((pcm[2 * i] & 0xff) | (pcm[2 * i + 1] << 8));
  }
}
