package com.kestrova.sharefold.reliqaclassifier.models;

import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.asset;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.bits;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.collection;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.describe;
import static com.kestrova.sharefold.reliqaclassifier.models.Fixtures.metric;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.Map;
import java.util.function.UnaryOperator;
import org.junit.jupiter.api.Test;

/** What the binding's readers make of the managed objects, compared with the native records. */
class ReadingTest {
  @Test
  void inputGraphArrivesFieldForFieldAndBitForBit() {
    AssetDetail odd = new AssetDetail("id-é😀", "vidéo", Long.MIN_VALUE, -1, -0.0, Double.NaN,
        Double.longBitsToDouble(0x7ff8dead00000001L), Double.MAX_VALUE, Double.MIN_VALUE,
        Integer.MIN_VALUE, Integer.MAX_VALUE, -7, 123, metric(false, 42.5), metric(true, -1e-300));
    ReliqaClassifierInput input = new ReliqaClassifierInput("col\u0000lection", -3.25,
        new LocationInfo("Zürich", false, -0.5, 1e10),
        new AssetCounts(1, 2, 3, 4, 5, 6, 7, 8, 9, 10),
        new AssetDetail[] {asset("first", 1, 2), odd, asset("last", 3, 4)},
        new DuplicateInfo[] {new DuplicateInfo("first", "last", 0.5),
            new DuplicateInfo("last", "first", 0.25)});
    assertEquals(describe(input), NativeReference.describeInput(input));
  }

  @Test
  void absentLocationAndCountsAndEmptyArrays() {
    ReliqaClassifierInput input =
        new ReliqaClassifierInput("", 0, null, null, new AssetDetail[0], new DuplicateInfo[0]);
    String described = NativeReference.describeInput(input);
    assertEquals(describe(input), described);
    assertEquals(true, described.contains("location=absent\ncounts=0 0 0 0 0 0 0 0 0 0\n"));
  }

  @Test
  void unpairedSurrogatesBecomeReplacementCharacters() {
    ReliqaClassifierInput input = new ReliqaClassifierInput("a\uD800b\uDC00", 0, null, null,
        new AssetDetail[0], new DuplicateInfo[0]);
    assertEquals(true,
        NativeReference.describeInput(input).startsWith("collectionID=a\uFFFDb\uFFFD\n"));
  }

  private static void assertNullNamed(String message, ReliqaClassifierInput input) {
    NullPointerException e =
        assertThrows(NullPointerException.class, () -> NativeReference.describeInput(input));
    assertEquals(message, e.getMessage());
  }

  private static ReliqaClassifierInput withAsset(int index, UnaryOperator<AssetDetail> change) {
    ReliqaClassifierInput base = collection(3);
    AssetDetail[] assets = base.assetDetails().clone();
    assets[index] = change.apply(assets[index]);
    return new ReliqaClassifierInput(base.collectionID(), base.timeSinceStory(),
        base.locationInfo(), base.assetCounts(), assets, base.duplicateInfos());
  }

  @Test
  void everyNullIsRejectedWithItsPlace() {
    ReliqaClassifierInput c = collection(3);
    assertNullNamed("ReliqaClassifierInput is null", null);
    assertNullNamed("ReliqaClassifierInput.assetDetails is null", new ReliqaClassifierInput(
        "x", 0, null, null, null, new DuplicateInfo[0]));
    assertNullNamed("ReliqaClassifierInput.duplicateInfos is null", new ReliqaClassifierInput(
        "x", 0, null, null, new AssetDetail[0], null));
    assertNullNamed("ReliqaClassifierInput.collectionID is null", new ReliqaClassifierInput(
        null, 0, null, null, new AssetDetail[0], new DuplicateInfo[0]));
    assertNullNamed("ReliqaClassifierInput.assetDetails[2] is null", withAsset(2, a -> null));
    assertNullNamed("ReliqaClassifierInput.assetDetails[1].assetID is null",
        withAsset(1, a -> new AssetDetail(null, a.assetType(), 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0,
            a.blurrinessMetric(), a.darknessMetric())));
    assertNullNamed("ReliqaClassifierInput.assetDetails[0].assetType is null",
        withAsset(0, a -> new AssetDetail(a.assetID(), null, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0,
            a.blurrinessMetric(), a.darknessMetric())));
    assertNullNamed("ReliqaClassifierInput.assetDetails[1].darknessMetric is null",
        withAsset(1, a -> new AssetDetail(a.assetID(), a.assetType(), 0, 0, 0, 0, 0, 0, 0, 0, 0,
            0, 0, a.blurrinessMetric(), null)));
    assertNullNamed("ReliqaClassifierInput.duplicateInfos[0].assetIdB is null",
        new ReliqaClassifierInput("x", 0, null, null, new AssetDetail[0],
            new DuplicateInfo[] {new DuplicateInfo("a", null, 1)}));
    assertNullNamed("ReliqaClassifierInput.duplicateInfos[1] is null",
        new ReliqaClassifierInput("x", 0, null, null, new AssetDetail[0],
            new DuplicateInfo[] {new DuplicateInfo("a", "b", 1), null}));
    assertNullNamed("ReliqaClassifierInput.locationInfo.name is null", new ReliqaClassifierInput(
        "x", 0, new LocationInfo(null, true, 0, 0), null, c.assetDetails(),
        c.duplicateInfos()));
  }

