package com.kestrova.sharefold.reliqaclassifier.models;

import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.collection;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.logistic;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.singleSplitModel;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrova.keystash.PersistentKeyValueStore;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import java.util.concurrent.CountDownLatch;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.Future;
import java.util.concurrent.atomic.AtomicBoolean;
import java.util.concurrent.atomic.AtomicInteger;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** Classifications from many threads, with updates and closing in between. */
class ConcurrencyTest {
  @TempDir Path dir;

  /** Two parameter sets; each result must come entirely from one of them. */
  private static final ReliqaClassifierModelParams A =
      new ReliqaClassifierModelParams(singleSplitModel(4, 5.0, -2.0, 3.0), "a", 0.25);
  private static final ReliqaClassifierModelParams B =
      new ReliqaClassifierModelParams(singleSplitModel(4, 5.0, 1.0, -1.0), "b", 0.75);

  @Test
  void classificationsSeeWholeUpdatesOnly() throws Exception {
    ExecutorService pool = Executors.newFixedThreadPool(5);
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString());
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      classifier.setModelParams(A);
      AtomicBoolean done = new AtomicBoolean();
      Future<Integer> updater = pool.submit(() -> {
        int updates = 0;
        while (!done.get()) {
          classifier.setModelParams(updates % 2 == 0 ? B : A);
          classifier.setServerFeatures(new ReliqaClassifierServerFeatures(
              Map.of("100", Integer.toString(updates))));
          updates++;
        }
        return updates;
      });
      List<Future<Void>> workers = new ArrayList<>();
      for (int t = 0; t < 4; t++) {
        workers.add(pool.submit(() -> {
          for (int i = 0; i < 300; i++) {
            try (ReliqaClassifierResult r = classifier.classify(collection(3))) {
              String id = r.getLoggingValue("model_id");
              double expected = id.equals("a") ? logistic(-2.0) : logistic(1.0);
              assertEquals(id.equals("a") ? "0.25" : "0.75", r.getLoggingValue("threshold"));
              assertEquals(expected, r.getScore(), 1e-6, id);
              assertEquals(r.getScore() > (id.equals("a") ? 0.25 : 0.75), r.isOverThreshold());
            }
          }
          return null;
        }));
      }
      for (Future<Void> worker : workers) {
        worker.get();
      }
      done.set(true);
      assertTrue(updater.get() > 0);
    } finally {
      pool.shutdownNow();
    }
  }

  @Test
  void closeWaitsForCallsInProgressAndLaterCallsAreRefused() throws Exception {
    ExecutorService pool = Executors.newFixedThreadPool(4);
    ReliqaClassifierInput big = Fixtures.manyAssets(2_000);
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("s").toString())) {
      for (int round = 0; round < 5; round++) {
        ReliqaClassifier classifier = new ReliqaClassifier(store);
        CountDownLatch started = new CountDownLatch(4);
        AtomicInteger completed = new AtomicInteger();
        List<Future<Void>> workers = new ArrayList<>();
        for (int t = 0; t < 4; t++) {
          workers.add(pool.submit(() -> {
            started.countDown();
            try {
              while (true) {
                try (ReliqaClassifierResult r = classifier.classify(big)) {
                  assertEquals(1.0, r.getScore());
                  completed.incrementAndGet();
                }
              }
            } catch (IllegalStateException closed) {
              return null;
            }
          }));
        }
        started.await();
        classifier.close();
        for (Future<Void> worker : workers) {
          worker.get();
        }
      }
    } finally {
      pool.shutdownNow();
    }
  }
}
