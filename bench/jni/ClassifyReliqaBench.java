package com.kestrova.sharefold.reliqaclassifier.models;

import com.kestrova.keystash.PersistentKeyValueStore;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.LinkedHashSet;
import java.util.Set;

/**
 * What one classification costs a phone's app: {@code classify} of the example collection through
 * the Java API (reading the object graph, classifying, making and closing the result wrapper, one
 * value read back), beside the native classification of the same input in the same process, and
 * the native reading of the input alone.
 *
 * <p>Usage: {@code java -Djava.library.path=LIBS -cp JARS ...ClassifyReliqaBench MODEL_TEXT}
 *
 * <p>Each figure is the median of {@value #ROUNDS} rounds of {@value #CALLS} calls, after as many
 * calls of warm-up, over the SQLite store in a temporary directory.
 */
final class ClassifyReliqaBench {
  private static final int ROUNDS = 7;
  private static final int CALLS = 20_000;

  private ClassifyReliqaBench() {}

  interface Round {
    /** Runs {@link #CALLS} calls and returns the nanoseconds they took. */
    long run();
  }

  private static double medianMicros(Round round) {
    round.run();  // warm-up
    double[] perCall = new double[ROUNDS];
    for (int i = 0; i < ROUNDS; i++) {
      perCall[i] = round.run() / 1000.0 / CALLS;
    }
    Arrays.sort(perCall);
    return perCall[ROUNDS / 2];
  }

  private static String cpuFlags() throws IOException {
    Set<String> wanted = Set.of("avx512f", "avx2", "fma", "sse4_2", "bmi2", "asimd", "neon");
    Set<String> found = new LinkedHashSet<>();
    for (String line : Files.readAllLines(Path.of("/proc/cpuinfo"))) {
      if (line.startsWith("flags") || line.startsWith("Features")) {
        for (String flag : line.substring(line.indexOf(':') + 1).trim().split("\\s+")) {
          if (wanted.contains(flag)) {
            found.add(flag);
          }
        }
        break;
      }
    }
    return found.isEmpty() ? "none of " + wanted : String.join(" ", found);
  }

  public static void main(String[] args) throws Exception {
    if (args.length != 1) {
      System.err.println("usage: ClassifyReliqaBench MODEL_TEXT");
      System.exit(2);
    }
    String model = Files.readString(Path.of(args[0]));
    Path dir = Files.createTempDirectory("reliqa-bench");
    ReliqaClassifierInput input = ExampleCollection.input();
    try (PersistentKeyValueStore store = new PersistentKeyValueStore(dir.resolve("store.db").toString());
        ReliqaClassifier classifier = new ReliqaClassifier(store)) {
      classifier.setModelParams(new ReliqaClassifierModelParams(model, "example-synthetic-v1", 0.5));
      double[] sink = new double[1];
      double throughJni = medianMicros(() -> {
        long start = System.nanoTime();
        for (int i = 0; i < CALLS; i++) {
          try (ReliqaClassifierResult result = classifier.classify(input)) {
            sink[0] += result.getScore();
          }
        }
        return System.nanoTime() - start;
      });
      double nativeClassify = medianMicros(() -> NativeReference.classifyNatively(store, input, CALLS));
      double nativeRead = medianMicros(() -> NativeReference.readNatively(input, CALLS));

      System.out.println("CPU flags: " + cpuFlags());
      System.out.println("Java: " + System.getProperty("java.vm.name") + " "
          + System.getProperty("java.vm.version") + " (" + System.getProperty("os.arch") + ")");
      System.out.println("Libraries: " + System.getProperty("java.library.path"));
      System.out.printf("Example collection: %d assets, %d duplicate pairs, score %s%n",
          input.assetDetails().length, input.duplicateInfos().length, sink[0] / ((ROUNDS + 1) * CALLS));
      System.out.println();
      System.out.println("| Per call (median of " + ROUNDS + " x " + CALLS + " calls) | µs |");
      System.out.println("|---|---:|");
      System.out.printf("| classify through JNI (Java API, result wrapper closed) | %.2f |%n", throughJni);
      System.out.printf("| native classify of the same record | %.2f |%n", nativeClassify);
      System.out.printf("| native reading of the input object graph | %.2f |%n", nativeRead);
      System.out.printf("| JNI's share: the first less the second | %.2f |%n", throughJni - nativeClassify);
    } finally {
      try (var files = Files.walk(dir)) {
        files.sorted((a, b) -> b.getNameCount() - a.getNameCount()).forEach(p -> p.toFile().delete());
      }
    }
  }
}
