package com.tessal.android.orv.audiomodem;

import java.util.ArrayList;
import java.util.List;

/** Collects the tokens one {@link NativeDecoder#nativeGetTokens} call delivers. */
public final class TokenResults {
  public final List<byte[]> tokens = new ArrayList<>();

  /** Called by the native decoder once per token. */
  public void addToken(byte[] token) {
    tokens.add(token);
  }
}
