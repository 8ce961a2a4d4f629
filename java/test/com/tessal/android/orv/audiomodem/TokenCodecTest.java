package com.tessal.android.orv.audiomodem;

import static org.junit.Assert.assertArrayEquals;
import static org.junit.Assert.assertEquals;
import static org.junit.Assert.assertFalse;
import static org.junit.Assert.assertNotEquals;
import static org.junit.Assert.assertThrows;
import static org.junit.Assert.assertTrue;

import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.util.ArrayList;
import java.util.HashSet;
import java.util.List;
import java.util.Set;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.Future;
import org.junit.Test;

public class TokenCodecTest {
  private static final byte[] SIX = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c};
  private static final byte[] EIGHT = {0x53, 0x6f, 0x72, 0x76, 0x65, 0x6c, 0x21, 0x7e};
  private static final byte[] THREE = {0x12, 0x34, 0x56};
  private static final byte[] FIVE = {0x12, 0x34, 0x56, 0x78, (byte) 0x9a};

  private enum Input { SHORTS, DIRECT, HEAP }

  /** A quarter second of silence, then the token looped for three seconds. */
  private static short[] broadcast(TokenEncoder encoder, byte[] message) {
    short[] token = encoder.encode(message);
    int lead = 11025;
    short[] pcm = new short[lead + 3 * 44100];
    for (int i = lead; i < pcm.length; i++) pcm[i] = token[(i - lead) % token.length];
    return pcm;
  }

  /**
   * Feeds in blocks of an odd number of samples: arrays through the offset
   * form, buffers as windows (position..limit) of one buffer whose samples
   * start 2 bytes (direct) or 3 bytes (heap) in.
   */
  private static void feed(TokenDecoder decoder, short[] pcm, Input input) {
    final int block = 1001;
    if (input == Input.SHORTS) {
      for (int start = 0; start < pcm.length; start += block) {
        decoder.process(pcm, start, Math.min(block, pcm.length - start));
      }
      return;
    }
    int pad = input == Input.DIRECT ? 2 : 3;
    ByteBuffer buffer = input == Input.DIRECT
        ? ByteBuffer.allocateDirect(pad + 2 * pcm.length)
        : ByteBuffer.allocate(pad + 2 * pcm.length);
    buffer.order(ByteOrder.nativeOrder());
    buffer.position(pad);
    for (short s : pcm) buffer.putShort(s);
    for (int start = pad; start < buffer.capacity(); start += 2 * block) {
      int end = Math.min(start + 2 * block, buffer.capacity());
      buffer.limit(end).position(start);
      decoder.process(buffer);
      assertEquals(end, buffer.position());
    }
  }

  private static void assertDecodes(String name, TokenDecoder decoder, byte[] message) {
    List<byte[]> tokens = decoder.tokens();
    assertFalse(name + ": no token", tokens.isEmpty());
    assertArrayEquals(name, message, tokens.get(0));
  }

  @Test
  public void roundTripsThroughEveryInputKind() {
    DsssSettings dsss = DsssSettings.defaults();
    DtmfSettings dtmf = DtmfSettings.defaults();
    for (Input input : Input.values()) {
      for (boolean crc : new boolean[] {true, false}) {
        String name = input + (crc ? " crc" : " no crc");
        TokenEncoder dsssEncoder = new TokenEncoder(dsss, crc);
        short[] dsssPcm = broadcast(dsssEncoder, crc ? SIX : EIGHT);
        for (boolean hotsound : new boolean[] {false, true}) {
          try (TokenDecoder decoder =
                   TokenDecoder.builder(dsss).crc(crc).hotsound(hotsound).build()) {
            feed(decoder, dsssPcm, input);
            assertDecodes("dsss " + name + (hotsound ? " hotsound" : ""), decoder,
                crc ? SIX : EIGHT);
          }
        }
        TokenEncoder dtmfEncoder = new TokenEncoder(dtmf, crc);
        try (TokenDecoder decoder = TokenDecoder.builder(dtmf).crc(crc).build()) {
          feed(decoder, broadcast(dtmfEncoder, crc ? THREE : FIVE), input);
          assertDecodes("dtmf " + name, decoder, crc ? THREE : FIVE);
        }
      }
    }
  }

  @Test
  public void interleavedStereoAndLongBlocksDecode() {
    DsssSettings dsss = DsssSettings.defaults();
    short[] mono = broadcast(new TokenEncoder(dsss, true), SIX);
    short[] stereo = new short[2 * mono.length];
    for (int i = 0; i < mono.length; i++) {
      stereo[2 * i] = mono[i];
      stereo[2 * i + 1] = (short) (mono[i] / 2);
    }
    try (TokenDecoder decoder = TokenDecoder.builder(dsss).channels(2).crc(true).build()) {
      // One call with more than the decoder buffers: it must be fed in pieces.
      decoder.process(stereo);
      assertDecodes("stereo", decoder, SIX);
      decoder.wipe();
      assertTrue(decoder.tokens().isEmpty());
    }
  }

  @Test
  public void finishFindsABroadcastThatEndsTheRecording() {
    TokenEncoder dsssEncoder = new TokenEncoder(DsssSettings.defaults(), true);
    TokenEncoder dtmfEncoder = new TokenEncoder(DtmfSettings.defaults(), true);
    try (TokenDecoder dsss = TokenDecoder.builder(DsssSettings.defaults()).crc(true).build();
        TokenDecoder dtmf = TokenDecoder.builder(DtmfSettings.defaults()).crc(true).build()) {
      dsss.process(dsssEncoder.encode(SIX));
      dtmf.process(dtmfEncoder.encode(THREE));
      List<byte[]> dsssTokens = dsss.finish();
      List<byte[]> dtmfTokens = dtmf.finish();
      assertEquals(1, dsssTokens.size());
      assertArrayEquals(SIX, dsssTokens.get(0));
      assertEquals(1, dtmfTokens.size());
      assertArrayEquals(THREE, dtmfTokens.get(0));
    }
  }

  // Refused blocks leave the decoder and the buffer as they were.
  @Test
  public void refusedBlocksChangeNothing() {
    DsssSettings dsss = DsssSettings.defaults();
    short[] pcm = broadcast(new TokenEncoder(dsss, true), SIX);
    try (TokenDecoder decoder = TokenDecoder.builder(dsss).channels(2).crc(true).build()) {
      assertThrows(IllegalArgumentException.class, () -> decoder.process(new short[3]));
      assertThrows(IllegalArgumentException.class, () -> decoder.process(pcm, 0, 5));
      assertThrows(IndexOutOfBoundsException.class, () -> decoder.process(pcm, pcm.length, 2));
      for (ByteBuffer b : new ByteBuffer[] {ByteBuffer.allocateDirect(7), ByteBuffer.allocate(6)}) {
        b.position(1);
        assertThrows(IllegalArgumentException.class, () -> decoder.process(b));
        assertEquals(1, b.position());
      }
      short[] doubled = new short[2 * pcm.length];
      for (int i = 0; i < doubled.length; i++) doubled[i] = pcm[i / 2];
      decoder.process(doubled);
      assertDecodes("after refusals", decoder, SIX);
    }
  }

  @Test
  public void encoderRefusesWrongMessageLengths() {
    TokenEncoder encoder = new TokenEncoder(DsssSettings.defaults(), true);
    assertEquals(6, encoder.messageBytes());
    for (int length : new int[] {0, 5, 7, 8}) {
      IllegalArgumentException e = assertThrows(IllegalArgumentException.class,
          () -> encoder.encode(new byte[length]));
      assertTrue(e.getMessage(), e.getMessage().contains("6 bytes"));
    }
  }

  @Test
  public void everyCallAfterCloseThrows() {
    TokenDecoder decoder = TokenDecoder.builder(DtmfSettings.defaults()).build();
    decoder.close();
    decoder.close();  // closing again does nothing
    List<Runnable> calls = List.of(
        () -> decoder.process(new short[2]),
        () -> decoder.process(new short[2], 0, 2),
        () -> decoder.process(ByteBuffer.allocateDirect(4)),
        () -> decoder.process(ByteBuffer.allocate(4)),
        decoder::tokens,
        decoder::finish,
        decoder::wipe);
    for (Runnable call : calls) {
      assertThrows(IllegalStateException.class, call::run);
    }
  }

  @Test
  public void idsAreDistinctWhileOpenAndReusedAfterClose() throws Exception {
    DsssSettings dsss = DsssSettings.defaults();
    ExecutorService pool = Executors.newFixedThreadPool(4);
    List<Future<TokenDecoder>> futures = new ArrayList<>();
    for (int i = 0; i < 12; i++) {
      futures.add(pool.submit(() -> TokenDecoder.builder(dsss).build()));
    }
    List<TokenDecoder> open = new ArrayList<>();
    Set<Integer> ids = new HashSet<>();
    for (Future<TokenDecoder> f : futures) {
      open.add(f.get());
      assertTrue(ids.add(open.get(open.size() - 1).id()));
    }
    pool.shutdown();

    TokenDecoder third = open.get(2);
    int freed = third.id();
    third.close();
    try (TokenDecoder reused = TokenDecoder.builder(DtmfSettings.defaults()).build()) {
      assertEquals(freed, reused.id());
      // The other decoders are untouched by the slot's new owner.
      for (TokenDecoder d : open) {
        if (d != third) assertNotEquals(freed, d.id());
      }
      short[] pcm = broadcast(new TokenEncoder(dsss, false), EIGHT);
      open.get(0).process(pcm);
      assertDecodes("beside a reused id", open.get(0), EIGHT);
    }
    for (TokenDecoder d : open) d.close();
  }
}
