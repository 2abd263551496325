package com.kestrova.sharefold.reliqaclassifier.models;

import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.collection;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.logistic;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrova.keystash.PersistentKeyValueStore;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.Map;
import java.util.concurrent.TimeUnit;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** Parameters pushed in one JVM process are used by a classifier in the next one. */
class PersistenceTest {
  @TempDir Path dir;

  /** Entry point of the writing process: stores parameters and server features, then exits. */
  public static void main(String[] args) {
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(args[0]);
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      classifier.setModelParams(new ReliqaClassifierModelParams(ClassifierTest.MODEL,
          "from-another-process", 0.6));
      classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of("4", "9")));
    }
  }

  @Test
  void parametersSurviveTheProcess() throws Exception {
    String database = dir.resolve("store.db").toString();
    Process writer = Fixtures.startJvm(PersistenceTest.class, database);
    assertTrue(writer.waitFor(120, TimeUnit.SECONDS), "writer process hung");
    String output = new String(writer.getInputStream().readAllBytes(), StandardCharsets.UTF_8);
    // The writer's output reaches the test log so that JNI warnings there are seen too.
    System.out.print(output);
    assertEquals(0, writer.exitValue(), output);

    try (PersistentKeyValueStore store = new PersistentKeyValueStore(database);
        ReliqaClassifier classifier = new ReliqaClassifier(store);
        ReliqaClassifierResult result = classifier.classify(collection(3))) {
      assertEquals("from-another-process", classifier.currentlyUsedModelId());
      assertEquals("0.6", result.getLoggingValue("threshold"));
      assertEquals(logistic(3.0), result.getScore(), 1e-6);  // the stored server feature 4 = 9
      assertTrue(result.isOverThreshold());
    }
  }

  /** A store that fails is logged and read as empty, from whichever library its failures come. */
  @Test
  void storeFailuresNeverReachTheCaller() {
    try (PersistentKeyValueStore store = NativeReference.failingStore();
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      classifier.setModelParams(new ReliqaClassifierModelParams(ClassifierTest.MODEL, "lost", 0.6));
      classifier.setServerFeatures(new ReliqaClassifierServerFeatures(Map.of("4", "9")));
      assertEquals("", classifier.currentlyUsedModelId());
      try (ReliqaClassifierResult result = classifier.classify(collection(3))) {
        assertEquals(1.0, result.getScore());  // no model could be read back
        assertEquals("", result.getLoggingValue("model_id"));
        assertEquals("0", result.getLoggingValue("threshold"));
      }
    }
  }
}
