package com.kestrova.sharefold.reliqaclassifier.models;

import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.collection;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.wrapperOf;
import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertNotEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrova.keystash.PersistentKeyValueStore;
import java.lang.reflect.Method;
import java.lang.reflect.Modifier;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.Map;
import java.util.Set;
import java.util.TreeSet;
import java.util.concurrent.TimeUnit;
import java.util.stream.Collectors;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.function.Executable;
import org.junit.jupiter.api.io.TempDir;

/** Registration of the natives and how they find (or miss) their native peers. */
class PeerTest {
  @TempDir Path dir;

  private static String descriptor(Class<?> type) {
    if (type == void.class) {
      return "V";
    } else if (type == double.class) {
      return "D";
    } else if (type == boolean.class) {
      return "Z";
    } else if (type == byte.class) {
      return "B";
    } else if (type.isArray()) {
      return "[" + descriptor(type.getComponentType());
    }
    return "L" + type.getName().replace('.', '/') + ";";
  }

  private static Set<String> natives(Class<?> cls) {
    return Arrays.stream(cls.getDeclaredMethods())
        .filter(m -> Modifier.isNative(m.getModifiers()))
        .map(m -> m.getName() + Arrays.stream(m.getParameterTypes()).map(PeerTest::descriptor)
            .collect(Collectors.joining("", "(", ")")) + descriptor(m.getReturnType()))
        .collect(Collectors.toCollection(TreeSet::new));
  }