  // ---- server features ----

  private static String features(Map<String, String> map) {
    return NativeReference.describeServerFeatures(new ReliqaClassifierServerFeatures(map));
  }

  private static String entry(int id, double value) {
    return id + "=" + bits(value) + "\n";
  }

  @Test
  void serverFeatureTextsAreReadWithTheCRules() {
    assertEquals(entry(12, 0.5), features(Map.of("12", "0.5")));
    assertEquals("", features(Map.of()));
    assertEquals(entry(0, 0.0), features(Map.of("letters", "letters")));
    assertEquals(entry(7, 2.5), features(Map.of("7x", "2.5kg")));
    assertEquals(entry(7, -1.0), features(Map.of(" \t000000000007", "  -1")));
    assertEquals(entry(-2147483648, 1) + entry(2147483647, 2),
        features(Map.of("-2147483648", "1", "2147483647", "2")));
  }

  @Test
  void outOfRangeKeysAreDroppedAndTheFirstKeyForAnIdWins() {
    assertEquals(entry(3, 1), features(Map.of("2147483648", "9", "-2147483649", "9", "3", "1")));
    Map<String, String> ordered = new LinkedHashMap<>();
    ordered.put("05", "1");
    ordered.put("5", "2");
    ordered.put("+5", "3");
    assertEquals(entry(5, 1), features(ordered));
    Map<String, String> reversed = new LinkedHashMap<>();
    reversed.put("5", "2");
    reversed.put("05", "1");
    assertEquals(entry(5, 2), features(reversed));
  }

  @Test
  @SuppressWarnings({"unchecked", "rawtypes"})
  void nonStringKeysAndValuesAreClassCastErrors() {
    Map raw = new HashMap();
    raw.put("1", Integer.valueOf(5));
    ClassCastException value = assertThrows(ClassCastException.class, () -> features(raw));
    assertEquals("Tried to cast from class java.lang.Integer to java/lang/String.",
        value.getMessage());
    Map rawKey = new HashMap();
    rawKey.put(Long.valueOf(1), "5");
    ClassCastException key = assertThrows(ClassCastException.class, () -> features(rawKey));
    assertEquals("Tried to cast from class java.lang.Long to java/lang/String.", key.getMessage());
  }

  @Test
  void nullServerFeaturesAreRejectedWithTheirPlace() {
    Map<String, String> nullKey = new HashMap<>();
    nullKey.put(null, "1");
    Map<String, String> nullValue = new HashMap<>();
    nullValue.put("1", null);
    assertEquals("ReliqaClassifierServerFeatures is null", assertThrows(
        NullPointerException.class, () -> NativeReference.describeServerFeatures(null))
        .getMessage());
    assertEquals("ReliqaClassifierServerFeatures.features is null", assertThrows(
        NullPointerException.class, () -> features(null)).getMessage());
    assertEquals("ReliqaClassifierServerFeatures.features has a null key", assertThrows(
        NullPointerException.class, () -> features(nullKey)).getMessage());
    assertEquals("ReliqaClassifierServerFeatures.features has a null value", assertThrows(
        NullPointerException.class, () -> features(nullValue)).getMessage());
  }
}
