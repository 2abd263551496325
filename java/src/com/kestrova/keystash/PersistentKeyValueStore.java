package com.kestrova.keystash;

import com.kestrova.jni.HybridData;
import java.util.Objects;

/**
 * A persistent store of byte values under string keys, kept in one database file.
 *
 * <p>Native components that are given this object take a share of the native store; they keep
 * using it after this object is closed. {@link #close()} only releases this object's share.
 *
 * <p>Thread-safety: all methods may be called from any thread. Code that hands this object to
 * native code synchronises on it and checks {@link #isClosed()} first; {@link #close()} takes the
 * same monitor, so it never releases the native store under such a call.
 */
public final class PersistentKeyValueStore implements AutoCloseable {
  static {
    System.loadLibrary("kestrova_host");
  }

  private final HybridData mHybridData;

  /**
   * Opens (creating if needed) the store kept in {@code databasePath}.
   *
   * @throws NullPointerException if {@code databasePath} is null
   * @throws com.kestrova.jni.CppException if the database cannot be opened or created
   */
  public PersistentKeyValueStore(String databasePath) {
    Objects.requireNonNull(databasePath, "databasePath");
    mHybridData = initHybrid(databasePath);
  }

  /** Whether {@link #close()} has been called. */
  public synchronized boolean isClosed() {
    return !mHybridData.isValid();
  }

  /** Releases this object's share of the native store. Closing twice is harmless. */
  @Override
  public synchronized void close() {
    mHybridData.resetNative();
  }

  private static native HybridData initHybrid(String databasePath);
}
