package com.kestrova.sharefold.reliqaclassifier.models;

/** An image metric that may not have been calculated; {@code value} counts only if it was. */
public record OptionalImageMetricValue(boolean isCalculated, double value) {}
