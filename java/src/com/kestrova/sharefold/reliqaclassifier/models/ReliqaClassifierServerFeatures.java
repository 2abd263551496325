package com.kestrova.sharefold.reliqaclassifier.models;

import java.util.Map;

/**
 * Feature values computed by a server; they replace computed features of the same id. Keys are
 * decimal feature ids, values decimal numbers, both read with the C library's rules: leading
 * blanks are skipped and trailing text is ignored, so {@code "7x"} is feature 7 and {@code
 * "2.5kg"} is 2.5; text without a number reads as 0. A key whose number does not fit a signed
 * 32-bit id is dropped. When two keys name the same id, the one that comes first in the map's
 * iteration order wins: use a {@link java.util.LinkedHashMap} to control it. Neither the map nor
 * any key or value may be null, and both must be strings.
 */
public record ReliqaClassifierServerFeatures(Map<String, String> features) {}
