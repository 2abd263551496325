package com.kestrova.sharefold.reliqaclassifier.models;

import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.collection;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.describe;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.logistic;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.singleSplitModel;
import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrova.jni.CppException;
import com.kestrova.keystash.PersistentKeyValueStore;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** Classification end to end through the Java API, checked against the native classifier. */
class ClassifierTest {
  /** Feature 4 is the total asset count; the model splits it at 5. */
  static final String MODEL = singleSplitModel(4, 5.0, -2.0, 3.0);

  @TempDir Path dir;
  PersistentKeyValueStore store;
  ReliqaClassifier classifier;

  @BeforeEach
  void open() {
    store = new PersistentKeyValueStore(dir.resolve("store.db").toString());
    classifier = new ReliqaClassifier(store);
  }

  @AfterEach
  void close() {
    classifier.close();
    store.close();
  }

  private void assertSameAsNative(ReliqaClassifierInput input, ReliqaClassifierResult result) {
    assertEquals(NativeReference.classifyDirectly(store, input), describe(result));
  }

  @Test
  void withoutModelEverythingIsDefault() {
    ReliqaClassifierInput input = collection(3);
    try (ReliqaClassifierResult result = classifier.classify(input)) {
      assertEquals(1.0, result.getScore());
      assertTrue(result.isOverThreshold());
      assertEquals("1", result.getLoggingValue("score"));
      assertEquals("0", result.getLoggingValue("threshold"));
      assertEquals("", result.getLoggingValue("model_id"));
      assertTrue(result.getLoggingValue("feature_vector").contains("\"4\":3"));
      assertSameAsNative(input, result);
    }
    assertEquals("", classifier.currentlyUsedModelId());
  }

