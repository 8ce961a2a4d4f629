package com.tessal.android.orv.audiomodem;

import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.nio.ShortBuffer;
import java.util.BitSet;
import java.util.List;
import java.util.Objects;
import java.util.concurrent.locks.ReentrantReadWriteLock;

/**
 * Finds tokens in 16-bit PCM from a microphone: a DSSS decoder (optionally
 * behind the hotsound wake-up detector) or a multi-tone decoder, owning one
 * slot of the library's decoder registry until {@link #close()}.
 *
 * <pre>{@code
 * try (TokenDecoder decoder = TokenDecoder.builder(DsssSettings.defaults())
 *     .inputSampleRate(48000).crc(true).build()) {
 *   decoder.process(block);                  // as often as audio arrives
 *   List<byte[]> tokens = decoder.tokens();  // best first, CRC checked and removed
 * }
 * }</pre>
 *
 * <p>At the end of a recording, {@link #finish()} in place of {@code tokens()}
 * also finds a broadcast the recording ends with.
 *
 * <p>Audio is interleaved when there are several channels; a block must hold
 * whole frames (a multiple of the channel count), else {@link
 * IllegalArgumentException}. Blocks of any length are accepted: long ones are
 * fed in pieces no larger than the library can take without dropping
 * buffered audio.
 *
 * <p>Threads: each object is meant for one thread at a time, the one that
 * reads the audio. Its methods are synchronized, so calls from several
 * threads are serialised instead of corrupting the native decoder, but
 * blocks from two threads then interleave into one garbled stream. Separate
 * decoders run in parallel; creating and closing them is serialised against
 * all other decoder calls, since the registry may grow. Code that drives
 * {@link NativeDecoder} directly in the same process should keep to the
 * default slot -1: this class takes ids from 0 up.
 *
 * <p>After {@link #close()} every method except {@code close} throws {@link
 * IllegalStateException}. A decoder that is never closed keeps its native
 * memory and id for the life of the process.
 */
public final class TokenDecoder implements AutoCloseable {
  /** Samples copied per native call from arrays and heap buffers. */
  private static final int SCRATCH_SAMPLES = 8192;

  // Initialise and release may grow the registry's storage, so they must not
  // overlap any other call; calls on distinct decoders may overlap each other.
  private static final ReentrantReadWriteLock REGISTRY = new ReentrantReadWriteLock();
  private static final BitSet IDS_IN_USE = new BitSet();  // guarded by REGISTRY's write lock

  private final int id;
  private final int channels;
  private final boolean hotsound;
  private final int messageBytes;
  private final int crcBytes;
  private final int pieceSamples;  // most samples one native call takes
  private final int finishSamples;  // the silence finish() feeds: half a second
  private ByteBuffer scratch;  // direct, native order; for arrays and heap buffers
  private ShortBuffer scratchShorts;
  private boolean closed;

  /** A builder for a DSSS decoder. */
  public static Builder builder(DsssSettings settings) {
    return new Builder(Objects.requireNonNull(settings, "settings"), null);
  }

  /** A builder for a multi-tone decoder. */
  public static Builder builder(DtmfSettings settings) {
    return new Builder(null, Objects.requireNonNull(settings, "settings"));
  }

  private TokenDecoder(Builder b) {
    channels = b.channels;
    hotsound = b.hotsound;
    int tokenBytes = b.dsss != null ? b.dsss.tokenLengthBytes() : b.dtmf.bytesInToken();
    messageBytes = TokenEncoder.messageBytes(tokenBytes, b.crc);
    crcBytes = b.crc ? 2 : 0;
    int safeBytes;
    REGISTRY.writeLock().lock();
    try {
      id = IDS_IN_USE.nextClearBit(0);
      if (!initialize(id, b)) {
        // The library took these settings when they were checked; the registry is unchanged.
        throw new IllegalStateException("the library refused checked settings");
      }
      IDS_IN_USE.set(id);
      safeBytes = NativeDecoder.nativeGetMaxSafeInputSize(id);
    } finally {
      REGISTRY.writeLock().unlock();
    }
    pieceSamples = Math.max(channels, safeBytes / 2 / channels * channels);
    finishSamples = Math.round(0.5f * b.inputSampleRate) * channels;
  }