  @Test
  void theWrappersDeclareExactlyTheRegisteredNatives() throws Exception {
    assertEquals(new TreeSet<>(Set.of(
        "initHybrid(Lcom/kestrova/keystash/PersistentKeyValueStore;)Lcom/kestrova/jni/HybridData;",
        "currentlyUsedModelId()[B",
        "setModelParams(Lcom/kestrova/sharefold/reliqaclassifier/models/"
            + "ReliqaClassifierModelParams;)V",
        "setServerFeatures(Lcom/kestrova/sharefold/reliqaclassifier/models/"
            + "ReliqaClassifierServerFeatures;)V",
        "classifyReliqa(Lcom/kestrova/sharefold/reliqaclassifier/models/ReliqaClassifierInput;)"
            + "Lcom/kestrova/sharefold/reliqaclassifier/models/"
            + "ReliqaClassifierResult$ReliqaClassifierResultWrapper;")),
        natives(ReliqaClassifier.ReliqaClassifierWrapper.class));
    assertEquals(new TreeSet<>(Set.of("getScore()D", "getValueFromLoggingDataWithKey("
            + "Ljava/lang/String;)[B", "getAllKeysFromLoggingData()[[B", "getIsOverThreshold()Z")),
        natives(ReliqaClassifierResult.ReliqaClassifierResultWrapper.class));
    // Each of the nine is bound: calling it reaches native code rather than failing to link.
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString());
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      var wrapper = wrapperOf(classifier);
      assertArrayEquals(new byte[0], wrapper.currentlyUsedModelId());
      wrapper.setModelParams(new ReliqaClassifierModelParams("", "id", 0.5));
      wrapper.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of()));
      var result = wrapper.classifyReliqa(collection(3));
      assertEquals(1.0, result.getScore());
      assertEquals(true, result.getIsOverThreshold());
      assertEquals(4, result.getAllKeysFromLoggingData().length);
      assertArrayEquals("id".getBytes(), result.getValueFromLoggingDataWithKey("model_id"));
      Method init = ReliqaClassifier.ReliqaClassifierWrapper.class
          .getDeclaredMethod("initHybrid", PersistentKeyValueStore.class);
      init.setAccessible(true);
      com.kestrova.jni.HybridData data = (com.kestrova.jni.HybridData) init.invoke(null, store);
      assertEquals(true, data.isValid());
      data.resetNative();
      assertEquals(false, data.isValid());
    }
  }

  private static long nativePointer(Object destructor) throws Exception {
    java.lang.reflect.Field field = destructor.getClass().getDeclaredField("mNativePointer");
    field.setAccessible(true);
    return field.getLong(destructor);
  }

  @Test
  void peersOfUnreachableObjectsAreDestroyedByTheCleaner() throws Exception {
    Object classifierDestructor;
    Object resultDestructor;
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString())) {
      ReliqaClassifier classifier = new ReliqaClassifier(store);
      ReliqaClassifierResult result = classifier.classify(collection(3));
      classifierDestructor = Fixtures.field(wrapperOf(classifier).mHybridData, "mDestructor");
      java.lang.reflect.Field field =
          com.kestrova.jni.HybridClassBase.class.getDeclaredField("mDestructor");
      field.setAccessible(true);
      resultDestructor = field.get(wrapperOf(result));
      assertEquals(true, nativePointer(classifierDestructor) != 0);
      assertEquals(true, nativePointer(resultDestructor) != 0);
      classifier = null;
      result = null;
    }
    long deadline = System.nanoTime() + 30_000_000_000L;
    while ((nativePointer(classifierDestructor) != 0 || nativePointer(resultDestructor) != 0)
        && System.nanoTime() < deadline) {
      System.gc();
      Thread.sleep(10);
    }
    assertEquals(0, nativePointer(classifierDestructor));
    assertEquals(0, nativePointer(resultDestructor));
  }

  /** Entry point of the child process of the next test. */
  public static void main(String[] args) {
    NativeReference.attachTwice();
  }

  @Test
  void attachingASecondPeerToAHolderAbortsTheProcess() throws Exception {
    Process child = Fixtures.startJvm(PeerTest.class);
    String output = new String(child.getInputStream().readAllBytes(), StandardCharsets.UTF_8);
    assertTrue(child.waitFor(120, TimeUnit.SECONDS), "child process hung");
    System.out.print(output);  // JNI warnings of the child reach the test log
    assertNotEquals(0, child.exitValue(), output);
    assertTrue(output.matches("(?s).*Fatal error \\([^)]*:\\d+\\): "
        + "Attempt to set C\\+\\+ native pointer twice.*"), output);
  }

  @Test
  void aFailingRegistrationFailsTheLoadWithTheVmsError() {
    assertThrows(NoSuchMethodError.class, NativeReference::initializeWithFailingRegistration);
  }

  private static void assertNoPeer(Executable call) {
    NullPointerException e = assertThrows(NullPointerException.class, call);
    assertEquals("java.lang.NullPointerException", e.getMessage());
  }

  @Test
  void aWrapperWithoutPeerThrowsNullPointerException() {
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString());
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      var wrapper = wrapperOf(classifier);
      var result = wrapper.classifyReliqa(collection(3));

      // A destroyed peer: the pointer is zero. The peer is looked up before the argument is
      // read, so even a null argument reports the missing peer.
      wrapper.mHybridData.resetNative();
      assertNoPeer(wrapper::currentlyUsedModelId);
      assertNoPeer(() -> wrapper.setModelParams(null));
      assertNoPeer(() -> wrapper.setServerFeatures(null));
      assertNoPeer(() -> wrapper.classifyReliqa(null));

      // No holder at all.
      var holder = wrapper.mHybridData;
      wrapper.mHybridData = null;
      assertNoPeer(wrapper::currentlyUsedModelId);
      assertNoPeer(() -> wrapper.classifyReliqa(collection(3)));
      wrapper.mHybridData = holder;

      result.destroy();
      result.destroy();
      assertNoPeer(result::getScore);
      assertNoPeer(result::getIsOverThreshold);
      assertNoPeer(result::getAllKeysFromLoggingData);
      assertNoPeer(() -> result.getValueFromLoggingDataWithKey("score"));
      // The key is converted before the peer is looked up.
      assertEquals("logging data key is null", assertThrows(NullPointerException.class,
          () -> result.getValueFromLoggingDataWithKey(null)).getMessage());
    }
  }

  @Test
  void initHybridRejectsAMissingOrClosedStore() throws Exception {
    Method init = ReliqaClassifier.ReliqaClassifierWrapper.class
        .getDeclaredMethod("initHybrid", PersistentKeyValueStore.class);
    init.setAccessible(true);
    Executable withNull = () -> {
      try {
        init.invoke(null, (Object) null);
      } catch (java.lang.reflect.InvocationTargetException e) {
        throw e.getCause();
      }
    };
    assertEquals("PersistentKeyValueStore is null",
        assertThrows(NullPointerException.class, withNull).getMessage());

    PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString());
    store.close();
    assertNoPeer(() -> {
      try {
        init.invoke(null, store);
      } catch (java.lang.reflect.InvocationTargetException e) {
        throw e.getCause();
      }
    });
  }
}