  @Test
  void modelThresholdAndServerFeaturesDecideTogether() {
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "model-1", 0.5));
    assertEquals("model-1", classifier.currentlyUsedModelId());
    ReliqaClassifierInput small = collection(3);
    try (ReliqaClassifierResult result = classifier.classify(small)) {
      assertEquals(logistic(-2.0), result.getScore(), 1e-6);
      assertFalse(result.isOverThreshold());
      assertEquals("model-1", result.getLoggingValue("model_id"));
      assertEquals("0.5", result.getLoggingValue("threshold"));
      assertSameAsNative(small, result);
    }
    // A server feature replaces the computed feature of the same id.
    classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of("4", "9", "900", "1.5")));
    try (ReliqaClassifierResult result = classifier.classify(small)) {
      assertEquals(logistic(3.0), result.getScore(), 1e-6);
      assertTrue(result.isOverThreshold());
      String vector = result.getLoggingValue("feature_vector");
      assertTrue(vector.contains("\"4\":9") && vector.contains("\"900\":1.5"), vector);
      assertSameAsNative(small, result);
    }
    // Server features are replaced as a whole.
    classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of()));
    try (ReliqaClassifierResult result = classifier.classify(small)) {
      assertEquals(logistic(-2.0), result.getScore(), 1e-6);
      assertFalse(result.getLoggingValue("feature_vector").contains("\"900\""));
    }
  }

  @Test
  void emptyModelTextKeepsTheModelAndUpdatesIdAndThreshold() {
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "model-1", 0.5));
    classifier.setModelParams(new ReliqaClassifierModelParams("", "model-2", 0.99));
    try (ReliqaClassifierResult result = classifier.classify(collection(9))) {
      assertEquals(logistic(3.0), result.getScore(), 1e-6);
      assertFalse(result.isOverThreshold());
      assertEquals("model-2", result.getLoggingValue("model_id"));
      assertEquals("0.99", result.getLoggingValue("threshold"));
    }
  }

  @Test
  void loggingDataIsReadByKeyByteForByte() {
    String id = "modèle-😀-\u0000-end";
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, id, 0.25));
    assertArrayEquals(id.getBytes(StandardCharsets.UTF_8),
        classifier.currentlyUsedModelId().getBytes(StandardCharsets.UTF_8));
    try (ReliqaClassifierResult result = classifier.classify(collection(3))) {
      byte[][] keys = Fixtures.wrapperOf(result).getAllKeysFromLoggingData();
      List<String> names = new ArrayList<>();
      for (byte[] key : keys) {
        names.add(new String(key, StandardCharsets.UTF_8));
      }
      assertEquals(List.of("score", "model_id", "feature_vector", "threshold"), names);
      Map<String, String> data = result.getLoggingData();
      assertEquals(names, List.copyOf(data.keySet()));
      for (String name : names) {
        assertEquals(data.get(name), result.getLoggingValue(name));
      }
      assertArrayEquals(id.getBytes(StandardCharsets.UTF_8),
          Fixtures.wrapperOf(result).getValueFromLoggingDataWithKey("model_id"));
      assertEquals(data, result.getLoggingData());
      assertEquals(result.getScore(), result.getScore());

      IndexOutOfBoundsException missing = assertThrows(IndexOutOfBoundsException.class,
          () -> result.getLoggingValue("Score"));
      assertEquals("_Map_base::at", missing.getMessage());
      assertEquals("logging data key is null",
          assertThrows(NullPointerException.class, () -> result.getLoggingValue(null))
              .getMessage());
      assertThrows(UnsupportedOperationException.class, () -> data.put("x", "y"));
    }
  }

  @Test
  void badValuesFailAsJavaExceptionsAndLeaveTheClassifierUsable() {
    ReliqaClassifierInput base = collection(3);
    AssetDetail a = base.assetDetails()[0];
    AssetDetail nan = new AssetDetail(a.assetID(), a.assetType(), a.creationDateSinceEpoch(),
        a.modificationDateSinceEpoch(), a.pixelWidth(), a.pixelHeight(), Double.NaN,
        a.longitude(), a.videoDuration(), 0, 0, 0, 0, a.blurrinessMetric(), a.darknessMetric());
    ReliqaClassifierInput bad = new ReliqaClassifierInput("bad", 0, null, null,
        new AssetDetail[] {nan}, new DuplicateInfo[0]);
    assertThrows(CppException.class, () -> classifier.classify(bad));

    assertThrows(NullPointerException.class, () -> classifier.classify(null));
    assertEquals("ReliqaClassifierModelParams.mModelId is null", assertThrows(
        NullPointerException.class,
        () -> classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, null, 1)))
        .getMessage());
    assertEquals("ReliqaClassifierModelParams is null", assertThrows(
        NullPointerException.class, () -> classifier.setModelParams(null)).getMessage());
    assertEquals("", classifier.currentlyUsedModelId());  // nothing was stored

    try (ReliqaClassifierResult result = classifier.classify(base)) {
      assertEquals(1.0, result.getScore());
    }
  }

  @Test
  void resultsOutliveTheirClassifier() {
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "m", 0.5));
    ReliqaClassifierResult result = classifier.classify(collection(9));
    Map<String, String> before = result.getLoggingData();
    classifier.close();
    assertEquals(before, result.getLoggingData());
    assertEquals(logistic(3.0), result.getScore(), 1e-6);
    assertTrue(result.isOverThreshold());
    result.close();
  }

  @Test
  void closedObjectsRefuseEveryCallAndCloseTwiceIsHarmless() {
    ReliqaClassifierResult result = classifier.classify(collection(3));
    result.close();
    result.close();
    assertThrows(IllegalStateException.class, result::getScore);
    assertThrows(IllegalStateException.class, result::isOverThreshold);
    assertThrows(IllegalStateException.class, result::getLoggingData);
    assertThrows(IllegalStateException.class, () -> result.getLoggingValue("score"));

    classifier.close();
    classifier.close();
    assertThrows(IllegalStateException.class, () -> classifier.classify(collection(3)));
    assertThrows(IllegalStateException.class, classifier::currentlyUsedModelId);
    assertThrows(IllegalStateException.class,
        () -> classifier.setModelParams(new ReliqaClassifierModelParams("", "x", 0)));
    assertThrows(IllegalStateException.class,
        () -> classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of())));
  }

  @Test
  void classifiersOverOneStoreShareParametersButEachKeepsItsOwnModel() {
    try (ReliqaClassifier other = new ReliqaClassifier(store)) {
      classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "shared", 0.5));
      classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of("77", "1")));
      assertEquals("shared", other.currentlyUsedModelId());
      try (ReliqaClassifierResult result = other.classify(collection(3))) {
        assertEquals(1.0, result.getScore());  // no model loaded by `other`
        assertEquals("0.5", result.getLoggingValue("threshold"));
        assertTrue(result.getLoggingValue("feature_vector").contains("\"77\":1"));
      }
      try (ReliqaClassifier late = new ReliqaClassifier(store);
          ReliqaClassifierResult result = late.classify(collection(3))) {
        assertEquals(logistic(-2.0), result.getScore(), 1e-6);
      }
    }
  }

  @Test
  void aClassifierKeepsWorkingAfterItsStoreIsClosed() {
    store.close();
    assertTrue(store.isClosed());
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "after-close", 0.5));
    try (ReliqaClassifierResult result = classifier.classify(collection(9))) {
      assertEquals("after-close", result.getLoggingValue("model_id"));
    }
    assertThrows(IllegalStateException.class, () -> new ReliqaClassifier(store));
    assertThrows(NullPointerException.class, () -> new ReliqaClassifier(null));
  }

  @Test
  void tenThousandAssetsInOneCall() {
    // -Xcheck:jni reports any local references that pile up per asset.
    ReliqaClassifierInput input = Fixtures.manyAssets(10_000);
    classifier.setModelParams(new ReliqaClassifierModelParams(MODEL, "big", 0.5));
    try (ReliqaClassifierResult result = classifier.classify(input)) {
      assertEquals(logistic(3.0), result.getScore(), 1e-6);
      assertSameAsNative(input, result);
    }
  }
}
