package com.kestrova.sharefold.reliqaclassifier.models;

import java.nio.ByteBuffer;
import java.nio.ByteOrder;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.Base64;
import java.util.List;
import java.util.Map;
import java.util.TreeMap;

/** Inputs, models and canonical renderings shared by the tests. */
final class Fixtures {
  private Fixtures() {}

  /**
   * Starts a JVM like this one (same libraries, classes and JNI checks) running {@code mainClass},
   * with its output and errors merged. Under an emulator, which runs one program and not the
   * programs it starts, the system property {@code reliqa.emulator} names the command that runs a
   * program of this ABI, and the child is started through it.
   */
  static Process startJvm(Class<?> mainClass, String... args) throws java.io.IOException {
    List<String> command = new ArrayList<>();
    String emulator = System.getProperty("reliqa.emulator", "");
    if (!emulator.isEmpty()) {
      command.add(emulator);
    }
    command.add(java.nio.file.Path.of(System.getProperty("java.home"), "bin", "java").toString());
    command.addAll(List.of("-Xcheck:jni",
        "-Djava.library.path=" + System.getProperty("java.library.path"),
        "-cp", System.getProperty("java.class.path"),
        mainClass.getName()));
    command.addAll(List.of(args));
    return new ProcessBuilder(command).redirectErrorStream(true).start();
  }

  static OptionalImageMetricValue metric(boolean calculated, double value) {
    return new OptionalImageMetricValue(calculated, value);
  }

  static AssetDetail asset(String id, long created, long modified) {
    return new AssetDetail(id, "photo", created, modified, 4032, 3024, 48.85, 2.35, 0, 0, 0, 0, 1,
        metric(true, 0.25), metric(false, 7.5));
  }

  static AssetCounts counts(int totalAssets) {
    return new AssetCounts(1, totalAssets, 3, 4, 5, 6, 7, 8, 9, 10);
  }

  /** A small, ordinary collection with {@code totalAssets} as its total asset count. */
  static ReliqaClassifierInput collection(int totalAssets) {
    AssetDetail[] assets = {
      asset("a1", 1_600_000_000L, -1),
      asset("a2", 1_600_003_600L, 1_600_090_000L),
      new AssetDetail("v1", "video", 1_600_007_200L, 1_600_007_300L, 1920, 1080, 48.86, 2.34,
          12.5, 1, 0, 2, 3, metric(false, 0), metric(true, 0.75)),
    };
    DuplicateInfo[] duplicates = {new DuplicateInfo("a1", "a2", 0.93)};
    return new ReliqaClassifierInput("collection-1", 86_400.5,
        new LocationInfo("Paris", true, 2.35, 48.85), counts(totalAssets), assets, duplicates);
  }

  /** {@code count} assets, one minute apart. */
  static ReliqaClassifierInput manyAssets(int count) {
    AssetDetail[] assets = new AssetDetail[count];
    for (int i = 0; i < count; i++) {
      assets[i] = asset("asset-" + i, 1_600_000_000L + 60L * i, -1);
    }
    return new ReliqaClassifierInput("big", 10, null, counts(count), assets, new DuplicateInfo[0]);
  }

  static ReliqaClassifierServerFeatures serverFeatures(Map<String, String> features) {
    return new ReliqaClassifierServerFeatures(features);
  }

  /** The native-backed wrapper behind a result. */
  static ReliqaClassifierResult.ReliqaClassifierResultWrapper wrapperOf(
      ReliqaClassifierResult result) {
    return (ReliqaClassifierResult.ReliqaClassifierResultWrapper) field(result, "mWrapper");
  }

  /** The native-backed wrapper behind a classifier. */
  static ReliqaClassifier.ReliqaClassifierWrapper wrapperOf(ReliqaClassifier classifier) {
    return (ReliqaClassifier.ReliqaClassifierWrapper) field(classifier, "mWrapper");
  }

  static Object field(Object object, String name) {
    try {
      java.lang.reflect.Field field = object.getClass().getDeclaredField(name);
      field.setAccessible(true);
      return field.get(object);
    } catch (ReflectiveOperationException e) {
      throw new AssertionError(e);
    }
  }

  // ---- canonical renderings, matching NativeReference ----

  static String bits(double value) {
    return Long.toString(Double.doubleToRawLongBits(value));
  }

  private static String flag(boolean value) {
    return value ? "1" : "0";
  }

  /** The native record that {@code input} must become, rendered like describeInput. */
  /** A date as the native record holds it: where time_t has 32 bits, its low 32 bits. */
  private static String recordDate(long seconds) {
    return Long.toString(NativeReference.timeBits() == 32 ? (long) (int) seconds : seconds);
  }

