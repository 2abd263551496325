package com.kestrova.sharefold.reliqaclassifier.models;

import com.kestrova.jni.HybridData;
import com.kestrova.keystash.PersistentKeyValueStore;
import com.kestrova.sharefold.reliqaclassifier.models.ReliqaClassifierResult.ReliqaClassifierResultWrapper;
import java.nio.charset.StandardCharsets;
import java.util.Objects;
import java.util.concurrent.locks.Lock;
import java.util.concurrent.locks.ReentrantReadWriteLock;

/**
 * Decides whether candidate collections are worth showing to the user.
 *
 * <p>A classifier keeps its model parameters (serialized model, model identifier, threshold) and
 * the server features in the {@link PersistentKeyValueStore} it was created over, so a classifier
 * created after a restart classifies with the last parameters received. Only the model itself is
 * held in memory: it is loaded when the classifier is created and again by each {@link
 * #setModelParams} that carries a model. Identifier, threshold and server features are read from
 * the store on every call.
 *
 * <p>Two classifiers over one store therefore share identifier, threshold and server features,
 * but each scores with the model that it loaded itself: after {@code a.setModelParams(...)} with
 * a new model, {@code b} reports the new identifier and compares with the new threshold while
 * still scoring with its old model. Create a new classifier to pick up a model set through another
 * one.
 *
 * <p>The classifier keeps its share of the native store, so it goes on working after the store
 * object is closed.
 *
 * <p>Thread-safety: every method may be called from any thread at any time; classifications run
 * in parallel, updates are serialised with them. {@link #close()} waits for calls in progress.
 */
public final class ReliqaClassifier implements AutoCloseable {
  static {
    NativeLibrary.load();
  }

  private final ReentrantReadWriteLock mLock = new ReentrantReadWriteLock();
  private ReliqaClassifierWrapper mWrapper; // null once closed

  /**
   * Creates a classifier over {@code store} and loads the model stored there, if any.
   *
   * @throws NullPointerException if {@code store} is null
   * @throws IllegalStateException if {@code store} is closed
   * @throws com.kestrova.jni.CppException if the stored model cannot be read
   */
  public ReliqaClassifier(PersistentKeyValueStore store) {
    Objects.requireNonNull(store, "store");
    synchronized (store) {
      if (store.isClosed()) {
        throw new IllegalStateException("PersistentKeyValueStore is closed");
      }
      mWrapper = new ReliqaClassifierWrapper(store);
    }
  }

  /**
   * Classifies one collection: computes its features, lets the stored server features override
   * them, scores them with the loaded model (1.0 without a model) and compares the score with the
   * stored threshold.
   *
   * @throws NullPointerException if {@code input} or anything it must hold is null; the message
   *     names it, for example {@code "ReliqaClassifierInput.assetDetails[3] is null"}
   * @throws com.kestrova.jni.CppException if the classification fails, for example because a
   *     feature value or the threshold is NaN or infinite
   * @throws OutOfMemoryError if the collection is so extreme that feature extraction gives up
   * @throws IllegalStateException if this classifier is closed
   */
  public ReliqaClassifierResult classify(ReliqaClassifierInput input) {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      return new ReliqaClassifierResult(open().classifyReliqa(input));
    } finally {
      lock.unlock();
    }
  }

  /**
   * Stores identifier and threshold and, when {@code params.mSerializedModel()} is not empty, the
   * model, which this classifier then loads and uses.
   *
   * @throws NullPointerException if {@code params} or one of its strings is null
   * @throws com.kestrova.jni.CppException if the model cannot be read; identifier, threshold and
   *     model are stored all the same, and this classifier keeps its previous model
   * @throws IllegalStateException if this classifier is closed
   */
  public void setModelParams(ReliqaClassifierModelParams params) {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      open().setModelParams(params);
    } finally {
      lock.unlock();
    }
  }

  /**
   * Replaces the stored server features as a whole. See {@link ReliqaClassifierServerFeatures}
   * for how keys and values are read.
   *
   * @throws NullPointerException if {@code features}, its map, or a key or value is null
   * @throws ClassCastException if a key or value is not a {@link String}
   * @throws IllegalStateException if this classifier is closed
   */
  public void setServerFeatures(ReliqaClassifierServerFeatures features) {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      open().setServerFeatures(features);
    } finally {
      lock.unlock();
    }
  }

  /**
   * The stored model identifier; empty when none has been stored.
   *
   * @throws IllegalStateException if this classifier is closed
   */
  public String currentlyUsedModelId() {
    Lock lock = mLock.readLock();
    lock.lock();
    try {
      return new String(open().currentlyUsedModelId(), StandardCharsets.UTF_8);
    } finally {
      lock.unlock();
    }
  }

  /**
   * Releases the native classifier once the calls in progress have returned. Results already
   * returned stay readable. Closing twice is harmless.
   */
  @Override
  public void close() {
    Lock lock = mLock.writeLock();
    lock.lock();
    try {
      if (mWrapper != null) {
        mWrapper.mHybridData.resetNative();
        mWrapper = null;
      }
    } finally {
      lock.unlock();
    }
  }

  private ReliqaClassifierWrapper open() {
    if (mWrapper == null) {
      throw new IllegalStateException("ReliqaClassifier is closed");
    }
    return mWrapper;
  }

  /** The Java face of the native classifier; its natives are registered when the library loads. */
  static final class ReliqaClassifierWrapper {
    static {
      NativeLibrary.load();
    }

    HybridData mHybridData;

    ReliqaClassifierWrapper(PersistentKeyValueStore store) {
      mHybridData = initHybrid(store);
    }

    static native HybridData initHybrid(PersistentKeyValueStore store);

    native byte[] currentlyUsedModelId();

    native void setModelParams(ReliqaClassifierModelParams params);

    native void setServerFeatures(ReliqaClassifierServerFeatures features);

    native ReliqaClassifierResultWrapper classifyReliqa(ReliqaClassifierInput input);
  }
}
