package com.tessal.android.orv.audiomodem;

/**
 * Range checks shared by the settings builders, the encoder and the decoder.
 * Each throws {@link IllegalArgumentException} naming the setting, the allowed
 * range and the value. Stateless.
 */
final class Checks {
  /** Sample rates the Java API accepts, Hz (rates of audio hardware). */
  static final float MIN_RATE_HZ = 8000f;
  static final float MAX_RATE_HZ = 192000f;
  /** Token length, bytes; longer tokens take minutes of buffered audio. */
  static final int MAX_TOKEN_BYTES = 64;
  /** The decoders rank at most six candidates (their max_candidates_rank). */
  static final int MAX_CANDIDATES = 6;

  private Checks() {}

  static int intIn(String name, int value, int min, int max) {
    if (value < min || value > max) {
      throw new IllegalArgumentException(
          name + " must be in [" + min + ", " + max + "], got " + value);
    }
    return value;
  }

  /** Finite and in [min, max]. */
  static float floatIn(String name, float value, float min, float max) {
    if (!(value >= min && value <= max)) {
      throw new IllegalArgumentException(
          name + " must be in [" + min + ", " + max + "], got " + value);
    }
    return value;
  }

  static float rate(String name, float hz) {
    if (!(hz >= MIN_RATE_HZ && hz <= MAX_RATE_HZ)) {
      throw new IllegalArgumentException(name + " must be in [" + (int) MIN_RATE_HZ + ", "
          + (int) MAX_RATE_HZ + "] Hz, got " + hz);
    }
    return hz;
  }

  static IllegalArgumentException fail(String message) {
    return new IllegalArgumentException(message);
  }
}
