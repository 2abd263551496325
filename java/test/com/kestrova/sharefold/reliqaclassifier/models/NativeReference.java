package com.kestrova.sharefold.reliqaclassifier.models;

import com.kestrova.keystash.PersistentKeyValueStore;

/**
 * The native side's own view of what the binding reads and computes, as canonical text (see
 * {@link Fixtures#describe}): doubles are written as the decimal value of their bit pattern.
 */
final class NativeReference {
  static {
    NativeLibrary.load();
    System.loadLibrary("reliqa_jni_testsupport");
  }

  private NativeReference() {}

  /** The width of the native time_t in bits: 32 on 32-bit ARM, 64 elsewhere. */
  static native int timeBits();

  /** The native record that the binding's input reader makes of {@code input}. */
  static native String describeInput(ReliqaClassifierInput input);

  /** The native feature map made of {@code features}: one "id=bits" line per id, ascending. */
  static native String describeServerFeatures(ReliqaClassifierServerFeatures features);

  /**
   * Classifies {@code input} with a new native classifier over {@code store}'s native store,
   * without the managed wrappers: "score=bits", "over=0|1", then "key=value" per logging entry,
   * keys ascending.
   */
  static native String classifyDirectly(PersistentKeyValueStore store, ReliqaClassifierInput input);

  /**
   * Runs the host layer's initializer with a registration callback that fails; the initializer's
   * failure (the VM's NoSuchMethodError) is thrown from here.
   */
  static native void initializeWithFailingRegistration();

  /** Attaches a second peer to a holder that has one: the process aborts. */
  static native void attachTwice();

  /**
   * A store whose every fetch and store fails. Its native code lives in the test-support library,
   * so its failures reach the classifier library from another copy of the C++ runtime.
   */
  static native PersistentKeyValueStore failingStore();

  /**
   * For the JVM benchmark: reads {@code input} once, classifies the native record {@code
   * iterations} times with a new native classifier over {@code store}, and returns the nanoseconds
   * the native loop took.
   */
  static native long classifyNatively(
      PersistentKeyValueStore store, ReliqaClassifierInput input, int iterations);

  /** For the JVM benchmark: reads {@code input} natively {@code iterations} times; nanoseconds. */
  static native long readNatively(ReliqaClassifierInput input, int iterations);
}
