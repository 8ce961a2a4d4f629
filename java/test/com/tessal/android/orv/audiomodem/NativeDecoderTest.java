package com.tessal.android.orv.audiomodem;

import static org.junit.Assert.assertArrayEquals;
import static org.junit.Assert.assertEquals;
import static org.junit.Assert.assertFalse;
import static org.junit.Assert.assertNotEquals;
import static org.junit.Assert.assertTrue;

import java.io.File;
import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.util.concurrent.TimeUnit;
import org.junit.After;
import org.junit.Test;

public class NativeDecoderTest {
  private static final byte[] DSSS_MESSAGE = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c};
  private static final byte[] DTMF_MESSAGE = {0x12, 0x34, 0x56};

  // Ids this test initialised; releasing an id past the registry's end is
  // fatal, so only these are released.
  private final java.util.Set<Integer> used = new java.util.HashSet<>();

  @After
  public void release() {
    for (int id : used) {
      NativeDecoder.nativeRelease(id);
    }
    NativeEncoder.nativeRelease();
  }

  private void initDsss(int id, boolean hotsound) {
    used.add(id);
    assertTrue(NativeDecoder.nativeInitializeDsss(
        id, 8, false, false, 7, 0, 15, 4, 4, 3, false, 2, 1, hotsound,
        44100f, 18500f, 0.175f, 4.0f, 44100f, 4.0f));
  }

  private boolean initDtmf(int id, float sustainAmplitude) {
    used.add(id);
    return NativeDecoder.nativeInitializeDtmf(
        id, 5, false, 16, 2, 2, 1, 44100f, 0.05f, 0f, 44100f,
        0.005f, 0.005f, 0.03f, 0.005f, sustainAmplitude, 6.0f, new float[0]);
  }

  /** Token PCM from the encoder, looped to fill `seconds`, little-endian. */
  private static byte[] loopedPcm(boolean dsss, byte[] message, double seconds) {
    if (dsss) {
      NativeEncoder.nativeInitializeDsss(8, false, false, 7, 0, 15, 4, 4, 3, false, 44100,
          44100f, 18500f, 0.005f);
    } else {
      NativeEncoder.nativeInitializeDtmf(5, false, 16, 2, new float[0], 44100f, 0.05f,
          0.005f, 0.005f, 0.03f, 0.005f, 0.5f);
    }
    EncodeResults encoded = new EncodeResults();
    NativeEncoder.nativeEncode(message, encoded, 2);
    int total = (int) (seconds * 44100) * 2;
    byte[] pcm = new byte[total];
    for (int i = 0; i < total; i++) {
      pcm[i] = encoded.audio[i % encoded.audio.length];
    }
    return pcm;
  }

  /**
   * Feeds 10 ms blocks through one direct buffer; each block sits behind 2
   * bytes of padding and is passed with offset 2 and length block + 2, which
   * takes exactly the block.
   */
  private static void feed(int id, byte[] pcm, boolean hotsound) {
    final int block = 882;
    // The check counts offset and length together against the capacity.
    ByteBuffer buffer = ByteBuffer.allocateDirect(block + 4).order(ByteOrder.nativeOrder());
    for (int start = 0; start + block <= pcm.length; start += block) {
      buffer.clear();
      buffer.put((byte) 0x7f).put((byte) 0x7f);
      for (int i = 0; i < block; i += 2) {
        short sample = (short) ((pcm[start + i] & 0xff) | (pcm[start + i + 1] << 8));
        buffer.putShort(sample);
      }
      if (hotsound) {
        NativeDecoder.nativeProcessSamplesWithHotsound(id, buffer, 2, block + 2);
      } else {
        NativeDecoder.nativeProcessSamples(id, buffer, 2, block + 2);
      }
    }
  }

  private static TokenResults tokens(int id, int messageBytes) {
    TokenResults results = new TokenResults();
    NativeDecoder.nativeGetTokens(id, results, messageBytes, 2);
    return results;
  }

  @Test
  public void decodersSideBySideDecodeTheirTokens() {
    initDsss(0, false);
    initDsss(1, true);
    assertTrue(initDtmf(2, 0.8f));
    byte[] dsss = loopedPcm(true, DSSS_MESSAGE, 3.0);
    byte[] dtmf = loopedPcm(false, DTMF_MESSAGE, 3.0);
    feed(0, dsss, false);
    feed(1, dsss, true);
    feed(2, dtmf, false);

    for (int id : new int[] {0, 1}) {
      TokenResults results = tokens(id, 6);
      assertFalse("decoder " + id, results.tokens.isEmpty());
      assertArrayEquals(DSSS_MESSAGE, results.tokens.get(0));
      assertTrue(NativeDecoder.nativeDetectBroadcaster(id));
    }
    TokenResults results = tokens(2, 3);
    assertFalse(results.tokens.isEmpty());
    assertArrayEquals(DTMF_MESSAGE, results.tokens.get(0));
    assertFalse(NativeDecoder.nativeDetectBroadcaster(2));

    // A refused ADSR window leaves the registered decoder in place.
    assertFalse(initDtmf(2, 1.5f));
    assertArrayEquals(DTMF_MESSAGE, tokens(2, 3).tokens.get(0));
  }

  @Test
  public void safeInputSizeWipeAndRelease() {
    initDsss(-1, false);
    // Buffer 4 tokens of 17 frames of 1905 samples less one token, in bytes.
    assertEquals(2 * (Math.round(4 * 17 * 1905) - 17 * 1905),
        NativeDecoder.nativeGetMaxSafeInputSize(-1));
    assertTrue(initDtmf(0, 0.8f));
    int dtmf = NativeDecoder.nativeGetMaxSafeInputSize(0);
    assertTrue(dtmf > 0 && dtmf % 2 == 0);

    feed(-1, loopedPcm(true, DSSS_MESSAGE, 2.0), false);
    assertFalse(tokens(-1, 6).tokens.isEmpty());
    NativeDecoder.nativeWipeInternalData(-1);
    assertTrue(tokens(-1, 6).tokens.isEmpty());
    assertFalse(NativeDecoder.nativeDetectBroadcaster(-1));

    NativeDecoder.nativeRelease(-1);
    NativeDecoder.nativeRelease(-1);  // releasing an empty slot does nothing
    initDsss(-1, false);
    assertNotEquals(0, NativeDecoder.nativeGetMaxSafeInputSize(-1));
  }

  /** Buffer misuse aborts with its check text; shown in a child JVM. */
  @Test
  public void bufferMisuseIsFatal() throws Exception {
    String java = System.getProperty("java.home") + File.separator + "bin" + File.separator + "java";
    ProcessBuilder builder = new ProcessBuilder(java,
        "-Djava.library.path=" + System.getProperty("java.library.path"),
        "-XX:ErrorFile=/dev/null", "-XX:-CreateCoredumpOnCrash",
        "-cp", System.getProperty("java.class.path"),
        "com.tessal.android.orv.audiomodem.BufferMisuse");
    builder.redirectErrorStream(true);
    Process child = builder.start();
    String output = new String(child.getInputStream().readAllBytes());
    assertTrue(child.waitFor(60, TimeUnit.SECONDS));
    assertNotEquals(0, child.exitValue());
    assertTrue(output, output.contains("Check failed: length_bytes + offset_bytes <= capacity_bytes"));
  }
}