  private static boolean initialize(int id, Builder b) {
    if (b.dsss != null) {
      DsssSettings s = b.dsss;
      // Detection duration, threshold and buffer length keep the library's defaults.
      return NativeDecoder.nativeInitializeDsss(id, s.tokenLengthBytes(), s.appendCheckSymbol(),
          false, s.numberOfTaps(), s.codeNumber(), s.upsamplingFactor(), s.bitsPerSymbol(),
          s.minCyclesPerFrame(), s.basebandDecimationFactor(), s.useQuadrature(),
          s.maxCandidatesToReturn(), b.channels, b.hotsound, s.sampleRate(),
          s.desiredCarrierFrequency(), 0.175f, 4.0f, b.inputSampleRate, 4.0f);
    }
    DtmfSettings s = b.dtmf;
    float[] a = s.adsr();
    return NativeDecoder.nativeInitializeDtmf(id, s.bytesInToken(), s.useChecksumSymbol(),
        s.basebandDecimationFactor(), s.tonesPerSymbol(), s.maxCandidatesPerDecodeTokenCall(),
        b.channels, s.sampleRate(), s.windowDuration(), 0f, b.inputSampleRate, a[0], a[1], a[2],
        a[3], a[4], 6.0f, s.toneFrequencies());
  }

  /** The registry slot this decoder owns. */
  int id() {
    return id;
  }

  /** Message bytes per token (the token less its CRC bytes). */
  public int messageBytes() {
    return messageBytes;
  }

  /** Feeds all of {@code samples}. */
  public void process(short[] samples) {
    process(samples, 0, Objects.requireNonNull(samples, "samples").length);
  }

  /**
   * Feeds {@code length} samples from {@code offset} on.
   *
   * @throws IndexOutOfBoundsException when the range lies outside the array
   * @throws IllegalArgumentException when {@code length} is not a multiple of
   *     the channel count
   */
  public synchronized void process(short[] samples, int offset, int length) {
    checkOpen();
    Objects.checkFromIndexSize(offset, length, Objects.requireNonNull(samples, "samples").length);
    checkFrames(length);
    ensureScratch();
    final int piece = Math.min(pieceSamples, scratchShorts.capacity());
    for (int done = 0; done < length; ) {
      int n = Math.min(piece, length - done);
      scratchShorts.clear();
      scratchShorts.put(samples, offset + done, n);
      feed(scratch, 2 * n);
      done += n;
    }
  }

  /**
   * Feeds the bytes between the buffer's position and limit as native-order
   * 16-bit samples (whatever the buffer's {@link ByteBuffer#order()}), and
   * moves the position to the limit. Direct buffers are read in place, heap
   * and read-only ones are copied.
   *
   * @throws IllegalArgumentException when the byte count is odd or not whole
   *     frames; the position does not move then
   */
  public synchronized void process(ByteBuffer buffer) {
    checkOpen();
    Objects.requireNonNull(buffer, "buffer");
    final int bytes = buffer.remaining();
    if (bytes % 2 != 0) {
      throw new IllegalArgumentException("buffer must hold whole 16-bit samples, got " + bytes + " bytes");
    }
    checkFrames(bytes / 2);
    final int start = buffer.position();
    if (buffer.isDirect()) {
      final int piece = 2 * pieceSamples;
      for (int done = 0; done < bytes; ) {
        int n = Math.min(piece, bytes - done);
        // The library counts the offset twice against the capacity; a slice
        // starts at offset 0.
        ByteBuffer view = buffer;
        if (start + done != 0) {
          view = buffer.duplicate();
          view.position(start + done);
          view = view.slice();
        }
        feed(view, n);
        done += n;
      }
    } else {
      ensureScratch();
      final int piece = 2 * Math.min(pieceSamples, scratchShorts.capacity());
      ByteBuffer source = buffer.duplicate();
      for (int done = 0; done < bytes; ) {
        int n = Math.min(piece, bytes - done);
        source.limit(start + done + n).position(start + done);
        scratch.clear();
        scratch.put(source);
        feed(scratch, n);
        done += n;
      }
    }
    buffer.position(start + bytes);
  }

