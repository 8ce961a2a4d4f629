package com.tessal.android.orv.audiomodem;

import java.nio.ByteBuffer;

/** Run in a child JVM: an offset that pushes the block past the buffer end. */
public final class BufferMisuse {
  public static void main(String[] args) {
    NativeDecoder.nativeInitializeDsss(0, 8, false, false, 7, 0, 15, 4, 4, 3, false, 2, 1,
        false, 44100f, 18500f, 0.175f, 4.0f, 44100f, 4.0f);
    NativeDecoder.nativeProcessSamples(0, ByteBuffer.allocateDirect(64), 2, 64);
    System.out.println("not reached");
  }
}
