package com.kestrova.jni;

import java.lang.ref.Cleaner;

/**
 * Owner of a native peer object.
 *
 * <p>Native code creates a {@code HybridData}, attaches a peer to it and hands it to the Java
 * object that the peer belongs to, which keeps it in a field named {@code mHybridData}. The peer
 * is destroyed exactly once: by {@link #resetNative()}, or when the {@code HybridData} becomes
 * unreachable. After that, native methods of the owning object throw {@link
 * NullPointerException}.
 *
 * <p>{@link #resetNative()} does not wait for native calls that are running on the peer; classes
 * that offer {@code close()} guard their native calls with a lock of their own.
 */
public final class HybridData {
  static final Cleaner CLEANER = Cleaner.create();

  private final Destructor mDestructor = new Destructor();

  public HybridData() {
    CLEANER.register(this, mDestructor);
  }

  /** Destroys the native peer now. Harmless when it is already gone. */
  public void resetNative() {
    mDestructor.destruct();
  }

  /** Whether a native peer is attached and not yet destroyed. */
  public boolean isValid() {
    return mDestructor.isAttached();
  }

  /**
   * Holds the address of the native peer and destroys the peer once. Kept apart from its owner so
   * that the cleaner can run it after the owner has become unreachable.
   */
  static final class Destructor implements Runnable {
    static {
      System.loadLibrary("kestrova_host");
    }

    /** Address of the native peer; 0 when none. Written by native code. */
    private volatile long mNativePointer;

    Destructor() {}

    @Override
    public void run() {
      destruct();
    }

    void destruct() {
      long pointer;
      synchronized (this) {
        pointer = mNativePointer;
        mNativePointer = 0;
      }
      if (pointer != 0) {
        deleteNative(pointer);
      }
    }

    boolean isAttached() {
      return mNativePointer != 0;
    }

    private static native void deleteNative(long nativePointer);
  }
}
