package com.kestrova.jni;

/**
 * Base of Java classes that hold their native peer themselves instead of through a {@link
 * HybridData} field. Native code creates such an object with its no-argument constructor and then
 * attaches the peer; the peer is destroyed by {@link #resetNative()} or once the object is
 * unreachable.
 */
public abstract class HybridClassBase {
  private final HybridData.Destructor mDestructor = new HybridData.Destructor();

  protected HybridClassBase() {
    HybridData.CLEANER.register(this, mDestructor);
  }

  /** Destroys the native peer now. Harmless when it is already gone. */
  protected final void resetNative() {
    mDestructor.destruct();
  }

  /** Whether a native peer is attached and not yet destroyed. */
  protected final boolean isNativeValid() {
    return mDestructor.isAttached();
  }
}