  /**
   * The tokens found in the audio so far, best first, CRC checked and removed;
   * empty when there are none. Without CRC the lower-ranked ones are guesses.
   */
  public synchronized List<byte[]> tokens() {
    checkOpen();
    TokenResults results = new TokenResults();
    REGISTRY.readLock().lock();
    try {
      NativeDecoder.nativeGetTokens(id, results, messageBytes, crcBytes);
    } finally {
      REGISTRY.readLock().unlock();
    }
    return results.tokens;
  }

  /**
   * {@link #tokens()} at the end of a recording. The decoder scores a frame
   * only once it has heard a little past it, so a broadcast the audio ends
   * with is found only after this call, which feeds half a second of silence
   * first (audio fed later follows that silence).
   */
  public synchronized List<byte[]> finish() {
    checkOpen();
    process(new short[finishSamples]);
    return tokens();
  }

  /** Forgets the audio fed so far, as between two listening sessions. */
  public synchronized void wipe() {
    checkOpen();
    REGISTRY.readLock().lock();
    try {
      NativeDecoder.nativeWipeInternalData(id);
    } finally {
      REGISTRY.readLock().unlock();
    }
  }

  /** Frees the native decoder and its id. Closing again does nothing. */
  @Override
  public synchronized void close() {
    if (closed) return;
    closed = true;
    scratch = null;
    scratchShorts = null;
    REGISTRY.writeLock().lock();
    try {
      NativeDecoder.nativeRelease(id);
      IDS_IN_USE.clear(id);
    } finally {
      REGISTRY.writeLock().unlock();
    }
  }

  private void checkOpen() {
    if (closed) throw new IllegalStateException("TokenDecoder " + id + " is closed");
  }

  private void checkFrames(int samples) {
    if (samples % channels != 0) {
      throw new IllegalArgumentException(samples + " samples are not whole frames of " + channels + " channels");
    }
  }

  private void ensureScratch() {
    if (scratch != null) return;
    int samples = Math.max(channels, SCRATCH_SAMPLES / channels * channels);
    scratch = ByteBuffer.allocateDirect(2 * samples).order(ByteOrder.nativeOrder());
    scratchShorts = scratch.asShortBuffer();
  }

  /** Hands {@code bytes} from the start of a direct buffer to the library. */
  private void feed(ByteBuffer direct, int bytes) {
    REGISTRY.readLock().lock();
    try {
      if (hotsound) {
        NativeDecoder.nativeProcessSamplesWithHotsound(id, direct, 0, bytes);
      } else {
        NativeDecoder.nativeProcessSamples(id, direct, 0, bytes);
      }
    } finally {
      REGISTRY.readLock().unlock();
    }
  }

  /**
   * Collects the receiving side's settings; not thread safe. Defaults: 44100
   * Hz, one channel, no CRC, no hotsound. {@link #build()} checks them and
   * throws {@link IllegalArgumentException} naming the one that does not fit.
   */
  public static final class Builder {
    private final DsssSettings dsss;
    private final DtmfSettings dtmf;
    private float inputSampleRate = 44100f;
    private int channels = 1;
    private boolean crc;
    private boolean hotsound;

    private Builder(DsssSettings dsss, DtmfSettings dtmf) {
      this.dsss = dsss;
      this.dtmf = dtmf;
    }

    /** Rate of the audio fed in, 8000 to 192000 Hz (at least 40993 Hz with hotsound). */
    public Builder inputSampleRate(float hz) { inputSampleRate = hz; return this; }
    /** Interleaved channels, 1 to 8. */
    public Builder channels(int n) { channels = n; return this; }
    /** Tokens end in two CRC-16 bytes; only tokens that pass are returned. */
    public Builder crc(boolean v) { crc = v; return this; }
    /** DSSS only: decode only after the wake-up detector hears the carrier. */
    public Builder hotsound(boolean v) { hotsound = v; return this; }

    /** Checks the settings and sets up the native decoder. */
    public TokenDecoder build() {
      if (hotsound && dsss == null) {
        throw new IllegalArgumentException("hotsound works with DsssSettings only");
      }
      NativeSettings.require(dsss != null
          ? dsss.objection(crc, inputSampleRate, channels, hotsound)
          : dtmf.objection(crc, inputSampleRate, channels));
      return new TokenDecoder(this);
    }
  }

}
