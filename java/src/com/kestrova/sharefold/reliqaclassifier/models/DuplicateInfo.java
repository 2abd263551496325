package com.kestrova.sharefold.reliqaclassifier.models;

/** Two assets of a collection judged to be near-duplicates. */
public record DuplicateInfo(String assetIdA, String assetIdB, double dupeCoefficient) {}