  static String describe(ReliqaClassifierInput input) {
    StringBuilder text = new StringBuilder();
    text.append("collectionID=").append(input.collectionID()).append('\n');
    text.append("timeSinceStory=").append(bits(input.timeSinceStory())).append('\n');
    LocationInfo l = input.locationInfo();
    if (l == null) {
      text.append("location=absent\n");
    } else {
      text.append("location=").append(l.name()).append('|').append(flag(l.isLandmark()))
          .append('|').append(bits(l.longitude())).append('|').append(bits(l.latitude()))
          .append('\n');
    }
    AssetCounts c = input.assetCounts() != null ? input.assetCounts()
        : new AssetCounts(0, 0, 0, 0, 0, 0, 0, 0, 0, 0);
    text.append("counts=").append(String.join(" ", List.of(
        c.tileCount(), c.totalAssetsCount(), c.photosCount(), c.burstCount(), c.loopsCount(),
        c.videosCount(), c.totalAssetsWithinBurstsCount(), c.totalAssetsWithinLoopsCount(),
        c.facesCount(), c.photosWithFacesCount()).stream().map(String::valueOf).toList()))
        .append('\n');
    for (AssetDetail a : input.assetDetails()) {
      List<String> fields = new ArrayList<>(List.of(a.assetID(), a.assetType(),
          recordDate(a.creationDateSinceEpoch()), recordDate(a.modificationDateSinceEpoch()),
          bits(a.pixelWidth()), bits(a.pixelHeight()), bits(a.latitude()), bits(a.longitude()),
          bits(a.videoDuration()), Integer.toString(a.isFavorite()),
          Integer.toString(a.isHidden()), Integer.toString(a.mediaSubtypes()),
          Integer.toString(a.sourceType()), flag(a.blurrinessMetric().isCalculated()),
          bits(a.blurrinessMetric().value()), flag(a.darknessMetric().isCalculated()),
          bits(a.darknessMetric().value())));
      text.append("asset=").append(String.join("|", fields)).append('\n');
    }
    for (DuplicateInfo d : input.duplicateInfos()) {
      text.append("dup=").append(d.assetIdA()).append('|').append(d.assetIdB()).append('|')
          .append(bits(d.dupeCoefficient())).append('\n');
    }
    text.append("extraCount=0\n");
    return text.toString();
  }

  /** A Java result rendered like classifyDirectly. */
  static String describe(ReliqaClassifierResult result) {
    StringBuilder text = new StringBuilder();
    text.append("score=").append(bits(result.getScore())).append('\n');
    text.append("over=").append(flag(result.isOverThreshold())).append('\n');
    for (Map.Entry<String, String> e : new TreeMap<>(result.getLoggingData()).entrySet()) {
      text.append(e.getKey()).append('=').append(e.getValue()).append('\n');
    }
    return text.toString();
  }

  // ---- serialized models ----

  private static String line(ByteBuffer bytes) {
    byte[] data = new byte[bytes.position()];
    bytes.flip().get(data);
    return Base64.getEncoder().encodeToString(data) + "\n";
  }

  private static ByteBuffer buffer() {
    return ByteBuffer.allocate(256).order(ByteOrder.LITTLE_ENDIAN);
  }

  /**
   * A serialized model of one tree over one input, feature {@code featureId}: the leaf value is
   * {@code low} when the feature is at most {@code pivot}, else {@code high}. Its score is
   * therefore the logistic of one of the two.
   */
  static String singleSplitModel(int featureId, double pivot, double low, double high) {
    StringBuilder text = new StringBuilder();
    text.append(line(buffer().putInt(314156).putInt(3)));
    text.append(line(buffer().putDouble(0.0).putInt(1)));
    ByteBuffer tree = buffer().putDouble(1.0);
    tree.put((byte) 'L').putInt(0).putDouble(pivot);
    tree.put((byte) 'C').putDouble(low);
    tree.put((byte) 'C').putDouble(high);
    tree.putInt(0);
    text.append(line(tree));
    text.append(line(buffer().putInt(1)));
    text.append(Base64.getEncoder()
        .encodeToString(("f" + featureId).getBytes(StandardCharsets.UTF_8))).append('\n');
    text.append(line(buffer().putInt(1)));
    text.append(line(buffer().putInt(featureId)));
    text.append(line(buffer().putInt(0)));
    return text.toString();
  }

  static double logistic(double x) {
    return 1.0 / (Math.exp(-x) + 1.0);
  }
}
