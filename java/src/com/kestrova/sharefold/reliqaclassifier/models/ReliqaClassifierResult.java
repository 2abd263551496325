package com.kestrova.sharefold.reliqaclassifier.models;

import com.kestrova.jni.HybridClassBase;
import java.nio.charset.StandardCharsets;
import java.util.Collections;
import java.util.LinkedHashMap;
import java.util.Map;
import java.util.concurrent.locks.Lock;
import java.util.concurrent.locks.ReentrantReadWriteLock;

/**
 * The outcome of one classification: the score, the verdict and the logging data ({@code
 * "score"}, {@code "model_id"}, {@code "feature_vector"}, {@code "threshold"}).
 *
 * <p>A result never changes and does not depend on the classifier that produced it, which may be
 * closed before the result is read. Logging values are UTF-8 text.
 *
 * <p>Thread-safety: every method may be called from any thread; {@link #close()} waits for calls
 * in progress.
 */
public final class ReliqaClassifierResult implements AutoCloseable {
  private final ReentrantReadWriteLock mLock = new ReentrantReadWriteLock();
  private ReliqaClassifierResultWrapper mWrapper; // null once closed

  ReliqaClassifierResult(ReliqaClassifierResultWrapper wrapper) {
    mWrapper = wrapper;
  }

  /**
   * The model's probability, or 1.0 when no model was loaded.
   *
   * @throws IllegalStateException if this result is closed
   */
  public double getScore() {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      return open().getScore();
    } finally {
      lock.unlock();
    }
  }

  /**
   * Whether the score is strictly greater than the threshold.
   *
   * @throws IllegalStateException if this result is closed
   */
  public boolean isOverThreshold() {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      return open().getIsOverThreshold();
    } finally {
      lock.unlock();
    }
  }

  /**
   * The logging value stored under {@code key} (an exact, case-sensitive match).
   *
   * @throws IndexOutOfBoundsException if there is no such key
   * @throws NullPointerException if {@code key} is null
   * @throws IllegalStateException if this result is closed
   */
  public String getLoggingValue(String key) {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      return decode(open().getValueFromLoggingDataWithKey(key));
    } finally {
      lock.unlock();
    }
  }

  /**
   * Every logging value, as an unmodifiable map in the order in which the native side lists its
   * keys: score, model_id, feature_vector, threshold.
   *
   * @throws IllegalStateException if this result is closed
   */
  public Map<String, String> getLoggingData() {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      ReliqaClassifierResultWrapper wrapper = open();
      Map<String, String> data = new LinkedHashMap<>();
      for (byte[] key : wrapper.getAllKeysFromLoggingData()) {
        String text = decode(key);
        data.put(text, decode(wrapper.getValueFromLoggingDataWithKey(text)));
      }
      return Collections.unmodifiableMap(data);
    } finally {
      lock.unlock();
    }
  }

  /** Releases the native result once calls in progress have returned. Closing twice is harmless. */
  @Override
  public void close() {
    Lock lock = mLock.writeLock();
    lock.lock();
    try {
      if (mWrapper != null) {
        mWrapper.destroy();
        mWrapper = null;
      }
    } finally {
      lock.unlock();
    }
  }

  private ReliqaClassifierResultWrapper open() {
    if (mWrapper == null) {
      throw new IllegalStateException("ReliqaClassifierResult is closed");
    }
    return mWrapper;
  }

  private static String decode(byte[] bytes) {
    return new String(bytes, StandardCharsets.UTF_8);
  }

  /**
   * The Java face of one native result. Created by native code through its no-argument
   * constructor; its natives are registered when the library loads.
   */
  static final class ReliqaClassifierResultWrapper extends HybridClassBase {
    static {
      NativeLibrary.load();
    }

    ReliqaClassifierResultWrapper() {}

    void destroy() {
      resetNative();
    }

    native double getScore();

    native byte[] getValueFromLoggingDataWithKey(String key);

    native byte[][] getAllKeysFromLoggingData();

    native boolean getIsOverThreshold();
  }
}
