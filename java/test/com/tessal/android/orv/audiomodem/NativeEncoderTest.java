package com.tessal.android.orv.audiomodem;

import static org.junit.Assert.assertArrayEquals;
import static org.junit.Assert.assertEquals;
import static org.junit.Assert.assertFalse;
import static org.junit.Assert.assertNotNull;
import static org.junit.Assert.assertTrue;

import org.junit.After;
import org.junit.Test;

public class NativeEncoderTest {
  private static final byte[] MESSAGE = {1, 2, 3, 4, 5, 6};

  @After
  public void release() {
    NativeEncoder.nativeRelease();
  }

  private static void initDefaultDsss(boolean appendCheckSymbol) {
    assertTrue(NativeEncoder.nativeInitializeDsss(
        8, appendCheckSymbol, false, 7, 0, 15, 4, 4, 3, false, 44100, 44100f, 18500f, 0.005f));
  }

  private static boolean initDefaultDtmf(float attack, float sustainAmplitude) {
    return NativeEncoder.nativeInitializeDtmf(
        5, false, 16, 2, new float[0], 44100f, 0.05f, attack, 0.01f, 0.02f, 0.01f,
        sustainAmplitude);
  }

  private static int peak(byte[] pcm) {
    int peak = 0;
    for (int i = 0; i < pcm.length / 2; i++) {
      peak = Math.max(peak, Math.abs((int) EncodeResults.sampleAt(pcm, i)));
    }
    return peak;
  }

  /** 16 data symbols + check symbol + start frame, 1905 samples each, peak 0.5. */
  @Test
  public void dsssTokenWithCrcHasFramesAndPeak() {
    initDefaultDsss(true);
    EncodeResults results = new EncodeResults();
    NativeEncoder.nativeEncode(MESSAGE, results, 2);
    assertEquals(1, results.calls);
    assertEquals(44100f, results.sampleRate, 0f);
    assertEquals((16 + 1 + 1) * 1905 * 2, results.audio.length);
    assertEquals(16384, peak(results.audio));
    assertEquals(221 * 2, results.startTransition.length);
    // The transition leads into the loop: its last sample is 221/222 of the
    // waveform's last sample.
    int last = EncodeResults.sampleAt(results.audio, results.audio.length / 2 - 1);
    int ramp = EncodeResults.sampleAt(results.startTransition, 220);
    assertTrue(Math.abs(ramp - last * 221.0 / 222.0) <= 1.0);

    EncodeResults again = new EncodeResults();
    NativeEncoder.nativeEncode(MESSAGE, again, 2);
    assertArrayEquals(results.audio, again.audio);
  }

  @Test
  public void refusedSplitGivesEmptyArraysAndEmptyTokenNoCallback() {
    initDefaultDsss(false);
    EncodeResults results = new EncodeResults();
    NativeEncoder.nativeEncode(MESSAGE, results, 0);  // 6 + 0 != 8
    assertEquals(1, results.calls);
    assertEquals(0, results.audio.length);
    assertEquals(0, results.startTransition.length);

    NativeEncoder.nativeEncode(new byte[0], results, 2);
    assertEquals(1, results.calls);
  }

  /** 8 data symbols + spacer, 2208 samples each, full scale, no transition. */
  @Test
  public void dtmfTokenAndRefusedAdsrKeepsPreviousEncoder() {
    assertTrue(initDefaultDtmf(0.01f, 0.5f));
    EncodeResults results = new EncodeResults();
    NativeEncoder.nativeEncode(new byte[] {9, 8, 7}, results, 2);
    assertEquals(9 * 2208 * 2, results.audio.length);
    assertEquals(32767, peak(results.audio));
    assertEquals(0, results.startTransition.length);
    assertEquals(44100f, results.sampleRate, 0f);

    assertFalse(initDefaultDtmf(0.01f, 1.5f));  // sustain amplitude outside [0, 1]
    assertFalse(initDefaultDtmf(0.2f, 0.5f));  // longer than the 0.05 s frame
    EncodeResults after = new EncodeResults();
    NativeEncoder.nativeEncode(new byte[] {9, 8, 7}, after, 2);
    assertNotNull(after.audio);
    assertArrayEquals(results.audio, after.audio);
  }

  @Test
  public void dtmfCustomTonesReplaceTheTable() {
    assertTrue(NativeEncoder.nativeInitializeDtmf(
        2, true, 16, 2, new float[] {1000f, 1500f, 2000f, 2500f}, 16000f, 0.05f,
        0f, 0f, 0.05f, 0f, 1f));
    EncodeResults results = new EncodeResults();
    NativeEncoder.nativeEncode(new byte[] {(byte) 0xff, 0x10}, results, 0);
    // 6 tone pairs: base 5; 2 bytes need 7 digits; + spacer + checksum.
    assertEquals(16000f, results.sampleRate, 0f);
    assertEquals((7 + 2) * 800 * 2, results.audio.length);
  }
}
